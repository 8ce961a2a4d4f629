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

struct ModemOptions {
  std::string scheme = "dsss";
  bool crc = false;
  std::optional<int> token_bytes;        // scheme default: 8 DSSS, 5 multi-tone
  std::optional<int> decimation_factor;  // scheme default: 3 DSSS, 16 multi-tone
  audio_sorvane::DsssEncoderConfig dsss;
  audio_sorvane::DtmfConfig dtmf;
  std::vector<float> adsr;  // empty: half-sine window

  bool is_dsss() const { return scheme == "dsss"; }
  int TokenBytes() const { return token_bytes.value_or(is_dsss() ? 8 : 5); }
  int MessageBytes() const { return TokenBytes() - (crc ? 2 : 0); }
};

// Registers the scheme, --crc and the settings on `command`; with
// `transmitter`, also the settings only the sender has.
void AddModemOptions(CLI::App* command, ModemOptions* options, bool transmitter);

// Why the hotsound wake-up detector cannot listen at `rate` Hz (its
// carrier band does not fit below half the rate), or "".
std::string CheckHotsoundRate(double rate);

// Resolves the scheme defaults into options.dsss / options.dtmf and checks
// them. Returns an empty string or a one-line problem.
std::string ResolveModemOptions(ModemOptions& options);

// Parses hex ("0a1B2c"; spaces, ':' and '-' allowed between bytes).
// Returns an empty string or the problem.
std::string ParseHex(const std::string& hex, std::vector<uint8_t>* bytes);

std::string ToHex(const std::vector<uint8_t>& bytes);

}  // namespace sorvel_cli

#endif  // TOOLS_MODEM_OPTIONS_H_
