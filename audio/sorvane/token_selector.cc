#include "audio/sorvane/token_selector.h"

#include <cstdint>

#include "base/logging.h"

namespace audio_sorvane {

int ComputeCheckSymbol(int alphabet_size, std::span<const int> symbols) {
  CHECK(alphabet_size >= 2);
  const uint32_t m = static_cast<uint32_t>(alphabet_size - 1);
  // Unsigned: the sum wraps instead of overflowing, as on the transmitters.
  uint32_t sum = 0;
  for (int s : symbols) sum += static_cast<uint32_t>(s);
  return static_cast<int>((m - sum % m) % m);
}

}  // namespace audio_sorvane
