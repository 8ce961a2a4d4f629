// Channel settings of `simulate` and `eval`.
#ifndef TOOLS_CHANNEL_OPTIONS_H_
#define TOOLS_CHANNEL_OPTIONS_H_

#include <string>

#include "CLI/CLI.hpp"
#include "sim/channel_simulator.h"

namespace sorvel_cli {

struct ChannelOptions {
  sorvel_sim::ChannelConfig config;
  std::string noise = "white";
  std::string mix_file;
};

// --noise, --rate, --band-limit, --clip, --gain, --mix, --mix-gain and,
// with `single_values`, --snr, --speed, --rt60 and --seed (eval takes lists
// of those itself).
void AddChannelOptions(CLI::App* command, ChannelOptions* options, bool single_values);

// Fills the noise kind and loads the interference recording at `rate`.
// Returns an empty string or the problem.
std::string ResolveChannelOptions(ChannelOptions& options);

}  // namespace sorvel_cli

#endif  // TOOLS_CHANNEL_OPTIONS_H_
