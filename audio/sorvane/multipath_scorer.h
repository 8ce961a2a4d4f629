// Symbol scores of DSSS frames gathered over a room's multipath.
//
// In a room most of the energy that reaches the microphone arrives after
// the direct path: reflections and a diffuse tail spread each frame over
// tens of milliseconds of lags. This scorer estimates the channel of every
// frame as its code correlation over a window of lags (from `lead` before
// to `span` after the frame start), averaged over the frame and its
// neighbours, and combines the lags by that estimate before scoring the
// symbol tones (a rake with maximal-ratio weights). Lags whose estimate does
// not stand out of its frame-to-frame scatter get no weight, so that in a
// quiet, dry channel the scorer reduces to scoring at the strongest lag.
//
// Inputs are the decoder's complex baseband (real and imaginary parts);
// frame starts are indices into them. Doppler offsets are in carrier cycles
// per frame. Not thread safe: it keeps FFT scratch. Size mismatches end the
// process through CHECK.
#ifndef AUDIO_SORVANE_MULTIPATH_SCORER_H_
#define AUDIO_SORVANE_MULTIPATH_SCORER_H_

#include <complex>
#include <memory>
#include <span>
#include <vector>

#include "audio/dsp/eigen_types.h"
#include "audio/dsp/kiss_fft.h"
#include "audio/sorvane/symbol_wave_coder.h"

namespace audio_sorvane {

struct MultipathScorerParams {
  int lead = 147;            // lags before the frame start, baseband samples
  int span = 294;            // lags after it
  int channel_frames = 2;    // neighbours on each side averaged into the channel
  float gate = 3.0f;         // a lag counts when its power exceeds gate x its scatter
  float max_doppler = 2.35f;     // cycles per frame searched on each side of 0
  float doppler_step = 0.15f;    // finest Doppler step, cycles per frame
  int doppler_frames = 4;        // frames integrated coherently by the Doppler search
};

class MultipathScorer {
 public:
  MultipathScorer(const SymbolWaveCoder& coder, const MultipathScorerParams& params);

  // True when the lag window of the frame starting at `t` lies within a
  // buffer of `size` samples.
  bool HasWindow(int t, int size) const {
    return t - params_.lead >= 0 && t + frame_size_ + params_.span <= size;
  }

  // The Doppler offset that gathers the most peaky multipath energy over
  // up to doppler_frames frames from `t` on (at least the frame at t must
  // have its window). `origin` is t's absolute stream index, which fixes
  // the phase reference.
  float EstimateDoppler(std::span<const float> real, std::span<const float> imag, int t,
                        int64_t origin);

  // Scores of every symbol for the frame at `t` (absolute index `origin`),
  // its neighbours at t + round(j * period). False when its own window is
  // not in the buffer. `complete` tells whether every later neighbour was
  // available (the score will not change with more audio).
  bool Score(std::span<const float> real, std::span<const float> imag, int t, int64_t origin,
             double period, float doppler, audio_dsp::FloatVector* scores, bool* complete);

  // The frame period (baseband samples) of a sender whose carrier is
  // shifted by `doppler` cycles per frame: motion scales time as it scales
  // frequency.
  double Period(float doppler) const;

 private:
  // The code correlation over the lag window of the frame at t, the
  // baseband derotated by `doppler` with phase zero at absolute index
  // `phase_origin`. Keeps the window's spectrum in spectrum_ when asked.
  void Profile(std::span<const float> real, std::span<const float> imag, int t,
               int64_t absolute, float doppler, bool keep_spectrum,
               std::vector<std::complex<float>>* profile);

  MultipathScorerParams params_;
  int frame_size_;
  int lags_;
  float carrier_cycles_per_frame_;
  bool use_quadrature_;
  std::vector<float> code_;
  audio_dsp::FloatMatrix tones_;
  audio_dsp::ComplexFFTTransformer fft_;
  std::vector<std::complex<float>> code_spectrum_;  // conjugated
  // Scratch.
  std::vector<std::complex<float>> buffer_;
  std::vector<std::complex<float>> spectrum_;
  std::vector<std::vector<std::complex<float>>> profiles_;
  std::vector<std::complex<float>> channel_;
  audio_dsp::FloatVector real_part_;
};

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_MULTIPATH_SCORER_H_
