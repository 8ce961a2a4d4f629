#include "tools/decode_command.h"

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <iostream>
#include <memory>
#include <set>
#include <string>
#include <type_traits>
#include <vector>

#include "audio/audio_modem_decoder.h"
#include "audio/modem_config.h"
#include "tools/modem_options.h"
#include "tools/wav_io.h"

namespace sorvel_cli {
namespace {

struct DecodeOptions {
  ModemOptions modem;
  ReceiverOptions receiver;
  std::string input;
  float raw_rate = 44100.0f;
  int raw_channels = 1;
};

// Reads interleaved frames from a sound file or from raw 16-bit
// little-endian PCM on standard input: as 16-bit samples where that is what
// the input holds (raw input, 16-bit PCM files), else as floats on the
// 16-bit scale.
class AudioSource {
 public:
  std::string Open(const DecodeOptions& o) {
    if (o.input == "-") {
      rate_ = o.raw_rate;
      channels_ = o.raw_channels;
      if (rate_ <= 0 || channels_ < 1) return "--rate and --channels must be positive";
      return "";
    }
    if (std::string e = file_.Open(o.input); !e.empty()) return e;
    from_file_ = true;
    rate_ = static_cast<float>(file_.sample_rate());
    channels_ = file_.channels();
    return "";
  }

  // Whether Read gives 16-bit samples.
  bool pcm16() const { return !from_file_ || file_.pcm16(); }

