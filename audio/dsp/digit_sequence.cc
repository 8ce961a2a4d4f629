#include "audio/dsp/digit_sequence.h"

#include <limits>
#include <utility>

#include "base/logging.h"

namespace audio_dsp {

DigitSequence::DigitSequence(std::vector<int> digits, int base)
    : digits_(std::move(digits)), base_(base) {
  CHECK(base >= 2);
  if (digits_.empty()) digits_.push_back(0);
  for (int digit : digits_) {
    CHECK(digit >= 0);
    CHECK(digit < base_);
  }
  while (digits_.size() > 1 && digits_.back() == 0) digits_.pop_back();
}

DigitSequence::DigitSequence(int value, int base) : digits_{value}, base_(base) {
  CHECK(value >= 0);
  CHECK(base >= 2);
  Carry();
}

void DigitSequence::Carry() {
  int carry = 0;
  for (int& digit : digits_) {
    const int t = digit + carry;
    carry = t / base_;
    digit = t - carry * base_;
  }
  while (carry >= 1) {
    digits_.push_back(carry % base_);
    carry /= base_;
  }
}

DigitSequence DigitSequence::ConvertToBase(int result_base) const {
  CHECK(result_base >= 2);
  CHECK(result_base <= (std::numeric_limits<int>::max() / 2 + 1) / base_);
  DigitSequence result(0, result_base);
  for (auto it = digits_.rbegin(); it != digits_.rend(); ++it) {
    for (int& digit : result.digits_) digit *= base_;
    result.digits_[0] += *it;
    result.Carry();
  }
  return result;
}

}  // namespace audio_dsp
