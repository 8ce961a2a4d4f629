// A growable sample buffer that remembers how many samples have been dropped
// from its front, so that an index into it maps to an absolute sample number
// of the stream: sample i of the buffer is stream sample
// num_discarded_samples() + i. The count is 64-bit: at audio rates it
// stays exact for millennia of listening, where 32 bits wrap within days.
//
// Discard moves the start of the held samples forward and compacts the
// storage (elements move down) once the dead prefix exceeds an eighth of the
// held samples, so a receiver that discards a little per block moves each
// sample a few times, not once per discard. Not thread safe. Out-of-range
// discards and negative offsets end the process through CHECK.
#ifndef AUDIO_SORVANE_STREAM_BUFFER_H_
#define AUDIO_SORVANE_STREAM_BUFFER_H_

#include <algorithm>
#include <cstdint>
#include <span>
#include <vector>

#include "base/logging.h"

namespace audio_sorvane {

class StreamBuffer {
 public:
  StreamBuffer() = default;

  // Adds samples at the back.
  void Append(std::span<const float> samples) {
    buffer_.storage.insert(buffer_.storage.end(), samples.begin(), samples.end());
  }

  // Removes the first `num_samples` samples.
  void Discard(int num_samples) {
    CHECK(num_samples >= 0);
    CHECK(num_samples <= static_cast<int>(buffer_.size()));
    buffer_.start += num_samples;
    num_discarded_samples_ += num_samples;
    if (buffer_.start > buffer_.size() / 8) {
      buffer_.storage.erase(buffer_.storage.begin(),
                            buffer_.storage.begin() + static_cast<ptrdiff_t>(buffer_.start));
      buffer_.start = 0;
    }
  }

  // The samples from `offset` to the end; empty (null data) when `offset` is
  // at or beyond the end. Valid until the buffer next changes.
  std::span<const float> View(int offset) const {
    CHECK(offset >= 0);
    if (offset >= size()) return {};
    return {buffer_.data() + offset, buffer_.size() - offset};
  }

  // Makes room for `num_samples` held samples (and the dead prefix they
  // may trail), so that appending up to that many never reallocates.
  void Reserve(int num_samples) {
    buffer_.storage.reserve(static_cast<size_t>(num_samples) + num_samples / 8 + 1);
  }

  // Drops every sample and numbers the next appended sample `origin` (0
  // unless a test starts the stream far along).
  void Clear(int64_t origin = 0) {
    buffer_.storage.clear();
    buffer_.start = 0;
    num_discarded_samples_ = origin;
  }

  // Overwrites every held sample with 0, keeping the length and position.
  void Zero() {
    std::fill(buffer_.storage.begin() + static_cast<ptrdiff_t>(buffer_.start),
              buffer_.storage.end(), 0.0f);
  }

  int size() const { return static_cast<int>(buffer_.size()); }
  int64_t num_discarded_samples() const { return num_discarded_samples_; }
  // Capacity in samples, for memory accounting.
  int capacity() const { return static_cast<int>(buffer_.storage.capacity()); }

 private:
  // The held samples are storage[start ...]; the dead prefix before start is
  // dropped once it outgrows an eighth of them.
  struct Samples {
    std::vector<float> storage;
    size_t start = 0;
    size_t size() const { return storage.size() - start; }
    const float* data() const { return storage.data() + start; }
  };

  Samples buffer_;
  int64_t num_discarded_samples_ = 0;
};

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_STREAM_BUFFER_H_
