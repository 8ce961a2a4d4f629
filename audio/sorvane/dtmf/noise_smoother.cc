#include "audio/sorvane/dtmf/noise_smoother.h"

#include <algorithm>
#include <cmath>

#include "audio/dsp/float4.h"
#include "audio/dsp/gamma_filter.h"
#include "base/logging.h"

namespace audio_sorvane {

using audio_dsp::Float4;
using audio_dsp::Load4;
using audio_dsp::Splat4;
using audio_dsp::Store4;

AlignedGammaSmoother::AlignedGammaSmoother(int order, double sample_rate, double pole)
    : order_(order),
      sample_rate_(sample_rate),
      pole_(pole),
      gain_(static_cast<float>(1.0 - pole)),
      delay_(audio_dsp::GammaFilterDelay(order, pole)) {
  CHECK(order >= 1);
  CHECK(sample_rate > 0.0);
}

namespace {

// The mean of pieces [begin, end) of first ++ second, in double.
float Mean(std::span<const float> first, std::span<const float> second, int begin, int end) {
  const int n1 = static_cast<int>(first.size());
  double sum = 0.0;
  for (int i = begin; i < end; ++i) sum += i < n1 ? first[i] : second[i - n1];
  return static_cast<float>(sum / (end - begin));
}

// The free-response coefficients c_m(n) = p^n C(n + m - 1, m) (1 - p)^m
// for n = 1, 2, ... in turn, m < order: the response of stage m to a unit
// state in stage 0 after n steps. Generated as needed rather than tabled,
// so the smoother holds no tables that grow with the input.
class FreeResponse {
 public:
  FreeResponse(double pole, int order) : pole_(pole), g_(1.0 - pole), order_(order) {}
  // Moves to the next n and writes c_m(n) to out[m * stride].
  void Next(float* out, int stride) {
    ++n_;
    pn_ *= pole_;
    double b = 1.0;  // C(n + m - 1, m) g^m
    for (int m = 0; m < order_; ++m) {
      if (m > 0) b *= (n_ + m - 1) * g_ / m;
      out[m * stride] = static_cast<float>(pn_ * b);
    }
  }
  void Skip() {
    ++n_;
    pn_ *= pole_;
  }

