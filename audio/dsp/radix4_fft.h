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

#include <complex>
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
  void Forward(const float* re, const float* im, float* out_re, float* out_im) {
    Run(re, im, nullptr, out_re, out_im, 0.0f, nullptr);
  }
  void Inverse(const float* re, const float* im, float* out_re, float* out_im) {
    // Swapping real and imaginary parts turns a forward into an inverse
    // transform: swap(DFT(swap(x))) = N * IDFT(x).
    Forward(im, re, out_im, out_re);
  }
  // The powers of a cyclic cross-correlation: scale |Inverse(x * y)[k]|^2
  // into `powers` (`size` values), where the product is taken on the first
  // n bins (a multiple of eight) and is zero above. The product and the
  // powers are formed inside the transform's first and last stages, without
  // passes of their own.
  void InverseProductPowers(const float* x_re, const float* x_im, const float* y_re,
                            const float* y_im, int n, float scale, float* powers);

  struct Product;

 private:
  // The forward transform of (re, im), or with `product` of its swapped
  // product; into (out_re, out_im), or with `powers` their scaled powers.
  void Run(const float* re, const float* im, const Product* product, float* out_re,
           float* out_im, float power_scale, float* powers);

  int size_;
  // Per stage after the first, per group of four butterflies (the groups
  // of one sub-transform length ns; they repeat along the stage): the
  // twiddles w^1, w^2, w^3, real and imaginary, four lanes each; built when
  // the four-lane path is used.
  std::vector<float> twiddles_;
  std::vector<float> wide_twiddles_;  // the same per group of eight, for the wide path
  bool wide_ = false;
  std::vector<float> a_re_, a_im_, b_re_, b_im_;
};

// A complex FFT of interleaved values for power-of-two sizes from 16:
// Radix4Fft itself on sizes 4^k, and on 2 * 4^k Radix4Fft of the even and
// of the odd samples joined by one radix-2 stage. Several times faster than
// the KISS transformer at the sizes of a frame's lag profile. Forward and
// inverse as Radix4Fft's; with `normalize_inverse`, inverse outputs are
// scaled by 1 / size. The outputs may be the inputs. Holds scratch: not for
// two threads at once.
class PowerOfTwoFft {
 public:
  // `size` must be a power of two, at least 16 (CHECK).
  PowerOfTwoFft(int size, bool normalize_inverse);
  int GetSize() const { return size_; }
  void Forward(const std::complex<float>* input, std::complex<float>* output) {
    Run(input, output, false);
  }
  void Inverse(const std::complex<float>* input, std::complex<float>* output) {
    Run(input, output, true);
  }

 private:
  void Run(const std::complex<float>* input, std::complex<float>* output, bool inverse);
  template <bool kInverse>
  void Pass(const std::complex<float>* input, std::complex<float>* output, float scale);

  int size_;
  int half_;  // the radix-4 length: size_ or size_ / 2
  bool normalize_inverse_;
  Radix4Fft fft_;
  std::vector<float> twiddle_re_, twiddle_im_;  // exp(-2 pi i k / size_), k < half_
  // The (even) samples, then their transform; the odd ones likewise.
  std::vector<float> even_re_, even_im_, odd_re_, odd_im_;
};

}  // namespace audio_dsp

#endif  // AUDIO_DSP_RADIX4_FFT_H_
