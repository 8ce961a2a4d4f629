#include "audio/sorvane/dtmf/tone_strength_filter.h"

#include <cmath>
#include <numbers>

#include "base/logging.h"

namespace audio_sorvane {

const float* GetSineTable() {
  // A quarter period more than a full one, so that entry i + 1024 (the
  // cosine) needs no wrap. Function-local statics are initialised once,
  // thread-safely; the table is never freed.
  static const float* const table = [] {
    float* t = new float[kSineTableSteps + kSineTableSteps / 4];
    for (int i = 0; i < kSineTableSteps + kSineTableSteps / 4; ++i) {
      t[i] = static_cast<float>(
          std::sin(i * 2.0 * std::numbers::pi / kSineTableSteps));
    }
    return t;
  }();
  return table;
}

ToneStrengthFilter::ToneStrengthFilter(int decimation_factor,
                                       double sample_rate, double frequency,
                                       double cutoff_frequency)
    : table_(GetSineTable()),
      sample_rate_(sample_rate),
      frequency_(frequency),
      // Half a table step, so that taking the top 12 bits rounds to the
      // nearest entry.
      phase_(1u << 19),
      phase_increment_(0),
      decimation_factor_(decimation_factor) {
  const double cycles = frequency / sample_rate;
  if (std::isfinite(cycles)) {
    phase_increment_ =
        static_cast<uint32_t>((cycles - std::floor(cycles)) * 4294967296.0);
  }

  // Two identical one-pole stages, each 1/sqrt(2) in power at the cutoff.
  const double output_rate = sample_rate / decimation_factor;
  const double c = std::cos(2.0 * std::numbers::pi * cutoff_frequency / output_rate);
  const double g = 0.7071067811865475;
  const double a = (1.0 - c * g) / (1.0 - g);
  const double pole = a - std::sqrt(a * a - 1.0);
  smoothing_gain_ = static_cast<float>(1.0 - pole);
  delay_ = static_cast<int>(std::lround(2.0 * pole / (1.0 - pole)));

  CHECK(decimation_factor_ >= 1);
  Reset();
}

void ToneStrengthFilter::Reset() {
  accumulator_ = {0.0f, 0.0f};
  state1_ = {0.0f, 0.0f};
  state2_ = {0.0f, 0.0f};
  countdown_ = decimation_factor_;
}

void ToneStrengthFilter::ProcessSamples(std::span<const float> input,
                                        std::vector<float>* output_samples) {
  ProcessSamples(input, output_samples, nullptr);
}

void ToneStrengthFilter::ProcessSamples(std::span<const float> input,
                                        std::vector<float>* output_samples,
                                        std::vector<std::complex<float>>* block_sums) {
  CHECK(output_samples);
  output_samples->clear();
  output_samples->reserve(input.size() / decimation_factor_ + 1);
  if (block_sums) {
    block_sums->clear();
    block_sums->reserve(input.size() / decimation_factor_ + 1);
  }
  // Locals let the compiler keep the loop state in registers.
  uint32_t phase = phase_;
  float acc_re = accumulator_.real();
  float acc_im = accumulator_.imag();
  int countdown = countdown_;
  const float k = smoothing_gain_;
  for (float x : input) {
    const uint32_t index = phase >> 20;
    acc_re += x * table_[index + kSineTableSteps / 4];
    acc_im += x * table_[index];
    phase += phase_increment_;
    if (--countdown == 0) {
      const std::complex<float> z(acc_re, acc_im);
      if (block_sums) block_sums->push_back(z);
      acc_re = 0.0f;
      acc_im = 0.0f;
      countdown = decimation_factor_;
      state1_ += (z - state1_) * k;
      state2_ += (state1_ - state2_) * k;
      output_samples->push_back(state2_.real() * state2_.real() +
                                state2_.imag() * state2_.imag());
    }
  }
  phase_ = phase;
  accumulator_ = {acc_re, acc_im};
  countdown_ = countdown;
}

}  // namespace audio_sorvane
