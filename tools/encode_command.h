// `sorvel encode`: a token to a WAV file, in either scheme.
#ifndef TOOLS_ENCODE_COMMAND_H_
#define TOOLS_ENCODE_COMMAND_H_

#include <memory>
#include <string>
#include <vector>

#include "CLI/CLI.hpp"
#include "audio/audio_modem_encoder.h"
#include "tools/modem_options.h"

namespace sorvel_cli {

// Builds the encoder and the message bytes from resolved options and the
// token in hex. Returns an empty string or a one-line problem.
std::string PrepareEncoder(ModemOptions& options, const std::string& token_hex,
                           std::unique_ptr<audio_sorvane::AudioModemEncoder>* encoder,
                           std::vector<uint8_t>* message);

// Adds the `encode` subcommand.
void RegisterEncodeCommand(CLI::App* app, int* exit_code);

}  // namespace sorvel_cli

#endif  // TOOLS_ENCODE_COMMAND_H_
