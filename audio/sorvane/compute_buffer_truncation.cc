#include "audio/sorvane/compute_buffer_truncation.h"

#include <algorithm>

#include "base/logging.h"

namespace audio_sorvane {

BufferTruncation ComputeBufferTruncation(int input_size, int buffered_size,
                                         int max_good_block_size, int max_buffer_size) {
  const int n = input_size;
  const int m = max_buffer_size;
  if (n + buffered_size <= m) return {};
  if (n > m - max_good_block_size) {
    if (n > m) {
      const int skip = n - m;
      LOG(WARNING) << "Input of size " << n << " exceeds maximum buffer size " << m
                   << ", " << skip << " samples skipped, signal may be lost.";
      return {skip, buffered_size};
    }
    LOG(WARNING) << "Input of size " << n << " exceeds maximum good block size "
                 << m - max_good_block_size << ", signal may be lost.";
  }
  return {0, std::max(n + buffered_size - m, 0)};
}

}  // namespace audio_sorvane
