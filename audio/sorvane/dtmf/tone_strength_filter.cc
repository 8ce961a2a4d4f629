#include "audio/sorvane/dtmf/tone_strength_filter.h"

#include <algorithm>
#include <cmath>
#include <numbers>

#include "audio/dsp/float4.h"
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
  block_cos_.resize(decimation_factor_);
  block_sin_.resize(decimation_factor_);
  for (int n = 0; n < decimation_factor_; ++n) {
    const uint32_t phase = static_cast<uint32_t>(n) * phase_increment_;
    const double angle = 2.0 * std::numbers::pi * (phase / 4294967296.0);
    block_cos_[n] = static_cast<float>(std::cos(angle));
    block_sin_[n] = static_cast<float>(std::sin(angle));
  }
  Reset();
}

std::complex<float> PhaseRotation(uint32_t phase) {
  const float* table = GetSineTable();
  const uint32_t index = phase >> 20;
  const float a = static_cast<float>(phase & 0xFFFFFu) *
                  static_cast<float>(2.0 * std::numbers::pi / 4294967296.0);
  const float c = 1.0f - 0.5f * a * a, s = a - a * a * a * (1.0f / 6.0f);
  const float c0 = table[index + kSineTableSteps / 4], s0 = table[index];
  return {c0 * c - s0 * s, s0 * c + c0 * s};
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

void ToneStrengthFilter::PrepareOutputs(size_t input_size, std::vector<float>* output_samples,
                                        std::vector<std::complex<float>>* block_sums) const {
  CHECK(output_samples);
  output_samples->clear();
  output_samples->reserve(input_size / decimation_factor_ + 1);
  if (block_sums) {
    block_sums->clear();
    block_sums->reserve(input_size / decimation_factor_ + 1);
  }
}

// The fast path: the block sum is accumulated in the frame of the block's
// first sample (acc = sum x[n] e^{i n omega}) and turned by the oscillator
// phase at the block start when the block completes. The register phase_
// carries half a table step (2^19) for the reference path's rounding; the
// phase it stands for is phase_ - 2^19.
void ToneStrengthFilter::ProcessSamples(std::span<const float> input,
                                        std::vector<float>* output_samples,
                                        std::vector<std::complex<float>>* block_sums) {
  PrepareOutputs(input.size(), output_samples, block_sums);
  const int d = decimation_factor_;
  uint32_t block_phase =
      phase_ - static_cast<uint32_t>(d - countdown_) * phase_increment_ - (1u << 19);
  const uint32_t block_step = static_cast<uint32_t>(d) * phase_increment_;
  float acc_re = accumulator_.real(), acc_im = accumulator_.imag();
  int countdown = countdown_;
  const float k = smoothing_gain_;
  const size_t size = input.size();
  for (size_t i = 0; i < size;) {
    const int n0 = d - countdown;
    const int m = static_cast<int>(std::min<size_t>(countdown, size - i));
    for (int j = 0; j < m; ++j) {
      acc_re += input[i + j] * block_cos_[n0 + j];
      acc_im += input[i + j] * block_sin_[n0 + j];
    }
    i += m;
    countdown -= m;
    if (countdown == 0) {
      const std::complex<float> z = PhaseRotation(block_phase) * std::complex<float>(acc_re, acc_im);
      if (block_sums) block_sums->push_back(z);
      acc_re = acc_im = 0.0f;
      countdown = d;
      block_phase += block_step;
      state1_ += (z - state1_) * k;
      state2_ += (state1_ - state2_) * k;
      output_samples->push_back(state2_.real() * state2_.real() +
                                state2_.imag() * state2_.imag());
    }
  }
  phase_ += static_cast<uint32_t>(size) * phase_increment_;
  accumulator_ = {acc_re, acc_im};
  countdown_ = countdown;
}

void ToneStrengthFilter::ProcessSamplesReference(std::span<const float> input,
                                                 std::vector<float>* output_samples,
                                                 std::vector<std::complex<float>>* block_sums) {
  PrepareOutputs(input.size(), output_samples, block_sums);
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

ToneFilterBank::ToneFilterBank(int decimation_factor, double sample_rate,
                               const std::vector<float>& frequencies, double cutoff_frequency,
                               bool reference)
    : num_tones_(static_cast<int>(frequencies.size())),
      num_vectors_((num_tones_ + 3) / 4),
      decimation_factor_(decimation_factor),
      reference_(reference) {
  for (float f : frequencies) {
    filters_.emplace_back(decimation_factor, sample_rate, f, cutoff_frequency);
  }
  const int lanes = 4 * num_vectors_;
  cos_table_.assign(static_cast<size_t>(decimation_factor_) * lanes, 0.0f);
  sin_table_.assign(cos_table_.size(), 0.0f);
  block_step_.assign(lanes, 0);
  for (int t = 0; t < num_tones_; ++t) {
    for (int n = 0; n < decimation_factor_; ++n) {
      cos_table_[n * lanes + t] = filters_[t].block_cos_[n];
      sin_table_[n * lanes + t] = filters_[t].block_sin_[n];
    }
    block_step_[t] = static_cast<uint32_t>(decimation_factor_) * filters_[t].phase_increment_;
  }
  for (auto* v : {&acc_re_, &acc_im_, &s1_re_, &s1_im_, &s2_re_, &s2_im_}) v->assign(lanes, 0.0f);
  block_phase_.assign(lanes, 0);
  for (int t = 0; t < num_tones_; ++t) block_phase_[t] = filters_[t].phase_ - (1u << 19);
  for (auto* v : {&rot_re_, &rot_im_, &step_re_, &step_im_}) v->assign(lanes, 0.0f);
  for (int t = 0; t < num_tones_; ++t) {
    const double angle = 2.0 * std::numbers::pi * (block_step_[t] / 4294967296.0);
    step_re_[t] = static_cast<float>(std::cos(angle));
    step_im_[t] = static_cast<float>(std::sin(angle));
  }
  blocks_done_ = 0;
  countdown_ = decimation_factor_;
}

void ToneFilterBank::Reset() {
  for (ToneStrengthFilter& filter : filters_) filter.Reset();
  // The oscillators run on: the next block starts at the current phase.
  const uint32_t done = static_cast<uint32_t>(decimation_factor_ - countdown_);
  for (int t = 0; t < num_tones_; ++t) {
    block_phase_[t] += done * filters_[t].phase_increment_;
  }
  for (auto* v : {&acc_re_, &acc_im_, &s1_re_, &s1_im_, &s2_re_, &s2_im_}) {
    std::fill(v->begin(), v->end(), 0.0f);
  }
  blocks_done_ = 0;
  countdown_ = decimation_factor_;
}

namespace {

using audio_dsp::Float4;
using audio_dsp::Load4;
using audio_dsp::Splat4;
using audio_dsp::Store4;

// Adds samples x[0 .. count) at block positions n0 .. n0 + count to the
// accumulators (kVectors vectors of four tones).
template <int kVectors>
inline void Accumulate(const float* x, int count, int n0, const float* cos_table,
                       const float* sin_table, float* acc_re, float* acc_im) {
  constexpr int kLanes = 4 * kVectors;
  Float4 re[kVectors], im[kVectors];
  for (int v = 0; v < kVectors; ++v) {
    re[v] = Load4(acc_re + 4 * v);
    im[v] = Load4(acc_im + 4 * v);
  }
  const float* c = cos_table + n0 * kLanes;
  const float* s = sin_table + n0 * kLanes;
  for (int j = 0; j < count; ++j, c += kLanes, s += kLanes) {
    const Float4 xv = Splat4(x[j]);
    for (int v = 0; v < kVectors; ++v) {
      re[v] += xv * Load4(c + 4 * v);
      im[v] += xv * Load4(s + 4 * v);
    }
  }
  for (int v = 0; v < kVectors; ++v) {
    Store4(acc_re + 4 * v, re[v]);
    Store4(acc_im + 4 * v, im[v]);
  }
}

}  // namespace

int ToneFilterBank::ProcessSamples(std::span<const float> input, float* const* strengths,
                                   std::complex<float>* const* block_sums) {
  CHECK(strengths);
  if (reference_) {
    int produced = 0;
    for (int t = 0; t < num_tones_; ++t) {
      filters_[t].ProcessSamplesReference(input, &ref_strengths_, block_sums ? &ref_sums_ : nullptr);
      std::copy(ref_strengths_.begin(), ref_strengths_.end(), strengths[t]);
      if (block_sums) std::copy(ref_sums_.begin(), ref_sums_.end(), block_sums[t]);
      produced = static_cast<int>(ref_strengths_.size());
    }
    return produced;
  }
  const int d = decimation_factor_;
  const int lanes = 4 * num_vectors_;
  const float k = filters_.empty() ? 0.0f : filters_[0].smoothing_gain_;
  const Float4 gain = Splat4(k);
  const float* x = input.data();
  const size_t size = input.size();
  int produced = 0;
  for (size_t i = 0; i < size;) {
    const int n0 = d - countdown_;
    const int m = static_cast<int>(std::min<size_t>(countdown_, size - i));
    switch (num_vectors_) {
      case 1: Accumulate<1>(x + i, m, n0, cos_table_.data(), sin_table_.data(), acc_re_.data(), acc_im_.data()); break;
      case 2: Accumulate<2>(x + i, m, n0, cos_table_.data(), sin_table_.data(), acc_re_.data(), acc_im_.data()); break;
      case 3: Accumulate<3>(x + i, m, n0, cos_table_.data(), sin_table_.data(), acc_re_.data(), acc_im_.data()); break;
      case 4: Accumulate<4>(x + i, m, n0, cos_table_.data(), sin_table_.data(), acc_re_.data(), acc_im_.data()); break;
      default:
        for (int v = 0; v < num_vectors_; ++v) {
          // Four tones at a time through the one-vector kernel on a view of
          // the tables; same arithmetic.
          for (int j = 0; j < m; ++j) {
            const Float4 xv = Splat4(x[i + j]);
            const int row = (n0 + j) * lanes + 4 * v;
            Store4(&acc_re_[4 * v], Load4(&acc_re_[4 * v]) + xv * Load4(&cos_table_[row]));
            Store4(&acc_im_[4 * v], Load4(&acc_im_[4 * v]) + xv * Load4(&sin_table_[row]));
          }
        }
    }
    i += m;
    countdown_ -= m;
    if (countdown_ > 0) break;
    // Block complete: rotate, smooth and output, four tones at a time.
    for (int v = 0; v < num_vectors_; ++v) {
      Float4 rot_re, rot_im;
      if (blocks_done_ % kExactEvery == 0) {
        for (int l = 0; l < 4; ++l) {
          const std::complex<float> r = PhaseRotation(block_phase_[4 * v + l]);
          rot_re[l] = r.real();
          rot_im[l] = r.imag();
        }
      } else {
        rot_re = Load4(&rot_re_[4 * v]);
        rot_im = Load4(&rot_im_[4 * v]);
      }
      for (int l = 0; l < 4; ++l) block_phase_[4 * v + l] += block_step_[4 * v + l];
      {
        const Float4 st_re = Load4(&step_re_[4 * v]), st_im = Load4(&step_im_[4 * v]);
        Store4(&rot_re_[4 * v], rot_re * st_re - rot_im * st_im);
        Store4(&rot_im_[4 * v], rot_re * st_im + rot_im * st_re);
      }
      const Float4 a_re = Load4(&acc_re_[4 * v]), a_im = Load4(&acc_im_[4 * v]);
      const Float4 z_re = rot_re * a_re - rot_im * a_im;
      const Float4 z_im = rot_re * a_im + rot_im * a_re;
      Float4 s1_re = Load4(&s1_re_[4 * v]), s1_im = Load4(&s1_im_[4 * v]);
      Float4 s2_re = Load4(&s2_re_[4 * v]), s2_im = Load4(&s2_im_[4 * v]);
      s1_re += (z_re - s1_re) * gain;
      s1_im += (z_im - s1_im) * gain;
      s2_re += (s1_re - s2_re) * gain;
      s2_im += (s1_im - s2_im) * gain;
      Store4(&s1_re_[4 * v], s1_re);
      Store4(&s1_im_[4 * v], s1_im);
      Store4(&s2_re_[4 * v], s2_re);
      Store4(&s2_im_[4 * v], s2_im);
      const Float4 power = s2_re * s2_re + s2_im * s2_im;
      Store4(&acc_re_[4 * v], Splat4(0.0f));
      Store4(&acc_im_[4 * v], Splat4(0.0f));
      const int tones = std::min(4, num_tones_ - 4 * v);
      for (int l = 0; l < tones; ++l) {
        strengths[4 * v + l][produced] = power[l];
        if (block_sums) block_sums[4 * v + l][produced] = {z_re[l], z_im[l]};
      }
    }
    ++produced;
    ++blocks_done_;
    countdown_ = d;
  }
  // The next round of the loop starts a new block; a break leaves a partial
  // one in the accumulators.
  return produced;
}

}  // namespace audio_sorvane
