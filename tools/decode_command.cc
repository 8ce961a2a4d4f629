#include "tools/decode_command.h"

#include <sndfile.h>

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <iostream>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "audio/audio_modem_decoder.h"
#include "audio/modem_config.h"
#include "tools/modem_options.h"

namespace sorvel_cli {
namespace {

struct DecodeOptions {
  ModemOptions modem;
  std::string input;
  float raw_rate = 44100.0f;
  int raw_channels = 1;
  bool hotsound = false;
  int interval_ms = 250;
  bool json = false;
  int max_candidates = 2;
  float detection_duration = 0.175f;
  float detection_threshold = 4.0f;
  std::optional<float> buffer_duration_factor;
};

// Reads interleaved frames on the 16-bit scale from a sound file or from
// raw 16-bit little-endian PCM on standard input.
class AudioSource {
 public:
  ~AudioSource() {
    if (file_ != nullptr) sf_close(file_);
  }

  std::string Open(const DecodeOptions& o) {
    if (o.input == "-") {
      rate_ = o.raw_rate;
      channels_ = o.raw_channels;
      if (rate_ <= 0 || channels_ < 1) return "--rate and --channels must be positive";
      return "";
    }
    SF_INFO info = {};
    file_ = sf_open(o.input.c_str(), SFM_READ, &info);
    if (file_ == nullptr) return "cannot read " + o.input + ": " + sf_strerror(nullptr);
    rate_ = static_cast<float>(info.samplerate);
    channels_ = info.channels;
    return "";
  }

  // Up to `frames` frames; fewer (possibly none) at the end of the input.
  void Read(size_t frames, std::vector<float>* samples) {
    samples->resize(frames * channels_);
    size_t got = 0;
    if (file_ != nullptr) {
      // Float reads keep any format's full resolution (short reads of a
      // float file return only -1, 0 and 1); scale to the 16-bit range.
      got = static_cast<size_t>(sf_readf_float(file_, samples->data(),
                                               static_cast<sf_count_t>(frames)));
      for (float& v : *samples) v = std::clamp(v * 32768.0f, -32768.0f, 32767.0f);
    } else {
      raw_.resize(frames * channels_ * 2);
      const size_t bytes = std::fread(raw_.data(), 1, raw_.size(), stdin);
      got = bytes / (2 * channels_);
      for (size_t i = 0; i < got * channels_; ++i) {
        (*samples)[i] = static_cast<int16_t>(raw_[2 * i] | (raw_[2 * i + 1] << 8));
      }
    }
    samples->resize(got * channels_);
  }

  float rate() const { return rate_; }
  int channels() const { return channels_; }

