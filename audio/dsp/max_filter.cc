#include "audio/dsp/max_filter.h"

#include <vector>

#include "base/logging.h"

namespace audio_dsp {

void MaxFilter(const float* input, int num_samples, int window_size,
               float* output) {
  CHECK(num_samples >= 0);
  CHECK(window_size >= 1);
  if (num_samples == 0) return;
  CHECK(input);
  CHECK(output);
  const int n = num_samples;
  const int ahead = (window_size - 1) / 2;
  // Indices whose values decrease from front to back. Every index is pushed
  // once, so a flat array of n entries with two cursors is enough.
  std::vector<int> queue(n);
  int front = 0;
  int back = 0;
  for (int i = 0; i < n + ahead; ++i) {
    if (front < back && queue[front] <= i - window_size) ++front;
    if (i < n) {
      while (front < back && input[queue[back - 1]] <= input[i]) --back;
      queue[back++] = i;
    }
    if (i >= ahead) output[i - ahead] = input[queue[front]];
  }
}

}  // namespace audio_dsp