  // Up to `frames` frames; fewer (possibly none) at the end of the input.
  template <typename Sample>
  void Read(size_t frames, std::vector<Sample>* samples) {
    samples->resize(frames * channels_);
    size_t got = 0;
    if (from_file_) {
      std::vector<Sample>& chunk = Chunk(samples);
      // Files are read a few hundred milliseconds at a time (one read per
      // block cost more system time than a DTMF decoder spends on it) and
      // handed out in blocks.
      if (next_ == chunk.size()) {
        const size_t chunk_frames = 32 * frames;
        chunk.resize(chunk_frames * channels_);
        chunk.resize(file_.Read(chunk.data(), chunk_frames) * channels_);
        next_ = 0;
      }
      const size_t n = std::min(frames * channels_, chunk.size() - next_);
      std::copy_n(chunk.begin() + static_cast<std::ptrdiff_t>(next_), n, samples->begin());
      next_ += n;
      got = n / channels_;
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
  std::vector<float>& Chunk(std::vector<float>*) { return float_chunk_; }
  std::vector<int16_t>& Chunk(std::vector<int16_t>*) { return pcm16_chunk_; }

  SoundFileReader file_;
  bool from_file_ = false;
  float rate_ = 0.0f;
  int channels_ = 1;
  std::vector<uint8_t> raw_;
  // File samples read ahead, from next_ on (one of the two is used).
  std::vector<float> float_chunk_;
  std::vector<int16_t> pcm16_chunk_;
  size_t next_ = 0;
};

// Reads `source` to its end in 10 ms blocks of `Sample`s into `decoder`.
template <typename Sample>
void DecodeAll(AudioSource& source, StreamDecoder& decoder) {
  const size_t block_frames = std::max<size_t>(1, static_cast<size_t>(source.rate() / 100));
  std::vector<Sample> block;
  while (true) {
    source.Read(block_frames, &block);
    if (block.empty()) break;
    if constexpr (std::is_same_v<Sample, int16_t>) {
      decoder.FeedPcm16(block);
    } else {
      decoder.Feed(block);
    }
  }
}

int Run(DecodeOptions& o) {
  AudioSource source;
  StreamDecoder decoder;
  std::string error = audio_sorvane::ResolveModemSettings(o.modem);
  if (error.empty()) error = source.Open(o);
  if (error.empty()) error = decoder.Start(o.modem, o.receiver, source.rate(), source.channels());
  if (!error.empty()) {
    std::cerr << "sorvel decode: " << error << "\n";
    return kUsageError;
  }
  if (source.pcm16()) {
    DecodeAll<int16_t>(source, decoder);
  } else {
    DecodeAll<float>(source, decoder);
  }
  return decoder.Finish() > 0 ? 0 : 1;
}

}  // namespace

void AddReceiverOptions(CLI::App* command, ReceiverOptions* r) {
  const std::string group = "Receiver";
  command->add_flag("--hotsound", r->hotsound,
                    "DSSS only: wait for the wake-up detector before decoding")->group(group);
  command->add_option("--interval", r->interval_ms, "Ask for tokens every MS of audio")
      ->capture_default_str()->group(group);
  command->add_flag("--json", r->json, "One JSON object per token and line")->group(group);
  command->add_option("--max-candidates", r->max_candidates, "Candidates per request, best first")
      ->capture_default_str()->group(group);
  command->add_option("--detection-duration", r->detection_duration,
                      "DSSS broadcaster detection window, seconds")
      ->capture_default_str()->group(group);
  command->add_option("--detection-threshold", r->detection_threshold,
                      "DSSS broadcaster detection threshold")->capture_default_str()->group(group);
  command->add_option("--buffer-duration-factor", r->buffer_duration_factor,
                      "Audio held, in token durations [dsss 4, dtmf 6]")->group(group);
}

std::string StreamDecoder::Start(const ModemOptions& modem, const ReceiverOptions& receiver,
                                 float rate, int channels) {
  modem_ = modem;
  receiver_ = receiver;
  rate_ = rate;
  channels_ = channels;
  if (receiver.interval_ms <= 0) return "--interval must be positive";
  // The flag's own words first; the library names the setting.
  if (receiver.hotsound && modem.is_dsss()) {
    if (std::string e = CheckHotsoundRate(rate); !e.empty()) return e;
  }
  if (std::string e = audio_sorvane::CheckReceiverSettings(modem, receiver, rate, channels);
      !e.empty()) {
    return e;
  }
  // Input is read as fast as it decodes: the hotsound timeout runs on the
  // audio's time.
  decoder_ = audio_sorvane::MakeDecoder(modem, receiver, rate, channels,
                                        audio_sorvane::AudioTimeClock(&frames_, rate_));
  if (!decoder_) return "the ADSR window was refused (see the log line above)";
  next_request_ = receiver.interval_ms / 1000.0;
  return "";
}

void StreamDecoder::Feed(std::span<const float> samples) {
  decoder_->ProcessSamples(samples);
  Advance(static_cast<int64_t>(samples.size()) / channels_);
}

void StreamDecoder::FeedPcm16(std::span<const int16_t> samples) {
  decoder_->ProcessPcm16(samples.data(), static_cast<int>(samples.size()));
  Advance(static_cast<int64_t>(samples.size()) / channels_);
}

void StreamDecoder::Advance(int64_t frames) {
  frames_ += frames;
  const double now = frames_ / static_cast<double>(rate_);
  if (now >= next_request_) {
    Request(now);
    next_request_ += receiver_.interval_ms / 1000.0;
  }
}

int StreamDecoder::Finish() {
  // The stream clock stays at the end of the input.
  decoder_->FinishInput();
  Request(frames_ / static_cast<double>(rate_));
  return static_cast<int>(seen_.size());
}

void StreamDecoder::Request(double now) {
  audio_sorvane::AudioModemDecoder::DecodeResults results;
  if (!decoder_->DecodeTokens(&results, modem_.MessageBytes(), modem_.crc ? 2 : 0)) return;
  // Tokens come best first. Without CRC bytes nothing vouches for the
  // lower-ranked candidates, so they are flagged as alternatives.
  for (size_t rank = 1; rank <= results.tokens.size(); ++rank) {
    const auto& token = results.tokens[rank - 1];
    if (!seen_.insert(token.bytes).second) continue;
    if (first_token_seconds_ < 0 && rank == 1) first_token_seconds_ = now;
    if (receiver_.json) {
      std::printf("{\"time\": %.3f, \"token\": \"%s\", \"scheme\": \"%s\", \"rank\": %zu}\n",
                  now, ToHex(token.bytes).c_str(), modem_.scheme.c_str(), rank);
    } else {
      std::printf("%8.3f s  %s%s\n", now, ToHex(token.bytes).c_str(),
                  rank == 1 ? "" : "  (alternative)");
    }
    std::fflush(stdout);
  }
}

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
  AddReceiverOptions(command, &options->receiver);
  AddModemOptions(command, &options->modem, /*transmitter=*/false);
  command->callback([=] { *exit_code = Run(*options); });
}

}  // namespace sorvel_cli
