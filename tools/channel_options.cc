#include "tools/channel_options.h"

#include <cstdlib>
#include <sstream>

#include "tools/wav_io.h"

namespace sorvel_cli {

void AddChannelOptions(CLI::App* command, ChannelOptions* o, bool single_values) {
  auto& c = o->config;
  const std::string group = "Channel";
  if (single_values) {
    command->add_option("--snr", c.snr_db, "Full-band SNR, dB (signal power over the broadcast)")
        ->group(group);
    command->add_option("--speed", c.speed, "Sender moving towards the receiver, m/s")
        ->capture_default_str()->group(group);
    command->add_option("--rt60", c.rt60, "Room reverberation time, s (0: no room)")
        ->capture_default_str()->group(group);
    command->add_option("--seed", c.seed, "Noise and room seed")->capture_default_str()->group(group);
  }
  command->add_option("--noise", o->noise, "Noise colour")
      ->check(CLI::IsMember({"white", "pink"}))->capture_default_str()->group(group);
  command->add_option("--rate", c.output_rate, "Receiver's sample rate, Hz")
      ->capture_default_str()->group(group);
  command->add_option("--band-limit", c.band_limit,
                      "Microphone roll-off above this frequency, Hz (0: none)")
      ->capture_default_str()->group(group);
  command->add_option("--clip", c.clip, "Clip at this fraction of full scale (0: none)")
      ->capture_default_str()->group(group);
  command->add_option("--gain", c.gain_db, "Receiver gain before clipping, dB")
      ->capture_default_str()->group(group);
  CLI::Option* room = command->add_option("--room", o->room,
                      single_values
                          ? "Physical room WxDxH in m, optionally :RT60 in s (else --rt60), "
                            "e.g. 4x3x2.5:0.4"
                          : "Physical rooms, comma-separated WxDxH[:RT60] (m, s), e.g. "
                            "4x3x2.5:0.4,6x5x2.7:0.6; without :RT60 each --rt60 is used")
      ->group(group);
  command->add_option("--distance", c.room.distance, "With --room: loudspeaker to microphone, m")
      ->capture_default_str()->needs(room)->group(group);
  command->add_option("--source", o->source,
                      "With --room: loudspeaker directivity (phone: -10 dB behind)")
      ->check(CLI::IsMember({"omni", "phone"}))->capture_default_str()->needs(room)->group(group);
  command->add_flag("--no-phone-speaker", o->no_phone_speaker,
                    "With --room: an ideal loudspeaker instead of a phone's")
      ->needs(room)->group(group);
  command->add_flag("--no-phone-mic", o->no_phone_mic,
                    "With --room: an ideal microphone (no roll-off, no AGC) instead of a phone's")
      ->needs(room)->group(group);
  command->add_option("--mix", o->mix_file, "Interfering recording (e.g. speech) to mix in")
      ->group(group);
  command->add_option("--mix-gain", c.interference_gain_db,
                      "Gain of the interfering recording, dB (0: its own level)")
      ->capture_default_str()->group(group);
}

namespace {

// The whole of `text` as a finite number.
bool ParseNumber(const std::string& text, double* value) {
  char* end = nullptr;
  *value = std::strtod(text.c_str(), &end);
  return !text.empty() && end == text.c_str() + text.size() && std::isfinite(*value);
}

std::string ParseRooms(const std::string& text, std::vector<RoomShape>* rooms) {
  std::stringstream in(text);
  for (std::string item; std::getline(in, item, ',');) {
    RoomShape shape;
    shape.text = item;
    const std::string bad = "--room takes WxDxH[:RT60] in m and s, e.g. 4x3x2.5:0.4, not '" +
                            item + "'";
    const size_t colon = item.find(':');
    if (colon != std::string::npos &&
        (!ParseNumber(item.substr(colon + 1), &shape.rt60) || !(shape.rt60 > 0))) {
      return bad;
    }
    const std::string size_text = item.substr(0, colon);
    if (size_text.empty() || size_text.back() == 'x') return bad;
    std::stringstream size(size_text);
    std::vector<double> sizes;
    for (std::string part; std::getline(size, part, 'x');) {
      double v;
      if (!ParseNumber(part, &v) || !(v > 0)) return bad;
      sizes.push_back(v);
    }
    if (sizes.size() != 3) return bad;
    shape.width = sizes[0], shape.depth = sizes[1], shape.height = sizes[2];
    rooms->push_back(shape);
  }
  if (rooms->empty()) return "--room is empty";
  return "";
}

}  // namespace

std::string MakeRoom(const RoomShape& shape, double rt60, const sorvel_sim::RoomConfig& base,
                     sorvel_sim::RoomConfig* room) {
  *room = base;
  room->width = shape.width, room->depth = shape.depth, room->height = shape.height;
  room->rt60 = std::isnan(shape.rt60) ? rt60 : shape.rt60;
  if (!(room->rt60 > 0)) {
    return "room " + shape.text + " needs an RT60: WxDxH:RT60 or --rt60";
  }
  if (std::string e = sorvel_sim::CheckRoom(*room); !e.empty()) {
    return "room " + shape.text + ": " + e;
  }
  return "";
}

std::string ResolveChannelOptions(ChannelOptions& o) {
  o.config.noise = o.noise == "pink" ? sorvel_sim::NoiseKind::kPink : sorvel_sim::NoiseKind::kWhite;
  o.config.room.source =
      o.source == "phone" ? sorvel_sim::Directivity::kPhone : sorvel_sim::Directivity::kOmni;
  o.config.room.phone_speaker = !o.no_phone_speaker;
  o.config.room.phone_microphone = !o.no_phone_mic;
  if (!o.room.empty()) {
    if (std::string e = ParseRooms(o.room, &o.rooms); !e.empty()) return e;
  }
  if (std::string e = sorvel_sim::CheckChannel(o.config); !e.empty()) return e;
  if (o.mix_file.empty()) return "";
  WavData mix;
  if (std::string e = ReadWav(o.mix_file, &mix); !e.empty()) return e;
  if (mix.samples.empty()) return o.mix_file + " holds no audio";
  std::vector<float> mono(mix.samples.size() / mix.channels);
  for (size_t i = 0; i < mono.size(); ++i) {
    for (int c = 0; c < mix.channels; ++c) mono[i] += mix.samples[i * mix.channels + c] / mix.channels;
  }
  o.config.interference =
      sorvel_sim::ResampleHighQuality(mono, mix.sample_rate, o.config.output_rate);
  return "";
}

}  // namespace sorvel_cli
