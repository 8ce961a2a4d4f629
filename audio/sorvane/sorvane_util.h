// Phasor helpers of the receivers: Doppler frequency grids, phasor matrices
// and the peak search over a bank of correlators.
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

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_SORVANE_UTIL_H_
