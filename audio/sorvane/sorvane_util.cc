#include "audio/sorvane/sorvane_util.h"

#include <cmath>
#include <numbers>

#include "audio/dsp/kiss_fft.h"

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

std::vector<std::complex<float>> DesignLowpassTaps(int num_taps, float cutoff,
                                                   float oversampling) {
  CHECK(num_taps >= 1);
  constexpr int kBins = 1024;
  const double edge = cutoff + 0.5 / oversampling;
  std::vector<std::complex<float>> response(kBins);
  for (int b = -kBins / 2 + 1; b <= kBins / 2; ++b) {
    const double nu = static_cast<double>(b) / kBins;
    double h;
    if (nu < -cutoff) {
      h = 0.0;
    } else if (nu <= edge) {
      h = 1.0;
    } else {
      h = std::cos((nu - edge) * (std::numbers::pi / 2) / (0.5 - edge));
    }
    response[b < 0 ? b + kBins : b] = {static_cast<float>(h), 0.0f};
  }
  std::vector<std::complex<float>> impulse;
  audio_dsp::ComplexFFTTransformer(kBins, /*normalize_inverse=*/true)
      .Inverse(response, &impulse);

  const int half = (num_taps - 1) / 2;
  std::vector<std::complex<float>> taps;
  taps.reserve(2 * half + 1);
  for (int j = -half; j <= half; ++j) {
    const float window = static_cast<float>(
        std::cos(j * std::numbers::pi / (2 * half + 2)));
    taps.push_back(impulse[j < 0 ? j + kBins : j] * window);
  }
  return taps;
}

}  // namespace audio_sorvane
