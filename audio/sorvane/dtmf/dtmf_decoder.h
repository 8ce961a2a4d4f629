// The multi-tone receiver.
//
// Received audio (any rate and channel count) is mixed to mono, resampled to
// the encoder's rate and run through one ToneStrengthFilter per tone; the
// filter outputs (one per baseband sample) are kept in rolling buffers. On a
// token request the tone strengths are normalised by their local level,
// an acquisition score (weakest of the strongest tones_per_symbol tones over
// the smoothed mean of the others) finds the symbol timing, and per-symbol
// scores at every symbol-spaced time with enough acquisition go to the token
// selector.
//
// Not thread safe: one caller thread per decoder. Calls before Init are
// logged errors that do nothing; parameter and shape faults end the process
// through CHECK.
#ifndef AUDIO_SORVANE_DTMF_DTMF_DECODER_H_
#define AUDIO_SORVANE_DTMF_DTMF_DECODER_H_

#include <complex>
#include <cstdint>
#include <memory>
#include <span>
#include <unordered_map>
#include <utility>
#include <vector>

#include "audio/dsp/eigen_types.h"
#include "audio/dsp/float4.h"
#include "audio/dsp/rational_factor_resampler.h"
#include "audio/sorvane/decode_results.h"
#include "audio/sorvane/dtmf/byte_symbol_converter.h"
#include "audio/sorvane/dtmf/dtmf_encoder_params.h"
#include "audio/sorvane/dtmf/noise_smoother.h"
#include "audio/sorvane/dtmf/tone_sequence_search.h"
#include "audio/sorvane/dtmf/tone_strength_filter.h"
#include "audio/sorvane/token_selector.h"

namespace audio_sorvane {

struct ToneNormalizationParams {
  // Width of the local-level window, in symbol frames. Four frames span the
  // two tones of a symbol and the neighbours that share one of them, so a
  // tone is compared with its own recent level rather than the whole burst.
  float window_size = 4.0f;
  // Share of the strongest tone's level in each tone's normaliser. Half
  // keeps a weak tone (a quiet low note through a phone speaker) from being
  // blown up while still levelling the tones against each other.
  float cross_frequency_weight = 0.5f;
  // Added to every normaliser (squared 16-bit units): keeps digital silence
  // at 0 instead of 0 / 0, far below any audible tone.
  float division_floor = 1.0f;
};

// The coherent receiver for reverberant rooms (GetReverberantToken).
struct RoomSearchParams {
  bool enabled = true;
  // Room taps per tone and candidate masks per tone (ToneSequenceSearch).
  int num_taps = 6;
  int masks_per_tone = 8;
  // Frames after Init that are never used: the broadcast may start with
  // the recording, and a loop that has just started (or a microphone's gain
  // control that is still settling) does not fit the steady-state model.
  int settle_frames = 10;
  // The newest frames fitted (at least two loops are needed).
  int max_frames = 40;
  // Frame timings tried, evenly spread over one frame; the search runs for
  // the best few of them by their unconstrained fit.
  int timing_candidates = 8;
  int timings_searched = 4;
  // Candidates returned, best fit first.
  int max_tokens = 3;
  // The search runs only when the tone strengths one loop apart correlate
  // at least this much (a looped broadcast repeats; noise, speech and music
  // do not), and at most once per frame of new audio.
  float min_loop_correlation = 0.5f;
};

// The tone parameters shared with the encoder, then the receiver's own.
struct DtmfDecoderParams : DtmfEncoderParams {
  DtmfDecoderParams() = default;
  explicit DtmfDecoderParams(const DtmfEncoderParams& tones) : DtmfEncoderParams(tones) {}

  // Widens the tone filters by the Doppler shift of the highest tone at this
  // speed (m/s); 1 m/s is a hand moving a phone.
  float max_meters_per_second = 1.0f;
  // Received signal the buffers may hold, seconds (> 0). The app sets a
  // multiple of the token duration.
  float max_buffer_duration_in_seconds = 3.0f;
  ToneNormalizationParams tone_normalization_params;
  // Noise smoother: a 4-stage gamma filter spreading over 8 symbol frames is
  // smooth enough to ignore single symbols yet follows a noise change
  // within a token.
  int noise_estimate_filter_order = 4;
  float noise_estimate_filter_stddev = 8.0f;
  // A slot counts as a symbol when its tones stand twice above the noise.
  float acquisition_threshold = 2.0f;
  int max_candidates_rank = 6;
  int max_candidates_per_decode_token_call = 2;
  float token_threshold_factor = 1.0f / 3.0f;
  RoomSearchParams room_search;
  // Runs the tone filters, the noise smoother and the slots' local levels
  // in their direct reference forms (ToneStrengthFilter::
  // ProcessSamplesReference, AlignedGammaSmoother::SmoothReference,
  // BlockMaxima::MaxReference, no slot cache) instead of the fast ones; for
  // tests.
  bool use_reference_paths = false;
};

// Refuses a record the decoder cannot be built from (the constructor ends
// the process on it): the tone record's faults first, then the receiver's.
sorvel_base::Validation ValidateDtmfDecoderParams(const DtmfDecoderParams& params);

// Per-column values of the tone buffers, rows x capacity floats keyed by
// stream position (position mod capacity): appending and dropping move
// nothing. Grows (keeping a given range) only when asked for more room.
class ColumnRing {
 public:
  void Init(int rows, int capacity);
  // Makes room for `capacity` positions, keeping [from, to).
  void Reserve(int capacity, int64_t from, int64_t to);
  int rows() const { return rows_; }
  int capacity() const { return capacity_; }
  // Row r in ring order (position p at p mod capacity).
  const float* row(int r) const { return data_.data() + static_cast<size_t>(r) * capacity_; }
  float& at(int row, int64_t position) {
    return data_[static_cast<size_t>(row) * capacity_ + static_cast<size_t>(position % capacity_)];
  }
  float at(int row, int64_t position) const {
    return data_[static_cast<size_t>(row) * capacity_ + static_cast<size_t>(position % capacity_)];
  }
  void Write(int row, int64_t position, const float* values, int count);
  void Read(int row, int64_t position, int count, float* values) const;
  // [position, position + count) of a row as up to two contiguous pieces.
  std::pair<std::span<const float>, std::span<const float>> Pieces(int row, int64_t position,
                                                                    int count) const;

