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
  std::vector<float> flat(size);
  BoxFilter(input.data(), size, 1, first_width, flat.data());
  for (int r = 0; r < num_rows; ++r) {
    BoxFilter(flat.data() + r, num_columns, num_rows, second_width,
              output->data() + r);
  }
}

}  // namespace audio_dsp
