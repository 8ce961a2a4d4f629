// How much of a new block to skip and how much old signal to drop so that a
// receiver's buffer stays within its budget. All sizes are received samples
// per channel.
#ifndef AUDIO_SORVANE_COMPUTE_BUFFER_TRUNCATION_H_
#define AUDIO_SORVANE_COMPUTE_BUFFER_TRUNCATION_H_

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

// The largest block (samples, channels interleaved) one call can take
// without cutting into a token already in the buffer: the room beside one
// token, never negative.
inline int MaxSafeInputSize(int max_buffer_size, int max_good_block_size, int num_channels) {
  const int room = max_buffer_size - max_good_block_size;
  return (room > 0 ? room : 0) * num_channels;
}

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_COMPUTE_BUFFER_TRUNCATION_H_
