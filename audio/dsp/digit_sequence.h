// A non-negative integer of any size held as digits in a base (2 .. 2^30),
// least significant digit first, and its conversion to another base. Used to
// write token bytes (base 256) in the multi-tone alphabet's base.
//
// Immutable values. Digits out of range, bases below 2 and result bases whose
// product with the source base exceeds 2^30 end the process through CHECK.
#ifndef AUDIO_DSP_DIGIT_SEQUENCE_H_
#define AUDIO_DSP_DIGIT_SEQUENCE_H_

#include <vector>

namespace audio_dsp {

class DigitSequence {
 public:
  // From digits (least significant first), each in [0, base). High-order
  // zeros are dropped; an empty list is the value 0.
  DigitSequence(std::vector<int> digits, int base);
  // From a value >= 0, spread over as many digits as it needs.
  DigitSequence(int value, int base);

  // The same number in `result_base`, by Horner's scheme. Conversion is
  // quadratic in the number of digits; tokens are a few bytes long.
  DigitSequence ConvertToBase(int result_base) const;

  const std::vector<int>& digits() const { return digits_; }
  int base() const { return base_; }

 private:
  // Brings every digit into [0, base) by carrying upwards, growing the
  // sequence as needed.
  void Carry();

  std::vector<int> digits_;
  int base_;
};

}  // namespace audio_dsp

#endif  // AUDIO_DSP_DIGIT_SEQUENCE_H_
