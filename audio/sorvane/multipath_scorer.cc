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

// Complex loops on interleaved floats: std::complex's multiply carries a
// NaN fallback that keeps these loops scalar and branchy.
using Complex = std::complex<float>;

// sum_m conj(a[m]) b[m].
Complex InnerProduct(const Complex* a, const Complex* b, int n) {
  const float* x = reinterpret_cast<const float*>(a);
  const float* y = reinterpret_cast<const float*>(b);
  float re = 0.0f, im = 0.0f;
  for (int i = 0; i < 2 * n; i += 2) {
    re += x[i] * y[i] + x[i + 1] * y[i + 1];
    im += x[i] * y[i + 1] - x[i + 1] * y[i];
  }
  return {re, im};
}

// out[m] += a[m] * c.
void AddScaled(const Complex* a, Complex c, Complex* out, int n) {
  const float* x = reinterpret_cast<const float*>(a);
  float* y = reinterpret_cast<float*>(out);
  const float cr = c.real(), ci = c.imag();
  for (int i = 0; i < 2 * n; i += 2) {
    y[i] += x[i] * cr - x[i + 1] * ci;
    y[i + 1] += x[i] * ci + x[i + 1] * cr;
  }
}

// sum_m |a[m] * c - b[m]|^2.
float Distance(const Complex* a, Complex c, const Complex* b, int n) {
  const float* x = reinterpret_cast<const float*>(a);
  const float* y = reinterpret_cast<const float*>(b);
  const float cr = c.real(), ci = c.imag();
  float sum = 0.0f;
  for (int i = 0; i < 2 * n; i += 2) {
    const float re = x[i] * cr - x[i + 1] * ci - y[i];
    const float im = x[i] * ci + x[i + 1] * cr - y[i + 1];
    sum += re * re + im * im;
  }
  return sum;
}

// a[m] *= b[m] (or conj(b[m])).
void Multiply(Complex* a, const Complex* b, int n, bool conjugate) {
  float* x = reinterpret_cast<float*>(a);
  const float* y = reinterpret_cast<const float*>(b);
  const float sign = conjugate ? -1.0f : 1.0f;
  for (int i = 0; i < 2 * n; i += 2) {
    const float br = y[i], bi = sign * y[i + 1];
    const float re = x[i] * br - x[i + 1] * bi;
    x[i + 1] = x[i] * bi + x[i + 1] * br;
    x[i] = re;
  }
}

// The unit phasor of c (1 when c is 0).
Complex Direction(Complex c) {
  const float magnitude = std::hypot(c.real(), c.imag());
  return magnitude > 0.0f ? c / magnitude : Complex(1.0f);
}

}  // namespace

MultipathScorer::MultipathScorer(const SymbolWaveCoder& coder,
                                 const MultipathScorerParams& params)
    : params_(params),
      frame_size_(coder.samples_per_frame() / coder.params().baseband_decimation_factor),
      lags_(params.lead + params.span + 1),
      window_(frame_size_ + params.lead + params.span),
      carrier_cycles_per_frame_(static_cast<float>(coder.carrier_cycles_per_frame())),
      use_quadrature_(coder.params().use_quadrature),
      code_(coder.baseband_code()),
      tones_(coder.baseband_tones()),
      fft_(FastSizeAtLeast(window_), /*normalize_inverse=*/true) {
  CHECK(params_.lead >= 0);
  CHECK(params_.span >= 0);
  CHECK(params_.channel_frames >= 0);
  CHECK(params_.max_doppler >= 0.0f);
  CHECK(params_.doppler_step > 0.0f);
  CHECK(params_.doppler_frames >= 1);
  CHECK(carrier_cycles_per_frame_ > 0.0f);
  CHECK_EQ(static_cast<int>(code_.size()), frame_size_);
  const int n = fft_.GetSize();
  buffer_.assign(n, {});
  spectrum_.assign(n, {});
  rotation_.resize(window_);
  std::copy(code_.begin(), code_.end(), buffer_.begin());
  code_spectrum_.resize(n);
  fft_.Forward(buffer_.data(), code_spectrum_.data());
  for (auto& c : code_spectrum_) c = std::conj(c);
  real_part_.resize(frame_size_);
}

bool MultipathScorer::HasWindow(const BasebandView& view, int64_t start) const {
  const int64_t first = start - params_.lead - view.origin;
  return first >= 0 && first + window_ <= static_cast<int64_t>(view.real.size());
}

double MultipathScorer::Period(float doppler) const {
  return frame_size_ / (1.0 + doppler / carrier_cycles_per_frame_);
}

void MultipathScorer::StartTrack(int64_t anchor, float doppler) {
  has_track_ = true;
  anchor_ = anchor;
  doppler_ = doppler;
  period_ = Period(doppler);
  SetRotation(doppler);
  frames_.clear();
}

void MultipathScorer::Reset() {
  has_track_ = false;
  frames_.clear();
}

int64_t MultipathScorer::FrameStart(int64_t k) const {
  return anchor_ + std::llround(static_cast<double>(k) * period_);
}

