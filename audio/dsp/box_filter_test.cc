#include "audio/dsp/box_filter.h"

#include <algorithm>
#include <random>
#include <vector>

#include "gmock/gmock.h"
#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace audio_dsp {
namespace {

using sorvel_test::CheckFailed;
using testing::ElementsAreArray;
using testing::FloatNear;
using testing::Pointwise;

// The box sum by definition: window [i - back + 1, i + ahead] clipped.
std::vector<float> ReferenceBoxSums(const std::vector<float>& x, int width) {
  const int n = static_cast<int>(x.size());
  const int ahead = (width - 1) / 2;
  const int back = width - ahead;
  std::vector<float> y(n);
  for (int i = 0; i < n; ++i) {
    double sum = 0.0;
    for (int j = std::max(0, i - back + 1); j <= std::min(n - 1, i + ahead); ++j) {
      sum += x[j];
    }
    y[i] = static_cast<float>(sum);
  }
  return y;
}

std::vector<float> Box(const std::vector<float>& x, int width) {
  if (x.empty()) return {};  // BoxFilter requires a non-null input
  std::vector<float> y(x.size(), -1.0f);
  BoxFilter(x.data(), static_cast<int>(x.size()), 1, width, y.data());
  return y;
}

// Verifies every phase of the running sum (growing, sliding, shrinking,
// window wider than the signal) against the definition.
TEST(BoxFilterTest, MatchesDefinition) {
  std::mt19937 rng(7);
  std::uniform_real_distribution<float> uniform(-1.0f, 1.0f);
  for (int n = 1; n <= 12; ++n) {
    std::vector<float> x(n);
    for (float& v : x) v = uniform(rng);
    for (int width = 1; width <= 15; ++width) {
      EXPECT_THAT(Box(x, width), Pointwise(FloatNear(1e-5), ReferenceBoxSums(x, width)))
          << "n " << n << " width " << width;
    }
  }
}

// A 3-row table of 2 columns (column-major). The first pass runs across the
// column boundary: element 2 (row 2, column 0) sums elements 1..3.
TEST(BoxFilter2DTest, FlatPassThenPerRowPass) {
  // The row pass equals one strided BoxFilter per row, bit for bit.
  std::mt19937 rng(5);
  std::uniform_real_distribution<float> uniform(-1.0f, 1.0f);
  std::vector<float> table(7 * 23), flat(table.size()), expected(table.size()), actual;
  for (float& v : table) v = uniform(rng);
  for (int width : {1, 4, 9, 30}) {
    BoxFilter(table.data(), static_cast<int>(table.size()), 1, 3, flat.data());
    for (int r = 0; r < 7; ++r) BoxFilter(flat.data() + r, 23, 7, width, expected.data() + r);
    BoxFilter2D(table, 7, 3, width, false, &actual);
    EXPECT_EQ(actual, expected) << "width " << width;
  }
  std::vector<float> output;
  BoxFilter2D(std::vector<float>{1, 0, 0, 0, 0, 0}, 3, 3, 2, false, &output);
  EXPECT_THAT(output, ElementsAreArray({1.0f, 1.0f, 0.0f, 1.0f, 1.0f, 0.0f}));
  // Ragged: the incomplete last column is left at zero.
  BoxFilter2D(std::vector<float>(10, 1.0f), 3, 1, 1, true, &output);
  EXPECT_THAT(output, ElementsAreArray({1.0f, 1.0f, 1.0f, 1.0f, 1.0f, 1.0f,
                                        1.0f, 1.0f, 1.0f, 0.0f}));
}

#if GTEST_HAS_DEATH_TEST
TEST(BoxFilterDeathTest, RejectsInvalidArguments) {
  float buffer[4] = {};
  EXPECT_DEATH(BoxFilter(buffer, -1, 1, 3, buffer),
               CheckFailed("num_samples >= 0"));
  std::vector<float> output;
  EXPECT_DEATH(BoxFilter2D(std::vector<float>(10), 3, 1, 1, false, &output),
               "input of size 10 is not divisible by 3");
}
#endif

}  // namespace
}  // namespace audio_dsp
