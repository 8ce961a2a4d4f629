// The DTMF decoder's delay-compensated gamma smoother: a gamma
// filter of `order` stages whose delay d is removed by priming every stage
// with the mean of the first d inputs, dropping the first d outputs and
// flushing with the mean of the last d inputs.
//
// Smooth (the fast path) runs the recursion on eight segments of the
// sequence at once, each from a zero state (the first from the primed
// one), in the lanes of two Float4 vectors, then adds to every segment the
// free response of the true state it starts from, generated from the
// closed form p^n C(n + m - 1, m) (1 - p)^m. SmoothReference is the direct
// serial form. They agree within float rounding: |fast - reference| <=
// 1e-5 * max |x| (see noise_smoother_test.cc). Both are pure functions of
// the input, so equal inputs give bit-identical outputs on either path.
//
// Not thread safe (Smooth's scratch). SmoothInPlace never allocates; Smooth
// does only when an input is longer than any before.
#ifndef AUDIO_SORVANE_DTMF_NOISE_SMOOTHER_H_
#define AUDIO_SORVANE_DTMF_NOISE_SMOOTHER_H_

#include <span>
#include <vector>

namespace audio_sorvane {

class AlignedGammaSmoother {
 public:
  // `order` >= 1 stages with `pole` in [0, 1) (GammaFilterPoleFromStddev).
  AlignedGammaSmoother(int order, double sample_rate, double pole);

  int delay() const { return delay_; }

  // The input is `first` followed by `second` (two pieces, so that a ring
  // buffer can be read in place); `output` receives first.size() +
  // second.size() values and must not overlap the input.
  void Smooth(std::span<const float> first, std::span<const float> second, float* output);
  // Smooth in place: data[0, length) is the input and receives the output;
  // data must hold PaddedLength(length) floats (the rest is scratch).
  void SmoothInPlace(float* data, int length);
  int PaddedLength(int length) const;
  void SmoothReference(std::span<const float> first, std::span<const float> second,
                       float* output) const;

 private:
  static constexpr int kLanes = 8;
  static constexpr int kMaxOrder = 8;
  static constexpr int kChunk = 128;  // free-response values generated at a time

  int order_;
  double sample_rate_;
  double pole_;
  float gain_;
  int delay_;
  std::vector<float> input_;  // scratch of Smooth
};

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_DTMF_NOISE_SMOOTHER_H_
