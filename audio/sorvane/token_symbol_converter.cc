#include "audio/sorvane/token_symbol_converter.h"

#include "base/logging.h"

namespace audio_sorvane {

TokenSymbolConverter::TokenSymbolConverter(int bits_per_symbol)
    : symbols_per_byte_(0), base_(0) {
  CHECK(BitsPerSymbolOk(bits_per_symbol));
  symbols_per_byte_ = 8 / bits_per_symbol;
  base_ = 1 << bits_per_symbol;
}

void TokenSymbolConverter::TokenToSymbols(const std::vector<uint8_t>& bytes,
                                          std::vector<int>* symbols) const {
  CHECK(symbols);
  symbols->assign(bytes.size() * symbols_per_byte_, 0);
  auto out = symbols->begin();
  for (uint8_t byte : bytes) {
    // Digits come out least significant first; store them from the back.
    int value = byte;
    for (int d = symbols_per_byte_ - 1; d >= 0; --d) {
      out[d] = value % base_;
      value /= base_;
    }
    out += symbols_per_byte_;
  }
}

void TokenSymbolConverter::SymbolsToToken(const std::vector<int>& symbols,
                                          std::vector<uint8_t>* bytes) const {
  CHECK(bytes);
  bytes->clear();
  bytes->reserve(symbols.size() / symbols_per_byte_);
  uint8_t accumulator = 0;
  int count = 0;
  for (int symbol : symbols) {
    accumulator = static_cast<uint8_t>(accumulator * base_ + symbol);
    if (++count == symbols_per_byte_) {
      bytes->push_back(accumulator);
      accumulator = 0;
      count = 0;
    }
  }
}

}  // namespace audio_sorvane
