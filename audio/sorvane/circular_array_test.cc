#include "audio/sorvane/circular_array.h"

#include <vector>

#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace audio_sorvane {
namespace {

using sorvel_test::CheckFailed;

TEST(CircularArrayTest, RoundsSizeUpToPowerOfTwo) {
  const std::pair<int, int> cases[] = {{1, 1}, {2, 2}, {5, 8}, {6, 8},
                                       {8, 8}, {9, 16}, {1 << 20, 1 << 20}};
  for (auto [min_size, size] : cases) {
    EXPECT_EQ(CircularArray<int>(min_size).size(), size) << min_size;
  }
}

// Verifies the mask addressing: counters a size apart share a slot,
// negative counters wrap from the top, and size 1 maps everything to slot 0.
TEST(CircularArrayTest, CountersWrapThroughTheMask) {
  CircularArray<std::vector<float>> history(6);
  history.Fill(std::vector<float>(2, 0.0f));
  history[3] = {1.0f, 2.0f};
  EXPECT_EQ(history[11], (std::vector<float>{1.0f, 2.0f}));
  history[-1] = {7.0f};
  EXPECT_EQ(history[7], std::vector<float>{7.0f});
  EXPECT_EQ(history[4], std::vector<float>(2, 0.0f));

  CircularArray<int> single(1);
  single[5] = 3;
  EXPECT_EQ(single[-9], 3);
  EXPECT_EQ(single[0], 3);
}

#if GTEST_HAS_DEATH_TEST
TEST(CircularArrayDeathTest, RejectsSizesOutOfRange) {
  EXPECT_DEATH(CircularArray<char>(0), CheckFailed("min_size > 0"));
  EXPECT_DEATH(CircularArray<char>((1 << 30) + 1),
               CheckFailed("min_size <= 1 << 30"));
}
#endif

}  // namespace
}  // namespace audio_sorvane
