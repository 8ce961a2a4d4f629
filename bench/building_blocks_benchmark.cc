// Benchmarks of the small building blocks the receivers run per block.
#include <complex>
#include <cstdint>
#include <random>
#include <vector>

#include "audio/dsp/box_filter.h"
#include "audio/dsp/max_filter.h"
#include "audio/dsp/signal_vector_util.h"
#include "audio/sorvane/code_signal_generator.h"
#include "audio/sorvane/crc16_coder.h"
#include "benchmark/benchmark.h"

namespace {

std::vector<float> RandomSignal(int n) {
  std::mt19937 rng(1);
  std::normal_distribution<float> normal;
  std::vector<float> x(n);
  for (float& v : x) v = normal(rng);
  return x;
}

// Box sums over one second at 44.1 kHz; the cost must not grow with width.
void BM_BoxFilter(benchmark::State& state) {
  const std::vector<float> input = RandomSignal(44100);
  std::vector<float> output(input.size());
  for (auto _ : state) {
    audio_dsp::BoxFilter(input.data(), static_cast<int>(input.size()), 1,
                         static_cast<int>(state.range(0)), output.data());
    benchmark::DoNotOptimize(output.data());
  }
  state.SetItemsProcessed(state.iterations() * input.size());
}
BENCHMARK(BM_BoxFilter)->Arg(3)->Arg(64)->Arg(4096);

void BM_MaxFilter(benchmark::State& state) {
  const std::vector<float> input = RandomSignal(44100);
  std::vector<float> output(input.size());
  for (auto _ : state) {
    audio_dsp::MaxFilter(input.data(), static_cast<int>(input.size()),
                         static_cast<int>(state.range(0)), output.data());
    benchmark::DoNotOptimize(output.data());
  }
  state.SetItemsProcessed(state.iterations() * input.size());
}
BENCHMARK(BM_MaxFilter)->Arg(3)->Arg(64)->Arg(4096);

// The receiver's baseband smoother: a few complex taps over a 10 ms block.
void BM_ComplexFirFilter(benchmark::State& state) {
  std::vector<std::complex<float>> taps(state.range(0), {0.25f, 0.0f});
  audio_dsp::ComplexFirFilter filter(taps);
  const std::vector<float> re = RandomSignal(441);
  std::vector<std::complex<float>> input(re.begin(), re.end());
  std::vector<std::complex<float>> output;
  for (auto _ : state) {
    filter.Filter(input, &output);
    benchmark::DoNotOptimize(output.data());
  }
  state.SetItemsProcessed(state.iterations() * input.size());
}
BENCHMARK(BM_ComplexFirFilter)->Arg(3)->Arg(31);

void BM_Crc16(benchmark::State& state) {
  const audio_sorvane::Crc16Coder coder({.num_message_bytes = 8});
  std::vector<uint8_t> token = {1, 2, 3, 4, 5, 6, 7, 8, 0, 0};
  for (auto _ : state) {
    benchmark::DoNotOptimize(coder.Verify(token));
  }
}
BENCHMARK(BM_Crc16);

void BM_GenerateCodeSignal(benchmark::State& state) {
  std::vector<float> code;
  for (auto _ : state) {
    audio_sorvane::GenerateCodeSignal(static_cast<int>(state.range(0)), 0,
                                      &code);
    benchmark::DoNotOptimize(code.data());
  }
}
BENCHMARK(BM_GenerateCodeSignal)->Arg(7)->Arg(11);

}  // namespace
