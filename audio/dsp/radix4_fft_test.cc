#include "audio/dsp/radix4_fft.h"

#include <complex>
#include <random>
#include <vector>

#include "audio/dsp/kiss_fft.h"
#include "gtest/gtest.h"

namespace audio_dsp {
namespace {

// Verifies both directions against the general transformer on random
// inputs at every power-of-four length up to 4096, in place and not, on the
// four- and (where the processor has it) the eight-lane path: the largest
// difference stays within float rounding of the outputs' scale.
TEST(Radix4FftTest, MatchesGeneralTransform) {
  std::mt19937 rng(5);
  std::normal_distribution<float> normal;
  for (int size : {16, 64, 256, 1024, 4096}) {
    std::vector<std::complex<float>> x(size), expected_forward(size), expected_inverse(size);
    for (auto& v : x) v = {normal(rng), normal(rng)};
    ComplexFFTTransformer reference(size, /*normalize_inverse=*/false);
    reference.Forward(x.data(), expected_forward.data());
    reference.Inverse(x.data(), expected_inverse.data());

    for (bool wide : {false, true}) {
      Radix4Fft fft(size);
      if (!fft.UseWide(wide)) continue;
      std::vector<float> re(size), im(size), out_re(size), out_im(size);
      for (int i = 0; i < size; ++i) {
        re[i] = x[i].real();
        im[i] = x[i].imag();
      }
      const float tolerance = 1e-5f * std::sqrt(static_cast<float>(size)) * std::log2(static_cast<float>(size));
      fft.Forward(re.data(), im.data(), out_re.data(), out_im.data());
      for (int k = 0; k < size; ++k) {
        ASSERT_NEAR(out_re[k], expected_forward[k].real(), tolerance) << size << (wide ? " wide" : "") << " bin " << k;
        ASSERT_NEAR(out_im[k], expected_forward[k].imag(), tolerance) << size << (wide ? " wide" : "") << " bin " << k;
      }
      fft.Inverse(re.data(), im.data(), re.data(), im.data());  // in place
      for (int k = 0; k < size; ++k) {
        ASSERT_NEAR(re[k], expected_inverse[k].real(), tolerance) << size << (wide ? " wide" : "") << " sample " << k;
        ASSERT_NEAR(im[k], expected_inverse[k].imag(), tolerance) << size << (wide ? " wide" : "") << " sample " << k;
      }
    }
  }
}

// The fused correlation powers against an explicit product, inverse and
// powers, for products that fill all, more than half, half (the first
// stage then skips the zero half) or none of the bins, on both paths.
TEST(Radix4FftTest, InverseProductPowersMatchesExplicitSteps) {
  std::mt19937 rng(7);
  std::normal_distribution<float> normal;
  for (int size : {16, 64, 256}) {
    std::vector<float> x_re(size), x_im(size), y_re(size), y_im(size);
    for (auto* v : {&x_re, &x_im, &y_re, &y_im}) {
      for (float& f : *v) f = normal(rng);
    }
    for (int n : {size, size * 11 / 16 / 8 * 8, size / 2, 0}) {
      std::vector<std::complex<float>> product(size), lags(size);
      for (int i = 0; i < n; ++i) product[i] = std::complex(x_re[i], x_im[i]) * std::complex(y_re[i], y_im[i]);
      ComplexFFTTransformer(size, /*normalize_inverse=*/false).Inverse(product.data(), lags.data());
      for (bool wide : {false, true}) {
        Radix4Fft fft(size);
        if (!fft.UseWide(wide)) continue;
        std::vector<float> powers(size, -1.0f);
        fft.InverseProductPowers(x_re.data(), x_im.data(), y_re.data(), y_im.data(), n, 0.5f,
                                 powers.data());
        for (int k = 0; k < size; ++k) {
          const float expected = 0.5f * std::norm(lags[k]);
          ASSERT_NEAR(powers[k], expected, 1e-4f * size + 1e-5f * expected)
              << size << " n " << n << (wide ? " wide" : "") << " lag " << k;
        }
      }
    }
  }
}

// The power-of-two transform against the general one at odd and even
// powers of two, both directions (the inverse normalised), in place and not.
TEST(PowerOfTwoFftTest, MatchesGeneralTransform) {
  std::mt19937 rng(6);
  std::normal_distribution<float> normal;
  for (int size : {16, 32, 128, 256, 2048}) {
    std::vector<std::complex<float>> x(size), forward(size), inverse(size);
    for (auto& v : x) v = {normal(rng), normal(rng)};
    ComplexFFTTransformer reference(size, /*normalize_inverse=*/true);
    reference.Forward(x.data(), forward.data());
    reference.Inverse(x.data(), inverse.data());
    PowerOfTwoFft fft(size, /*normalize_inverse=*/true);
    ASSERT_EQ(fft.GetSize(), size);
    std::vector<std::complex<float>> out(size), in_place = x;
    fft.Forward(x.data(), out.data());
    fft.Inverse(in_place.data(), in_place.data());
    const float tolerance = 1e-5f * std::sqrt(static_cast<float>(size)) * std::log2(static_cast<float>(size));
    for (int k = 0; k < size; ++k) {
      ASSERT_LT(std::abs(out[k] - forward[k]), tolerance) << size << " bin " << k;
      ASSERT_LT(std::abs(in_place[k] - inverse[k]), tolerance / size) << size << " sample " << k;
    }
  }
}

}  // namespace
}  // namespace audio_dsp
