// A complex FFT for power-of-four lengths on split real and imaginary
// arrays, with four butterflies at a time in SIMD registers: several times
// faster than the general transformers of kiss_fft.h at the short lengths
// where a per-window transform dominates a detector's cost.
//
// Forward: X[k] = sum_n x[n] exp(-2 pi i k n / N); Inverse: the same with
// +2 pi i, unnormalised. Radix-4 Stockham stages, so the output comes out in
// natural order without a bit-reversal pass. Tables are built at
// construction; the object holds scratch space and must not be used by two
// threads at once.
#ifndef AUDIO_DSP_RADIX4_FFT_H_
#define AUDIO_DSP_RADIX4_FFT_H_

#include <vector>

namespace audio_dsp {

class Radix4Fft {
 public:
  // `size` must be a power of four, at least 16 (CHECK).
  explicit Radix4Fft(int size);

  int size() const { return size_; }
  // Picks eight butterflies at a time (x86 with AVX2 and FMA, sizes from
  // 64) or four; by default the widest available. Outputs agree to
  // rounding. Returns false, changing nothing, if the wide path is missing.
  bool UseWide(bool wide);
  // `size` values in from (re, im), out to (out_re, out_im); the outputs may
  // be the inputs.
  void Forward(const float* re, const float* im, float* out_re, float* out_im);
  void Inverse(const float* re, const float* im, float* out_re, float* out_im) {
    // Swapping real and imaginary parts turns a forward into an inverse
    // transform: swap(DFT(swap(x))) = N * IDFT(x).
    Forward(im, re, out_im, out_re);
  }

 private:
  int size_;
  // Per stage after the first, per group of four butterflies: the twiddles
  // w^1, w^2, w^3, real and imaginary, four lanes each.
  std::vector<float> twiddles_;
  std::vector<float> wide_twiddles_;  // the same per group of eight
  bool wide_ = false;
  std::vector<float> a_re_, a_im_, b_re_, b_im_;
};

}  // namespace audio_dsp

#endif  // AUDIO_DSP_RADIX4_FFT_H_
