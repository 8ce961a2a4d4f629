// Four (or eight) floats as one value, for inner loops that the compiler should keep
// in SIMD registers: GCC and Clang map the arithmetic to SSE on x86 and
// NEON on ARM, and to scalar code elsewhere. Loads and stores need no
// alignment beyond a float's.
#ifndef AUDIO_DSP_FLOAT4_H_
#define AUDIO_DSP_FLOAT4_H_

#include <cmath>
#include <cstring>

#if defined(__SSE__)
#include <xmmintrin.h>
#elif defined(__ARM_NEON) && defined(__aarch64__)
#include <arm_neon.h>
#endif

namespace audio_dsp {

typedef float Float4 __attribute__((vector_size(16)));

// Float4 at any float-aligned address, allowed to alias floats: one
// unaligned vector load or store (memcpy into a vector went through
// general registers and the stack on AArch64).
typedef float UnalignedFloat4 __attribute__((vector_size(16), aligned(4), may_alias));

inline Float4 Load4(const float* p) { return *reinterpret_cast<const UnalignedFloat4*>(p); }

inline void Store4(float* p, Float4 v) { *reinterpret_cast<UnalignedFloat4*>(p) = v; }

inline Float4 Splat4(float x) { return Float4{x, x, x, x}; }

inline float Sum4(Float4 v) { return (v[0] + v[1]) + (v[2] + v[3]); }

// Transposes the 4 x 4 matrix whose rows are a, b, c, d.
inline void Transpose4(Float4& a, Float4& b, Float4& c, Float4& d) {
  const Float4 t0 = __builtin_shufflevector(a, b, 0, 4, 1, 5);
  const Float4 t1 = __builtin_shufflevector(c, d, 0, 4, 1, 5);
  const Float4 t2 = __builtin_shufflevector(a, b, 2, 6, 3, 7);
  const Float4 t3 = __builtin_shufflevector(c, d, 2, 6, 3, 7);
  a = __builtin_shufflevector(t0, t1, 0, 1, 4, 5);
  b = __builtin_shufflevector(t0, t1, 2, 3, 6, 7);
  c = __builtin_shufflevector(t2, t3, 0, 1, 4, 5);
  d = __builtin_shufflevector(t2, t3, 2, 3, 6, 7);
}

// Lane-wise 1 / sqrt(v), to within a few units in the last place: the
// processor's estimate refined by Newton steps (no division). Lanes of zero
// give NaN or infinity; compare so that those lose.
inline Float4 Rsqrt4(Float4 v) {
#if defined(__SSE__)
  const Float4 y = reinterpret_cast<Float4>(_mm_rsqrt_ps(reinterpret_cast<__m128>(v)));
  return y * (Float4{1.5f, 1.5f, 1.5f, 1.5f} - 0.5f * v * y * y);
#elif defined(__ARM_NEON) && defined(__aarch64__)
  const float32x4_t x = reinterpret_cast<float32x4_t>(v);
  float32x4_t y = vrsqrteq_f32(x);
  y = vmulq_f32(y, vrsqrtsq_f32(vmulq_f32(x, y), y));
  y = vmulq_f32(y, vrsqrtsq_f32(vmulq_f32(x, y), y));
  return reinterpret_cast<Float4>(y);
#else
  return Float4{1.0f / std::sqrt(v[0]), 1.0f / std::sqrt(v[1]), 1.0f / std::sqrt(v[2]),
                1.0f / std::sqrt(v[3])};
#endif
}

// Lane-wise maximum (exact; for ordered values the same as std::max).
inline Float4 Max4(Float4 a, Float4 b) { return a < b ? b : a; }

// The largest lane.
inline float MaxLane4(Float4 v) {
  const float a = v[0] < v[1] ? v[1] : v[0];
  const float b = v[2] < v[3] ? v[3] : v[2];
  return a < b ? b : a;
}

// Eight floats as two Float4 halves, for loops over many independent lanes
// (a plain 32-byte vector type lowers poorly without AVX: its comparisons
// become scalar code).
struct Float8 {
  Float4 lo, hi;
  float operator[](int lane) const { return lane < 4 ? lo[lane] : hi[lane - 4]; }
};

inline Float8 Load8(const float* p) { return {Load4(p), Load4(p + 4)}; }
inline void Store8(float* p, Float8 v) {
  Store4(p, v.lo);
  Store4(p + 4, v.hi);
}
inline Float8 Splat8(float x) { return {Splat4(x), Splat4(x)}; }
inline Float8 operator+(Float8 a, Float8 b) { return {a.lo + b.lo, a.hi + b.hi}; }
inline Float8 operator-(Float8 a, Float8 b) { return {a.lo - b.lo, a.hi - b.hi}; }
inline Float8 operator*(Float8 a, Float8 b) { return {a.lo * b.lo, a.hi * b.hi}; }
inline Float8 operator/(Float8 a, Float8 b) { return {a.lo / b.lo, a.hi / b.hi}; }
inline Float8& operator+=(Float8& a, Float8 b) { return a = a + b; }
// Lane-wise std::max and std::min (same operand order, so the same result
// for equal values).
inline Float8 Max8(Float8 a, Float8 b) {
  return {a.lo < b.lo ? b.lo : a.lo, a.hi < b.hi ? b.hi : a.hi};
}
inline Float8 Min8(Float8 a, Float8 b) {
  return {b.lo < a.lo ? b.lo : a.lo, b.hi < a.hi ? b.hi : a.hi};
}

}  // namespace audio_dsp

#endif  // AUDIO_DSP_FLOAT4_H_
