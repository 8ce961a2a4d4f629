// `sorvel encode`: a token to a WAV file, in either scheme.
#ifndef TOOLS_ENCODE_COMMAND_H_
#define TOOLS_ENCODE_COMMAND_H_

#include <optional>
#include <string>
#include <vector>

#include "CLI/CLI.hpp"
#include "audio/audio_modem_encoder.h"
#include "audio/modem_config.h"

namespace sorvel_cli {

// Exit code of refused arguments.
inline constexpr int kUsageError = 2;

// The transmitter settings shared by `encode` and `simulate`.
struct EncodeOptions {
  std::string scheme = "dsss";
  std::string token_hex;
  bool crc = false;
  std::optional<int> token_bytes;         // scheme default: 8 DSSS, 5 multi-tone
  std::optional<int> decimation_factor;   // scheme default: 3 DSSS, 16 multi-tone
  audio_sorvane::DsssEncoderConfig dsss;
  audio_sorvane::DtmfConfig dtmf;
  std::vector<float> adsr;                // empty: half-sine window
};

// Registers the scheme and every transmitter setting on `command`.
void AddEncodeOptions(CLI::App* command, EncodeOptions* options);

// Parses hex ("0a1B2c"; spaces, ':' and '-' allowed between bytes).
// Returns an empty string or the problem.
std::string ParseHex(const std::string& hex, std::vector<uint8_t>* bytes);

// Validates the options and builds the encoder and the message bytes.
// Returns an empty string or a one-line problem.
std::string PrepareEncoder(EncodeOptions& options,
                           std::unique_ptr<audio_sorvane::AudioModemEncoder>* encoder,
                           std::vector<uint8_t>* message);

// Adds the `encode` subcommand.
void RegisterEncodeCommand(CLI::App* app, int* exit_code);

}  // namespace sorvel_cli

#endif  // TOOLS_ENCODE_COMMAND_H_
