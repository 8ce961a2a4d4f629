#include "audio/dsp/number_util.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <limits>
#include <utility>

#include "base/logging.h"

namespace audio_dsp {

Rational RationalApproximation(int max_denominator, double value) {
  using std::isfinite;
  CHECK(isfinite(value));
  CHECK(max_denominator > 0);
  CHECK(std::fabs(value) <= std::numeric_limits<int>::max());

  // Current convergent p/q and the one before it, pp/qp.
  int64_t p = static_cast<int64_t>(std::floor(value));
  int64_t q = 1;
  int64_t pp = 1;
  int64_t qp = 0;
  double x = value;
  int64_t a = p;
  int64_t k = 0;
  const auto current = [&] {
    return Rational{static_cast<int>(p), static_cast<int>(q)};
  };
  for (int steps = 0;; ++steps) {
    if (steps == 18 || std::fabs(x - static_cast<double>(a)) < 1e-9) {
      return current();
    }
    x = 1.0 / (x - static_cast<double>(a));
    a = static_cast<int64_t>(std::floor(x));
    k = (max_denominator - qp) / q;
    if (k < a) break;
    pp = std::exchange(p, pp + a * p);
    qp = std::exchange(q, qp + a * q);
  }

  // The next full convergent has too large a denominator; the semiconvergent
  // with k in place of a may still beat the current convergent.
  const int64_t half = (a + 1) / 2;
  if (k < half) return current();
  const Rational semi{static_cast<int>(pp + k * p),
                      static_cast<int>(qp + k * q)};
  if (a % 2 == 1 || k > half) return semi;
  const double semi_error =
      std::fabs(value - static_cast<double>(semi.numerator) / semi.denominator);
  const double current_error =
      std::fabs(value - static_cast<double>(p) / static_cast<double>(q));
  return semi_error < current_error ? semi : current();
}

Combinations::Combinations(int n, int k) : n_(n), k_(k), done_(k > n) {
  CHECK(k >= 0);
  indices_.resize(k);
  for (int i = 0; i < k; ++i) indices_[i] = i;
}

void Combinations::Next() {
  if (done_) {
    LOG(ERROR) << "Next() called when already done.";
    return;
  }
  for (int i = k_ - 1; i >= 0; --i) {
    if (indices_[i] + 1 <= n_ - k_ + i) {
      ++indices_[i];
      for (int j = i + 1; j < k_; ++j) indices_[j] = indices_[j - 1] + 1;
      return;
    }
  }
  done_ = true;
}

MixedRadixCounter::MixedRadixCounter(std::vector<int> radices)
    : radices_(std::move(radices)),
      indices_(radices_.size(), 0),
      done_(radices_.empty()) {
  for (int radix : radices_) {
    if (radix <= 0) done_ = true;
  }
}

void MixedRadixCounter::Next() {
  if (done_) return;
  for (size_t j = 0; j < indices_.size(); ++j) {
    if (++indices_[j] < radices_[j]) return;
    indices_[j] = 0;
  }
  done_ = true;
}

bool operator==(const MixedRadixCounter& a, const MixedRadixCounter& b) {
  if (a.done_ || b.done_) return a.done_ && b.done_;
  return a.radices_ == b.radices_ && a.indices_ == b.indices_;
}

ArithmeticSequence::ArithmeticSequence(double base, double step, double limit)
    : base_(base), step_(step), limit_(limit), size_(0) {
  CHECK(std::isfinite(base_) && std::isfinite(limit_) &&
        std::isfinite(step_) && step_ != 0.0);
  // Rounding in base + i * step is a few ulps of the largest magnitude
  // involved; values that miss the limit by no more than that still count.
  const double magnitude =
      std::max({std::fabs(base_), std::fabs(limit_), std::fabs(step_)});
  const double tol = 4 * std::numeric_limits<double>::epsilon() * magnitude;
  if (std::fabs(step_) <= tol) {
    LOG(WARNING) << "step is small compared to machine precision in "
                    "ArithmeticSequence("
                 << base_ << ", " << step_ << ", " << limit_
                 << "), result is unreliable.";
  }
  const double steps_to_limit = (limit_ - base_) / step_;
  const double sized =
      std::max(0.0, std::floor(steps_to_limit + tol / std::fabs(step_)) + 1.0);
  CHECK(sized <= std::numeric_limits<int>::max())
      << "Arguments: (" << base_ << ", " << step_ << ", " << limit_ << ")";
  size_ = static_cast<int>(sized);

  const double sign_step = step_ > 0 ? 1.0 : -1.0;
  CHECK(sign_step * (base_ + step_ * (size_ - 1)) <=
        sign_step * limit_ + 2 * tol)
      << "size = " << size_ << " would overshoot limit in ArithmeticSequence("
      << base_ << ", " << step_ << ", " << limit_ << ")";
  CHECK(sign_step * limit_ < sign_step * (base_ + step_ * size_))
      << "size = " << size_ << " would undershoot limit in ArithmeticSequence("
      << base_ << ", " << step_ << ", " << limit_ << ")";
}

std::vector<double> ArithmeticSequence::ToVector() const {
  std::vector<double> values(size_);
  for (int i = 0; i < size_; ++i) values[i] = (*this)[i];
  return values;
}

}  // namespace audio_dsp
