#include "audio/sorvane/dtmf/byte_symbol_converter.h"

#include <algorithm>
#include <utility>

#include "audio/dsp/digit_sequence.h"
#include "base/logging.h"

namespace audio_sorvane {

ByteSymbolConverter::ByteSymbolConverter(int alphabet_size, int spacer_symbol,
                                         int bytes_in_token)
    : alphabet_size_(alphabet_size),
      spacer_symbol_(spacer_symbol),
      bytes_in_token_(bytes_in_token),
      symbols_in_token_(0),
      digit_base_(alphabet_size - 1) {
  CHECK(alphabet_size >= 3);
  const audio_dsp::DigitSequence largest(
      std::vector<int>(std::max(bytes_in_token, 0), 255), 256);
  symbols_in_token_ =
      static_cast<int>(largest.ConvertToBase(digit_base_).digits().size());
}

std::vector<int> ByteSymbolConverter::BytesToSymbols(
    const std::vector<uint8_t>& bytes) const {
  CHECK(static_cast<int>(bytes.size()) == bytes_in_token_);
  const audio_dsp::DigitSequence token(std::vector<int>(bytes.begin(), bytes.end()),
                                       256);
  std::vector<int> message_digits = token.ConvertToBase(digit_base_).digits();
  CHECK(static_cast<int>(message_digits.size()) <= symbols_in_token_);
  message_digits.resize(symbols_in_token_, 0);
  for (int& digit : message_digits) {
    if (digit >= spacer_symbol_) ++digit;
  }
  return message_digits;
}

std::vector<uint8_t> ByteSymbolConverter::SymbolsToBytes(
    const std::vector<int>& symbols) const {
  std::vector<uint8_t> bytes;
  SymbolsToBytes(symbols, &bytes);
  return bytes;
}

void ByteSymbolConverter::SymbolsToBytes(const std::vector<int>& symbols,
                                         std::vector<uint8_t>* bytes) const {
  CHECK(bytes);
  CHECK(static_cast<int>(symbols.size()) == symbols_in_token_);
  for (int symbol : symbols) {
    CHECK(symbol >= 0);
    CHECK(symbol < alphabet_size_);
    CHECK(symbol != spacer_symbol_);
  }
  // Horner's scheme from the most significant digit, carrying in base 256:
  // the number's bytes, least significant first, without high-order zeros.
  bytes->reserve(std::max<size_t>(symbols.size() + 1, bytes_in_token_));
  bytes->assign(1, 0);
  for (auto it = symbols.rbegin(); it != symbols.rend(); ++it) {
    int carry = *it > spacer_symbol_ ? *it - 1 : *it;
    for (uint8_t& byte : *bytes) {
      const int t = byte * digit_base_ + carry;
      byte = static_cast<uint8_t>(t & 255);
      carry = t >> 8;
    }
    while (carry > 0) {
      bytes->push_back(static_cast<uint8_t>(carry & 255));
      carry >>= 8;
    }
  }
  if (static_cast<int>(bytes->size()) < bytes_in_token_) bytes->resize(bytes_in_token_, 0);
}

}  // namespace audio_sorvane
