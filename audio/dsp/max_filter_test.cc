#include "audio/dsp/max_filter.h"

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

std::vector<float> Max(const std::vector<float>& x, int window) {
  std::vector<float> y(x.size(), -1.0f);
  MaxFilter(x.data(), static_cast<int>(x.size()), window, y.data());
  return y;
}

// Verifies the monotonic queue against the definition over many shapes:
// ties, even windows (one further back than ahead), windows wider than the
// signal, and decreasing runs that fill the queue.
TEST(MaxFilterTest, MatchesDefinition) {
  MaxFilter(nullptr, 0, 3, nullptr);  // nothing to do, pointers not examined
  std::mt19937 rng(3);
  std::uniform_int_distribution<int> level(-5, 5);
  for (int n = 1; n <= 20; ++n) {
    std::vector<float> x(n);
    for (float& v : x) v = static_cast<float>(level(rng));
    if (n > 10) std::sort(x.rbegin(), x.rend());
    for (int window = 1; window <= 10; ++window) {
      const int ahead = (window - 1) / 2;
      std::vector<float> expected(n);
      for (int j = 0; j < n; ++j) {
        const int first = std::max(0, j + ahead - window + 1);
        const int last = std::min(n - 1, j + ahead);
        expected[j] = *std::max_element(x.begin() + first, x.begin() + last + 1);
      }
      EXPECT_THAT(Max(x, window), ElementsAreArray(expected))
          << "n " << n << " window " << window;
    }
  }
}

#if GTEST_HAS_DEATH_TEST
TEST(MaxFilterDeathTest, RejectsInvalidArguments) {
  float buffer[3] = {};
  EXPECT_DEATH(MaxFilter(buffer, -1, 3, buffer), CheckFailed("num_samples >= 0"));
}
#endif

}  // namespace
}  // namespace audio_dsp
