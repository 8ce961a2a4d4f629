#include "audio/dsp/digit_sequence.h"

#include <vector>

#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace audio_dsp {
namespace {

using sorvel_test::CheckFailed;
using Digits = std::vector<int>;

TEST(DigitSequenceTest, NormalisesAndConverts) {
  EXPECT_EQ(DigitSequence(Digits{0, 0, 0}, 10).digits(), Digits{0});
  EXPECT_EQ(DigitSequence(Digits{}, 10).digits(), Digits{0});
  EXPECT_EQ(DigitSequence(1000, 10).digits(), (Digits{0, 0, 0, 1}));
  EXPECT_EQ(DigitSequence(0, 7).digits(), Digits{0});
  // 0x0102 little-endian in base 256 is 258 = 2 * 121 + 1 * 11 + 5 in base 11.
  const DigitSequence converted = DigitSequence(Digits{2, 1}, 256).ConvertToBase(11);
  EXPECT_EQ(converted.digits(), (Digits{5, 1, 2}));
  EXPECT_EQ(converted.base(), 11);
  EXPECT_EQ(converted.ConvertToBase(256).digits(), (Digits{2, 1}));
  EXPECT_EQ(DigitSequence(Digits{0}, 256).ConvertToBase(44).digits(), Digits{0});
  // Result bases up to 2^30 / 256 keep every product inside an int.
  EXPECT_EQ(DigitSequence(Digits{255, 255, 255, 255}, 256).ConvertToBase(4194304).digits(),
            (Digits{4194303, 1023}));
}

#if GTEST_HAS_DEATH_TEST
// Verifies that a base conversion whose digits would overflow int ends the
// process.
TEST(DigitSequenceDeathTest, RejectsOverflowingBases) {
  EXPECT_DEATH(DigitSequence(Digits{1}, 256).ConvertToBase(4194305),
               CheckFailed("result_base <= (std::numeric_limits<int>::max() / 2 + 1) / base_"));
}
#endif

}  // namespace
}  // namespace audio_dsp
