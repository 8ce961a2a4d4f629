#include "audio/dsp/number_util.h"

#include <algorithm>
#include <cmath>
#include <numbers>
#include <vector>

#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace audio_dsp {
namespace {

using sorvel_test::CheckFailed;

// Sample-rate ratios, the semiconvergent cases of pi (311/99 is a
// semiconvergent, 2/3 beats 1/2 at an even partial quotient), integers and
// negative values.
TEST(RationalApproximationTest, MatchesReferenceValues) {
  struct Case {
    int max_denominator;
    double value;
    Rational expected;
  };
  const Case cases[] = {
      {2000, 44100.0 / 16000.0, {441, 160}}, {2000, 48000.0 / 44100.0, {160, 147}},
      {2000, 14700.0 / 44100.0, {1, 3}},     {10, std::numbers::pi, {22, 7}},
      {100, std::numbers::pi, {311, 99}},    {1000, std::numbers::pi, {355, 113}},
      {1, std::numbers::pi, {3, 1}},         {2000, 7.0, {7, 1}},
      {2000, -2.5, {-5, 2}},                 {4, 0.6, {2, 3}},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(RationalApproximation(c.max_denominator, c.value), c.expected)
        << c.value << " / " << c.max_denominator;
  }
}

TEST(CombinationsTest, EnumeratesSubsetsInLexicographicOrder) {
  std::vector<std::vector<int>> subsets;
  for (Combinations c(10, 2); !c.Done(); c.Next()) subsets.push_back(c.GetCombination());
  ASSERT_EQ(subsets.size(), 45u);
  EXPECT_EQ(subsets[0], (std::vector<int>{0, 1}));
  EXPECT_EQ(subsets[9], (std::vector<int>{1, 2}));
  EXPECT_EQ(subsets[44], (std::vector<int>{8, 9}));
  EXPECT_TRUE(std::is_sorted(subsets.begin(), subsets.end()));

  Combinations done(2, 3);
  EXPECT_TRUE(done.Done());
  sorvel_test::ScopedLogCapture capture;
  done.Next();
  EXPECT_TRUE(capture.Contains(sorvel_base::ERROR, "Next() called when already done."));
}

TEST(MixedRadixCounterTest, CountsWithCarryAndCompares) {
  std::vector<std::vector<int>> seen;
  for (MixedRadixCounter c({2, 3}); !c.Done(); c.Next()) seen.push_back(c.GetIndices());
  EXPECT_EQ(seen, (std::vector<std::vector<int>>{
                      {0, 0}, {1, 0}, {0, 1}, {1, 1}, {0, 2}, {1, 2}}));
  EXPECT_TRUE(MixedRadixCounter({3, 0}).Done());
  EXPECT_TRUE(MixedRadixCounter({}) == MixedRadixCounter({4, -1}));
  MixedRadixCounter a({2, 2});
  a.Next();
  EXPECT_FALSE(a == MixedRadixCounter({2, 2}));
}

TEST(IntegerHelpersTest, ModuloAndRoundUp) {
  struct Case {
    int x, m, modulo, round_up;
  };
  const Case cases[] = {{-1, 5, 4, 0}, {-6, 5, 4, -5}, {0, 3, 0, 0},
                        {6, 3, 0, 6},  {7, 3, 1, 9},   {-7, 3, 2, -6}};
  for (const Case& c : cases) {
    EXPECT_EQ(PositiveModulo(c.x, c.m), c.modulo) << c.x << " mod " << c.m;
    EXPECT_EQ(RoundUpToMultiple(c.x, c.m), c.round_up) << c.x << ", " << c.m;
  }
}

// Verifies that rounding in base + i * step neither drops the limit (0.1 * 10
// lands a hair off 1) nor adds a value past it, in both directions.
TEST(ArithmeticSequenceTest, SizesAndValues) {
  struct Case {
    double base, step, limit;
    int size;
  };
  const Case cases[] = {{0.0, 0.1, 1.0, 11}, {0.0, 1.0, 4.5, 5}, {1.0, -0.25, 0.0, 5},
                        {5.0, 1.0, 5.0, 1},  {0.0, 1.0, -1.0, 0}, {-3.0, 0.7, 3.0, 9}};
  for (const Case& c : cases) {
    const ArithmeticSequence s(c.base, c.step, c.limit);
    ASSERT_EQ(s.size(), c.size) << c.base << ", " << c.step << ", " << c.limit;
    if (c.size > 0) {
      EXPECT_NEAR(s[c.size - 1], c.base + c.step * (c.size - 1), 1e-12);
    }
  }
  sorvel_test::ScopedLogCapture capture;
  EXPECT_GE(ArithmeticSequence(1.0, 1e-17, 1.0).size(), 1);
  EXPECT_TRUE(capture.Contains(
      sorvel_base::WARNING,
      "step is small compared to machine precision in ArithmeticSequence("));
}

#if GTEST_HAS_DEATH_TEST
// Verifies that a sequence too long to index ends the process.
TEST(NumberUtilDeathTest, RejectsOversizeSequences) {
  EXPECT_DEATH(ArithmeticSequence(0.0, 1e-6, 1e6),
               CheckFailed("sized <= std::numeric_limits<int>::max()"));
}
#endif

}  // namespace
}  // namespace audio_dsp
