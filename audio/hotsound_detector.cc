#include "audio/hotsound_detector.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <numbers>

#include "audio/dsp/float4.h"
#include "audio/dsp/multiversion.h"
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
// tails fall about e-fold per unit), with seven carrier offsets; eleven
// raise the tails by about ln(11 / 7) = 0.45, and the thresholds by half a
// unit with them. A broadcast at -16 dB full-band SNR in white noise sums
// about 55 on the short track at rest, 40 at 1 m/s.
constexpr float kRawThreshold = 34.5f;
constexpr float kLongRawThreshold = 46.5f;
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
constexpr double kOffsetBins[HotsoundDetector::kCarrierOffsets] = {
    -2.5, -2.0, -1.5, -1.0, -0.5, 0.0, 0.5, 1.0, 1.5, 2.0, 2.5};
// The spread family tracks only the whole-bin offsets and the outermost
// ones: its pooled sums and tracks would add a fifth to the detector's cost
// at the half-bin offsets too, for phones that move in a reverberant room,
// where the single lags of the direct path still see them.
constexpr bool kSpreadOffset[HotsoundDetector::kCarrierOffsets] = {
    true, true, false, true, false, true, false, true, false, true, true};
constexpr int kMaxShift = 3;
// The code's lag moves against the carrier offset (a faster broadcast
// reaches each window earlier in its code).
constexpr double kDriftSign = -1.0;
// Cyclic padding of a track row: covers the drift and one lag either side.
constexpr int kPad = 4;

audio_dsp::Float4 Max(audio_dsp::Float4 a, audio_dsp::Float4 b) { return a > b ? a : b; }

// The sum of n floats, four lanes at a time (a serial sum waits on each add).
float Sum(const float* x, int n) {
  audio_dsp::Float4 lanes = {};
  int i = 0;
  for (; i + 4 <= n; i += 4) lanes += audio_dsp::Load4(x + i);
  float sum = audio_dsp::Sum4(lanes);
  for (; i < n; ++i) sum += x[i];
  return sum;
}

double Blackman(double x) {  // x in [-1, 1]
  return 0.42 + 0.5 * std::cos(std::numbers::pi * x) + 0.08 * std::cos(2 * std::numbers::pi * x);
}

// Eight floats per value for MixWindow's multiply-adds: one AVX register in
// its AVX2 clones (a pair of SSE registers in the baseline one) on x86, a
// pair of Float4 elsewhere (a 32-byte vector type there goes through the
// stack).
#if defined(SORVEL_WIDE_PATHS)
typedef float Taps8 __attribute__((vector_size(32)));
#define LOAD_TAPS8(p) SORVEL_LOAD_WIDE(p)
#define FOLD_TAPS8(v) \
  (__builtin_shufflevector((v), (v), 0, 1, 2, 3) + __builtin_shufflevector((v), (v), 4, 5, 6, 7))
#else
using Taps8 = audio_dsp::Float8;
#define LOAD_TAPS8(p) audio_dsp::Load8(p)
#define FOLD_TAPS8(v) ((v).lo + (v).hi)
#endif