int64_t MultipathScorer::NearestFrame(int64_t start) const {
  return std::llround(static_cast<double>(start - anchor_) / period_);
}

void MultipathScorer::ForgetBefore(int64_t k) {
  frames_.erase(frames_.begin(), frames_.lower_bound(k));
}

void MultipathScorer::SetRotation(float doppler) {
  rotation_doppler_ = doppler;
  const double step = -2.0 * std::numbers::pi * doppler / frame_size_;
  for (int i = 0; i < window_; ++i) {
    rotation_[i] = {static_cast<float>(std::cos(step * i)), static_cast<float>(std::sin(step * i))};
  }
}

void MultipathScorer::Derotate(const BasebandView& view, int64_t start) {
  CHECK(HasWindow(view, start));
  CHECK_EQ(view.real.size(), view.imag.size());
  const int64_t first = start - params_.lead;
  const float* real = view.real.data() + (first - view.origin);
  const float* imag = view.imag.data() + (first - view.origin);
  // The phase is counted from stream index 0, so that a path keeps its
  // phase from frame to frame: the table's rotation times the phase at the
  // window's first sample.
  const double phase = std::remainder(
      -2.0 * std::numbers::pi * rotation_doppler_ / frame_size_ * static_cast<double>(first),
      2.0 * std::numbers::pi);
  const float cr = static_cast<float>(std::cos(phase)), ci = static_cast<float>(std::sin(phase));
  const float* r = reinterpret_cast<const float*>(rotation_.data());
  float* out = reinterpret_cast<float*>(buffer_.data());
  for (int i = 0; i < window_; ++i) {
    const float pr = r[2 * i] * cr - r[2 * i + 1] * ci;
    const float pi = r[2 * i] * ci + r[2 * i + 1] * cr;
    out[2 * i] = real[i] * pr - imag[i] * pi;
    out[2 * i + 1] = real[i] * pi + imag[i] * pr;
  }
}

void MultipathScorer::Transform(const BasebandView& view, int64_t start, bool keep_window,
                                Frame* frame) {
  const int n = fft_.GetSize();
  Derotate(view, start);
  std::fill(buffer_.begin() + window_, buffer_.end(), std::complex<float>());
  if (keep_window) frame->window.assign(buffer_.begin(), buffer_.begin() + window_);
  // Out of place: KISS FFT allocates a temporary for in-place transforms.
  fft_.Forward(buffer_.data(), spectrum_.data());
  if (keep_window) frame->spectrum.assign(spectrum_.begin(), spectrum_.end());
  Multiply(spectrum_.data(), code_spectrum_.data(), n, false);
  fft_.Inverse(spectrum_.data(), buffer_.data());
  frame->profile.assign(buffer_.begin(), buffer_.begin() + lags_);
}

