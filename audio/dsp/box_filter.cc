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

namespace internal {

std::span<const float> BoxFilter2DFirstPass(std::span<const float> input, int num_rows,
                                            int first_width, int second_width,
                                            bool allow_ragged, BoxFilter2DWorkspace* workspace) {
  CHECK(workspace);
  CHECK(num_rows > 0);
  const int size = static_cast<int>(input.size());
  if (size == 0) return input;
  if (!allow_ragged && size % num_rows != 0) {
    LOG(FATAL) << "input of size " << size << " is not divisible by "
               << num_rows;
  }
  CHECK(first_width >= 1);
  CHECK(second_width >= 1);
  if (first_width == 1) return input;  // the first pass is the identity
  workspace->flat.resize(size);
  BoxFilter(input.data(), size, 1, first_width, workspace->flat.data());
  return workspace->flat;
}

}  // namespace internal

void BoxFilter2D(std::span<const float> input, int num_rows, int first_width,
                 int second_width, bool allow_ragged,
                 std::vector<float>* output) {
  CHECK(output);
  output->assign(input.size(), 0.0f);
  BoxFilter2DWorkspace workspace;
  BoxFilter2DByColumn(input, num_rows, first_width, second_width, allow_ragged, &workspace,
                      [&](int c, const float* values) {
                        const size_t first = static_cast<size_t>(c) * num_rows;
                        const size_t count = std::min<size_t>(num_rows, output->size() - first);
                        std::copy_n(values, count, output->begin() + first);
                      });
}

}  // namespace audio_dsp
