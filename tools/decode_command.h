// `sorvel decode`: tokens from a sound file or a live 16-bit PCM stream,
// and the streaming decoder that `simulate` shares.
#ifndef TOOLS_DECODE_COMMAND_H_
#define TOOLS_DECODE_COMMAND_H_

#include <cstdint>
#include <memory>
#include <set>
#include <span>
#include <string>
#include <vector>

#include "CLI/CLI.hpp"
#include "audio/audio_modem_decoder.h"
#include "audio/modem_config.h"
#include "tools/modem_options.h"

namespace sorvel_cli {

// The receiver's own settings, and how the tool asks and answers.
struct ReceiverOptions : audio_sorvane::ReceiverSettings {
  int interval_ms = 250;
  bool json = false;
};

void AddReceiverOptions(CLI::App* command, ReceiverOptions* options);

// Feeds audio to a decoder, asks for tokens every interval of stream time
// and prints each distinct token once, with its time.
class StreamDecoder {
 public:
  // `modem` must be resolved. Returns an empty string or a problem.
  std::string Start(const ModemOptions& modem, const ReceiverOptions& receiver, float rate,
                    int channels);
  // Interleaved samples on the 16-bit scale.
  void Feed(std::span<const float> samples);
  // Interleaved 16-bit samples.
  void FeedPcm16(std::span<const int16_t> samples);
  // Ends the input (AudioModemDecoder::FinishInput) and asks a last time;
  // returns the number of distinct tokens found.
  int Finish();
  // Stream time of the first best-ranked token, or a negative value.
  double first_token_seconds() const { return first_token_seconds_; }

 private:
  void Request(double now);
  // Counts `frames` more frames and asks for tokens when an interval is due.
  void Advance(int64_t frames);

  ModemOptions modem_;
  ReceiverOptions receiver_;
  float rate_ = 0.0f;
  int channels_ = 1;
  std::unique_ptr<audio_sorvane::AudioModemDecoder> decoder_;
  int64_t frames_ = 0;
  double next_request_ = 0.0;
  double first_token_seconds_ = -1.0;
  std::set<std::vector<uint8_t>> seen_;
};

// Adds the `decode` subcommand. Exit status: 0 when a token was found, 1
// when none, 2 on bad arguments or unreadable input.
void RegisterDecodeCommand(CLI::App* app, int* exit_code);

}  // namespace sorvel_cli

#endif  // TOOLS_DECODE_COMMAND_H_