// Mixes a window down: baseband sample m is the dot product of `taps` input
// samples from tap_start[m] with the complex taps (tap_cos, tap_sin), times
// the carrier's phase at tap_start[m] (rotation_re, rotation_im). Returns
// the baseband's power and largest sample power.
SORVEL_MULTIVERSION void MixWindow(const float* window, const int* tap_start,
                                   const float* tap_cos, const float* tap_sin, int taps,
                                   const float* rotation_re, const float* rotation_im,
                                   float* base_re, float* base_im, float* energy, float* peak) {
  // Four baseband samples at a time: each load of the taps serves four
  // samples, and their eight chains of multiply-adds run side by side.
  using audio_dsp::Float4;
  using audio_dsp::Load4;
  Float4 total = {}, top = {};
  for (int m = 0; m < kN; m += 4) {
    const float* x[4];
    for (int j = 0; j < 4; ++j) x[j] = window + tap_start[m + j];
    Taps8 r[4] = {}, i[4] = {};
    for (int t = 0; t < taps; t += 8) {
      const Taps8 c = LOAD_TAPS8(tap_cos + t), s = LOAD_TAPS8(tap_sin + t);
      for (int j = 0; j < 4; ++j) {
        const Taps8 xv = LOAD_TAPS8(x[j] + t);
        r[j] += xv * c;
        i[j] += xv * s;
      }
    }
    Float4 re[4], im[4];
    for (int j = 0; j < 4; ++j) {
      re[j] = FOLD_TAPS8(r[j]);
      im[j] = FOLD_TAPS8(i[j]);
    }
    audio_dsp::Transpose4(re[0], re[1], re[2], re[3]);
    audio_dsp::Transpose4(im[0], im[1], im[2], im[3]);
    const Float4 sr = (re[0] + re[1]) + (re[2] + re[3]);
    const Float4 si = (im[0] + im[1]) + (im[2] + im[3]);
    const Float4 wr = Load4(rotation_re + m), wi = Load4(rotation_im + m);
    const Float4 br = sr * wr - si * wi, bi = sr * wi + si * wr;
    audio_dsp::Store4(base_re + m, br);
    audio_dsp::Store4(base_im + m, bi);
    const Float4 power = br * br + bi * bi;
    total += power;
    top = audio_dsp::Max4(top, power);
  }
  *energy = audio_dsp::Sum4(total);
  *peak = audio_dsp::MaxLane4(top);
}

// out[i] = x[i] for n samples (eight at a time in the AVX2 clones).
SORVEL_MULTIVERSION void ToFloat(const int16_t* x, size_t n, float* out) {
  for (size_t i = 0; i < n; ++i) out[i] = x[i];
}

// The products' total power over all carrier offsets: sum over offsets d
// and bins i < n (a multiple of four) of the spectrum's power at start[d] + i
// (in `half` or `whole`, as offset d reads) times the code's at i.
SORVEL_MULTIVERSION float ProductPower(const float* whole, const float* half, const int* start,
                                       const float* code, int n) {
  using audio_dsp::Float4;
  using audio_dsp::Load4;
  Float4 total = {};
  for (int i = 0; i < n; i += 4) {
    Float4 spectra = {};
    for (int d = 0; d < HotsoundDetector::kCarrierOffsets; ++d) {
      spectra += Load4((kOffsetBins[d] == std::floor(kOffsetBins[d]) ? whole : half) + start[d] + i);
    }
    total += spectra * Load4(code + i);
  }
  return audio_dsp::Sum4(total);
}

// out = |re + i im|^2 over n values (a multiple of four).
void Powers(const float* re, const float* im, int n, float* out) {
  for (int t = 0; t < n; t += 4) {
    const audio_dsp::Float4 r = audio_dsp::Load4(re + t), i = audio_dsp::Load4(im + t);
    audio_dsp::Store4(out + t, r * r + i * i);
  }
}

// Fills a track row's cyclic padding: kPad copies of the other end of its
// n lags on both sides.
void PadRow(int n, float* row) {
  std::copy(row + n, row + n + kPad, row);
  std::copy(row + kPad, row + 2 * kPad, row + n + kPad);
}

// One track step over n lags (see HotsoundDetector::ExtendTrack); the
// lane-wise maximum of `to` only when kTop.
template <bool kTop>
audio_dsp::Float4 StepTrack(int n, float* from, float* to, const float* powers, int drift) {
  // Each step may move one lag around the drift.
  PadRow(n, from);
  const float* source = from + kPad - drift;
  float* out = to + kPad;
  using audio_dsp::Load4;
  audio_dsp::Float4 top = {};
  for (int t = 0; t < n; t += 4) {
    const audio_dsp::Float4 best =
        Max(Max(Load4(source + t - 1), Load4(source + t)), Load4(source + t + 1));
    const audio_dsp::Float4 sum = Load4(powers + t) + best;
    audio_dsp::Store4(out + t, sum);
    if (kTop) top = Max(top, sum);
  }
  return top;
}

