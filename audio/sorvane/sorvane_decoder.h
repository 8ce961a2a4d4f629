// The DSSS receiver.
//
// Audio is mixed down from the carrier, resampled to the baseband rate
// R = sample_rate / baseband_decimation_factor of the coder, smoothed, and
// kept (a few seconds) in two stream buffers. The acquisition scorer runs
// over every new baseband sample. GetToken box-filters the acquisition
// scores across symbol periods, groups the peaks that sit on one symbol
// grid (one transmission), scores every symbol frame of the best group
// against the coder's tones, folds the scores by token period and lets the
// token selector rank candidates. Symbol frames are scored over the room's
// multipath by default (MultipathScorer: channel estimated over tens of
// milliseconds of lags, Doppler searched once per transmission); with
// multipath_span 0 each detection is scored at its own lag with its own
// Doppler and phase correction. Input beyond the buffer budget is truncated
// with a warning.
//
// Not thread safe: one caller thread per decoder. Calls before Initialize
// are logged errors that do nothing.
#ifndef AUDIO_SORVANE_SORVANE_DECODER_H_
#define AUDIO_SORVANE_SORVANE_DECODER_H_

#include <complex>
#include <map>
#include <memory>
#include <span>
#include <vector>

#include "audio/dsp/box_filter.h"
#include "audio/dsp/eigen_types.h"
#include "audio/dsp/rational_factor_resampler.h"
#include "audio/dsp/signal_vector_util.h"
#include "audio/sorvane/acquisition_scorer.h"
#include "audio/sorvane/decode_results.h"
#include "audio/sorvane/decoding_group.h"
#include "audio/sorvane/multipath_scorer.h"
#include "audio/sorvane/stream_buffer.h"
#include "audio/sorvane/symbol_wave_coder.h"
#include "audio/sorvane/token_selector.h"
#include "audio/sorvane/token_symbol_converter.h"
#include "base/validation.h"

namespace audio_sorvane {

struct SorvaneDecoderParams {
  float max_speed = 1.0f;               // m/s between sender and receiver
  bool save_received_samples = false;   // keep the last 30 s of raw input
  bool use_designed_lowpass = false;    // else taps {0.25, 0.5, 0.25}
  int lowpass_num_taps = 11;
  float lowpass_cutoff = 0.01f;
  int num_chunks = 16;                  // acquisition chunks per frame
  float buffer_duration = 3.0f;         // seconds of input held at most
  float acquisition_frequency_step = 0.3f;  // cycles per frame
  int noise_smoothing_width = 750;      // frames
  int box_width = 1;                    // score box filter along samples
  int num_symbol_periods_to_sum = 9;    // ... and across symbol periods
  float peak_threshold = 5.0f;          // per summed score
  int symbols_in_token = 16;
  bool append_check_symbol = false;
  float max_phase_error = 0.1f;         // fraction of a symbol
  int max_gap = 2000;                   // baseband samples
  float frame_extension = 0.45f;        // fraction of a symbol on each side
  float symbol_frequency_step = 0.15f;  // cycles per frame
  float detection_threshold = 4.0f;     // on the normalised detection score
  float detection_duration = 0.175f;    // seconds
  // Multipath: a frame's symbols are scored over the lags from
  // multipath_lead before to multipath_span after its start (seconds),
  // combined by a channel estimate averaged over the frame and
  // channel_frames neighbours on each side. multipath_span 0 scores each
  // detection at its own lag alone.
  float multipath_lead = 0.010f;
  float multipath_span = 0.020f;
  int channel_frames = 4;
  float channel_gate = 10.0f;
  int max_candidates_to_consider = 128;  // passed to the token selector
  int max_candidates_rank = 6;
  int max_candidates_to_return = 2;
};

// Refuses a record the decoder cannot be built from (the constructor ends
// the process on it).
sorvel_base::Validation ValidateSorvaneDecoderParams(const SorvaneDecoderParams& params);

class SorvaneDecoder {
 public:
  SorvaneDecoder(std::shared_ptr<const SymbolWaveCoder> symbol_wave_coder,
                 const SorvaneDecoderParams& params);

  // Sets up for `num_channels` interleaved channels at `sample_rate` Hz and
  // drops everything buffered.
  void Initialize(int num_channels, float sample_rate);
  // Appends received samples (channels interleaved, any scale).
  void ProcessSamples(std::span<const float> received_samples);
  // True while the detection score says a broadcaster is on the air.
  bool DetectBroadcaster();
  // Fills `decode_results`; true if at least one candidate was produced.
  bool GetToken(DecodeResults* decode_results);
  // Drops all buffered audio and state (same channels and rate).
  void WipeInternalData();
  // Numbers the next baseband sample `baseband_index` instead of 0, as if
  // that much audio had streamed by. Only right after Initialize; for checks
  // of listening that runs for days.
  void SetStreamOrigin(int64_t baseband_index);
  // The largest block (samples, channels interleaved) one call can take
  // without cutting into a token held in the buffer; 0 before Initialize.
  int GetMaxSafeInputSize() const;

