// Running maximum over a window of `window_size` samples:
//   output[j] = max of input[i] for i in [j + ahead - window_size + 1, j + ahead]
// clipped to the signal, with ahead = (window_size - 1) / 2 (centred for odd
// sizes). Block prefix and suffix maxima make the cost linear in the length,
// independent of the window size (see the .cc).
//
// Stateless and thread-compatible. A negative length, a window below 1, or a
// null pointer with a non-empty signal ends the process through CHECK.
#ifndef AUDIO_DSP_MAX_FILTER_H_
#define AUDIO_DSP_MAX_FILTER_H_

namespace audio_dsp {

// `input` and `output` hold `num_samples` floats; they may be the same array.
void MaxFilter(const float* input, int num_samples, int window_size,
               float* output);
// As above without allocating: `scratch` holds 2 * num_samples floats.
void MaxFilter(const float* input, int num_samples, int window_size,
               float* output, float* scratch);

}  // namespace audio_dsp

#endif  // AUDIO_DSP_MAX_FILTER_H_