#if defined(SORVEL_WIDE_PATHS)
// StepTrack eight lags at a time.
template <bool kTop>
SORVEL_WIDE audio_dsp::Float4 StepTrackWide(int n, float* from, float* to, const float* powers,
                                            int drift) {
  using audio_dsp::Wide;
  PadRow(n, from);
  const float* source = from + kPad - drift;
  float* out = to + kPad;
  Wide top = {};
  for (int t = 0; t < n; t += 8) {
    const Wide a = SORVEL_LOAD_WIDE(source + t - 1), b = SORVEL_LOAD_WIDE(source + t);
    const Wide c = SORVEL_LOAD_WIDE(source + t + 1);
    const Wide ab = a > b ? a : b;
    const Wide best = ab > c ? ab : c;
    const Wide sum = SORVEL_LOAD_WIDE(powers + t) + best;
    SORVEL_STORE_WIDE(out + t, sum);
    if (kTop) top = top > sum ? top : sum;
  }
  return Max(__builtin_shufflevector(top, top, 0, 1, 2, 3), __builtin_shufflevector(top, top, 4, 5, 6, 7));
}
#else
template <bool kTop>
audio_dsp::Float4 StepTrackWide(int n, float* from, float* to, const float* powers, int drift) {
  return StepTrack<kTop>(n, from, to, powers, drift);
}
#endif

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
    : config_(config), step_(std::max(step, 1)), fft_(kN), wide_steps_(audio_dsp::HasWidePaths()) {
  // The broadcast's frame: the default code, chip rate and frame length.
  const SymbolWaveCoderParams coder;
  const int chips = static_cast<int>(coder.code.size());
  const double frame_seconds = chips * coder.upsampling_factor / coder.sample_rate;
  const double rate = config_.sample_rate;
  const double frame = frame_seconds * rate;  // input samples per frame
  const double spacing = frame / kN;
  hop_samples_ = static_cast<int>(std::lround(kHopFrames * frame));

  taps_ = 8 * static_cast<int>(std::ceil(kTapsPerSample * spacing / 8.0));
  // One low-pass filter for every baseband sample, centred between its
  // middle two taps: each sample reads the taps_ input samples around its
  // time rounded to the nearest input sample. That moves it by at most half
  // an input sample, under a twenty-fifth of a chip at any rate the band
  // fits (a chip spans 15 samples at 44.1 kHz), which the correlation does
  // not notice; in return one load of the shared taps serves many samples.
  const double half = taps_ / 2.0;
  const double middle = (taps_ - 1) / 2.0;
  const double w = 2.0 * std::numbers::pi * config_.frequency / rate;
  const double cutoff = kCutoffHz / rate;  // cycles per input sample
  std::vector<double> h(taps_);
  double sum = 0.0;
  for (int t = 0; t < taps_; ++t) {
    const double u = t - middle;
    const double x = 2.0 * cutoff * u;
    h[t] = std::sin(std::numbers::pi * x) / (std::numbers::pi * x) * Blackman(u / half);
    sum += h[t];
  }
  for (int t = 0; t < taps_; ++t) {
    tap_cos_.push_back(static_cast<float>(h[t] / sum * std::cos(w * t)));
    tap_sin_.push_back(static_cast<float>(-h[t] / sum * std::sin(w * t)));
  }
  for (int m = 0; m < kN; ++m) {
    const int start = static_cast<int>(std::lround(half + m * spacing - middle));
    tap_start_.push_back(start);
    rotation_re_.push_back(static_cast<float>(std::cos(w * start)));
    rotation_im_.push_back(static_cast<float>(-std::sin(w * start)));
  }
  window_size_ = tap_start_[kN - 1] + taps_;
  CHECK(hop_samples_ >= window_size_);

  // The code band-limited to its chips' bins (|k| < chips / 2) and seen at
  // kN samples per frame: its spectrum is the chips' DFT on those bins.
  half_band_ = chips / 2;
  product_size_ = (2 * half_band_ + 1 + 7) / 8 * 8;
  CHECK(product_size_ <= kN);
  code_re_.assign(product_size_, 0.0f);
  code_im_.assign(product_size_, 0.0f);
  for (int k = -half_band_; k <= half_band_; ++k) {
    std::complex<double> sum = 0.0;
    for (int n = 0; n < chips; ++n) {
      sum += static_cast<double>(coder.code[n]) *
             std::polar(1.0, -2.0 * std::numbers::pi * k * n / chips);
    }
    const std::complex<double> value = std::conj(sum) / std::sqrt(double(chips));
    code_re_[k + half_band_] = static_cast<float>(value.real());
    code_im_[k + half_band_] = static_cast<float>(value.imag());
  }
  turned_code_re_ = code_re_;
  turned_code_im_ = code_im_;
  for (int i = 1; i < product_size_; i += 2) {
    turned_code_re_[i] = -code_re_[i];
    turned_code_im_[i] = -code_im_[i];
  }
  code_power_.resize(product_size_);
  Powers(code_re_.data(), code_im_.data(), product_size_, code_power_.data());

  window_.resize(window_size_);
  for (auto* v : {&base_re_, &base_im_, &spec_re_, &spec_im_}) v->resize(kN);
  // Centred spectra and their powers, with room for the products' reads
  // past the band, a multiple of four.
  for (auto* v : {&whole_re_, &whole_im_, &half_re_, &half_im_, &whole_power_, &half_power_}) {
    v->assign((product_size_ + 2 * kMaxShift + 4 + 3) / 4 * 4, 0.0f);
  }
  for (int m = 0; m < kN; ++m) {
    half_turn_re_.push_back(static_cast<float>(std::cos(std::numbers::pi * m / kN)));
    half_turn_im_.push_back(static_cast<float>(-std::sin(std::numbers::pi * m / kN)));
  }
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
      if (&f == &families_[1] && !kSpreadOffset[d]) continue;
      f.offsets.push_back(d);
      const double compression = kOffsetBins[d] * window_rate / config_.frequency;
      f.drift.push_back(
          static_cast<int>(std::lround(kDriftSign * compression * kHopFrames * kN / f.stride)));
      CHECK(std::abs(f.drift.back()) + 1 <= kPad);
    }
    const int offsets = static_cast<int>(f.offsets.size());
    f.ring.assign(kLongWindows, std::vector<float>(offsets * f.row, 0.0f));
    f.short_tracks.assign(kLongWindows, std::vector<float>(offsets * f.row, 0.0f));
    f.short_best.assign(kLongWindows, 0.0f);
  }
  for (auto* v : {&track_a_, &track_b_, &track_c_}) v->assign(families_[0].row, 0.0f);
  static_assert(kSpreadStride == 4 && kN % 16 == 0 && kSpreadLags % 16 == 0);
  pooled_.resize(kN);
}

