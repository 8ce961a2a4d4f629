// The wake-up detector of the hotsound receiver: decides cheaply, from a
// fraction of the audio, whether a DSSS broadcast is on the air.
//
// Every DSSS frame carries the same spreading code on a constant pedestal of
// the carrier, so the broadcast is periodic in the frame length whatever the
// symbols. Every kHopFrames frames the detector takes one frame's worth of
// audio ("window"), mixes it down from the carrier and low-passes it into
// kBasebandSize complex samples (two per chip), whitens the code band (so
// a microphone's roll-off or the tilt of music does not matter) and clips
// tones, and correlates it with the code at every cyclic lag (half-chip
// steps) for kCarrierOffsets carrier offsets, through two forward (whole and
// half-bin offsets) and kCarrierOffsets inverse FFTs. Each window's
// correlation powers are divided by their mean, so the statistic does not
// depend on the level of the audio: noise, speech, music and clicks spread
// evenly over the lags, the code piles up at one, or in a room over the
// milliseconds of its reflections. A score adds windows along a lag track
// (each step may move one lag around the drift that the carrier offset
// implies, which follows a moving phone) and takes the best track and
// offset, for two statistics (single lags at every offset, and sums over
// half a frame of lags at the whole-bin and outermost offsets) and two
// lengths: the last kWindows windows (0.37 s, for a quick wake) and the
// last kLongWindows (0.8 s, for weak broadcasts;
// updated every other window), each against its own threshold; 25.0 means
// a broadcast. A long track is followed only when the short tracks show
// that it could come near a wake (see kLongGate).
//
// Scores depend only on the audio of the last kLongWindows windows, not on
// how it was split into blocks. Not thread safe.
#ifndef AUDIO_HOTSOUND_DETECTOR_H_
#define AUDIO_HOTSOUND_DETECTOR_H_

#include <complex>
#include <cstdint>
#include <memory>
#include <span>
#include <vector>

#include "audio/dsp/float4.h"
#include "audio/dsp/radix4_fft.h"

namespace audio_sorvane {

// The detector's configuration, as built from the input sample rate and the
// decimation step. The core uses the sample rate and the carrier frequency;
// the other values describe the original detector's fixed-point scales and
// hop and are carried unchanged.
struct HotsoundDetectorConfig {
  int32_t sample_rate = 44100;
  float frequency = 18496.0625f;  // Hz, the default DSSS carrier
  int64_t sample_rate_scale = 0;  // sample_rate * 2032
  int64_t time_scale = 12288000;
  int32_t min_hops_over_threshold = 1;
  int32_t num_detections_required = 1;
  int32_t flags = 0;
  int64_t hop_size = 256;
};

class HotsoundDetector {
 public:
  static constexpr float kThreshold = 25.0f;
  // Half the width of the band the detector needs around the carrier: the
  // code's main band (half the chip rate), the symbol tones and Doppler.
  static constexpr double kHalfBandwidth = 2000.0;
  static constexpr int kBasebandSize = 256;  // complex samples per window
  // Carrier offsets searched, in window bins (23 Hz): every half bin from
  // -2.5 to 2.5. A phone moving at 1 m/s shifts the carrier by 2.3 bins; a
  // carrier half a bin from every offset searched would lose 4 dB (a hand's
  // drift of 0.2 m/s did), a quarter of a bin loses 0.9 dB.
  static constexpr int kCarrierOffsets = 11;
  // Frames from one window to the next: four hops and a window fit in
  // 0.5 s, so every broadcast gives the short track four whole windows
  // within half a second of its start, wherever it starts in the hop. Each
  // window starts half a frame further into the code than the one before;
  // odd windows' lags are turned by half a frame to line up.
  static constexpr double kHopFrames = 2.5;
  static constexpr int kWindows = 4;    // windows a score adds up
  static constexpr int kLongWindows = 8;  // ... and the slower, finer one
  // Long tracks are followed only where they could reach this fraction of
  // the threshold: scores from kLongGate * kThreshold up are exact, lower
  // ones may leave the long tracks out.
  static constexpr float kLongGate = 0.8f;

  // Null when the configuration cannot make a detector: a bad rate or hop,
  // or a carrier band that does not fit below half the sample rate.
  static std::unique_ptr<HotsoundDetector> Create(const HotsoundDetectorConfig& config,
                                                  int step);
  // Whether a detector of the carrier `frequency` can run at `sample_rate`.
  static bool RateFits(double sample_rate, double frequency);

  // Decimates the block by the step (pair averages, which mix interleaved
  // stereo down to mono) and scores the windows it completes. The block is
  // read, not changed. Returns the highest score of those windows, or the
  // current score if the block completed none.
  float Process(std::span<const int16_t> samples);
  bool Detected(float score) const { return score > kThreshold; }

