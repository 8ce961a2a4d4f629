// Receive side: real-time factor of the DSSS decoder (10 ms blocks of
// 44.1 kHz mono, GetToken every 250 ms; items are input samples, so
// items_per_second / 44100 is the real-time factor) and the heap one
// decoder holds after 60 s of streaming.
#include <malloc.h>

#include <algorithm>
#include <cstdint>
#include <memory>
#include <vector>

#include "audio/hotsound_detector.h"
#include "audio/modem_config.h"
#include "audio/sorvane/sorvane_decoder.h"
#include "audio/sorvane/acquisition_scorer.h"
#include "audio/sorvane/sorvane_util.h"
#include "benchmark/benchmark.h"
#include "sim/channel_simulator.h"

namespace {

using audio_sorvane::SorvaneDecoder;

std::vector<float> ReceivedBroadcast(double seconds, double snr_db) {
  const auto encoder = audio_sorvane::MakeDsssEncoder({});
  std::vector<float> token;
  encoder->Encode({0x53, 0x6f, 0x72, 0x76, 0x65, 0x6c}, &token, 2);
  sorvel_sim::ChannelConfig channel;
  channel.snr_db = snr_db;
  return sorvel_sim::ApplyChannel(sorvel_sim::RenderLoopedBroadcast(*encoder, token, seconds),
                                  channel);
}

std::unique_ptr<SorvaneDecoder> MakeDecoder() {
  auto decoder = std::make_unique<SorvaneDecoder>(
      std::make_shared<const audio_sorvane::SymbolWaveCoder>(
          audio_sorvane::MakeSymbolWaveCoderParams({})),
      audio_sorvane::SorvaneDecoderParams());
  decoder->Initialize(1, 44100.0f);
  return decoder;
}

// Feeds `signal` in 10 ms blocks with GetToken every 25 blocks.
void Stream(SorvaneDecoder& decoder, const std::vector<float>& signal) {
  audio_sorvane::DecodeResults results;
  for (size_t start = 0, n = 0; start + 441 <= signal.size(); start += 441, ++n) {
    decoder.ProcessSamples(std::span<const float>(signal).subspan(start, 441));
    if (n % 25 == 24) benchmark::DoNotOptimize(decoder.GetToken(&results));
  }
}

void BM_DsssDecoderRealTime(benchmark::State& state) {
  const std::vector<float> signal = ReceivedBroadcast(10.0, -10.0);
  auto decoder = MakeDecoder();
  for (auto _ : state) Stream(*decoder, signal);
  state.SetItemsProcessed(state.iterations() * static_cast<int64_t>(signal.size()));
  state.counters["x_real_time"] = benchmark::Counter(
      static_cast<double>(signal.size()) / 44100.0, benchmark::Counter::kIsIterationInvariantRate);
}
BENCHMARK(BM_DsssDecoderRealTime)->Unit(benchmark::kMillisecond);

// The acquisition scorer alone at the default geometry, on 10 s of random
// baseband in 147-sample blocks (10 ms); arg 1 forces the reference path.
void BM_AcquisitionScorer(benchmark::State& state) {
  const audio_sorvane::SymbolWaveCoder coder(audio_sorvane::MakeSymbolWaveCoderParams({}));
  const audio_sorvane::SorvaneDecoderParams params;
  std::vector<float> grid;
  audio_sorvane::FrequencyGrid(
      params.acquisition_frequency_step,
      static_cast<float>(params.max_speed * coder.carrier_cycles_per_frame() / 343.0), &grid);
  audio_sorvane::AcquisitionScorer scorer(
      coder.baseband_code(), grid, params.num_chunks, 2573,
      static_cast<float>(params.noise_smoothing_width),
      state.range(0) ? audio_sorvane::AcquisitionPath::kReference
                     : audio_sorvane::AcquisitionPath::kFast);
  const std::vector<float> real = sorvel_sim::MakeNoise(sorvel_sim::NoiseKind::kWhite, 147000, 1.0, 1);
  const std::vector<float> imaginary = sorvel_sim::MakeNoise(sorvel_sim::NoiseKind::kWhite, 147000, 1.0, 2);
  std::vector<float> scores;
  for (auto _ : state) {
    for (size_t start = 0; start + 147 <= real.size(); start += 147) {
      scorer.ScoreSamples(std::span(real).subspan(start, 147),
                          std::span(imaginary).subspan(start, 147), &scores);
    }
    benchmark::DoNotOptimize(scores.data());
  }
  state.counters["x_real_time"] = benchmark::Counter(10.0, benchmark::Counter::kIsIterationInvariantRate);
}
BENCHMARK(BM_AcquisitionScorer)->Arg(0)->Arg(1)->Unit(benchmark::kMillisecond);

// The hotsound wake-up detector alone on `signal` as 16-bit samples in
// 10 ms blocks (items: input samples). Its budget is 3 % of
// BM_DsssDecoderRealTime's time per audio second, i.e. a real-time factor
// above ~33 times the decoder's.
void RunDetector(benchmark::State& state, const std::vector<float>& signal) {
  std::vector<int16_t> pcm(signal.size());
  for (size_t i = 0; i < signal.size(); ++i) {
    pcm[i] = static_cast<int16_t>(std::clamp(signal[i], -32768.0f, 32767.0f));
  }
  auto detector = audio_sorvane::MakeHotsoundDetector(44100, 1);
  for (auto _ : state) {
    for (size_t start = 0; start + 441 <= pcm.size(); start += 441) {
      benchmark::DoNotOptimize(detector->Process(std::span<const int16_t>(pcm).subspan(start, 441)));
    }
  }
  state.SetItemsProcessed(state.iterations() * static_cast<int64_t>(signal.size()));
  state.counters["x_real_time"] = benchmark::Counter(
      static_cast<double>(signal.size()) / 44100.0, benchmark::Counter::kIsIterationInvariantRate);
}

// On the same broadcast as the decoders.
void BM_HotsoundDetectorRealTime(benchmark::State& state) {
  RunDetector(state, ReceivedBroadcast(10.0, -10.0));
}
BENCHMARK(BM_HotsoundDetectorRealTime)->Unit(benchmark::kMicrosecond);

// On quiet room noise (-60 dBFS pink), as it runs for hours between
// broadcasts.
void BM_HotsoundDetectorIdle(benchmark::State& state) {
  RunDetector(state, sorvel_sim::MakeNoise(sorvel_sim::NoiseKind::kPink, 10 * 44100, 33.0, 5));
}
BENCHMARK(BM_HotsoundDetectorIdle)->Unit(benchmark::kMicrosecond);

// Heap held by one decoder (construction included) after 60 s of input.
void BM_DsssDecoderMemory(benchmark::State& state) {
  const std::vector<float> signal = ReceivedBroadcast(10.0, -10.0);
  for (auto _ : state) {
    const size_t before = mallinfo2().uordblks;
    auto decoder = MakeDecoder();
    for (int i = 0; i < 6; ++i) Stream(*decoder, signal);
    state.counters["heap_bytes"] = static_cast<double>(mallinfo2().uordblks - before);
  }
}
BENCHMARK(BM_DsssDecoderMemory)->Iterations(1)->Unit(benchmark::kMillisecond);

// Feeds `signal` to the multi-tone decoder through the facade, same
// feeding pattern, for each iteration; reports the real-time factor.
void StreamDtmf(benchmark::State& state, const std::vector<float>& signal) {
  const auto decoder = audio_sorvane::MakeDtmfDecoder({});
  audio_sorvane::AudioModemDecoder::DecodeResults results;
  for (auto _ : state) {
    for (size_t start = 0, n = 0; start + 441 <= signal.size(); start += 441, ++n) {
      decoder->ProcessSamples(std::span<const float>(signal).subspan(start, 441));
      if (n % 25 == 24) benchmark::DoNotOptimize(decoder->DecodeTokens(&results, 3, 2));
    }
  }
  state.SetItemsProcessed(state.iterations() * static_cast<int64_t>(signal.size()));
  state.counters["x_real_time"] = benchmark::Counter(
      static_cast<double>(signal.size()) / 44100.0, benchmark::Counter::kIsIterationInvariantRate);
}

// A multi-tone broadcast at -10 dB (target: at least 1000x real time).
void BM_DtmfDecoderRealTime(benchmark::State& state) {
  const auto encoder = audio_sorvane::MakeDtmfEncoder({});
  std::vector<float> token;
  encoder->Encode({0x53, 0x6f, 0x72}, &token, 2);
  StreamDtmf(state, sorvel_sim::ApplyChannel(sorvel_sim::RenderLoopedBroadcast(*encoder, token, 10.0),
                                             {.snr_db = -10.0}));
}
BENCHMARK(BM_DtmfDecoderRealTime)->Unit(benchmark::kMillisecond);

// Listening to noise alone, where no candidate passes the CRC and the
// receiver must not fall back to its costly room search on every request.
void BM_DtmfDecoderIdle(benchmark::State& state) {
  StreamDtmf(state, sorvel_sim::MakeNoise(sorvel_sim::NoiseKind::kWhite, 10 * 44100, 1000.0, 3));
}
BENCHMARK(BM_DtmfDecoderIdle)->Unit(benchmark::kMillisecond);

// Heap held by one default multi-tone decoder (construction included) after
// 60 s of a broadcast at -5 dB in 10 ms blocks, asking for tokens (with CRC)
// every 250 ms. Target: below 0.5 MB. The process-wide sine table that
// every tone filter shares (20 kB) is built before the count starts.
void BM_DtmfDecoderMemory(benchmark::State& state) {
  const auto encoder = audio_sorvane::MakeDtmfEncoder({});
  std::vector<uint8_t> message(encoder->token_length_bytes() - 2, 0x53);
  std::vector<float> token;
  encoder->Encode(message, &token, 2);
  const std::vector<float> signal = sorvel_sim::ApplyChannel(
      sorvel_sim::RenderLoopedBroadcast(*encoder, token, 10.0), {.snr_db = -5.0});
  audio_sorvane::MakeDtmfDecoder({});
  for (auto _ : state) {
    const size_t before = mallinfo2().uordblks;
    const auto decoder = audio_sorvane::MakeDtmfDecoder({});
    audio_sorvane::AudioModemDecoder::DecodeResults results;
    int found = 0;
    for (int i = 0; i < 6; ++i) {
      for (size_t start = 0, n = 0; start + 441 <= signal.size(); start += 441, ++n) {
        decoder->ProcessSamples(std::span<const float>(signal).subspan(start, 441));
        if (n % 25 == 24) found += decoder->DecodeTokens(&results, message.size(), 2);
      }
    }
    state.counters["heap_bytes"] = static_cast<double>(mallinfo2().uordblks - before);
    state.counters["requests_found"] = found;
  }
}
BENCHMARK(BM_DtmfDecoderMemory)->Iterations(1)->Unit(benchmark::kMillisecond);

// The multi-tone tone filter bank alone (ten tones, 10 ms blocks at
// 44.1 kHz), fast path and reference path.
void ToneBank(benchmark::State& state, bool reference) {
  const std::vector<float> tones = {740.0f, 831.0f, 987.0f, 1108.0f, 1244.0f,
                                    1480.0f, 1661.0f, 1975.0f, 2217.0f, 2489.0f};
  audio_sorvane::ToneFilterBank bank(16, 44100.0, tones, 11.86, reference);
  const std::vector<float> input =
      sorvel_sim::MakeNoise(sorvel_sim::NoiseKind::kWhite, 441, 1000.0, 5);
  std::vector<float> out(tones.size() * 64);
  std::vector<float*> rows(tones.size());
  for (size_t t = 0; t < tones.size(); ++t) rows[t] = out.data() + t * 64;
  for (auto _ : state) {
    benchmark::DoNotOptimize(bank.ProcessSamples(input, rows.data(), nullptr));
  }
  state.SetItemsProcessed(state.iterations() * static_cast<int64_t>(input.size()));
}
void BM_DtmfToneBank(benchmark::State& state) { ToneBank(state, false); }
void BM_DtmfToneBankReference(benchmark::State& state) { ToneBank(state, true); }
BENCHMARK(BM_DtmfToneBank);
BENCHMARK(BM_DtmfToneBankReference);

}  // namespace