 private:
  int rows_ = 0;
  int capacity_ = 0;
  std::vector<float> data_;
};

// The maxima of aligned blocks of kBlock stream positions of a ColumnRing
// (block b covers [b * kBlock, (b + 1) * kBlock)), kept in a ring of the
// same wrap, so that the maximum over a long range reads a few values per
// block instead of every value. Max is exact: it equals MaxReference, the
// direct scan, for any range of positions the ring holds.
//
// Not thread safe. The values ring's capacity must be a multiple of kBlock
// (CHECK).
class BlockMaxima {
 public:
  static constexpr int kBlock = 64;

  void Init(const ColumnRing& values);
  // Computes the blocks that end in (from, to]: call after writing values
  // [from, to), with the block holding `from` written from its start.
  void Update(const ColumnRing& values, int64_t from, int64_t to);
  // Recomputes every block inside [from, to) (after the values ring grew).
  void Rebuild(const ColumnRing& values, int64_t from, int64_t to);
  // The largest value of every row over positions [first, last] (first <=
  // last), one per row into `maxima`.
  void Max(const ColumnRing& values, int64_t first, int64_t last, float* maxima) const;
  static void MaxReference(const ColumnRing& values, int64_t first, int64_t last,
                           float* maxima);

 private:
  void ComputeBlock(const ColumnRing& values, int64_t block);

  ColumnRing maxima_;  // one value per block
};

class DtmfDecoder {
 public:
  explicit DtmfDecoder(const DtmfDecoderParams& params);

  // Must come before any audio; may be called again to restart.
  void Init(int num_channels, float received_sample_rate);
  // Empties the buffers and restarts with the same format.
  void Reset();
  // Appends interleaved samples (any scale).
  void ProcessSamples(std::span<const float> received_samples);
  // Candidates of the right length (bytes filled, position = slot of the
  // spacer) into decode_results, with the selector's scores table and the
  // recorded slots' times and acquisition scores as diagnostics. True if
  // any candidate was found.
  bool GetToken(DecodeResults* decode_results);
  // Candidates from coherent frame amplitudes with a fitted room response
  // per tone (see ToneSequenceSearch): for reverberant rooms, where the
  // tails of earlier frames mask the energy scores. Costlier than GetToken
  // and without a score table; meant for when GetToken's candidates fail
  // the CRC. Needs at least settle_frames + two loops of audio; false when
  // disabled, unsupported by the token layout, or nothing was found.
  bool GetReverberantToken(DecodeResults* decode_results);
  // The largest block (samples, channels interleaved) one call can take
  // without cutting into a token held in the buffer; 0 before Init.
  int GetMaxSafeInputSize() const;

  const DtmfDecoderParams& params() const { return params_; }
  bool uses_resampler() const { return received_resampler_ != nullptr; }
  int tone_strength_buffer_size() const { return tone_strength_buffer_size_; }
  int symbols_in_token() const { return converter_.symbols_in_token(); }
  int baseband_frame_size() const { return baseband_frame_size_; }

 private:
  friend class DtmfDecoderTestPeer;  // drives the private steps in tests

  // Brings the per-column signal and noise up to date with the buffers,
  // computing only the columns that changed (see the .cc).
  void UpdateColumnScores();
  void ComputeColumns(int first, int last);
  size_t ColumnScratchSize() const;
  // The normalised tone scores of buffer column t, into `scores`: local
  // levels from the block maxima (BlockMaxima::MaxReference, the direct
  // scan, on the reference paths). Equal results.
  void ToneScoresAt(int t, float* scores) const;
  // Running windowed sums of the block sums for the coherent path: the
  // matched-filter output of every frame of every timing candidate, as it
  // completes.
  void TrackFrames(int count);
  // Matched-filter outputs of the newest `count` frames (at most
  // max_frames) of timing candidate `candidate` starting at or after stream
  // position `earliest`, one row per frame, phase-aligned across frames.
  // Returns the number of frames.
  int FrameAmplitudes(int candidate, int64_t earliest, audio_dsp::ComplexMatrix* frames) const;
  // Whether the tone strengths of the newest frames, sampled mid-frame and
  // centred per tone, correlate with those one loop later.
  bool LoopRepeats(int first, int count) const;
  // A token read from per-tone loop masks; false unless the loop holds
  // exactly one spacer and valid symbols.
  bool TokenFromMasks(const std::vector<uint32_t>& tone_masks, DecodedToken* token) const;

