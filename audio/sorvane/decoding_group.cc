#include "audio/sorvane/decoding_group.h"

#include <algorithm>
#include <bitset>
#include <cmath>
#include <cstdlib>

#include "base/logging.h"

namespace audio_sorvane {

DecodingGroup::DecodingGroup(int first_time, int period, int max_gap, float score,
                             float phase_tolerance)
    : start_time_(first_time),
      score_(score),
      period_(period),
      max_phase_error_(static_cast<int>(std::round(period * phase_tolerance))),
      max_gap_(max_gap),
      times_{first_time} {}

void DecodingGroup::Restart(int first_time, float score) {
  start_time_ = first_time;
  score_ = score;
  times_.assign(1, first_time);
}

bool DecodingGroup::TryAdd(int time, float score) {
  CHECK(time > times_.back());
  if (time - times_.back() > max_gap_) return false;
  const int phase = std::abs(time - start_time_) % period_;
  if (std::min(period_ - phase, phase) > max_phase_error_) return false;
  score_ += score;
  times_.push_back(time);
  return true;
}

int DecodingGroup::SlotOf(int time) const {
  return static_cast<int>(
      std::round(static_cast<float>(time - start_time_) / static_cast<float>(period_)));
}

bool DecodingGroup::CoversAllSlots(int num_slots) const {
  // Marks on the stack for the usual token lengths (receivers ask on every
  // request and must not allocate); on the heap beyond.
  constexpr int kStackSlots = 1024;
  std::bitset<kStackSlots> stack_marks;
  std::vector<bool> heap_marks(num_slots > kStackSlots ? num_slots : 0, false);
  int covered = 0;
  for (int t : times_) {
    const int slot = SlotOf(t) % num_slots;  // C remainder: times never precede the start
    if (slot < 0) continue;
    const bool seen = num_slots > kStackSlots ? heap_marks[slot] : stack_marks[slot];
    if (seen) continue;
    if (num_slots > kStackSlots) {
      heap_marks[slot] = true;
    } else {
      stack_marks[slot] = true;
    }
    ++covered;
  }
  return covered == num_slots;
}

int DecodingGroup::IndexOfSlot(int slot) const {
  CHECK(!times_.empty());
  const int target = start_time_ + period_ * slot - (period_ + 1) / 2;
  auto it = std::lower_bound(times_.begin(), times_.end(), target);
  for (; it != times_.end(); ++it) {
    if (SlotOf(*it) >= slot) return static_cast<int>(it - times_.begin());
  }
  return static_cast<int>(times_.size()) - 1;
}

}  // namespace audio_sorvane
