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
// ProcessSamples (the fast path) forms each block sum as
//   z = e^{i theta_start} * sum_n x[n] e^{i n omega}
// from per-filter tables of cos / sin(n omega), n < decimation_factor, and one
// rotation by the exact oscillator phase at the block start.
// ProcessSamplesReference is the direct form, a sine-table
// lookup per sample whose phase is quantised to 4096 steps. The two differ
// only by that quantisation (at most pi / 4096 rad per sample) and float
// rounding: block sums agree within 1e-3 * sum |x| over the block, strengths
// correspondingly (see tone_strength_filter_test.cc). A filter's partial
// block is held in a path-specific form: use one path per filter between
// Resets.
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

  // The direct per-sample form (see above).
  void ProcessSamplesReference(std::span<const float> input, std::vector<float>* output_samples,
                               std::vector<std::complex<float>>* block_sums = nullptr);

  // The smoother's group delay at DC, in output samples.
  int delay() const { return delay_; }
  double sample_rate() const { return sample_rate_; }
  double frequency() const { return frequency_; }
  // Oscillator phase step per input sample, in 2^-32 turns.
  uint32_t phase_increment() const { return phase_increment_; }
  int decimation_factor() const { return decimation_factor_; }
  float smoothing_gain() const { return smoothing_gain_; }

 private:
  // Empties the outputs (block_sums may be null) and reserves room for the
  // outputs of `input_size` samples. A null output_samples is fatal.
  void PrepareOutputs(size_t input_size, std::vector<float>* output_samples,
                      std::vector<std::complex<float>>* block_sums) const;
  friend class ToneFilterBank;

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
  // Fast path: cos / sin(n omega) for n < decimation_factor_.
  std::vector<float> block_cos_, block_sin_;
};

// e^{i 2 pi phase / 2^32} from the sine table and a short series for the
// phase below one table step (error below 1e-7).
std::complex<float> PhaseRotation(uint32_t phase);

// One ToneStrengthFilter per tone, all fed the same input: the fast path
// computes the block sums of every tone together as one small matrix
// product per block (block samples times a decimation x tones table of
// cos / sin), four tones per vector, then one rotation and the smoothers
// per tone, also four at a time. `reference` = true runs every tone's
// ProcessSamplesReference instead (for tests). Allocation-free after
// construction. Tolerance between the paths: as for ToneStrengthFilter.
class ToneFilterBank {
 public:
  ToneFilterBank(int decimation_factor, double sample_rate, const std::vector<float>& frequencies,
                 double cutoff_frequency, bool reference = false);

  void Reset();
  int num_tones() const { return num_tones_; }
  const ToneStrengthFilter& filter(int tone) const { return filters_[tone]; }
  // Outputs that `num_samples` more input samples can complete, at most.
  int MaxOutputs(int num_samples) const { return num_samples / decimation_factor_ + 1; }
  // Feeds `input` to every tone; tone t's strengths go to strengths[t][0..]
  // and, when block_sums is not null, its raw block sums to block_sums[t]
  // (each array holding MaxOutputs(input.size()) entries). Returns the number
  // of outputs per tone.
  int ProcessSamples(std::span<const float> input, float* const* strengths,
                     std::complex<float>* const* block_sums);

 private:
  int num_tones_;
  int num_vectors_;  // ceil(num_tones_ / 4)
  int decimation_factor_;
  bool reference_;
  std::vector<ToneStrengthFilter> filters_;
  // Fast path state, tones in lanes (padded to num_vectors_ * 4).
  std::vector<float> cos_table_, sin_table_;  // [n][lane]
  std::vector<float> acc_re_, acc_im_, s1_re_, s1_im_, s2_re_, s2_im_;
  std::vector<uint32_t> block_phase_;  // oscillator phase at the block start
  std::vector<uint32_t> block_step_;   // decimation_factor * increment
  // The rotation e^{i 2 pi block_phase / 2^32}, advanced by complex
  // multiplication with step_re_/im_ and recomputed exactly from
  // block_phase_ every kExactEvery blocks (so it drifts by at most ~1e-6).
  static constexpr int kExactEvery = 32;
  std::vector<float> rot_re_, rot_im_, step_re_, step_im_;
  int64_t blocks_done_ = 0;
  int countdown_;
  // Reference path scratch.
  std::vector<float> ref_strengths_;
  std::vector<std::complex<float>> ref_sums_;
};

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_DTMF_TONE_STRENGTH_FILTER_H_
