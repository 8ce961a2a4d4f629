#include "audio/pcm16.h"

#include <algorithm>
#include <cmath>

namespace audio_sorvane {

int16_t FloatToPcm16(float sample) {
  // Clamp in float before converting: a float-to-int conversion out of range
  // (or of a NaN) is undefined behaviour.
  const float scaled = std::trunc(sample * 32768.0f);
  if (!(scaled > -32768.0f)) return std::isnan(scaled) ? 0 : -32768;
  return static_cast<int16_t>(std::min(scaled, 32767.0f));
}

std::vector<int8_t> FloatsToPcm16Le(std::span<const float> samples) {
  std::vector<int8_t> bytes(2 * samples.size());
  for (size_t i = 0; i < samples.size(); ++i) {
    const uint16_t v = static_cast<uint16_t>(FloatToPcm16(samples[i]));
    bytes[2 * i] = static_cast<int8_t>(v & 0xff);
    bytes[2 * i + 1] = static_cast<int8_t>(v >> 8);
  }
  return bytes;
}

}  // namespace audio_sorvane
