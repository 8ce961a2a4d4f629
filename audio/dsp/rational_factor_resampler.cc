#include "audio/dsp/rational_factor_resampler.h"

#include <cmath>
#include <cstdint>
#include <type_traits>

#include "audio/dsp/float4.h"
#include "audio/dsp/number_util.h"

namespace audio_dsp {
namespace {

// One output: the dot product of `num_taps` real taps with the samples at
// `s`. Four partial sums break the dependency chain of a single accumulator
// (the compiler may not reassociate float additions by itself).
inline float Dot(const float* taps, const float* s, int num_taps) {
  float sum[4] = {0.0f, 0.0f, 0.0f, 0.0f};
  int m = 0;
  for (; m + 4 <= num_taps; m += 4) {
    for (int j = 0; j < 4; ++j) sum[j] += taps[m + j] * s[m + j];
  }
  for (; m < num_taps; ++m) sum[0] += taps[m] * s[m];
  return (sum[0] + sum[1]) + (sum[2] + sum[3]);
}

// The complex form reads `paired_taps`, each tap written twice (t0 t0 t1 t1
// ...), so that four lanes multiply two interleaved re/im samples at once:
// even lanes sum the real parts, odd lanes the imaginary ones.
inline std::complex<float> Dot(const float* paired_taps, const std::complex<float>* s,
                               int num_taps) {
  const float* x = reinterpret_cast<const float*>(s);
  const int n = 2 * num_taps;
  Float4 a = {}, b = {};
  int m = 0;
  for (; m + 8 <= n; m += 8) {
    a += Load4(paired_taps + m) * Load4(x + m);
    b += Load4(paired_taps + m + 4) * Load4(x + m + 4);
  }
  if (m + 4 <= n) {
    a += Load4(paired_taps + m) * Load4(x + m);
    m += 4;
  }
  const Float4 sum = a + b;
  float re = sum[0] + sum[2], im = sum[1] + sum[3];
  if (m < n) {  // one tap left
    re += paired_taps[m] * x[m];
    im += paired_taps[m + 1] * x[m + 1];
  }
  return {re, im};
}

// Dot for four outputs at once, each summed exactly as Dot sums it: four
// independent chains of multiply-adds overlap where one waits on each add.
inline void Dot4(const float* const paired_taps[4], const std::complex<float>* const s[4],
                 int num_taps, std::complex<float>* out) {
  const int n = 2 * num_taps;
  Float4 a[4] = {}, b[4] = {};
  const float* x[4];
  for (int j = 0; j < 4; ++j) x[j] = reinterpret_cast<const float*>(s[j]);
  int m = 0;
  for (; m + 8 <= n; m += 8) {
    for (int j = 0; j < 4; ++j) {
      a[j] += Load4(paired_taps[j] + m) * Load4(x[j] + m);
      b[j] += Load4(paired_taps[j] + m + 4) * Load4(x[j] + m + 4);
    }
  }
  const bool quad = m + 4 <= n;
  if (quad) {
    for (int j = 0; j < 4; ++j) a[j] += Load4(paired_taps[j] + m) * Load4(x[j] + m);
    m += 4;
  }
  for (int j = 0; j < 4; ++j) {
    const Float4 sum = a[j] + b[j];
    float re = sum[0] + sum[2], im = sum[1] + sum[3];
    if (m < n) {
      re += paired_taps[j][m] * x[j][m];
      im += paired_taps[j][m + 1] * x[j][m + 1];
    }
    out[j] = {re, im};
  }
}

}  // namespace

template <typename T>
RationalFactorResampler<T>::RationalFactorResampler(
    const ResamplingKernel& kernel, int max_denominator) {
  if (!kernel.Valid() || max_denominator < 1) return;
  const Rational ratio = RationalApproximation(
      max_denominator, kernel.input_sample_rate() / kernel.output_sample_rate());
  if (ratio.numerator < 1) return;  // output rate beyond 2^31 times the input
  factor_numerator_ = ratio.numerator;
  factor_denominator_ = ratio.denominator;
  integer_step_ = factor_numerator_ / factor_denominator_;
  fractional_step_ = factor_numerator_ % factor_denominator_;
  radius_ = static_cast<int>(std::ceil(kernel.radius()));
  num_taps_ = 2 * radius_ + 1;
  filters_.assign(factor_denominator_, std::vector<float>(num_taps_));
  for (int p = 0; p < factor_denominator_; ++p) {
    const double offset = static_cast<double>(p) / factor_denominator_;
    for (int j = -radius_; j <= radius_; ++j) {
      filters_[p][radius_ - j] = static_cast<float>(kernel.Eval(j + offset));
    }
  }
  if constexpr (std::is_same_v<T, std::complex<float>>) {
    dot_filters_.assign(factor_denominator_, std::vector<float>(2 * num_taps_));
    for (int p = 0; p < factor_denominator_; ++p) {
      for (int m = 0; m < num_taps_; ++m) {
        dot_filters_[p][2 * m] = dot_filters_[p][2 * m + 1] = filters_[p][m];
      }
    }
  }
  valid_ = true;
  Reset();
}

template <typename T>
void RationalFactorResampler<T>::Reset() {
  phase_ = 0;
  delayed_input_.assign(radius_, T{});
  held_ = radius_;
}

template <typename T>
void RationalFactorResampler<T>::ProcessSamples(std::span<const T> input,
                                                std::vector<T>* output) {
  // The working stream is delayed_input_ followed by the input; appending in
  // place keeps one buffer whose capacity settles after the first blocks.
  // Its first held_ values are live; the vector only grows, so that blocks
  // are copied in without inserting or zero-filling (which std::complex, not
  // being trivial, would do value by value).
  const size_t needed = static_cast<size_t>(held_) + input.size();
  if (delayed_input_.size() < needed) {
    // Exactly: resize alone would double a buffer that one long block made
    // large (a wake-up's pre-trigger audio) when the next is a little longer.
    delayed_input_.reserve(needed);
    delayed_input_.resize(needed);
  }
  std::copy(input.begin(), input.end(), delayed_input_.begin() + held_);
  held_ = static_cast<int64_t>(needed);
  const int64_t total = held_;
  const int64_t starts = total + 1 - num_taps_;  // window starts available
  if (starts < 1) {
    output->clear();
    return;
  }
  const int64_t count =
      (starts * factor_denominator_ - phase_ - 1 + factor_numerator_) /
      factor_numerator_;
  output->resize(count);

  const T* s = delayed_input_.data();
  const std::vector<std::vector<float>>& taps =
      std::is_same_v<T, std::complex<float>> ? dot_filters_ : filters_;
  int64_t i = 0;
  const auto advance = [&] {
    phase_ += fractional_step_;
    i += integer_step_;
    if (phase_ >= factor_denominator_) {
      phase_ -= factor_denominator_;
      ++i;
    }
  };
  int64_t k = 0;
  if constexpr (std::is_same_v<T, std::complex<float>>) {
    for (; k + 4 <= count; k += 4) {
      const float* phase_taps[4];
      const T* starts[4];
      for (int j = 0; j < 4; ++j) {
        phase_taps[j] = taps[phase_].data();
        starts[j] = s + i;
        advance();
      }
      Dot4(phase_taps, starts, num_taps_, output->data() + k);
    }
  }
  for (; k < count; ++k) {
    (*output)[k] = Dot(taps[phase_].data(), s + i, num_taps_);
    advance();
  }
  const int64_t consumed = std::min(i, total);
  if (consumed > 0) {
    std::copy(delayed_input_.begin() + consumed, delayed_input_.begin() + total,
              delayed_input_.begin());
  }
  held_ = total - consumed;
}

template <typename T>
void RationalFactorResampler<T>::Flush(std::vector<T>* output) {
  output->clear();
  const std::vector<T> zeros(num_taps_ - 1, T{});
  ProcessSamples(zeros, output);
}

template class RationalFactorResampler<float>;
template class RationalFactorResampler<std::complex<float>>;

}  // namespace audio_dsp
