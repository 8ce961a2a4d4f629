// Builds the modem objects from the scalar settings an app (through JNI) or
// the command-line tool passes, so that both configure them the same way.
// Defaults are the modem's defaults: DSSS with a 127-chip code, 18.5 kHz
// carrier, 4 bits per symbol and 8-byte tokens; multi-tone with ten tones
// from 740 Hz, tone pairs as symbols and 5-byte tokens.
#ifndef AUDIO_MODEM_CONFIG_H_
#define AUDIO_MODEM_CONFIG_H_

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "audio/audio_modem_decoder.h"
#include "audio/audio_modem_encoder.h"
#include "audio/sorvane/dtmf/dtmf_encoder_params.h"
#include "audio/sorvane/symbol_wave_coder.h"

namespace audio_sorvane {

// The DSSS settings transmitter and receiver must share.
struct DsssCoderConfig {
  int number_of_taps = 7;
  int code_number = 0;
  int upsampling_factor = 15;
  int bits_per_symbol = 4;
  int min_cycles_per_frame = 4;
  int baseband_decimation_factor = 3;
  bool use_quadrature = false;
  float sample_rate = 44100.0f;
  float desired_carrier_frequency = 18500.0f;
};

struct DsssEncoderConfig {
  DsssCoderConfig coder;
  int token_length_bytes = 8;
  bool append_check_symbol = false;
  bool high_pass_at_carrier = false;
  int broadcast_sample_rate = 44100;
  float start_transition_duration = 0.005f;
};

// The multi-tone settings transmitter and receiver must share.
struct DtmfConfig {
  int bytes_in_token = 5;
  bool use_checksum_symbol = false;
  int baseband_decimation_factor = 16;
  int tones_per_symbol = 2;
  // Empty keeps the default tones and symbol table.
  std::vector<float> tone_frequencies;
  float sample_rate = 44100.0f;
  float window_duration = 0.05f;
  // Attack, decay, sustain, release (seconds) and sustain amplitude; without
  // it the frame window is a half sine.
  std::optional<std::array<float, 5>> adsr;
};

// The coder's parameter record, the code generated from (number_of_taps,
// code_number). Out-of-range values end the process through CHECK when the
// coder is built.
SymbolWaveCoderParams MakeSymbolWaveCoderParams(const DsssCoderConfig& config);

// Symbols per DSSS token: (8 / bits_per_symbol) * token bytes.
int DsssSymbolsPerToken(int bits_per_symbol, int token_length_bytes);

// Fills `params` (starting from the defaults); false when the ADSR window is
// refused, which is logged, or given `problem` described there instead.
bool MakeDtmfEncoderParams(const DtmfConfig& config, DtmfEncoderParams* params,
                           std::string* problem = nullptr);

// An empty string when the settings are usable, else one line naming the
// first problem. Building from invalid settings ends the process (the
// checks guard the modem's invariants), so tools that take settings from
// users validate first.
std::string ValidateDsssCoderConfig(const DsssCoderConfig& config);
std::string ValidateDtmfConfig(const DtmfConfig& config);

// The receiving side. The decoders hold a few tokens' worth of audio:
// buffer_duration_factor times one token's duration.
struct DsssDecoderConfig {
  DsssCoderConfig coder;
  int token_length_bytes = 8;
  bool append_check_symbol = false;
  bool save_received_samples = false;
  int max_candidates_to_return = 2;
  int num_channels = 1;
  bool with_hotsound = false;
  float detection_duration = 0.175f;
  float detection_threshold = 4.0f;
  float input_sample_rate = 44100.0f;
  float buffer_duration_factor = 4.0f;  // about 3 s with the defaults
  // The hotsound decoder's activity clock; empty: the steady clock. A file
  // decoded faster than real time needs its audio time here, or the
  // decoder's one-second timeout spans minutes of audio.
  HotsoundDecoder::Clock hotsound_clock;
};

struct DtmfDecoderConfig {
  DtmfConfig tones;
  int max_candidates_per_decode_token_call = 2;
  int num_channels = 1;
  float input_sample_rate = 44100.0f;
  float buffer_duration_factor = 6.0f;  // about 2.7 s with the defaults
};

std::unique_ptr<AudioModemEncoder> MakeDsssEncoder(const DsssEncoderConfig& config);
// Null when the ADSR window is refused.
std::unique_ptr<AudioModemEncoder> MakeDtmfEncoder(const DtmfConfig& config);

// Initialised decoders (Initialize already called with the channel count
// and input rate). The multi-tone one is null when the ADSR window is
// refused.
std::unique_ptr<AudioModemDecoder> MakeDsssDecoder(const DsssDecoderConfig& config);
std::unique_ptr<AudioModemDecoder> MakeDtmfDecoder(const DtmfDecoderConfig& config);

// The settings a person picks (the command-line tool's options, the Python
// module's keywords): the scheme, the CRC and both schemes' settings, the
// scheme-dependent ones left empty for the scheme's default.
struct ModemSettings {
  std::string scheme = "dsss";  // "dsss" or "dtmf"
  bool crc = false;
  std::optional<int> token_bytes;        // scheme default: 8 DSSS, 5 multi-tone
  std::optional<int> decimation_factor;  // scheme default: 3 DSSS, 16 multi-tone
  DsssEncoderConfig dsss;  // dsss.coder.sample_rate is the frame rate of both schemes
  DtmfConfig dtmf;
  std::vector<float> adsr;  // empty: half-sine window; else the five values

