// Two ways to give an inner loop AVX2 on x86-64 while the binary still runs
// on any x86-64 processor:
// - SORVEL_MULTIVERSION before a free function's definition builds it for
//   AVX2 with FMA as well as for the baseline, the loader picking one per
//   machine (x86-64 ELF only; elsewhere it is empty). The AVX clone gets
//   three-operand instructions and fused multiply-adds (rounding differs in
//   the last bits). Member functions cannot carry it portably (Clang wants
//   it on every declaration); give them a free function to call.
// - Where SORVEL_WIDE_PATHS is defined, functions marked SORVEL_WIDE may use
//   eight-lane vectors (Wide) with comparisons and shuffles, which only AVX
//   registers keep as vector code; callers choose them when HasWidePaths().
#ifndef AUDIO_DSP_MULTIVERSION_H_
#define AUDIO_DSP_MULTIVERSION_H_

#if defined(__x86_64__) && defined(__ELF__)
#define SORVEL_MULTIVERSION __attribute__((target_clones("arch=x86-64-v3", "avx2", "default")))
#else
#define SORVEL_MULTIVERSION
#endif

#if defined(__x86_64__) && defined(__GNUC__)
#define SORVEL_WIDE_PATHS 1
#define SORVEL_WIDE __attribute__((target("avx2,fma")))
#endif

namespace audio_dsp {

#if defined(SORVEL_WIDE_PATHS)
// Eight floats in one AVX register (inside SORVEL_WIDE functions; keep them
// out of the signatures of any other function). Loads and stores need no
// alignment beyond a float's.
typedef float Wide __attribute__((vector_size(32)));
typedef float UnalignedWide __attribute__((vector_size(32), aligned(4), may_alias));
#define SORVEL_LOAD_WIDE(p) (*reinterpret_cast<const ::audio_dsp::UnalignedWide*>(p))
#define SORVEL_STORE_WIDE(p, v) (*reinterpret_cast<::audio_dsp::UnalignedWide*>(p) = (v))

// Whether this processor runs SORVEL_WIDE code (AVX2 and FMA).
inline bool HasWidePaths() {
  return __builtin_cpu_supports("avx2") && __builtin_cpu_supports("fma");
}
#else
inline bool HasWidePaths() { return false; }
#endif

}  // namespace audio_dsp

#endif  // AUDIO_DSP_MULTIVERSION_H_