float MultipathScorer::SearchDoppler(const BasebandView& view, int64_t start) {
  CHECK(HasWindow(view, start));
  power_.resize(lags_);
  // Powers summed over frames (their phases are not trusted at low SNR),
  // then the sum of squares, which rewards energy gathered into peaks over
  // energy smeared across lags by a wrong offset.
  const auto peakiness = [&](float doppler) {
    SetRotation(doppler);
    std::fill(power_.begin(), power_.end(), 0.0);
    const double period = Period(doppler);
    for (int j = 0; j < params_.doppler_frames; ++j) {
      const int64_t frame_start = start + std::llround(j * period);
      if (!HasWindow(view, frame_start)) break;
      Transform(view, frame_start, false, &search_frame_);
      const float* p = reinterpret_cast<const float*>(search_frame_.profile.data());
      for (int m = 0; m < lags_; ++m) power_[m] += p[2 * m] * p[2 * m] + p[2 * m + 1] * p[2 * m + 1];
    }
    double sum = 0.0;
    for (double p : power_) sum += p * p;
    return sum;
  };
  float best = 0.0f;
  double best_value = -1.0;
  const auto consider = [&](float doppler) {
    if (std::fabs(doppler) > params_.max_doppler * (1.0f + 1e-6f)) return;
    const double value = peakiness(doppler);
    if (value > best_value) {
      best_value = value;
      best = doppler;
    }
  };
  // A coarse grid (a quarter-cycle of phase error over a frame at most
  // costs little), then two refinements around its best.
  const float coarse = 4.0f * params_.doppler_step;
  const int steps = static_cast<int>(std::ceil(params_.max_doppler / coarse));
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

MultipathScorer::Frame& MultipathScorer::CachedFrame(const BasebandView& view, int64_t k) {
  Frame& frame = frames_[k];
  if (frame.profile.empty()) Transform(view, FrameStart(k), !frame.scored, &frame);
  return frame;
}

void MultipathScorer::Combine(const Frame& frame) {
  // Few weighted lags (a dry room) are cheaper to combine directly than
  // through two transforms.
  constexpr int kMaxDirectLags = 32;
  int weighted = 0;
  for (const Complex& w : weights_) weighted += w != Complex();
  combined_.assign(frame_size_, {});
  if (weighted <= kMaxDirectLags) {
    for (int m = 0; m < lags_; ++m) {
      if (weights_[m] == Complex()) continue;
      AddScaled(frame.window.data() + m, std::conj(weights_[m]), combined_.data(), frame_size_);
    }
    return;
  }
  const int n = fft_.GetSize();
  std::fill(buffer_.begin(), buffer_.end(), std::complex<float>());
  std::copy(weights_.begin(), weights_.end(), buffer_.begin());
  fft_.Forward(buffer_.data(), spectrum_.data());
  for (int k = 0; k < n; ++k) spectrum_[k] = std::conj(spectrum_[k]);
  Multiply(spectrum_.data(), frame.spectrum.data(), n, false);
  fft_.Inverse(spectrum_.data(), buffer_.data());
  std::copy_n(buffer_.begin(), frame_size_, combined_.begin());
}

bool MultipathScorer::Score(const BasebandView& view, int64_t k, audio_dsp::FloatVector* scores) {
  CHECK(scores);
  CHECK(has_track_);
  if (auto it = frames_.find(k); it != frames_.end() && it->second.scored) {
    *scores = it->second.scores;
    return true;
  }
  const int neighbours = params_.channel_frames;
  for (int j = 0; j <= neighbours; ++j) {
    const int64_t later = k + j;
    const auto it = frames_.find(later);
    if ((it == frames_.end() || it->second.profile.empty()) &&
        !HasWindow(view, FrameStart(later))) {
      return false;
    }
  }
  // Channel estimate: the profiles of the frame and its neighbours, each
  // phase-aligned to the frame's own (a residual Doppler error turns them
  // from frame to frame), averaged. Earlier neighbours whose audio is gone
  // and were never seen are left out.
  Frame& own = CachedFrame(view, k);
  channel_.assign(lags_, {});
  neighbours_.clear();
  for (int j = -neighbours; j <= neighbours; ++j) {
    const auto it = frames_.find(k + j);
    const bool cached = it != frames_.end() && !it->second.profile.empty();
    if (!cached && !HasWindow(view, FrameStart(k + j))) continue;
    const Complex* p = CachedFrame(view, k + j).profile.data();
    const Complex align = Direction(InnerProduct(p, own.profile.data(), lags_));
    AddScaled(p, align, channel_.data(), lags_);
    neighbours_.push_back({p, align});
  }
  const int count = static_cast<int>(neighbours_.size());
  for (auto& v : channel_) v /= static_cast<float>(count);
  // The scatter of the aligned profiles around their average, per lag,
  // estimates the noise power of the average. With one frame no lag can be
  // judged and all keep their weight.
  double scatter = 0.0;
  if (count > 1) {
    for (const auto& [p, align] : neighbours_) {
      scatter += Distance(p, align, channel_.data(), lags_);
    }
    scatter /= static_cast<double>(lags_) * (count - 1) * count;
  }

  // Maximal-ratio weights; the strongest lag always counts.
  weights_.assign(lags_, {});
  const float* h = reinterpret_cast<const float*>(channel_.data());
  float* w = reinterpret_cast<float*>(weights_.data());
  const float threshold = static_cast<float>(params_.gate * scatter);
  int strongest = 0;
  float strongest_power = -1.0f;
  for (int m = 0; m < lags_; ++m) {
    const float power = h[2 * m] * h[2 * m] + h[2 * m + 1] * h[2 * m + 1];
    if (power > strongest_power) {
      strongest_power = power;
      strongest = m;
    }
    const float weight = power > threshold ? 1.0f - threshold / power : 0.0f;
    w[2 * m] = h[2 * m] * weight;
    w[2 * m + 1] = h[2 * m + 1] * weight;
  }
  weights_[strongest] = channel_[strongest];
  Combine(own);

  // Despread the combined frame, put its pedestal on the real axis and
  // correlate with the symbol tones.
  float* c = reinterpret_cast<float*>(combined_.data());
  double sum_re = 0.0, sum_im = 0.0;
  for (int i = 0; i < frame_size_; ++i) {
    c[2 * i] *= code_[i];
    c[2 * i + 1] *= code_[i];
    sum_re += c[2 * i];
    sum_im += c[2 * i + 1];
  }
  double phi = std::atan2(sum_im, sum_re);
  if (use_quadrature_) phi += std::numbers::pi / 2;
  const std::complex<float> derotate(static_cast<float>(std::cos(-phi)),
                                     static_cast<float>(std::sin(-phi)));
  for (int i = 0; i < frame_size_; ++i) {
    real_part_[i] = c[2 * i] * derotate.real() - c[2 * i + 1] * derotate.imag();
  }
  own.scores = tones_ * real_part_;
  own.scored = true;
  std::vector<std::complex<float>>().swap(own.spectrum);
  std::vector<std::complex<float>>().swap(own.window);
  // Profiles further back than any later frame's neighbours are done with.
  for (auto it = frames_.begin(); it != frames_.end() && it->first < k - neighbours; ++it) {
    if (it->second.scored) std::vector<std::complex<float>>().swap(it->second.profile);
  }
  *scores = own.scores;
  return true;
}

}  // namespace audio_sorvane
