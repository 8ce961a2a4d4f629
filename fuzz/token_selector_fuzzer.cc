// The token selector on arbitrary score maps: any finite scores, any
// positions, any shapes within the parameter checks. Candidates must have
// the token's length, contain no spacer and carry symbols of the alphabet.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <vector>

#include "audio/sorvane/token_selector.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size < 4) return 0;
  audio_sorvane::TokenSelectorParams params;
  params.alphabet_size = 3 + data[0] % 18;
  params.spacer = data[1] % params.alphabet_size;
  params.symbols_in_token = 1 + data[2] % 16;
  params.append_check_symbol = data[3] & 1;
  params.max_candidates_to_return = 1 + (data[3] >> 1) % 2;
  const audio_sorvane::TokenSelector selector(params);

  audio_sorvane::SymbolScoreMap map;
  size_t pos = 4;
  int position = static_cast<int8_t>(data[3]);
  while (pos + params.alphabet_size + 1 <= size) {
    position += 1 + data[pos++] % 3;
    audio_dsp::FloatVector scores(params.alphabet_size);
    for (int s = 0; s < params.alphabet_size; ++s) {
      scores[s] = (static_cast<int>(data[pos++]) - 64) / 16.0f;
    }
    map[position] = scores;
  }
  audio_dsp::FloatMatrix table;
  std::vector<audio_sorvane::DecodedToken> candidates;
  selector.SelectTokens(map, &table, &candidates);
  for (const auto& c : candidates) {
    if (static_cast<int>(c.symbols.size()) != params.symbols_in_token) std::abort();
    for (int s : c.symbols) {
      if (s < 0 || s >= params.alphabet_size || s == params.spacer) std::abort();
    }
  }
  return 0;
}
