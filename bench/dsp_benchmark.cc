// Benchmarks of the DSP toolkit at the sizes the modem uses.
//
// 1905 and 635 are the default DSSS frame lengths (Bluestein), 34290 samples
// is one whole default DSSS token at 44.1 kHz, 44100 -> 14700 Hz is the DSSS
// receiver's baseband conversion.
#include <complex>
#include <random>
#include <vector>

#include "audio/dsp/kiss_fft.h"
#include "audio/dsp/kiss_fft_util.h"
#include "audio/dsp/rational_factor_resampler.h"
#include "audio/dsp/resampler.h"
#include "audio/sorvane/dtmf/tone_strength_filter.h"
#include "benchmark/benchmark.h"

namespace {

using Complex = std::complex<float>;

std::vector<float> Noise(int n) {
  std::mt19937 rng(5);
  std::normal_distribution<float> normal;
  std::vector<float> x(n);
  for (float& v : x) v = normal(rng);
  return x;
}

void BM_ComplexFFT(benchmark::State& state) {
  const int n = static_cast<int>(state.range(0));
  audio_dsp::ComplexFFTTransformer fft(n, false);
  const std::vector<float> re = Noise(n);
  std::vector<Complex> input(re.begin(), re.end()), output(n);
  for (auto _ : state) {
    fft.Forward(input.data(), output.data());
    benchmark::DoNotOptimize(output.data());
  }
  state.SetItemsProcessed(state.iterations() * n);
}
BENCHMARK(BM_ComplexFFT)->Arg(1024)->Arg(635)->Arg(1905);

void BM_RealFFT(benchmark::State& state) {
  const int n = static_cast<int>(state.range(0));
  audio_dsp::RealFFTTransformer fft(n, false);
  const std::vector<float> input = Noise(n);
  std::vector<Complex> output(n / 2 + 1);
  for (auto _ : state) {
    fft.Forward(input.data(), output.data());
    benchmark::DoNotOptimize(output.data());
  }
  state.SetItemsProcessed(state.iterations() * n);
}
BENCHMARK(BM_RealFFT)->Arg(127)->Arg(34290);

// One default token, 44100 -> 48000 Hz, plans included (built per call).
void BM_FftResampleToken(benchmark::State& state) {
  const std::vector<float> input = Noise(34290);
  std::vector<float> output;
  for (auto _ : state) {
    audio_dsp::FftResample(input, &output, 44100.0f, 48000.0f);
    benchmark::DoNotOptimize(output.data());
  }
  state.SetItemsProcessed(state.iterations() * input.size());
}
BENCHMARK(BM_FftResampleToken)->Unit(benchmark::kMillisecond);

// Baseband conversion in 10 ms blocks; items are input samples.
void BM_ComplexResampler44100To14700(benchmark::State& state) {
  audio_dsp::RationalFactorResampler<Complex> resampler(
      audio_dsp::DefaultResamplingKernel(44100, 14700), 2000);
  const std::vector<float> re = Noise(441);
  std::vector<Complex> input(re.begin(), re.end());
  std::vector<Complex> output;
  for (auto _ : state) {
    resampler.ProcessSamples(input, &output);
    benchmark::DoNotOptimize(output.data());
  }
  state.SetItemsProcessed(state.iterations() * input.size());
}
BENCHMARK(BM_ComplexResampler44100To14700);

void BM_FloatResampler44100To16000(benchmark::State& state) {
  audio_dsp::RationalFactorResampler<float> resampler(
      audio_dsp::DefaultResamplingKernel(44100, 16000), 2000);
  const std::vector<float> input = Noise(441);
  std::vector<float> output;
  for (auto _ : state) {
    resampler.ProcessSamples(input, &output);
    benchmark::DoNotOptimize(output.data());
  }
  state.SetItemsProcessed(state.iterations() * input.size());
}
BENCHMARK(BM_FloatResampler44100To16000);

// One tone, 10 ms blocks at 16 kHz decimated by 40.
void BM_ToneStrengthFilter(benchmark::State& state) {
  audio_sorvane::ToneStrengthFilter filter(40, 16000.0, 740.0, 10.0);
  const std::vector<float> input = Noise(160);
  std::vector<float> output;
  for (auto _ : state) {
    filter.ProcessSamples(input, &output);
    benchmark::DoNotOptimize(output.data());
  }
  state.SetItemsProcessed(state.iterations() * input.size());
}
BENCHMARK(BM_ToneStrengthFilter);

}  // namespace