  const SymbolWaveCoder& symbol_wave_coder() const { return *coder_; }
  // Bytes the data symbols of one token carry: bits_per_symbol *
  // symbols_in_token / 8.
  int token_length_bytes() const {
    return coder_->params().bits_per_symbol * params_.symbols_in_token / 8;
  }
  const SorvaneDecoderParams& params() const { return params_; }
  bool initialized() const { return initialized_; }
  // Buffer occupancy, for bounds checks and diagnostics.
  int baseband_buffer_size() const { return baseband_real_.size(); }
  int score_buffer_size() const { return acquisition_scores_.size(); }
  int symbol_score_cache_size() const { return static_cast<int>(symbol_score_cache_.size()); }
  int max_buffer_size() const { return max_buffer_size_; }
  const AcquisitionScorer& acquisition_scorer() const { return *scorer_; }

 private:
  friend class SorvaneDecoderTestPeer;  // drives the private steps in tests

  void ResetStream();
  // The frame start near group time t that the raw scores point at.
  int RefinePeak(int t) const;
  void ProcessMono(std::span<const float> samples);
  // Scores of every symbol for the frame starting at buffer index t; false
  // when the extended frame is not fully in the buffer.
  bool ComputeSymbolScores(int t, audio_dsp::FloatVector* symbol_scores);
  // Symbol scores of the chosen group's frames, one per slot, gathered
  // over the multipath.
  void ScoreGroupOverMultipath(const DecodingGroup& group, SymbolScoreMap* symbol_scores);
  // The summed acquisition score of the peak at buffer index t.
  float PeakScore(int t) const;

  std::shared_ptr<const SymbolWaveCoder> coder_;
  SorvaneDecoderParams params_;
  int frame_size_;            // F, baseband samples per symbol
  float baseband_rate_;       // R
  float max_doppler_;         // cycles per frame
  std::unique_ptr<AcquisitionScorer> scorer_;
  int phase_block_size_;
  int extended_size_;
  int extension_;
  std::vector<float> extended_code_;
  std::vector<float> extended_window_;
  std::vector<float> symbol_frequencies_;
  audio_dsp::ComplexMatrix symbol_phasors_;
  std::unique_ptr<audio_dsp::ComplexFirFilter> smoothing_filter_;
  std::unique_ptr<TokenSelector> token_selector_;
  std::unique_ptr<TokenSymbolConverter> converter_;

  int num_channels_ = 1;
  float sample_rate_ = 0.0f;
  int max_buffer_size_ = 0;
  int max_good_block_size_ = 0;
  double input_per_baseband_ = 1.0;
  std::complex<double> rotation_{1.0, 0.0};
  static constexpr int kMixLanes = 8;
  std::complex<double> mix_rotations_[kMixLanes];  // rotation_^k
  std::complex<double> mix_step_{1.0, 0.0};         // rotation_^kMixLanes
  std::complex<double> oscillator_{1.0, 0.0};
  std::unique_ptr<audio_dsp::RationalFactorResampler<std::complex<float>>> baseband_resampler_;
  bool initialized_ = false;

  StreamBuffer baseband_real_;
  StreamBuffer baseband_imaginary_;
  StreamBuffer acquisition_scores_;
  int num_scored_ = 0;
  StreamBuffer received_samples_;
  int64_t samples_processed_ = 0;
  std::map<int64_t, audio_dsp::FloatVector> symbol_score_cache_;
  std::unique_ptr<MultipathScorer> multipath_;
  int64_t track_last_seen_ = 0;  // the last detection of the track's transmission
  float track_reference_score_ = 0.0f;  // of the frame its Doppler was searched on
  // A group whose strongest frame beats the track's by this factor searches
  // the Doppler again.
  static constexpr float kResearchGain = 1.25f;

  // Scratch, kept to avoid allocation per block.
  std::vector<float> mono_;
  std::vector<std::complex<float>> mixed_;
  std::vector<std::complex<float>> resampled_;
  std::vector<std::complex<float>> filtered_;
  std::vector<float> parts_;
  std::vector<float> new_scores_;
  // Per-request scratch, so that requests allocate nothing once warm.
  struct Peak {
    int time;     // buffer index
    float score;  // summed acquisition score
  };
  struct SlotFrame {
    int slot;
    int64_t start;  // absolute
    float score;
  };
  audio_dsp::BoxFilter2DWorkspace box_workspace_;
  std::vector<Peak> peaks_;            // ascending time
  std::vector<DecodingGroup> groups_;  // the first few are this request's
  std::vector<SlotFrame> slot_frames_;
  audio_dsp::FloatVector scores_;
};

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_SORVANE_DECODER_H_
