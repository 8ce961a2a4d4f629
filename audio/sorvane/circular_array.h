// A ring of a power-of-two number of slots addressed by an ever-growing
// (64-bit) frame counter: counter i (negative ones too) maps to slot i & (size - 1),
// so the owner never reduces its counter and no division is needed.
//
// Not thread safe. A minimum size outside [1, 2^30] ends the process through
// CHECK.
#ifndef AUDIO_SORVANE_CIRCULAR_ARRAY_H_
#define AUDIO_SORVANE_CIRCULAR_ARRAY_H_

#include <bit>
#include <cstdint>
#include <vector>

#include "base/logging.h"

namespace audio_sorvane {

template <typename T>
class CircularArray {
 public:
  // Holds the smallest power of two >= `min_size` default-constructed slots.
  explicit CircularArray(int min_size) {
    CHECK(min_size > 0);
    CHECK(min_size <= 1 << 30);
    size_ = static_cast<int>(std::bit_ceil(static_cast<unsigned>(min_size)));
    mask_ = size_ - 1;
    slots_.resize(size_);
  }

  T& operator[](int64_t counter) { return slots_[static_cast<size_t>(counter & mask_)]; }
  const T& operator[](int64_t counter) const {
    return slots_[static_cast<size_t>(counter & mask_)];
  }

  // Assigns a copy of `value` to every slot.
  void Fill(const T& value) { slots_.assign(size_, value); }

  int size() const { return size_; }

 private:
  int size_ = 0;
  int64_t mask_ = 0;
  std::vector<T> slots_;
};

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_CIRCULAR_ARRAY_H_