  DtmfDecoderParams params_;
  ByteSymbolConverter converter_;
  std::unique_ptr<TokenSelector> token_selector_;
  int num_frequencies_ = 0;
  int frame_size_ = 0;
  int baseband_frame_size_ = 0;
  float frame_duration_ = 0.0f;
  float baseband_sample_rate_ = 0.0f;
  float received_sample_rate_ = 0.0f;
  int num_channels_ = 1;
  float received_per_baseband_ = 1.0f;
  int max_good_block_size_ = 0;
  int max_buffer_size_ = 0;
  std::unique_ptr<audio_dsp::RationalFactorResampler<float>> received_resampler_;
  std::unique_ptr<ToneFilterBank> tone_bank_;
  // Raw tone strengths, one row per tone, for stream positions
  // [begin_, begin_ + tone_strength_buffer_size_).
  ColumnRing strengths_;
  BlockMaxima strength_blocks_;
  int64_t begin_ = 0;
  int tone_strength_buffer_size_ = 0;
  bool initialized_ = false;

  std::vector<float> mono_, resampled_;  // scratch
  std::vector<float> bank_strengths_;    // scratch, one row per tone
  std::vector<float*> bank_strength_rows_;
  std::vector<std::complex<float>> bank_sums_;  // scratch, one row per tone
  std::vector<std::complex<float>*> bank_sum_rows_;

  // Coherent path (room search).
  bool search_supported_ = false;
  ToneSequenceSearchParams search_params_;
  std::vector<uint32_t> frame_phase_steps_;  // oscillator turn per frame, 2^-32
  std::unordered_map<uint32_t, int> symbol_of_tones_;  // tone bit set -> symbol
  std::unique_ptr<ToneSequenceSearch> sequence_search_;  // built on first use
  int64_t last_search_end_ = -1;  // stream position of the last gate check
  // Frame windows: w[m] = sin(pi (m + 0.5) / P) = Im e^{i phi (m + 0.5)}
  // with phi = pi / P, so a window's sum over [s, s + P) is
  // (e^{-i phi s} A - e^{i phi s} B) / 2i with A, B the sums of
  // e^{+-i phi (j + 0.5)} z_j over the window: running sums per tone (in
  // double) differenced at the window ends.
  std::vector<std::complex<double>> window_twiddles_;  // e^{i phi (j + 0.5)}, j < 2P
  std::vector<std::complex<double>> start_twiddles_;   // e^{i phi j}, j < 2P
  std::vector<std::complex<double>> running_a_, running_b_;  // per tone
  std::vector<std::complex<double>> window_a_, window_b_;    // per candidate x tone
  std::vector<int64_t> window_start_;   // per candidate: start of the open window, or -1
  std::vector<int> candidate_at_;       // per (position + 1) mod P: candidate ending there, or -1
  std::vector<int> candidate_offset_;   // per candidate
  // Per candidate the newest max_frames frames (unrotated), a ring.
  std::vector<std::complex<float>> frame_values_;  // candidate x max_frames x tones
  std::vector<int64_t> frame_starts_;              // candidate x max_frames
  std::vector<int> frame_count_, frame_next_;
  int64_t block_position_ = 0;  // stream position of the next block sum

  // Per-column acquisition terms of the last GetToken (signal row 0, noise
  // row 1), for stream positions [columns_begin_, columns_begin_ +
  // columns_length_).
  ColumnRing columns_;
  int64_t columns_begin_ = 0;
  int columns_length_ = 0;
  std::unique_ptr<AlignedGammaSmoother> smoother_;
  // Scratch, sized once.
  std::vector<audio_dsp::Float8> top8_;  // the strongest tones of eight columns
  std::vector<float> column_scores_, acquisition_;
  audio_dsp::FloatVector slot_scores_;    // one slot's symbol scores
  // Tone scores of the slots of the last GetToken whose windows lay inside
  // the buffer, by stream position (ascending), and those of the current
  // one: a slot whose window still lies inside has the same scores.
  struct SlotCache {
    std::vector<int64_t> positions;
    std::vector<float> scores;  // num_frequencies_ per position
  };
  SlotCache slot_cache_, next_slot_cache_;
  std::vector<DecodedToken> rejected_;    // candidates of the wrong length
  mutable std::vector<double> repeat_scratch_;  // LoopRepeats' strengths
  std::vector<double> folded_;
};

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_DTMF_DTMF_DECODER_H_
