// Design of the complex FIR low-pass that smooths a receiver's baseband.
//
// DesignLowpassTaps: complex FIR taps (num_taps, odd counts centred on 0) of
// a one-sided low-pass: gain 1 from -cutoff up to cutoff + 0.5 /
// oversampling, a quarter-cosine roll-off up to half the rate, nothing below
// -cutoff. Frequencies are normalised to the sample rate. Sampled on 1024
// bins, transformed by the inverse FFT (normalised, so the DC gain is about
// 1) and cosine-windowed.
//
// Stateless and thread safe. num_taps < 1 ends the process through CHECK.
#ifndef AUDIO_DSP_LOWPASS_DESIGN_H_
#define AUDIO_DSP_LOWPASS_DESIGN_H_

#include <complex>
#include <vector>

namespace audio_dsp {

// An even `num_taps` gives num_taps - 1 taps (the count is kept odd).
std::vector<std::complex<float>> DesignLowpassTaps(int num_taps, float cutoff,
                                                   float oversampling);

}  // namespace audio_dsp

#endif  // AUDIO_DSP_LOWPASS_DESIGN_H_
