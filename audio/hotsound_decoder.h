// A DSSS decoder behind a cheap wake-up detector ("hotsound").
//
// While listening, audio only goes into a short pre-trigger buffer and past
// a wake-up detector of the DSSS broadcast (hotsound_detector.h). When the
// detector fires, the buffered audio and everything after it goes to the
// DSSS decoder, until that decoder has reported nothing for more than a
// second; then the decoder listens again. The detector hears all audio,
// listening or not, so its score is always that of the latest audio: a
// decoder that goes back to sleep after a broadcast wakes again only if a
// broadcast is still on the air. Activity time comes from a monotonic clock that
// tests can replace.
//
// Not thread safe; callers serialise. Missing parts are fatal at
// construction.
#ifndef AUDIO_HOTSOUND_DECODER_H_
#define AUDIO_HOTSOUND_DECODER_H_

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <span>
#include <vector>

#include "audio/hotsound_detector.h"
#include "audio/sorvane/sorvane_decoder.h"

namespace audio_sorvane {

class HotsoundDecoder {
 public:
  using Clock = std::function<std::chrono::steady_clock::time_point()>;
  static constexpr int kPreTriggerCapacity = 14400;
  // A triggered decoder goes back to listening once it has reported nothing
  // for more than this long (whole milliseconds).
  static constexpr int64_t kIdleTimeoutMs = 1000;

  HotsoundDecoder(std::unique_ptr<SorvaneDecoder> dsss_decoder,
                  std::unique_ptr<HotsoundDetector> hotsound_detector,
                  Clock clock = std::chrono::steady_clock::now);

  void Initialize(int num_channels, float input_sample_rate);
  void ProcessSamples(const int16_t* samples, int count);
  // The DSSS decoder's tokens while triggered; false while listening.
  bool DecodeTokens(DecodeResults* raw_results);
  bool DetectBroadcaster();
  // Wipes the DSSS decoder only; a triggered decoder stays triggered.
  void WipeInternalData();
  int GetMaxSafeInputSize() const;
  int token_length_bytes() const { return token_length_bytes_; }

  bool triggered() const { return state_ == 1; }
  int pre_trigger_count() const { return pre_trigger_count_; }
  const int16_t* pre_trigger_samples() const { return pre_trigger_.data() + pre_trigger_start_; }
  const SorvaneDecoder& dsss_decoder() const { return *dsss_decoder_; }

 private:
  void UpdateActivity(bool success);
  void FeedDsss(const int16_t* samples, int count);

  std::unique_ptr<SorvaneDecoder> dsss_decoder_;
  std::unique_ptr<HotsoundDetector> hotsound_detector_;
  int pre_trigger_start_ = 0;  // the oldest kept sample
  int pre_trigger_count_ = 0;
  std::vector<int16_t> pre_trigger_;
  int state_ = 0;
  int token_length_bytes_ = 0;
  std::chrono::steady_clock::time_point last_activity_;
  Clock clock_;
  std::vector<float> floats_;
};

}  // namespace audio_sorvane

#endif  // AUDIO_HOTSOUND_DECODER_H_
