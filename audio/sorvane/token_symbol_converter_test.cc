#include "audio/sorvane/token_symbol_converter.h"

#include <vector>

#include "gtest/gtest.h"

namespace audio_sorvane {
namespace {

TEST(TokenSymbolConverterTest, SplitsBytesMostSignificantFirst) {
  struct Case {
    int bits_per_symbol;
    std::vector<int> symbols;
  };
  const Case cases[] = {
      {4, {10, 7}},
      {2, {2, 2, 1, 3}},
      {1, {1, 0, 1, 0, 0, 1, 1, 1}},
      {8, {0xA7}},
  };
  for (const Case& c : cases) {
    const TokenSymbolConverter converter(c.bits_per_symbol);
    EXPECT_EQ(converter.base(), 1 << c.bits_per_symbol);
    std::vector<int> symbols = {99};
    converter.TokenToSymbols({0xA7}, &symbols);
    EXPECT_EQ(symbols, c.symbols) << c.bits_per_symbol << " bits per symbol";
  }
}

// Verifies bytes -> symbols -> bytes for every byte value at every accepted
// symbol width, and that the outputs are replaced, not appended to.
TEST(TokenSymbolConverterTest, RoundTripsEveryByte) {
  std::vector<uint8_t> all_bytes(256);
  for (int i = 0; i < 256; ++i) all_bytes[i] = static_cast<uint8_t>(i);
  for (int bits : {1, 2, 4, 8}) {
    const TokenSymbolConverter converter(bits);
    std::vector<int> symbols;
    converter.TokenToSymbols(all_bytes, &symbols);
    ASSERT_EQ(symbols.size(), 256u * (8 / bits));
    for (int s : symbols) ASSERT_LT(s, 1 << bits);
    std::vector<uint8_t> bytes = {1, 2, 3};
    converter.SymbolsToToken(symbols, &bytes);
    EXPECT_EQ(bytes, all_bytes) << bits << " bits per symbol";

    converter.TokenToSymbols({}, &symbols);
    EXPECT_TRUE(symbols.empty());
    converter.SymbolsToToken({}, &bytes);
    EXPECT_TRUE(bytes.empty());
  }
}

TEST(TokenSymbolConverterTest, DropsIncompleteTrailingByte) {
  const TokenSymbolConverter converter(2);
  std::vector<uint8_t> bytes;
  converter.SymbolsToToken({2, 2, 1, 3, 3, 3, 3}, &bytes);
  EXPECT_EQ(bytes, std::vector<uint8_t>{0xA7});
}

}  // namespace
}  // namespace audio_sorvane
