// Tracks the strength of one tone at a decimated rate.
//
// Per input sample x, with an oscillator phase theta (table lookup, no trig
// calls): acc += x * exp(i theta). Every `decimation_factor` samples the
// block sum z goes through two one-pole complex low-pass stages
//   s1 += (z - s1) k,   s2 += (s1 - s2) k,
// which together are 3 dB down at the cutoff, and |s2|^2 is output. A steady
// tone at the filter frequency therefore settles at |block sum|^2; tones far
// beyond the cutoff decay towards 0. Block boundaries persist across calls.
//
// Not thread safe; the shared sine table is built once, thread-safely, on
// first use. A decimation factor below 1 or a null output ends the process
// through CHECK.
#ifndef AUDIO_SORVANE_DTMF_TONE_STRENGTH_FILTER_H_
#define AUDIO_SORVANE_DTMF_TONE_STRENGTH_FILTER_H_

#include <complex>
#include <cstdint>
#include <span>
#include <vector>

namespace audio_sorvane {

// 5120 entries sin(i * 2 pi / 4096): entry i is the sine and entry i + 1024
// the cosine of phase i * 2 pi / 4096, for i in 0 .. 4095. Lives for the
// whole process.
inline constexpr int kSineTableSteps = 4096;
const float* GetSineTable();

class ToneStrengthFilter {
 public:
  // `decimation_factor` >= 1 input samples per output; `sample_rate`,
  // `frequency` (the tone) and `cutoff_frequency` (of the smoother, at the
  // output rate sample_rate / decimation_factor) in Hz.
  ToneStrengthFilter(int decimation_factor, double sample_rate,
                     double frequency, double cutoff_frequency);

  // Clears the block sum and the smoother; the oscillator runs on.
  void Reset();

  // Replaces `output_samples` with one strength per block completed by
  // `input`.
  void ProcessSamples(std::span<const float> input,
                      std::vector<float>* output_samples);
  // As above, and when `block_sums` is given it is replaced with the raw
  // (unsmoothed) complex sum of every completed block, sum x * e^{j phase}:
  // the tone's complex amplitude at the output rate, for coherent receivers.
  void ProcessSamples(std::span<const float> input, std::vector<float>* output_samples,
                      std::vector<std::complex<float>>* block_sums);

  // The smoother's group delay at DC, in output samples.
  int delay() const { return delay_; }
  double sample_rate() const { return sample_rate_; }
  double frequency() const { return frequency_; }
  // Oscillator phase step per input sample, in 2^-32 turns.
  uint32_t phase_increment() const { return phase_increment_; }

 private:
  const float* table_;
  double sample_rate_;
  double frequency_;
  uint32_t phase_;
  uint32_t phase_increment_;
  std::complex<float> accumulator_;
  int decimation_factor_;
  int countdown_;
  float smoothing_gain_;
  int delay_;
  std::complex<float> state1_;
  std::complex<float> state2_;
};

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_DTMF_TONE_STRENGTH_FILTER_H_
