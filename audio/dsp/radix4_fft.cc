#include "audio/dsp/radix4_fft.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <numbers>
#include <vector>

#include "audio/dsp/float4.h"
#include "audio/dsp/multiversion.h"
#include "base/logging.h"

namespace audio_dsp {
namespace {

struct Complex4 {
  Float4 re, im;
};

Complex4 Load(const float* re, const float* im, int at) { return {Load4(re + at), Load4(im + at)}; }

void Store(float* re, float* im, int at, Complex4 v) {
  Store4(re + at, v.re);
  Store4(im + at, v.im);
}

Complex4 Multiply(Complex4 a, const float* w) {
  const Float4 wr = Load4(w), wi = Load4(w + 4);
  return {a.re * wr - a.im * wi, a.re * wi + a.im * wr};
}

}  // namespace

// The input of InverseProductPowers: the product of two spectra on their
// first n bins, zero above.
struct Radix4Fft::Product {
  const float *x_re, *x_im, *y_re, *y_im;
  int n;
};

namespace {

// The first stage's input at `at`: four values of (re, im), or with a
// product, four of x * y with real and imaginary parts swapped (an inverse
// transform run as a forward one).
Complex4 FirstInput(const float* re, const float* im, const Radix4Fft::Product* product, int at) {
  if (product == nullptr) return Load(re, im, at);
  if (at >= product->n) return {Float4{}, Float4{}};
  const Float4 a = Load4(product->x_re + at), b = Load4(product->x_im + at);
  const Float4 c = Load4(product->y_re + at), d = Load4(product->y_im + at);
  return {a * d + b * c, a * c - b * d};
}

// The four-point DFT of a0..a3 (exponent -2 pi i), in place, lane-wise.
template <typename Complex>
inline __attribute__((always_inline)) void Butterfly(Complex& a0, Complex& a1, Complex& a2, Complex& a3) {
  const Complex t0{a0.re + a2.re, a0.im + a2.im};
  const Complex t1{a0.re - a2.re, a0.im - a2.im};
  const Complex t2{a1.re + a3.re, a1.im + a3.im};
  // -i (a1 - a3)
  const Complex t3{a1.im - a3.im, a3.re - a1.re};
  a0 = {t0.re + t2.re, t0.im + t2.im};
  a2 = {t0.re - t2.re, t0.im - t2.im};
  a1 = {t1.re + t3.re, t1.im + t3.im};
  a3 = {t1.re - t3.re, t1.im - t3.im};
}

// Butterfly when a2 and a3 are zero (an input zero past the first half).
template <typename Complex>
inline __attribute__((always_inline)) void HalfButterfly(Complex& a0, Complex& a1, Complex& a2, Complex& a3) {
  a2 = {a0.re - a1.re, a0.im - a1.im};
  a3 = {a0.re - a1.im, a0.im + a1.re};
  const Complex t1{a0.re + a1.im, a0.im - a1.re};  // a0 - i a1
  a0 = {a0.re + a1.re, a0.im + a1.im};
  a1 = t1;
}

// Whether the first stage's inputs from the second half on are zero: a
// product on no more than half the bins.
inline bool SecondHalfZero(const Radix4Fft::Product* product, int size) {
  return product != nullptr && product->n <= size / 2;
}

// Where stage `ns` of a transform of `size` writes: the output after the
// last stage, else whichever scratch pair the previous stage did not.
inline __attribute__((always_inline)) void StageDestination(int ns, int size, const float* src_re,
                                                            float* out_re, float* out_im,
                                                            float* a_re, float* a_im, float* b_re,
                                                            float* b_im, float** dst_re,
                                                            float** dst_im) {
  const bool last = ns * 4 == size;
  *dst_re = last ? out_re : src_re == a_re ? b_re : a_re;
  *dst_im = last ? out_im : src_re == a_re ? b_im : a_im;
}

// Twiddles of every stage after the first, per group of `lanes` butterflies
// and r = 1..3: exp(-2 pi i r k / (4 ns)) for lane l's k = (j + l) mod ns,
// the real parts of the group, then the imaginary. They repeat every ns
// butterflies, so only the groups with j < max(ns, lanes) are kept
// (StageGroups of them per stage); group j reads TwiddleGroup's.
int StageGroups(int ns, int lanes) { return std::max(ns / lanes, 1); }
int TwiddleGroup(int j, int ns, int lanes) { return (j & (ns - 1)) / lanes; }  // ns: a power of four

std::vector<float> StageTwiddles(int size, int lanes) {
  std::vector<float> twiddles;
  for (int ns = 4; ns < size; ns *= 4) {
    for (int j = 0; j < StageGroups(ns, lanes) * lanes; j += lanes) {
      for (int r = 1; r <= 3; ++r) {
        for (int part = 0; part < 2; ++part) {
          for (int lane = 0; lane < lanes; ++lane) {
            const double angle = -2.0 * std::numbers::pi * r * ((j + lane) % ns) / (4.0 * ns);
            twiddles.push_back(static_cast<float>(part == 0 ? std::cos(angle) : std::sin(angle)));
          }
        }
      }
    }
  }
  return twiddles;
}

// The transform of `size` values through the scratch pairs a and b, with
// the stages' twiddles `w`. With `powers`, the last stage writes
// power_scale |X[k]|^2 there instead of X to out_re and out_im.
SORVEL_MULTIVERSION void Transform(int size, const float* w, const float* re, const float* im,
                                   const Radix4Fft::Product* product, float* out_re,
                                   float* out_im, float* a_re, float* a_im, float* b_re,
                                   float* b_im, float power_scale, float* powers) {
  const int quarter = size / 4;
  // First stage: length-4 transforms of x[j + r quarter], written to
  // 4 j + r (a transpose of each group of four butterflies).
  float* dst_re = a_re;
  float* dst_im = a_im;
  const bool half_zero = SecondHalfZero(product, size);
  for (int j = 0; j < quarter; j += 4) {
    Complex4 a0 = FirstInput(re, im, product, j), a1 = FirstInput(re, im, product, j + quarter);
    Complex4 a2, a3;
    if (half_zero) {
      HalfButterfly(a0, a1, a2, a3);
    } else {
      a2 = FirstInput(re, im, product, j + 2 * quarter);
      a3 = FirstInput(re, im, product, j + 3 * quarter);
      Butterfly(a0, a1, a2, a3);
    }
    Transpose4(a0.re, a1.re, a2.re, a3.re);
    Transpose4(a0.im, a1.im, a2.im, a3.im);
    Store(dst_re, dst_im, 4 * j, a0);
    Store(dst_re, dst_im, 4 * j + 4, a1);
    Store(dst_re, dst_im, 4 * j + 8, a2);
    Store(dst_re, dst_im, 4 * j + 12, a3);
  }
  const float* src_re = dst_re;
  const float* src_im = dst_im;
  for (int ns = 4; ns < size; ns *= 4) {
    StageDestination(ns, size, src_re, out_re, out_im, a_re, a_im, b_re, b_im, &dst_re, &dst_im);
    for (int j = 0; j < quarter; j += 4) {
      const float* wj = w + TwiddleGroup(j, ns, 4) * 24;
      Complex4 a0 = Load(src_re, src_im, j);
      Complex4 a1 = Multiply(Load(src_re, src_im, j + quarter), wj);
      Complex4 a2 = Multiply(Load(src_re, src_im, j + 2 * quarter), wj + 8);
      Complex4 a3 = Multiply(Load(src_re, src_im, j + 3 * quarter), wj + 16);
      Butterfly(a0, a1, a2, a3);
      const int k = j & (ns - 1);  // j mod ns
      const int base = (j - k) * 4 + k;
      if (powers != nullptr && ns * 4 == size) {
        const Float4 scale = Splat4(power_scale);
        Store4(powers + base, (a0.re * a0.re + a0.im * a0.im) * scale);
        Store4(powers + base + ns, (a1.re * a1.re + a1.im * a1.im) * scale);
        Store4(powers + base + 2 * ns, (a2.re * a2.re + a2.im * a2.im) * scale);
        Store4(powers + base + 3 * ns, (a3.re * a3.re + a3.im * a3.im) * scale);
        continue;
      }
      Store(dst_re, dst_im, base, a0);
      Store(dst_re, dst_im, base + ns, a1);
      Store(dst_re, dst_im, base + 2 * ns, a2);
      Store(dst_re, dst_im, base + 3 * ns, a3);
    }
    w += StageGroups(ns, 4) * 24;
    src_re = dst_re;
    src_im = dst_im;
  }
}

#if defined(SORVEL_WIDE_PATHS)
struct ComplexWide {
  Wide re, im;
};

#define SORVEL_LOAD_COMPLEX(re, im, at) \
  ComplexWide { SORVEL_LOAD_WIDE((re) + (at)), SORVEL_LOAD_WIDE((im) + (at)) }

// FirstInput eight values at a time (n a multiple of eight).
SORVEL_WIDE inline ComplexWide FirstInputWide(const float* re, const float* im,
                                              const Radix4Fft::Product* product, int at) {
  if (product == nullptr) return SORVEL_LOAD_COMPLEX(re, im, at);
  if (at >= product->n) return {Wide{}, Wide{}};
  const Wide a = SORVEL_LOAD_WIDE(product->x_re + at), b = SORVEL_LOAD_WIDE(product->x_im + at);
  const Wide c = SORVEL_LOAD_WIDE(product->y_re + at), d = SORVEL_LOAD_WIDE(product->y_im + at);
  return {a * d + b * c, a * c - b * d};
}

// a *= the twiddles at tw (eight real parts, then eight imaginary).
SORVEL_WIDE inline void MultiplyWide(ComplexWide& a, const float* tw) {
  const Wide wr = SORVEL_LOAD_WIDE(tw), wi = SORVEL_LOAD_WIDE(tw + 8);
  const Wide r = a.re * wr - a.im * wi;
  a.im = a.re * wi + a.im * wr;
  a.re = r;
}

// Transposes the 4 x 4 matrices in the low and in the high halves of the
// rows v0..v3.
SORVEL_WIDE inline void TransposeHalves(Wide& v0, Wide& v1, Wide& v2, Wide& v3) {
  const Wide t0 = __builtin_shufflevector(v0, v1, 0, 8, 1, 9, 4, 12, 5, 13);
  const Wide t1 = __builtin_shufflevector(v2, v3, 0, 8, 1, 9, 4, 12, 5, 13);
  const Wide t2 = __builtin_shufflevector(v0, v1, 2, 10, 3, 11, 6, 14, 7, 15);
  const Wide t3 = __builtin_shufflevector(v2, v3, 2, 10, 3, 11, 6, 14, 7, 15);
  v0 = __builtin_shufflevector(t0, t1, 0, 1, 8, 9, 4, 5, 12, 13);
  v1 = __builtin_shufflevector(t0, t1, 2, 3, 10, 11, 6, 7, 14, 15);
  v2 = __builtin_shufflevector(t2, t3, 0, 1, 8, 9, 4, 5, 12, 13);
  v3 = __builtin_shufflevector(t2, t3, 2, 3, 10, 11, 6, 7, 14, 15);
}

// Stores the low halves of v0..v3 at dst + at, +4, +8, +12 and the high
// halves at +16 .. +28.
SORVEL_WIDE inline void StoreHalves(float* dst, int at, const Wide& v0, const Wide& v1,
                                    const Wide& v2, const Wide& v3) {
  SORVEL_STORE_WIDE(dst + at, __builtin_shufflevector(v0, v1, 0, 1, 2, 3, 8, 9, 10, 11));
  SORVEL_STORE_WIDE(dst + at + 8, __builtin_shufflevector(v2, v3, 0, 1, 2, 3, 8, 9, 10, 11));
  SORVEL_STORE_WIDE(dst + at + 16, __builtin_shufflevector(v0, v1, 4, 5, 6, 7, 12, 13, 14, 15));
  SORVEL_STORE_WIDE(dst + at + 24, __builtin_shufflevector(v2, v3, 4, 5, 6, 7, 12, 13, 14, 15));
}

// Transform with eight butterflies at a time, for sizes of at least 64.
// Twiddles `w` per stage after the first and group of eight butterflies:
// w^1, w^2, w^3, real and imaginary, eight lanes each. Where a group's
// outputs are not eight in a row (the first two stages), each 128-bit half
// holds four of them. `powers` as Transform's.
SORVEL_WIDE void TransformWide(int size, const float* w, const float* re, const float* im,
                               const Radix4Fft::Product* product, float* out_re, float* out_im,
                               float* a_re, float* a_im, float* b_re, float* b_im,
                               float power_scale, float* powers) {
  const int quarter = size / 4;
  float* dst_re = a_re;
  float* dst_im = a_im;
  const bool half_zero = SecondHalfZero(product, size);
  for (int j = 0; j < quarter; j += 8) {
    ComplexWide a0 = FirstInputWide(re, im, product, j);
    ComplexWide a1 = FirstInputWide(re, im, product, j + quarter);
    ComplexWide a2, a3;
    if (half_zero) {
      HalfButterfly(a0, a1, a2, a3);
    } else {
      a2 = FirstInputWide(re, im, product, j + 2 * quarter);
      a3 = FirstInputWide(re, im, product, j + 3 * quarter);
      Butterfly(a0, a1, a2, a3);
    }
    // Lane l's four outputs go to 4 (j + l) .. 4 (j + l) + 3.
    TransposeHalves(a0.re, a1.re, a2.re, a3.re);
    TransposeHalves(a0.im, a1.im, a2.im, a3.im);
    StoreHalves(dst_re, 4 * j, a0.re, a1.re, a2.re, a3.re);
    StoreHalves(dst_im, 4 * j, a0.im, a1.im, a2.im, a3.im);
  }
  const float* src_re = dst_re;
  const float* src_im = dst_im;
  for (int ns = 4; ns < size; ns *= 4) {
    StageDestination(ns, size, src_re, out_re, out_im, a_re, a_im, b_re, b_im, &dst_re, &dst_im);
    for (int j = 0; j < quarter; j += 8) {
      const float* wj = w + TwiddleGroup(j, ns, 8) * 48;
      ComplexWide a0 = SORVEL_LOAD_COMPLEX(src_re, src_im, j);
      ComplexWide a1 = SORVEL_LOAD_COMPLEX(src_re, src_im, j + quarter);
      ComplexWide a2 = SORVEL_LOAD_COMPLEX(src_re, src_im, j + 2 * quarter);
      ComplexWide a3 = SORVEL_LOAD_COMPLEX(src_re, src_im, j + 3 * quarter);
      MultiplyWide(a1, wj);
      MultiplyWide(a2, wj + 16);
      MultiplyWide(a3, wj + 32);
      Butterfly(a0, a1, a2, a3);
      if (ns == 4) {  // lanes 0-3 go to 4 j + r ns + l, lanes 4-7 16 further
        StoreHalves(dst_re, 4 * j, a0.re, a1.re, a2.re, a3.re);
        StoreHalves(dst_im, 4 * j, a0.im, a1.im, a2.im, a3.im);
        continue;
      }
      const int k = j & (ns - 1);  // j mod ns
      const int base = (j - k) * 4 + k;
      if (powers != nullptr && ns * 4 == size) {  // the last stage, from size 64: ns >= 16
        const Wide scale = {power_scale, power_scale, power_scale, power_scale,
                            power_scale, power_scale, power_scale, power_scale};
        for (int r = 0; r < 4; ++r) {
          const ComplexWide& a = r == 0 ? a0 : r == 1 ? a1 : r == 2 ? a2 : a3;
          SORVEL_STORE_WIDE(powers + base + r * ns, (a.re * a.re + a.im * a.im) * scale);
        }
        continue;
      }
      for (int r = 0; r < 4; ++r) {
        const ComplexWide& a = r == 0 ? a0 : r == 1 ? a1 : r == 2 ? a2 : a3;
        SORVEL_STORE_WIDE(dst_re + base + r * ns, a.re);
        SORVEL_STORE_WIDE(dst_im + base + r * ns, a.im);
      }
    }
    w += StageGroups(ns, 8) * 48;
    src_re = dst_re;
    src_im = dst_im;
  }
}
#undef SORVEL_LOAD_COMPLEX
#endif

}  // namespace

Radix4Fft::Radix4Fft(int size) : size_(size) {
  int n = size;
  while (n > 1 && n % 4 == 0) n /= 4;
  CHECK(size >= 16 && n == 1);
  // Stage with sub-transforms of length ns (4, 16, ... size / 4): butterfly
  // j multiplies its inputs r = 1..3 by exp(-2 pi i r k / (4 ns)),
  // k = j mod ns; grouped by four lanes, and by eight for the wide path.
  // Only the table of the path in use is built (a second one is made if a
  // caller switches paths).
  wide_ = size >= 64 && HasWidePaths();
  if (wide_) {
    wide_twiddles_ = StageTwiddles(size, 8);
  } else {
    twiddles_ = StageTwiddles(size, 4);
  }
  a_re_.resize(size);
  a_im_.resize(size);
  b_re_.resize(size);
  b_im_.resize(size);
}

bool Radix4Fft::UseWide(bool wide) {
  if (wide && (size_ < 64 || !HasWidePaths())) return false;
  std::vector<float>& table = wide ? wide_twiddles_ : twiddles_;
  if (table.empty()) table = StageTwiddles(size_, wide ? 8 : 4);
  wide_ = wide;
  return true;
}

void Radix4Fft::Run(const float* re, const float* im, const Product* product, float* out_re,
                    float* out_im, float power_scale, float* powers) {
#if defined(SORVEL_WIDE_PATHS)
  if (wide_) {
    TransformWide(size_, wide_twiddles_.data(), re, im, product, out_re, out_im, a_re_.data(),
                  a_im_.data(), b_re_.data(), b_im_.data(), power_scale, powers);
    return;
  }
#endif
  Transform(size_, twiddles_.data(), re, im, product, out_re, out_im, a_re_.data(),
            a_im_.data(), b_re_.data(), b_im_.data(), power_scale, powers);
}

void Radix4Fft::InverseProductPowers(const float* x_re, const float* x_im, const float* y_re,
                                     const float* y_im, int n, float scale, float* powers) {
  CHECK(n >= 0 && n <= size_ && n % 8 == 0);
  const Product product{x_re, x_im, y_re, y_im, n};
  Run(nullptr, nullptr, &product, nullptr, nullptr, scale, powers);
}

namespace {

int RadixFourLength(int size) {
  CHECK(size >= 16 && std::has_single_bit(static_cast<unsigned>(size)));
  return std::countr_zero(static_cast<unsigned>(size)) % 2 == 0 ? size : size / 2;
}

}  // namespace

PowerOfTwoFft::PowerOfTwoFft(int size, bool normalize_inverse)
    : size_(size),
      half_(RadixFourLength(size)),
      normalize_inverse_(normalize_inverse),
      fft_(half_),
      even_re_(half_),
      even_im_(half_),
      odd_re_(half_),
      odd_im_(half_) {
  if (half_ == size_) return;
  for (int k = 0; k < half_; ++k) {
    const double angle = -2.0 * std::numbers::pi * k / size_;
    twiddle_re_.push_back(static_cast<float>(std::cos(angle)));
    twiddle_im_.push_back(static_cast<float>(std::sin(angle)));
  }
}

void PowerOfTwoFft::Run(const std::complex<float>* input, std::complex<float>* output,
                        bool inverse) {
  if (inverse) {
    Pass<true>(input, output, normalize_inverse_ ? 1.0f / static_cast<float>(size_) : 1.0f);
  } else {
    Pass<false>(input, output, 1.0f);
  }
}

// Interleaves four real and four imaginary parts into four complex values
// at y.
inline void StoreInterleaved(float* y, Float4 re, Float4 im) {
  Store4(y, __builtin_shufflevector(re, im, 0, 4, 1, 5));
  Store4(y + 4, __builtin_shufflevector(re, im, 2, 6, 3, 7));
}

template <bool kInverse>
void PowerOfTwoFft::Pass(const std::complex<float>* input, std::complex<float>* output,
                         float scale) {
  // The inverse is the forward transform of the input with real and
  // imaginary parts swapped, swapped back (see Radix4Fft::Inverse). Four
  // values at a time: sizes are multiples of 16.
  const float* x = reinterpret_cast<const float*>(input);
  float* y = reinterpret_cast<float*>(output);
  float* const er = kInverse ? even_im_.data() : even_re_.data();
  float* const ei = kInverse ? even_re_.data() : even_im_.data();
  float* const odr = kInverse ? odd_im_.data() : odd_re_.data();
  float* const odi = kInverse ? odd_re_.data() : odd_im_.data();
  const Float4 gain = Splat4(scale);
  if (half_ == size_) {
    for (int m = 0; m < size_; m += 4) {
      const Float4 a = Load4(x + 2 * m), b = Load4(x + 2 * m + 4);
      Store4(er + m, __builtin_shufflevector(a, b, 0, 2, 4, 6));
      Store4(ei + m, __builtin_shufflevector(a, b, 1, 3, 5, 7));
    }
    fft_.Forward(even_re_.data(), even_im_.data(), even_re_.data(), even_im_.data());
    for (int k = 0; k < size_; k += 4) {
      StoreInterleaved(y + 2 * k, Load4(er + k) * gain, Load4(ei + k) * gain);
    }
    return;
  }
  for (int m = 0; m < half_; m += 4) {
    // Complex samples 2m .. 2m + 7: rows become even re, even im, odd re, odd im.
    Float4 v0 = Load4(x + 4 * m), v1 = Load4(x + 4 * m + 4);
    Float4 v2 = Load4(x + 4 * m + 8), v3 = Load4(x + 4 * m + 12);
    Transpose4(v0, v1, v2, v3);
    Store4(er + m, v0);
    Store4(ei + m, v1);
    Store4(odr + m, v2);
    Store4(odi + m, v3);
  }
  fft_.Forward(even_re_.data(), even_im_.data(), even_re_.data(), even_im_.data());
  fft_.Forward(odd_re_.data(), odd_im_.data(), odd_re_.data(), odd_im_.data());
  // X[k] = E[k] + w^k O[k], X[k + size / 2] = E[k] - w^k O[k], on the
  // transform's own real and imaginary parts (swapped for the inverse).
  const float* fr = even_re_.data();
  const float* fi = even_im_.data();
  const float* gr = odd_re_.data();
  const float* gi = odd_im_.data();
  float* upper = y + 2 * half_;
  for (int k = 0; k < half_; k += 4) {
    const Float4 wr = Load4(twiddle_re_.data() + k), wi = Load4(twiddle_im_.data() + k);
    const Float4 orr = Load4(gr + k), oi = Load4(gi + k);
    const Float4 tr = wr * orr - wi * oi, ti = wr * oi + wi * orr;
    const Float4 e_re = Load4(fr + k), e_im = Load4(fi + k);
    const Float4 lo_re = (e_re + tr) * gain, lo_im = (e_im + ti) * gain;
    const Float4 hi_re = (e_re - tr) * gain, hi_im = (e_im - ti) * gain;
    if (kInverse) {
      StoreInterleaved(y + 2 * k, lo_im, lo_re);
      StoreInterleaved(upper + 2 * k, hi_im, hi_re);
    } else {
      StoreInterleaved(y + 2 * k, lo_re, lo_im);
      StoreInterleaved(upper + 2 * k, hi_re, hi_im);
    }
  }
}

}  // namespace audio_dsp
