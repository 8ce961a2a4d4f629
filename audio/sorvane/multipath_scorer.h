// Symbol scores of DSSS frames gathered over a room's multipath.
//
// In a room most of the energy that reaches a microphone a few metres away
// arrives after the direct path: reflections and a diffuse tail spread each
// frame over tens of milliseconds of lags, and scoring symbols at one lag
// throws that energy away. This scorer follows one transmission as a track:
// a frame grid (an anchor frame start and the frame period) and a Doppler
// offset, searched once per track. For every frame on the grid it estimates
// the channel as the code correlation over a window of lags (from `lead`
// before to `span` after the frame start), averaged over the frame and its
// neighbours, and combines the lags by that estimate before scoring the
// symbol tones (a rake with maximal-ratio weights). A lag whose estimate
// does not stand out of its frame-to-frame scatter gets no weight, so in a
// dry, noisy channel the scorer reduces to scoring at the strongest lag.
//
// Positions are absolute stream indices of the decoder's complex baseband
// (real and imaginary parts); the caller passes the buffered span together
// with the absolute index of its first sample. Doppler offsets are in
// carrier cycles per frame. Not thread safe: it keeps FFT scratch and
// per-frame caches. Out-of-buffer reads and bad parameters end the process
// through CHECK.
#ifndef AUDIO_SORVANE_MULTIPATH_SCORER_H_
#define AUDIO_SORVANE_MULTIPATH_SCORER_H_

#include <complex>
#include <cstdint>
#include <map>
#include <span>
#include <utility>
#include <vector>

#include "audio/dsp/eigen_types.h"
#include "audio/dsp/radix4_fft.h"
#include "audio/sorvane/symbol_wave_coder.h"

namespace audio_sorvane {

struct MultipathScorerParams {
  int lead = 100;              // lags before the frame start, baseband samples (>= 0)
  int span = 235;              // lags after it (>= 0)
  int channel_frames = 4;      // neighbours on each side averaged into the channel (>= 0)
  float gate = 10.0f;          // a lag counts when its power exceeds gate x its scatter
  float max_doppler = 2.35f;   // searched on each side of 0, cycles per frame (>= 0)
  float doppler_step = 0.15f;  // finest Doppler step, cycles per frame (> 0)
  int doppler_frames = 4;      // frames whose powers the Doppler search sums (>= 1)
  // Transforms that hold a frame's lag window whole, the reference path;
  // otherwise one half that size when the window overhangs it by at most an
  // eighth, the overhang added directly. The two agree to float rounding
  // (scores within a relative 1e-4).
  bool whole_window_transform = false;
};

// A view of the buffered baseband: samples real[i] + j imag[i] have the
// absolute stream index origin + i.
struct BasebandView {
  std::span<const float> real;
  std::span<const float> imag;
  int64_t origin = 0;
};

class MultipathScorer {
 public:
  // `coder` must outlive the scorer (its tone matrix is read, not copied).
  MultipathScorer(const SymbolWaveCoder& coder, const MultipathScorerParams& params);

  // True when the lag window of a frame starting at absolute index `start`
  // lies in the view.
  bool HasWindow(const BasebandView& view, int64_t start) const;

  // The Doppler offset that gathers the most peaky multipath energy over up
  // to doppler_frames frames from `start` on (whose own window must be in
  // the view).
  float SearchDoppler(const BasebandView& view, int64_t start);


  // Follows a new transmission: frame k starts at anchor + round(k * period)
  // with the period that `doppler` implies. Forgets every cached frame.
  void StartTrack(int64_t anchor, float doppler);
  // Forgets the track and every cached frame.
  void Reset();
  bool has_track() const { return has_track_; }
  int transform_size() const { return fft_.GetSize(); }
  float doppler() const { return doppler_; }
  double period() const { return period_; }
  int64_t FrameStart(int64_t k) const;
  // The grid index nearest to absolute index `start`.
  int64_t NearestFrame(int64_t start) const;

  // Scores of every symbol for grid frame k. False when its window, or the
  // window of any later neighbour, is not in the view yet (the score would
  // change with more audio). Frames are cached, so each is scored once.
  bool Score(const BasebandView& view, int64_t k, audio_dsp::FloatVector* scores);

  // Sets aside storage for `count` frames (their scores) and the profiles
  // of a few channel estimates, so that streaming a buffer of that many
  // frames allocates nothing once warm.
  void ReserveFrames(int count);

