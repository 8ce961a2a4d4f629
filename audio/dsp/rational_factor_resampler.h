// Polyphase FIR resampling by a rational factor.
//
// The rate ratio input/output is approximated by a/b (denominator at most
// max_denominator). Output k is the kernel-weighted sum of the input around
// input time k * a / b: with r = ceil(kernel radius), each output is a dot
// product of 2r + 1 taps from one of b precomputed phase filters,
//   tap m of phase p = kernel(r - m + p / b).
// The stream starts with r zero samples, so the first output is centred on
// the first input sample (no delay). Blocks of any size give the same output
// sequence; Flush drains the last r samples held back.
//
// One instance per stream, not thread safe. Invalid kernels or
// max_denominator < 1 give a resampler whose Valid() is false and which must
// not be used.
#ifndef AUDIO_DSP_RATIONAL_FACTOR_RESAMPLER_H_
#define AUDIO_DSP_RATIONAL_FACTOR_RESAMPLER_H_

#include <complex>
#include <span>
#include <vector>

#include "audio/dsp/resampler.h"

namespace audio_dsp {

// The max_denominator the receivers and the simulator use: the exact ratios
// between the usual audio rates and the baseband rates fit (48000 Hz to
// 14700 Hz is 160/49), and the phase filters stay at most 2000.
inline constexpr int kDefaultMaxDenominator = 2000;

template <typename T>
class RationalFactorResampler : public Resampler<T> {
 public:
  RationalFactorResampler(const ResamplingKernel& kernel, int max_denominator);

  void Reset() override;
  bool Valid() const override { return valid_; }
  void ProcessSamples(std::span<const T> input, std::vector<T>* output) override;
  void Flush(std::vector<T>* output) override;

  int factor_numerator() const { return factor_numerator_; }
  int factor_denominator() const { return factor_denominator_; }
  int num_taps() const { return num_taps_; }
  const std::vector<std::vector<float>>& filters() const { return filters_; }

 private:
  bool valid_ = false;
  int factor_numerator_ = 1;    // a
  int factor_denominator_ = 1;  // b
  int integer_step_ = 1;        // a / b
  int fractional_step_ = 0;     // a % b
  int radius_ = 0;
  int num_taps_ = 1;
  std::vector<std::vector<float>> filters_;
  // For complex samples, the filters with each tap written twice (one per
  // part), as the inner loop reads them.
  std::vector<std::vector<float>> dot_filters_;
  // Input not yet consumed, starting at the next output's first tap: the
  // first held_ values.
  std::vector<T> delayed_input_;
  int64_t held_ = 0;
  int phase_ = 0;
};

extern template class RationalFactorResampler<float>;
extern template class RationalFactorResampler<std::complex<float>>;

}  // namespace audio_dsp

#endif  // AUDIO_DSP_RATIONAL_FACTOR_RESAMPLER_H_