 private:
  double pole_, g_;
  int order_;
  int n_ = 0;
  double pn_ = 1.0;  // p^n
};

}  // namespace

void AlignedGammaSmoother::SmoothReference(std::span<const float> first,
                                           std::span<const float> second, float* output) const {
  const int length = static_cast<int>(first.size() + second.size());
  if (length == 0) return;
  std::vector<float> x(first.begin(), first.end());
  x.insert(x.end(), second.begin(), second.end());
  const int d = delay_;
  if (length <= d) {
    std::fill(output, output + length, Mean(first, second, 0, length));
    return;
  }
  const float head = d > 0 ? Mean(first, second, 0, d) : x[0];
  const float tail = d > 0 ? Mean(first, second, length - d, length) : x[length - 1];
  audio_dsp::GammaFilter filter(order_, sample_rate_, pole_);
  filter.SetState(head);
  std::vector<float> scratch(d);
  filter.ProcessBlock(x.data(), d, scratch.data());  // warm-up, output unused
  filter.ProcessBlock(x.data() + d, length - d, output);
  std::fill(scratch.begin(), scratch.end(), tail);
  filter.ProcessBlock(scratch.data(), d, output + (length - d));
}

int AlignedGammaSmoother::PaddedLength(int length) const {
  const int total = length + delay_;
  return std::max(kLanes * ((total + kLanes - 1) / kLanes), length);
}

void AlignedGammaSmoother::Smooth(std::span<const float> first, std::span<const float> second,
                                  float* output) {
  const int length = static_cast<int>(first.size() + second.size());
  if (length == 0) return;
  if (order_ > kMaxOrder) return SmoothReference(first, second, output);
  input_.resize(std::max<size_t>(input_.size(), PaddedLength(length)));
  std::copy(first.begin(), first.end(), input_.begin());
  std::copy(second.begin(), second.end(), input_.begin() + first.size());
  SmoothInPlace(input_.data(), length);
  std::copy_n(input_.data(), length, output);
}

void AlignedGammaSmoother::SmoothInPlace(float* data, int length) {
  if (length == 0) return;
  const int d = delay_;
  if (order_ > kMaxOrder) {
    input_.assign(data, data + length);
    return SmoothReference(std::span<const float>(input_), {}, data);
  }
  const std::span<const float> first(data, length), second;
  if (length <= d) {
    std::fill(data, data + length, Mean(first, second, 0, length));
    return;
  }
  const float head = d > 0 ? Mean(first, second, 0, d) : data[0];
  const float tail = d > 0 ? Mean(first, second, length - d, length) : data[length - 1];
  // The input u = x ++ (d times tail); y[j] (j >= d) goes to output[j - d].
  // Each lane reads u at an index before writing y there, so y replaces u
  // in place.
  const int total = length + d;
  const int segment = (total + kLanes - 1) / kLanes;
  const int order = order_;
  const Float4 gain = Splat4(gain_);

  // Zero-state runs, one segment per lane (lane 0 primed with head).
  Float4 state[kMaxOrder][2];
  for (int k = 0; k < order; ++k) {
    state[k][0] = Float4{head, 0.0f, 0.0f, 0.0f};
    state[k][1] = Splat4(0.0f);
  }
  float final_state[kLanes][kMaxOrder] = {};
  const int padded = kLanes * segment;
  float* const full = data;
  std::fill(data + length, data + padded, tail);
  int lane_length[kLanes];
  for (int q = 0; q < kLanes; ++q) lane_length[q] = std::clamp(total - q * segment, 0, segment);
  for (int i = 0; i < segment; ++i) {
    float* x = data + i;
    Float4 in[2] = {Float4{x[0], x[segment], x[2 * segment], x[3 * segment]},
                    Float4{x[4 * segment], x[5 * segment], x[6 * segment], x[7 * segment]}};
    for (int k = 0; k < order; ++k) {
      for (int h = 0; h < 2; ++h) {
        state[k][h] += gain * (in[h] - state[k][h]);
        in[h] = state[k][h];
      }
    }
    for (int q = 0; q < kLanes; ++q) full[q * segment + i] = in[q / 4][q % 4];
  }
  // The end states of the whole segments (only those are read below; a
  // short last segment ran on into the padding).
  for (int q = 0; q < kLanes; ++q) {
    if (lane_length[q] == segment) {
      for (int k = 0; k < order; ++k) final_state[q][k] = state[k][q / 4][q % 4];
    }
  }

  // Free responses: the true state entering segment q is the previous
  // segment's zero-state end plus the free response of its own entry state.
  // c_m(segment), the free response across a whole segment.
  float across[kMaxOrder];
  {
    FreeResponse response(pole_, order);
    for (int n = 1; n < segment; ++n) response.Skip();
    response.Next(across, 1);
  }
  float c[kMaxOrder * kChunk];  // c_m(n) for a chunk of n, row m at m * kChunk
  float entry[kMaxOrder] = {};  // the true state entering segment q
  for (int q = 1; q < kLanes; ++q) {
    const int start = q * segment;
    if (start >= total) break;
    float next[kMaxOrder];
    for (int k = 0; k < order; ++k) {
      float free = 0.0f;
      if (q > 1) {
        for (int m = 0; m <= k; ++m) free += across[m] * entry[k - m];
      }
      next[k] = final_state[q - 1][k] + free;
    }
    std::copy(next, next + order, entry);
    // Output j = start + n - 1 gets sum_m c_m(n) entry[order - 1 - m], in
    // chunks of n that start at multiples of kChunk.
    const int end = std::min(total, start + segment);
    int j = std::max(start, d);
    FreeResponse response(pole_, order);
    for (int n = 1; n <= j - start; ++n) response.Skip();
    while (j < end) {
      const int first = j;
      const int chunk_end = std::min(end, start + ((j - start) / kChunk + 1) * kChunk);
      for (int i = first; i < chunk_end; ++i) response.Next(c + (i - first), kChunk);
      for (; j < chunk_end && (j - start) % 4 != 0; ++j) {
        float free = 0.0f;
        for (int m = 0; m < order; ++m) free += c[m * kChunk + j - first] * entry[order - 1 - m];
        full[j] += free;
      }
      for (; j + 4 <= chunk_end; j += 4) {
        Float4 free = Splat4(0.0f);
        for (int m = 0; m < order; ++m) {
          free += Load4(c + m * kChunk + j - first) * Splat4(entry[order - 1 - m]);
        }
        Store4(&full[j], Load4(&full[j]) + free);
      }
      for (; j < chunk_end; ++j) {
        float free = 0.0f;
        for (int m = 0; m < order; ++m) free += c[m * kChunk + j - first] * entry[order - 1 - m];
        full[j] += free;
      }
    }
  }
  std::copy(full + d, full + total, data);
}

}  // namespace audio_sorvane
