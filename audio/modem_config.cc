#include "audio/modem_config.h"

#include <sstream>
#include <utility>

#include "audio/sorvane/code_signal_generator.h"
#include "audio/sorvane/token_symbol_converter.h"

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

namespace {

template <typename... Parts>
std::string Concat(const Parts&... parts) {
  std::ostringstream out;
  (out << ... << parts);
  return out.str();
}

}  // namespace

std::string ValidateDsssCoderConfig(const DsssCoderConfig& c) {
  if (c.number_of_taps < kMinTaps || c.number_of_taps > kMaxTaps) {
    return Concat("number_of_taps must be in [", kMinTaps, ", ", kMaxTaps, "], got ",
                  c.number_of_taps);
  }
  if (c.code_number < 0 || c.code_number >= NumCodesForTaps(c.number_of_taps)) {
    return Concat("code_number must be in [0, ", NumCodesForTaps(c.number_of_taps) - 1,
                  "] for ", c.number_of_taps, " taps, got ", c.code_number);
  }
  if (!BitsPerSymbolOk(c.bits_per_symbol)) {
    return Concat("bits_per_symbol must be 1, 2, 4 or 8, got ", c.bits_per_symbol);
  }
  if (!(c.sample_rate > 0.0f)) return Concat("sample_rate must be positive, got ", c.sample_rate);
  if (c.upsampling_factor <= 0 || c.baseband_decimation_factor <= 0 ||
      c.upsampling_factor % c.baseband_decimation_factor != 0) {
    return Concat("baseband_decimation_factor (", c.baseband_decimation_factor,
                  ") must be positive and divide upsampling_factor (", c.upsampling_factor,
                  ")");
  }
  if (!(c.desired_carrier_frequency >= 0.0f &&
        c.desired_carrier_frequency <= c.sample_rate / 2)) {
    return Concat("carrier frequency must be in [0, ", c.sample_rate / 2, "] Hz, got ",
                  c.desired_carrier_frequency);
  }
  if (c.min_cycles_per_frame < 0) {
    return Concat("min_cycles_per_frame must be >= 0, got ", c.min_cycles_per_frame);
  }
  return "";
}

std::string ValidateDtmfConfig(const DtmfConfig& c) {
  if (!(c.sample_rate > 0.0f)) return Concat("sample_rate must be positive, got ", c.sample_rate);
  if (c.bytes_in_token <= 0) return Concat("token bytes must be positive, got ", c.bytes_in_token);
  if (c.baseband_decimation_factor <= 0) {
    return Concat("baseband_decimation_factor must be positive, got ",
                  c.baseband_decimation_factor);
  }
  DtmfEncoderParams defaults;
  defaults.sample_rate = c.sample_rate;
  defaults.window_duration = c.window_duration;
  defaults.baseband_decimation_factor = c.baseband_decimation_factor;
  if (!(c.window_duration > 0.0f) || FrameSize(defaults) <= 0) {
    return Concat("window_duration ", c.window_duration, " s gives no samples per frame");
  }
  const std::vector<float>& tones =
      c.tone_frequencies.empty() ? defaults.tone_frequencies : c.tone_frequencies;
  for (float f : tones) {
    if (!(f >= 0.0f && f < c.sample_rate / 2)) {
      return Concat("tone frequency ", f, " Hz must be in [0, ", c.sample_rate / 2, ")");
    }
  }
  const size_t n = tones.size();
  if (c.tones_per_symbol <= 0 || static_cast<size_t>(c.tones_per_symbol) > n) {
    return Concat("tones_per_symbol must be in [1, ", n, "], got ", c.tones_per_symbol);
  }
  if (!c.tone_frequencies.empty()) {
    const size_t symbols = MakeSymbolTable(static_cast<int>(n), c.tones_per_symbol).size();
    if (symbols < 3 || n * (n - 1) / 2 < symbols) {
      return Concat(n, " tones taken ", c.tones_per_symbol, " at a time give ", symbols,
                    " symbols; between 3 and ", n * (n - 1) / 2, " are needed");
    }
  } else if (c.tones_per_symbol != 2) {
    return "the default tones are used in pairs; give tone frequencies to change that";
  }
  return "";
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

std::unique_ptr<AudioModemDecoder> MakeDsssDecoder(const DsssDecoderConfig& config) {
  auto coder = std::make_shared<const SymbolWaveCoder>(MakeSymbolWaveCoderParams(config.coder));
  SorvaneDecoderParams params;
  params.symbols_in_token =
      DsssSymbolsPerToken(config.coder.bits_per_symbol, config.token_length_bytes);
  params.append_check_symbol = config.append_check_symbol;
  params.save_received_samples = config.save_received_samples;
  params.max_candidates_to_return = config.max_candidates_to_return;
  params.detection_duration = config.detection_duration;
  params.detection_threshold = config.detection_threshold;
  params.buffer_duration =
      TokenDurationSeconds(FramesPerToken(params.symbols_in_token, params.append_check_symbol),
                           coder->samples_per_frame(), config.coder.sample_rate) *
      config.buffer_duration_factor;
  auto dsss = std::make_unique<SorvaneDecoder>(std::move(coder), params);
  std::unique_ptr<AudioModemDecoder> decoder;
  if (config.with_hotsound) {
    decoder = std::make_unique<AudioModemDecoder>(std::make_unique<HotsoundDecoder>(
        std::move(dsss),
        MakeHotsoundDetector(static_cast<int>(config.input_sample_rate), config.num_channels),
        config.hotsound_clock ? config.hotsound_clock : std::chrono::steady_clock::now));
  } else {
    decoder = std::make_unique<AudioModemDecoder>(std::move(dsss));
  }
  decoder->Initialize(config.num_channels, config.input_sample_rate);
  return decoder;
}

std::unique_ptr<AudioModemDecoder> MakeDtmfDecoder(const DtmfDecoderConfig& config) {
  DtmfEncoderParams tones;
  if (!MakeDtmfEncoderParams(config.tones, &tones)) return nullptr;
  DtmfDecoderParams params(tones);
  params.max_candidates_per_decode_token_call = config.max_candidates_per_decode_token_call;
  params.max_buffer_duration_in_seconds =
      TokenDurationSeconds(tones) * config.buffer_duration_factor;
  auto decoder =
      std::make_unique<AudioModemDecoder>(std::make_unique<DtmfDecoder>(params));
  decoder->Initialize(config.num_channels, config.input_sample_rate);
  return decoder;
}

}  // namespace audio_sorvane
