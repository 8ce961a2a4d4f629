#include "audio/dsp/radix4_fft.h"

#include <cmath>
#include <numbers>

#include "audio/dsp/float4.h"
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

// The four-point DFT of a0..a3 (exponent -2 pi i), in place.
void Butterfly(Complex4& a0, Complex4& a1, Complex4& a2, Complex4& a3) {
  const Complex4 t0{a0.re + a2.re, a0.im + a2.im};
  const Complex4 t1{a0.re - a2.re, a0.im - a2.im};
  const Complex4 t2{a1.re + a3.re, a1.im + a3.im};
  // -i (a1 - a3)
  const Complex4 t3{a1.im - a3.im, a3.re - a1.re};
  a0 = {t0.re + t2.re, t0.im + t2.im};
  a2 = {t0.re - t2.re, t0.im - t2.im};
  a1 = {t1.re + t3.re, t1.im + t3.im};
  a3 = {t1.re - t3.re, t1.im - t3.im};
}

}  // namespace

Radix4Fft::Radix4Fft(int size) : size_(size) {
  int n = size;
  while (n > 1 && n % 4 == 0) n /= 4;
  CHECK(size >= 16 && n == 1);
  // Stage with sub-transforms of length ns (4, 16, ... size / 4): butterfly
  // j (lane of a group of four) multiplies its inputs r = 1..3 by
  // exp(-2 pi i r k / (4 ns)), k = j mod ns.
  for (int ns = 4; ns < size; ns *= 4) {
    for (int j = 0; j < size / 4; j += 4) {
      for (int r = 1; r <= 3; ++r) {
        float re[4], im[4];
        for (int lane = 0; lane < 4; ++lane) {
          const int k = (j + lane) % ns;
          const double angle = -2.0 * std::numbers::pi * r * k / (4.0 * ns);
          re[lane] = static_cast<float>(std::cos(angle));
          im[lane] = static_cast<float>(std::sin(angle));
        }
        twiddles_.insert(twiddles_.end(), re, re + 4);
        twiddles_.insert(twiddles_.end(), im, im + 4);
      }
    }
  }
  a_re_.resize(size);
  a_im_.resize(size);
  b_re_.resize(size);
  b_im_.resize(size);
}

void Radix4Fft::Forward(const float* re, const float* im, float* out_re, float* out_im) {
  const int quarter = size_ / 4;
  // First stage: length-4 transforms of x[j + r quarter], written to
  // 4 j + r (a transpose of each group of four butterflies).
  float* dst_re = a_re_.data();
  float* dst_im = a_im_.data();
  for (int j = 0; j < quarter; j += 4) {
    Complex4 a0 = Load(re, im, j), a1 = Load(re, im, j + quarter);
    Complex4 a2 = Load(re, im, j + 2 * quarter), a3 = Load(re, im, j + 3 * quarter);
    Butterfly(a0, a1, a2, a3);
    Transpose4(a0.re, a1.re, a2.re, a3.re);
    Transpose4(a0.im, a1.im, a2.im, a3.im);
    Store(dst_re, dst_im, 4 * j, a0);
    Store(dst_re, dst_im, 4 * j + 4, a1);
    Store(dst_re, dst_im, 4 * j + 8, a2);
    Store(dst_re, dst_im, 4 * j + 12, a3);
  }
  const float* src_re = dst_re;
  const float* src_im = dst_im;
  const float* w = twiddles_.data();
  for (int ns = 4; ns < size_; ns *= 4) {
    if (ns * 4 == size_) {
      dst_re = out_re;
      dst_im = out_im;
    } else {
      dst_re = src_re == a_re_.data() ? b_re_.data() : a_re_.data();
      dst_im = src_im == a_im_.data() ? b_im_.data() : a_im_.data();
    }
    for (int j = 0; j < quarter; j += 4, w += 24) {
      Complex4 a0 = Load(src_re, src_im, j);
      Complex4 a1 = Multiply(Load(src_re, src_im, j + quarter), w);
      Complex4 a2 = Multiply(Load(src_re, src_im, j + 2 * quarter), w + 8);
      Complex4 a3 = Multiply(Load(src_re, src_im, j + 3 * quarter), w + 16);
      Butterfly(a0, a1, a2, a3);
      const int k = j % ns;
      const int base = (j - k) * 4 + k;
      Store(dst_re, dst_im, base, a0);
      Store(dst_re, dst_im, base + ns, a1);
      Store(dst_re, dst_im, base + 2 * ns, a2);
      Store(dst_re, dst_im, base + 3 * ns, a3);
    }
    src_re = dst_re;
    src_im = dst_im;
  }
}

}  // namespace audio_dsp