float HotsoundDetector::Process(std::span<const int16_t> samples) {
  // With a step of two or more the detector hears pair averages at every
  // step-th sample (the last pair of a block whose length - 1 is a multiple
  // of the step reads the last sample twice). Only the samples that land in
  // a window are formed: most of the stream falls between windows.
  const size_t n = samples.size();
  const size_t step = static_cast<size_t>(step_);
  const size_t count = (n + step - 1) / step;
  float best = -1.0f;
  size_t i = 0;
  while (i < count) {
    if (skip_ > 0) {
      const size_t dropped = std::min<size_t>(skip_, count - i);
      skip_ -= static_cast<int>(dropped);
      i += dropped;
      continue;
    }
    const size_t take = std::min<size_t>(window_size_ - fill_, count - i);
    float* out = window_.data() + fill_;
    if (step == 1) {
      ToFloat(samples.data() + i, take, out);
    } else {
      for (size_t j = 0; j < take; ++j) {
        const size_t at = (i + j) * step;
        const int next = at + 1 < n ? samples[at + 1] : samples[at];
        out[j] = static_cast<float>(static_cast<int16_t>((samples[at] + next) / 2));
      }
    }
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

void HotsoundDetector::MixDown(float* energy, float* peak) {
  MixWindow(window_.data(), tap_start_.data(), tap_cos_.data(), tap_sin_.data(), taps_,
            rotation_re_.data(), rotation_im_.data(), base_re_.data(), base_im_.data(), energy,
            peak);
}

void HotsoundDetector::ScoreWindow() {
  float energy = 0.0f, peak = 0.0f;
  MixDown(&energy, &peak);

  const int slot = ring_next_;
  ring_next_ = (ring_next_ + 1) % kLongWindows;
  // Digital silence scores zero, and so does a window that one click
  // dominates: its correlation is the code itself, the same in every window
  // that a regular tick lands in alike.
  if (energy >= kSilentPower * kN && peak < kMaxCrest * energy / kN) {
    fft_.Forward(base_re_.data(), base_im_.data(), spec_re_.data(), spec_im_.data());
    Condition(spec_re_.data(), spec_im_.data(), whole_re_.data(), whole_im_.data());
    // The same window half a bin lower, so its spectrum reads half a bin up.
    for (int m = 0; m < kN; ++m) {
      const float re = base_re_[m], im = base_im_[m];
      base_re_[m] = re * half_turn_re_[m] - im * half_turn_im_[m];
      base_im_[m] = re * half_turn_im_[m] + im * half_turn_re_[m];
    }
    fft_.Forward(base_re_.data(), base_im_.data(), spec_re_.data(), spec_im_.data());
    Condition(spec_re_.data(), spec_im_.data(), half_re_.data(), half_im_.data());
    // Per carrier offset the spectrum times the code's, whose total power
    // gives the lags' mean power (the inverse transform is unnormalised:
    // sum |c|^2 = kN sum |product|^2). The products sit from bin 0 rather
    // than around it: a cyclic shift of the spectrum turns the lags' phases
    // but not their powers.
    const int spectrum_size = static_cast<int>(whole_re_.size());
    Powers(whole_re_.data(), whole_im_.data(), spectrum_size, whole_power_.data());
    Powers(half_re_.data(), half_im_.data(), spectrum_size, half_power_.data());
    int start[kCarrierOffsets];
    for (int d = 0; d < kCarrierOffsets; ++d) {
      start[d] = kMaxShift + static_cast<int>(std::floor(kOffsetBins[d]));
    }
    const float total = ProductPower(whole_power_.data(), half_power_.data(), start,
                                     code_power_.data(), product_size_);
    // Correlation powers in units of their mean.
    const float scale = kCarrierOffsets / total;
    int spread_row = 0;
    // Odd windows start half a frame further into the code: their lags are
    // turned back by half a frame (every odd input of the inverse transform
    // negated), so that a broadcast keeps its lag from window to window.
    const bool turned = windows_ % 2 == 1;
    const float* code_re = (turned ? turned_code_re_ : code_re_).data();
    const float* code_im = (turned ? turned_code_im_ : code_im_).data();
    for (int d = 0; d < kCarrierOffsets; ++d) {
      const bool half = kOffsetBins[d] != std::floor(kOffsetBins[d]);
      float* powers = families_[0].ring[slot].data() + d * families_[0].row + kPad;
      fft_.InverseProductPowers((half ? half_re_ : whole_re_).data() + start[d],
                                (half ? half_im_ : whole_im_).data() + start[d], code_re, code_im,
                                product_size_, scale, powers);
      if (kSpreadOffset[d]) {
        PoolSpread(powers, families_[1].ring[slot].data() + spread_row * families_[1].row + kPad);
        ++spread_row;
      }
    }
  } else {
    for (Family& f : families_) std::fill(f.ring[slot].begin(), f.ring[slot].end(), 0.0f);
  }

  float best = 0.0f;
  const bool update_long = windows_++ % 2 == 0;
  for (Family& f : families_) best = std::max(best, UpdateTracks(f, slot, update_long));
  score_ = kThreshold * best;
}

void HotsoundDetector::PoolSpread(const float* powers, float* out) {
  using audio_dsp::Float4;
  using audio_dsp::Load4;
  // pooled[j]: the sum of kSpreadStride consecutive lags from j * stride.
  // An output adds kGroups of those from j on (cyclically): split at the
  // block of kGroups that j falls in, it is the rest of j's block plus the
  // start of the next, i.e. the block's total less its sums before j, plus
  // the next block's sums before j. Sums before each entry are taken per
  // block, so rounding never spans more than one block.
  constexpr int kLags = kN / kSpreadStride;
  constexpr int kGroups = kSpreadLags / kSpreadStride;
  constexpr int kBlocks = kLags / kGroups;
  static_assert(kLags % kGroups == 0 && kGroups % 4 == 0);
  float* pooled = pooled_.data();
  for (int t = 0; t < kN; t += 16) {
    Float4 a = Load4(powers + t), b = Load4(powers + t + 4), c = Load4(powers + t + 8),
           e = Load4(powers + t + 12);
    audio_dsp::Transpose4(a, b, c, e);
    audio_dsp::Store4(pooled + t / 4, (a + b) + (c + e));
  }
  float* before = pooled + kLags;  // per entry, its block's sums before it
  float totals[kBlocks];
  for (int block = 0; block < kBlocks; ++block) {
    Float4 carry = {};
    for (int j = block * kGroups; j < (block + 1) * kGroups; j += 4) {
      const Float4 x = Load4(pooled + j);
      // Inclusive running sums of the four lanes, then of the block.
      Float4 run = x + __builtin_shufflevector(x, Float4{}, 4, 0, 1, 2);
      run += __builtin_shufflevector(run, Float4{}, 4, 4, 0, 1);
      run += carry;
      audio_dsp::Store4(before + j, run - x);
      carry = audio_dsp::Splat4(run[3]);
    }
    totals[block] = carry[0];
  }
  for (int block = 0; block < kBlocks; ++block) {
    const int next = (block + 1) % kBlocks;
    const Float4 total = audio_dsp::Splat4(totals[block]);
    for (int k = 0; k < kGroups; k += 4) {
      audio_dsp::Store4(out + block * kGroups + k,
                        total - Load4(before + block * kGroups + k) +
                            Load4(before + next * kGroups + k));
    }
  }
}

void HotsoundDetector::Condition(const float* spec_re, const float* spec_im, float* out_re,
                                 float* out_im) const {
  // Bins -reach .. reach around the carrier, the only ones read; negative
  // frequencies sit at the end of the input arrays.
  const int half_band = half_band_;
  const int reach = half_band + kMaxShift;
  const int width = 2 * reach + 1;
  std::copy(spec_re + kN - reach, spec_re + kN, out_re);
  std::copy(spec_im + kN - reach, spec_im + kN, out_im);
  std::copy(spec_re, spec_re + reach + 1, out_re + reach);
  std::copy(spec_im, spec_im + reach + 1, out_im + reach);
  // Powers of the centred bins (the outputs are zero past `width`).
  using audio_dsp::Float4;
  float power[kN];
  Float4 all = {};
  for (int i = 0; i < width; i += 4) {
    const Float4 re = audio_dsp::Load4(out_re + i), im = audio_dsp::Load4(out_im + i);
    const Float4 p = re * re + im * im;
    audio_dsp::Store4(power + i, p);
    all += p;
  }
  float band = audio_dsp::Sum4(all);
  for (int i = 0; i < kMaxShift; ++i) band -= power[i] + power[width - 1 - i];
  const float band_mean = std::max(band, 0.0f) / static_cast<float>(2 * half_band + 1);
  // Each block of kWhiteningBlock bins is brought to the band's mean (a
  // microphone's roll-off tilts the band, and music through it would
  // otherwise correlate with the code into smooth lag profiles; the outer
  // blocks reach over the bins the carrier offsets read); then bins far
  // above the mean (sustained tones of music, a whistle) are pulled down to
  // kMaxBinPower times it: a few tones correlate with the code into smooth
  // lag profiles that the spread statistic would take for a room. Noise and
  // the code rarely get there.
  const float ceiling = kMaxBinPower * band_mean;
  float amplitudes[kN];  // per centred bin: its block's amplitude gain
  std::fill(amplitudes + width, amplitudes + (width + 3) / 4 * 4, 0.0f);
  for (int lo = -half_band; lo < half_band; lo += kWhiteningBlock) {
    const int first = lo == -half_band ? -reach : lo;
    const int last = lo + kWhiteningBlock >= half_band ? reach : lo + kWhiteningBlock - 1;
    const float block = Sum(power + (first + reach), last - first + 1);
    // A block without power stays as it is (zero).
    const float gain = block > 0.0f ? band_mean * static_cast<float>(last - first + 1) / block : 1.0f;
    std::fill(amplitudes + (first + reach), amplitudes + (last + reach + 1), std::sqrt(gain));
  }
  // A bin whose power p would exceed the ceiling after its block's gain is
  // scaled to the ceiling instead, by sqrt(ceiling / p): the lesser of the
  // two amplitude gains (the comparison keeps the block's where p is zero).
  const Float4 root_ceiling = audio_dsp::Splat4(std::sqrt(ceiling));
  for (int i = 0; i < width; i += 4) {
    const Float4 amplitude = audio_dsp::Load4(amplitudes + i);
    const Float4 clipped = root_ceiling * audio_dsp::Rsqrt4(audio_dsp::Load4(power + i));
    const Float4 g = clipped < amplitude ? clipped : amplitude;
    audio_dsp::Store4(out_re + i, audio_dsp::Load4(out_re + i) * g);
    audio_dsp::Store4(out_im + i, audio_dsp::Load4(out_im + i) * g);
  }
}

float HotsoundDetector::UpdateTracks(Family& f, int newest, bool update_long) {
  // The short track over the last kWindows windows starts from the oldest
  // window's row; the long one extends the short track that ended kWindows
  // windows ago by the same windows (on every other window: it is for
  // broadcasts that take a second). One carrier offset at a time, through
  // two scratch rows, so that a track's steps stay in the first-level cache.
  const int first = (newest + kLongWindows - kWindows + 1) % kLongWindows;
  static_assert(kWindows >= 2);
  const int older_slot = (first + kLongWindows - 1) % kLongWindows;
  const int offsets = static_cast<int>(f.offsets.size());
  float* const scratch[2] = {track_a_.data(), track_b_.data()};
  // Runs the steps over windows first + k0 .. newest from `start`, ending in
  // `end`; returns the lane-wise maximum of the last step.
  const auto follow = [&](int d, int k0, float* start, float* end) {
    const int row = d * f.row;
    float* from = start;
    for (int k = k0; k < kWindows - 1; ++k) {
      float* const to = scratch[k % 2];
      ExtendTrack<false>(f, from, to, f.ring[(first + k) % kLongWindows].data() + row + kPad,
                         f.drift[d]);
      from = to;
    }
    return ExtendTrack<true>(f, from, end, f.ring[newest].data() + row + kPad, f.drift[d]);
  };
  // The last step's outputs give each track's best sum.
  audio_dsp::Float4 short_top = {};
  for (int d = 0; d < offsets; ++d) {
    const int row = d * f.row;
    short_top = Max(short_top, follow(d, 1, f.ring[first].data() + row,
                                      f.short_tracks[newest].data() + row));
  }
  f.short_best[newest] = audio_dsp::MaxLane4(short_top);
  // Noise sums to f.pool per window on average; scores count from there,
  // relative to the thresholds, so a score near 0 means noise for either
  // family.
  const float mean = static_cast<float>(f.pool);
  const auto long_score = [&](float sum) {
    return (sum - kLongWindows * mean) / (f.long_threshold - kLongWindows * mean);
  };
  // A long track sums no more than the best of the older short track plus
  // the best of this one (the same windows from a zero start). Where even
  // that stays below kLongGate, the long track cannot decide a wake and its
  // steps are skipped: in noise they are a third of the tracks' work.
  if (update_long && long_score(f.short_best[older_slot] + f.short_best[newest]) < kLongGate) {
    f.long_score = 0.0f;
  } else if (update_long) {
    audio_dsp::Float4 long_top = {};
    for (int d = 0; d < offsets; ++d) {
      long_top = Max(long_top, follow(d, 0, f.short_tracks[older_slot].data() + d * f.row,
                                      track_c_.data()));
    }
    f.long_score = long_score(audio_dsp::MaxLane4(long_top));
  }
  return std::max(
      (f.short_best[newest] - kWindows * mean) / (f.threshold - kWindows * mean), f.long_score);
}

template <bool kTop>
audio_dsp::Float4 HotsoundDetector::ExtendTrack(const Family& f, float* from, float* to,
                                                const float* powers, int drift) const {
  return wide_steps_ ? StepTrackWide<kTop>(f.lags, from, to, powers, drift)
                     : StepTrack<kTop>(f.lags, from, to, powers, drift);
}

bool HotsoundDetector::UseWideSteps(bool wide) {
  if (wide && !audio_dsp::HasWidePaths()) return false;
  wide_steps_ = wide;
  return true;
}

std::unique_ptr<HotsoundDetector> MakeHotsoundDetector(int sample_rate, int step) {
  HotsoundDetectorConfig config;
  config.sample_rate = sample_rate;
  config.sample_rate_scale = static_cast<int64_t>(sample_rate) * 2032;
  return HotsoundDetector::Create(config, step);
}

}  // namespace audio_sorvane
