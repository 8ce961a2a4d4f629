// Vector helpers for the receivers' signal paths.
//
// ComplexFirFilter: a streaming FIR filter on complex samples in transposed
// direct form. With taps h[0..T-1]:
//   y[n] = sum_k h[k] x[n - k]
// State carries across calls, so filtering a signal in pieces gives the same
// output as filtering it at once. Not thread safe. Empty taps or a null
// result end the process through CHECK.
//
// PeriodicPad: a signal repeated cyclically on both sides. Stateless; an
// empty signal or a null output ends the process through CHECK.
#ifndef AUDIO_DSP_SIGNAL_VECTOR_UTIL_H_
#define AUDIO_DSP_SIGNAL_VECTOR_UTIL_H_

#include <complex>
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
  void Reset() { state_.assign(impulse_response_.size() - 1, {0.0f, 0.0f}); }

  // Filters `input` into `result`, which is resized to the input's length.
  // `result` must not alias `input`'s storage.
  void Filter(std::span<const std::complex<float>> input,
              std::vector<std::complex<float>>* result) {
    CHECK(result);
    result->resize(input.size());
    const std::complex<float>* h = impulse_response_.data();
    const size_t taps = impulse_response_.size();
    if (taps < 2) {
      for (size_t n = 0; n < input.size(); ++n) (*result)[n] = input[n] * h[0];
      return;
    }
    std::complex<float>* s = state_.data();
    for (size_t n = 0; n < input.size(); ++n) {
      const std::complex<float> x = input[n];
      (*result)[n] = x * h[0] + s[0];
      for (size_t k = 1; k + 1 < taps; ++k) s[k - 1] = x * h[k] + s[k];
      s[taps - 2] = x * h[taps - 1];
    }
  }

  const std::vector<std::complex<float>>& impulse_response() const {
    return impulse_response_;
  }

 private:
  std::vector<std::complex<float>> impulse_response_;
  std::vector<std::complex<float>> state_;
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
