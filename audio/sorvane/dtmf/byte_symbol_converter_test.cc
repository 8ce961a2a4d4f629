#include "audio/sorvane/dtmf/byte_symbol_converter.h"

#include <random>
#include <vector>

#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace audio_sorvane {
namespace {

using sorvel_test::CheckFailed;
using Bytes = std::vector<uint8_t>;

TEST(ByteSymbolConverterTest, SymbolsPerTokenLength) {
  const std::pair<int, int> cases[] = {{1, 2}, {2, 3}, {3, 5}, {4, 6}, {5, 8},
                                       {6, 9}, {8, 12}, {10, 15}, {16, 24}};
  for (auto [bytes, symbols] : cases) {
    EXPECT_EQ(ByteSymbolConverter(45, 44, bytes).symbols_in_token(), symbols) << bytes;
  }
}

// Verifies the little-endian digit order, the spacer skip and that every
// token survives the round trip.
TEST(ByteSymbolConverterTest, RoundTripsAndSkipsTheSpacer) {
  const ByteSymbolConverter converter(45, 44, 5);
  EXPECT_EQ(converter.BytesToSymbols(Bytes(5, 0)), std::vector<int>(8, 0));
  EXPECT_EQ(converter.BytesToSymbols({45, 0, 0, 0, 0}),
            (std::vector<int>{1, 1, 0, 0, 0, 0, 0, 0}));  // 45 = 1 * 44 + 1
  const std::vector<int> all_ones = converter.BytesToSymbols(Bytes(5, 0xFF));
  EXPECT_NE(all_ones.back(), 0);
  std::mt19937 rng(2);
  for (int trial = 0; trial < 50; ++trial) {
    Bytes token(5);
    for (uint8_t& b : token) b = static_cast<uint8_t>(rng());
    EXPECT_EQ(converter.SymbolsToBytes(converter.BytesToSymbols(token)), token);
  }

  // Spacer 3 of 0..9: digits 3..8 become symbols 4..9.
  const ByteSymbolConverter middle(10, 3, 1);
  EXPECT_EQ(middle.BytesToSymbols({3 + 9 * 5}), (std::vector<int>{4, 6, 0}));
  EXPECT_EQ(middle.SymbolsToBytes({4, 6, 0}), Bytes{48});
  // A value of 2^40 or more does not fit 5 bytes: 6 bytes come back.
  EXPECT_EQ(converter.SymbolsToBytes(std::vector<int>(8, 43)).size(), 6u);
}

#if GTEST_HAS_DEATH_TEST
// Verifies that symbols outside the alphabet and tokens of the wrong size
// end the process.
TEST(ByteSymbolConverterDeathTest, RejectsMalformedInput) {
  const ByteSymbolConverter middle(10, 3, 1);
  EXPECT_DEATH(middle.SymbolsToBytes({10, 0, 0}), CheckFailed("symbol < alphabet_size_"));
  EXPECT_DEATH(middle.BytesToSymbols({1, 2}),
               CheckFailed("static_cast<int>(bytes.size()) == bytes_in_token_"));
}
#endif

}  // namespace
}  // namespace audio_sorvane
