// Vector helpers for the receivers' signal paths.
//
// ComplexFirFilter: a streaming FIR filter on complex samples. With taps
// h[0..T-1]:
//   y[n] = x[n] h[0] + (x[n-1] h[1] + (... + x[n-T+1] h[T-1]))
// summed in that order, as the transposed direct form adds, but each output
// on its own so that neighbouring outputs are computed side by side. State
// (the last T - 1 inputs) carries across calls, so filtering a signal in
// pieces gives the same output as filtering it at once. Not thread safe.
// Empty taps or a null result end the process through CHECK.
//
// PeriodicPad: a signal repeated cyclically on both sides. Stateless; an
// empty signal or a null output ends the process through CHECK.
#ifndef AUDIO_DSP_SIGNAL_VECTOR_UTIL_H_
#define AUDIO_DSP_SIGNAL_VECTOR_UTIL_H_

#include <algorithm>
#include <complex>
#include <cstddef>
#include <span>
#include <vector>

#include "base/logging.h"

namespace audio_dsp {

class ComplexFirFilter {
 public:
  explicit ComplexFirFilter(std::vector<std::complex<float>> impulse_response)
      : impulse_response_(std::move(impulse_response)) {
    CHECK(!impulse_response_.empty());
    Reset();
  }

  // Clears the filter's memory of past input.
  void Reset() { extended_.assign(impulse_response_.size() - 1, {0.0f, 0.0f}); }

  // Filters `input` into `result`, which is resized to the input's length.
  // `result` must not alias `input`'s storage.
  void Filter(std::span<const std::complex<float>> input,
              std::vector<std::complex<float>>* result) {
    CHECK(result);
    result->resize(input.size());
    const int taps = static_cast<int>(impulse_response_.size());
    const size_t history = static_cast<size_t>(taps) - 1;
    // The inputs after the last T - 1 before them; x[n - k] is extended_[n + T - 1 - k].
    extended_.resize(history + input.size());
    std::copy(input.begin(), input.end(), extended_.begin() + static_cast<ptrdiff_t>(history));
    // Interleaved floats with the products written out: std::complex's
    // multiply carries a NaN fallback that keeps the loop scalar.
    const float* h = reinterpret_cast<const float*>(impulse_response_.data());
    const float* x = reinterpret_cast<const float*>(extended_.data());
    float* y = reinterpret_cast<float*>(result->data());
    for (size_t n = 0; n < input.size(); ++n) {
      const float* xn = x + 2 * (n + history);  // x[n]
      float re = xn[-2 * (taps - 1)] * h[2 * (taps - 1)] -
                 xn[-2 * (taps - 1) + 1] * h[2 * (taps - 1) + 1];
      float im = xn[-2 * (taps - 1)] * h[2 * (taps - 1) + 1] +
                 xn[-2 * (taps - 1) + 1] * h[2 * (taps - 1)];
      for (int k = taps - 2; k >= 0; --k) {
        const float a = xn[-2 * k], b = xn[-2 * k + 1], c = h[2 * k], d = h[2 * k + 1];
        re = (a * c - b * d) + re;
        im = (a * d + b * c) + im;
      }
      y[2 * n] = re;
      y[2 * n + 1] = im;
    }
    // Keep the last T - 1 inputs at the front for the next call.
    std::copy(extended_.end() - static_cast<ptrdiff_t>(history), extended_.end(),
              extended_.begin());
    extended_.resize(history);
  }

  const std::vector<std::complex<float>>& impulse_response() const {
    return impulse_response_;
  }

 private:
  std::vector<std::complex<float>> impulse_response_;
  // The last T - 1 inputs between calls; during one, followed by its input.
  std::vector<std::complex<float>> extended_;
};

// `signal` repeated cyclically: pad_before + signal.size() + pad_after
// values, value i = signal[(i - pad_before) mod signal.size()].
template <typename T>
void PeriodicPad(std::span<const T> signal, int pad_before, int pad_after,
                 std::vector<T>* padded_signal) {
  CHECK(!signal.empty());
  CHECK(padded_signal);
  const int n = static_cast<int>(signal.size());
  padded_signal->resize(pad_before + n + pad_after);
  // Start at the index of value 0 and walk forward without a per-value
  // division.
  int j = ((-pad_before) % n + n) % n;
  for (T& value : *padded_signal) {
    value = signal[j];
    if (++j == n) j = 0;
  }
}

}  // namespace audio_dsp

#endif  // AUDIO_DSP_SIGNAL_VECTOR_UTIL_H_
