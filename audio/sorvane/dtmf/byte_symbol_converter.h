// Maps a multi-tone token (a fixed number of bytes) to its data symbols and
// back by reading the bytes as one little-endian number and writing it in
// base alphabet_size - 1, least significant digit first. Digits at or above
// the spacer are shifted up by one, so the spacer never carries data.
//
// Immutable; violated preconditions end the process through CHECK.
#ifndef AUDIO_SORVANE_DTMF_BYTE_SYMBOL_CONVERTER_H_
#define AUDIO_SORVANE_DTMF_BYTE_SYMBOL_CONVERTER_H_

#include <cstdint>
#include <vector>

namespace audio_sorvane {

class ByteSymbolConverter {
 public:
  // alphabet_size >= 3 symbols, including the spacer.
  ByteSymbolConverter(int alphabet_size, int spacer_symbol, int bytes_in_token);

  // Exactly symbols_in_token() symbols for a token of bytes_in_token bytes.
  std::vector<int> BytesToSymbols(const std::vector<uint8_t>& bytes) const;
  // At least bytes_in_token bytes; more when the symbols' value does not fit
  // a token (callers detect that by the length).
  std::vector<uint8_t> SymbolsToBytes(const std::vector<int>& symbols) const;
  // The same into `bytes`, reusing its storage (no allocation once it has
  // held a token).
  void SymbolsToBytes(const std::vector<int>& symbols, std::vector<uint8_t>* bytes) const;

  int symbols_in_token() const { return symbols_in_token_; }
  int bytes_in_token() const { return bytes_in_token_; }

 private:
  int alphabet_size_;
  int spacer_symbol_;
  int bytes_in_token_;
  int symbols_in_token_;
  int digit_base_;
};

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_DTMF_BYTE_SYMBOL_CONVERTER_H_
