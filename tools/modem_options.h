// The modem settings shared by the `encode`, `decode` and `simulate`
// commands: the scheme and every parameter of the app's initialise calls,
// with the modem's defaults.
#ifndef TOOLS_MODEM_OPTIONS_H_
#define TOOLS_MODEM_OPTIONS_H_

#include <optional>
#include <string>
#include <vector>

#include "CLI/CLI.hpp"
#include "audio/modem_config.h"

namespace sorvel_cli {

// Exit code of refused arguments and unreadable input.
inline constexpr int kUsageError = 2;

// The settings of audio/modem_config.h; ResolveModemSettings resolves
// and checks them.
using ModemOptions = audio_sorvane::ModemSettings;

// Registers the scheme, --crc and the settings on `command`; with
// `transmitter`, also the settings only the sender has.
void AddModemOptions(CLI::App* command, ModemOptions* options, bool transmitter);

// audio_sorvane::CheckHotsoundRate, in the words of the --hotsound flag.
std::string CheckHotsoundRate(double rate);

// Parses hex ("0a1B2c"; spaces, ':' and '-' allowed between bytes).
// Returns an empty string or the problem.
std::string ParseHex(const std::string& hex, std::vector<uint8_t>* bytes);

std::string ToHex(const std::vector<uint8_t>& bytes);

}  // namespace sorvel_cli

#endif  // TOOLS_MODEM_OPTIONS_H_
