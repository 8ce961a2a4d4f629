#include "audio/dsp/number_util.h"

#include <cmath>
#include <numbers>
#include <vector>

#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace audio_dsp {
namespace {

using sorvel_test::CheckFailed;

// Verifies reference approximations, including sample-rate ratios, the
// semiconvergent cases of pi and exact integers and fractions.
TEST(RationalApproximationTest, MatchesReferenceValues) {
  struct Case {
    int max_denominator;
    double value;
    Rational expected;
  };
  const Case cases[] = {
      {2000, 44100.0 / 16000.0, {441, 160}},
      {2000, 48000.0 / 44100.0, {160, 147}},
      {2000, 14700.0 / 44100.0, {1, 3}},
      {10, std::numbers::pi, {22, 7}},
      {100, std::numbers::pi, {311, 99}},
      {1000, std::numbers::pi, {355, 113}},
      {1, std::numbers::pi, {3, 1}},
      {2000, 7.0, {7, 1}},
      {2000, -2.5, {-5, 2}},
      {2000, 0.0, {0, 1}},
      {5, 0.6, {3, 5}},
      {4, 0.6, {2, 3}},  // 1/2 and 2/3 bracket it; 2/3 is closer
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(testing::Message() << c.value << " / " << c.max_denominator);
    EXPECT_EQ(RationalApproximation(c.max_denominator, c.value), c.expected);
  }
}

// Verifies that no denominator exceeds the bound and that the result is at
// least as close as any fraction with that denominator bound (brute force).
TEST(RationalApproximationTest, IsBestWithinDenominatorBound) {
  for (double value : {0.3183098861, 1.41421356237, 2.718281828, 0.123456}) {
    for (int max_denominator : {1, 2, 3, 7, 10, 57, 200}) {
      const Rational r = RationalApproximation(max_denominator, value);
      ASSERT_GE(r.denominator, 1);
      ASSERT_LE(r.denominator, max_denominator);
      const double error =
          std::fabs(value - static_cast<double>(r.numerator) / r.denominator);
      for (int q = 1; q <= max_denominator; ++q) {
        const double p = std::round(value * q);
        EXPECT_LE(error, std::fabs(value - p / q) + 1e-12)
            << value << " with q <= " << max_denominator << ": got "
            << r.numerator << "/" << r.denominator << ", " << p << "/" << q
            << " is closer";
      }
    }
  }
}

TEST(CombinationsTest, EnumeratesSubsetsInLexicographicOrder) {
  std::vector<std::vector<int>> subsets;
  for (Combinations c(10, 2); !c.Done(); c.Next()) {
    subsets.push_back(c.GetCombination());
  }
  ASSERT_EQ(subsets.size(), 45u);
  EXPECT_EQ(subsets.front(), (std::vector<int>{0, 1}));
  EXPECT_EQ(subsets[1], (std::vector<int>{0, 2}));
  EXPECT_EQ(subsets[9], (std::vector<int>{1, 2}));
  EXPECT_EQ(subsets.back(), (std::vector<int>{8, 9}));
  for (size_t i = 1; i < subsets.size(); ++i) {
    EXPECT_LT(subsets[i - 1], subsets[i]);
  }

  int count = 0;
  for (Combinations c(5, 3); !c.Done(); c.Next()) ++count;
  EXPECT_EQ(count, 10);
  count = 0;
  for (Combinations c(4, 0); !c.Done(); c.Next()) ++count;
  EXPECT_EQ(count, 1);
  count = 0;
  for (Combinations c(3, 3); !c.Done(); c.Next()) ++count;
  EXPECT_EQ(count, 1);
}

// Verifies that k > n is done at once and that advancing a finished
// iterator logs an error and changes nothing.
TEST(CombinationsTest, NextWhenDoneLogsError) {
  Combinations c(2, 3);
  EXPECT_TRUE(c.Done());
  sorvel_test::ScopedLogCapture capture;
  c.Next();
  EXPECT_TRUE(c.Done());
  EXPECT_TRUE(
      capture.Contains(sorvel_base::ERROR, "Next() called when already done."));
}

TEST(MixedRadixCounterTest, CountsWithCarryAndCompares) {
  std::vector<std::vector<int>> seen;
  for (MixedRadixCounter c({2, 3}); !c.Done(); c.Next()) {
    seen.push_back(c.GetIndices());
  }
  const std::vector<std::vector<int>> expected = {{0, 0}, {1, 0}, {0, 1},
                                                  {1, 1}, {0, 2}, {1, 2}};
  EXPECT_EQ(seen, expected);

  EXPECT_TRUE(MixedRadixCounter({}).Done());
  EXPECT_TRUE(MixedRadixCounter({3, 0, 2}).Done());
  EXPECT_TRUE(MixedRadixCounter({3, -1}).Done());

  MixedRadixCounter a({2, 2});
  MixedRadixCounter b({2, 2});
  EXPECT_TRUE(a == b);
  a.Next();
  EXPECT_FALSE(a == b);
  b.Next();
  EXPECT_TRUE(a == b);
  EXPECT_FALSE(a == MixedRadixCounter({2, 3}));
  EXPECT_TRUE(MixedRadixCounter({}) == MixedRadixCounter({4, 0}));
  EXPECT_FALSE(a == MixedRadixCounter({}));
}

TEST(IntegerHelpersTest, ModuloAndRoundUp) {
  struct Case {
    int x, m, modulo, round_up;
  };
  const Case cases[] = {
      {-1, 5, 4, 0},  {-5, 5, 0, -5}, {-6, 5, 4, -5}, {0, 3, 0, 0},
      {6, 3, 0, 6},   {7, 3, 1, 9},   {1, 1, 0, 1},   {-7, 3, 2, -6},
      {13, 8, 5, 16}, {8, 8, 0, 8},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(PositiveModulo(c.x, c.m), c.modulo) << c.x << " mod " << c.m;
    EXPECT_EQ(RoundUpToMultiple(c.x, c.m), c.round_up) << c.x << ", " << c.m;
  }
  static_assert(PositiveModulo<long>(-1, 7) == 6);
}

TEST(ArithmeticSequenceTest, SizesAndValues) {
  struct Case {
    double base, step, limit;
    int size;
    double last;
  };
  const Case cases[] = {
      {0.0, 0.1, 1.0, 11, 1.0},   // 10 steps of 0.1 land within rounding
      {0.0, 1.0, 4.5, 5, 4.0},    {1.0, -0.25, 0.0, 5, 0.0},
      {5.0, 1.0, 5.0, 1, 5.0},    {0.0, 1.0, -1.0, 0, 0.0},
      {0.0, -1.0, 1.0, 0, 0.0},   {-3.0, 0.7, 3.0, 9, 2.6},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(testing::Message() << c.base << ", " << c.step << ", "
                                    << c.limit);
    const ArithmeticSequence s(c.base, c.step, c.limit);
    ASSERT_EQ(s.size(), c.size);
    EXPECT_EQ(s.ToVector().size(), static_cast<size_t>(c.size));
    if (c.size > 0) {
      EXPECT_DOUBLE_EQ(s[0], c.base);
      EXPECT_NEAR(s[c.size - 1], c.last, 1e-12);
    }
  }
}

TEST(ArithmeticSequenceTest, WarnsWhenStepIsBelowPrecision) {
  sorvel_test::ScopedLogCapture capture;
  const ArithmeticSequence s(1.0, 1e-17, 1.0);
  EXPECT_GE(s.size(), 1);
  EXPECT_TRUE(capture.Contains(
      sorvel_base::WARNING,
      "step is small compared to machine precision in ArithmeticSequence("));
  EXPECT_TRUE(capture.Contains(sorvel_base::WARNING, "), result is unreliable."));
}

#if GTEST_HAS_DEATH_TEST
TEST(NumberUtilDeathTest, RejectsInvalidArguments) {
  EXPECT_DEATH(RationalApproximation(10, std::nan("")),
               CheckFailed("isfinite(value)"));
  EXPECT_DEATH(RationalApproximation(10, INFINITY),
               CheckFailed("isfinite(value)"));
  EXPECT_DEATH(RationalApproximation(0, 1.5),
               CheckFailed("max_denominator > 0"));
  const char* kSequenceCheck =
      "std::isfinite(base_) && std::isfinite(limit_) && "
      "std::isfinite(step_) && step_ != 0.0";
  EXPECT_DEATH(ArithmeticSequence(0.0, 0.0, 1.0), CheckFailed(kSequenceCheck));
  EXPECT_DEATH(ArithmeticSequence(NAN, 1.0, 1.0), CheckFailed(kSequenceCheck));
  EXPECT_DEATH(ArithmeticSequence(0.0, 1e-6, 1e6),
               CheckFailed("sized <= std::numeric_limits<int>::max()"));
}
#endif

}  // namespace
}  // namespace audio_dsp
