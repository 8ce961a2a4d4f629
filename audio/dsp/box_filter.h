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

#include <algorithm>
#include <cstddef>
#include <span>
#include <vector>

namespace audio_dsp {

// Reads `num_samples` elements at input[0], input[stride], ... and writes the
// box sums at the same positions of `output`. `input` and `output` must not
// overlap (the running sum reads samples behind the one it writes).
void BoxFilter(const float* input, int num_samples, int stride, int box_width,
               float* output);

// Storage BoxFilter2DByColumn keeps between calls, so that repeated calls
// on inputs of a steady size allocate nothing.
struct BoxFilter2DWorkspace {
  std::vector<float> flat;     // the first pass, when first_width > 1
  std::vector<double> sums;    // one running sum per row
  std::vector<float> column;   // the column being handed out
};

// Treats `input` as a column-major table of `num_rows` rows (element r + c *
// num_rows is row r, column c). First box-filters the whole input as one flat
// sequence with `first_width`, running across the boundaries between columns
// (intended: neighbouring rows are neighbouring offsets), then box-filters
// each row along the columns with `second_width`, and hands the result out
// one column at a time, in order: visit(c, values) with the num_rows values
// of column c. With `allow_ragged`, a trailing incomplete column is allowed
// and handed out as zeros (its first input_size % num_rows values); without
// it, an incomplete column ends the process.
template <typename Visit>
void BoxFilter2DByColumn(std::span<const float> input, int num_rows, int first_width,
                         int second_width, bool allow_ragged, BoxFilter2DWorkspace* workspace,
                         Visit visit);

// The same, written to `output` (resized to the input's size).
void BoxFilter2D(std::span<const float> input, int num_rows, int first_width,
                 int second_width, bool allow_ragged,
                 std::vector<float>* output);

namespace internal {
// Checks the arguments and runs the first pass; returns the flat sequence.
std::span<const float> BoxFilter2DFirstPass(std::span<const float> input, int num_rows,
                                            int first_width, int second_width,
                                            bool allow_ragged, BoxFilter2DWorkspace* workspace);
}  // namespace internal

template <typename Visit>
void BoxFilter2DByColumn(std::span<const float> input, int num_rows, int first_width,
                         int second_width, bool allow_ragged, BoxFilter2DWorkspace* workspace,
                         Visit visit) {
  const std::span<const float> flat = internal::BoxFilter2DFirstPass(
      input, num_rows, first_width, second_width, allow_ragged, workspace);
  const int n = static_cast<int>(input.size()) / num_rows;  // whole columns
  const int ahead = (second_width - 1) / 2;
  const int back = second_width - ahead;
  const auto in = [&](int c) { return flat.data() + static_cast<ptrdiff_t>(c) * num_rows; };
  std::vector<double>& sum = workspace->sums;
  std::vector<float>& out = workspace->column;
  sum.assign(num_rows, 0.0);
  out.assign(num_rows, 0.0f);
  // The running sums of one BoxFilter per row, all rows at once, walking
  // memory column by column.
  for (int j = 0; j < std::min(ahead, n); ++j) {
    for (int r = 0; r < num_rows; ++r) sum[r] += in(j)[r];
  }
  int i = 0;
  const auto emit = [&](int c) {
    for (int r = 0; r < num_rows; ++r) out[r] = static_cast<float>(sum[r]);
    visit(c, static_cast<const float*>(out.data()));
  };
  for (; i < std::min(n - ahead, back); ++i) {
    for (int r = 0; r < num_rows; ++r) sum[r] += in(i + ahead)[r];
    emit(i);
  }
  if (n >= second_width) {
    for (; i < n - ahead; ++i) {
      const float* added = in(i + ahead);
      const float* removed = in(i - back);
      for (int r = 0; r < num_rows; ++r) sum[r] += added[r] - removed[r];
      emit(i);
    }
  } else {
    for (; i < std::min(n, back); ++i) emit(i);
  }
  for (; i < n; ++i) {
    for (int r = 0; r < num_rows; ++r) sum[r] -= in(i - back)[r];
    emit(i);
  }
  if (static_cast<int>(input.size()) > n * num_rows) {
    std::fill(out.begin(), out.end(), 0.0f);
    visit(n, static_cast<const float*>(out.data()));
  }
}

}  // namespace audio_dsp

#endif  // AUDIO_DSP_BOX_FILTER_H_
