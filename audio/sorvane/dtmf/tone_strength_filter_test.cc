#include "audio/sorvane/dtmf/tone_strength_filter.h"

#include <algorithm>
#include <cmath>
#include <complex>
#include <numbers>
#include <vector>

#include "gtest/gtest.h"

namespace audio_sorvane {
namespace {

std::vector<float> Tone(double frequency, double sample_rate, int n,
                        double amplitude = 1.0) {
  std::vector<float> x(n);
  for (int i = 0; i < n; ++i) {
    x[i] = static_cast<float>(
        amplitude * std::cos(2.0 * std::numbers::pi * frequency * i / sample_rate));
  }
  return x;
}

TEST(SineTableTest, SineThenCosineQuarterPeriodLater) {
  const float* table = GetSineTable();
  for (int i : {0, 1, 512, 1024, 2047, 3000, 4095}) {
    const double phase = i * 2.0 * std::numbers::pi / 4096;
    EXPECT_NEAR(table[i], std::sin(phase), 1e-7) << i;
    EXPECT_NEAR(table[i + 1024], std::cos(phase), 1e-7) << i;
  }
  EXPECT_EQ(GetSineTable(), table);  // built once per process
}

// Verifies that a tone on the filter frequency settles at the squared block
// sum (amplitude * D / 2)^2, while a tone far beyond the cutoff decays to a
// negligible level.
TEST(ToneStrengthFilterTest, OnToneSteadyFarToneRejected) {
  const double rate = 8000.0;
  const int decimation = 40;  // 200 outputs per second
  ToneStrengthFilter filter(decimation, rate, 740.0, 10.0);
  std::vector<float> out;
  filter.ProcessSamples(Tone(740.0, rate, 16000, 0.5), &out);
  ASSERT_EQ(out.size(), 400u);
  const float expected = std::pow(0.5f * decimation / 2.0f, 2.0f);
  for (size_t i = 300; i < out.size(); ++i) {
    EXPECT_NEAR(out[i], expected, 0.01 * expected) << i;
  }

  ToneStrengthFilter far(decimation, rate, 740.0, 10.0);
  far.ProcessSamples(Tone(1100.0, rate, 16000, 0.5), &out);
  for (size_t i = 300; i < out.size(); ++i) {
    EXPECT_LT(out[i], 1e-3 * expected) << i;
  }
}

// Verifies that partial blocks carry over between calls: any split gives
// the output of one call. Also a decimation factor of 1 gives one output
// per sample, and Reset clears the smoother.
TEST(ToneStrengthFilterTest, BlocksCarryAcrossCalls) {
  const std::vector<float> x = Tone(1000.0, 16000.0, 1000);
  ToneStrengthFilter whole(7, 16000.0, 990.0, 50.0);
  std::vector<float> expected;
  whole.ProcessSamples(x, &expected);
  ASSERT_EQ(expected.size(), 1000u / 7);

  ToneStrengthFilter split(7, 16000.0, 990.0, 50.0);
  std::vector<float> streamed, out;
  size_t pos = 0;
  for (size_t size : {3, 4, 0, 13, 1, 500, 479}) {
    split.ProcessSamples(std::span(x).subspan(pos, size), &out);
    streamed.insert(streamed.end(), out.begin(), out.end());
    pos += size;
  }
  EXPECT_EQ(streamed, expected);

  ToneStrengthFilter every(1, 16000.0, 1000.0, 50.0);
  every.ProcessSamples(x, &out);
  EXPECT_EQ(out.size(), x.size());
  every.Reset();
  every.ProcessSamples(std::span(x).first(1), &out);
  ASSERT_EQ(out.size(), 1u);
  EXPECT_LT(out[0], 0.01f);  // smoother restarted from zero
}

TEST(ToneStrengthFilterTest, DelayMatchesSmootherPole) {
  // Output rate 100 Hz, cutoff 5 Hz: c = cos(0.1 pi), a = (1 - c g) / (1 - g),
  // p = a - sqrt(a^2 - 1) = 0.6179, delay = round(2p / (1 - p)) = 3.
  const ToneStrengthFilter filter(80, 8000.0, 700.0, 5.0);
  EXPECT_EQ(filter.delay(), 3);
}

// Verifies that the raw block sums come one per output, each the unsmoothed
// complex sum of its block: an on-frequency tone of amplitude A gives
// magnitude A * D / 2 (within the image at twice the tone) from the first
// block on, whatever the call sizes.
TEST(ToneStrengthFilterTest, BlockSumsAreRawBlockIntegrals) {
  const int decimation = 40;
  ToneStrengthFilter filter(decimation, 8000.0, 750.0, 10.0);
  const std::vector<float> x = Tone(750.0, 8000.0, 4000, 2.0);
  std::vector<float> out;
  std::vector<std::complex<float>> sums, all;
  for (size_t start = 0; start < x.size(); start += 333) {
    const size_t n = std::min<size_t>(333, x.size() - start);
    filter.ProcessSamples(std::span<const float>(x).subspan(start, n), &out, &sums);
    EXPECT_EQ(sums.size(), out.size());
    all.insert(all.end(), sums.begin(), sums.end());
  }
  ASSERT_EQ(all.size(), x.size() / decimation);
  for (const std::complex<float>& z : all) EXPECT_NEAR(std::abs(z), 2.0 * decimation / 2, 1.5);  // the 2f image: about 1
}

}  // namespace
}  // namespace audio_sorvane
