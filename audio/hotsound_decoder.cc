#include "audio/hotsound_decoder.h"

#include <algorithm>
#include <utility>

#include "base/logging.h"

namespace audio_sorvane {

HotsoundDecoder::HotsoundDecoder(std::unique_ptr<SorvaneDecoder> dsss_decoder,
                                 std::unique_ptr<HotsoundDetector> hotsound_detector,
                                 Clock clock)
    : pre_trigger_(2 * kPreTriggerCapacity),
      last_activity_(std::chrono::steady_clock::time_point::min()),
      clock_(std::move(clock)) {
  CHECK(dsss_decoder);
  CHECK(hotsound_detector);
  dsss_decoder_ = std::move(dsss_decoder);
  hotsound_detector_ = std::move(hotsound_detector);
  token_length_bytes_ = dsss_decoder_->token_length_bytes();
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
  const std::span<const int16_t> block(samples, static_cast<size_t>(count));
  if (state_ == 1) {
    FeedDsss(samples, count);
    hotsound_detector_->Process(block);
    return;
  }
  // Keep the newest audio: the block's first `take` samples behind as much
  // of the old audio as still fits. The buffer has room for two captures, so
  // the kept audio moves to the front only when the end is reached.
  const int take = std::min(kPreTriggerCapacity, count);
  const int keep = std::min(kPreTriggerCapacity - take, pre_trigger_count_);
  const int old_end = pre_trigger_start_ + pre_trigger_count_;
  if (old_end + take > static_cast<int>(pre_trigger_.size())) {
    std::copy(pre_trigger_.begin() + (old_end - keep), pre_trigger_.begin() + old_end,
              pre_trigger_.begin());
    pre_trigger_start_ = 0;
  } else {
    pre_trigger_start_ = old_end - keep;
  }
  std::copy(samples, samples + take, pre_trigger_.begin() + pre_trigger_start_ + keep);
  pre_trigger_count_ = keep + take;

  const float score = hotsound_detector_->Process(block);
  if (!hotsound_detector_->Detected(score)) return;
  VLOG(1) << "Hotsound detected, score " << score;
  state_ = 1;
  last_activity_ = clock_();
  FeedDsss(pre_trigger_samples(), pre_trigger_count_);
  pre_trigger_count_ = 0;
  pre_trigger_start_ = 0;
}

void HotsoundDecoder::UpdateActivity(bool success) {
  const auto now = clock_();
  if (success) {
    last_activity_ = now;
    return;
  }
  const auto elapsed =
      std::chrono::duration_cast<std::chrono::milliseconds>(now - last_activity_).count();
  if (elapsed > kIdleTimeoutMs) state_ = 0;
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
