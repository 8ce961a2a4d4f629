#include "audio/dsp/kiss_fft_util.h"

#include <cmath>
#include <complex>
#include <numbers>
#include <vector>

#include "gmock/gmock.h"
#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace audio_dsp {
namespace {

using Complex = std::complex<float>;
using sorvel_test::CheckFailed;

struct Partial {
  int harmonic;  // cycles per period
  double amplitude;
  double phase;
};

// `num_samples` samples of one period of a sum of harmonics.
std::vector<float> Periodic(const std::vector<Partial>& partials,
                            int num_samples) {
  std::vector<float> x(num_samples);
  for (int i = 0; i < num_samples; ++i) {
    double v = 0.0;
    for (const Partial& p : partials) {
      v += p.amplitude * std::cos(2.0 * std::numbers::pi * p.harmonic * i /
                                      num_samples + p.phase);
    }
    x[i] = static_cast<float>(v);
  }
  return x;
}

double MaxAbsDifference(const std::vector<float>& a, const std::vector<float>& b) {
  double worst = 0.0;
  for (size_t i = 0; i < a.size(); ++i) {
    worst = std::max(worst, static_cast<double>(std::fabs(a[i] - b[i])));
  }
  return worst;
}

// Verifies up- and downsampling of band-limited periodic signals against the
// same signal sampled at the new rate, for odd and even lengths, including a
// component on the Nyquist bin of an even-length input.
TEST(FftResampleTest, MatchesAnalyticResampledSignal) {
  struct Case {
    int input_size;
    float input_rate, output_rate;
    int output_size;
    std::vector<Partial> partials;
  };
  const std::vector<Partial> band_limited = {
      {0, 0.25, 0.0}, {1, 1.0, 0.3}, {7, 0.5, -1.0}, {20, 0.25, 2.0}};
  const Case cases[] = {
      {100, 44100, 48000, 109, band_limited},
      {147, 48000, 44100, 135, band_limited},
      {99, 16000, 44100, 273, band_limited},
      {1270, 44100, 14700, 423, band_limited},
      {64, 1000, 1500, 96, {{32, 1.0, 0.0}, {3, 0.5, 0.1}}},  // Nyquist bin
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(testing::Message() << c.input_size << " -> " << c.output_size);
    const std::vector<float> input = Periodic(c.partials, c.input_size);
    std::vector<float> output;
    FftResample(input, &output, c.input_rate, c.output_rate);
    ASSERT_EQ(static_cast<int>(output.size()), c.output_size);
    EXPECT_LT(MaxAbsDifference(output, Periodic(c.partials, c.output_size)), 1e-5);
  }
}

TEST(FftResampleTest, EqualLengthsCopyTheInput) {
  std::vector<float> input = {1.5f, -2.0f, 3.25f, 0.0f, 7.0f, 1.0f, 2.0f,
                              3.0f, 4.0f, 5.0f};
  std::vector<float> output;
  FftResample(input, &output, 44100, 44100);
  EXPECT_EQ(output, input);
  FftResample(input, &output, 100, 104);  // round(10.4) = 10
  EXPECT_EQ(output, input);
  FftResample(input, &output, 44100, 48000);
  FftResample(input, &input, 44100, 48000);  // in place
  EXPECT_EQ(input, output);
}

// Bins at 0, 10, .., 40 Hz; a bin on an edge is kept.
TEST(SpectralBandPassFilterTest, KeepsBinsInsideEdgesInclusive) {
  const std::vector<Complex> spectrum = {{1, 1}, {2, 0}, {3, 0}, {4, -1}, {5, 0}};
  std::vector<Complex> out;
  SpectralBandPassFilter(spectrum, &out, 0.0f, 40.0f, 10.0f);
  EXPECT_EQ(out, spectrum);
  SpectralBandPassFilter(spectrum, &out, 15.0f, 15.0f, 10.0f);
  EXPECT_THAT(out, testing::Each(Complex(0, 0)));
  out = spectrum;
  SpectralBandPassFilter(out, &out, 10.0f, 30.0f, 10.0f);  // in place
  EXPECT_THAT(out, testing::ElementsAre(Complex(0, 0), Complex(2, 0), Complex(3, 0),
                                        Complex(4, -1), Complex(0, 0)));
}

// Tones on exact bins: a band keeps exactly the tones inside it.
TEST(BandPassFilterTest, SeparatesTonesOnBins) {
  const int n = 441;  // 100 Hz bins at 44100 Hz
  const std::vector<float> mix =
      Periodic({{10, 1.0, 0.0}, {50, 1.0, 0.5}, {90, 1.0, 1.0}}, n);
  std::vector<float> out;
  BandPassFilter(mix, &out, 4000.0f, 6000.0f, 44100.0f);
  EXPECT_LT(MaxAbsDifference(out, Periodic({{50, 1.0, 0.5}}, n)), 1e-4);
  HighPassFilter(mix, &out, 8000.0f, 44100.0f);
  EXPECT_LT(MaxAbsDifference(out, Periodic({{90, 1.0, 1.0}}, n)), 1e-4);

  std::vector<float> single = {0.75f};
  HighPassFilter(single, &single, 0.0f, 44100.0f);  // edge limit = rate
  EXPECT_FLOAT_EQ(single[0], 0.75f);
}

#if GTEST_HAS_DEATH_TEST
// Empty inputs and band edges past the spectrum would index out of range.
TEST(KissFftUtilDeathTest, RejectsEmptyInputsAndEdgesPastTheSpectrum) {
  const std::vector<Complex> spectrum(5);
  std::vector<Complex> out;
  EXPECT_DEATH(SpectralBandPassFilter({}, &out, 0, 1, 1),
               CheckFailed("!input_spectrum.empty()"));
  EXPECT_DEATH(SpectralBandPassFilter(spectrum, &out, 0, 5.5f, 1),
               CheckFailed("high_band_edge <= bin_width * spectrum_size"));
  const std::vector<float> signal(10);
  std::vector<float> real_out;
  EXPECT_DEATH(BandPassFilter({}, &real_out, 0, 1, 100),
               CheckFailed("!input.empty()"));
  EXPECT_DEATH(BandPassFilter(signal, &real_out, 0, 55, 100),
               CheckFailed("high_band_edge < sample_rate * (0.5f + 0.5f / "
                           "input.size())"));
}
#endif

}  // namespace
}  // namespace audio_dsp