 private:
  SNDFILE* file_ = nullptr;
  float rate_ = 0.0f;
  int channels_ = 1;
  std::vector<uint8_t> raw_;
};

std::unique_ptr<audio_sorvane::AudioModemDecoder> MakeDecoder(DecodeOptions& o, float rate,
                                                              int channels) {
  if (o.modem.is_dsss()) {
    audio_sorvane::DsssDecoderConfig config;
    config.coder = o.modem.dsss.coder;
    config.token_length_bytes = o.modem.TokenBytes();
    config.append_check_symbol = o.modem.dsss.append_check_symbol;
    config.max_candidates_to_return = o.max_candidates;
    config.num_channels = channels;
    config.with_hotsound = o.hotsound;
    config.detection_duration = o.detection_duration;
    config.detection_threshold = o.detection_threshold;
    config.input_sample_rate = rate;
    if (o.buffer_duration_factor) config.buffer_duration_factor = *o.buffer_duration_factor;
    return audio_sorvane::MakeDsssDecoder(config);
  }
  audio_sorvane::DtmfDecoderConfig config;
  config.tones = o.modem.dtmf;
  config.max_candidates_per_decode_token_call = o.max_candidates;
  config.num_channels = channels;
  config.input_sample_rate = rate;
  if (o.buffer_duration_factor) config.buffer_duration_factor = *o.buffer_duration_factor;
  return audio_sorvane::MakeDtmfDecoder(config);
}

int Run(DecodeOptions& o) {
  const auto fail = [](const std::string& message) {
    std::cerr << "sorvel decode: " << message << "\n";
    return kUsageError;
  };
  if (std::string e = ResolveModemOptions(o.modem); !e.empty()) return fail(e);
  if (o.interval_ms <= 0) return fail("--interval must be positive");
  if (o.max_candidates < 1 || o.max_candidates > 6) {
    return fail("--max-candidates must be in [1, 6]");
  }
  AudioSource source;
  if (std::string e = source.Open(o); !e.empty()) return fail(e);
  if (o.hotsound && !o.modem.is_dsss()) return fail("--hotsound works with the dsss scheme");
  // The DSSS carrier needs a receiver rate above twice its frequency.
  if (o.modem.is_dsss() && source.rate() < 2 * o.modem.dsss.coder.desired_carrier_frequency) {
    return fail("a " + std::to_string(static_cast<int>(source.rate())) +
                " Hz input cannot carry the " +
                std::to_string(static_cast<int>(o.modem.dsss.coder.desired_carrier_frequency)) +
                " Hz carrier");
  }
  const auto decoder = MakeDecoder(o, source.rate(), source.channels());
  if (!decoder) return fail("the ADSR window was refused (see the log line above)");

  const size_t block_frames = std::max<size_t>(1, static_cast<size_t>(source.rate() / 100));
  const double interval = o.interval_ms / 1000.0;
  const int crc_bytes = o.modem.crc ? 2 : 0;
  std::set<std::vector<uint8_t>> seen;
  std::vector<float> block;
  int64_t frames = 0;
  double next_request = interval;
  audio_sorvane::AudioModemDecoder::DecodeResults results;
  const auto request = [&](double now) {
    if (!decoder->DecodeTokens(&results, o.modem.MessageBytes(), crc_bytes)) return;
    for (const auto& token : results.tokens) {
      if (!seen.insert(token.bytes).second) continue;
      if (o.json) {
        std::printf("{\"time\": %.3f, \"token\": \"%s\", \"scheme\": \"%s\"}\n", now,
                    ToHex(token.bytes).c_str(), o.modem.scheme.c_str());
      } else {
        std::printf("%8.3f s  %s\n", now, ToHex(token.bytes).c_str());
      }
      std::fflush(stdout);
    }
  };
  while (true) {
    source.Read(block_frames, &block);
    if (block.empty()) break;
    decoder->ProcessSamples(block);
    frames += static_cast<int64_t>(block.size()) / source.channels();
    const double now = frames / static_cast<double>(source.rate());
    if (now >= next_request) {
      request(now);
      next_request += interval;
    }
  }
  request(frames / static_cast<double>(source.rate()));
  return seen.empty() ? 1 : 0;
}

}  // namespace

void RegisterDecodeCommand(CLI::App* app, int* exit_code) {
  auto options = std::make_shared<DecodeOptions>();
  CLI::App* command = app->add_subcommand(
      "decode", "Decode tokens from a sound file (WAV, FLAC, ...) or raw 16-bit PCM on stdin (-)");
  command->add_option("input", options->input, "Sound file, or - for raw s16le PCM on stdin")
      ->required();
  command->add_option("--rate", options->raw_rate, "Sample rate of raw input, Hz")
      ->capture_default_str();
  command->add_option("--channels", options->raw_channels, "Channels of raw input")
      ->capture_default_str();
  command->add_flag("--hotsound", options->hotsound,
                    "DSSS only: wait for the wake-up detector before decoding");
  command->add_option("--interval", options->interval_ms, "Ask for tokens every MS of audio")
      ->capture_default_str();
  command->add_flag("--json", options->json, "One JSON object per token and line");
  command->add_option("--max-candidates", options->max_candidates,
                      "Candidates per request, best first")->capture_default_str();
  command->add_option("--detection-duration", options->detection_duration,
                      "DSSS broadcaster detection window, seconds")->capture_default_str();
  command->add_option("--detection-threshold", options->detection_threshold,
                      "DSSS broadcaster detection threshold")->capture_default_str();
  command->add_option("--buffer-duration-factor", options->buffer_duration_factor,
                      "Audio held, in token durations [dsss 4, dtmf 6]");
  AddModemOptions(command, &options->modem, /*transmitter=*/false);
  command->callback([=] { *exit_code = Run(*options); });
}

}  // namespace sorvel_cli
