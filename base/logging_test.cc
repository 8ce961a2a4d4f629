#include "base/logging.h"

#include <string>

#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace {

using sorvel_test::CheckFailed;
using sorvel_test::ScopedLogCapture;

// Verifies that each severity reaches the sink with its source position and
// the streamed text, and that file names are relative to the repository.
TEST(LoggingTest, LinesReachSinkWithSeverityAndPosition) {
  ScopedLogCapture capture;
  const int line = __LINE__ + 1;
  LOG(INFO) << "info " << 1;
  LOG(WARNING) << "warning " << 2.5;
  LOG(ERROR) << "error";
  const auto entries = capture.entries();
  ASSERT_EQ(entries.size(), 3u);
  EXPECT_EQ(entries[0].severity, sorvel_base::INFO);
  EXPECT_EQ(entries[0].message, "info 1");
  EXPECT_EQ(entries[0].file, "base/logging_test.cc");
  EXPECT_EQ(entries[0].line, line);
  EXPECT_EQ(entries[1].severity, sorvel_base::WARNING);
  EXPECT_EQ(entries[1].message, "warning 2.5");
  EXPECT_EQ(entries[2].severity, sorvel_base::ERROR);
}

// Verifies that VLOG is off by default and follows the verbosity level,
// without evaluating the message when off.
TEST(LoggingTest, VlogFollowsVerbosity) {
  ScopedLogCapture capture;
  int evaluations = 0;
  const auto count = [&] { return ++evaluations; };
  EXPECT_EQ(sorvel_base::GetVlogLevel(), 0);
  VLOG(1) << count();
  sorvel_base::SetVlogLevel(2);
  VLOG(1) << "one";
  VLOG(2) << "two";
  VLOG(3) << count();
  sorvel_base::SetVlogLevel(0);
  EXPECT_EQ(evaluations, 0);
  const auto entries = capture.entries();
  ASSERT_EQ(entries.size(), 2u);
  EXPECT_EQ(entries[0].message, "one");
  EXPECT_EQ(entries[1].severity, sorvel_base::INFO);
}

// Verifies that passing checks log nothing, evaluate their operands once and
// work as single statements in if/else.
TEST(LoggingTest, PassingChecksAreSilent) {
  ScopedLogCapture capture;
  int calls = 0;
  const auto next = [&] { return ++calls; };
  CHECK(next() == 1) << "not evaluated " << next();
  CHECK_EQ(next(), 2);
  CHECK_LT(next(), 4);
  CHECK_EQ(std::string("abc").size(), 3);  // size_t against int
  if (calls == 3)
    CHECK_GE(calls, 3);
  else
    CHECK(false);
  EXPECT_EQ(calls, 3);
  EXPECT_TRUE(capture.entries().empty());
}

TEST(LoggingTest, DefaultSinkWritesOneLinePerMessageToStderr) {
  testing::internal::CaptureStderr();
  LOG(WARNING) << "to stderr";
  const std::string out = testing::internal::GetCapturedStderr();
  EXPECT_NE(out.find("W base/logging_test.cc:"), std::string::npos) << out;
  EXPECT_NE(out.find("] to stderr\n"), std::string::npos) << out;
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
  EXPECT_DEATH(CHECK_GT(two, 2), CheckFailed("two > 2"));
  // Mixed signedness compares values: -1 is not equal to SIZE_MAX.
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
