// Four floats as one value, for inner loops that the compiler should keep
// in SIMD registers: GCC and Clang map the arithmetic to SSE on x86 and
// NEON on ARM, and to scalar code elsewhere. Loads and stores go through
// memcpy, so pointers need no alignment.
#ifndef AUDIO_DSP_FLOAT4_H_
#define AUDIO_DSP_FLOAT4_H_

#include <cstring>

namespace audio_dsp {

typedef float Float4 __attribute__((vector_size(16)));

inline Float4 Load4(const float* p) {
  Float4 v;
  std::memcpy(&v, p, sizeof(v));
  return v;
}

inline void Store4(float* p, Float4 v) { std::memcpy(p, &v, sizeof(v)); }

inline Float4 Splat4(float x) { return Float4{x, x, x, x}; }

inline float Sum4(Float4 v) { return (v[0] + v[1]) + (v[2] + v[3]); }

}  // namespace audio_dsp

#endif  // AUDIO_DSP_FLOAT4_H_
