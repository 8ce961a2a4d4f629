// Detection times that belong to one transmission: each follows the previous
// one by at most max_gap and lies within max_phase_error of the symbol grid
// start_time + k * period.
//
// Not thread safe. Offering times out of order ends the process through
// CHECK.
#ifndef AUDIO_SORVANE_DECODING_GROUP_H_
#define AUDIO_SORVANE_DECODING_GROUP_H_

#include <cstddef>
#include <vector>

namespace audio_sorvane {

class DecodingGroup {
 public:
  // `phase_tolerance` is a fraction of the period.
  DecodingGroup(int first_time, int period, int max_gap, float score,
                float phase_tolerance);

  // Starts over from one time with the same period and tolerances, keeping
  // the storage (so a receiver can reuse its groups from request to request).
  void Restart(int first_time, float score);

  // Makes room for `count` times.
  void Reserve(size_t count) { times_.reserve(count); }

  // Adds `time` (greater than every time so far) if it is close enough to the
  // last time and on the grid.
  bool TryAdd(int time, float score);

  // True when the times, reduced to slots modulo num_slots, cover every slot.
  bool CoversAllSlots(int num_slots) const;

  // Index of the first time at or after `slot` periods from the start (half a
  // period of slack); the last index if there is none.
  int IndexOfSlot(int slot) const;

  // round((time - start_time) / period).
  int SlotOf(int time) const;

  int start_time() const { return start_time_; }
  float score() const { return score_; }
  int period() const { return period_; }
  const std::vector<int>& times() const { return times_; }

 private:
  int start_time_;
  float score_;
  int period_;
  int max_phase_error_;
  int max_gap_;
  std::vector<int> times_;
};

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_DECODING_GROUP_H_
