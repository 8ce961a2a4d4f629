// Link quality of the default DSSS configuration: token success rate per
// full-band SNR over noise seeds, from 3 s of looped broadcast with GetToken
// every 250 ms; success means the first candidate equals the sent token
// within those 3 s. Prints a table and the lowest SNR with >= 95 % success.
//
//   sorvel_link_quality [--seeds N] [--speed M_PER_S] [--rate HZ]
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <random>
#include <string>
#include <vector>

#include "audio/modem_config.h"
#include "audio/sorvane/crc16_coder.h"
#include "audio/sorvane/sorvane_decoder.h"
#include "sim/channel_simulator.h"

namespace {

using audio_sorvane::DecodeResults;

struct Trial {
  bool success = false;
  double seconds = 0.0;  // time of the first correct token
};

Trial RunTrial(double snr_db, double speed, double rate, uint64_t seed) {
  std::mt19937_64 rng(seed);
  std::vector<uint8_t> message(6);
  for (uint8_t& b : message) b = static_cast<uint8_t>(rng());
  const auto encoder = audio_sorvane::MakeDsssEncoder({});
  std::vector<float> token_audio;
  encoder->Encode(message, &token_audio, 2);
  std::vector<uint8_t> token = message;
  audio_sorvane::Crc16Coder({.num_message_bytes = 6}).Encode(&token);

  sorvel_sim::ChannelConfig channel;
  channel.snr_db = snr_db;
  channel.speed = speed;
  channel.output_rate = rate;
  channel.seed = seed;
  // The phone starts playing at a random point of the token loop.
  std::vector<float> broadcast = sorvel_sim::RenderLoopedBroadcast(*encoder, token_audio, 4.0);
  const size_t offset = std::uniform_int_distribution<size_t>(0, token_audio.size())(rng);
  broadcast.erase(broadcast.begin(), broadcast.begin() + offset);
  std::vector<float> received = sorvel_sim::ApplyChannel(broadcast, channel);
  received.resize(static_cast<size_t>(3.0 * rate));

  audio_sorvane::SorvaneDecoder decoder(
      std::make_shared<const audio_sorvane::SymbolWaveCoder>(
          audio_sorvane::MakeSymbolWaveCoderParams({})),
      {});
  decoder.Initialize(1, static_cast<float>(rate));
  const size_t block = static_cast<size_t>(rate / 100);
  DecodeResults results;
  for (size_t start = 0, n = 0; start < received.size(); start += block, ++n) {
    decoder.ProcessSamples(std::span<const float>(received).subspan(
        start, std::min(block, received.size() - start)));
    if (n % 25 == 24 && decoder.GetToken(&results) && results.tokens[0].bytes == token) {
      return {true, (start + block) / rate};
    }
  }
  return {};
}

}  // namespace

int main(int argc, char** argv) {
  int seeds = 20;
  double speed = 0.0;
  double rate = 44100.0;
  for (int i = 1; i + 1 < argc; i += 2) {
    if (!std::strcmp(argv[i], "--seeds")) seeds = std::atoi(argv[i + 1]);
    if (!std::strcmp(argv[i], "--speed")) speed = std::atof(argv[i + 1]);
    if (!std::strcmp(argv[i], "--rate")) rate = std::atof(argv[i + 1]);
  }
  std::printf("DSSS defaults, %d seeds, speed %.2f m/s, receiver %.0f Hz\n", seeds, speed, rate);
  std::printf("%8s %9s %14s\n", "SNR dB", "success", "mean first s");
  double lowest = NAN;
  bool all_good = true;
  for (int snr = 10; snr >= -20; snr -= 2) {
    int successes = 0;
    double seconds = 0.0;
    for (int seed = 0; seed < seeds; ++seed) {
      const Trial t = RunTrial(snr, speed, rate, 1000 * (snr + 100) + seed);
      successes += t.success;
      seconds += t.seconds;
    }
    const double rate_ok = static_cast<double>(successes) / seeds;
    std::printf("%8d %8.0f%% %14.2f\n", snr, 100 * rate_ok,
                successes ? seconds / successes : NAN);
    if (rate_ok >= 0.95 && all_good) lowest = snr;
    if (rate_ok < 0.95) all_good = false;
  }
  std::printf("lowest SNR with >= 95%% success: %.0f dB\n", lowest);
  return 0;
}
