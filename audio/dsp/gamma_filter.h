// A cascade of `order` identical one-pole low-pass stages (a gamma filter):
// for each stage k, state[k] += (1 - pole) * (in_k - state[k]), where in_0 is
// the input and in_k the freshly updated state[k - 1]; the output is the last
// state. Its impulse response is a discrete gamma kernel, a smooth bump whose
// spread and delay follow from `order` and `pole` (see
// GammaFilterPoleFromStddev and GammaFilterDelay).
//
// Not thread safe (holds state). Construction with a non-positive sample rate
// or an order below 1 ends the process through CHECK.
#ifndef AUDIO_DSP_GAMMA_FILTER_H_
#define AUDIO_DSP_GAMMA_FILTER_H_

#include <cmath>
#include <vector>

#include "base/logging.h"

namespace audio_dsp {

class GammaFilter {
 public:
  // `sample_rate` in Hz (> 0), `order` >= 1 stages, `pole` in [0, 1).
  GammaFilter(int order, double sample_rate, double pole)
      : sample_rate_(sample_rate),
        order_(order),
        pole_(pole),
        gain_(static_cast<float>(1.0 - pole)),
        states_(order > 0 ? order : 0, 0.0f) {
    CHECK(sample_rate > 0.0);
    CHECK(order >= 1);
  }

  // Filters one sample and returns the output of the last stage.
  float ProcessSample(float x) {
    float in = x;
    for (float& state : states_) {
      state += gain_ * (in - state);
      in = state;
    }
    return in;
  }

  // Filters `num_samples` samples of `input` into `output` (the same
  // arithmetic as ProcessSample, with the stages held in registers for the
  // usual small orders). `output` may alias `input`.
  void ProcessBlock(const float* input, int num_samples, float* output) {
    switch (order_) {
      case 1: return ProcessBlockFixed<1>(input, num_samples, output);
      case 2: return ProcessBlockFixed<2>(input, num_samples, output);
      case 3: return ProcessBlockFixed<3>(input, num_samples, output);
      case 4: return ProcessBlockFixed<4>(input, num_samples, output);
      case 5: return ProcessBlockFixed<5>(input, num_samples, output);
      case 6: return ProcessBlockFixed<6>(input, num_samples, output);
      default:
        for (int i = 0; i < num_samples; ++i) output[i] = ProcessSample(input[i]);
    }
  }

  // Zeroes every stage.
  void Reset() { states_.assign(states_.size(), 0.0f); }
  // Sets every stage to `value`, as if that value had been the input forever.
  void SetState(float value) { states_.assign(states_.size(), value); }

  double sample_rate() const { return sample_rate_; }
  int order() const { return order_; }
  double pole() const { return pole_; }
  float gain() const { return gain_; }

 private:
  template <int kOrder>
  void ProcessBlockFixed(const float* input, int num_samples, float* output) {
    float states[kOrder];
    for (int k = 0; k < kOrder; ++k) states[k] = states_[k];
    const float gain = gain_;
    for (int i = 0; i < num_samples; ++i) {
      float in = input[i];
      for (int k = 0; k < kOrder; ++k) {
        states[k] += gain * (in - states[k]);
        in = states[k];
      }
      output[i] = in;
    }
    for (int k = 0; k < kOrder; ++k) states_[k] = states[k];
  }

  double sample_rate_;
  int order_;
  double pole_;
  float gain_;
  std::vector<float> states_;
};

// The pole that gives an `order`-stage gamma filter an impulse response with
// standard deviation `stddev_samples`: with v = stddev^2 / order,
// pole = (1 - sqrt(4 v + 1)) / (2 v) + 1. Requires stddev > 0 and order >= 1.
inline double GammaFilterPoleFromStddev(double stddev_samples, int order) {
  CHECK(stddev_samples > 0.0);
  CHECK(order >= 1);
  const double v = stddev_samples * stddev_samples / order;
  return (1.0 - std::sqrt(4.0 * v + 1.0)) / (2.0 * v) + 1.0;
}

// The filter's delay in samples (the mean of its impulse response, rounded):
// round(order * pole / (1 - pole)).
inline int GammaFilterDelay(int order, double pole) {
  return static_cast<int>(std::lround(order * pole / (1.0 - pole)));
}

}  // namespace audio_dsp

#endif  // AUDIO_DSP_GAMMA_FILTER_H_
