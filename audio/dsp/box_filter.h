// Running box sums.
//
// BoxFilter: output[i] = sum of input[j] for j in [i - back + 1, i + ahead],
// clipped to the signal, with ahead = (box_width - 1) / 2 and back =
// box_width - ahead: a centred window for odd widths, reaching one sample
// further back for even widths. These are sums, not means. The running sum
// is kept in double to limit drift; the cost is linear in the length and
// independent of the width.
//
// Stateless and thread-compatible. Null pointers, negative lengths and widths
// below 1 end the process through CHECK.
#ifndef AUDIO_DSP_BOX_FILTER_H_
#define AUDIO_DSP_BOX_FILTER_H_

#include <span>
#include <vector>

namespace audio_dsp {

// Reads `num_samples` elements at input[0], input[stride], ... and writes the
// box sums at the same positions of `output`. `input` and `output` must not
// overlap (the running sum reads samples behind the one it writes).
void BoxFilter(const float* input, int num_samples, int stride, int box_width,
               float* output);

// Treats `input` as a column-major table of `num_rows` rows (element r + c *
// num_rows is row r, column c). First box-filters the whole input as one flat
// sequence with `first_width`, running across the boundaries between columns
// (intended: neighbouring rows are neighbouring offsets), then box-filters
// each row along the columns with `second_width`. `output` is resized to the
// input's size. With `allow_ragged`, a trailing incomplete column is allowed;
// its outputs are 0. Without it, an incomplete column ends the process.
void BoxFilter2D(std::span<const float> input, int num_rows, int first_width,
                 int second_width, bool allow_ragged,
                 std::vector<float>* output);

}  // namespace audio_dsp

#endif  // AUDIO_DSP_BOX_FILTER_H_