  // Picks the track steps of eight lags (x86 with AVX2 and FMA) or of four;
  // by default the widest the processor runs. Scores agree to rounding.
  // Returns false, changing nothing, if the processor lacks the wide one.
  bool UseWideSteps(bool wide);

  int step() const { return step_; }
  float score() const { return score_; }

 private:
  HotsoundDetector(const HotsoundDetectorConfig& config, int step);
  // Tracks over one kind of lag statistic: single lags, or sums over a
  // span of lags (a room's early reflections) at a coarser stride.
  struct Family {
    int lags = 0;    // statistics per window and carrier offset
    int stride = 1;  // lags from one statistic to the next
    int pool = 1;    // lags one statistic adds
    float threshold = 0.0f, long_threshold = 0.0f;  // raw track sums that score 1
    int row = 0;     // lags + cyclic padding
    std::vector<int> offsets;  // the carrier offsets it tracks (indices)
    std::vector<int> drift;    // per tracked offset: statistics the code moves per window
    // The last kLongWindows windows' statistics in units of the window's
    // mean lag power, one row (lags between kPad of padding) per offset.
    std::vector<std::vector<float>> ring;
    // Per window slot, the short track that ended there and its best sum;
    // the long track's best sum relative to its threshold when last updated
    // (0 when skipped).
    std::vector<std::vector<float>> short_tracks;
    std::vector<float> short_best;
    float long_score = 0.0f;
  };

  void ScoreWindow();
  // Mixes the window down into base_re_/base_im_; returns its power and
  // largest sample power.
  void MixDown(float* energy, float* peak);
  // Whitens the code band of a spectrum (natural bin order) and clips its
  // tones, into a centred spectrum.
  void Condition(const float* re, const float* im, float* out_re, float* out_im) const;
  // Sums of kSpreadLags consecutive powers every kSpreadStride lags.
  void PoolSpread(const float* powers, float* out);
  // Adds the window in `newest` to the family's tracks; returns the higher
  // of its short and long track sums' excess over noise, each relative to
  // its threshold's (1: on the air).
  float UpdateTracks(Family& f, int newest, bool update_long);
  // One step of a track: `to` = `from` moved by the drift and up to one
  // lag, plus the window's powers. Fills `from`'s cyclic padding. Returns
  // the lane-wise maximum of `to` when kTop (the last step), else zeros.
  template <bool kTop>
  audio_dsp::Float4 ExtendTrack(const Family& f, float* from, float* to, const float* powers,
                                int drift) const;

  HotsoundDetectorConfig config_;
  int step_;
  int window_size_ = 0;  // input samples one window reads
  int hop_samples_ = 0;
  int taps_ = 0;         // filter taps per baseband sample, a multiple of 8
  // The low-pass filter's taps_ coefficients, mixed down from the carrier
  // (real and imaginary parts); per baseband sample, the first input sample
  // it reads and the carrier's phase there.
  std::vector<float> tap_cos_, tap_sin_;
  std::vector<int> tap_start_;
  std::vector<float> rotation_re_, rotation_im_;
  // Spectra are kept centred on the carrier: entry kMaxShift + half_band_
  // + f holds bin f, for |f| <= half_band_ + kMaxShift (the bins the carrier
  // offsets read). conj(code spectrum) on bins -half_band_..half_band_ from
  // entry 0, zero-padded to product_size_ (a multiple of eight), and its
  // power.
  int half_band_ = 0;
  int product_size_ = 0;
  std::vector<float> code_re_, code_im_, code_power_;
  // The code spectrum with every odd entry negated: the lags it gives are
  // turned by half a frame.
  std::vector<float> turned_code_re_, turned_code_im_;
  audio_dsp::Radix4Fft fft_;
  bool wide_steps_;

  std::vector<float> window_;  // the current window's input so far
  int fill_ = 0;
  int skip_ = 0;               // input samples to drop before the next window
  // The window mixed down; its spectrum and the spectrum half a bin up.
  std::vector<float> base_re_, base_im_, spec_re_, spec_im_;
  // The two spectra conditioned and centred, and their powers.
  std::vector<float> whole_re_, whole_im_, half_re_, half_im_, whole_power_, half_power_;
  std::vector<float> half_turn_re_, half_turn_im_;  // exp(-i pi m / kBasebandSize)
  uint32_t windows_ = 0;  // windows scored (wraps harmlessly), for the long tracks' every other window
  Family families_[2];
  int ring_next_ = 0;          // the slot the next window goes to
  std::vector<float> pooled_;  // PoolSpread's partial sums
  // Scratch rows of a track being built (rows of the widest family).
  std::vector<float> track_a_, track_b_, track_c_;
  float score_ = 0.0f;
};

// The configuration from the integer input rate and the step (channels).
std::unique_ptr<HotsoundDetector> MakeHotsoundDetector(int sample_rate, int step);

}  // namespace audio_sorvane

#endif  // AUDIO_HOTSOUND_DETECTOR_H_
