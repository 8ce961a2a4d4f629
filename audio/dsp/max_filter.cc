#include "audio/dsp/max_filter.h"

#include <algorithm>
#include <vector>

#include "base/logging.h"

namespace audio_dsp {

// Van Herk / Gil-Werman: cut the signal into blocks of window_size samples
// and keep, per sample, the maximum from its block's start (prefix) and to
// its block's end (suffix). A full window [s, s + w - 1] meets at most two
// blocks, so its maximum is max(suffix[s], prefix[s + w - 1]): three
// comparisons per sample whatever the window, and no data-dependent
// branches. Windows clipped by the signal's ends take the global prefix or
// suffix maximum instead. The result equals the running maximum of the
// window [j + ahead - w + 1, j + ahead] clipped to the signal.
void MaxFilter(const float* input, int num_samples, int window_size, float* output) {
  CHECK(num_samples >= 0);
  std::vector<float> scratch(2 * static_cast<size_t>(num_samples));
  MaxFilter(input, num_samples, window_size, output, scratch.data());
}

void MaxFilter(const float* input, int num_samples, int window_size, float* output,
               float* scratch) {
  CHECK(num_samples >= 0);
  CHECK(window_size >= 1);
  if (num_samples == 0) return;
  CHECK(input);
  CHECK(output);
  const int n = num_samples;
  const int w = window_size;
  const int ahead = (w - 1) / 2;
  float* const prefix = scratch;
  float* const suffix = scratch + n;
  for (int block = 0; block < n; block += w) {
    const int end = std::min(n, block + w);
    // Both running maxima in one loop: two independent dependency chains
    // run side by side.
    float up = input[block], down = input[end - 1];
    prefix[block] = up;
    suffix[end - 1] = down;
    for (int i = 1; i < end - block; ++i) {
      up = std::max(up, input[block + i]);
      down = std::max(down, input[end - 1 - i]);
      prefix[block + i] = up;
      suffix[end - 1 - i] = down;
    }
  }
  // Output j reads the window [j + ahead - w + 1, j + ahead]. Outputs whose
  // window is clipped at the start or end are handled apart, so the
  // interior loop has no branches.
  const int last_block = (n - 1) / w * w;
  const auto clipped = [&](int j) {
    const int last = j + ahead;
    const int first = last - w + 1;
    // A window covering the whole signal means n <= w: one block, whose
    // prefix ends in the maximum of everything.
    if (first <= 0 && last >= n - 1) return prefix[n - 1];
    // Clipped at the start: the maximum of input[0 .. last]. Block prefixes
    // restart every w samples, and last < w here, so the first block's
    // prefix is the running maximum from 0.
    if (first <= 0) return prefix[last];
    // Clipped at the end: the maximum of input[first .. n - 1], which lies
    // in the last block or spans the last two.
    return first >= last_block ? suffix[first] : std::max(suffix[first], prefix[n - 1]);
  };
  const int interior_begin = std::min(n, w - 1 - ahead + 1);  // first > 0
  const int interior_end = std::max(interior_begin, n - 1 - ahead);  // last < n - 1
  for (int j = 0; j < interior_begin; ++j) output[j] = clipped(j);
  const float* suffix_at = suffix + (ahead - w + 1);
  const float* prefix_at = prefix + ahead;
  for (int j = interior_begin; j < interior_end; ++j) {
    output[j] = std::max(suffix_at[j], prefix_at[j]);
  }
  for (int j = interior_end; j < n; ++j) output[j] = clipped(j);
}

}  // namespace audio_dsp
