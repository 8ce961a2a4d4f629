#include "audio/sorvane/acquisition_scorer.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <cstring>
#include <numbers>

#include "audio/dsp/float4.h"
#include "audio/dsp/multiversion.h"
#include "audio/sorvane/sorvane_util.h"
#include "base/logging.h"

namespace audio_sorvane {
namespace {

using audio_dsp::FloatVector;

// Eight floats per value. On x86 a GCC/Clang 32-byte vector: SSE register
// pairs, or single AVX2 registers in the clone chosen at load time. Loads
// and horizontal sums are macros, not functions: a 32-byte vector passed to
// or returned from a function outside an AVX context changes the calling
// convention, which compilers reject or warn about. Elsewhere (NEON) two
// 16-byte halves: a 32-byte vector type there is lowered through the stack.
#if defined(__x86_64__)
typedef float Float8 __attribute__((vector_size(32)));
#define SORVEL_LOAD8(name, pointer) \
  Float8 name;                      \
  std::memcpy(&name, (pointer), sizeof(Float8))
#define SORVEL_STORE8(pointer, v) std::memcpy((pointer), &(v), sizeof(Float8))
// Listing the lanes lets the compiler broadcast straight from memory; adding
// the scalar to a zero vector would cost an addition (x + 0 is not x for -0).
#define SORVEL_SPLAT8(x) (Float8{(x), (x), (x), (x), (x), (x), (x), (x)})
#define SORVEL_MAX8(a, b) ((a) > (b) ? (a) : (b))
#else
using audio_dsp::Float8;
#define SORVEL_LOAD8(name, pointer) const Float8 name = audio_dsp::Load8(pointer)
#define SORVEL_STORE8(pointer, v) audio_dsp::Store8((pointer), (v))
#define SORVEL_SPLAT8(x) audio_dsp::Splat8(x)
#define SORVEL_MAX8(a, b) audio_dsp::Max8((a), (b))
#endif

// The re/im correlation of each chunk of `code` with sixteen consecutive
// frames: lane j of a sum is the frame starting j samples later, so the
// template value is broadcast and no horizontal sums are needed. Two
// eight-lane sums per part share each template value and keep more
// multiply-adds in flight. Frames 0-7 go to out[8 c + j], frames 8-15 to
// out[8 (num_chunks + c) + j].
SORVEL_MULTIVERSION void CorrelateChunks16(const float* code, const float* frame_real,
                                           const float* frame_imaginary, int num_chunks,
                                           int chunk_size, int last_chunk_size,
                                           float* out_real, float* out_imaginary) {
  for (int c = 0; c < num_chunks; ++c) {
    const int offset = c * chunk_size;
    const int size = c + 1 < num_chunks ? chunk_size : last_chunk_size;
    const float* t = code + offset;
    const float* re = frame_real + offset;
    const float* im = frame_imaginary + offset;
    Float8 re_a = {}, im_a = {}, re_b = {}, im_b = {};
    for (int k = 0; k < size; ++k) {
      SORVEL_LOAD8(ra, re + k);
      SORVEL_LOAD8(ia, im + k);
      SORVEL_LOAD8(rb, re + k + 8);
      SORVEL_LOAD8(ib, im + k + 8);
      const Float8 tk = SORVEL_SPLAT8(t[k]);
      re_a += tk * ra;
      im_a += tk * ia;
      re_b += tk * rb;
      im_b += tk * ib;
    }
    SORVEL_STORE8(out_real + 8 * c, re_a);
    SORVEL_STORE8(out_imaginary + 8 * c, im_a);
    SORVEL_STORE8(out_real + 8 * (num_chunks + c), re_b);
    SORVEL_STORE8(out_imaginary + 8 * (num_chunks + c), im_b);
  }
}

// The powers of eight frames at once from their correlations (lane j of
// entry c is frame j's chunk c): out[8 i + j] is frequency i of frame j. The
// phasors are stored by frequency, one row of num_chunks per frequency.
SORVEL_MULTIVERSION void FrequencyPowers8(const float* phasors_real,
                                          const float* phasors_imaginary,
                                          const float* corr_real, const float* corr_imaginary,
                                          int num_frequencies, int num_chunks, float* out) {
  for (int i = 0; i < num_frequencies; ++i) {
    const float* pr = phasors_real + i * num_chunks;
    const float* pi = phasors_imaginary + i * num_chunks;
    Float8 acc_re = {}, acc_im = {};
    for (int c = 0; c < num_chunks; ++c) {
      SORVEL_LOAD8(x, corr_real + 8 * c);
      SORVEL_LOAD8(y, corr_imaginary + 8 * c);
      acc_re += SORVEL_SPLAT8(pr[c]) * x - SORVEL_SPLAT8(pi[c]) * y;
      acc_im += SORVEL_SPLAT8(pr[c]) * y + SORVEL_SPLAT8(pi[c]) * x;
    }
    const Float8 p = acc_re * acc_re + acc_im * acc_im;
    SORVEL_STORE8(out + 8 * i, p);
  }
}

// The same powers when the frequencies come in pairs +f, -f (a grid
// symmetric around 0): with phasor = C + jS for +f, the -f phasor is its
// conjugate, so A = sum_c C_c corr_c and B = sum_c S_c corr_c give both,
// |A + jB|^2 and |A - jB|^2, for half the multiplications. `cosines` and
// `sines` hold the phasors of the first num_pairs rows, num_chunks each;
// row n - 1 - p is the conjugate of row p and the middle row (has_zero) is
// all ones. out[8 i + j] is frequency i of frame j, as for FrequencyPowers8,
// with n = 2 num_pairs + has_zero rows.
SORVEL_MULTIVERSION void PairedFrequencyPowers8(const float* cosines, const float* sines,
                                                const float* corr_real,
                                                const float* corr_imaginary, int num_pairs,
                                                bool has_zero, int num_chunks, float* out) {
  const int n = 2 * num_pairs + (has_zero ? 1 : 0);
  // Both powers of pair p from its sums (a macro: a function taking 32-byte
  // vectors would change the calling convention outside AVX code).
#define SORVEL_STORE_PAIR(p, ar, ai, br, bi)                                      \
  {                                                                             \
    const Float8 plus_re = (ar) - (bi), plus_im = (ai) + (br);                  \
    const Float8 minus_re = (ar) + (bi), minus_im = (ai) - (br);                \
    const Float8 plus = plus_re * plus_re + plus_im * plus_im;                  \
    const Float8 minus = minus_re * minus_re + minus_im * minus_im;             \
    SORVEL_STORE8(out + 8 * (p), plus);                                         \
    SORVEL_STORE8(out + 8 * (n - 1 - (p)), minus);                              \
  }
  int p = 0;
  // Two pairs per pass: eight independent sums hide the multiply-add
  // latency, and each correlation loaded serves both.
  for (; p + 2 <= num_pairs; p += 2) {
    const float* cs = cosines + p * num_chunks;
    const float* sn = sines + p * num_chunks;
    Float8 ar = {}, ai = {}, br = {}, bi = {}, cr = {}, ci = {}, dr = {}, di = {};
    for (int c = 0; c < num_chunks; ++c) {
      SORVEL_LOAD8(x, corr_real + 8 * c);
      SORVEL_LOAD8(y, corr_imaginary + 8 * c);
      const Float8 cv = SORVEL_SPLAT8(cs[c]), sv = SORVEL_SPLAT8(sn[c]);
      const Float8 cw = SORVEL_SPLAT8(cs[num_chunks + c]), sw = SORVEL_SPLAT8(sn[num_chunks + c]);
      ar += cv * x;
      ai += cv * y;
      br += sv * x;
      bi += sv * y;
      cr += cw * x;
      ci += cw * y;
      dr += sw * x;
      di += sw * y;
    }
    SORVEL_STORE_PAIR(p, ar, ai, br, bi)
    SORVEL_STORE_PAIR(p + 1, cr, ci, dr, di)
  }
  for (; p < num_pairs; ++p) {
    const float* cs = cosines + p * num_chunks;
    const float* sn = sines + p * num_chunks;
    Float8 ar = {}, ai = {}, br = {}, bi = {};
    for (int c = 0; c < num_chunks; ++c) {
      SORVEL_LOAD8(x, corr_real + 8 * c);
      SORVEL_LOAD8(y, corr_imaginary + 8 * c);
      const Float8 cv = SORVEL_SPLAT8(cs[c]), sv = SORVEL_SPLAT8(sn[c]);
      ar += cv * x;
      ai += cv * y;
      br += sv * x;
      bi += sv * y;
    }
    SORVEL_STORE_PAIR(p, ar, ai, br, bi)
  }
#undef SORVEL_STORE_PAIR
  if (has_zero) {
    Float8 re = {}, im = {};
    for (int c = 0; c < num_chunks; ++c) {
      SORVEL_LOAD8(x, corr_real + 8 * c);
      SORVEL_LOAD8(y, corr_imaginary + 8 * c);
      re += x;
      im += y;
    }
    const Float8 p = re * re + im * im;
    SORVEL_STORE8(out + 8 * num_pairs, p);
  }
}

// Per lane j of eight frames whose n powers are interleaved (powers[8 i +
// j] is frequency i of frame j): their sum, added in the order of
// AcquisitionScorer::FinishFrame's scalar loop (four interleaved partial
// sums, the remainder on the first), so both give the same bits, and their
// largest.
SORVEL_MULTIVERSION void SumsAndPeaks8(const float* powers, int n, float* sums, float* peaks) {
  Float8 s0 = {}, s1 = {}, s2 = {}, s3 = {};
  SORVEL_LOAD8(first, powers);
  Float8 top = first;
  int i = 0;
  for (; i + 4 <= n; i += 4) {
    SORVEL_LOAD8(a, powers + 8 * i);
    SORVEL_LOAD8(b, powers + 8 * (i + 1));
    SORVEL_LOAD8(c, powers + 8 * (i + 2));
    SORVEL_LOAD8(d, powers + 8 * (i + 3));
    s0 += a;
    s1 += b;
    s2 += c;
    s3 += d;
    top = SORVEL_MAX8(top, SORVEL_MAX8(SORVEL_MAX8(a, b), SORVEL_MAX8(c, d)));
  }
  for (; i < n; ++i) {
    SORVEL_LOAD8(a, powers + 8 * i);
    s0 += a;
    top = SORVEL_MAX8(top, a);
  }
  const Float8 sum = (s0 + s1) + (s2 + s3);
  SORVEL_STORE8(sums, sum);
  SORVEL_STORE8(peaks, top);
}

// rows[j][i] = powers[8 i + j] for i < n, j < 8: eight frames' interleaved
// powers written to their history rows. On x86 eight values of each row at
// a time through an 8 x 8 transpose in registers.
SORVEL_MULTIVERSION void Deinterleave8(const float* powers, int n, float* const* rows) {
  int i = 0;
#if defined(__x86_64__)
  for (; i + 8 <= n; i += 8) {
    const float* p = powers + 8 * i;
    SORVEL_LOAD8(r0, p);
    SORVEL_LOAD8(r1, p + 8);
    SORVEL_LOAD8(r2, p + 16);
    SORVEL_LOAD8(r3, p + 24);
    SORVEL_LOAD8(r4, p + 32);
    SORVEL_LOAD8(r5, p + 40);
    SORVEL_LOAD8(r6, p + 48);
    SORVEL_LOAD8(r7, p + 56);
    // Pairs of rows interleaved, then pairs of pairs, then the halves.
#define SORVEL_LOW1(a, b) __builtin_shufflevector(a, b, 0, 8, 1, 9, 4, 12, 5, 13)
#define SORVEL_HIGH1(a, b) __builtin_shufflevector(a, b, 2, 10, 3, 11, 6, 14, 7, 15)
#define SORVEL_LOW2(a, b) __builtin_shufflevector(a, b, 0, 1, 8, 9, 4, 5, 12, 13)
#define SORVEL_HIGH2(a, b) __builtin_shufflevector(a, b, 2, 3, 10, 11, 6, 7, 14, 15)
    const Float8 t0 = SORVEL_LOW1(r0, r1), t1 = SORVEL_HIGH1(r0, r1), t2 = SORVEL_LOW1(r2, r3),
                 t3 = SORVEL_HIGH1(r2, r3), t4 = SORVEL_LOW1(r4, r5), t5 = SORVEL_HIGH1(r4, r5),
                 t6 = SORVEL_LOW1(r6, r7), t7 = SORVEL_HIGH1(r6, r7);
    const Float8 u0 = SORVEL_LOW2(t0, t2), u1 = SORVEL_HIGH2(t0, t2), u2 = SORVEL_LOW2(t1, t3),
                 u3 = SORVEL_HIGH2(t1, t3), u4 = SORVEL_LOW2(t4, t6), u5 = SORVEL_HIGH2(t4, t6),
                 u6 = SORVEL_LOW2(t5, t7), u7 = SORVEL_HIGH2(t5, t7);
#undef SORVEL_LOW1
#undef SORVEL_HIGH1
#undef SORVEL_LOW2
#undef SORVEL_HIGH2
#define SORVEL_HALVES(j, a, b)                                                            \
  {                                                                                       \
    const Float8 low = __builtin_shufflevector(a, b, 0, 1, 2, 3, 8, 9, 10, 11);          \
    const Float8 high = __builtin_shufflevector(a, b, 4, 5, 6, 7, 12, 13, 14, 15);       \
    SORVEL_STORE8(rows[j] + i, low);                                                      \
    SORVEL_STORE8(rows[j + 4] + i, high);                                                 \
  }
    SORVEL_HALVES(0, u0, u4)
    SORVEL_HALVES(1, u1, u5)
    SORVEL_HALVES(2, u2, u6)
    SORVEL_HALVES(3, u3, u7)
#undef SORVEL_HALVES
  }
#endif
  for (; i < n; ++i) {
    for (int j = 0; j < 8; ++j) rows[j][i] = powers[8 * i + j];
  }
}

constexpr int kNoiseSmootherOrder = 2;

// The noise smoother for a smoothing width of `width` frames: two gamma
// stages whose impulse response has a standard deviation of
// width / sqrt(24) frames.
audio_dsp::GammaFilter MakeNoiseSmoother(double width) {
  return audio_dsp::GammaFilter(
      kNoiseSmootherOrder, /*sample_rate=*/1.0,
      audio_dsp::GammaFilterPoleFromStddev(width / std::sqrt(24.0), kNoiseSmootherOrder));
}


}  // namespace

size_t AcquisitionScorer::FrameWindow::Fill(std::span<const float> input) {
  const size_t n = std::min(input.size(), static_cast<size_t>(capacity - write));
  std::copy_n(input.begin(), n, samples.begin() + write);
  write += static_cast<int>(n);
  return n;
}

void AcquisitionScorer::FrameWindow::Advance() {
  ++read;
  if (read > capacity - frame_size) {
    std::copy(samples.begin() + read, samples.begin() + write, samples.begin());
    write -= read;
    shifted += read;
    read = 0;
  }
}

AcquisitionScorer::AcquisitionScorer(std::span<const float> code_template,
                                     std::span<const float> frequency_offsets,
                                     int num_chunks, int detection_window,
                                     float smoothing_width, AcquisitionPath path)
    : frame_size_(static_cast<int>(code_template.size())),
      num_frequencies_(static_cast<int>(frequency_offsets.size())),
      num_chunks_(num_chunks),
      detection_window_size_(std::max(2 * frame_size_ - 1, detection_window)),
      detection_num_frames_((detection_window_size_ + 1 - frame_size_) / frame_size_),
      detection_num_shifts_(detection_window_size_ + 1 - detection_num_frames_ * frame_size_),
      chunk_size_(0),
      last_chunk_size_(0),
      noise_smoother_(MakeNoiseSmoother(smoothing_width)),
      noise_delay_(audio_dsp::GammaFilterDelay(kNoiseSmootherOrder, noise_smoother_.pole())) {
  CHECK(num_chunks_ > 0);
  CHECK(detection_num_frames_ >= 1);
  CHECK(detection_num_shifts_ >= frame_size_);
  warmup_frames_ = std::max(noise_delay_, 10);
  // The history holds the frames read back: the delayed frame (N + 1), the
  // warm-up, and the detection window's oldest frame, W + 1 - F back. One
  // flat ring of power-of-two rows, addressed by the frame counter.
  const int rows = std::max({noise_delay_ + 1, warmup_frames_,
                             detection_window_size_ + 1 - frame_size_});
  history_rows_ = static_cast<int>(std::bit_ceil(static_cast<unsigned>(rows)));
  history_.assign(static_cast<size_t>(history_rows_) * num_frequencies_, 0.0f);
  // Room for a batch of eight ahead of the delayed frame.
  peak_rows_ = static_cast<int>(std::bit_ceil(static_cast<unsigned>(noise_delay_ + 8)));
  peaks_.assign(peak_rows_, 0.0f);
  batch_sums_.assign(8, 0.0f);
  batch_peaks_.assign(8, 0.0f);

  chunk_size_ = static_cast<int>(
      std::ceil(static_cast<float>(frame_size_) / static_cast<float>(num_chunks_)));
  last_chunk_size_ = frame_size_ - (num_chunks_ - 1) * chunk_size_;
  code_.assign(code_template.begin(), code_template.end());
  std::vector<float> steps(frequency_offsets.begin(), frequency_offsets.end());
  PhasorMatrix(steps, num_chunks_, 2.0 * std::numbers::pi / num_chunks_, &phasor_matrix_);
  detection_sums_.setZero(num_frequencies_);
  batch_real_.assign(16 * num_chunks_, 0.0f);
  batch_powers_.assign(8 * num_frequencies_, 0.0f);
  matrix_real_.resize(static_cast<size_t>(num_frequencies_) * num_chunks_);
  matrix_imaginary_.resize(matrix_real_.size());
  for (int i = 0; i < num_frequencies_; ++i) {
    for (int c = 0; c < num_chunks_; ++c) {
      matrix_real_[i * num_chunks_ + c] = phasor_matrix_(i, c).real();
      matrix_imaginary_[i * num_chunks_ + c] = phasor_matrix_(i, c).imag();
    }
  }
  batch_imaginary_.assign(16 * num_chunks_, 0.0f);
  // The paired form needs rows that are conjugates of their mirror rows
  // (frequencies symmetric around 0, as the receiver's grids are) and a
  // middle row of ones.
  paired_ = path == AcquisitionPath::kFast;
  for (int i = 0; i < num_frequencies_ && paired_; ++i) {
    for (int c = 0; c < num_chunks_; ++c) {
      const std::complex<float> v = phasor_matrix_(i, c);
      const std::complex<float> mirror = phasor_matrix_(num_frequencies_ - 1 - i, c);
      paired_ = paired_ && v == std::conj(mirror) &&
                (2 * i + 1 != num_frequencies_ || v == std::complex<float>(1.0f, 0.0f));
    }
  }
  for (FrameWindow* window : {&real_window_, &imaginary_window_}) {
    // Fifteen more samples than are ever filled: a batch of sixteen frames
    // of which only the first are complete reads past the last one.
    window->capacity = 2 * frame_size_ - 1;
    window->samples.assign(window->capacity + 15, 0.0f);
    window->frame_size = frame_size_;
  }
  Reset();
}

void AcquisitionScorer::Reset(int64_t first_frame) {
  frame_counter_ = first_frame_ = first_frame;
  real_window_.Clear();
  imaginary_window_.Clear();
  std::fill(history_.begin(), history_.end(), 0.0f);
  std::fill(peaks_.begin(), peaks_.end(), 0.0f);
}

void AcquisitionScorer::ZeroHistory() {
  std::fill(real_window_.samples.begin(), real_window_.samples.end(), 0.0f);
  std::fill(imaginary_window_.samples.begin(), imaginary_window_.samples.end(), 0.0f);
  std::fill(history_.begin(), history_.end(), 0.0f);
  std::fill(peaks_.begin(), peaks_.end(), 0.0f);
}

void AcquisitionScorer::ScoreSamples(std::span<const float> baseband_real_signal,
                                     std::span<const float> baseband_imaginary_signal,
                                     std::vector<float>* acquisition_scores) {
  if (baseband_real_signal.size() != baseband_imaginary_signal.size()) {
    LOG(WARNING) << "Baseband signal size mismatch: " << baseband_real_signal.size()
                 << " vs. " << baseband_imaginary_signal.size();
  }
  CHECK(baseband_real_signal.size() == baseband_imaginary_signal.size());
  CHECK(acquisition_scores);
  acquisition_scores->clear();
  size_t consumed = 0;
  const size_t total = baseband_real_signal.size();
  do {
    real_window_.Fill(baseband_real_signal.subspan(consumed));
    consumed += imaginary_window_.Fill(baseband_imaginary_signal.subspan(consumed));
    while (real_window_.HasFrame() && imaginary_window_.HasFrame()) {
      // Sixteen frames in one pass, the last batch possibly partly complete
      // (its extra lanes are dropped): every frame takes the same
      // arithmetic, so scores do not depend on how blocks were split.
      // Advancing may compact the windows, but every sample the batch needs
      // has been read by then.
      const int available =
          std::min(real_window_.write, imaginary_window_.write) - real_window_.read -
          frame_size_ + 1;
      CorrelateChunks16(code_.data(), real_window_.Frame().data(),
                        imaginary_window_.Frame().data(), num_chunks_, chunk_size_,
                        last_chunk_size_, batch_real_.data(), batch_imaginary_.data());
      for (int half = 0; half < 2 && available > 8 * half; ++half) {
        const float* corr_real = batch_real_.data() + 8 * num_chunks_ * half;
        const float* corr_imaginary = batch_imaginary_.data() + 8 * num_chunks_ * half;
        if (paired_) {
          PairedFrequencyPowers8(matrix_real_.data(), matrix_imaginary_.data(), corr_real,
                                 corr_imaginary, num_frequencies_ / 2,
                                 num_frequencies_ % 2 == 1, num_chunks_, batch_powers_.data());
        } else {
          FrequencyPowers8(matrix_real_.data(), matrix_imaginary_.data(), corr_real,
                           corr_imaginary, num_frequencies_, num_chunks_, batch_powers_.data());
        }
        const int complete = std::min(8, available - 8 * half);
        if (complete == 8) {
          FinishFrames8(batch_powers_.data(), acquisition_scores);
        } else {
          for (int j = 0; j < complete; ++j) {
            const float score = FinishFrame(batch_powers_.data() + j, 8);
            if (frame_counter_ - first_frame_ > noise_delay_) acquisition_scores->push_back(score);
          }
        }
        for (int j = 0; j < complete; ++j) {
          real_window_.Advance();
          imaginary_window_.Advance();
        }
      }
    }
  } while (consumed < total);
}

float AcquisitionScorer::FinishFrame(const float* powers, int stride) {
  float* power = HistoryRow(frame_counter_);
  // Sums and maxima in four interleaved parts: one running value would make
  // every step wait on the previous one. SumsAndPeaks8 adds in this order.
  float s0 = 0.0f, s1 = 0.0f, s2 = 0.0f, s3 = 0.0f;
  float peak = powers[0];
  int i = 0;
  for (; i + 4 <= num_frequencies_; i += 4) {
    for (int k = 0; k < 4; ++k) {
      power[i + k] = powers[(i + k) * stride];
      peak = std::max(peak, power[i + k]);
    }
    s0 += power[i];
    s1 += power[i + 1];
    s2 += power[i + 2];
    s3 += power[i + 3];
  }
  for (; i < num_frequencies_; ++i) {
    power[i] = powers[i * stride];
    peak = std::max(peak, power[i]);
    s0 += power[i];
  }
  Peak(frame_counter_) = peak;
  return ScoreStored((s0 + s1) + (s2 + s3));
}

void AcquisitionScorer::FinishFrames8(const float* powers, std::vector<float>* scores) {
  SumsAndPeaks8(powers, num_frequencies_, batch_sums_.data(), batch_peaks_.data());
  if (frame_counter_ - first_frame_ >= warmup_frames_) {
    // Past the warm-up: the noise smoother runs over the eight frames with
    // its stages in registers, the same arithmetic as ScoreStored's.
    float levels[8];
    float* rows[8];
    for (int j = 0; j < 8; ++j) rows[j] = HistoryRow(frame_counter_ + j);
    Deinterleave8(powers, num_frequencies_, rows);
    for (int j = 0; j < 8; ++j) {
      Peak(frame_counter_ + j) = batch_peaks_[j];
      levels[j] = batch_sums_[j] / static_cast<float>(num_frequencies_);
    }
    noise_smoother_.ProcessBlock(levels, 8, levels);
    noise_level_ = levels[7];
    for (int j = 0; j < 8; ++j) {
      const int64_t n = frame_counter_ + j;
      const float score = Peak(n - noise_delay_) / (levels[j] + 1e-12f);
      if (n - first_frame_ > noise_delay_) scores->push_back(score);
    }
    frame_counter_ += 8;
    return;
  }
  for (int j = 0; j < 8; ++j) {
    float* row = HistoryRow(frame_counter_);
    for (int i = 0; i < num_frequencies_; ++i) row[i] = powers[8 * i + j];
    Peak(frame_counter_) = batch_peaks_[j];
    const float score = ScoreStored(batch_sums_[j]);
    if (frame_counter_ - first_frame_ > noise_delay_) scores->push_back(score);
  }
}

float AcquisitionScorer::ScoreStored(float power_sum) {
  const int64_t n = frame_counter_;
  const int64_t age = n - first_frame_;
  float score = 0.0f;
  if (age == warmup_frames_ - 1) {
    float sum = 0.0f;
    for (int k = 0; k < warmup_frames_; ++k) {
      sum += Eigen::Map<const FloatVector>(HistoryRow(first_frame_ + k), num_frequencies_).sum();
    }
    noise_level_ = sum / static_cast<float>(num_frequencies_ * warmup_frames_);
    noise_smoother_.SetState(noise_level_);
  } else if (age > warmup_frames_ - 1) {
    noise_level_ = noise_smoother_.ProcessSample(power_sum / static_cast<float>(num_frequencies_));
  }
  if (age >= warmup_frames_ - 1) score = Peak(n - noise_delay_) / (noise_level_ + 1e-12f);
  ++frame_counter_;
  return score;
}

float AcquisitionScorer::DetectionScore(bool normalize) const {
  if (frame_size_ + (frame_counter_ - first_frame_) <= detection_window_size_) return 0.0f;
  FloatVector& accumulated = detection_sums_;
  float peak = 0.0f;
  double total = 0.0;
  for (int s = 0; s < detection_num_shifts_; ++s) {
    accumulated.setZero();
    for (int m = 0; m < detection_num_frames_; ++m) {
      accumulated += Eigen::Map<const FloatVector>(
          HistoryRow(frame_counter_ - 1 - s - m * frame_size_), num_frequencies_);
    }
    peak = std::max(peak, accumulated.maxCoeff());
    total += accumulated.sum();
  }
  if (normalize) {
    peak /= std::max(static_cast<float>(total / (detection_num_frames_ * detection_num_shifts_)),
                     1e-12f);
  }
  return peak;
}

}  // namespace audio_sorvane