  bool is_dsss() const { return scheme == "dsss"; }
  int TokenBytes() const { return token_bytes.value_or(is_dsss() ? 8 : 5); }
  int MessageBytes() const { return TokenBytes() - (crc ? 2 : 0); }
};

// Resolves the scheme defaults into settings.dsss / settings.dtmf and
// checks them. Returns "" or a one-line problem.
std::string ResolveModemSettings(ModemSettings& settings);

// Why a message of `message_bytes` bytes cannot be sent with the resolved
// `settings`, or "".
std::string CheckMessageBytes(const ModemSettings& settings, size_t message_bytes);

// The encoder of resolved settings; null when the ADSR window is refused
// (which is logged).
std::unique_ptr<AudioModemEncoder> MakeEncoder(const ModemSettings& settings);

// The receiver's own settings.
struct ReceiverSettings {
  bool hotsound = false;  // DSSS behind the wake-up detector
  int max_candidates = 2;  // per token request, 1..6
  float detection_duration = 0.175f;  // s, DSSS broadcaster detection window
  float detection_threshold = 4.0f;
  std::optional<float> buffer_duration_factor;  // scheme default: 4 DSSS, 6 multi-tone
};

// Why the hotsound wake-up detector cannot listen at `rate_hz` (its
// carrier band does not fit below half the rate), or "".
std::string CheckHotsoundRate(double rate_hz);

// Why a receiver with these settings cannot take input at `rate_hz` (8 to
// 192 kHz) with `num_channels` interleaved channels, or "". `modem` must be
// resolved.
std::string CheckReceiverSettings(const ModemSettings& modem, const ReceiverSettings& receiver,
                                  float rate_hz, int num_channels);

// The initialised decoder of settings that passed CheckReceiverSettings
// (others end the process through CHECK); null when the ADSR window is
// refused. `hotsound_clock` as in DsssDecoderConfig.
std::unique_ptr<AudioModemDecoder> MakeDecoder(const ModemSettings& modem,
                                               const ReceiverSettings& receiver, float rate_hz,
                                               int num_channels,
                                               HotsoundDecoder::Clock hotsound_clock = {});

// A hotsound clock that follows the audio rather than the wall: `*frames`
// frames at `rate_hz` after an arbitrary epoch. For audio decoded faster
// than real time; `frames` must outlive the clock.
HotsoundDecoder::Clock AudioTimeClock(const int64_t* frames, float rate_hz);

}  // namespace audio_sorvane

#endif  // AUDIO_MODEM_CONFIG_H_
