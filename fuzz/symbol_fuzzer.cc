// Round trips of the symbol conversions on arbitrary bytes and alphabets:
// bytes -> symbols -> bytes gives the bytes back, and any spacer-free
// symbol string converts to at least a token's worth of bytes.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <vector>

#include "audio/dsp/digit_sequence.h"
#include "audio/sorvane/dtmf/byte_symbol_converter.h"
#include "audio/sorvane/token_symbol_converter.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size < 4) return 0;
  const int alphabet = 3 + data[0] % 62;
  const int spacer = data[1] % alphabet;
  const int bits = 1 << (data[2] % 4);  // 1, 2, 4 or 8
  const std::vector<uint8_t> payload(data + 3, data + size);

  const audio_sorvane::TokenSymbolConverter dsss(bits);
  std::vector<int> symbols;
  std::vector<uint8_t> bytes;
  dsss.TokenToSymbols(payload, &symbols);
  dsss.SymbolsToToken(symbols, &bytes);
  if (bytes != payload) std::abort();

  const int token_bytes = 1 + static_cast<int>(payload.size() % 24);
  const std::vector<uint8_t> token(payload.begin(), payload.begin() + std::min<size_t>(token_bytes, payload.size()));
  if (static_cast<int>(token.size()) == token_bytes) {
    const audio_sorvane::ByteSymbolConverter dtmf(alphabet, spacer, token_bytes);
    const std::vector<int> digits = dtmf.BytesToSymbols(token);
    if (dtmf.SymbolsToBytes(digits) != token) std::abort();
    // Any spacer-free string of the right length converts.
    std::vector<int> arbitrary(digits.size());
    for (size_t i = 0; i < arbitrary.size(); ++i) {
      int s = payload[i % payload.size()] % (alphabet - 1);
      arbitrary[i] = s >= spacer ? s + 1 : s;
    }
    if (static_cast<int>(dtmf.SymbolsToBytes(arbitrary).size()) < token_bytes) std::abort();
  }

  const int from = 2 + data[0] % 200, to = 2 + data[1] % 200;
  std::vector<int> raw(payload.size());
  for (size_t i = 0; i < raw.size(); ++i) raw[i] = payload[i] % from;
  const audio_dsp::DigitSequence number(raw, from);
  if (number.ConvertToBase(to).ConvertToBase(from).digits() != number.digits()) std::abort();
  return 0;
}
