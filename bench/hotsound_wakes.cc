// False wakes of the hotsound detector: streams long stretches of sound
// that is not a broadcast (noise, speech, music, clicks, silence, through a
// phone microphone's band limit) in 10 ms blocks through the detector and
// counts wakes (scores crossing the threshold) per hour. With --duty it
// instead plays an hour of a room with speech and a broadcast every three
// minutes through the whole hotsound receiver and reports the fraction of
// audio during which the DSSS decoder ran.
//
//   sorvel_hotsound_wakes [--minutes M] [--only NAME]   (default 60 each)
//   sorvel_hotsound_wakes --duty [--minutes M]
//   sorvel_hotsound_wakes --latency SEEDS
#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include "audio/hotsound_decoder.h"
#include "audio/modem_config.h"
#include "sim/channel_simulator.h"
#include "sim/interferers.h"

namespace {

using sorvel_sim::NoiseKind;
constexpr double kRate = 44100.0;
constexpr size_t kChunk = 60 * 44100;  // generated a minute at a time

double DbfsToRms(double dbfs) { return 32768.0 * std::pow(10.0, dbfs / 20.0); }

std::vector<int16_t> ToPcm(const std::vector<float>& x) {
  std::vector<int16_t> pcm(x.size());
  for (size_t i = 0; i < x.size(); ++i) {
    pcm[i] = static_cast<int16_t>(std::clamp(std::round(x[i]), -32768.0f, 32767.0f));
  }
  return pcm;
}

std::vector<float> BandLimit(const std::vector<float>& x) {
  float peak = 0.0f;
  for (float v : x) peak = std::max(peak, std::fabs(v));
  return sorvel_sim::ApplyChannel(x, {.level = peak, .band_limit = 16000.0});
}

// `recording` looped from random points at random gains (+-6 dB) over faint
// white noise, a minute (chunk `index`).
std::vector<float> Looped(const std::vector<float>& recording, uint64_t index) {
  std::mt19937_64 rng(index);
  std::vector<float> out = sorvel_sim::MakeNoise(NoiseKind::kWhite, kChunk, 3.0, index);
  size_t at = 0;
  while (at < out.size()) {
    const size_t from = std::uniform_int_distribution<size_t>(0, recording.size() - 1)(rng);
    const float gain = static_cast<float>(std::pow(10.0, std::uniform_real_distribution<>(-0.3, 0.3)(rng)));
    for (size_t i = from; i < recording.size() && at < out.size(); ++i) out[at++] += gain * recording[i];
  }
  return out;
}

struct Interferer {
  std::string name;
  std::function<std::vector<float>(uint64_t)> minute;  // chunk by index
};

std::vector<Interferer> Interferers() {
  std::vector<Interferer> list;
  list.push_back({"digital-silence", [](uint64_t) { return std::vector<float>(kChunk, 0.0f); }});
  for (double dbfs : {-60.0, -30.0, -10.0}) {
    for (NoiseKind kind : {NoiseKind::kWhite, NoiseKind::kPink}) {
      const std::string name = std::string(kind == NoiseKind::kWhite ? "white" : "pink") + "-noise" +
                               std::to_string(static_cast<int>(dbfs)) + "dBFS";
      list.push_back({name, [=](uint64_t i) {
                        return sorvel_sim::MakeNoise(kind, kChunk, DbfsToRms(dbfs), 1000 + i);
                      }});
    }
  }
  for (NoiseKind kind : {NoiseKind::kWhite, NoiseKind::kPink}) {
    list.push_back({std::string(kind == NoiseKind::kWhite ? "white" : "pink") +
                        "-noise-30dBFS-mic16kHz",
                    [=](uint64_t i) {
                      return BandLimit(sorvel_sim::MakeNoise(kind, kChunk, DbfsToRms(-30), 2000 + i));
                    }});
  }
  list.push_back({"clicks", [](uint64_t i) { return sorvel_sim::MakeClicks(kChunk, 30000.0, 3000 + i); }});
  auto speech = std::make_shared<std::vector<float>>(sorvel_sim::RenderSpeech(16000.0));
  auto music = std::make_shared<std::vector<float>>(sorvel_sim::RenderMusic(16000.0));
  if (speech->empty()) std::fprintf(stderr, "espeak-ng missing: no speech\n");
  if (music->empty()) std::fprintf(stderr, "xmp or fb-music-high missing: no music\n");
  for (double db : {6.0, -20.0}) {
    const float g = static_cast<float>(std::pow(10.0, db / 20.0));
    const std::string level = db > 0 ? "-loud" : "-quiet";
    if (!speech->empty()) {
      list.push_back({"speech" + level, [=](uint64_t i) {
                        auto x = Looped(*speech, 4000 + i);
                        for (float& v : x) v *= g;
                        return x;
                      }});
    }
    if (!music->empty()) {
      list.push_back({"music" + level, [=](uint64_t i) {
                        auto x = Looped(*music, 5000 + i);
                        for (float& v : x) v *= g;
                        return x;
                      }});
    }
  }
  if (!speech->empty()) {
    list.push_back({"speech-mic16kHz", [=](uint64_t i) { return BandLimit(Looped(*speech, 6000 + i)); }});
  }
  if (!music->empty()) {
    list.push_back({"music-mic16kHz", [=](uint64_t i) { return BandLimit(Looped(*music, 7000 + i)); }});
  }
  return list;
}

int Wakes(double minutes, const std::string& only) {
  std::printf("%-30s %8s %6s %10s %10s\n", "interferer", "hours", "wakes", "wakes/h", "max score");
  for (const Interferer& interferer : Interferers()) {
    if (!only.empty() && interferer.name.find(only) == std::string::npos) continue;
    auto detector = audio_sorvane::MakeHotsoundDetector(44100, 1);
    int wakes = 0;
    bool above = false;
    float max_score = 0.0f;
    const int chunks = static_cast<int>(std::ceil(minutes));
    for (int c = 0; c < chunks; ++c) {
      std::vector<int16_t> pcm = ToPcm(interferer.minute(c));
      for (size_t start = 0; start < pcm.size(); start += 441) {
        const float score = detector->Process(std::span<int16_t>(pcm).subspan(start, std::min<size_t>(441, pcm.size() - start)));
        max_score = std::max(max_score, score);
        const bool detected = detector->Detected(score);
        wakes += detected && !above;
        above = detected;
      }
    }
    const double hours = chunks / 60.0;
    std::printf("%-30s %8.2f %6d %10.2f %10.2f\n", interferer.name.c_str(), hours, wakes,
                wakes / hours, max_score);
    std::fflush(stdout);
  }
  return 0;
}

// An hour in a 6 x 5 x 2.7 m room: speech (loud, with pauses) and faint
// noise all along, and every three minutes a 4 s broadcast from 2 m.
int Duty(double minutes) {
  const std::vector<float> speech = sorvel_sim::RenderSpeech(12000.0);
  if (speech.empty()) {
    std::fprintf(stderr, "espeak-ng missing\n");
    return 1;
  }
  audio_sorvane::DsssDecoderConfig config;
  config.with_hotsound = true;
  auto coder = std::make_shared<const audio_sorvane::SymbolWaveCoder>(
      audio_sorvane::MakeSymbolWaveCoderParams({}));
  int64_t fed = 0, awake = 0;
  const auto clock = [&] {
    return std::chrono::steady_clock::time_point() +
           std::chrono::microseconds(fed * 1000000 / static_cast<int64_t>(kRate));
  };
  audio_sorvane::HotsoundDecoder decoder(
      std::make_unique<audio_sorvane::SorvaneDecoder>(coder, audio_sorvane::SorvaneDecoderParams()),
      audio_sorvane::MakeHotsoundDetector(44100, 1), clock);
  decoder.Initialize(1, 44100.0f);
  const auto encoder = audio_sorvane::MakeDsssEncoder({});
  sorvel_sim::ChannelConfig channel;
  channel.room = {.width = 6.0, .depth = 5.0, .height = 2.7, .rt60 = 0.6, .distance = 2.0};
  int broadcasts = 0, decoded = 0, wakes = 0;
  bool was_awake = false;
  std::mt19937_64 rng(11);
  const int chunks = static_cast<int>(std::ceil(minutes));
  audio_sorvane::DecodeResults results;
  for (int c = 0; c < chunks; ++c) {
    std::vector<float> audio = Looped(speech, 8000 + c);
    bool got = true;
    if (c % 3 == 1) {  // a broadcast 30 s into every third minute
      std::vector<uint8_t> message(6);
      for (uint8_t& b : message) b = static_cast<uint8_t>(rng());
      std::vector<float> token;
      encoder->Encode(message, &token, 2);
      channel.seed = 100 + c;
      const std::vector<float> received = sorvel_sim::ApplyChannel(
          sorvel_sim::RenderLoopedBroadcast(*encoder, token, 4.0), channel);
      for (size_t i = 0; i < received.size() && 30 * 44100 + i < audio.size(); ++i) {
        audio[30 * 44100 + i] += received[i];
      }
      ++broadcasts;
      got = false;
    }
    const std::vector<int16_t> pcm = ToPcm(audio);
    for (size_t start = 0, n = 0; start < pcm.size(); start += 441, ++n) {
      const int count = static_cast<int>(std::min<size_t>(441, pcm.size() - start));
      decoder.ProcessSamples(pcm.data() + start, count);
      fed += count;
      if (decoder.triggered()) awake += count;
      wakes += decoder.triggered() && !was_awake;
      was_awake = decoder.triggered();
      if (n % 25 == 24 && decoder.DecodeTokens(&results)) got = true;
    }
    decoded += got;
  }
  std::printf("audio %.1f min, broadcasts %d, decoded %d, wakes %d, DSSS duty cycle %.2f %%\n",
              fed / kRate / 60.0, broadcasts, decoded - (chunks - broadcasts), wakes,
              100.0 * awake / fed);
  return 0;
}

// Wake times over `seeds` broadcasts (random messages looped from random
// points, each after a second of the channel's noise and a random part of
// the detector's hop, so that windows fall anywhere) through `channel`
// (its seed varied per broadcast): the share woken within 0.5 s of the
// broadcast's start, the median latency and the median peak score in that
// half second, and how many of the broadcasts that a plain DSSS decoder fed
// the same audio decodes were also woken in time.
struct WakeStats {
  int woken_percent;
  double median_latency, median_peak;
  int dsss_decoded, woken_of_decoded;
};

WakeStats MeasureWakes(audio_sorvane::AudioModemEncoder& encoder, sorvel_sim::ChannelConfig channel,
                       int seeds) {
  std::vector<double> latency, peak;
  int woken = 0, dsss_decoded = 0, woken_of_decoded = 0;
  for (int s = 0; s < seeds; ++s) {
    std::mt19937_64 rng(77 + s);
    std::vector<uint8_t> message(6);
    for (uint8_t& b : message) b = static_cast<uint8_t>(rng());
    std::vector<float> token;
    encoder.Encode(message, &token, 2);
    std::vector<float> loop = sorvel_sim::RenderLoopedBroadcast(encoder, token, 3.0);
    loop.erase(loop.begin(), loop.begin() + std::uniform_int_distribution<size_t>(0, token.size())(rng));
    loop.resize(static_cast<size_t>(2.5 * kRate));  // room for a whole token after any start
    const size_t begin = static_cast<size_t>(kRate) +
                         std::uniform_int_distribution<size_t>(0, 3 * 1905 - 1)(rng);
    channel.leading_silence = static_cast<double>(begin) / kRate;
    channel.seed = 500ULL + s;
    std::vector<int16_t> pcm = ToPcm(sorvel_sim::ApplyChannel(loop, channel));
    auto detector = audio_sorvane::MakeHotsoundDetector(44100, 1);
    double t = INFINITY;
    float best = 0.0f;
    for (size_t start = 0; start < pcm.size(); start += 441) {
      const size_t n = std::min<size_t>(441, pcm.size() - start);
      const float score = detector->Process(std::span<int16_t>(pcm).subspan(start, n));
      if (start + n > begin && start + n <= begin + kRate / 2) best = std::max(best, score);
      if (detector->Detected(score) && !std::isfinite(t)) t = (start + n - double(begin)) / kRate;
    }
    woken += t <= 0.5;
    const auto dsss = audio_sorvane::MakeDsssDecoder({});
    audio_sorvane::AudioModemDecoder::DecodeResults results;
    bool decoded = false;
    for (size_t start = 0; start < pcm.size(); start += 441) {
      dsss->ProcessPcm16(pcm.data() + start, static_cast<int>(std::min<size_t>(441, pcm.size() - start)));
      decoded = dsss->DecodeTokens(&results, 6, 2) || decoded;
    }
    dsss_decoded += decoded;
    woken_of_decoded += decoded && t <= 0.5;
    latency.push_back(t);
    peak.push_back(best);
  }
  std::sort(latency.begin(), latency.end());
  std::sort(peak.begin(), peak.end());
  return {100 * woken / seeds, latency[seeds / 2], peak[seeds / 2], dsss_decoded, woken_of_decoded};
}

// Wake times for white and pink noise at several full-band SNRs, senders at
// rest and at +-1 m/s, then in three rooms at several distances (+10 dB).
int Latency(int seeds) {
  const auto encoder = audio_sorvane::MakeDsssEncoder({});
  std::printf("%-22s %6s %7s %10s %12s %12s %14s\n", "channel", "speed", "SNR dB", "woken<0.5s",
              "median s", "median score", "woken/DSSS");
  const auto print = [](const char* name, double speed, double snr, const WakeStats& w) {
    std::printf("%-22s %6.1f %7.1f %9d%% %12.3f %12.1f %8d/%d\n", name, speed, snr, w.woken_percent,
                w.median_latency, w.median_peak, w.woken_of_decoded, w.dsss_decoded);
    std::fflush(stdout);
  };
  for (NoiseKind kind : {NoiseKind::kWhite, NoiseKind::kPink}) {
    for (double speed : {0.0, -1.0, 1.0}) {
      if (kind == NoiseKind::kPink && speed != 0.0) continue;
      for (double snr : {-10.0, -14.0, -16.0, -18.0, -20.0}) {
        const sorvel_sim::ChannelConfig channel{.speed = speed, .level = 8000, .snr_db = snr, .noise = kind};
        print(kind == NoiseKind::kWhite ? "white" : "pink", speed, snr, MeasureWakes(*encoder, channel, seeds));
      }
    }
  }
  struct Room {
    const char* name;
    double width, depth, height, rt60;
  };
  for (const Room& room : {Room{"office", 4.0, 3.0, 2.5, 0.4}, Room{"living room", 6.0, 5.0, 2.7, 0.6},
                           Room{"hall", 10.0, 8.0, 3.5, 1.0}}) {
    for (double distance : {1.0, 2.0, 3.0, 5.0}) {
      sorvel_sim::ChannelConfig channel{.level = 8000, .snr_db = 10.0};
      channel.room = {.width = room.width, .depth = room.depth, .height = room.height, .rt60 = room.rt60,
                      .distance = distance};
      char name[64];
      std::snprintf(name, sizeof(name), "%s %.0f m", room.name, distance);
      print(name, 0.0, 10.0, MeasureWakes(*encoder, channel, seeds));
    }
  }
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  double minutes = 60.0;
  bool duty = false;
  std::string only;
  for (int i = 1; i < argc; ++i) {
    if (!std::strcmp(argv[i], "--minutes") && i + 1 < argc) {
      minutes = std::atof(argv[++i]);
    } else if (!std::strcmp(argv[i], "--only") && i + 1 < argc) {
      only = argv[++i];
    } else if (!std::strcmp(argv[i], "--duty")) {
      duty = true;
    } else if (!std::strcmp(argv[i], "--latency") && i + 1 < argc) {
      return Latency(std::atoi(argv[++i]));
    } else {
      std::fprintf(stderr, "usage: %s [--minutes M] [--only NAME] [--duty]\n", argv[0]);
      return 2;
    }
  }
  if (!(minutes > 0.0)) return 2;
  return duty ? Duty(minutes) : Wakes(minutes, only);
}