  // Drops what is cached for frames before grid index k.
  void ForgetBefore(int64_t k);

  // The frame period (baseband samples) of a sender whose carrier is
  // shifted by `doppler` cycles per frame: motion scales time as it scales
  // frequency.
  double Period(float doppler) const;

 private:
  struct Frame {
    std::vector<std::complex<float>> profile;  // code correlation per lag
    std::vector<std::complex<float>> window;    // derotated, until scored
    std::vector<std::complex<float>> spectrum;  // the window's, until scored
    bool scored = false;
    audio_dsp::FloatVector scores;
  };
  // spectrum_ = the spectrum of the window of a frame starting at `start`,
  // derotated by the offset of rotation_ (its first transform-size samples,
  // zero-padded when fewer).
  void WindowSpectrum(const BasebandView& view, int64_t start);
  // The transform of the first transform-size values of `window`,
  // zero-padded.
  void Spectrum(const std::vector<std::complex<float>>& window, std::complex<float>* spectrum);
  // Completes the code correlation `profile` (lags_ values) of derotated_
  // computed cyclically from a spectrum shifted by `shift` bins, when the
  // window overhangs the transform.
  void AddCodeOverhang(int shift, std::complex<float>* profile);
  // Fills the profile of the frame at `start` from the view: the baseband
  // derotated by the offset of rotation_, correlated with the code.
  void Transform(const BasebandView& view, int64_t start, Frame* frame);
  Frame& CachedFrame(const BasebandView& view, int64_t k);
  // The frame at grid index k, added (from a spare node) when absent.
  Frame& FrameAt(int64_t k);
  // Writes the window of a frame starting at `start`, derotated by the
  // Doppler offset of rotation_ with phase zero at stream index 0, to
  // derotated_.
  void Derotate(const BasebandView& view, int64_t start);
  // Fills rotation_ for a Doppler offset.
  void SetRotation(float doppler);
  // combined_[i] = sum_m conj(weights_[m]) x[i + m], i < frame size, where x
  // is a frame's derotated window; its spectrum is filled in when empty and
  // needed.
  void Combine(const std::vector<std::complex<float>>& window,
               std::vector<std::complex<float>>* spectrum);
  // The channel is sounded (its lag profile computed) on every other frame
  // of the grid: it changes far more slowly than a frame, and the profiles
  // are most of the cost.
  static constexpr int kSoundingInterval = 2;
  static bool Sounded(int64_t k);

  MultipathScorerParams params_;
  int frame_size_;
  int lags_;
  int window_;
  float carrier_cycles_per_frame_;
  bool use_quadrature_;
  std::vector<float> code_;
  const audio_dsp::FloatMatrix& tones_;  // the coder's, which outlives the scorer
  audio_dsp::PowerOfTwoFft fft_;
  std::vector<std::complex<float>> code_spectrum_;  // conjugated

  bool has_track_ = false;
  int64_t anchor_ = 0;
  float doppler_ = 0.0f;
  double period_ = 0.0;
  std::map<int64_t, Frame> frames_;  // by grid index
  // Storage of forgotten frames, reused for new ones.
  std::vector<std::map<int64_t, Frame>::node_type> spare_frames_;
  std::vector<std::vector<std::complex<float>>> profile_pool_;
  std::vector<std::vector<std::complex<float>>> window_pool_;
  std::vector<std::vector<std::complex<float>>> spectrum_pool_;

  // Scratch.
  std::vector<std::complex<float>> buffer_;     // transform-size
  std::vector<std::complex<float>> derotated_;  // the window last derotated
  // When the window overhangs the transform: its last samples less its
  // first ones, and exp(-2 pi j q / transform size).
  std::vector<std::complex<float>> overhang_;
  std::vector<std::complex<float>> turns_;
  std::vector<std::complex<float>> spectrum_;
  std::vector<std::complex<float>> channel_;
  std::vector<std::complex<float>> reference_;
  std::vector<std::complex<float>> weights_;
  std::vector<std::complex<float>> combined_;
  std::vector<double> power_;
  float rotation_doppler_ = 0.0f;
  std::vector<std::complex<float>> rotation_;  // exp(-2 pi j doppler i / frame size)
  std::vector<std::pair<const std::complex<float>*, std::complex<float>>> neighbours_;
  Frame search_frame_;
  std::vector<double> search_powers_;  // lag powers per coarse Doppler offset
  audio_dsp::FloatVector real_part_;
};

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_MULTIPATH_SCORER_H_
