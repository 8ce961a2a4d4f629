// How much of a new block to skip and how much old signal to drop so that a
// receiver's buffer stays within its budget. All sizes are received samples
// per channel.
#ifndef AUDIO_SORVANE_COMPUTE_BUFFER_TRUNCATION_H_
#define AUDIO_SORVANE_COMPUTE_BUFFER_TRUNCATION_H_

#include <algorithm>
#include <cmath>

#include "audio/dsp/number_util.h"

namespace audio_sorvane {

struct BufferTruncation {
  int skip = 0;  // leading samples of the new block to ignore
  int drop = 0;  // oldest buffered samples to discard
  friend bool operator==(const BufferTruncation&, const BufferTruncation&) = default;
};

// `input_size` new samples arrive at a buffer holding `buffered_size` of at
// most `max_buffer_size`; `max_good_block_size` is one token. A block larger
// than the whole buffer is cut to its last max_buffer_size samples (and the
// buffer emptied); a block larger than what fits beside one token is taken
// with a warning, since a token spanning the cut may be lost.
BufferTruncation ComputeBufferTruncation(int input_size, int buffered_size,
                                         int max_good_block_size, int max_buffer_size);

// ComputeBufferTruncation in the units a receiver works in.
struct BlockTruncation {
  int skip_samples = 0;   // leading samples of the block, channels interleaved
  int drop_baseband = 0;  // oldest baseband samples to discard
};

// `num_samples` interleaved samples of `num_channels` channels arrive at a
// receiver holding `baseband_held` baseband samples of `input_per_baseband`
// received samples each. The drop is rounded up to whole frames of
// `baseband_frame_size` (keeping the symbol phase) and capped at
// baseband_held. The ratio's type sets the precision of the conversions.
template <typename Ratio>
BlockTruncation ComputeBlockTruncation(int num_samples, int num_channels,
                                       Ratio input_per_baseband, int baseband_held,
                                       int baseband_frame_size, int max_good_block_size,
                                       int max_buffer_size) {
  const int buffered_size =
      static_cast<int>(std::ceil(input_per_baseband * (baseband_held + 1)));
  const BufferTruncation truncation = ComputeBufferTruncation(
      num_samples / num_channels, buffered_size, max_good_block_size, max_buffer_size);
  BlockTruncation block;
  block.skip_samples = truncation.skip * num_channels;
  const int drop = static_cast<int>(std::ceil(truncation.drop / input_per_baseband));
  if (drop >= 1) {
    block.drop_baseband =
        std::min(audio_dsp::RoundUpToMultiple(drop, baseband_frame_size), baseband_held);
  }
  return block;
}

// The largest block (samples, channels interleaved) one call can take
// without cutting into a token already in the buffer: the room beside one
// token, never negative.
inline int MaxSafeInputSize(int max_buffer_size, int max_good_block_size, int num_channels) {
  const int room = max_buffer_size - max_good_block_size;
  return (room > 0 ? room : 0) * num_channels;
}

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_COMPUTE_BUFFER_TRUNCATION_H_
