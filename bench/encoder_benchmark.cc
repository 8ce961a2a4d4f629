// Transmit side: one default token end to end through the encoder facade
// (target: under 2 ms each), and the DSSS set-up cost.
#include <cstdint>
#include <vector>

#include "audio/modem_config.h"
#include "audio/sorvane/symbol_wave_coder.h"
#include "benchmark/benchmark.h"

namespace {

void BM_EncodeDsssToken(benchmark::State& state) {
  const auto encoder = audio_sorvane::MakeDsssEncoder({});
  const std::vector<uint8_t> message = {0x53, 0x6f, 0x72, 0x76, 0x65, 0x6c};
  std::vector<float> audio;
  for (auto _ : state) {
    encoder->Encode(message, &audio, 2);
    benchmark::DoNotOptimize(audio.data());
  }
}
BENCHMARK(BM_EncodeDsssToken)->Unit(benchmark::kMicrosecond);

void BM_EncodeDtmfToken(benchmark::State& state) {
  const auto encoder = audio_sorvane::MakeDtmfEncoder({});
  const std::vector<uint8_t> message = {0x53, 0x6f, 0x72};
  std::vector<float> audio;
  for (auto _ : state) {
    encoder->Encode(message, &audio, 2);
    benchmark::DoNotOptimize(audio.data());
  }
}
BENCHMARK(BM_EncodeDtmfToken)->Unit(benchmark::kMicrosecond);

void BM_SymbolWaveCoderSetUp(benchmark::State& state) {
  const audio_sorvane::SymbolWaveCoderParams params;
  for (auto _ : state) {
    audio_sorvane::SymbolWaveCoder coder(params);
    benchmark::DoNotOptimize(&coder);
  }
}
BENCHMARK(BM_SymbolWaveCoderSetUp)->Unit(benchmark::kMicrosecond);

}  // namespace
