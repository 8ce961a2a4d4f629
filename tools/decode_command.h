// `sorvel decode`: tokens from a sound file or a live 16-bit PCM stream.
#ifndef TOOLS_DECODE_COMMAND_H_
#define TOOLS_DECODE_COMMAND_H_

#include "CLI/CLI.hpp"

namespace sorvel_cli {

// Adds the `decode` subcommand. Exit status: 0 when a token was found, 1
// when none, 2 on bad arguments or unreadable input.
void RegisterDecodeCommand(CLI::App* app, int* exit_code);

}  // namespace sorvel_cli

#endif  // TOOLS_DECODE_COMMAND_H_
