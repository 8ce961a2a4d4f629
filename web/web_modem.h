// The modem as the browser page drives it: the settings a person picks or
// types (scheme, CRC, hex token, sample rate) are checked the way the
// command-line tool checks them, then a token becomes PCM, or a mono stream
// of received audio becomes tokens.
//
// Refused settings and input come back as a one-line message (and are logged
// at ERROR); nothing a caller passes ends the process. Defaults are the
// modem's: 8-byte DSSS tokens, 5-byte multi-tone tokens, two of them CRC
// bytes with `crc`. Not thread safe.
#ifndef WEB_WEB_MODEM_H_
#define WEB_WEB_MODEM_H_

#include <cstdint>
#include <memory>
#include <set>
#include <span>
#include <string>
#include <vector>

#include "audio/audio_modem_decoder.h"

namespace sorvel_web {

// Rates the page accepts, Hz: browsers run audio between these.
inline constexpr int kMinSampleRateHz = 8000;
inline constexpr int kMaxSampleRateHz = 192000;
// Longest looped broadcast one call renders, seconds.
inline constexpr double kMaxLoopSeconds = 60.0;

struct WebModemSettings {
  std::string scheme = "dsss";  // "dsss" or "dtmf"
  bool crc = false;             // tokens end in two CRC-16 check bytes
  int sample_rate_hz = 44100;   // encoder output / decoder input, Hz
  bool hotsound = false;        // decoder, dsss only: wait for the wake-up detector
};

// Bytes of message (token less its CRC bytes) the scheme carries.
int MessageBytes(const WebModemSettings& settings);

// "" when the settings can build an encoder and a decoder, else the problem.
std::string ValidateSettings(const WebModemSettings& settings);

// Parses hex ("0a1B2c"; spaces, ':' and '-' allowed between bytes).
// Returns "" or the problem.
std::string ParseHex(const std::string& hex, std::vector<uint8_t>* bytes);
std::string ToHex(std::span<const uint8_t> bytes);

struct EncodeResult {
  std::string error;           // "" on success, when `samples` holds the audio
  std::vector<float> samples;  // full scale +-1 at sample_rate_hz
};

// One token of `message_hex` (the message; with crc the CRC bytes are
// added), or with loop_seconds > 0 a looped broadcast of that length: the
// start transition, repetitions and the fade-out, as a phone plays it.
EncodeResult EncodeToken(const WebModemSettings& settings, const std::string& message_hex,
                         double loop_seconds);

// A receiver for one mono stream. It asks the decoder for tokens every
// 250 ms of audio and reports each token once (Reset forgets them).
// With crc every token that passed its check is reported; without, only the
// best candidate, since nothing vouches for the others.
class WebDecoder {
 public:
  WebDecoder() = default;
  // The decoder's activity clock reads this object's audio time.
  WebDecoder(const WebDecoder&) = delete;
  WebDecoder& operator=(const WebDecoder&) = delete;

  // Builds the decoder; on a problem returns it and keeps the decoder it
  // had (if any) untouched.
  std::string Configure(const WebModemSettings& settings);
  bool configured() const { return decoder_ != nullptr; }

  // Mono samples on the 16-bit scale (+-32768). Returns, in hex, the tokens
  // first heard in this audio. Before Configure: logged, nothing decoded.
  std::vector<std::string> Process(std::span<const float> samples);

  // The end of a recording: tokens first heard once the decoder has had the
  // half second of silence that lets it finish a broadcast the audio ends
  // with (AudioModemDecoder::FinishInput).
  std::vector<std::string> Finish();

  // Drops buffered audio and the tokens already reported.
  void Reset();

 private:
  void Request(std::vector<std::string>* heard);

  WebModemSettings settings_;
  std::unique_ptr<audio_sorvane::AudioModemDecoder> decoder_;
  int64_t frames_ = 0;          // audio fed since Configure or Reset
  int64_t next_request_frame_ = 0;
  int64_t request_interval_frames_ = 0;
  std::set<std::vector<uint8_t>> seen_;
  audio_sorvane::AudioModemDecoder::DecodeResults results_;
};

}  // namespace sorvel_web

#endif  // WEB_WEB_MODEM_H_
