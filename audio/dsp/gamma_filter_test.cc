#include "audio/dsp/gamma_filter.h"

#include <cmath>
#include <vector>

#include "gtest/gtest.h"

namespace audio_dsp {
namespace {

TEST(GammaFilterTest, FirstOrderIsOnePoleSmoother) {
  GammaFilter pass(1, 100.0, 0.0);
  for (float x : {1.0f, -3.0f, 7.5f}) EXPECT_EQ(pass.ProcessSample(x), x);

  GammaFilter smoother(1, 100.0, 0.5);
  EXPECT_FLOAT_EQ(smoother.gain(), 0.5f);
  EXPECT_FLOAT_EQ(smoother.ProcessSample(1.0f), 0.5f);
  EXPECT_FLOAT_EQ(smoother.ProcessSample(1.0f), 0.75f);
  EXPECT_FLOAT_EQ(smoother.ProcessSample(1.0f), 0.875f);
  smoother.Reset();
  EXPECT_FLOAT_EQ(smoother.ProcessSample(1.0f), 0.5f);
}

// Verifies that the pole designed from a spread gives an impulse response
// with that standard deviation, whose mean is the stated delay, and that the
// DC gain is one.
TEST(GammaFilterTest, PoleFromSpreadGivesThatSpreadAndDelay) {
  for (int order : {1, 2, 4}) {
    for (double stddev : {3.0, 8.0, 32.0}) {
      SCOPED_TRACE(testing::Message() << "order " << order << " stddev " << stddev);
      const double pole = GammaFilterPoleFromStddev(stddev, order);
      ASSERT_GT(pole, 0.0);
      ASSERT_LT(pole, 1.0);
      GammaFilter filter(order, 8000.0, pole);
      double sum = 0.0, mean = 0.0, second = 0.0;
      for (int n = 0; n < 20000; ++n) {
        const double h = filter.ProcessSample(n == 0 ? 1.0f : 0.0f);
        sum += h;
        mean += n * h;
        second += static_cast<double>(n) * n * h;
      }
      mean /= sum;
      const double variance = second / sum - mean * mean;
      EXPECT_NEAR(sum, 1.0, 1e-4);
      EXPECT_NEAR(std::sqrt(variance), stddev, 1e-3 * stddev);
      EXPECT_NEAR(GammaFilterDelay(order, pole), mean, 0.5 + 1e-3 * mean);
    }
  }
}

}  // namespace
}  // namespace audio_dsp
