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

}  // namespace
}  // namespace audio_dsp
