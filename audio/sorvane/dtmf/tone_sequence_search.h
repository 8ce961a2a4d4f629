// Finds which tones a looped multi-tone broadcast sounds at each position of
// its loop from coherent per-frame tone amplitudes heard in a reverberant
// room.
//
// Every frame's tones start at phase 0 under the same window, so a static
// room seen through a per-frame complex matched filter is a fixed linear
// filter in frame steps. For tone k and frame n:
//
//   y_k(n) = sum_{j=0}^{T-1} h_k[j] * a_k(n - j) + noise,
//
// where a_k(n) is 1 when frame n sounds tone k and h_k holds T complex room
// taps (the direct frame and its tail). A looped token makes a_k periodic:
// a_k(n) = bit (n mod period) of a mask. For every tone and every mask the
// taps are fitted by least squares and the residual energy kept; the
// search then picks one mask per tone, minimising the summed residual
// subject to every loop position sounding exactly tones_per_symbol tones
// (dynamic programming over the per-position tone counts, each tone
// restricted to its best few masks and the empty one).
//
// Not thread safe (scratch is reused). Parameters the search cannot handle
// (see Supported) end the process through CHECK.
#ifndef AUDIO_SORVANE_DTMF_TONE_SEQUENCE_SEARCH_H_
#define AUDIO_SORVANE_DTMF_TONE_SEQUENCE_SEARCH_H_

#include <complex>
#include <cstdint>
#include <vector>

#include "audio/dsp/eigen_types.h"

namespace audio_sorvane {

struct ToneSequenceSearchParams {
  int num_tones = 10;        // 1 .. 32
  int period = 9;            // frames per loop, 2 .. kMaxPeriod
  int tones_per_symbol = 2;  // 1 .. num_tones
  // Room taps per tone, in frames (1 .. period). Six frames (0.3 s) hold
  // most of the energy of rooms up to an RT60 of about 1 s.
  int num_taps = 6;
  // Masks per tone the combination step considers, besides the empty one.
  // The true mask nearly always ranks first or second.
  int masks_per_tone = 8;
};

class ToneSequenceSearch {
 public:
  static constexpr int kMaxPeriod = 12;
  static constexpr int kMaxTaps = 12;
  static constexpr int kMaxStates = 1 << 20;

  // True when these parameters fit the search's limits (period, taps and
  // the number of count states (tones_per_symbol + 1)^period).
  static bool Supported(const ToneSequenceSearchParams& params);

  explicit ToneSequenceSearch(const ToneSequenceSearchParams& params);

  // `frames`: F x num_tones complex matched-filter outputs, frame n at loop
  // position n % period. Fills `tone_masks` (one per tone, bit p set when
  // the tone sounds at position p) and `cost` (summed residual energy).
  // False when no assignment satisfies the counts (or F < period).
  bool Search(const audio_dsp::ComplexMatrix& frames, std::vector<uint32_t>* tone_masks,
              double* cost);

  // Residual energy of tone k under mask m from the last Search.
  double residual(int tone, uint32_t mask) const {
    return residuals_[static_cast<size_t>(tone) * num_masks_ + mask];
  }
  const ToneSequenceSearchParams& params() const { return params_; }

 private:
  // Cholesky factors of the normal matrices of every mask for F frames.
  void FactorNormalMatrices(int num_frames);
  void FitResiduals(const audio_dsp::ComplexMatrix& frames);
  bool Combine(std::vector<uint32_t>* tone_masks, double* cost);

  ToneSequenceSearchParams params_;
  int num_masks_;
  int num_states_;
  int factored_frames_ = -1;
  std::vector<double> factors_;       // num_masks_ x T x T, lower triangles
  std::vector<double> residuals_;     // num_tones x num_masks_
  std::vector<uint32_t> full_;        // per state: positions already at the count
  std::vector<int> state_step_;       // per position: its weight in a state index
  std::vector<std::complex<double>> sums_, fits_;  // scratch
  std::vector<double> cost_, next_cost_;
  std::vector<int8_t> choice_;        // num_tones x num_states_
  std::vector<int> active_, next_active_;
  std::vector<uint32_t> candidates_;  // num_tones x (masks_per_tone + 1)
};

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_DTMF_TONE_SEQUENCE_SEARCH_H_
