#include "audio/sorvane/symbol_wave_coder.h"

#include <cmath>
#include <complex>
#include <numbers>

#include "audio/dsp/kiss_fft.h"
#include "audio/sorvane/code_signal_generator.h"
#include "base/logging.h"

namespace audio_sorvane {
namespace {

// rows x columns, row r = sin(2 pi (min_cycles + r) i / columns), in double.
audio_dsp::FloatMatrix ToneMatrix(int rows, int columns, int min_cycles) {
  audio_dsp::FloatMatrix tones(rows, columns);
  for (int r = 0; r < rows; ++r) {
    const double step = 2.0 * std::numbers::pi * (min_cycles + r) / columns;
    for (int i = 0; i < columns; ++i) tones(r, i) = static_cast<float>(std::sin(step * i));
  }
  return tones;
}

}  // namespace

SymbolWaveCoderParams::SymbolWaveCoderParams()
    : code(GenerateCodeSignal(kDefaultNumberOfTaps, kDefaultCodeNumber)) {}

void InterpolateCode(std::span<const float> code, int length,
                     std::vector<float>* upsampled_code) {
  CHECK(upsampled_code);
  const int n = static_cast<int>(code.size());
  CHECK(n > 0);
  const int target = n * (length / n);
  std::vector<std::complex<float>> spectrum;
  audio_dsp::RealFFTTransformer(n, /*normalize_inverse=*/false)
      .Forward(code, &spectrum);
  if (n % 2 == 0) spectrum.back() *= 0.5f;
  spectrum.resize(target / 2 + 1, {0.0f, 0.0f});
  audio_dsp::RealFFTTransformer(target, /*normalize_inverse=*/false)
      .Inverse(spectrum, upsampled_code);
  const double scale = 1.0 / n;
  for (float& v : *upsampled_code) v = static_cast<float>(v * scale);
}

sorvel_base::Validation ValidateSymbolWaveCoderParams(const SymbolWaveCoderParams& params) {
  SORVEL_REQUIRE(params.sample_rate > 0.0, "sample_rate must be positive, got ",
                 params.sample_rate);
  SORVEL_REQUIRE(params.upsampling_factor > 0, "upsampling_factor must be positive, got ",
                 params.upsampling_factor);
  SORVEL_REQUIRE(params.desired_carrier_frequency >= 0.0, "carrier frequency must be in [0, ",
                 params.sample_rate / 2, "] Hz, got ", params.desired_carrier_frequency);
  SORVEL_REQUIRE(params.desired_carrier_frequency <= params.sample_rate / 2,
                 "carrier frequency must be in [0, ", params.sample_rate / 2, "] Hz, got ",
                 params.desired_carrier_frequency);
  SORVEL_REQUIRE(params.bits_per_symbol > 0, "bits_per_symbol must be positive, got ",
                 params.bits_per_symbol);
  SORVEL_REQUIRE(params.min_cycles_per_frame >= 0, "min_cycles_per_frame must be >= 0, got ",
                 params.min_cycles_per_frame);
  SORVEL_REQUIRE(params.baseband_decimation_factor > 0,
                 "baseband_decimation_factor must be positive, got ",
                 params.baseband_decimation_factor);
  SORVEL_REQUIRE(params.upsampling_factor % params.baseband_decimation_factor == 0,
                 "baseband_decimation_factor (", params.baseband_decimation_factor,
                 ") must divide upsampling_factor (", params.upsampling_factor, ")");
  SORVEL_REQUIRE(params.pedestal_amplitude > 0.0f, "pedestal_amplitude must be positive, got ",
                 params.pedestal_amplitude);
  SORVEL_REQUIRE(!params.code.empty(), "the spreading code is empty");
  return {};
}

SymbolWaveCoder::SymbolWaveCoder(const SymbolWaveCoderParams& params)
    : params_(params) {
  CHECK_VALID(ValidateSymbolWaveCoderParams(params));

  alphabet_size_ = (1 << params_.bits_per_symbol) + 1;
  const int n = SamplesPerFrame(params_);
  samples_per_frame_ = n;
  carrier_cycles_per_frame_ = static_cast<int>(std::floor(
      params_.desired_carrier_frequency * static_cast<float>(n) / params_.sample_rate));
  VLOG(1) << "CCPF: " << carrier_cycles_per_frame_;
  CHECK(carrier_cycles_per_frame_ >= 0);

  const int baseband_size = n / params_.baseband_decimation_factor;
  InterpolateCode(params_.code, baseband_size, &baseband_code_);
  baseband_tones_ =
      ToneMatrix(alphabet_size_, baseband_size, params_.min_cycles_per_frame);
}

// The full-rate templates only a transmitter reads: built on first use, so
// a receiver never holds them (about 130 kB at the defaults).
const std::vector<std::vector<float>>& SymbolWaveCoder::Templates() const {
  std::call_once(templates_once_, [this] {
    const int n = samples_per_frame_;
    std::vector<float> code;
    InterpolateCode(params_.code, n, &code);
    const audio_dsp::FloatMatrix tones =
        ToneMatrix(alphabet_size_, n, params_.min_cycles_per_frame);
    const double omega = carrier_cycles_per_frame_ * 2.0 * std::numbers::pi / n;
    std::vector<float> sine(n), quadrature(n);
    for (int i = 0; i < n; ++i) {
      sine[i] = static_cast<float>(std::sin(omega * i));
      quadrature[i] = params_.use_quadrature
                          ? static_cast<float>(std::cos(omega * i))
                          : sine[i];
    }

    templates_.assign(alphabet_size_, std::vector<float>(n));
    float peak = 0.0f;
    for (int k = 0; k < alphabet_size_; ++k) {
      std::vector<float>& frame = templates_[k];
      for (int i = 0; i < n; ++i) {
        frame[i] = code[i] * (quadrature[i] * tones(k, i) +
                              params_.pedestal_amplitude * sine[i]);
        peak = std::max(peak, std::fabs(frame[i]));
      }
    }
    // A zero carrier (desired frequency 0, no quadrature) leaves every
    // template silent; there is nothing to scale then.
    if (peak > 0.0f) {
      const float scale = 1.0f / peak;
      for (std::vector<float>& frame : templates_) {
        for (float& v : frame) v *= scale;
      }
    }
  });
  return templates_;
}

std::span<const float> SymbolWaveCoder::SymbolWaveform(int symbol) const {
  CHECK(symbol >= 0);
  CHECK(symbol < alphabet_size_);
  return Templates()[symbol];
}

std::span<const float> SymbolWaveCoder::StartWaveform() const {
  return Templates().back();
}

float SymbolWaveCoder::CarrierFrequency() const {
  return params_.sample_rate * static_cast<float>(carrier_cycles_per_frame_) /
         static_cast<float>(samples_per_frame_);
}

}  // namespace audio_sorvane
