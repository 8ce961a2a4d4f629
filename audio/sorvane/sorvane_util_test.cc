#include "audio/sorvane/sorvane_util.h"

#include <cmath>
#include <complex>
#include <numbers>
#include <vector>

#include "gmock/gmock.h"
#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace audio_sorvane {
namespace {

using Complex = std::complex<float>;
using sorvel_test::CheckFailed;
using testing::ElementsAre;

TEST(FrequencyGridTest, SymmetricAroundZero) {
  std::vector<float> grid;
  FrequencyGrid(2.0f, 5.0f, &grid);  // n = round(2.5) = 3
  EXPECT_THAT(grid, ElementsAre(-6, -4, -2, 0, 2, 4, 6));
  FrequencyGrid(0.5f, 0.2f, &grid);
  EXPECT_THAT(grid, ElementsAre(0.0f));
}

// Verifies the phasor recurrence stays on exp(i step j) over long rows.
TEST(PhasorMatrixTest, RowsAreComplexExponentials) {
  const std::vector<float> frequencies = {-1.5f, 0.0f, 2.0f};
  const double scale = 2.0 * std::numbers::pi / 1905;
  audio_dsp::ComplexMatrix phasors;
  PhasorMatrix(frequencies, 5000, scale, &phasors);
  ASSERT_EQ(phasors.rows(), 3);
  ASSERT_EQ(phasors.cols(), 5000);
  for (int r = 0; r < 3; ++r) {
    for (int j : {0, 1, 17, 4999}) {
      const std::complex<double> expected =
          std::polar(1.0, frequencies[r] * scale * j);
      EXPECT_NEAR(std::abs(std::complex<double>(phasors(r, j)) - expected), 0.0,
                  1e-6)
          << r << ", " << j;
    }
  }
}

TEST(MaxFilterResponseTest, PicksStrongestRowFirstOnTies) {
  audio_dsp::ComplexMatrix filters(3, 2);
  filters << Complex(1, 0), Complex(0, 0),  //
      Complex(0, 2), Complex(0, 0),         //
      Complex(0, 0), Complex(2, 0);
  audio_dsp::ComplexVector signal(2);
  signal << Complex(1, 0), Complex(1, 0);
  const FilterResponsePeak tie = MaxFilterResponse(filters, signal);
  EXPECT_EQ(tie.index, 1);  // rows 1 and 2 both give power 4
  EXPECT_FLOAT_EQ(tie.power, 4.0f);
  signal << Complex(0, 0), Complex(0, 3);
  EXPECT_EQ(MaxFilterResponse(filters, signal).index, 2);
  const FilterResponsePeak empty = MaxFilterResponse(
      audio_dsp::ComplexMatrix(0, 2), audio_dsp::ComplexVector(2));
  EXPECT_EQ(empty.index, 0);
  EXPECT_EQ(empty.power, 0.0f);
}

#if GTEST_HAS_DEATH_TEST
TEST(SorvaneUtilDeathTest, RejectsMismatchedSizes) {
  EXPECT_DEATH(MaxFilterResponse(audio_dsp::ComplexMatrix(2, 3),
                                 audio_dsp::ComplexVector(2)),
               CheckFailed("filter_matrix.cols() == signal.size()"));
}
#endif

}  // namespace
}  // namespace audio_sorvane
