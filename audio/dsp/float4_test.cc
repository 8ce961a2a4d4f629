#include "audio/dsp/float4.h"

#include <cmath>
#include <limits>

#include "gtest/gtest.h"

namespace audio_dsp {
namespace {

// The refined estimate against the exact value over many decades, and the
// lanes of zero that a caller's comparison must be able to reject.
TEST(Float4Test, RsqrtIsCloseAndZeroLanesCompareFalse) {
  for (float x = 1e-30f; x < 1e30f; x *= 1.37f) {
    const Float4 y = Rsqrt4(Float4{x, 2.0f * x, 3.0f * x, 5.0f * x});
    for (int lane = 0; lane < 4; ++lane) {
      const double exact = 1.0 / std::sqrt(static_cast<double>(x) * (lane == 3 ? 5 : lane + 1));
      ASSERT_NEAR(y[lane] / exact, 1.0, 1e-6) << x << " lane " << lane;
    }
  }
  const Float4 zero = Rsqrt4(Float4{0.0f, 0.0f, 0.0f, 0.0f});
  for (int lane = 0; lane < 4; ++lane) {
    EXPECT_FALSE(zero[lane] < 1.0f) << zero[lane];
  }
}

}  // namespace
}  // namespace audio_dsp
