#include "audio/modem_config.h"

#include <utility>

#include "audio/sorvane/code_signal_generator.h"

namespace audio_sorvane {

SymbolWaveCoderParams MakeSymbolWaveCoderParams(const DsssCoderConfig& config) {
  SymbolWaveCoderParams params;
  params.code = GenerateCodeSignal(config.number_of_taps, config.code_number);
  params.sample_rate = config.sample_rate;
  params.upsampling_factor = config.upsampling_factor;
  params.desired_carrier_frequency = config.desired_carrier_frequency;
  params.bits_per_symbol = config.bits_per_symbol;
  params.min_cycles_per_frame = config.min_cycles_per_frame;
  params.baseband_decimation_factor = config.baseband_decimation_factor;
  params.use_quadrature = config.use_quadrature;
  return params;
}

int DsssSymbolsPerToken(int bits_per_symbol, int token_length_bytes) {
  return bits_per_symbol > 0 ? (8 / bits_per_symbol) * token_length_bytes : 0;
}

bool MakeDtmfEncoderParams(const DtmfConfig& config, DtmfEncoderParams* params) {
  DtmfEncoderParams filled;
  filled.bytes_in_token = config.bytes_in_token;
  filled.use_checksum_symbol = config.use_checksum_symbol;
  filled.baseband_decimation_factor = config.baseband_decimation_factor;
  filled.tones_per_symbol = config.tones_per_symbol;
  filled.sample_rate = config.sample_rate;
  filled.window_duration = config.window_duration;
  if (!config.tone_frequencies.empty()) {
    SetToneFrequencies(config.tone_frequencies, config.tones_per_symbol, &filled);
  }
  if (config.adsr) {
    const auto& a = *config.adsr;
    if (!SetAdsrWindow(&filled, a[0], a[1], a[2], a[3], a[4])) return false;
  }
  *params = std::move(filled);
  return true;
}

std::unique_ptr<AudioModemEncoder> MakeDsssEncoder(const DsssEncoderConfig& config) {
  auto coder = std::make_shared<const SymbolWaveCoder>(
      MakeSymbolWaveCoderParams(config.coder));
  SorvaneEncoderParams params;
  params.num_symbols =
      DsssSymbolsPerToken(config.coder.bits_per_symbol, config.token_length_bytes);
  params.append_check_symbol = config.append_check_symbol;
  params.high_pass_at_carrier = config.high_pass_at_carrier;
  params.transition_duration = config.start_transition_duration;
  params.broadcast_sample_rate = static_cast<float>(config.broadcast_sample_rate);
  return std::make_unique<AudioModemEncoder>(
      std::make_unique<SorvaneEncoder>(std::move(coder), params));
}

std::unique_ptr<AudioModemEncoder> MakeDtmfEncoder(const DtmfConfig& config) {
  DtmfEncoderParams params;
  if (!MakeDtmfEncoderParams(config, &params)) return nullptr;
  return std::make_unique<AudioModemEncoder>(std::make_unique<DtmfEncoder>(params));
}

}  // namespace audio_sorvane
