#include "audio/dsp/rational_factor_resampler.h"

#include <cmath>
#include <complex>
#include <limits>
#include <numbers>
#include <vector>

#include "audio/dsp/resampler.h"
#include "gtest/gtest.h"

namespace audio_dsp {
namespace {

// Reference values from the power series summed to convergence in double
// (Python: sum((z*z/4)**k / factorial(k)**2 for k in range(400))).
TEST(BesselI0Test, MatchesSeriesReference) {
  const std::pair<double, double> cases[] = {
      {0.0, 1.0},
      {0.5, 1.0634833707413236},
      {1.0, 1.2660658777520082},
      {6.0, 67.23440697647796},
      {20.9, 104774245.97086325},
      {21.0, 115513961.92215805},  // asymptotic branch from here on
      {25.0, 5774560606.466313},
      {40.0, 1.4894774793419902e+16},
  };
  for (auto [z, expected] : cases) {
    EXPECT_NEAR(BesselI0(z), expected, 1e-12 * expected) << z;
    EXPECT_DOUBLE_EQ(BesselI0(-z), BesselI0(z));
  }
}

// Verifies the kernel's shape, the table built from it, and that bad rates
// or denominators leave kernel and resampler invalid.
TEST(RationalFactorResamplerTest, KernelAndPolyphaseTable) {
  const DefaultResamplingKernel up(16000, 44100);
  ASSERT_TRUE(up.Valid());
  EXPECT_EQ(up.radius(), 5.0);
  EXPECT_DOUBLE_EQ(up.Eval(0.0), 0.9);  // 2 * 0.45 * 16000 / 16000
  EXPECT_EQ(up.Eval(5.001), 0.0);
  EXPECT_DOUBLE_EQ(up.Eval(1.3), up.Eval(-1.3));

  const RationalFactorResampler<float> down(DefaultResamplingKernel(44100, 16000),
                                            2000);
  ASSERT_TRUE(down.Valid());
  EXPECT_EQ(down.factor_numerator(), 441);
  EXPECT_EQ(down.factor_denominator(), 160);
  EXPECT_EQ(down.num_taps(), 29);  // radius 5 * 2.75625 rounds up to 14
  ASSERT_EQ(down.filters().size(), 160u);
  EXPECT_EQ(down.filters()[159].size(), 29u);

  const RationalFactorResampler<float> same(DefaultResamplingKernel(8000, 8000),
                                            2000);
  EXPECT_EQ(same.num_taps(), 11);
  EXPECT_EQ(same.filters().size(), 1u);
  EXPECT_FLOAT_EQ(same.filters()[0][5], 0.9f);  // centred on the peak

  for (auto [in, out] : {std::pair{0.0, 16000.0}, {16000.0, -1.0},
                         {std::nan(""), 16000.0}}) {
    const DefaultResamplingKernel bad(in, out);
    EXPECT_FALSE(bad.Valid()) << in << " -> " << out;
    EXPECT_FALSE(RationalFactorResampler<float>(bad, 2000).Valid());
  }
  EXPECT_FALSE(RationalFactorResampler<float>(up, 0).Valid());
}

struct RatePair {
  double input_rate;
  double output_rate;
};

class ResamplerAccuracyTest : public testing::TestWithParam<RatePair> {};

// Verifies that a 1 kHz sine (well inside every passband here) comes out as
// the same sine at the new rate, with no delay, to better than -60 dB, for
// real and complex samples.
TEST_P(ResamplerAccuracyTest, SineKeepsShapeAtNewRate) {
  const RatePair rates = GetParam();
  const double frequency = 1000.0;
  const int input_size = static_cast<int>(rates.input_rate);  // one second
  std::vector<float> real(input_size);
  std::vector<std::complex<float>> analytic(input_size);
  for (int i = 0; i < input_size; ++i) {
    const double phase = 2.0 * std::numbers::pi * frequency * i / rates.input_rate;
    real[i] = static_cast<float>(std::sin(phase));
    analytic[i] = std::polar(1.0f, static_cast<float>(phase));
  }
  const DefaultResamplingKernel kernel(rates.input_rate, rates.output_rate);
  RationalFactorResampler<float> real_resampler(kernel, 2000);
  RationalFactorResampler<std::complex<float>> complex_resampler(kernel, 2000);
  std::vector<float> real_out;
  std::vector<std::complex<float>> complex_out;
  real_resampler.ProcessSamples(real, &real_out);
  complex_resampler.ProcessSamples(analytic, &complex_out);
  ASSERT_EQ(real_out.size(), complex_out.size());
  ASSERT_GT(real_out.size(), rates.output_rate * 0.9);

  // Skip the edges, where the kernel reaches into the zeros before the
  // stream and the samples not yet received.
  const size_t margin = 100;
  double real_error = 0.0, complex_error = 0.0, power = 0.0;
  for (size_t k = margin; k + margin < real_out.size(); ++k) {
    const double phase = 2.0 * std::numbers::pi * frequency * k / rates.output_rate;
    real_error += std::pow(real_out[k] - std::sin(phase), 2);
    complex_error += std::norm(std::complex<double>(complex_out[k]) -
                               std::polar(1.0, phase));
    power += 1.0;
  }
  EXPECT_LT(10 * std::log10(real_error / (power / 2)), -60.0);
  EXPECT_LT(10 * std::log10(complex_error / power), -60.0);
}

INSTANTIATE_TEST_SUITE_P(
    RatePairs, ResamplerAccuracyTest,
    testing::Values(RatePair{44100, 14700}, RatePair{48000, 14700},
                    RatePair{44100, 16000}, RatePair{48000, 44100},
                    RatePair{16000, 44100}, RatePair{44100, 44100}),
    [](const testing::TestParamInfo<RatePair>& info) {
      return std::to_string(static_cast<int>(info.param.input_rate)) + "to" +
             std::to_string(static_cast<int>(info.param.output_rate));
    });

// Verifies that the output does not depend on how the stream is split into
// blocks (phase carried across calls), that a block too short for one
// output is kept for the next call, and that Reset starts over.
TEST(RationalFactorResamplerTest, BlockSizesDoNotChangeTheOutput) {
  const int n = 4410;
  std::vector<std::complex<float>> input(n);
  for (int i = 0; i < n; ++i) {
    input[i] = {std::sin(0.01f * i) + 0.1f * std::cos(1.3f * i),
                std::cos(0.02f * i)};
  }
  RationalFactorResampler<std::complex<float>> resampler(
      DefaultResamplingKernel(44100, 16000), 2000);
  std::vector<std::complex<float>> whole;
  resampler.ProcessSamples(input, &whole);

  for (int block : {1, 7, 441}) {
    resampler.Reset();
    std::vector<std::complex<float>> streamed, out;
    for (int start = 0; start < n; start += block) {
      const int size = std::min(block, n - start);
      resampler.ProcessSamples(std::span(input).subspan(start, size), &out);
      streamed.insert(streamed.end(), out.begin(), out.end());
    }
    EXPECT_EQ(streamed, whole) << "block size " << block;
  }

  resampler.Reset();
  std::vector<std::complex<float>> out = {{1.0f, 1.0f}};
  resampler.ProcessSamples(std::span(input).first(10), &out);
  EXPECT_TRUE(out.empty());  // 14 zeros + 10 samples < 29 taps
  resampler.ProcessSamples(std::span(input).subspan(10), &out);
  EXPECT_EQ(out, whole);
}

// Verifies that Flush delivers every output whose centre lies inside the
// signal, ending as if silence followed.
TEST(RationalFactorResamplerTest, FlushDrainsTheTail) {
  RationalFactorResampler<float> resampler(DefaultResamplingKernel(44100, 14700),
                                           2000);
  std::vector<float> out, tail;
  resampler.ProcessSamples(std::vector<float>(1000, 1.0f), &out);
  resampler.Flush(&tail);
  EXPECT_GE(out.size() + tail.size(), 334u);  // ceil(1000 / 3)
  ASSERT_FALSE(tail.empty());
  EXPECT_NEAR(tail.back(), 0.0f, 0.01f);
}

}  // namespace
}  // namespace audio_dsp
