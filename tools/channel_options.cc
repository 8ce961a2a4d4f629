#include "tools/channel_options.h"

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
  command->add_option("--mix", o->mix_file, "Interfering recording (e.g. speech) to mix in")
      ->group(group);
  command->add_option("--mix-gain", c.interference_gain_db,
                      "Gain of the interfering recording, dB (0: its own level)")
      ->capture_default_str()->group(group);
}

std::string ResolveChannelOptions(ChannelOptions& o) {
  o.config.noise = o.noise == "pink" ? sorvel_sim::NoiseKind::kPink : sorvel_sim::NoiseKind::kWhite;
  if (!(o.config.output_rate > 0)) return "--rate must be positive";
  if (o.config.rt60 < 0 || o.config.band_limit < 0 || o.config.clip < 0) {
    return "--rt60, --band-limit and --clip must not be negative";
  }
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
