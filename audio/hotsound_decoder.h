// A DSSS decoder behind a cheap wake-up detector ("hotsound").
//
// While listening, audio only goes into a short pre-trigger buffer and past
// a narrow-band detector of the DSSS carrier. When the detector fires, the
// buffered audio and everything after it goes to the DSSS decoder, until
// that decoder has reported nothing for more than a second; then the
// decoder listens again. Activity time comes from a monotonic clock that
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

#include "audio/sorvane/sorvane_decoder.h"

namespace audio_sorvane {

// The detector's configuration, as built from the input sample rate and the
// decimation step. The core uses the sample rate, the frequency and the hop
// size; the other values describe the original detector's fixed-point
// scales and are carried unchanged.
struct HotsoundDetectorConfig {
  int32_t sample_rate = 44100;
  float frequency = 18496.0625f;  // Hz, the default DSSS carrier
  int64_t sample_rate_scale = 0;  // sample_rate * 2032
  int64_t time_scale = 12288000;
  int32_t min_hops_over_threshold = 1;
  int32_t num_detections_required = 1;
  int32_t flags = 0;
  int64_t hop_size = 256;  // samples per score update
};

// Narrow-band detector of a DSSS broadcast. Every hop of hop_size samples
// it measures Goertzel powers at five frequencies across the spread carrier
// (f0 + {-1000, -500, 0, 500, 1000} Hz) and at five reference frequencies
// 4.5 to 6.5 kHz below it, smooths both sums over about 16 hops and scores
//   score = 10 * signal / (reference + epsilon).
// White noise scores about 10 (at most 14.4 over a minute here), pink noise
// and speech less (their energy falls with frequency); a broadcast at 0 dB
// full-band SNR scores about 80. A score above 25.0 (the band 4 dB above
// its surroundings) means a broadcast is on the air.
class HotsoundDetector {
 public:
  static constexpr float kThreshold = 25.0f;

  // Null when the configuration cannot make a detector (bad rate or hop,
  // or a carrier beyond half the sample rate).
  static std::unique_ptr<HotsoundDetector> Create(const HotsoundDetectorConfig& config,
                                                  int step);

  // Decimates the block in place by the step (pair averages, which mix
  // interleaved stereo down to mono), scores it and returns the score after
  // the block.
  float Process(std::span<int16_t> samples);
  bool Detected(float score) const { return score > kThreshold; }

  int step() const { return step_; }
  float score() const { return score_; }

 private:
  HotsoundDetector(const HotsoundDetectorConfig& config, int step);
  void FinishHop();

  HotsoundDetectorConfig config_;
  int step_;
  std::vector<double> coefficients_;  // 2 cos(w) per bin, signal bins first
  std::vector<double> state1_, state2_;
  int hop_fill_ = 0;
  double signal_level_ = 0.0;
  double reference_level_ = 0.0;
  float score_ = 0.0f;
};

// The configuration from the integer input rate and the step (channels).
std::unique_ptr<HotsoundDetector> MakeHotsoundDetector(int sample_rate, int step);

class HotsoundDecoder {
 public:
  using Clock = std::function<std::chrono::steady_clock::time_point()>;
  static constexpr int kPreTriggerCapacity = 14400;

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
  const int16_t* pre_trigger_samples() const { return pre_trigger_.data(); }
  const SorvaneDecoder& dsss_decoder() const { return *dsss_decoder_; }

 private:
  void UpdateActivity(bool success);
  void FeedDsss(const int16_t* samples, int count);

  std::unique_ptr<SorvaneDecoder> dsss_decoder_;
  std::unique_ptr<HotsoundDetector> hotsound_detector_;
  int pre_trigger_count_ = 0;
  std::vector<int16_t> pre_trigger_;
  int state_ = 0;
  int token_length_bytes_ = 0;
  std::chrono::steady_clock::time_point last_activity_;
  Clock clock_;
  std::vector<int16_t> block_;
  std::vector<float> floats_;
};

}  // namespace audio_sorvane

#endif  // AUDIO_HOTSOUND_DECODER_H_
