// Streaming sample-rate conversion.
//
// A ResamplingKernel is the continuous-time interpolation filter, evaluated
// at offsets measured in input samples. DefaultResamplingKernel is a
// Kaiser-windowed sinc (beta 6) with cutoff 0.45 * min(input, output rate),
// reaching 5 output samples each way (wider when decimating).
//
// Resampler<T> is the streaming interface: ProcessSamples may be called with
// blocks of any size, and the concatenated outputs do not depend on how the
// stream was split. Implementations report unusable configurations through
// Valid(), which callers check right after construction.
#ifndef AUDIO_DSP_RESAMPLER_H_
#define AUDIO_DSP_RESAMPLER_H_

#include <span>
#include <vector>

namespace audio_dsp {

class ResamplingKernel {
 public:
  virtual ~ResamplingKernel() = default;
  // The kernel's value at an offset of `x` input samples.
  virtual double Eval(double x) const = 0;
  virtual bool Valid() const = 0;

  double input_sample_rate() const { return input_sample_rate_; }
  double output_sample_rate() const { return output_sample_rate_; }
  // Input samples beyond which the kernel is zero.
  double radius() const { return radius_; }

 protected:
  ResamplingKernel(double input_sample_rate, double output_sample_rate,
                   double radius)
      : input_sample_rate_(input_sample_rate),
        output_sample_rate_(output_sample_rate),
        radius_(radius) {}

  double input_sample_rate_;
  double output_sample_rate_;
  double radius_;
};

// Eval(x) = normalized_cutoff * sinc(pi * normalized_cutoff * x) * kaiser(x),
// normalized_cutoff = 2 * cutoff / input rate, so that the kernel sums to
// about 1 over integer offsets (unit gain at DC).
class DefaultResamplingKernel : public ResamplingKernel {
 public:
  // Rates in Hz; both must be positive for a valid kernel.
  DefaultResamplingKernel(double input_sample_rate, double output_sample_rate);

  double Eval(double x) const override;
  bool Valid() const override { return valid_; }

 private:
  bool valid_ = false;
  double normalized_cutoff_ = 0.0;
  double sinc_scale_ = 0.0;
  double kaiser_beta_ = 0.0;
  double kaiser_norm_ = 1.0;
};

// The modified Bessel function of the first kind of order 0, in double.
double BesselI0(double z);

template <typename T>
class Resampler {
 public:
  virtual ~Resampler() = default;
  // Returns to the state right after construction.
  virtual void Reset() = 0;
  virtual bool Valid() const = 0;
  // Consumes `input` and replaces `output` with the samples it completes.
  virtual void ProcessSamples(std::span<const T> input,
                              std::vector<T>* output) = 0;
  // Replaces `output` with the samples still held back (as if the stream
  // were followed by silence). Does not reset.
  virtual void Flush(std::vector<T>* output) = 0;
};

}  // namespace audio_dsp

#endif  // AUDIO_DSP_RESAMPLER_H_
