#include "audio/sorvane/multipath_scorer.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <limits>
#include <numbers>

#include "base/logging.h"

namespace audio_sorvane {
namespace {

// Complex loops on interleaved floats: std::complex's multiply carries a
// NaN fallback that keeps these loops scalar and branchy.
using Complex = std::complex<float>;

// sum_m conj(a[m]) b[m], in eight independent partial sums so that the
// compiler may keep them in vector registers.
Complex InnerProduct(const Complex* a, const Complex* b, int n) {
  const float* x = reinterpret_cast<const float*>(a);
  const float* y = reinterpret_cast<const float*>(b);
  float re[4] = {}, im[4] = {};
  int i = 0;
  for (; i + 4 <= n; i += 4) {
    for (int u = 0; u < 4; ++u) {
      const int k = 2 * (i + u);
      re[u] += x[k] * y[k] + x[k + 1] * y[k + 1];
      im[u] += x[k] * y[k + 1] - x[k + 1] * y[k];
    }
  }
  for (; i < n; ++i) {
    re[0] += x[2 * i] * y[2 * i] + x[2 * i + 1] * y[2 * i + 1];
    im[0] += x[2 * i] * y[2 * i + 1] - x[2 * i + 1] * y[2 * i];
  }
  return {(re[0] + re[1]) + (re[2] + re[3]), (im[0] + im[1]) + (im[2] + im[3])};
}

// sum_m |a[m]|^2.
float Energy(const Complex* a, int n) {
  const float* x = reinterpret_cast<const float*>(a);
  float sum[8] = {};
  int i = 0;
  for (; i + 8 <= 2 * n; i += 8) {
    for (int u = 0; u < 8; ++u) sum[u] += x[i + u] * x[i + u];
  }
  for (; i < 2 * n; ++i) sum[0] += x[i] * x[i];
  return ((sum[0] + sum[1]) + (sum[2] + sum[3])) + ((sum[4] + sum[5]) + (sum[6] + sum[7]));
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

// out[m] = a[m] b[m]; out may be a.
void Multiply(const Complex* a, const Complex* b, int n, Complex* out) {
  const float* x = reinterpret_cast<const float*>(a);
  const float* y = reinterpret_cast<const float*>(b);
  float* z = reinterpret_cast<float*>(out);
  for (int i = 0; i < 2 * n; i += 2) {
    const float re = x[i] * y[i] - x[i + 1] * y[i + 1];
    const float im = x[i] * y[i + 1] + x[i + 1] * y[i];
    z[i] = re;
    z[i + 1] = im;
  }
}

// Buffers of one size are lent to frames and given back when the frames are
// done with them, so a steady stream of frames allocates nothing while only
// the frames that need a buffer hold one.
void Borrow(std::vector<std::vector<Complex>>* pool, std::vector<Complex>* buffer) {
  if (buffer->capacity() > 0 || pool->empty()) return;
  buffer->swap(pool->back());
  pool->pop_back();
}

void GiveBack(std::vector<std::vector<Complex>>* pool, std::vector<Complex>* buffer) {
  if (buffer->capacity() == 0) return;
  buffer->clear();
  pool->emplace_back().swap(*buffer);
}

// The transform length for correlating windows of `window` samples with
// templates of up to `longest` (the code or the lag weights): the power of two
// that holds the window whole, or the one below when the window overhangs it
// by at most an eighth (and it still holds a template); the overhang is then
// added back directly by AddOverhang, for less than the larger transform.
int TransformSize(int window, int longest, bool whole) {
  const int below = static_cast<int>(std::bit_floor(static_cast<unsigned>(window)));
  if (!whole && window - below <= below / 8 && longest <= below && below >= 16) return below;
  return std::max(16, static_cast<int>(std::bit_ceil(static_cast<unsigned>(window))));
}

// A cyclic correlation of length n computes out[j] = sum_i a[i] x[(j + i) mod n]
// from the first n samples of x; this adds what the linear one has beyond
// it, a[i] (x[j + i] - x[j + i - n]) wherever j + i >= n, for j < count.
// `overhang[q]` holds x[n + q] - x[q] for q < count + a_size - 1 - n.
// `a(i)` gives a[i].
template <typename Coefficients>
void AddOverhang(Coefficients a, int a_size, const Complex* overhang, int n, int count,
                 Complex* out) {
  for (int j = std::max(0, n - a_size + 1); j < count; ++j) {
    Complex sum;
    for (int i = n - j; i < a_size; ++i) sum += a(i) * overhang[j + i - n];
    out[j] += sum;
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
      fft_(TransformSize(window_, std::max(frame_size_, lags_), params.whole_window_transform),
           /*normalize_inverse=*/true) {
  CHECK(params_.lead >= 0);
  CHECK(params_.span >= 0);
  CHECK(params_.channel_frames >= 0);
  CHECK(params_.max_doppler >= 0.0f);
  CHECK(params_.doppler_step > 0.0f);
  CHECK(params_.doppler_frames >= 1);
  CHECK_EQ(static_cast<int>(code_.size()), frame_size_);
  const int n = fft_.GetSize();
  buffer_.assign(n, {});
  spectrum_.assign(n, {});
  rotation_.resize(window_);
  derotated_.resize(window_);
  overhang_.resize(std::max(0, window_ - n));
  if (window_ > n) {
    turns_.resize(n);
    for (int q = 0; q < n; ++q) turns_[q] = std::polar(1.0, -2.0 * std::numbers::pi * q / n);
  }
  std::copy(code_.begin(), code_.end(), buffer_.begin());
  code_spectrum_.resize(n);
  fft_.Forward(buffer_.data(), code_spectrum_.data());
  for (auto& c : code_spectrum_) c = std::conj(c);
  real_part_.resize(frame_size_);
  // Room for the frames of a few seconds of buffer, so the pools do not
  // grow while streaming.
  for (auto* pool : {&profile_pool_, &window_pool_, &spectrum_pool_}) pool->reserve(256);
  spare_frames_.reserve(256);
}

bool MultipathScorer::HasWindow(const BasebandView& view, int64_t start) const {
  const int64_t first = start - params_.lead - view.origin;
  return first >= 0 && first + window_ <= static_cast<int64_t>(view.real.size());
}

double MultipathScorer::Period(float doppler) const {
  // A coder without a carrier has no Doppler to scale time with.
  if (carrier_cycles_per_frame_ <= 0.0f) return frame_size_;
  return frame_size_ / (1.0 + doppler / carrier_cycles_per_frame_);
}

void MultipathScorer::StartTrack(int64_t anchor, float doppler) {
  has_track_ = true;
  anchor_ = anchor;
  doppler_ = doppler;
  period_ = Period(doppler);
  SetRotation(doppler);
  ForgetBefore(std::numeric_limits<int64_t>::max());
}

void MultipathScorer::Reset() {
  has_track_ = false;
  ForgetBefore(std::numeric_limits<int64_t>::max());
}

int64_t MultipathScorer::FrameStart(int64_t k) const {
  return anchor_ + std::llround(static_cast<double>(k) * period_);
}

int64_t MultipathScorer::NearestFrame(int64_t start) const {
  return std::llround(static_cast<double>(start - anchor_) / period_);
}

void MultipathScorer::ForgetBefore(int64_t k) {
  // The map nodes are kept, with their score vectors, for later frames.
  while (!frames_.empty() && frames_.begin()->first < k) {
    Frame& frame = frames_.begin()->second;
    GiveBack(&profile_pool_, &frame.profile);
    GiveBack(&window_pool_, &frame.window);
    GiveBack(&spectrum_pool_, &frame.spectrum);
    frame.scored = false;
    spare_frames_.push_back(frames_.extract(frames_.begin()));
  }
}

void MultipathScorer::ReserveFrames(int count) {
  while (static_cast<int>(frames_.size() + spare_frames_.size()) < count) {
    std::map<int64_t, Frame> one;
    one[0].scores.setZero(tones_.rows());
    spare_frames_.push_back(one.extract(one.begin()));
  }
  // Profiles for the sounded frames of one channel estimate and a few more:
  // a frame's profile is given back once no later frame's estimate reads
  // it, so only a handful are held at a time. The pool keeps any it grows.
  const int profiles = std::min(count, params_.channel_frames + 4);
  while (static_cast<int>(profile_pool_.size()) < profiles) {
    profile_pool_.emplace_back().reserve(lags_);
  }
}

MultipathScorer::Frame& MultipathScorer::FrameAt(int64_t k) {
  if (auto it = frames_.find(k); it != frames_.end()) return it->second;
  if (spare_frames_.empty()) return frames_[k];
  auto node = std::move(spare_frames_.back());
  spare_frames_.pop_back();
  node.key() = k;
  return frames_.insert(std::move(node)).position->second;
}

void MultipathScorer::SetRotation(float doppler) {
  rotation_doppler_ = doppler;
  const double step = -2.0 * std::numbers::pi * doppler / frame_size_;
  // exp(j step i) for i = 64 a + b as the product of two short tables in
  // double: its error (1e-16) is far below a float's step, so the rounded
  // values are those of the direct cosines and sines, for a fraction of the
  // cost.
  constexpr int kFine = 64;
  std::complex<double> fine[kFine];
  for (int b = 0; b < kFine; ++b) fine[b] = std::polar(1.0, step * b);
  for (int a = 0; a * kFine < window_; ++a) {
    const std::complex<double> coarse = std::polar(1.0, step * (a * kFine));
    for (int b = 0; b < kFine && a * kFine + b < window_; ++b) {
      const std::complex<double> turn = coarse * fine[b];
      rotation_[a * kFine + b] = {static_cast<float>(turn.real()), static_cast<float>(turn.imag())};
    }
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
  float* out = reinterpret_cast<float*>(derotated_.data());
  for (int i = 0; i < window_; ++i) {
    const float pr = r[2 * i] * cr - r[2 * i + 1] * ci;
    const float pi = r[2 * i] * ci + r[2 * i + 1] * cr;
    out[2 * i] = real[i] * pr - imag[i] * pi;
    out[2 * i + 1] = real[i] * pi + imag[i] * pr;
  }
}

void MultipathScorer::WindowSpectrum(const BasebandView& view, int64_t start) {
  Derotate(view, start);
  Spectrum(derotated_, spectrum_.data());
}

void MultipathScorer::Spectrum(const std::vector<Complex>& window, Complex* spectrum) {
  const int n = fft_.GetSize();
  const int kept = std::min(n, static_cast<int>(window.size()));
  std::copy_n(window.begin(), kept, buffer_.begin());
  std::fill(buffer_.begin() + kept, buffer_.end(), Complex());
  fft_.Forward(buffer_.data(), spectrum);
}

void MultipathScorer::AddCodeOverhang(int shift, Complex* profile) {
  const int n = fft_.GetSize();
  if (window_ <= n) return;
  // The window as the shifted spectrum has it: turned by shift bins.
  for (int q = 0; q < window_ - n; ++q) {
    const Complex turn = turns_[static_cast<size_t>(shift) * q % n];
    overhang_[q] = (derotated_[n + q] - derotated_[q]) * turn;
  }
  AddOverhang([&](int i) { return code_[i]; }, frame_size_, overhang_.data(), n, lags_, profile);
}

void MultipathScorer::Transform(const BasebandView& view, int64_t start, Frame* frame) {
  WindowSpectrum(view, start);
  Multiply(spectrum_.data(), code_spectrum_.data(), fft_.GetSize(), spectrum_.data());
  fft_.Inverse(spectrum_.data(), buffer_.data());
  AddCodeOverhang(0, buffer_.data());
  Borrow(&profile_pool_, &frame->profile);
  frame->profile.assign(buffer_.begin(), buffer_.begin() + lags_);
}

float MultipathScorer::SearchDoppler(const BasebandView& view, int64_t start) {
  CHECK(HasWindow(view, start));
  power_.resize(lags_);
  // Powers summed over frames (their phases are not trusted at low SNR),
  // then the sum of squares, which rewards energy gathered into peaks over
  // energy smeared across lags by a wrong offset.
  const auto peakiness = [&](const double* power) {
    double sum = 0.0;
    for (int m = 0; m < lags_; ++m) sum += power[m] * power[m];
    return sum;
  };
  const auto add_power = [&](const std::complex<float>* profile, double* power) {
    const float* p = reinterpret_cast<const float*>(profile);
    for (int m = 0; m < lags_; ++m) power[m] += p[2 * m] * p[2 * m] + p[2 * m + 1] * p[2 * m + 1];
  };
  float best = 0.0f;
  double best_value = -1.0;
  const auto consider = [&](float doppler, double value) {
    if (value > best_value) {
      best_value = value;
      best = doppler;
    }
  };

  // Coarse grid: offsets of whole FFT bins, which shift the spectrum of the
  // window instead of derotating it, so each frame is transformed once. The
  // grid steps by the whole bins nearest to kCoarseStep cycles per frame,
  // where a half-step error still keeps most of the power. Frames are taken
  // a nominal period apart; each offset's powers are summed in its own row.
  constexpr float kCoarseStep = 0.6f;
  const int n = fft_.GetSize();
  const int stride = std::max(
      1, static_cast<int>(std::lround(kCoarseStep * static_cast<float>(n) / static_cast<float>(frame_size_))));
  const float bin = static_cast<float>(stride * frame_size_) / static_cast<float>(n);
  const int bins = static_cast<int>(std::floor(params_.max_doppler / bin + 0.5f));
  search_powers_.assign(static_cast<size_t>(2 * bins + 1) * lags_, 0.0);
  SetRotation(0.0f);
  for (int j = 0; j < params_.doppler_frames; ++j) {
    const int64_t frame_start = start + static_cast<int64_t>(j) * frame_size_;
    if (!HasWindow(view, frame_start)) break;
    WindowSpectrum(view, frame_start);
    for (int b = -bins; b <= bins; ++b) {
      // Derotating by b steps takes bin k + b stride to bin k: a cyclic shift.
      const int shift = ((b * stride) % n + n) % n;
      Multiply(spectrum_.data() + shift, code_spectrum_.data(), n - shift, buffer_.data());
      Multiply(spectrum_.data(), code_spectrum_.data() + (n - shift), shift,
               buffer_.data() + (n - shift));
      fft_.Inverse(buffer_.data(), buffer_.data());
      AddCodeOverhang(shift, buffer_.data());
      add_power(buffer_.data(), &search_powers_[static_cast<size_t>(b + bins) * lags_]);
    }
  }
  for (int b = -bins; b <= bins; ++b) {
    consider(std::clamp(b * bin, -params_.max_doppler, params_.max_doppler),
             peakiness(&search_powers_[static_cast<size_t>(b + bins) * lags_]));
  }

  // Two refinements around the best, derotated exactly, the frames a
  // period of that offset apart.
  const auto evaluate = [&](float doppler) {
    if (std::fabs(doppler) > params_.max_doppler * (1.0f + 1e-6f)) return;
    SetRotation(doppler);
    std::fill(power_.begin(), power_.end(), 0.0);
    const double period = Period(doppler);
    for (int j = 0; j < params_.doppler_frames; ++j) {
      const int64_t frame_start = start + std::llround(j * period);
      if (!HasWindow(view, frame_start)) break;
      Transform(view, frame_start, &search_frame_);
      add_power(search_frame_.profile.data(), power_.data());
    }
    consider(doppler, peakiness(power_.data()));
  };
  best_value = -1.0;
  const float coarse_best = best;
  evaluate(coarse_best);
  for (float step : {bin / 2.0f, params_.doppler_step}) {
    const float centre = best;
    evaluate(centre - step);
    evaluate(centre + step);
  }
  return best;
}

bool MultipathScorer::Sounded(int64_t k) { return k % kSoundingInterval == 0; }

MultipathScorer::Frame& MultipathScorer::CachedFrame(const BasebandView& view, int64_t k) {
  Frame& frame = FrameAt(k);
  // Only the profile is kept: a neighbour's window is derotated again if it
  // is ever scored itself, so at most one window is held at a time.
  if (frame.profile.empty()) Transform(view, FrameStart(k), &frame);
  return frame;
}

void MultipathScorer::Combine(const std::vector<std::complex<float>>& window,
                              std::vector<std::complex<float>>* spectrum) {
  // Few weighted lags (a dry room) are cheaper to combine directly than
  // through two transforms.
  constexpr int kMaxDirectLags = 32;
  int weighted = 0;
  for (const Complex& w : weights_) weighted += w != Complex();
  combined_.assign(frame_size_, {});
  if (weighted <= kMaxDirectLags) {
    for (int m = 0; m < lags_; ++m) {
      if (weights_[m] == Complex()) continue;
      AddScaled(window.data() + m, std::conj(weights_[m]), combined_.data(), frame_size_);
    }
    return;
  }
  const int n = fft_.GetSize();
  if (spectrum->empty()) {
    Borrow(&spectrum_pool_, spectrum);
    spectrum->resize(n);
    Spectrum(window, spectrum->data());
  }
  Spectrum(weights_, spectrum_.data());
  for (int k = 0; k < n; ++k) spectrum_[k] = std::conj(spectrum_[k]);
  Multiply(spectrum_.data(), spectrum->data(), n, spectrum_.data());
  fft_.Inverse(spectrum_.data(), buffer_.data());
  std::copy_n(buffer_.begin(), frame_size_, combined_.begin());
  if (window_ > n) {
    for (int q = 0; q < window_ - n; ++q) overhang_[q] = window[n + q] - window[q];
    AddOverhang([&](int m) { return std::conj(weights_[m]); }, lags_, overhang_.data(), n,
                frame_size_, combined_.data());
  }
}

bool MultipathScorer::Score(const BasebandView& view, int64_t k, audio_dsp::FloatVector* scores) {
  CHECK(scores);
  CHECK(has_track_);
  if (auto it = frames_.find(k); it != frames_.end() && it->second.scored) {
    *scores = it->second.scores;
    return true;
  }
  const int neighbours = params_.channel_frames;
  const auto has_profile = [&](int64_t i) {
    const auto it = frames_.find(i);
    return it != frames_.end() && !it->second.profile.empty();
  };
  for (int j = 0; j <= neighbours; ++j) {
    const int64_t later = k + j;
    if (!Sounded(later) && j > 0) continue;
    if (!has_profile(later) && !HasWindow(view, FrameStart(later))) return false;
  }
  // Channel estimate: the profiles of the frame and its neighbours, each
  // phase-aligned to the frame's own (a residual Doppler error turns them
  // from frame to frame), averaged. Earlier neighbours whose audio is gone
  // and were never seen are left out.
  Frame& own = FrameAt(k);
  if (own.window.empty()) {
    if (!HasWindow(view, FrameStart(k))) return false;
    Derotate(view, FrameStart(k));
    Borrow(&window_pool_, &own.window);
    own.window.assign(derotated_.begin(), derotated_.end());
  }
  neighbours_.clear();
  power_.assign(lags_, 0.0);
  const Complex* nearest = nullptr;
  int64_t nearest_distance = 0;
  for (int j = -neighbours; j <= neighbours; ++j) {
    if (!Sounded(k + j)) continue;
    if (!has_profile(k + j) && !HasWindow(view, FrameStart(k + j))) continue;
    const Complex* p = CachedFrame(view, k + j).profile.data();
    for (int m = 0; m < lags_; ++m) power_[m] += std::norm(p[m]);
    neighbours_.push_back({p, Complex(1.0f)});
    if (nearest == nullptr || std::abs(j) < nearest_distance) {
      nearest = p;
      nearest_distance = std::abs(j);
    }
  }
  // The frames are phase-aligned to the nearest one's profile weighted by the
  // lag powers of all of them: at low SNR the strong lags decide the
  // alignment, not the noise of hundreds of empty ones.
  reference_.resize(lags_);
  for (int m = 0; m < lags_; ++m) reference_[m] = nearest[m] * static_cast<float>(power_[m]);
  channel_.assign(lags_, {});
  for (auto& [p, align] : neighbours_) {
    align = Direction(InnerProduct(p, reference_.data(), lags_));
    AddScaled(p, align, channel_.data(), lags_);
  }
  const int count = static_cast<int>(neighbours_.size());
  for (auto& v : channel_) v /= static_cast<float>(count);
  // The scatter of the aligned profiles around their average, per lag,
  // estimates the noise power of the average. With one frame no lag can be
  // judged and all keep their weight.
  // (The squared distances of the profiles from their mean sum to their
  // energies less count times the mean's.)
  double scatter = 0.0;
  if (count > 1) {
    double energy = 0.0;
    for (const auto& [p, align] : neighbours_) energy += Energy(p, lags_);
    scatter = std::max(0.0, energy - count * static_cast<double>(Energy(channel_.data(), lags_)));
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
  Combine(own.window, &own.spectrum);

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
  own.scores.noalias() = tones_ * real_part_;
  own.scored = true;
  GiveBack(&spectrum_pool_, &own.spectrum);
  GiveBack(&window_pool_, &own.window);
  // Profiles further back than any later frame's neighbours are done with.
  for (auto it = frames_.begin(); it != frames_.end() && it->first < k - neighbours; ++it) {
    if (it->second.scored) GiveBack(&profile_pool_, &it->second.profile);
  }
  *scores = own.scores;
  return true;
}

}  // namespace audio_sorvane
