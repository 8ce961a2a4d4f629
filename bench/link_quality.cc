// Link quality of one configuration: token success rate per full-band SNR
// over noise seeds, from 3 s of looped broadcast with tokens requested every
// 250 ms; success means the first token (CRC checked) equals the sent
// message within those 3 s. Prints a table and the lowest SNR with >= 95 %
// success.
//
//   sorvel_link_quality [--scheme dsss|hotsound|dtmf] [--seeds N]
//                       [--speed M_PER_S] [--rate HZ] [--noise white|pink]
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <random>
#include <string>
#include <vector>

#include "audio/modem_config.h"
#include "sim/channel_simulator.h"

namespace {

struct Options {
  std::string scheme = "dsss";
  int seeds = 20;
  double speed = 0.0;
  double rate = 44100.0;
  sorvel_sim::NoiseKind noise = sorvel_sim::NoiseKind::kWhite;
};

struct Trial {
  bool success = false;
  double seconds = 0.0;  // time of the first correct token
};

Trial RunTrial(const Options& o, double snr_db, uint64_t seed) {
  std::mt19937_64 rng(seed);
  const bool dtmf = o.scheme == "dtmf";
  std::vector<uint8_t> message(dtmf ? 3 : 6);
  for (uint8_t& b : message) b = static_cast<uint8_t>(rng());
  const auto encoder =
      dtmf ? audio_sorvane::MakeDtmfEncoder({}) : audio_sorvane::MakeDsssEncoder({});
  std::vector<float> token_audio;
  encoder->Encode(message, &token_audio, 2);

  // The phone starts playing at a random point of the token loop.
  std::vector<float> broadcast = sorvel_sim::RenderLoopedBroadcast(*encoder, token_audio, 4.0);
  const size_t offset = std::uniform_int_distribution<size_t>(0, token_audio.size())(rng);
  broadcast.erase(broadcast.begin(), broadcast.begin() + offset);
  std::vector<float> received = sorvel_sim::ApplyChannel(
      broadcast, {.output_rate = o.rate, .speed = o.speed, .snr_db = snr_db, .noise = o.noise,
                  .seed = seed});
  received.resize(static_cast<size_t>(3.0 * o.rate));
  for (float& v : received) v = std::clamp(std::round(v), -32768.0f, 32767.0f);

  std::unique_ptr<audio_sorvane::AudioModemDecoder> decoder;
  if (dtmf) {
    audio_sorvane::DtmfDecoderConfig config;
    config.input_sample_rate = static_cast<float>(o.rate);
    decoder = audio_sorvane::MakeDtmfDecoder(config);
  } else {
    audio_sorvane::DsssDecoderConfig config;
    config.input_sample_rate = static_cast<float>(o.rate);
    config.with_hotsound = o.scheme == "hotsound";
    decoder = audio_sorvane::MakeDsssDecoder(config);
  }
  const size_t block = static_cast<size_t>(o.rate / 100);
  audio_sorvane::AudioModemDecoder::DecodeResults results;
  const int message_bytes = static_cast<int>(message.size());
  for (size_t start = 0, n = 0; start < received.size(); start += block, ++n) {
    decoder->ProcessSamples(std::span<const float>(received).subspan(
        start, std::min(block, received.size() - start)));
    if (n % 25 == 24 && decoder->DecodeTokens(&results, message_bytes, 2)) {
      if (results.tokens[0].bytes == message) return {true, (start + block) / o.rate};
      return {};  // a wrong first token is a failure
    }
  }
  return {};
}

}  // namespace

int main(int argc, char** argv) {
  Options o;
  for (int i = 1; i + 1 < argc; i += 2) {
    if (!std::strcmp(argv[i], "--scheme")) o.scheme = argv[i + 1];
    if (!std::strcmp(argv[i], "--seeds")) o.seeds = std::atoi(argv[i + 1]);
    if (!std::strcmp(argv[i], "--speed")) o.speed = std::atof(argv[i + 1]);
    if (!std::strcmp(argv[i], "--rate")) o.rate = std::atof(argv[i + 1]);
    if (!std::strcmp(argv[i], "--noise") && !std::strcmp(argv[i + 1], "pink")) {
      o.noise = sorvel_sim::NoiseKind::kPink;
    }
  }
  std::printf("%s defaults, %d seeds, %s noise, speed %.2f m/s, receiver %.0f Hz\n",
              o.scheme.c_str(), o.seeds, o.noise == sorvel_sim::NoiseKind::kPink ? "pink" : "white",
              o.speed, o.rate);
  std::printf("%8s %9s %14s\n", "SNR dB", "success", "mean first s");
  double lowest = NAN;
  bool all_good = true;
  for (int snr = 10; snr >= -20; snr -= 2) {
    int successes = 0;
    double seconds = 0.0;
    for (int seed = 0; seed < o.seeds; ++seed) {
      const Trial t = RunTrial(o, snr, 1000 * (snr + 100) + seed);
      successes += t.success;
      seconds += t.seconds;
    }
    const double rate_ok = static_cast<double>(successes) / o.seeds;
    std::printf("%8d %8.0f%% %14.2f\n", snr, 100 * rate_ok, successes ? seconds / successes : NAN);
    if (rate_ok >= 0.95 && all_good) lowest = snr;
    if (rate_ok < 0.95) all_good = false;
  }
  std::printf("lowest SNR with >= 95%% success: %.0f dB\n", lowest);
  return 0;
}
