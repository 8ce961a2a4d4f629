#include "audio/sorvane/multipath_scorer.h"

#include <algorithm>
#include <cmath>
#include <numbers>

#include "base/logging.h"

namespace audio_sorvane {
namespace {

int FastSizeAtLeast(int n) {
  while (!audio_dsp::IsFastFFTSize(n)) ++n;
  return n;
}

}  // namespace

MultipathScorer::MultipathScorer(const SymbolWaveCoder& coder,
                                 const MultipathScorerParams& params)
    : params_(params),
      frame_size_(coder.samples_per_frame() / coder.params().baseband_decimation_factor),
      lags_(params.lead + params.span + 1),
      carrier_cycles_per_frame_(static_cast<float>(coder.carrier_cycles_per_frame())),
      use_quadrature_(coder.params().use_quadrature),
      code_(coder.baseband_code()),
      tones_(coder.baseband_tones()),
      fft_(FastSizeAtLeast(frame_size_ + params.lead + params.span), /*normalize_inverse=*/true) {
  CHECK(params_.lead >= 0);
  CHECK(params_.span >= 0);
  CHECK(params_.channel_frames >= 0);
  CHECK(params_.doppler_frames >= 1);
  CHECK_EQ(static_cast<int>(code_.size()), frame_size_);
  const int n = fft_.GetSize();
  buffer_.assign(n, {});
  std::copy(code_.begin(), code_.end(), buffer_.begin());
  code_spectrum_.resize(n);
  fft_.Forward(buffer_.data(), code_spectrum_.data());
  for (auto& c : code_spectrum_) c = std::conj(c);
  real_part_.resize(frame_size_);
}

double MultipathScorer::Period(float doppler) const {
  return frame_size_ / (1.0 + doppler / carrier_cycles_per_frame_);
}

void MultipathScorer::Profile(std::span<const float> real, std::span<const float> imag, int t,
                              int64_t absolute, float doppler, bool keep_spectrum,
                              std::vector<std::complex<float>>* profile) {
  const int n = fft_.GetSize();
  const int window = frame_size_ + params_.lead + params_.span;
  const int start = t - params_.lead;
  CHECK(start >= 0 && start + window <= static_cast<int>(real.size()));
  CHECK_EQ(real.size(), imag.size());
  // Derotate by the Doppler offset with the phase counted from the start of
  // the stream, so that a path keeps its phase from frame to frame.
  const double step = -2.0 * std::numbers::pi * doppler / frame_size_;
  const double phase = std::remainder(step * static_cast<double>(absolute - params_.lead),
                                      2.0 * std::numbers::pi);
  std::complex<double> phasor(std::cos(phase), std::sin(phase));
  const std::complex<double> rotation(std::cos(step), std::sin(step));
  for (int i = 0; i < window; ++i) {
    buffer_[i] = std::complex<float>(real[start + i], imag[start + i]) *
                 std::complex<float>(phasor);
    phasor *= rotation;
  }
  std::fill(buffer_.begin() + window, buffer_.end(), std::complex<float>());
  fft_.Forward(buffer_.data(), buffer_.data());
  if (keep_spectrum) spectrum_.assign(buffer_.begin(), buffer_.end());
  for (int k = 0; k < n; ++k) buffer_[k] *= code_spectrum_[k];
  fft_.Inverse(buffer_.data(), buffer_.data());
  profile->assign(buffer_.begin(), buffer_.begin() + lags_);
}

float MultipathScorer::EstimateDoppler(std::span<const float> real, std::span<const float> imag,
                                       int t, int64_t origin) {
  const int size = static_cast<int>(real.size());
  std::vector<std::complex<float>> profile;
  std::vector<double> power(lags_);
  // Powers summed over frames (their phases are not trusted at low SNR),
  // then the sum of squares, which rewards energy gathered into peaks over
  // energy smeared across lags by a wrong offset.
  const auto peakiness = [&](float doppler) {
    std::fill(power.begin(), power.end(), 0.0);
    const double period = Period(doppler);
    for (int j = 0; j < params_.doppler_frames; ++j) {
      const int offset = static_cast<int>(std::lround(j * period));
      if (!HasWindow(t + offset, size)) break;
      Profile(real, imag, t + offset, origin + offset, doppler, false, &profile);
      for (int m = 0; m < lags_; ++m) power[m] += std::norm(profile[m]);
    }
    double sum = 0.0;
    for (double p : power) sum += p * p;
    return sum;
  };
  const float coarse = 4.0f * params_.doppler_step;
  const int steps = static_cast<int>(std::ceil(params_.max_doppler / coarse));
  float best = 0.0f;
  double best_value = -1.0;
  const auto consider = [&](float doppler) {
    if (std::fabs(doppler) > params_.max_doppler + 1e-6f) return;
    const double value = peakiness(doppler);
    if (value > best_value) {
      best_value = value;
      best = doppler;
    }
  };
  for (int i = -steps; i <= steps; ++i) {
    consider(std::clamp(i * coarse, -params_.max_doppler, params_.max_doppler));
  }
  for (float step : {2.0f * params_.doppler_step, params_.doppler_step}) {
    const float centre = best;
    consider(centre - step);
    consider(centre + step);
  }
  return best;
}

bool MultipathScorer::Score(std::span<const float> real, std::span<const float> imag, int t,
                            int64_t origin, double period, float doppler,
                            audio_dsp::FloatVector* scores, bool* complete) {
  CHECK(scores);
  const int size = static_cast<int>(real.size());
  if (!HasWindow(t, size)) return false;
  const int count_max = 2 * params_.channel_frames + 1;
  if (static_cast<int>(profiles_.size()) < count_max) profiles_.resize(count_max);
  int count = 0, centre = 0;
  bool later_complete = true;
  for (int j = -params_.channel_frames; j <= params_.channel_frames; ++j) {
    const int offset = static_cast<int>(std::lround(j * period));
    if (!HasWindow(t + offset, size)) {
      if (j > 0) later_complete = false;
      continue;
    }
    if (j == 0) centre = count;
    Profile(real, imag, t + offset, origin + offset, doppler, j == 0, &profiles_[count]);
    ++count;
  }
  if (complete != nullptr) *complete = later_complete;

  // Channel estimate: the profiles, phase-aligned to the frame's own (a
  // residual Doppler error turns them from frame to frame), averaged.
  const std::vector<std::complex<float>>& own = profiles_[centre];
  channel_.assign(lags_, {});
  for (int i = 0; i < count; ++i) {
    std::vector<std::complex<float>>& p = profiles_[i];
    std::complex<double> c;
    for (int m = 0; m < lags_; ++m) c += std::complex<double>(std::conj(p[m]) * own[m]);
    const std::complex<float> align =
        std::abs(c) > 0.0 ? std::complex<float>(c / std::abs(c)) : std::complex<float>(1.0f);
    for (int m = 0; m < lags_; ++m) {
      p[m] *= align;
      channel_[m] += p[m];
    }
  }
  for (auto& v : channel_) v /= static_cast<float>(count);
  // The scatter of the frames around the average, per lag, as the noise
  // power of the average; with a single frame no lag can be judged, and
  // all keep their weight.
  double scatter = 0.0;
  if (count > 1) {
    for (int i = 0; i < count; ++i) {
      for (int m = 0; m < lags_; ++m) scatter += std::norm(profiles_[i][m] - channel_[m]);
    }
    scatter /= static_cast<double>(lags_) * (count - 1) * count;
  }

  // Maximal-ratio weights, gated, applied as a correlation of the frame's
  // window with the weights: combined[k] = sum_m conj(w_m) x[k + m].
  const int n = fft_.GetSize();
  std::fill(buffer_.begin(), buffer_.end(), std::complex<float>());
  int strongest = 0;
  for (int m = 0; m < lags_; ++m) {
    if (std::norm(channel_[m]) > std::norm(channel_[strongest])) strongest = m;
  }
  for (int m = 0; m < lags_; ++m) {
    const double power = std::norm(channel_[m]);
    const double weight = m == strongest ? 1.0
                          : power > 0.0 ? std::max(0.0, 1.0 - params_.gate * scatter / power)
                                        : 0.0;
    buffer_[m] = channel_[m] * static_cast<float>(weight);
  }
  fft_.Forward(buffer_.data(), buffer_.data());
  for (int k = 0; k < n; ++k) buffer_[k] = spectrum_[k] * std::conj(buffer_[k]);
  fft_.Inverse(buffer_.data(), buffer_.data());

  // Despread the combined frame, put its pedestal on the real axis and
  // correlate with the symbol tones.
  std::complex<double> sum;
  for (int k = 0; k < frame_size_; ++k) {
    buffer_[k] *= code_[k];
    sum += std::complex<double>(buffer_[k]);
  }
  double phi = std::atan2(sum.imag(), sum.real());
  if (use_quadrature_) phi += std::numbers::pi / 2;
  const std::complex<float> derotate(static_cast<float>(std::cos(-phi)),
                                     static_cast<float>(std::sin(-phi)));
  for (int k = 0; k < frame_size_; ++k) real_part_[k] = (buffer_[k] * derotate).real();
  *scores = tones_ * real_part_;
  return true;
}

}  // namespace audio_sorvane
