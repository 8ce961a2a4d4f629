#include "audio/modem_config.h"

#include <chrono>
#include <cmath>
#include <limits>
#include <sstream>
#include <utility>

#include "audio/hotsound_detector.h"
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

bool MakeDtmfEncoderParams(const DtmfConfig& config, DtmfEncoderParams* params,
                           std::string* problem) {
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
    // Described instead of logged when the caller asks why.
    if (problem != nullptr) {
      if (auto v = ValidateAdsrWindow(filled, a[0], a[1], a[2], a[3], a[4]); !v.ok()) {
        *problem = "adsr: " + v.message();
        return false;
      }
    }
    if (!SetAdsrWindow(&filled, a[0], a[1], a[2], a[3], a[4])) return false;
  }
  *params = std::move(filled);
  return true;
}

namespace {

using sorvel_base::StrCat;

// The limits people-facing entry points add to what the library accepts:
// the rates of audio hardware, and sizes past which a setting only costs
// memory (megabytes per frame, minutes of buffered audio).
constexpr float kMinRateHz = 8000.0f;
constexpr float kMaxRateHz = 192000.0f;
constexpr int kMaxTokenBytes = 64;
constexpr int kMaxUpsamplingFactor = 32;
// Keeps the tone arithmetic (min cycles + symbol) inside an int.
constexpr int kMaxMinCyclesPerFrame = std::numeric_limits<int>::max() - 256;
constexpr int kMaxTones = 32;
constexpr float kMaxWindowDuration = 1.0f;
constexpr int kMaxChannels = 8;
// The decoders rank six candidates (max_candidates_rank).
constexpr int kMaxCandidates = 6;
// Audio a receiver holds, in token durations. Blocks up to the buffer less
// one token go in whole; below two tokens that leaves under a token for
// blocks, and below one every block is cut with a warning. The fuzzers take
// the library from a quarter of a token to twelve.
constexpr float kMinBufferTokens = 2.0f;
constexpr float kMaxBufferTokens = 12.0f;

std::string RateProblem(const char* name, float hz) {
  if (hz >= kMinRateHz && hz <= kMaxRateHz) return "";
  return StrCat(name, " must be between ", kMinRateHz, " and ", kMaxRateHz, " Hz, got ", hz);
}

}  // namespace

std::string ValidateDsssCoderConfig(const DsssCoderConfig& c) {
  if (auto v = ValidateCodeChoice(c.number_of_taps, c.code_number); !v.ok()) return v.message();
  if (!BitsPerSymbolOk(c.bits_per_symbol)) {
    return StrCat("bits_per_symbol must be 1, 2, 4 or 8, got ", c.bits_per_symbol);
  }
  return ValidateSymbolWaveCoderParams(MakeSymbolWaveCoderParams(c)).message();
}

std::string ValidateDtmfConfig(const DtmfConfig& c) {
  // What SetToneFrequencies and the window need before the record exists.
  if (!(c.sample_rate > 0.0f)) return StrCat("sample_rate must be positive, got ", c.sample_rate);
  const size_t n = c.tone_frequencies.empty() ? DtmfEncoderParams().tone_frequencies.size()
                                              : c.tone_frequencies.size();
  if (c.tones_per_symbol <= 0 || static_cast<size_t>(c.tones_per_symbol) > n) {
    return StrCat("tones_per_symbol must be in [1, ", n, "], got ", c.tones_per_symbol);
  }
  if (c.tone_frequencies.empty() && c.tones_per_symbol != 2) {
    return "the default tones are used in pairs; give tone frequencies to change that";
  }
  if (!c.tone_frequencies.empty()) {
    const size_t symbols = MakeSymbolTable(static_cast<int>(n), c.tones_per_symbol).size();
    if (symbols < 3 || n * (n - 1) / 2 < symbols) {
      return StrCat(n, " tones taken ", c.tones_per_symbol, " at a time give ", symbols,
                    " symbols; between 3 and ", n * (n - 1) / 2, " are needed");
    }
  }
  if (c.baseband_decimation_factor <= 0) {
    return StrCat("baseband_decimation_factor must be positive, got ",
                  c.baseband_decimation_factor);
  }
  DtmfEncoderParams params;
  std::string problem;
  if (!MakeDtmfEncoderParams(c, &params, &problem)) return problem;
  return ValidateDtmfEncoderParams(params).message();
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

namespace {

// The DSSS receiver's record, for a coder of `samples_per_frame` samples.
SorvaneDecoderParams DecoderRecord(const DsssDecoderConfig& config, int samples_per_frame) {
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
                           samples_per_frame, config.coder.sample_rate) *
      config.buffer_duration_factor;
  return params;
}

// The multi-tone receiver's record; false as MakeDtmfEncoderParams.
bool DecoderRecord(const DtmfDecoderConfig& config, DtmfDecoderParams* params,
                   std::string* problem = nullptr) {
  DtmfEncoderParams tones;
  if (!MakeDtmfEncoderParams(config.tones, &tones, problem)) return false;
  *params = DtmfDecoderParams(tones);
  params->max_candidates_per_decode_token_call = config.max_candidates_per_decode_token_call;
  params->max_buffer_duration_in_seconds =
      TokenDurationSeconds(tones) * config.buffer_duration_factor;
  return true;
}

DsssDecoderConfig DsssReceiver(const ModemSettings& modem, const ReceiverSettings& receiver,
                               float rate_hz, int num_channels) {
  DsssDecoderConfig config;
  config.coder = modem.dsss.coder;
  config.token_length_bytes = modem.TokenBytes();
  config.append_check_symbol = modem.dsss.append_check_symbol;
  config.max_candidates_to_return = receiver.max_candidates;
  config.num_channels = num_channels;
  config.with_hotsound = receiver.hotsound;
  config.detection_duration = receiver.detection_duration;
  config.detection_threshold = receiver.detection_threshold;
  config.input_sample_rate = rate_hz;
  if (receiver.buffer_duration_factor) {
    config.buffer_duration_factor = *receiver.buffer_duration_factor;
  }
  return config;
}

DtmfDecoderConfig DtmfReceiver(const ModemSettings& modem, const ReceiverSettings& receiver,
                               float rate_hz, int num_channels) {
  DtmfDecoderConfig config;
  config.tones = modem.dtmf;
  config.max_candidates_per_decode_token_call = receiver.max_candidates;
  config.num_channels = num_channels;
  config.input_sample_rate = rate_hz;
  if (receiver.buffer_duration_factor) {
    config.buffer_duration_factor = *receiver.buffer_duration_factor;
  }
  return config;
}

}  // namespace

