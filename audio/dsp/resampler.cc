#include "audio/dsp/resampler.h"

#include <algorithm>
#include <cmath>
#include <numbers>

namespace audio_dsp {
namespace {

constexpr double kEpsilon = 2.220446049250313e-16;

double Sinc(double y) { return std::fabs(y) <= 1e-12 ? 1.0 : std::sin(y) / y; }

}  // namespace

double BesselI0(double z) {
  z = std::fabs(z);
  if (z < 21.0) {
    // Power series: sum (z^2/4)^k / (k!)^2.
    const double quarter_z2 = z * z / 4.0;
    double sum = 1.0;
    double term = 1.0;
    for (int k = 1; k < 40; ++k) {
      term *= quarter_z2 / (static_cast<double>(k) * k);
      if (term < sum * kEpsilon) break;
      sum += term;
    }
    return sum;
  }
  // Asymptotic series: e^z / sqrt(2 pi z) * (1 + sum t_k).
  double sum = 1.0;
  double term = 1.0;
  for (int k = 1; k < 40; ++k) {
    term *= (2.0 * k - 1.0) * (2.0 * k - 1.0) / (8.0 * k * z);
    if (std::fabs(term) < sum * kEpsilon) break;
    sum += term;
  }
  return std::exp(z) / std::sqrt(2.0 * std::numbers::pi * z) * sum;
}

DefaultResamplingKernel::DefaultResamplingKernel(double input_sample_rate,
                                                 double output_sample_rate)
    : ResamplingKernel(input_sample_rate, output_sample_rate,
                       input_sample_rate <= output_sample_rate
                           ? 5.0
                           : 5.0 * input_sample_rate / output_sample_rate) {
  const double cutoff = 0.45 * std::min(input_sample_rate, output_sample_rate);
  const double beta = 6.0;
  // Written so that NaN rates fail too.
  if (!(input_sample_rate > 0.0 && output_sample_rate > 0.0 && cutoff > 0.0 &&
        radius_ > 0.0 && beta > 0.0 && cutoff <= input_sample_rate * 0.5)) {
    return;
  }
  kaiser_beta_ = beta;
  normalized_cutoff_ = 2.0 * cutoff / input_sample_rate;
  sinc_scale_ = std::numbers::pi * normalized_cutoff_;
  kaiser_norm_ = BesselI0(kaiser_beta_);
  valid_ = true;
}

double DefaultResamplingKernel::Eval(double x) const {
  const double u = std::fabs(x) / radius_;
  double window;
  if (u < 1e-12) {
    window = 1.0;
  } else if (u > 1.000000000001) {
    window = 0.0;
  } else {
    window = BesselI0(kaiser_beta_ * std::sqrt(std::max(0.0, 1.0 - u * u))) /
             kaiser_norm_;
  }
  return normalized_cutoff_ * Sinc(sinc_scale_ * x) * window;
}

}  // namespace audio_dsp
