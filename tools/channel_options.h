// Channel settings of `simulate` and `eval`.
#ifndef TOOLS_CHANNEL_OPTIONS_H_
#define TOOLS_CHANNEL_OPTIONS_H_

#include <cmath>
#include <string>
#include <vector>

#include "CLI/CLI.hpp"
#include "sim/channel_simulator.h"

namespace sorvel_cli {

// One room of --room: its size in metres and, after a colon, its RT60 in
// seconds (NAN when not given).
struct RoomShape {
  double width = 0, depth = 0, height = 0;
  double rt60 = NAN;
  std::string text;  // as given
};

struct ChannelOptions {
  sorvel_sim::ChannelConfig config;
  std::string noise = "white";
  std::string mix_file;
  std::string room;    // comma-separated WxDxH[:RT60]
  std::string source = "omni";
  bool no_phone_speaker = false;
  bool no_phone_mic = false;
  std::vector<RoomShape> rooms;  // parsed from `room`
};

// --noise, --rate, --band-limit, --clip, --gain, --mix, --mix-gain, the
// physical room's --room, --distance, --source, --no-phone-speaker and
// --no-phone-mic, and, with `single_values`, --snr, --speed, --rt60 and
// --seed (eval takes lists of those itself).
void AddChannelOptions(CLI::App* command, ChannelOptions* options, bool single_values);

// Fills the noise kind, parses the rooms (their switches go to
// config.room, sizes stay 0) and loads the interference recording at
// `rate`. Returns an empty string or the problem.
std::string ResolveChannelOptions(ChannelOptions& options);

// `base` (switches and distance) with the size of `shape` and its RT60, or
// `rt60` when it has none, checked: returns "" or the problem.
std::string MakeRoom(const RoomShape& shape, double rt60, const sorvel_sim::RoomConfig& base,
                     sorvel_sim::RoomConfig* room);

}  // namespace sorvel_cli

#endif  // TOOLS_CHANNEL_OPTIONS_H_
