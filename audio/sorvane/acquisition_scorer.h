// Decides, frame by frame, whether a DSSS broadcast is on the air.
//
// Fed the decimated complex baseband, it slides the spreading-code template
// over it one sample at a time. For each position ("frame") n the template
// is cut into num_chunks pieces; each piece is correlated coherently and the
// pieces are combined for every candidate carrier offset f_i (cycles per
// frame) with the phasors exp(+j c 2 pi f_i / num_chunks):
//   p_n[i] = | sum_c phasor[i][c] corr_c(n) |^2.
// The acquisition score of frame n is max_i p_n[i] over a noise level, the
// mean of p over frequencies smoothed by a two-stage gamma filter; the
// smoother's delay N is compensated, so the score of frame n is emitted N frames later.
// The detection score integrates p non-coherently over whole code periods
// in a detection window and normalises the best bin by the total power.
//
// Not thread safe. Fatal checks guard the geometry and mismatched inputs.
#ifndef AUDIO_SORVANE_ACQUISITION_SCORER_H_
#define AUDIO_SORVANE_ACQUISITION_SCORER_H_

#include <cstdint>
#include <span>
#include <vector>

#include "audio/dsp/eigen_types.h"
#include "audio/dsp/gamma_filter.h"

namespace audio_sorvane {

// How the frequency powers are computed. kFast combines mirror frequencies
// (+f, -f) from shared sums, for half the multiplications, when the grid
// allows it; kReference is the direct complex product per frequency. The
// two differ by float rounding only: powers agree within a relative 1e-5.
enum class AcquisitionPath { kFast, kReference };

class AcquisitionScorer {
 public:
  // `code_template`: one baseband frame of the code (F samples);
  // `frequency_offsets` in carrier cycles per frame; `detection_window` in
  // baseband samples; `smoothing_width` (> 0, frames) sets the noise
  // smoother's spread.
  AcquisitionScorer(std::span<const float> code_template,
                    std::span<const float> frequency_offsets, int num_chunks,
                    int detection_window, float smoothing_width,
                    AcquisitionPath path = AcquisitionPath::kFast);

  // Consumes equal-length real and imaginary baseband blocks and replaces
  // `acquisition_scores` with the scores that became available: the same
  // bits however the stream is split into blocks.
  void ScoreSamples(std::span<const float> baseband_real_signal,
                    std::span<const float> baseband_imaginary_signal,
                    std::vector<float>* acquisition_scores);

  // The detection score over the most recent frames (0 until enough frames
  // were seen). With `normalize`, the best bin over the mean total power per
  // shift.
  float DetectionScore(bool normalize) const;

  // Starts over: no frames, empty windows, zero history. The noise levels
  // are re-seeded after the next warm-up. The next frame is numbered
  // `first_frame` (a test may start far along the stream).
  void Reset(int64_t first_frame = 0);
  // Zeroes the window samples and the history, keeping positions and count.
  void ZeroHistory();

  int frame_size() const { return frame_size_; }
  int noise_delay() const { return noise_delay_; }
  float noise_alpha() const { return noise_smoother_.gain(); }
  // The number of the next frame: frames scored since Reset plus its first_frame.
  int64_t frame_counter() const { return frame_counter_; }
  int detection_window_size() const { return detection_window_size_; }
  int history_size() const { return history_rows_; }
  // True when the fast path's paired form is in use.
  bool paired() const { return paired_; }

 private:
  // A sliding window over one baseband stream that holds up to capacity =
  // 2F - 1 samples and compacts itself once per F frames.
  struct FrameWindow {
    std::vector<float> samples;
    int frame_size = 0;
    int capacity = 0;
    int shifted = 0;
    int read = 0;
    int write = 0;

    size_t Fill(std::span<const float> input);
    bool HasFrame() const { return read + frame_size <= write; }
    std::span<const float> Frame() const {
      return std::span<const float>(samples).subspan(read, frame_size);
    }
    void Advance();
    void Clear() { shifted = read = write = 0; }
  };

  // Stores the frequency powers (num_frequencies_ values `stride` apart) of
  // frame frame_counter_ in the history and returns the score of frame
  // counter - N.
  float FinishFrame(const float* powers, int stride);
  // The same for eight frames whose powers are interleaved (out[8 i + j] is
  // frequency i of frame j); appends the scores that are due.
  void FinishFrames8(const float* powers, std::vector<float>* scores);
  // Updates the noise level with frame frame_counter_'s power sum (its
  // powers and peak already stored), advances the counter and returns the
  // score of frame counter - N.
  float ScoreStored(float power_sum);

  int frame_size_;
  int num_frequencies_;
  int num_chunks_;
  int detection_window_size_;
  int detection_num_frames_;
  int detection_num_shifts_;
  int chunk_size_;
  int last_chunk_size_;
  // The code template; chunk c is code_[c * chunk_size_ ...].
  std::vector<float> code_;
  audio_dsp::ComplexMatrix phasor_matrix_;
  int64_t frame_counter_ = 0;  // 64-bit: a 32-bit count wraps after 40 h
  int64_t first_frame_ = 0;
  FrameWindow real_window_;
  FrameWindow imaginary_window_;
  bool paired_ = false;
  mutable audio_dsp::FloatVector detection_sums_;  // DetectionScore's scratch
  std::vector<float> batch_real_;    // 16 frames' correlations per chunk
  std::vector<float> batch_imaginary_;
  std::vector<float> batch_powers_;      // 8 frames per frequency
  std::vector<float> matrix_real_;       // the phasors by frequency
  std::vector<float> matrix_imaginary_;
  audio_dsp::GammaFilter noise_smoother_;  // one sample per frame
  int noise_delay_;
  float noise_level_ = 0.0f;  // the smoother's latest output
  int warmup_frames_;
  // Frequency powers of the recent frames: row (frame & (rows - 1)).
  int history_rows_ = 0;
  std::vector<float> history_;
  float* HistoryRow(int64_t frame) {
    return history_.data() + (frame & (history_rows_ - 1)) * num_frequencies_;
  }
  const float* HistoryRow(int64_t frame) const {
    return history_.data() + (frame & (history_rows_ - 1)) * num_frequencies_;
  }
  // Each recent frame's largest frequency power, by frame & (peak_rows_ - 1):
  // the score's numerator, taken while the powers are at hand.
  int peak_rows_ = 0;
  std::vector<float> peaks_;
  float& Peak(int64_t frame) { return peaks_[frame & (peak_rows_ - 1)]; }
  std::vector<float> batch_sums_, batch_peaks_;  // FinishFrames8's, 8 each
};

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_ACQUISITION_SCORER_H_
