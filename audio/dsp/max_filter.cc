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
  CHECK(window_size >= 1);
  if (num_samples == 0) return;
  CHECK(input);
  CHECK(output);
  const int n = num_samples;
  const int w = window_size;
  const int ahead = (w - 1) / 2;
  std::vector<float> prefix(n), suffix(n);
  for (int block = 0; block < n; block += w) {
    const int end = std::min(n, block + w);
    prefix[block] = input[block];
    for (int i = block + 1; i < end; ++i) prefix[i] = std::max(prefix[i - 1], input[i]);
    suffix[end - 1] = input[end - 1];
    for (int i = end - 2; i >= block; --i) suffix[i] = std::max(suffix[i + 1], input[i]);
  }
  const float whole = *std::max_element(input, input + n);
  for (int j = 0; j < n; ++j) {
    const int last = j + ahead;  // window [last - w + 1, last]
    const int first = last - w + 1;
    if (first <= 0 && last >= n - 1) {
      output[j] = whole;  // the window covers the whole signal
    } else if (first <= 0) {
      // Clipped at the start: the maximum of input[0 .. last]. Block
      // prefixes restart every w samples, and last < w here, so the first
      // block's prefix is the running maximum from 0.
      output[j] = prefix[last];
    } else if (last >= n - 1) {
      // Clipped at the end: the maximum of input[first .. n - 1], which
      // lies in the last block or spans the last two.
      const int last_block = (n - 1) / w * w;
      output[j] = first >= last_block ? suffix[first]
                                      : std::max(suffix[first], prefix[n - 1]);
    } else {
      output[j] = std::max(suffix[first], prefix[last]);
    }
  }
}

}  // namespace audio_dsp
