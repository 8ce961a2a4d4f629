#include "audio/hotsound_detector.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <numbers>

#include "audio/dsp/float4.h"
#include "audio/sorvane/symbol_wave_coder.h"
#include "base/logging.h"

namespace audio_sorvane {
namespace {

constexpr int kN = HotsoundDetector::kBasebandSize;
// Low-pass taps per baseband sample: four sample spacings of a Blackman
// windowed sinc keep what lies more than ~6 kHz from the carrier (speech,
// music) some 50 dB down. Three let tonal music through a phone
// microphone's roll-off leak in and wake the detector.
constexpr double kTapsPerSample = 4.0;
constexpr double kCutoffHz = 2200.0;
// Track sums (in units of a window's mean power) that score kThreshold, for
// single lags. In an hour noise of any kind and level reaches about 26 on
// the short track and 40 on the long one, speech and music 30 and 41 (the
// tails fall about e-fold per unit). A broadcast at -16 dB full-band SNR in
// white noise sums about 55 on the short track at rest, 40 at 1 m/s.
constexpr float kRawThreshold = 34.0f;
constexpr float kLongRawThreshold = 46.0f;
// A room spreads the code over its reflections, where no single lag stands
// out. A second family of tracks adds the powers of kSpreadLags lags (half
// a frame, 22 ms), evaluated every kSpreadStride lags (a track step may
// move one stride). In an hour of noise, speech, music or clicks the short
// sums reach about 675 (clicks) and the long ones 1210 (means 512 and
// 1024); the thresholds sit 10-20 % of those excesses higher. Spans of 5
// and 11 ms woke later in rooms at 3-5 m.
constexpr int kSpreadLags = 128;
constexpr int kSpreadStride = 4;
constexpr float kSpreadThreshold = 690.0f;
constexpr float kLongSpreadThreshold = 1251.0f;
// Bins per block of the band's whitening.
constexpr int kWhiteningBlock = 16;
// Spectral power, relative to the mean over the code's band, above which a
// bin counts as a tone and is clipped.
constexpr float kMaxBinPower = 2.0f;
// Windows whose baseband power per sample is below this (digital silence)
// score zero.
constexpr float kSilentPower = 1e-3f;
// Peak over mean baseband power above which a window counts as a click.
// Noise and broadcasts stay below about 12 (ln 256 plus a few).
constexpr float kMaxCrest = 20.0f;
// The carrier offsets searched, in window bins, and the largest whole-bin
// shift they read from a spectrum (-2.5 reads the half-bin spectrum 3 down).
constexpr double kOffsetBins[HotsoundDetector::kCarrierOffsets] = {-2.5, -2.0, -1.0, 0.0,
                                                                   1.0,  2.0,  2.5};
constexpr int kMaxShift = 3;
// The code's lag moves against the carrier offset (a faster broadcast
// reaches each window earlier in its code).
constexpr double kDriftSign = -1.0;
// Cyclic padding of a track row: covers the drift and one lag either side.
constexpr int kPad = 4;

audio_dsp::Float4 Max(audio_dsp::Float4 a, audio_dsp::Float4 b) { return a > b ? a : b; }

double Blackman(double x) {  // x in [-1, 1]
  return 0.42 + 0.5 * std::cos(std::numbers::pi * x) + 0.08 * std::cos(2 * std::numbers::pi * x);
}

}  // namespace

bool HotsoundDetector::RateFits(double sample_rate, double frequency) {
  return sample_rate > 0.0 && frequency - kHalfBandwidth > 0.0 &&
         frequency + kHalfBandwidth < sample_rate / 2.0;
}

std::unique_ptr<HotsoundDetector> HotsoundDetector::Create(const HotsoundDetectorConfig& config,
                                                           int step) {
  if (config.hop_size <= 0 || !RateFits(config.sample_rate, config.frequency)) return nullptr;
  return std::unique_ptr<HotsoundDetector>(new HotsoundDetector(config, step));
}

HotsoundDetector::HotsoundDetector(const HotsoundDetectorConfig& config, int step)
    : config_(config), step_(std::max(step, 1)), fft_(kN) {
  // The broadcast's frame: the default code, chip rate and frame length.
  const SymbolWaveCoderParams coder;
  const int chips = static_cast<int>(coder.code.size());
  const double frame_seconds = chips * coder.upsampling_factor / coder.sample_rate;
  const double rate = config_.sample_rate;
  const double frame = frame_seconds * rate;  // input samples per frame
  const double spacing = frame / kN;
  hop_samples_ = static_cast<int>(std::lround(kHopFrames * frame));

  taps_ = 8 * static_cast<int>(std::ceil(kTapsPerSample * spacing / 8.0));
  tap_start_.resize(kN);
  taps_re_.resize(static_cast<size_t>(kN) * taps_);
  taps_im_.resize(taps_re_.size());
  const double half = taps_ / 2.0;
  const double w = 2.0 * std::numbers::pi * config_.frequency / rate;
  const double cutoff = kCutoffHz / rate;  // cycles per input sample
  std::vector<double> h(taps_);
  for (int m = 0; m < kN; ++m) {
    const double centre = half + m * spacing;
    const int start = static_cast<int>(std::floor(centre - half)) + 1;
    tap_start_[m] = start;
    double sum = 0.0;
    for (int t = 0; t < taps_; ++t) {
      const double u = start + t - centre;
      const double x = 2.0 * cutoff * u;
      const double sinc = u == 0.0 ? 1.0 : std::sin(std::numbers::pi * x) / (std::numbers::pi * x);
      h[t] = std::abs(u) < half ? sinc * Blackman(u / half) : 0.0;
      sum += h[t];
    }
    for (int t = 0; t < taps_; ++t) {
      const double phase = w * (start + t);
      taps_re_[static_cast<size_t>(m) * taps_ + t] = static_cast<float>(h[t] / sum * std::cos(phase));
      taps_im_[static_cast<size_t>(m) * taps_ + t] = static_cast<float>(-h[t] / sum * std::sin(phase));
    }
  }
  window_size_ = tap_start_[kN - 1] + taps_;
  CHECK(hop_samples_ >= window_size_);

  // The code band-limited to its chips' bins (|k| < chips / 2) and seen at
  // kN samples per frame: its spectrum is the chips' DFT on those bins.
  code_re_.assign(kN, 0.0f);
  code_im_.assign(kN, 0.0f);
  for (int k = -(chips / 2); k <= chips / 2; ++k) {
    std::complex<double> sum = 0.0;
    for (int n = 0; n < chips; ++n) {
      sum += static_cast<double>(coder.code[n]) *
             std::polar(1.0, -2.0 * std::numbers::pi * k * n / chips);
    }
    const int bin = (k + kN) % kN;
    const std::complex<double> value = std::conj(sum) / std::sqrt(double(chips));
    code_re_[bin] = static_cast<float>(value.real());
    code_im_[bin] = static_cast<float>(value.imag());
    code_bins_.push_back(bin);
  }

  window_.resize(window_size_);
  for (auto* v : {&base_re_, &base_im_, &spec_re_, &spec_im_, &half_re_, &half_im_}) v->resize(kN);
  for (int m = 0; m < kN; ++m) {
    half_turn_re_.push_back(static_cast<float>(std::cos(std::numbers::pi * m / kN)));
    half_turn_im_.push_back(static_cast<float>(-std::sin(std::numbers::pi * m / kN)));
  }
  prod_re_.assign(kN, 0.0f);
  prod_im_.assign(kN, 0.0f);
  // A phone moving at v compresses the broadcast by v / c: the code's lag
  // moves by the same fraction of a hop per window, and its carrier by the
  // same fraction of the carrier frequency (one bin: window_rate Hz).
  const double window_rate = 1.0 / frame_seconds;
  families_[0].lags = kN;
  families_[0].threshold = kRawThreshold;
  families_[0].long_threshold = kLongRawThreshold;
  families_[1].lags = kN / kSpreadStride;
  families_[1].stride = kSpreadStride;
  families_[1].pool = kSpreadLags;
  families_[1].threshold = kSpreadThreshold;
  families_[1].long_threshold = kLongSpreadThreshold;
  for (Family& f : families_) {
    f.row = f.lags + 2 * kPad;
    for (int d = 0; d < kCarrierOffsets; ++d) {
      const double compression = kOffsetBins[d] * window_rate / config_.frequency;
      f.drift.push_back(
          static_cast<int>(std::lround(kDriftSign * compression * kHopFrames * kN / f.stride)));
      CHECK(std::abs(f.drift.back()) + 1 <= kPad);
    }
    f.ring.assign(kLongWindows, std::vector<float>(kCarrierOffsets * f.lags, 0.0f));
    f.short_tracks.assign(kLongWindows, std::vector<float>(kCarrierOffsets * f.row, 0.0f));
    f.long_track.assign(kCarrierOffsets * f.row, 0.0f);
  }
  scales_.assign(kLongWindows, 0.0f);
  powers_.resize(kN);
  static_assert(kSpreadStride == 4 && kN % kSpreadStride == 0);
  pooled_.resize(kN);
}

float HotsoundDetector::Process(std::span<int16_t> samples) {
  size_t n = samples.size();
  if (step_ >= 2) {
    // Pair averages at every step-th sample; the last pair of a block whose
    // length - 1 is a multiple of the step reads the last sample twice.
    size_t out = 0;
    for (size_t i = 0; i < n; i += step_) {
      const int next = i + 1 < n ? samples[i + 1] : samples[i];
      samples[out++] = static_cast<int16_t>((samples[i] + next) / 2);
    }
    n = out;
  }
  float best = -1.0f;
  size_t i = 0;
  while (i < n) {
    if (skip_ > 0) {
      const size_t dropped = std::min<size_t>(skip_, n - i);
      skip_ -= static_cast<int>(dropped);
      i += dropped;
      continue;
    }
    const size_t take = std::min<size_t>(window_size_ - fill_, n - i);
    std::copy(samples.begin() + i, samples.begin() + i + take, window_.begin() + fill_);
    fill_ += static_cast<int>(take);
    i += take;
    if (fill_ == window_size_) {
      ScoreWindow();
      best = std::max(best, score_);
      fill_ = 0;
      skip_ = hop_samples_ - window_size_;
    }
  }
  return best >= 0.0f ? best : score_;
}

void HotsoundDetector::ScoreWindow() {
  // Mix down and low-pass to kN complex samples.
  double energy = 0.0;
  float peak = 0.0f;
  for (int m = 0; m < kN; ++m) {
    const float* x = window_.data() + tap_start_[m];
    const float* re = taps_re_.data() + static_cast<size_t>(m) * taps_;
    const float* im = taps_im_.data() + static_cast<size_t>(m) * taps_;
    using audio_dsp::Load4;
    audio_dsp::Float4 r0 = {}, r1 = {}, i0 = {}, i1 = {};
    for (int t = 0; t < taps_; t += 8) {
      const audio_dsp::Float4 x0 = Load4(x + t), x1 = Load4(x + t + 4);
      r0 += x0 * Load4(re + t);
      r1 += x1 * Load4(re + t + 4);
      i0 += x0 * Load4(im + t);
      i1 += x1 * Load4(im + t + 4);
    }
    const float sr = audio_dsp::Sum4(r0 + r1), si = audio_dsp::Sum4(i0 + i1);
    base_re_[m] = sr;
    base_im_[m] = si;
    const float power = sr * sr + si * si;
    energy += power;
    peak = std::max(peak, power);
  }

  const int slot = ring_next_;
  ring_next_ = (ring_next_ + 1) % kLongWindows;
  // Digital silence scores zero, and so does a window that one click
  // dominates: its correlation is the code itself, the same in every window
  // that a regular tick lands in alike.
  float scale = 0.0f;
  if (energy >= kSilentPower * kN && peak < kMaxCrest * energy / kN) {
    fft_.Forward(base_re_.data(), base_im_.data(), spec_re_.data(), spec_im_.data());
    // The same window half a bin lower, so its spectrum reads half a bin up.
    for (int m = 0; m < kN; ++m) {
      const float re = base_re_[m], im = base_im_[m];
      base_re_[m] = re * half_turn_re_[m] - im * half_turn_im_[m];
      base_im_[m] = re * half_turn_im_[m] + im * half_turn_re_[m];
    }
    fft_.Forward(base_re_.data(), base_im_.data(), half_re_.data(), half_im_.data());
    Condition(spec_re_.data(), spec_im_.data());
    Condition(half_re_.data(), half_im_.data());
    // Correlation powers per offset; their total from the products (the
    // inverse transform is unnormalised: sum |c|^2 = kN sum |product|^2).
    double total = 0.0;
    for (int d = 0; d < kCarrierOffsets; ++d) {
      const int shift = static_cast<int>(std::floor(kOffsetBins[d]));
      const bool half = kOffsetBins[d] != shift;
      const float* x_re = half ? half_re_.data() : spec_re_.data();
      const float* x_im = half ? half_im_.data() : spec_im_.data();
      for (int bin : code_bins_) {
        const int from = (bin + shift + kN) % kN;
        const float re = x_re[from] * code_re_[bin] - x_im[from] * code_im_[bin];
        const float im = x_re[from] * code_im_[bin] + x_im[from] * code_re_[bin];
        prod_re_[bin] = re;
        prod_im_[bin] = im;
        total += re * re + im * im;
      }
      fft_.Inverse(prod_re_.data(), prod_im_.data(), base_re_.data(), base_im_.data());
      float* powers = powers_.data();
      for (int t = 0; t < kN; t += 4) {
        const audio_dsp::Float4 re = audio_dsp::Load4(&base_re_[t]), im = audio_dsp::Load4(&base_im_[t]);
        audio_dsp::Store4(powers + t, re * re + im * im);
      }
      std::copy(powers, powers + kN, families_[0].ring[slot].data() + d * kN);
      // Sums of kSpreadLags lags every kSpreadStride lags, from sums of
      // kSpreadStride consecutive lags.
      const Family& spread = families_[1];
      float* out = families_[1].ring[slot].data() + d * spread.lags;
      for (int j = 0; j < spread.lags; ++j) {
        const float* p = powers + j * kSpreadStride;
        pooled_[j] = (p[0] + p[1]) + (p[2] + p[3]);
      }
      constexpr int kGroups = kSpreadLags / kSpreadStride;
      std::copy(pooled_.begin(), pooled_.begin() + kGroups, pooled_.begin() + spread.lags);  // cyclic
      float sum = 0.0f;
      for (int j = 0; j < kGroups; ++j) sum += pooled_[j];
      for (int j = 0; j < spread.lags; ++j) {
        out[j] = sum;
        sum += pooled_[j + kGroups] - pooled_[j];
      }
    }
    scale = static_cast<float>(kCarrierOffsets / total);
  }
  scales_[slot] = scale;

  float best = 0.0f;
  const bool update_long = windows_++ % 2 == 0;
  for (Family& f : families_) best = std::max(best, UpdateTracks(f, slot, update_long));
  score_ = kThreshold * best;
}

void HotsoundDetector::Condition(float* spec_re, float* spec_im) const {
  // Bins -reach .. reach around the carrier, the only ones read; negative
  // frequencies sit at the end of the arrays.
  const int half_band = static_cast<int>(code_bins_.size()) / 2;
  const int reach = half_band + kMaxShift;
  float power[2 * (kN / 2)];
  const auto index = [](int f) { return f < 0 ? f + kN : f; };
  double band = 0.0;
  for (int f = -reach; f <= reach; ++f) {
    const int k = index(f);
    power[f + reach] = spec_re[k] * spec_re[k] + spec_im[k] * spec_im[k];
    if (f >= -half_band && f <= half_band) band += power[f + reach];
  }
  const float band_mean = static_cast<float>(band / code_bins_.size());
  // Each block of kWhiteningBlock bins is brought to the band's mean (a
  // microphone's roll-off tilts the band, and music through it would
  // otherwise correlate with the code into smooth lag profiles; the outer
  // blocks reach over the bins the carrier offsets read); then bins far
  // above the mean (sustained tones of music, a whistle) are pulled down to
  // kMaxBinPower times it: a few tones correlate with the code into smooth
  // lag profiles that the spread statistic would take for a room. Noise and
  // the code rarely get there.
  const float ceiling = kMaxBinPower * band_mean;
  for (int lo = -half_band; lo < half_band; lo += kWhiteningBlock) {
    const int first = lo == -half_band ? -reach : lo;
    const int last = lo + kWhiteningBlock >= half_band ? reach : lo + kWhiteningBlock - 1;
    float block = 0.0f;
    for (int f = first; f <= last; ++f) block += power[f + reach];
    if (!(block > 0.0f)) continue;
    const float gain = band_mean * static_cast<float>(last - first + 1) / block;  // of power
    const float amplitude_gain = std::sqrt(gain);
    for (int f = first; f <= last; ++f) {
      const float p = power[f + reach] * gain;
      const float g = p > ceiling ? std::sqrt(gain * ceiling / p) : amplitude_gain;
      const int k = index(f);
      spec_re[k] *= g;
      spec_im[k] *= g;
    }
  }
}

float HotsoundDetector::UpdateTracks(Family& f, int newest, bool update_long) {
  // The short track over the last kWindows windows; the long one extends
  // the short track that ended kWindows windows ago by the same windows
  // (on every other window: it is for broadcasts that take a second).
  const int first = (newest + kLongWindows - kWindows + 1) % kLongWindows;
  float* short_track = f.short_tracks[newest].data();
  float* long_track = f.long_track.data();
  for (int d = 0; d < kCarrierOffsets; ++d) {
    const float* e = f.ring[first].data() + d * f.lags;
    const float scale = scales_[first];
    std::transform(e, e + f.lags, short_track + d * f.row + kPad, [=](float p) { return p * scale; });
    if (!update_long) continue;
    const float* older = f.short_tracks[(first + kLongWindows - 1) % kLongWindows].data() + d * f.row;
    std::copy(older, older + f.row, long_track + d * f.row);
    ExtendTrack(f, long_track + d * f.row, e, scale, f.drift[d]);
  }
  for (int k = 1; k < kWindows; ++k) {
    const int slot = (first + k) % kLongWindows;
    for (int d = 0; d < kCarrierOffsets; ++d) {
      const float* e = f.ring[slot].data() + d * f.lags;
      ExtendTrack(f, short_track + d * f.row, e, scales_[slot], f.drift[d]);
      if (update_long) ExtendTrack(f, long_track + d * f.row, e, scales_[slot], f.drift[d]);
    }
  }
  // Noise sums to f.pool per window on average; scores count from there,
  // relative to the thresholds, so a score near 0 means noise for either
  // family.
  const float mean = static_cast<float>(f.pool);
  const auto best = [&](const float* track) {
    audio_dsp::Float4 top = {};
    for (int d = 0; d < kCarrierOffsets; ++d) {
      const float* a = track + d * f.row + kPad;
      for (int t = 0; t < f.lags; t += 4) top = Max(top, audio_dsp::Load4(a + t));
    }
    return std::max(std::max(top[0], top[1]), std::max(top[2], top[3]));
  };
  if (update_long) {
    f.long_score = (best(long_track) - kLongWindows * mean) / (f.long_threshold - kLongWindows * mean);
  }
  return std::max((best(short_track) - kWindows * mean) / (f.threshold - kWindows * mean), f.long_score);
}

void HotsoundDetector::ExtendTrack(const Family& f, float* row, const float* powers, float scale,
                                   int drift) {
  // Rows carry kPad copies of the other end on both sides for the cyclic
  // lags; each step may move one lag around the drift.
  const int n = f.lags;
  std::copy(row + n, row + n + kPad, row);
  std::copy(row + kPad, row + 2 * kPad, row + n + kPad);
  const float* from = row + kPad - drift;
  using audio_dsp::Load4;
  const audio_dsp::Float4 gain = audio_dsp::Splat4(scale);
  for (int t = 0; t < n; t += 4) {
    const audio_dsp::Float4 best = Max(Max(Load4(from + t - 1), Load4(from + t)), Load4(from + t + 1));
    audio_dsp::Store4(pooled_.data() + t, gain * Load4(powers + t) + best);
  }
  std::copy(pooled_.begin(), pooled_.begin() + n, row + kPad);
}

std::unique_ptr<HotsoundDetector> MakeHotsoundDetector(int sample_rate, int step) {
  HotsoundDetectorConfig config;
  config.sample_rate = sample_rate;
  config.sample_rate_scale = static_cast<int64_t>(sample_rate) * 2032;
  return HotsoundDetector::Create(config, step);
}

}  // namespace audio_sorvane
