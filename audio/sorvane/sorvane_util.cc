#include "audio/sorvane/sorvane_util.h"

#include <cmath>

namespace audio_sorvane {

void FrequencyGrid(float frequency_step, float max_frequency,
                   std::vector<float>* frequencies) {
  CHECK(frequency_step > 0.0f);
  CHECK(frequencies);
  const int n = static_cast<int>(std::round(max_frequency / frequency_step));
  frequencies->resize(2 * n + 1);
  for (int j = -n; j <= n; ++j) (*frequencies)[j + n] = frequency_step * j;
}

void PhasorMatrix(std::span<const float> frequencies, int num_samples,
                  double scale, audio_dsp::ComplexMatrix* phasor_matrix) {
  CHECK(phasor_matrix);
  const int rows = static_cast<int>(frequencies.size());
  phasor_matrix->resize(rows, num_samples);
  for (int r = 0; r < rows; ++r) {
    const double step = frequencies[r] * scale;
    const std::complex<double> rotation(std::cos(step), std::sin(step));
    std::complex<double> phasor(1.0, 0.0);
    for (int j = 0; j < num_samples; ++j) {
      (*phasor_matrix)(r, j) = std::complex<float>(phasor);
      phasor *= rotation;
    }
  }
}

FilterResponsePeak MaxFilterResponse(
    const audio_dsp::ComplexMatrix& filter_matrix,
    const audio_dsp::ComplexVector& signal) {
  CHECK(filter_matrix.cols() == signal.size());
  const audio_dsp::ComplexVector response = filter_matrix * signal;
  FilterResponsePeak peak;
  for (int i = 0; i < response.size(); ++i) {
    const float power = std::norm(response[i]);
    if (i == 0 || power > peak.power) peak = {i, power};
  }
  return peak;
}

}  // namespace audio_sorvane
