// Vector helpers of the receivers: Doppler frequency grids, phasor matrices,
// peak search over a bank of correlators, periodic padding and the complex
// low-pass design of the baseband smoother.
//
// Stateless. Null outputs and the listed size mismatches end the process
// through CHECK.
#ifndef AUDIO_SORVANE_SORVANE_UTIL_H_
#define AUDIO_SORVANE_SORVANE_UTIL_H_

#include <complex>
#include <span>
#include <vector>

#include "audio/dsp/eigen_types.h"
#include "base/logging.h"

namespace audio_sorvane {

// The 2n + 1 values frequency_step * j, j = -n .. n, with
// n = round(max_frequency / frequency_step); index n holds 0.
void FrequencyGrid(float frequency_step, float max_frequency,
                   std::vector<float>* frequencies);

// A frequencies.size() x num_samples matrix; row r is exp(i step_r j) for
// j = 0 .. num_samples - 1 with step_r = frequencies[r] * scale, generated in
// double by repeated multiplication from 1.
void PhasorMatrix(std::span<const float> frequencies, int num_samples,
                  double scale, audio_dsp::ComplexMatrix* phasor_matrix);

struct FilterResponsePeak {
  int index = 0;
  float power = 0.0f;
};

// The row of filter_matrix * signal with the largest squared magnitude
// (the first one on ties) and that squared magnitude; {0, 0} when empty.
FilterResponsePeak MaxFilterResponse(
    const audio_dsp::ComplexMatrix& filter_matrix,
    const audio_dsp::ComplexVector& signal);

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

// Complex FIR taps (num_taps, odd counts centred on 0) of a one-sided
// low-pass: gain 1 from -cutoff up to cutoff + 0.5 / oversampling, a
// quarter-cosine roll-off up to half the rate, nothing below -cutoff.
// Frequencies are normalised to the sample rate. Sampled on 1024 bins,
// transformed by the inverse FFT (normalised, so the DC gain is about 1) and
// cosine-windowed.
std::vector<std::complex<float>> DesignLowpassTaps(int num_taps, float cutoff,
                                                   float oversampling);

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_SORVANE_UTIL_H_
