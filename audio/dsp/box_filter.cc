#include "audio/dsp/box_filter.h"

#include <algorithm>
#include <cstddef>

#include "base/logging.h"

namespace audio_dsp {

void BoxFilter(const float* input, int num_samples, int stride, int box_width,
               float* output) {
  CHECK(input);
  CHECK(num_samples >= 0);
  CHECK(box_width >= 1);
  CHECK(output);
  const int n = num_samples;
  const int ahead = (box_width - 1) / 2;
  const int back = box_width - ahead;
  const auto in = [=](int j) { return input[static_cast<ptrdiff_t>(j) * stride]; };
  const auto out = [=](int j) -> float& {
    return output[static_cast<ptrdiff_t>(j) * stride];
  };

  double sum = 0.0;
  for (int j = 0; j < std::min(ahead, n); ++j) sum += in(j);
  int i = 0;
  // Window still growing at the front.
  for (; i < std::min(n - ahead, back); ++i) {
    sum += in(i + ahead);
    out(i) = static_cast<float>(sum);
  }
  if (n >= box_width) {
    // Full window slides.
    for (; i < n - ahead; ++i) {
      sum += in(i + ahead) - in(i - back);
      out(i) = static_cast<float>(sum);
    }
  } else {
    // The whole signal is inside the window.
    for (; i < std::min(n, back); ++i) out(i) = static_cast<float>(sum);
  }
  // Window shrinking at the end.
  for (; i < n; ++i) {
    sum -= in(i - back);
    out(i) = static_cast<float>(sum);
  }
}

namespace {

// BoxFilter along each row of a column-major table, all rows at once: the
// same running sums in the same order as one BoxFilter call per row (so the
// results are identical), but walking memory column by column instead of
// jumping num_rows floats per step.
void BoxFilterRows(const float* input, int num_rows, int num_columns, int box_width,
                   float* output) {
  const int n = num_columns;
  const int ahead = (box_width - 1) / 2;
  const int back = box_width - ahead;
  const auto in = [=](int c) { return input + static_cast<ptrdiff_t>(c) * num_rows; };
  const auto out = [=](int c) { return output + static_cast<ptrdiff_t>(c) * num_rows; };
  std::vector<double> sum(num_rows, 0.0);
  for (int j = 0; j < std::min(ahead, n); ++j) {
    for (int r = 0; r < num_rows; ++r) sum[r] += in(j)[r];
  }
  int i = 0;
  for (; i < std::min(n - ahead, back); ++i) {
    for (int r = 0; r < num_rows; ++r) {
      sum[r] += in(i + ahead)[r];
      out(i)[r] = static_cast<float>(sum[r]);
    }
  }
  if (n >= box_width) {
    for (; i < n - ahead; ++i) {
      const float* added = in(i + ahead);
      const float* removed = in(i - back);
      for (int r = 0; r < num_rows; ++r) {
        sum[r] += added[r] - removed[r];
        out(i)[r] = static_cast<float>(sum[r]);
      }
    }
  } else {
    for (; i < std::min(n, back); ++i) {
      for (int r = 0; r < num_rows; ++r) out(i)[r] = static_cast<float>(sum[r]);
    }
  }
  for (; i < n; ++i) {
    for (int r = 0; r < num_rows; ++r) {
      sum[r] -= in(i - back)[r];
      out(i)[r] = static_cast<float>(sum[r]);
    }
  }
}

}  // namespace

void BoxFilter2D(std::span<const float> input, int num_rows, int first_width,
                 int second_width, bool allow_ragged,
                 std::vector<float>* output) {
  CHECK(output);
  CHECK(num_rows > 0);
  const int size = static_cast<int>(input.size());
  output->assign(size, 0.0f);
  if (size == 0) return;
  const int num_columns = size / num_rows;
  if (!allow_ragged && size != num_columns * num_rows) {
    LOG(FATAL) << "input of size " << size << " is not divisible by "
               << num_rows;
  }
  CHECK(first_width >= 1);
  CHECK(second_width >= 1);
  std::vector<float> flat(size);
  BoxFilter(input.data(), size, 1, first_width, flat.data());
  BoxFilterRows(flat.data(), num_rows, num_columns, second_width, output->data());
}

}  // namespace audio_dsp
