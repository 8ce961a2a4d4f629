// 16-bit PCM, as Java and WAV files receive it.
//
// Encoder output is float at full scale +-1.0; the app receives signed 16-bit
// little-endian mono PCM. A sample s becomes trunc(s * 32768) limited to
// [-32768, 32767], so 1.0 -> 32767, -1.0 -> -32768, -0.5 -> -16384.
#ifndef AUDIO_PCM16_H_
#define AUDIO_PCM16_H_

#include <cstdint>
#include <span>
#include <vector>

namespace audio_sorvane {

// One float sample to a 16-bit value (truncation toward zero, then clamping).
int16_t FloatToPcm16(float sample);

// Two bytes per sample, low byte first.
std::vector<int8_t> FloatsToPcm16Le(std::span<const float> samples);

}  // namespace audio_sorvane

#endif  // AUDIO_PCM16_H_
