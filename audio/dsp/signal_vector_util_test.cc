#include "audio/dsp/signal_vector_util.h"

#include <complex>
#include <random>
#include <vector>

#include "gmock/gmock.h"
#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace audio_dsp {
namespace {

using Complex = std::complex<float>;
using sorvel_test::CheckFailed;
using testing::ElementsAre;

std::vector<Complex> RandomComplex(int n, std::mt19937* rng) {
  std::normal_distribution<float> normal;
  std::vector<Complex> x(n);
  for (Complex& v : x) v = {normal(*rng), normal(*rng)};
  return x;
}

TEST(ComplexFirFilterTest, OneTapScalesWithoutState) {
  ComplexFirFilter filter(std::vector<Complex>{{0.0f, 2.0f}});
  std::vector<Complex> out;
  filter.Filter(std::vector<Complex>{{1.0f, 0.0f}, {0.0f, 1.0f}}, &out);
  ASSERT_EQ(out.size(), 2u);
  EXPECT_EQ(out[0], Complex(0.0f, 2.0f));
  EXPECT_EQ(out[1], Complex(-2.0f, 0.0f));
  filter.Filter(std::vector<Complex>{{3.0f, 0.0f}}, &out);
  EXPECT_EQ(out[0], Complex(0.0f, 6.0f));
}

// Verifies the output against direct convolution, and that any split of the
// input into blocks (empty blocks included) gives the same output as one
// call; Reset forgets the past.
TEST(ComplexFirFilterTest, StreamsLikeOneConvolution) {
  std::mt19937 rng(11);
  for (int taps : {2, 3, 8}) {
    const std::vector<Complex> h = RandomComplex(taps, &rng);
    const std::vector<Complex> x = RandomComplex(50, &rng);
    std::vector<Complex> expected(x.size());
    for (size_t n = 0; n < x.size(); ++n) {
      for (int k = 0; k < taps && k <= static_cast<int>(n); ++k) {
        expected[n] += h[k] * x[n - k];
      }
    }
    ComplexFirFilter filter(h);
    std::vector<Complex> streamed, block;
    size_t pos = 0;
    for (size_t size : {1, 0, 2, 7, 13, 27}) {
      filter.Filter(std::span(x).subspan(pos, size), &block);
      ASSERT_EQ(block.size(), size);
      streamed.insert(streamed.end(), block.begin(), block.end());
      pos += size;
    }
    ASSERT_EQ(streamed.size(), x.size());
    for (size_t n = 0; n < x.size(); ++n) {
      EXPECT_NEAR(std::abs(streamed[n] - expected[n]), 0.0f, 1e-5f)
          << taps << " taps, sample " << n;
    }
    filter.Reset();
    filter.Filter(x, &block);
    for (size_t n = 0; n < x.size(); ++n) {
      EXPECT_NEAR(std::abs(block[n] - expected[n]), 0.0f, 1e-5f);
    }
  }
}

TEST(PeriodicPadTest, RepeatsSignalCyclically) {
  const std::vector<int> signal = {1, 2, 3};
  std::vector<int> padded;
  PeriodicPad<int>(signal, 2, 1, &padded);
  EXPECT_THAT(padded, ElementsAre(2, 3, 1, 2, 3, 1));
  PeriodicPad<int>(signal, 7, 0, &padded);
  EXPECT_THAT(padded, ElementsAre(3, 1, 2, 3, 1, 2, 3, 1, 2, 3));
  PeriodicPad<int>(signal, 0, 0, &padded);
  EXPECT_EQ(padded, signal);
}

#if GTEST_HAS_DEATH_TEST
// Empty taps and an empty signal would be indexed past their ends.
TEST(SignalVectorUtilDeathTest, RejectsEmptyInputs) {
  EXPECT_DEATH(ComplexFirFilter(std::vector<Complex>{}), CheckFailed("!impulse_response_.empty()"));
  std::vector<float> padded;
  EXPECT_DEATH(PeriodicPad<float>({}, 1, 1, &padded), CheckFailed("!signal.empty()"));
}
#endif

}  // namespace
}  // namespace audio_dsp
