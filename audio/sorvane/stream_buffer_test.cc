#include "audio/sorvane/stream_buffer.h"

#include <vector>

#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace audio_sorvane {
namespace {

using sorvel_test::CheckFailed;

std::vector<float> Ramp(int first, int count) {
  std::vector<float> v(count);
  for (int i = 0; i < count; ++i) v[i] = static_cast<float>(first + i);
  return v;
}

// Verifies that views map buffer indices to absolute stream positions across
// appends and discards.
TEST(StreamBufferTest, TracksStreamPositionAcrossDiscards) {
  StreamBuffer buffer;
  buffer.Append(Ramp(0, 10));
  buffer.Discard(4);
  buffer.Append(Ramp(10, 3));
  EXPECT_EQ(buffer.size(), 9);
  EXPECT_EQ(buffer.num_discarded_samples(), 4);
  const auto view = buffer.View(0);
  ASSERT_EQ(view.size(), 9u);
  EXPECT_EQ(view[0], 4.0f);  // stream sample 4
  EXPECT_EQ(view[8], 12.0f);
  EXPECT_EQ(buffer.View(5)[0], 9.0f);

  buffer.Discard(0);
  EXPECT_EQ(buffer.size(), 9);
  EXPECT_EQ(buffer.num_discarded_samples(), 4);
  buffer.Discard(9);
  EXPECT_EQ(buffer.size(), 0);
  EXPECT_EQ(buffer.num_discarded_samples(), 13);
}

// Views at or past the end are empty (null data); Zero keeps length and
// position, Clear resets both.
TEST(StreamBufferTest, EmptyViewsZeroAndClear) {
  StreamBuffer buffer;
  EXPECT_EQ(buffer.View(0).data(), nullptr);
  buffer.Append(Ramp(1, 6));
  buffer.Discard(2);
  EXPECT_TRUE(buffer.View(4).empty());
  EXPECT_EQ(buffer.View(7).data(), nullptr);
  buffer.Zero();
  EXPECT_EQ(buffer.size(), 4);
  EXPECT_EQ(buffer.num_discarded_samples(), 2);
  for (float v : buffer.View(0)) EXPECT_EQ(v, 0.0f);
  buffer.Clear();
  EXPECT_EQ(buffer.size(), 0);
  EXPECT_EQ(buffer.num_discarded_samples(), 0);
}

#if GTEST_HAS_DEATH_TEST
TEST(StreamBufferDeathTest, RejectsOutOfRangeArguments) {
  StreamBuffer buffer;
  buffer.Append(Ramp(0, 3));
  EXPECT_DEATH(buffer.Discard(-1), CheckFailed("num_samples >= 0"));
  EXPECT_DEATH(buffer.Discard(4),
               CheckFailed("num_samples <= static_cast<int>(buffer_.size())"));
  EXPECT_DEATH(buffer.View(-1), CheckFailed("offset >= 0"));
}
#endif

}  // namespace
}  // namespace audio_sorvane
