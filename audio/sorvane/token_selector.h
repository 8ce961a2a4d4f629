// Token candidate selection shared by both receivers, and the check symbol
// shared with both transmitters.
#ifndef AUDIO_SORVANE_TOKEN_SELECTOR_H_
#define AUDIO_SORVANE_TOKEN_SELECTOR_H_

#include <span>

namespace audio_sorvane {

// The check symbol appended after the data symbols: with m = alphabet_size - 1
// (the number of data symbols) and S the sum of `symbols`,
// (m - (S mod m)) mod m, which brings the sum to a multiple of m. Always a
// data symbol, never the spacer. Requires alphabet_size >= 2.
int ComputeCheckSymbol(int alphabet_size, std::span<const int> symbols);

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_TOKEN_SELECTOR_H_
