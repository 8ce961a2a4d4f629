#include "audio/dsp/kiss_fft_util.h"

#include <algorithm>
#include <cmath>

#include "audio/dsp/kiss_fft.h"
#include "base/logging.h"

namespace audio_dsp {

void SpectralBandPassFilter(std::span<const std::complex<float>> input_spectrum,
                            std::vector<std::complex<float>>* output_spectrum,
                            float low_band_edge, float high_band_edge,
                            float bin_width) {
  CHECK(!input_spectrum.empty());
  CHECK(output_spectrum != nullptr);
  const int spectrum_size = static_cast<int>(input_spectrum.size());
  CHECK(low_band_edge >= 0.0f);
  CHECK(low_band_edge <= high_band_edge);
  CHECK(high_band_edge <= bin_width * spectrum_size);
  // Copy first: the input may view the output vector.
  const int first = std::min<int>(
      spectrum_size, static_cast<int>(std::ceil(low_band_edge / bin_width)));
  const int last = std::min<int>(
      spectrum_size,
      static_cast<int>(std::floor(high_band_edge / bin_width)) + 1);
  if (output_spectrum->data() != input_spectrum.data()) {
    output_spectrum->assign(input_spectrum.begin(), input_spectrum.end());
  }
  std::complex<float>* out = output_spectrum->data();
  std::fill(out, out + first, std::complex<float>(0.0f, 0.0f));
  std::fill(out + std::max(first, last), out + spectrum_size,
            std::complex<float>(0.0f, 0.0f));
}

void BandPassFilter(std::span<const float> input, std::vector<float>* output,
                    float low_band_edge, float high_band_edge,
                    float sample_rate) {
  CHECK(!input.empty());
  CHECK(low_band_edge >= 0.0f);
  CHECK(low_band_edge <= high_band_edge);
  CHECK(high_band_edge < sample_rate * (0.5f + 0.5f / input.size()));
  CHECK(output != nullptr);
  const int n = static_cast<int>(input.size());
  RealFFTTransformer transformer(n, /*normalize_inverse=*/true);
  std::vector<std::complex<float>> spectrum;
  transformer.Forward(input, &spectrum);
  SpectralBandPassFilter(spectrum, &spectrum, low_band_edge, high_band_edge,
                         sample_rate / n);
  transformer.Inverse(spectrum, output);
}

void HighPassFilter(std::span<const float> input, std::vector<float>* output,
                    float cutoff, float sample_rate) {
  BandPassFilter(input, output, cutoff, sample_rate * 0.5f, sample_rate);
}

void FftResample(std::span<const float> input, std::vector<float>* output,
                 float input_sample_rate, float output_sample_rate) {
  CHECK(input_sample_rate > 0);
  CHECK(output_sample_rate > 0);
  CHECK(output);
  const int input_size = static_cast<int>(input.size());
  const int output_size = static_cast<int>(
      std::round(output_sample_rate / input_sample_rate * input_size));
  if (output_size == input_size) {
    if (output->data() != input.data()) output->assign(input.begin(), input.end());
    return;
  }
  if (output_size == 0) {
    output->clear();
    return;
  }
  std::vector<std::complex<float>> spectrum;
  RealFFTTransformer(input_size, /*normalize_inverse=*/false)
      .Forward(input, &spectrum);
  if (input_size % 2 == 0 && output_size > input_size) {
    // The old Nyquist bin becomes two bins (+ and - that frequency) of the
    // longer spectrum; each gets half of it.
    spectrum[input_size / 2] *= 0.5f;
  }
  spectrum.resize(output_size / 2 + 1, {0.0f, 0.0f});
  RealFFTTransformer(output_size, /*normalize_inverse=*/false)
      .Inverse(spectrum, output);
  const float scale = 1.0f / static_cast<float>(input_size);
  for (float& v : *output) v *= scale;
}

}  // namespace audio_dsp