std::unique_ptr<AudioModemDecoder> MakeDsssDecoder(const DsssDecoderConfig& config) {
  auto coder = std::make_shared<const SymbolWaveCoder>(MakeSymbolWaveCoderParams(config.coder));
  auto dsss = std::make_unique<SorvaneDecoder>(
      coder, DecoderRecord(config, coder->samples_per_frame()));
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
  DtmfDecoderParams params;
  if (!DecoderRecord(config, &params)) return nullptr;
  auto decoder =
      std::make_unique<AudioModemDecoder>(std::make_unique<DtmfDecoder>(params));
  decoder->Initialize(config.num_channels, config.input_sample_rate);
  return decoder;
}

std::string ResolveModemSettings(ModemSettings& s) {
  if (s.scheme != "dsss" && s.scheme != "dtmf") {
    return "scheme must be dsss or dtmf, got '" + s.scheme + "'";
  }
  if (s.MessageBytes() <= 0) {
    return "token bytes (" + std::to_string(s.TokenBytes()) + ") leave no message bytes";
  }
  if (s.TokenBytes() > kMaxTokenBytes) {
    return StrCat("token bytes must be at most ", kMaxTokenBytes, ", got ", s.TokenBytes());
  }
  if (std::string e = RateProblem("the frame sample rate", s.dsss.coder.sample_rate);
      !e.empty()) {
    return e;
  }
  if (s.is_dsss()) {
    s.dsss.token_length_bytes = s.TokenBytes();
    s.dsss.coder.baseband_decimation_factor = s.decimation_factor.value_or(3);
    if (std::string e = ValidateDsssCoderConfig(s.dsss.coder); !e.empty()) return e;
    if (s.dsss.coder.upsampling_factor > kMaxUpsamplingFactor) {
      return StrCat("upsampling_factor must be at most ", kMaxUpsamplingFactor, ", got ",
                    s.dsss.coder.upsampling_factor);
    }
    if (s.dsss.coder.min_cycles_per_frame > kMaxMinCyclesPerFrame) {
      return StrCat("min_cycles_per_frame must be at most ", kMaxMinCyclesPerFrame, ", got ",
                    s.dsss.coder.min_cycles_per_frame);
    }
    if (std::string e = RateProblem(
            "the broadcast sample rate", static_cast<float>(s.dsss.broadcast_sample_rate));
        !e.empty()) {
      return e;
    }
    if (!(s.dsss.start_transition_duration >= 0.0f && s.dsss.start_transition_duration <= 1.0f)) {
      return StrCat("start_transition_duration must be in [0, 1] s, got ",
                    s.dsss.start_transition_duration);
    }
    SorvaneEncoderParams encoder;
    encoder.broadcast_sample_rate = static_cast<float>(s.dsss.broadcast_sample_rate);
    return ValidateSorvaneEncoderParams(encoder).message();
  }
  s.dtmf.bytes_in_token = s.TokenBytes();
  s.dtmf.sample_rate = s.dsss.coder.sample_rate;
  s.dtmf.baseband_decimation_factor = s.decimation_factor.value_or(16);
  if (!s.adsr.empty()) {
    if (s.adsr.size() != 5) {
      return StrCat("adsr takes 5 values (attack, decay, sustain, release, level), got ",
                    s.adsr.size());
    }
    s.dtmf.adsr = {{s.adsr[0], s.adsr[1], s.adsr[2], s.adsr[3], s.adsr[4]}};
  }
  if (s.dtmf.tone_frequencies.size() > kMaxTones) {
    return StrCat("at most ", kMaxTones, " tone frequencies, got ", s.dtmf.tone_frequencies.size());
  }
  if (!(s.dtmf.window_duration <= kMaxWindowDuration)) {
    return StrCat("window_duration must be at most ", kMaxWindowDuration, " s, got ",
                  s.dtmf.window_duration);
  }
  return ValidateDtmfConfig(s.dtmf);
}

