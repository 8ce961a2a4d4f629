// Soak: hours of noise with a broadcast every few minutes, streamed in 10 ms
// blocks through each decoder kind with tokens requested every 250 ms.
// Every broadcast must be decoded and the decoders' buffers must stay within
// their budgets; reports the peak RSS.
//
//   sorvel_soak [--minutes M] [--every SECONDS]     (defaults: 120, 180)
#include <sys/resource.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <random>
#include <set>
#include <vector>

#include "audio/hotsound_decoder.h"
#include "audio/modem_config.h"
#include "audio/sorvane/crc16_coder.h"
#include "audio/sorvane/dtmf/dtmf_decoder.h"
#include "sim/channel_simulator.h"

namespace {

using audio_sorvane::DecodeResults;

struct Result {
  int broadcasts = 0;
  int decoded = 0;
  bool within_budget = true;
};

// Feeds `minutes` of white noise (RMS 1000) with a 4 s broadcast of a fresh
// message every `every` seconds. `decode` returns the first candidate's
// bytes (empty if none); `buffer_ok` checks the held buffers.
template <typename Feed, typename Decode, typename BufferOk>
Result Soak(bool dtmf, double minutes, double every, Feed feed, Decode decode, BufferOk buffer_ok) {
  const double rate = 44100.0;
  const auto encoder = dtmf ? audio_sorvane::MakeDtmfEncoder({}) : audio_sorvane::MakeDsssEncoder({});
  std::mt19937_64 rng(17);
  std::normal_distribution<float> noise(0.0f, 1000.0f);
  const size_t total = static_cast<size_t>(minutes * 60 * rate);
  const size_t period = static_cast<size_t>(every * rate);
  std::vector<float> broadcast, block(441);
  std::vector<uint8_t> token;
  std::set<std::vector<uint8_t>> expected, found;
  Result result;
  for (size_t start = 0, n = 0; start + 441 <= total; start += 441, ++n) {
    const size_t phase = start % period;
    if (phase < 441) {  // a new broadcast begins 1 s into each period
      std::vector<uint8_t> message(dtmf ? 3 : 6);
      for (uint8_t& b : message) b = static_cast<uint8_t>(rng());
      std::vector<float> audio;
      encoder->Encode(message, &audio, 2);
      token = message;
      audio_sorvane::Crc16Coder({.num_message_bytes = static_cast<int>(message.size())}).Encode(&token);
      const std::vector<float> loop = sorvel_sim::RenderLoopedBroadcast(*encoder, audio, 4.0);
      broadcast.assign(static_cast<size_t>(rate), 0.0f);
      for (float v : loop) broadcast.push_back(v * 16384.0f / 0.5f * (dtmf ? 0.5f : 1.0f));
      expected.insert(token);
      ++result.broadcasts;
    }
    for (size_t i = 0; i < 441; ++i) {
      const size_t t = phase + i;
      block[i] = noise(rng) + (t < broadcast.size() ? broadcast[t] : 0.0f);
    }
    feed(block);
    if (n % 25 == 24) {
      const std::vector<uint8_t> bytes = decode();
      if (!bytes.empty() && expected.count(bytes)) found.insert(bytes);
      result.within_budget = result.within_budget && buffer_ok();
    }
  }
  result.decoded = static_cast<int>(found.size());
  return result;
}

long PeakRssKb() {
  rusage usage;
  getrusage(RUSAGE_SELF, &usage);
  return usage.ru_maxrss;
}

}  // namespace

int main(int argc, char** argv) {
  double minutes = 120.0, every = 180.0;
  for (int i = 1; i + 1 < argc; i += 2) {
    if (!std::strcmp(argv[i], "--minutes")) minutes = std::atof(argv[i + 1]);
    if (!std::strcmp(argv[i], "--every")) every = std::atof(argv[i + 1]);
  }
  bool ok = true;
  const auto report = [&](const char* name, const Result& r) {
    std::printf("%-9s %d/%d broadcasts decoded, buffers %s, peak RSS so far %ld kB\n", name,
                r.decoded, r.broadcasts, r.within_budget ? "within budget" : "OVER BUDGET",
                PeakRssKb());
    std::fflush(stdout);
    ok = ok && r.decoded == r.broadcasts && r.within_budget;
  };
  std::printf("soak: %.0f minutes of noise, a broadcast every %.0f s, 10 ms blocks\n", minutes,
              every);
  const auto coder = std::make_shared<const audio_sorvane::SymbolWaveCoder>(
      audio_sorvane::MakeSymbolWaveCoderParams({}));
  {
    audio_sorvane::SorvaneDecoder dsss(coder, {});
    dsss.Initialize(1, 44100.0f);
    DecodeResults results;
    report("dsss", Soak(
        false, minutes, every, [&](const std::vector<float>& b) { dsss.ProcessSamples(b); },
        [&] { return dsss.GetToken(&results) ? results.tokens[0].bytes : std::vector<uint8_t>(); },
        [&] {
          return dsss.baseband_buffer_size() <= dsss.max_buffer_size() / 3 + 2 * 635 &&
                 dsss.symbol_score_cache_size() <= 400;
        }));
  }
  {
    audio_sorvane::HotsoundDecoder hotsound(
        std::make_unique<audio_sorvane::SorvaneDecoder>(coder, audio_sorvane::SorvaneDecoderParams()),
        audio_sorvane::MakeHotsoundDetector(44100, 1));
    hotsound.Initialize(1, 44100.0f);
    DecodeResults results;
    std::vector<int16_t> pcm;
    report("hotsound", Soak(
        false, minutes, every,
        [&](const std::vector<float>& b) {
          pcm.assign(b.size(), 0);
          for (size_t i = 0; i < b.size(); ++i) {
            pcm[i] = static_cast<int16_t>(std::clamp(b[i], -32768.0f, 32767.0f));
          }
          hotsound.ProcessSamples(pcm.data(), static_cast<int>(pcm.size()));
        },
        [&] {
          return hotsound.DecodeTokens(&results) ? results.tokens[0].bytes : std::vector<uint8_t>();
        },
        [&] {
          return hotsound.pre_trigger_count() <= audio_sorvane::HotsoundDecoder::kPreTriggerCapacity &&
                 hotsound.dsss_decoder().baseband_buffer_size() <=
                     hotsound.dsss_decoder().max_buffer_size() / 3 + 2 * 635;
        }));
  }
  {
    audio_sorvane::DtmfDecoder dtmf{audio_sorvane::DtmfDecoderParams()};
    dtmf.Init(1, 44100.0f);
    DecodeResults results;
    report("dtmf", Soak(
        true, minutes, every, [&](const std::vector<float>& b) { dtmf.ProcessSamples(b); },
        [&] { return dtmf.GetToken(&results) ? results.tokens[0].bytes : std::vector<uint8_t>(); },
        [&] { return dtmf.tone_strength_buffer_size() <= 3 * 44100 / 16 + 138; }));
  }
  std::printf("%s\n", ok ? "soak passed" : "soak FAILED");
  return ok ? 0 : 1;
}
