#include "audio/sorvane/decoding_group.h"

#include "audio/sorvane/compute_buffer_truncation.h"
#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace audio_sorvane {
namespace {

// Period 10, phase tolerance 0.2 -> 2 samples, gap 25.
TEST(DecodingGroupTest, AcceptsTimesOnTheGridWithinTheGap) {
  DecodingGroup group(100, 10, 25, 1.0f, 0.2f);
  EXPECT_TRUE(group.TryAdd(108, 1.0f));   // 2 before the grid
  EXPECT_TRUE(group.TryAdd(112, 1.0f));   // 2 after
  EXPECT_FALSE(group.TryAdd(115, 5.0f));  // half a period off
  EXPECT_TRUE(group.TryAdd(122, 2.0f));
  EXPECT_FALSE(group.TryAdd(150, 1.0f));  // gap 28 > 25
  EXPECT_EQ(group.times(), (std::vector<int>{100, 108, 112, 122}));
  EXPECT_FLOAT_EQ(group.score(), 5.0f);
}

TEST(DecodingGroupTest, SlotsCoverageAndIndex) {
  DecodingGroup group(0, 10, 100, 1.0f, 0.2f);
  for (int t : {9, 21, 29, 41, 52}) ASSERT_TRUE(group.TryAdd(t, 1.0f));
  // Times 0, 9, 21, 29, 41, 52 are slots 0 .. 5.
  EXPECT_TRUE(group.CoversAllSlots(3));
  EXPECT_TRUE(group.CoversAllSlots(6));
  EXPECT_FALSE(group.CoversAllSlots(7));
  EXPECT_EQ(group.IndexOfSlot(0), 0);
  EXPECT_EQ(group.IndexOfSlot(3), 3);  // 29, found from half a period before 30
  EXPECT_EQ(group.IndexOfSlot(5), 5);
  EXPECT_EQ(group.IndexOfSlot(9), 5);  // beyond the last: the last index
}

TEST(ComputeBufferTruncationTest, KeepsWithinBudget) {
  struct Case {
    int input, buffered, good, max;
    BufferTruncation expected;
    const char* warning;
  };
  const Case cases[] = {
      {60, 40, 30, 100, {0, 0}, nullptr},
      {50, 40, 30, 100, {0, 0}, nullptr},
      {65, 40, 30, 100, {0, 5}, nullptr},
      {71, 40, 30, 100, {0, 11},
       "Input of size 71 exceeds maximum good block size 70, signal may be lost."},
      {150, 40, 30, 100, {50, 40},
       "Input of size 150 exceeds maximum buffer size 100, 50 samples skipped, signal may "
       "be lost."},
  };
  for (const Case& c : cases) {
    sorvel_test::ScopedLogCapture capture;
    EXPECT_EQ(ComputeBufferTruncation(c.input, c.buffered, c.good, c.max), c.expected)
        << c.input;
    if (c.warning) {
      EXPECT_TRUE(capture.Contains(sorvel_base::WARNING, c.warning));
    } else {
      EXPECT_TRUE(capture.entries().empty());
    }
  }
}

}  // namespace
}  // namespace audio_sorvane
