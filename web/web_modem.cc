#include "web/web_modem.h"

#include <algorithm>
#include <cctype>
#include <chrono>
#include <cmath>
#include <cstdio>

#include "audio/hotsound_detector.h"
#include "audio/modem_config.h"
#include "base/logging.h"

namespace sorvel_web {
namespace {

constexpr int kRequestIntervalMs = 250;
constexpr int kMaxCandidates = 2;

bool IsDsss(const WebModemSettings& s) { return s.scheme == "dsss"; }

int TokenBytes(const WebModemSettings& s) { return IsDsss(s) ? 8 : 5; }

audio_sorvane::DsssCoderConfig DsssCoder() { return {}; }

audio_sorvane::DtmfConfig Dtmf(const WebModemSettings& s) {
  audio_sorvane::DtmfConfig config;
  config.bytes_in_token = TokenBytes(s);
  return config;
}

std::string Refuse(std::string problem) {
  LOG(ERROR) << problem;
  return problem;
}

}  // namespace

int MessageBytes(const WebModemSettings& settings) {
  return TokenBytes(settings) - (settings.crc ? 2 : 0);
}

std::string ValidateSettings(const WebModemSettings& s) {
  if (s.scheme != "dsss" && s.scheme != "dtmf") {
    return "scheme must be dsss or dtmf, got '" + s.scheme + "'";
  }
  if (s.sample_rate_hz < kMinSampleRateHz || s.sample_rate_hz > kMaxSampleRateHz) {
    return "sample rate must be in [" + std::to_string(kMinSampleRateHz) + ", " +
           std::to_string(kMaxSampleRateHz) + "] Hz, got " + std::to_string(s.sample_rate_hz);
  }
  if (s.hotsound && !IsDsss(s)) return "the wake-up detector works with the dsss scheme";
  if (IsDsss(s)) {
    const auto coder = DsssCoder();
    if (std::string e = audio_sorvane::ValidateDsssCoderConfig(coder); !e.empty()) return e;
    // The carrier must fit below half the rate at both ends of the link.
    if (s.sample_rate_hz < 2 * coder.desired_carrier_frequency) {
      return "a " + std::to_string(s.sample_rate_hz) + " Hz rate cannot carry the " +
             std::to_string(static_cast<int>(coder.desired_carrier_frequency)) +
             " Hz carrier";
    }
    if (s.hotsound &&
        !audio_sorvane::HotsoundDetector::RateFits(
            s.sample_rate_hz, audio_sorvane::HotsoundDetectorConfig().frequency)) {
      return "the wake-up detector cannot listen at " + std::to_string(s.sample_rate_hz) +
             " Hz";
    }
    return "";
  }
  return audio_sorvane::ValidateDtmfConfig(Dtmf(s));
}

std::string ParseHex(const std::string& hex, std::vector<uint8_t>* bytes) {
  std::string digits;
  for (char c : hex) {
    if (std::isxdigit(static_cast<unsigned char>(c))) {
      digits += c;
    } else if (c != ' ' && c != ':' && c != '-') {
      return std::string("token: '") + c + "' is not a hex digit";
    }
  }
  if (digits.size() % 2 != 0) return "token: odd number of hex digits";
  bytes->clear();
  for (size_t i = 0; i < digits.size(); i += 2) {
    bytes->push_back(static_cast<uint8_t>(std::stoi(digits.substr(i, 2), nullptr, 16)));
  }
  return "";
}

std::string ToHex(std::span<const uint8_t> bytes) {
  std::string hex;
  char pair[3];
  for (uint8_t b : bytes) {
    std::snprintf(pair, sizeof(pair), "%02x", b);
    hex += pair;
  }
  return hex;
}

EncodeResult EncodeToken(const WebModemSettings& s, const std::string& message_hex,
                         double loop_seconds) {
  EncodeResult result;
  std::vector<uint8_t> message;
  if (std::string e = ValidateSettings(s); !e.empty()) {
    result.error = Refuse(e);
    return result;
  }
  if (std::string e = ParseHex(message_hex, &message); !e.empty()) {
    result.error = Refuse(e);
    return result;
  }
  if (static_cast<int>(message.size()) != MessageBytes(s)) {
    result.error = Refuse("token has " + std::to_string(message.size()) + " bytes; the " +
                          s.scheme + " scheme sends " + std::to_string(TokenBytes(s)) +
                          "-byte tokens, so give " + std::to_string(MessageBytes(s)) +
                          (s.crc ? " message bytes (the CRC adds 2)" : " bytes"));
    return result;
  }
  // Also refuses NaN.
  if (!(loop_seconds >= 0.0 && loop_seconds <= kMaxLoopSeconds)) {
    result.error = Refuse("loop must be between 0 and " +
                          std::to_string(static_cast<int>(kMaxLoopSeconds)) + " seconds");
    return result;
  }

  std::unique_ptr<audio_sorvane::AudioModemEncoder> encoder;
  if (IsDsss(s)) {
    audio_sorvane::DsssEncoderConfig config;
    config.coder = DsssCoder();
    config.token_length_bytes = TokenBytes(s);
    config.broadcast_sample_rate = s.sample_rate_hz;
    encoder = audio_sorvane::MakeDsssEncoder(config);
  } else {
    audio_sorvane::DtmfConfig config = Dtmf(s);
    config.sample_rate = static_cast<float>(s.sample_rate_hz);
    encoder = audio_sorvane::MakeDtmfEncoder(config);
  }
  if (!encoder) {
    result.error = Refuse("the encoder could not be built");
    return result;
  }
  std::vector<float> token;
  encoder->Encode(message, &token, s.crc ? 2 : 0);
  if (token.empty()) {
    result.error = Refuse("the encoder refused the token");
    return result;
  }
  if (loop_seconds == 0.0) {
    result.samples = std::move(token);
    return result;
  }
  encoder->MakeStartTransition(token, &result.samples);
  const double wanted = loop_seconds * encoder->OutputSampleRate();
  const int repeats =
      std::max(1, static_cast<int>(std::ceil(wanted / static_cast<double>(token.size()))));
  for (int r = 0; r < repeats; ++r) {
    result.samples.insert(result.samples.end(), token.begin(), token.end());
  }
  std::vector<float> stop;
  encoder->MakeStopTransition(token, &stop);
  result.samples.insert(result.samples.end(), stop.begin(), stop.end());
  return result;
}

std::string WebDecoder::Configure(const WebModemSettings& s) {
  if (std::string e = ValidateSettings(s); !e.empty()) return Refuse(e);
  const float rate = static_cast<float>(s.sample_rate_hz);
  std::unique_ptr<audio_sorvane::AudioModemDecoder> decoder;
  if (IsDsss(s)) {
    audio_sorvane::DsssDecoderConfig config;
    config.coder = DsssCoder();
    config.token_length_bytes = TokenBytes(s);
    config.max_candidates_to_return = kMaxCandidates;
    config.with_hotsound = s.hotsound;
    config.input_sample_rate = rate;
    // Blocks arrive at the audio's pace, but a page in a background tab
    // may get them late and in bursts: the wake-up timeout runs on audio
    // time.
    config.hotsound_clock = [this] {
      return std::chrono::steady_clock::time_point() +
             std::chrono::microseconds(frames_ * 1000000 / settings_.sample_rate_hz);
    };
    decoder = audio_sorvane::MakeDsssDecoder(config);
  } else {
    audio_sorvane::DtmfDecoderConfig config;
    config.tones = Dtmf(s);
    config.max_candidates_per_decode_token_call = kMaxCandidates;
    config.input_sample_rate = rate;
    decoder = audio_sorvane::MakeDtmfDecoder(config);
  }
  if (!decoder) return Refuse("the decoder could not be built");
  settings_ = s;
  decoder_ = std::move(decoder);
  request_interval_frames_ = static_cast<int64_t>(s.sample_rate_hz) * kRequestIntervalMs / 1000;
  frames_ = 0;
  next_request_frame_ = request_interval_frames_;
  seen_.clear();
  return "";
}

std::vector<std::string> WebDecoder::Process(std::span<const float> samples) {
  std::vector<std::string> heard;
  if (!decoder_) {
    LOG(ERROR) << "the decoder is not configured; audio dropped";
    return heard;
  }
  // Pieces end where a request is due and never exceed what the decoder
  // takes in one call without cutting into a buffered token.
  const size_t max_piece = static_cast<size_t>(std::max(1, decoder_->GetMaxSafeInputSize()));
  while (!samples.empty()) {
    const size_t until_request = static_cast<size_t>(next_request_frame_ - frames_);
    const size_t n = std::min({samples.size(), max_piece, until_request});
    decoder_->ProcessSamples(samples.first(n));
    samples = samples.subspan(n);
    frames_ += static_cast<int64_t>(n);
    if (frames_ == next_request_frame_) {
      Request(&heard);
      next_request_frame_ += request_interval_frames_;
    }
  }
  return heard;
}

std::vector<std::string> WebDecoder::Finish() {
  std::vector<std::string> heard;
  if (!decoder_) {
    LOG(ERROR) << "the decoder is not configured";
    return heard;
  }
  decoder_->FinishInput();
  Request(&heard);
  return heard;
}

void WebDecoder::Reset() {
  if (!decoder_) return;
  decoder_->WipeInternalData();
  frames_ = 0;
  next_request_frame_ = request_interval_frames_;
  seen_.clear();
}

void WebDecoder::Request(std::vector<std::string>* heard) {
  const int crc_bytes = settings_.crc ? 2 : 0;
  if (!decoder_->DecodeTokens(&results_, MessageBytes(settings_), crc_bytes)) return;
  const size_t vouched = settings_.crc ? results_.tokens.size() : 1;
  for (size_t i = 0; i < std::min(vouched, results_.tokens.size()); ++i) {
    const auto& bytes = results_.tokens[i].bytes;
    if (seen_.insert(bytes).second) heard->push_back(ToHex(bytes));
  }
}

}  // namespace sorvel_web
