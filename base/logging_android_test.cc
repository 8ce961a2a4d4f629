// The Android sink, exercised through the host build of liblog, which prints
// "<tag> <priority letter> <time> <pid> <tid> <message>" to standard error.
#include <string>

#include "base/logging.h"
#include "gtest/gtest.h"

namespace {

// Verifies that lines go out under the tag "Sorvel" with the matching
// priority and carry the source position.
TEST(AndroidLogTest, WritesTaggedLinesWithPriority) {
  testing::internal::CaptureStderr();
  LOG(ERROR) << "android error";
  LOG(WARNING) << "android warning";
  const std::string out = testing::internal::GetCapturedStderr();
  EXPECT_NE(out.find("Sorvel E"), std::string::npos) << out;
  EXPECT_NE(out.find("Sorvel W"), std::string::npos) << out;
  EXPECT_NE(out.find("base/logging_android_test.cc:"), std::string::npos)
      << out;
  EXPECT_NE(out.find("] android error"), std::string::npos) << out;
}

#if GTEST_HAS_DEATH_TEST
TEST(AndroidLogDeathTest, FatalCheckReachesTheLog) {
  EXPECT_DEATH(CHECK(1 + 1 == 3), "Sorvel F.*Check failed: 1 \\+ 1 == 3");
}
#endif

}  // namespace
