#include "audio/dsp/kiss_fft.h"

#include <cmath>
#include <complex>
#include <numbers>
#include <random>
#include <vector>

#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace audio_dsp {
namespace {

using Complex = std::complex<float>;
using sorvel_test::CheckFailed;

// The DFT in double precision, exponent sign -1 (forward) or +1 (inverse),
// with an exact twiddle table indexed by k * n mod N.
std::vector<std::complex<double>> DirectDft(const std::vector<Complex>& x,
                                            int sign) {
  const int n = static_cast<int>(x.size());
  std::vector<std::complex<double>> twiddle(n);
  for (int i = 0; i < n; ++i) {
    twiddle[i] = std::polar(1.0, sign * 2.0 * std::numbers::pi * i / n);
  }
  std::vector<std::complex<double>> y(n);
  for (int k = 0; k < n; ++k) {
    std::complex<double> sum;
    for (int j = 0; j < n; ++j) {
      sum += std::complex<double>(x[j]) *
             twiddle[(static_cast<int64_t>(k) * j) % n];
    }
    y[k] = sum;
  }
  return y;
}

// ||actual - expected|| / ||expected|| over the first `count` values.
template <typename A>
double RelativeError(const std::vector<A>& actual,
                     const std::vector<std::complex<double>>& expected,
                     size_t count) {
  double error = 0.0, norm = 0.0;
  for (size_t i = 0; i < count; ++i) {
    error += std::norm(std::complex<double>(actual[i]) - expected[i]);
    norm += std::norm(expected[i]);
  }
  return std::sqrt(error / norm);
}

std::vector<Complex> RandomComplex(int n, int seed) {
  std::mt19937 rng(seed);
  std::normal_distribution<float> normal;
  std::vector<Complex> x(n);
  for (Complex& v : x) v = {normal(rng), normal(rng)};
  return x;
}

TEST(IsFastFFTSizeTest, FactorsOfTwoThreeFiveTimesSmallRemainder) {
  for (int size : {1, 2, 26, 2 * 3 * 5 * 23, 63, 255, 1024, 2208, 3840}) {
    EXPECT_TRUE(IsFastFFTSize(size)) << size;
  }
  for (int size : {29, 62, 49, 31, 127, 511, 635, 1023, 1905, 2047, 34290}) {
    EXPECT_FALSE(IsFastFFTSize(size)) << size;
  }
}

// Verifies which back end each facade picks.
TEST(FFTTransformerTest, ChoosesBackendBySize) {
  const auto is = [](auto* impl) { return impl != nullptr; };
  const ComplexFFTTransformer fast(1024, false), odd(127, false);
  EXPECT_TRUE(is(dynamic_cast<const KissComplexFFTTransformerImpl*>(&fast.impl())));
  EXPECT_TRUE(is(dynamic_cast<const BluesteinComplexFFTTransformerImpl*>(&odd.impl())));
  const RealFFTTransformer even(2208, false), fast_odd(63, false), slow(254, false);
  EXPECT_TRUE(is(dynamic_cast<const KissRealFFTTransformerImpl*>(&even.impl())));
  EXPECT_FALSE(is(dynamic_cast<const KissRealFFTTransformerImpl*>(&fast_odd.impl())));
  EXPECT_FALSE(is(dynamic_cast<const KissRealFFTTransformerImpl*>(&slow.impl())));
  EXPECT_EQ(BluesteinComplexFFTTransformerImpl(1905).GetInnerSize(), 3840);
}

class FFTAccuracyTest : public testing::TestWithParam<int> {};

// Verifies the complex forward and inverse transforms and the real forward
// transform against the double-precision DFT, and that the normalised
// inverses restore the input.
TEST_P(FFTAccuracyTest, MatchesDirectDft) {
  const int n = GetParam();
  const double tolerance = IsFastFFTSize(n) ? 1e-5 : 1e-4;
  const std::vector<Complex> x = RandomComplex(n, n);

  ComplexFFTTransformer complex_fft(n, /*normalize_inverse=*/false);
  std::vector<Complex> y;
  complex_fft.Forward(x, &y);
  EXPECT_LT(RelativeError(y, DirectDft(x, -1), n), tolerance);
  complex_fft.Inverse(x, &y);
  EXPECT_LT(RelativeError(y, DirectDft(x, +1), n), tolerance);

  ComplexFFTTransformer normalized(n, /*normalize_inverse=*/true);
  std::vector<Complex> round_trip;
  normalized.Forward(x, &y);
  normalized.Inverse(y, &round_trip);
  std::vector<std::complex<double>> expected_x(x.begin(), x.end());
  EXPECT_LT(RelativeError(round_trip, expected_x, n), tolerance);

  std::vector<float> real(n);
  std::vector<Complex> real_as_complex(n);
  for (int i = 0; i < n; ++i) {
    real[i] = x[i].real();
    real_as_complex[i] = {x[i].real(), 0.0f};
  }
  RealFFTTransformer real_fft(n, /*normalize_inverse=*/true);
  ASSERT_EQ(real_fft.GetTransformedSize(), n / 2 + 1);
  std::vector<Complex> spectrum;
  real_fft.Forward(real, &spectrum);
  ASSERT_EQ(spectrum.size(), static_cast<size_t>(n / 2 + 1));
  EXPECT_LT(RelativeError(spectrum, DirectDft(real_as_complex, -1), n / 2 + 1),
            tolerance);
  std::vector<float> real_round_trip;
  real_fft.Inverse(spectrum, &real_round_trip);
  ASSERT_EQ(real_round_trip.size(), static_cast<size_t>(n));
  std::vector<std::complex<double>> expected_real(real.begin(), real.end());
  EXPECT_LT(RelativeError(real_round_trip, expected_real, n), tolerance);
}

INSTANTIATE_TEST_SUITE_P(SmallSizes, FFTAccuracyTest, testing::Range(1, 65));
INSTANTIATE_TEST_SUITE_P(ModemSizes, FFTAccuracyTest,
                         testing::Values(127, 635, 1905, 2047, 2208));
INSTANTIATE_TEST_SUITE_P(LargeNonFastSizes, FFTAccuracyTest,
                         testing::Values(4099, 6002, 10007));

// A whole default token (34290 = 2 * 3^3 * 5 * 127 samples) is too long for
// the direct DFT; a tone on one bin and the round trip pin it down.
TEST(FFTTransformerTest, LongNonFastRealTransform) {
  const int n = 34290, bin = 4321;
  std::vector<float> x(n);
  for (int i = 0; i < n; ++i) {
    x[i] = static_cast<float>(std::cos(2.0 * std::numbers::pi * bin * i / n));
  }
  RealFFTTransformer fft(n, /*normalize_inverse=*/true);
  std::vector<Complex> spectrum;
  fft.Forward(x, &spectrum);
  std::vector<std::complex<double>> expected(spectrum.size());
  expected[bin] = n / 2.0;
  EXPECT_LT(RelativeError(spectrum, expected, spectrum.size()), 1e-4);
  std::vector<float> y;
  fft.Inverse(spectrum, &y);
  EXPECT_LT(RelativeError(y, {x.begin(), x.end()}, n), 1e-4);
}

#if GTEST_HAS_DEATH_TEST
TEST(FFTTransformerDeathTest, RejectsWrongSizes) {
  EXPECT_DEATH(ComplexFFTTransformer(0, false), CheckFailed("size > 0"));
  ComplexFFTTransformer complex_fft(8, false);
  std::vector<Complex> out;
  EXPECT_DEATH(complex_fft.Inverse(std::vector<Complex>(9), &out),
               CheckFailed("input.size() == GetSize()"));
  RealFFTTransformer real_fft(8, false);
  std::vector<float> real_out;
  EXPECT_DEATH(real_fft.Inverse(std::vector<Complex>(8), &real_out),
               CheckFailed("input.size() == GetTransformedSize()"));
}
#endif

}  // namespace
}  // namespace audio_dsp
