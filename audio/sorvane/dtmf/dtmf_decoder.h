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
#include <vector>

#include "audio/dsp/eigen_types.h"
#include "audio/dsp/rational_factor_resampler.h"
#include "audio/sorvane/dtmf/byte_symbol_converter.h"
#include "audio/sorvane/dtmf/dtmf_encoder_params.h"
#include "audio/sorvane/dtmf/tone_sequence_search.h"
#include "audio/sorvane/dtmf/tone_strength_filter.h"
#include "audio/sorvane/sorvane_decoder.h"
#include "audio/sorvane/stream_buffer.h"
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
  // Aligns the gamma-smoothed sequence with its input (see the .cc).
  void SmoothNoise(std::vector<float>* noise) const;
  // Brings tone_scores_, column_signal_ and column_noise_ up to date with
  // the buffers, computing only the columns that changed (see the .cc).
  void UpdateColumnScores();
  void ComputeColumns(int first, int last, audio_dsp::RowMajorFloatMatrix* scores,
                      std::vector<float>* signal, std::vector<float>* noise);
  // Matched-filter outputs of `count` frames starting at buffer index
  // `first`, one row per frame, phase-aligned across frames.
  void FrameAmplitudes(int first, int count, audio_dsp::ComplexMatrix* frames) const;
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
  std::vector<ToneStrengthFilter> tone_strength_filters_;
  std::vector<StreamBuffer> tone_strength_buffers_;
  int tone_strength_buffer_size_ = 0;
  bool initialized_ = false;

  std::vector<float> mono_, resampled_, strengths_;  // scratch

  // Coherent path: per tone the raw block sums (interleaved real,
  // imaginary), kept in step with tone_strength_buffers_.
  std::vector<StreamBuffer> tone_block_buffers_;
  std::vector<std::complex<float>> block_sums_;  // scratch
  std::vector<uint32_t> frame_phase_steps_;      // oscillator turn per frame, 2^-32
  std::vector<float> frame_window_;              // per baseband sample of a frame
  std::unordered_map<uint32_t, int> symbol_of_tones_;  // tone bit set -> symbol
  std::unique_ptr<ToneSequenceSearch> sequence_search_;
  int64_t last_search_end_ = -1;  // stream position of the last gate check

  // Per-column results of the last GetToken, for the columns of the buffers
  // as they were then, starting at stream index columns_begin_.
  audio_dsp::RowMajorFloatMatrix tone_scores_;
  std::vector<float> column_signal_, column_noise_;
  int columns_begin_ = 0;
  audio_dsp::RowMajorFloatMatrix local_;  // scratch
};

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_DTMF_DTMF_DECODER_H_
