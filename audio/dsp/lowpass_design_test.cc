#include "audio/dsp/lowpass_design.h"

#include <complex>
#include <numbers>
#include <vector>

#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace audio_dsp {
namespace {

using Complex = std::complex<float>;
using sorvel_test::CheckFailed;

// The frequency response of the designed taps: unit gain inside the one-sided
// passband, strong rejection below -cutoff.
TEST(DesignLowpassTapsTest, OneSidedPassband) {
  const std::vector<Complex> taps = DesignLowpassTaps(31, 0.05f, 4.0f);
  ASSERT_EQ(taps.size(), 31u);
  const auto gain = [&](double nu) {
    std::complex<double> sum;
    for (int j = -15; j <= 15; ++j) {
      sum += std::complex<double>(taps[j + 15]) *
             std::polar(1.0, -2.0 * std::numbers::pi * nu * j);
    }
    return std::abs(sum);
  };
  for (double nu : {-0.02, 0.0, 0.05, 0.15}) EXPECT_NEAR(gain(nu), 1.0, 0.05) << nu;
  for (double nu : {-0.2, -0.3, -0.45}) EXPECT_LT(gain(nu), 0.02) << nu;
  EXPECT_EQ(DesignLowpassTaps(4, 0.05f, 4.0f).size(), 3u);  // centred: odd
}

#if GTEST_HAS_DEATH_TEST
TEST(DesignLowpassTapsDeathTest, RejectsNoTaps) {
  EXPECT_DEATH(DesignLowpassTaps(0, 0.05f, 4.0f), CheckFailed("num_taps >= 1"));
}
#endif

}  // namespace
}  // namespace audio_dsp
