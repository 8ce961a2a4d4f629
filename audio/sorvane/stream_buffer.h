// A growable sample buffer that remembers how many samples it has dropped
// from its front, so that an index into it maps to an absolute sample number
// of the stream: sample i of the buffer is stream sample
// num_discarded_samples() + i.
//
// Discard moves the start of the held samples forward and compacts the
// vector (elements move down) once the dead prefix exceeds a quarter of the
// live samples, so a receiver that discards a little per block moves each
// sample a few times, not once per discard. Not thread safe.
// Out-of-range discards and negative offsets end the process through CHECK.
#ifndef AUDIO_SORVANE_STREAM_BUFFER_H_
#define AUDIO_SORVANE_STREAM_BUFFER_H_

#include <algorithm>
#include <span>
#include <vector>

#include "base/logging.h"

namespace audio_sorvane {

class StreamBuffer {
 public:
  StreamBuffer() = default;

  // Adds samples at the back.
  void Append(std::span<const float> samples) {
    buffer_.insert(buffer_.end(), samples.begin(), samples.end());
  }

  // Removes the first `num_samples` samples.
  void Discard(int num_samples) {
    CHECK(num_samples >= 0);
    CHECK(num_samples <= size());
    start_ += num_samples;
    num_discarded_samples_ += num_samples;
    if (start_ > size() / 4) {
      buffer_.erase(buffer_.begin(), buffer_.begin() + start_);
      start_ = 0;
    }
  }

  // The samples from `offset` to the end; empty (null data) when `offset` is
  // at or beyond the end. Valid until the buffer next changes.
  std::span<const float> View(int offset) const {
    CHECK(offset >= 0);
    if (offset >= size()) return {};
    return std::span<const float>(buffer_).subspan(start_ + offset);
  }

  // Drops every sample and resets the stream position to 0.
  void Clear() {
    buffer_.clear();
    start_ = 0;
    num_discarded_samples_ = 0;
  }

  // Overwrites every held sample with 0, keeping the length and position.
  void Zero() { std::fill(buffer_.begin() + start_, buffer_.end(), 0.0f); }

  int size() const { return static_cast<int>(buffer_.size()) - start_; }
  int num_discarded_samples() const { return num_discarded_samples_; }
  // Capacity in samples, for memory accounting.
  int capacity() const { return static_cast<int>(buffer_.capacity()); }

 private:
  std::vector<float> buffer_;
  int start_ = 0;  // index in buffer_ of the first held sample
  int num_discarded_samples_ = 0;
};

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_STREAM_BUFFER_H_