std::string CheckMessageBytes(const ModemSettings& s, size_t message_bytes) {
  if (static_cast<int>(message_bytes) == s.MessageBytes()) return "";
  return StrCat("token has ", message_bytes, " bytes; the ", s.scheme, " scheme sends ",
                s.TokenBytes(), "-byte tokens, so give ", s.MessageBytes(),
                s.crc ? " message bytes (the CRC adds 2)" : " bytes");
}

std::unique_ptr<AudioModemEncoder> MakeEncoder(const ModemSettings& s) {
  return s.is_dsss() ? MakeDsssEncoder(s.dsss) : MakeDtmfEncoder(s.dtmf);
}

std::string CheckHotsoundRate(double rate_hz) {
  const double carrier = HotsoundDetectorConfig().frequency;
  // The detector is built for the whole-Hz rate.
  if (HotsoundDetector::RateFits(std::floor(rate_hz), carrier)) return "";
  const int needed = static_cast<int>(2 * (carrier + HotsoundDetector::kHalfBandwidth)) + 1;
  return StrCat("hotsound needs a sample rate of at least ", needed, " Hz (the ",
                std::lround(carrier), " Hz carrier and its band), got ",
                static_cast<int>(rate_hz), " Hz");
}

std::string CheckReceiverSettings(const ModemSettings& modem, const ReceiverSettings& r,
                                  float rate_hz, int num_channels) {
  if (r.max_candidates < 1 || r.max_candidates > kMaxCandidates) {
    return StrCat("max_candidates must be in [1, ", kMaxCandidates, "], got ", r.max_candidates);
  }
  if (num_channels < 1 || num_channels > kMaxChannels) {
    return StrCat("the input must have 1 to ", kMaxChannels, " channels, got ", num_channels);
  }
  // The rates the decoders are fuzzed at; far outside them their
  // resamplers cannot be built.
  if (std::string e = RateProblem("the input rate", rate_hz); !e.empty()) return e;
  if (!(r.detection_duration >= 0.0f && r.detection_duration <= 10.0f)) {
    return StrCat("detection_duration must be in [0, 10] s, got ", r.detection_duration);
  }
  if (!(r.detection_threshold >= 0.0f) || !std::isfinite(r.detection_threshold)) {
    return StrCat("detection_threshold must not be negative, got ", r.detection_threshold);
  }
  if (r.buffer_duration_factor && !(*r.buffer_duration_factor >= kMinBufferTokens &&
                                     *r.buffer_duration_factor <= kMaxBufferTokens)) {
    return StrCat("buffer_duration_factor must be in [", kMinBufferTokens, ", ",
                  kMaxBufferTokens, "], got ", *r.buffer_duration_factor);
  }
  if (r.hotsound && !modem.is_dsss()) return "hotsound works with the dsss scheme";
  if (r.hotsound) {
    if (std::string e = CheckHotsoundRate(rate_hz); !e.empty()) return e;
  }
  // The DSSS carrier needs a receiver rate above twice its frequency.
  if (modem.is_dsss() && rate_hz < 2 * modem.dsss.coder.desired_carrier_frequency) {
    return StrCat("a ", static_cast<int>(rate_hz), " Hz input cannot carry the ",
                  static_cast<int>(modem.dsss.coder.desired_carrier_frequency), " Hz carrier");
  }
  if (modem.is_dsss()) {
    const DsssDecoderConfig config = DsssReceiver(modem, r, rate_hz, num_channels);
    const int samples_per_frame = SamplesPerFrame(MakeSymbolWaveCoderParams(config.coder));
    return ValidateSorvaneDecoderParams(DecoderRecord(config, samples_per_frame)).message();
  }
  DtmfDecoderParams params;
  std::string problem;
  if (!DecoderRecord(DtmfReceiver(modem, r, rate_hz, num_channels), &params, &problem)) {
    return problem;
  }
  return ValidateDtmfDecoderParams(params).message();
}

std::unique_ptr<AudioModemDecoder> MakeDecoder(const ModemSettings& modem,
                                               const ReceiverSettings& receiver, float rate_hz,
                                               int num_channels,
                                               HotsoundDecoder::Clock hotsound_clock) {
  if (modem.is_dsss()) {
    DsssDecoderConfig config = DsssReceiver(modem, receiver, rate_hz, num_channels);
    config.hotsound_clock = std::move(hotsound_clock);
    return MakeDsssDecoder(config);
  }
  return MakeDtmfDecoder(DtmfReceiver(modem, receiver, rate_hz, num_channels));
}

HotsoundDecoder::Clock AudioTimeClock(const int64_t* frames, float rate_hz) {
  return [frames, rate_hz] {
    return std::chrono::steady_clock::time_point() +
           std::chrono::microseconds(static_cast<int64_t>(*frames * 1e6 / rate_hz));
  };
}

}  // namespace audio_sorvane
