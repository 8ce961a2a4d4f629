// Converts token bytes to DSSS symbols of `bits_per_symbol` bits and back.
//
// Each byte becomes 8 / bits_per_symbol symbols, most significant first: at 4
// bits per symbol 0xA7 becomes {10, 7}, at 2 bits {2, 2, 1, 3}. The reverse
// packs symbols into bytes in the same order and drops a trailing incomplete
// byte. Symbol values are not range-checked.
//
// Immutable after construction; conversions may run concurrently. A
// bits_per_symbol outside {1, 2, 4, 8} ends the process through CHECK.
#ifndef AUDIO_SORVANE_TOKEN_SYMBOL_CONVERTER_H_
#define AUDIO_SORVANE_TOKEN_SYMBOL_CONVERTER_H_

#include <cstdint>
#include <vector>

namespace audio_sorvane {

// True for 1, 2, 4 and 8: whole symbols per byte.
constexpr bool BitsPerSymbolOk(int bits_per_symbol) {
  return bits_per_symbol >= 1 && bits_per_symbol <= 8 &&
         8 % bits_per_symbol == 0;
}

class TokenSymbolConverter {
 public:
  explicit TokenSymbolConverter(int bits_per_symbol);
  virtual ~TokenSymbolConverter() = default;

  // Replaces `symbols` with bytes.size() * symbols_per_byte() symbols.
  void TokenToSymbols(const std::vector<uint8_t>& bytes,
                      std::vector<int>* symbols) const;
  // Replaces `bytes` with symbols.size() / symbols_per_byte() bytes.
  void SymbolsToToken(const std::vector<int>& symbols,
                      std::vector<uint8_t>* bytes) const;

  int symbols_per_byte() const { return symbols_per_byte_; }
  int base() const { return base_; }

 private:
  int symbols_per_byte_;
  int base_;
};

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_TOKEN_SYMBOL_CONVERTER_H_
