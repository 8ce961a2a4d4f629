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
  CHECK(static_cast<int>(symbols.size()) == symbols_in_token_);
  std::vector<int> digits;
  digits.reserve(symbols.size());
  for (int symbol : symbols) {
    CHECK(symbol >= 0);
    CHECK(symbol < alphabet_size_);
    CHECK(symbol != spacer_symbol_);
    digits.push_back(symbol > spacer_symbol_ ? symbol - 1 : symbol);
  }
  std::vector<int> byte_digits =
      audio_dsp::DigitSequence(std::move(digits), digit_base_).ConvertToBase(256).digits();
  if (static_cast<int>(byte_digits.size()) < bytes_in_token_) {
    byte_digits.resize(bytes_in_token_, 0);
  }
  return std::vector<uint8_t>(byte_digits.begin(), byte_digits.end());
}

}  // namespace audio_sorvane
