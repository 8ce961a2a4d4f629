#include "audio/sorvane/dtmf/tone_sequence_search.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <limits>

#include "base/logging.h"

namespace audio_sorvane {
namespace {

// Relative ridge on the normal matrices: masks whose shifted copies are
// nearly dependent (all on, or one position) still give a finite fit.
constexpr double kRidge = 1e-6;

int IntPow(int base, int exponent) {
  long long v = 1;
  for (int i = 0; i < exponent; ++i) {
    v *= base;
    if (v > ToneSequenceSearch::kMaxStates) return ToneSequenceSearch::kMaxStates + 1;
  }
  return static_cast<int>(v);
}

}  // namespace

bool ToneSequenceSearch::Supported(const ToneSequenceSearchParams& p) {
  return p.num_tones >= 1 && p.num_tones <= 32 && p.period >= 2 && p.period <= kMaxPeriod &&
         p.tones_per_symbol >= 1 && p.tones_per_symbol <= p.num_tones && p.num_taps >= 1 &&
         p.num_taps <= std::min(p.period, kMaxTaps) && p.masks_per_tone >= 1 &&
         p.masks_per_tone < (1 << p.period) && p.masks_per_tone <= 100 &&
         IntPow(p.tones_per_symbol + 1, p.period) <= kMaxStates;
}

ToneSequenceSearch::ToneSequenceSearch(const ToneSequenceSearchParams& params)
    : params_(params) {
  CHECK(Supported(params));
  num_masks_ = 1 << params_.period;
  const int base = params_.tones_per_symbol + 1;
  num_states_ = IntPow(base, params_.period);
  state_step_.resize(params_.period);
  for (int p = 0, step = 1; p < params_.period; ++p, step *= base) state_step_[p] = step;
  full_.assign(num_states_, 0);
  for (int s = 0; s < num_states_; ++s) {
    for (int p = 0, rest = s; p < params_.period; ++p, rest /= base) {
      if (rest % base == params_.tones_per_symbol) full_[s] |= 1u << p;
    }
  }
  const int taps = params_.num_taps;
  factors_.assign(static_cast<size_t>(num_masks_) * taps * taps, 0.0);
  residuals_.assign(static_cast<size_t>(params_.num_tones) * num_masks_, 0.0);
  sums_.resize(static_cast<size_t>(taps) * params_.period);
  fits_.resize(static_cast<size_t>(num_masks_) * taps);
  cost_.assign(num_states_, std::numeric_limits<double>::infinity());
  next_cost_.assign(num_states_, std::numeric_limits<double>::infinity());
  choice_.assign(static_cast<size_t>(params_.num_tones) * num_states_, -1);
  candidates_.resize(static_cast<size_t>(params_.num_tones) * (params_.masks_per_tone + 1));
}

// For mask m the normal matrix is G[j][i] = #frames n with both a(n - j) and
// a(n - i) on. Frame n is at position (n - j) mod period for tap j, so with
// count_j(p) = #{n : (n - j) mod period = p},
// G[j][i] = sum over p in m with (p + j - i) mod period in m of count_j(p).
void ToneSequenceSearch::FactorNormalMatrices(int num_frames) {
  if (num_frames == factored_frames_) return;
  factored_frames_ = num_frames;
  const int period = params_.period, taps = params_.num_taps;
  std::vector<int> count(static_cast<size_t>(taps) * period, 0);
  for (int j = 0; j < taps; ++j) {
    for (int n = 0; n < num_frames; ++n) ++count[j * period + ((n - j) % period + period) % period];
  }
  double g[kMaxTaps * kMaxTaps];
  for (int m = 1; m < num_masks_; ++m) {
    for (int j = 0; j < taps; ++j) {
      for (int i = 0; i <= j; ++i) {
        int sum = 0;
        for (int p = 0; p < period; ++p) {
          const int q = ((p + j - i) % period + period) % period;
          if ((m >> p & 1) && (m >> q & 1)) sum += count[j * period + p];
        }
        g[j * taps + i] = sum;
      }
    }
    double trace = 0.0;
    for (int j = 0; j < taps; ++j) trace += g[j * taps + j];
    const double ridge = kRidge * trace / taps + 1e-12;
    // In-place Cholesky of the lower triangle: G = L L^T.
    double* l = &factors_[static_cast<size_t>(m) * taps * taps];
    for (int j = 0; j < taps; ++j) {
      for (int i = 0; i <= j; ++i) {
        double v = g[j * taps + i] + (i == j ? ridge : 0.0);
        for (int c = 0; c < i; ++c) v -= l[j * taps + c] * l[i * taps + c];
        l[j * taps + i] = i == j ? std::sqrt(std::max(v, ridge)) : v / l[i * taps + i];
      }
    }
  }
}

// Residual of tone k under mask m: |y_k|^2 - b^H G^-1 b with
// b[j] = sum over p in m of S_k[j][p], S_k[j][p] the sum of y_k(n) over the
// frames at position p for tap j. b grows one position at a time from the
// mask without its lowest bit.
void ToneSequenceSearch::FitResiduals(const audio_dsp::ComplexMatrix& frames) {
  const int period = params_.period, taps = params_.num_taps;
  const int num_frames = static_cast<int>(frames.rows());
  for (int k = 0; k < params_.num_tones; ++k) {
    std::fill(sums_.begin(), sums_.end(), std::complex<double>());
    double energy = 0.0;
    for (int n = 0; n < num_frames; ++n) {
      const std::complex<double> y(frames(n, k));
      energy += std::norm(y);
      for (int j = 0; j < taps; ++j) sums_[j * period + ((n - j) % period + period) % period] += y;
    }
    double* out = &residuals_[static_cast<size_t>(k) * num_masks_];
    out[0] = energy;
    for (int j = 0; j < taps; ++j) fits_[j] = 0.0;
    for (int m = 1; m < num_masks_; ++m) {
      const int low = std::countr_zero(static_cast<unsigned>(m));
      const std::complex<double>* from = &fits_[static_cast<size_t>(m & (m - 1)) * taps];
      std::complex<double>* b = &fits_[static_cast<size_t>(m) * taps];
      for (int j = 0; j < taps; ++j) b[j] = from[j] + sums_[j * period + low];
      // |L^-1 b|^2 = b^H G^-1 b.
      const double* l = &factors_[static_cast<size_t>(m) * taps * taps];
      std::complex<double> v[kMaxTaps];
      double fit = 0.0;
      for (int j = 0; j < taps; ++j) {
        std::complex<double> x = b[j];
        for (int c = 0; c < j; ++c) x -= l[j * taps + c] * v[c];
        v[j] = x / l[j * taps + j];
        fit += std::norm(v[j]);
      }
      out[m] = std::max(energy - fit, 0.0);
    }
  }
}

// Dynamic programming over tones; a state counts the tones chosen so far at
// every position. Only reachable states are visited.
namespace {
// Partial assignments kept after each tone.
constexpr int kBeamStates = 1024;
}  // namespace

bool ToneSequenceSearch::Combine(std::vector<uint32_t>* tone_masks, double* cost) {
  const int per_tone = params_.masks_per_tone + 1;
  const double inf = std::numeric_limits<double>::infinity();
  std::vector<int> order(num_masks_ - 1);
  for (int k = 0; k < params_.num_tones; ++k) {
    for (int m = 1; m < num_masks_; ++m) order[m - 1] = m;
    const double* r = &residuals_[static_cast<size_t>(k) * num_masks_];
    std::partial_sort(order.begin(), order.begin() + params_.masks_per_tone, order.end(),
                      [r](int a, int b) { return r[a] < r[b]; });
    uint32_t* c = &candidates_[static_cast<size_t>(k) * per_tone];
    c[0] = 0;
    for (int i = 0; i < params_.masks_per_tone; ++i) c[i + 1] = static_cast<uint32_t>(order[i]);
  }
  const auto increment = [&](uint32_t mask) {
    int v = 0;
    for (int p = 0; p < params_.period; ++p) {
      if (mask >> p & 1) v += state_step_[p];
    }
    return v;
  };

  for (int s : active_) cost_[s] = inf;
  active_.assign(1, 0);
  cost_[0] = 0.0;
  for (int k = 0; k < params_.num_tones; ++k) {
    const uint32_t* c = &candidates_[static_cast<size_t>(k) * per_tone];
    const double* r = &residuals_[static_cast<size_t>(k) * num_masks_];
    int8_t* choice = &choice_[static_cast<size_t>(k) * num_states_];
    next_active_.clear();
    for (int i = 0; i < per_tone; ++i) {
      const uint32_t mask = c[i];
      const int step = increment(mask);
      for (int s : active_) {
        if (full_[s] & mask) continue;
        const int to = s + step;
        const double v = cost_[s] + r[mask];
        if (next_cost_[to] == inf) next_active_.push_back(to);
        if (v < next_cost_[to]) {
          next_cost_[to] = v;
          choice[to] = static_cast<int8_t>(i);
        }
      }
    }
    if (static_cast<int>(next_active_.size()) > kBeamStates) {
      // Only the cheapest partial assignments go on: the full table of
      // per-position tone counts is large (3^9 for the default loop), and
      // the right answer fits each present tone far better than the rest.
      std::nth_element(next_active_.begin(), next_active_.begin() + kBeamStates, next_active_.end(),
                       [this](int a, int b) { return next_cost_[a] < next_cost_[b]; });
      for (size_t i = kBeamStates; i < next_active_.size(); ++i) next_cost_[next_active_[i]] = inf;
      next_active_.resize(kBeamStates);
    }
    for (int s : active_) cost_[s] = inf;
    for (int s : next_active_) cost_[s] = next_cost_[s], next_cost_[s] = inf;
    active_.swap(next_active_);
  }
  int final_state = 0;
  for (int p = 0; p < params_.period; ++p) final_state += params_.tones_per_symbol * state_step_[p];
  if (cost_[final_state] == inf) return false;
  *cost = cost_[final_state];
  tone_masks->assign(params_.num_tones, 0);
  for (int k = params_.num_tones - 1, s = final_state; k >= 0; --k) {
    const int i = choice_[static_cast<size_t>(k) * num_states_ + s];
    const uint32_t mask = candidates_[static_cast<size_t>(k) * per_tone + i];
    (*tone_masks)[k] = mask;
    s -= increment(mask);
  }
  return true;
}

bool ToneSequenceSearch::Search(const audio_dsp::ComplexMatrix& frames,
                                std::vector<uint32_t>* tone_masks, double* cost) {
  CHECK(tone_masks);
  CHECK(cost);
  CHECK(frames.cols() == params_.num_tones);
  const int num_frames = static_cast<int>(frames.rows());
  if (num_frames < params_.period) return false;
  FactorNormalMatrices(num_frames);
  FitResiduals(frames);
  return Combine(tone_masks, cost);
}

}  // namespace audio_sorvane
