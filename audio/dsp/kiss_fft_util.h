// Spectral filtering and resampling of whole signals with the FFT
// transformers. Input and output may be the same vector. Argument faults end
// the process through CHECK.
#ifndef AUDIO_DSP_KISS_FFT_UTIL_H_
#define AUDIO_DSP_KISS_FFT_UTIL_H_

#include <complex>
#include <span>
#include <vector>

namespace audio_dsp {

// Keeps the bins of a real signal's spectrum whose frequency k * bin_width
// lies in [low_band_edge, high_band_edge] (edges included) and zeroes the
// rest. Frequencies in Hz (or any unit shared with bin_width).
void SpectralBandPassFilter(std::span<const std::complex<float>> input_spectrum,
                            std::vector<std::complex<float>>* output_spectrum,
                            float low_band_edge, float high_band_edge,
                            float bin_width);

// An ideal (brick-wall, circular) band-pass of a real signal: real FFT of the
// whole signal, SpectralBandPassFilter with bin width sample_rate / N, inverse.
void BandPassFilter(std::span<const float> input, std::vector<float>* output,
                    float low_band_edge, float high_band_edge,
                    float sample_rate);

// BandPassFilter from `cutoff` up to half the sample rate.
void HighPassFilter(std::span<const float> input, std::vector<float>* output,
                    float cutoff, float sample_rate);

// Resamples a whole signal, taken as one period of a periodic signal, by
// zero-padding or truncating its spectrum: L input samples become
// round(output_sample_rate / input_sample_rate * L) output samples. When the
// lengths agree the input is copied unchanged.
void FftResample(std::span<const float> input, std::vector<float>* output,
                 float input_sample_rate, float output_sample_rate);

}  // namespace audio_dsp

#endif  // AUDIO_DSP_KISS_FFT_UTIL_H_
