#include "audio/dsp/lowpass_design.h"

#include <cmath>
#include <numbers>

#include "audio/dsp/kiss_fft.h"
#include "base/logging.h"

namespace audio_dsp {

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
  ComplexFFTTransformer(kBins, /*normalize_inverse=*/true)
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

}  // namespace audio_dsp
