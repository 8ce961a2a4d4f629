#include "audio/sorvane/code_signal_generator.h"

#include <numeric>
#include <string>
#include <vector>

#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace audio_sorvane {
namespace {

using sorvel_test::CheckFailed;

std::string FirstBits(const std::vector<float>& code, int count) {
  std::string bits;
  for (int i = 0; i < count; ++i) bits += code[i] > 0 ? '1' : '0';
  return bits;
}

TEST(CodeSignalGeneratorTest, FirstChipsMatchReference) {
  struct Case {
    int taps, code;
    const char* bits;
  };
  const Case cases[] = {
      {5, 0, "0001101110101000"}, {6, 0, "0000010000110001"},
      {7, 0, "0000101011000100"}, {7, 3, "0101101110111100"},
      {8, 0, "0101011100111001"}, {11, 3, "0000110000011100"},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(FirstBits(GenerateCodeSignal(c.taps, c.code), 16), c.bits)
        << c.taps << " taps, code " << c.code;
  }
}

// Verifies for every permitted code that the chips are +-1, balanced
// (2^(L-1) ones), continue the register's recurrence across the wrap (so the
// sequence repeats with period N) and have the two-valued autocorrelation of
// a maximal-length sequence (N at lag 0, -1 elsewhere), which also rules out
// any shorter period.
TEST(CodeSignalGeneratorTest, EveryCodeIsMaximalLength) {
  for (int taps = kMinTaps; taps <= kMaxTaps; ++taps) {
    for (int code_number = 0; code_number < NumCodesForTaps(taps); ++code_number) {
      SCOPED_TRACE(testing::Message() << taps << " taps, code " << code_number);
      const std::vector<float> code = GenerateCodeSignal(taps, code_number);
      const int n = (1 << taps) - 1;
      ASSERT_EQ(static_cast<int>(code.size()), n);
      EXPECT_EQ(code[0], -1.0f);
      int ones = 0;
      for (float chip : code) {
        ASSERT_TRUE(chip == 1.0f || chip == -1.0f);
        ones += chip > 0;
      }
      EXPECT_EQ(ones, 1 << (taps - 1));

      const std::vector<int>& tap_set = CodeTaps(taps, code_number);
      EXPECT_EQ(tap_set.back(), taps - 1);
      for (int k = 0; k < n; ++k) {
        int bit = 0;
        for (int t : tap_set) bit ^= code[(k - 1 - t + n) % n] > 0;
        ASSERT_EQ(bit, code[k] > 0) << "recurrence breaks at chip " << k;
      }
      for (int lag = 0; lag < n; ++lag) {
        float correlation = 0.0f;
        for (int k = 0; k < n; ++k) correlation += code[k] * code[(k + lag) % n];
        ASSERT_EQ(correlation, lag == 0 ? n : -1) << "lag " << lag;
      }
    }
  }
}

TEST(CodeSignalGeneratorTest, ReplacesExistingContents) {
  std::vector<float> code(500, 3.0f);
  GenerateCodeSignal(5, 2, &code);
  EXPECT_EQ(code, GenerateCodeSignal(5, 2));
}

#if GTEST_HAS_DEATH_TEST
// A tap count or code number past the tap table ends the process.
TEST(CodeSignalGeneratorDeathTest, RejectsCodesOutsideTheTable) {
  std::vector<float> code = {1.0f};
  EXPECT_DEATH(GenerateCodeSignal(12, 9, &code), CheckFailed("number_of_taps <= 11"));
  EXPECT_DEATH(GenerateCodeSignal(7, 4, &code),
               CheckFailed("code_number <= number_of_taps <= 6 ? 2 : 3"));
}
#endif

}  // namespace
}  // namespace audio_sorvane
