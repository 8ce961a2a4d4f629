#include "base/logging.h"

#include <string>

#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace {

using sorvel_test::CheckFailed;
using sorvel_test::ScopedLogCapture;

// Verifies that lines reach an installed sink with severity, position (file
// relative to the repository) and text, and the default sink writes one
// "W file:line] text" line to stderr.
TEST(LoggingTest, LinesReachSinkWithSeverityAndPosition) {
  {
    ScopedLogCapture capture;
    const int line = __LINE__ + 1;
    LOG(WARNING) << "warning " << 2.5;
    LOG(ERROR) << "error";
    const auto entries = capture.entries();
    ASSERT_EQ(entries.size(), 2u);
    EXPECT_EQ(entries[0].severity, sorvel_base::WARNING);
    EXPECT_EQ(entries[0].message, "warning 2.5");
    EXPECT_EQ(entries[0].file, "base/logging_test.cc");
    EXPECT_EQ(entries[0].line, line);
    EXPECT_EQ(entries[1].severity, sorvel_base::ERROR);
  }
  testing::internal::CaptureStderr();
  LOG(WARNING) << "to stderr";
  const std::string out = testing::internal::GetCapturedStderr();
  EXPECT_NE(out.find("W base/logging_test.cc:"), std::string::npos) << out;
  EXPECT_NE(out.find("] to stderr\n"), std::string::npos) << out;
}

// Verifies that VLOG is off by default and follows the verbosity level, and
// that disabled VLOGs and passing checks neither log nor evaluate their
// messages, and evaluate their operands once.
TEST(LoggingTest, VlogLevelsAndPassingChecks) {
  ScopedLogCapture capture;
  int evaluations = 0;
  const auto count = [&] { return ++evaluations; };
  EXPECT_EQ(sorvel_base::GetVlogLevel(), 0);
  VLOG(1) << count();
  sorvel_base::SetVlogLevel(2);
  VLOG(2) << "two";
  VLOG(3) << count();
  sorvel_base::SetVlogLevel(0);
  CHECK(evaluations == 0) << count();
  CHECK_EQ(count(), 1);
  CHECK_EQ(std::string("abc").size(), 3);  // size_t against int
  EXPECT_EQ(evaluations, 1);
  const auto entries = capture.entries();
  ASSERT_EQ(entries.size(), 1u);
  EXPECT_EQ(entries[0].message, "two");
  EXPECT_EQ(entries[0].severity, sorvel_base::INFO);
}

#if GTEST_HAS_DEATH_TEST
// Verifies the fatal paths: the check text, file and line, the compared
// values of CHECK_op, extra streamed text, and that a capturing sink does
// not hide why the process ended.
TEST(LoggingDeathTest, FailedChecksAbortWithExpressionText) {
  const int two = 2;
  EXPECT_DEATH(CHECK(two + 1 == 4), CheckFailed("two + 1 == 4"));
  EXPECT_DEATH(CHECK(two < 0), "base/logging_test.cc:[0-9]+\\] Check failed");
  EXPECT_DEATH(CHECK_EQ(two, 3) << "context", "two == 3 \\(2 vs. 3\\) context");
  // Mixed signedness compares values: -1 is not SIZE_MAX.
  const size_t big = static_cast<size_t>(-1);
  EXPECT_DEATH(CHECK_EQ(big, -1), CheckFailed("big == -1"));
  EXPECT_DEATH(LOG(FATAL) << "fatal text", "fatal text");
  EXPECT_DEATH(
      {
        ScopedLogCapture capture;
        CHECK(two == 5);
      },
      CheckFailed("two == 5"));
}
#endif

}  // namespace
