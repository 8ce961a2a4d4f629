#include "audio/hotsound_decoder.h"

#include <algorithm>
#include <cmath>
#include <numbers>
#include <utility>

#include "base/logging.h"

namespace audio_sorvane {
namespace {

constexpr double kSignalOffsets[] = {-1000.0, -500.0, 0.0, 500.0, 1000.0};
constexpr double kReferenceOffsets[] = {-4500.0, -5000.0, -5500.0, -6000.0, -6500.0};
constexpr int kBinsPerGroup = 5;
// Exponential smoothing over about 16 hops (0.1 s at 44.1 kHz): long enough
// to steady the ratio of two noise powers, short enough to fire within a
// fraction of a second.
constexpr double kSmoothing = 1.0 / 16.0;

}  // namespace

std::unique_ptr<HotsoundDetector> HotsoundDetector::Create(const HotsoundDetectorConfig& config,
                                                           int step) {
  if (config.sample_rate <= 0 || config.hop_size <= 0 ||
      config.frequency + kSignalOffsets[kBinsPerGroup - 1] >= config.sample_rate / 2.0 ||
      config.frequency + kReferenceOffsets[kBinsPerGroup - 1] <= 0.0) {
    return nullptr;
  }
  return std::unique_ptr<HotsoundDetector>(new HotsoundDetector(config, step));
}

HotsoundDetector::HotsoundDetector(const HotsoundDetectorConfig& config, int step)
    : config_(config), step_(std::max(step, 1)) {
  for (const double* offsets : {kSignalOffsets, kReferenceOffsets}) {
    for (int b = 0; b < kBinsPerGroup; ++b) {
      const double w = 2.0 * std::numbers::pi * (config_.frequency + offsets[b]) /
                       config_.sample_rate;
      coefficients_.push_back(2.0 * std::cos(w));
    }
  }
  state1_.assign(coefficients_.size(), 0.0);
  state2_.assign(coefficients_.size(), 0.0);
}

float HotsoundDetector::Process(std::span<int16_t> samples) {
  size_t n = samples.size();
  if (step_ >= 2) {
    // Pair averages at every step-th sample; the last pair of a block whose
    // length - 1 is a multiple of the step reads the last sample twice.
    size_t out = 0;
    for (size_t i = 0; i < n; i += step_) {
      const int next = i + 1 < n ? samples[i + 1] : samples[i];
      samples[out++] = static_cast<int16_t>((samples[i] + next) / 2);
    }
    n = out;
  }
  const size_t bins = coefficients_.size();
  for (size_t i = 0; i < n; ++i) {
    const double x = samples[i];
    for (size_t b = 0; b < bins; ++b) {
      const double s = x + coefficients_[b] * state1_[b] - state2_[b];
      state2_[b] = state1_[b];
      state1_[b] = s;
    }
    if (++hop_fill_ == config_.hop_size) FinishHop();
  }
  return score_;
}

void HotsoundDetector::FinishHop() {
  double signal = 0.0, reference = 0.0;
  for (size_t b = 0; b < coefficients_.size(); ++b) {
    const double power = state1_[b] * state1_[b] + state2_[b] * state2_[b] -
                         coefficients_[b] * state1_[b] * state2_[b];
    (b < kBinsPerGroup ? signal : reference) += power;
    state1_[b] = state2_[b] = 0.0;
  }
  hop_fill_ = 0;
  signal_level_ += kSmoothing * (signal - signal_level_);
  reference_level_ += kSmoothing * (reference - reference_level_);
  // Epsilon: a few LSBs of noise per bin, so digital silence scores 0.
  const double epsilon = 1e3 * static_cast<double>(config_.hop_size);
  score_ = static_cast<float>(10.0 * signal_level_ / (reference_level_ + epsilon));
}

std::unique_ptr<HotsoundDetector> MakeHotsoundDetector(int sample_rate, int step) {
  HotsoundDetectorConfig config;
  config.sample_rate = sample_rate;
  config.sample_rate_scale = static_cast<int64_t>(sample_rate) * 2032;
  return HotsoundDetector::Create(config, step);
}

HotsoundDecoder::HotsoundDecoder(std::unique_ptr<SorvaneDecoder> dsss_decoder,
                                 std::unique_ptr<HotsoundDetector> hotsound_detector,
                                 Clock clock)
    : pre_trigger_(kPreTriggerCapacity),
      last_activity_(std::chrono::steady_clock::time_point::min()),
      clock_(std::move(clock)) {
  CHECK(dsss_decoder);
  CHECK(hotsound_detector);
  dsss_decoder_ = std::move(dsss_decoder);
  hotsound_detector_ = std::move(hotsound_detector);
  token_length_bytes_ = dsss_decoder_->symbol_wave_coder().params().bits_per_symbol *
                        dsss_decoder_->params().symbols_in_token / 8;
}

void HotsoundDecoder::Initialize(int num_channels, float input_sample_rate) {
  dsss_decoder_->Initialize(num_channels, input_sample_rate);
}

void HotsoundDecoder::FeedDsss(const int16_t* samples, int count) {
  floats_.assign(samples, samples + count);
  dsss_decoder_->ProcessSamples(floats_);
}

void HotsoundDecoder::ProcessSamples(const int16_t* samples, int count) {
  if (count <= 0) return;
  if (state_ == 1) {
    FeedDsss(samples, count);
    return;
  }
  // Keep the newest audio: the block's first `take` samples behind as much
  // of the old audio as still fits.
  const int take = std::min(kPreTriggerCapacity, count);
  const int room = kPreTriggerCapacity - take;
  const int keep = std::min(room, pre_trigger_count_);
  if (keep >= 1 && room < pre_trigger_count_) {
    std::copy(pre_trigger_.begin() + (pre_trigger_count_ - keep),
              pre_trigger_.begin() + pre_trigger_count_, pre_trigger_.begin());
  }
  std::copy(samples, samples + take, pre_trigger_.begin() + keep);
  pre_trigger_count_ = keep + take;

  block_.assign(samples, samples + count);  // the detector decimates in place
  const float score = hotsound_detector_->Process(block_);
  if (!hotsound_detector_->Detected(score)) return;
  VLOG(1) << "Hotsound detected, score " << score;
  state_ = 1;
  last_activity_ = clock_();
  FeedDsss(pre_trigger_.data(), pre_trigger_count_);
  pre_trigger_count_ = 0;
}

void HotsoundDecoder::UpdateActivity(bool success) {
  const auto now = clock_();
  if (success) {
    last_activity_ = now;
    return;
  }
  const auto elapsed =
      std::chrono::duration_cast<std::chrono::milliseconds>(now - last_activity_).count();
  if (elapsed >= 1001) state_ = 0;
}

bool HotsoundDecoder::DecodeTokens(DecodeResults* raw_results) {
  if (state_ != 1) return false;
  const bool success = dsss_decoder_->GetToken(raw_results);
  UpdateActivity(success);
  return success;
}

bool HotsoundDecoder::DetectBroadcaster() {
  if (state_ != 1) return false;
  const bool detected = dsss_decoder_->DetectBroadcaster();
  UpdateActivity(detected);
  return detected;
}

void HotsoundDecoder::WipeInternalData() { dsss_decoder_->WipeInternalData(); }

int HotsoundDecoder::GetMaxSafeInputSize() const { return dsss_decoder_->GetMaxSafeInputSize(); }

}  // namespace audio_sorvane
