// Small numeric helpers: rational approximation of a real number, subset and
// mixed-radix enumerators, integer modulo helpers and an arithmetic sequence.
//
// All functions are pure; the iterator classes hold only their own state.
// Violated preconditions (non-finite values, non-positive bounds) end the
// process through CHECK.
#ifndef AUDIO_DSP_NUMBER_UTIL_H_
#define AUDIO_DSP_NUMBER_UTIL_H_

#include <concepts>
#include <vector>

namespace audio_dsp {

struct Rational {
  int numerator = 0;
  int denominator = 1;
  friend bool operator==(const Rational&, const Rational&) = default;
};

// The best rational approximation of `value` with 0 < denominator <=
// `max_denominator`, by continued fractions with semiconvergents. Used to turn
// a ratio of sample rates into integer resampling factors. At most 18
// continued-fraction steps are taken, and the expansion stops once the
// remainder is within 1e-9 of an integer. Requires a finite `value` that fits
// in an int and `max_denominator` > 0.
Rational RationalApproximation(int max_denominator, double value);

// Iterates over the k-element subsets of {0, ..., n - 1} in lexicographic
// order, each as an increasing index vector:
//   for (Combinations c(n, k); !c.Done(); c.Next()) Use(c.GetCombination());
// Done() is true at once when k > n. Requires k >= 0.
class Combinations {
 public:
  Combinations(int n, int k);

  bool Done() const { return done_; }
  const std::vector<int>& GetCombination() const { return indices_; }
  // Advances to the next subset; logs an error when already done.
  void Next();

 private:
  int n_;
  int k_;
  bool done_;
  std::vector<int> indices_;
};

// Iterates over all index vectors with 0 <= index[j] < radices[j], index[0]
// counting fastest. Done from the start when `radices` is empty or holds a
// radix <= 0.
class MixedRadixCounter {
 public:
  explicit MixedRadixCounter(std::vector<int> radices);

  bool Done() const { return done_; }
  const std::vector<int>& GetIndices() const { return indices_; }
  const std::vector<int>& GetRadices() const { return radices_; }
  // Advances by one; does nothing when done.
  void Next();

  // Two counters are equal when both are done, or when neither is and their
  // radices and indices agree.
  friend bool operator==(const MixedRadixCounter& a,
                         const MixedRadixCounter& b);

 private:
  std::vector<int> radices_;
  std::vector<int> indices_;
  bool done_;
};

// The remainder of x by m in [0, m), also for negative x. Requires m > 0.
template <std::integral T>
constexpr T PositiveModulo(T x, T m) {
  return x >= 0 ? x % m : m - 1 - ((-x - 1) % m);
}

// The smallest multiple of m that is >= x. Requires m > 0.
template <std::integral T>
constexpr T RoundUpToMultiple(T x, T m) {
  return x > 0 ? (x - 1) + m - ((x - 1) % m) : x + ((-x) % m);
}

// The values base, base + step, base + 2 step, ... that do not pass `limit`
// (a value within a few ulps beyond the limit still counts, so that
// ArithmeticSequence(0, 0.1, 1) ends at 1). Empty when the limit lies behind
// `base`. Requires finite arguments and a non-zero step.
class ArithmeticSequence {
 public:
  ArithmeticSequence(double base, double step, double limit);

  double base() const { return base_; }
  double step() const { return step_; }
  double limit() const { return limit_; }
  int size() const { return size_; }
  bool empty() const { return size_ == 0; }
  // Value i, computed as base + i * step (no accumulated rounding).
  double operator[](int i) const { return base_ + step_ * i; }
  std::vector<double> ToVector() const;

 private:
  double base_;
  double step_;
  double limit_;
  int size_;
};

}  // namespace audio_dsp

#endif  // AUDIO_DSP_NUMBER_UTIL_H_
