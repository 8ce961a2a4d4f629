#include "audio/sorvane/sorvane_decoder.h"

#include <algorithm>
#include <cmath>
#include <numbers>
#include <utility>

#include "audio/dsp/acoustics.h"
#include "audio/dsp/box_filter.h"
#include "audio/dsp/float4.h"
#include "audio/dsp/lowpass_design.h"
#include "audio/dsp/number_util.h"
#include "audio/dsp/resampler.h"
#include "audio/sorvane/compute_buffer_truncation.h"
#include "audio/sorvane/decoding_group.h"
#include "audio/sorvane/sorvane_util.h"
#include "base/logging.h"

namespace audio_sorvane {
namespace {

using audio_dsp::ComplexVector;
using audio_dsp::FloatVector;
using audio_dsp::kSpeedOfSound;

constexpr double kMaxSavedSeconds = 30.0;

}  // namespace

sorvel_base::Validation ValidateSorvaneDecoderParams(const SorvaneDecoderParams& params) {
  SORVEL_REQUIRE(params.symbols_in_token > 0, "symbols_in_token must be positive, got ",
                 params.symbols_in_token);
  SORVEL_REQUIRE(params.max_candidates_to_return > 0, "max_candidates must be in [1, ",
                 params.max_candidates_rank, "], got ", params.max_candidates_to_return);
  SORVEL_REQUIRE(params.max_candidates_to_return <= params.max_candidates_rank,
                 "max_candidates must be in [1, ", params.max_candidates_rank, "], got ",
                 params.max_candidates_to_return);
  SORVEL_REQUIRE(params.max_candidates_rank <= params.max_candidates_to_consider,
                 "max_candidates_rank (", params.max_candidates_rank,
                 ") must not exceed max_candidates_to_consider (",
                 params.max_candidates_to_consider, ")");
  SORVEL_REQUIRE(params.num_chunks > 0, "num_chunks must be positive, got ", params.num_chunks);
  // Both are rounded to sample counts.
  SORVEL_REQUIRE(std::isfinite(params.detection_duration),
                 "detection_duration must be finite, got ", params.detection_duration);
  SORVEL_REQUIRE(std::isfinite(params.buffer_duration), "buffer_duration must be finite, got ",
                 params.buffer_duration);
  return {};
}

SorvaneDecoder::SorvaneDecoder(std::shared_ptr<const SymbolWaveCoder> symbol_wave_coder,
                               const SorvaneDecoderParams& params)
    : params_(params) {
  CHECK(symbol_wave_coder);
  CHECK_VALID(ValidateSorvaneDecoderParams(params));
  coder_ = std::move(symbol_wave_coder);
  const SymbolWaveCoderParams& coder_params = coder_->params();
  frame_size_ = coder_->samples_per_frame() / coder_params.baseband_decimation_factor;
  baseband_rate_ = coder_params.sample_rate /
                   static_cast<float>(coder_params.baseband_decimation_factor);
  max_doppler_ = static_cast<float>(params_.max_speed * coder_->carrier_cycles_per_frame() /
                                    kSpeedOfSound);

  std::vector<float> acquisition_grid;
  FrequencyGrid(params_.acquisition_frequency_step, max_doppler_, &acquisition_grid);
  scorer_ = std::make_unique<AcquisitionScorer>(
      coder_->baseband_code(), acquisition_grid, params_.num_chunks,
      static_cast<int>(std::lround(params_.detection_duration * baseband_rate_)),
      static_cast<float>(params_.noise_smoothing_width));

  // Phase blocks short enough that the largest Doppler turns the phase by at
  // most a sixteenth of a cycle within one.
  phase_block_size_ = std::max(
      1, static_cast<int>(std::ceil(frame_size_ / std::max(16.0 * max_doppler_, 1.0))));
  const int x = static_cast<int>(std::ceil(params_.frame_extension * frame_size_));
  extended_size_ = audio_dsp::RoundUpToMultiple(frame_size_ + 2 * x, phase_block_size_);
  extension_ = (extended_size_ - frame_size_) / 2;
  audio_dsp::PeriodicPad<float>(coder_->baseband_code(), extension_,
                     extended_size_ - frame_size_ - extension_, &extended_code_);
  extended_window_.resize(extended_size_);
  for (int i = 0; i < extended_size_; ++i) {
    extended_window_[i] = static_cast<float>(std::sin(std::numbers::pi * i / extended_size_));
  }
  FrequencyGrid(params_.symbol_frequency_step, max_doppler_, &symbol_frequencies_);
  PhasorMatrix(symbol_frequencies_, extended_size_ / phase_block_size_,
               -2.0 * std::numbers::pi / (frame_size_ / phase_block_size_), &symbol_phasors_);

  if (params_.use_designed_lowpass) {
    smoothing_filter_ = std::make_unique<audio_dsp::ComplexFirFilter>(audio_dsp::DesignLowpassTaps(
        params_.lowpass_num_taps, params_.lowpass_cutoff,
        static_cast<float>(coder_params.upsampling_factor /
                           coder_params.baseband_decimation_factor)));
  } else {
    smoothing_filter_ = std::make_unique<audio_dsp::ComplexFirFilter>(
        std::vector<std::complex<float>>{{0.25f, 0.0f}, {0.5f, 0.0f}, {0.25f, 0.0f}});
  }

  if (params_.multipath_span > 0.0f) {
    MultipathScorerParams multipath;
    multipath.lead = static_cast<int>(std::lround(params_.multipath_lead * baseband_rate_));
    multipath.span = static_cast<int>(std::lround(params_.multipath_span * baseband_rate_));
    multipath.channel_frames = params_.channel_frames;
    multipath.gate = params_.channel_gate;
    multipath.max_doppler = max_doppler_;
    multipath.doppler_step = params_.symbol_frequency_step;
    multipath_ = std::make_unique<MultipathScorer>(*coder_, multipath);
  }

  TokenSelectorParams selector;
  selector.alphabet_size = coder_->alphabet_size();
  selector.spacer = coder_->alphabet_size() - 1;
  selector.symbols_in_token = params_.symbols_in_token;
  selector.append_check_symbol = params_.append_check_symbol;
  selector.max_candidates_to_consider = params_.max_candidates_to_consider;
  selector.max_candidates_rank = params_.max_candidates_rank;
  selector.max_candidates_to_return = params_.max_candidates_to_return;
  token_selector_ = std::make_unique<TokenSelector>(selector);
  converter_ = std::make_unique<TokenSymbolConverter>(coder_params.bits_per_symbol);
}

void SorvaneDecoder::Initialize(int num_channels, float sample_rate) {
  CHECK(num_channels > 0);
  num_channels_ = num_channels;
  sample_rate_ = sample_rate;
  const float coder_rate = coder_->params().sample_rate;
  max_buffer_size_ = static_cast<int>(std::lround(params_.buffer_duration * sample_rate));
  // Frame duration times frames times rate, in this order: GetMaxSafeInputSize
  // reports the rounded result.
  const int frames_per_token =
      FramesPerToken(params_.symbols_in_token, params_.append_check_symbol);
  max_good_block_size_ = static_cast<int>(std::lround(
      coder_->samples_per_frame() / coder_rate * frames_per_token * sample_rate));
  input_per_baseband_ = static_cast<double>(sample_rate) / baseband_rate_;
  const double carrier = static_cast<double>(coder_rate) * coder_->carrier_cycles_per_frame() /
                         coder_->samples_per_frame();
  const double omega = -2.0 * std::numbers::pi * carrier / sample_rate;
  rotation_ = {std::cos(omega), std::sin(omega)};
  for (int k = 0; k < kMixLanes; ++k) {
    mix_rotations_[k] = {std::cos(omega * k), std::sin(omega * k)};
  }
  mix_step_ = {std::cos(omega * kMixLanes), std::sin(omega * kMixLanes)};
  oscillator_ = {1.0, 0.0};
  baseband_resampler_ = std::make_unique<audio_dsp::RationalFactorResampler<std::complex<float>>>(
      audio_dsp::DefaultResamplingKernel(sample_rate, baseband_rate_),
      audio_dsp::kDefaultMaxDenominator);
  CHECK(baseband_resampler_->Valid()) << "Failed to initialize RationalFactorResampler.";

  smoothing_filter_->Reset();
  scorer_->Reset();
  baseband_real_.Clear();
  baseband_imaginary_.Clear();
  acquisition_scores_.Clear();
  received_samples_.Clear();
  num_scored_ = 0;
  samples_processed_ = 0;
  symbol_score_cache_.clear();
  if (multipath_ != nullptr) {
    multipath_->Reset();
    // The frames a full buffer holds, and the neighbours around them.
    const int baseband_frames = static_cast<int>(
        std::ceil(max_buffer_size_ / input_per_baseband_ / frame_size_));
    multipath_->ReserveFrames(baseband_frames + 2 * params_.channel_frames + 4);
  }
  // The most a full buffer holds (one frame of rounding either side), so
  // that streaming never grows the buffers.
  const int max_baseband =
      static_cast<int>(std::ceil(max_buffer_size_ / input_per_baseband_)) + 2 * frame_size_;
  for (StreamBuffer* buffer : {&baseband_real_, &baseband_imaginary_, &acquisition_scores_}) {
    buffer->Reserve(max_baseband);
  }
  initialized_ = true;
}

void SorvaneDecoder::SetStreamOrigin(int64_t baseband_index) {
  CHECK(initialized_);
  CHECK(baseband_real_.size() == 0);
  baseband_real_.Clear(baseband_index);
  baseband_imaginary_.Clear(baseband_index);
  acquisition_scores_.Clear(baseband_index);
  scorer_->Reset(baseband_index);
}

void SorvaneDecoder::ResetStream() {
  received_samples_.Zero();
  baseband_real_.Zero();
  baseband_imaginary_.Zero();
  acquisition_scores_.Zero();
  smoothing_filter_->Reset();
  scorer_->ZeroHistory();
  symbol_score_cache_.clear();
  if (multipath_ != nullptr) multipath_->Reset();
}

void SorvaneDecoder::WipeInternalData() {
  if (!initialized_) return;
  ResetStream();
  Initialize(num_channels_, sample_rate_);
}

int SorvaneDecoder::GetMaxSafeInputSize() const {
  if (!initialized_) return 0;
  return MaxSafeInputSize(max_buffer_size_, max_good_block_size_, num_channels_);
}

void SorvaneDecoder::ProcessSamples(std::span<const float> received_samples) {
  if (!initialized_) {
    LOG(ERROR) << "ProcessSamples() called before call to Initialize().";
    return;
  }
  const BlockTruncation truncation = ComputeBlockTruncation(
      static_cast<int>(received_samples.size()), num_channels_, input_per_baseband_,
      acquisition_scores_.size(), frame_size_, max_good_block_size_, max_buffer_size_);
  const int skip = truncation.skip_samples;
  if (skip >= 1) {
    ResetStream();
    Initialize(num_channels_, sample_rate_);
    received_samples = received_samples.subspan(
        std::min<size_t>(static_cast<size_t>(skip), received_samples.size()));
  } else if (truncation.drop_baseband >= 1) {
    const int d = truncation.drop_baseband;
    num_scored_ -= d;
    baseband_real_.Discard(d);
    baseband_imaginary_.Discard(d);
    acquisition_scores_.Discard(d);
    const int64_t first_kept = extension_ + baseband_real_.num_discarded_samples();
    symbol_score_cache_.erase(symbol_score_cache_.begin(),
                              symbol_score_cache_.lower_bound(first_kept));
  }

  if (num_channels_ == 1) {
    ProcessMono(received_samples);
  } else {
    CHECK(received_samples.size() % num_channels_ == 0);
    mono_.assign(received_samples.size() / num_channels_, 0.0f);
    for (size_t i = 0; i < mono_.size(); ++i) {
      for (int c = 0; c < num_channels_; ++c) mono_[i] += received_samples[i * num_channels_ + c];
    }
    ProcessMono(mono_);
  }

  scorer_->ScoreSamples(baseband_real_.View(num_scored_), baseband_imaginary_.View(num_scored_),
                        &new_scores_);
  acquisition_scores_.Append(new_scores_);
  num_scored_ = baseband_real_.size();
}

void SorvaneDecoder::ProcessMono(std::span<const float> samples) {
  if (params_.save_received_samples) {
    const int cap = static_cast<int>(std::lround(kMaxSavedSeconds * sample_rate_));
    const int excess = received_samples_.size() + static_cast<int>(samples.size()) - cap;
    if (excess > 0) received_samples_.Discard(std::min(excess, received_samples_.size()));
    received_samples_.Append(samples);
  }
  mixed_.resize(samples.size());
  // Eight phasors per step from one oscillator value, so that the products
  // do not wait on each other as a running oscillator would.
  const auto multiply = [](std::complex<double> a, std::complex<double> b) {
    return std::complex<double>(a.real() * b.real() - a.imag() * b.imag(),
                                a.real() * b.imag() + a.imag() * b.real());
  };
  std::complex<double> oscillator = oscillator_;
  size_t i = 0;
  for (; i + kMixLanes <= samples.size(); i += kMixLanes) {
    for (int k = 0; k < kMixLanes; ++k) {
      const std::complex<double> phasor = multiply(oscillator, mix_rotations_[k]);
      const double x = samples[i + k];
      mixed_[i + k] = {static_cast<float>(x * phasor.real()),
                       static_cast<float>(x * phasor.imag())};
    }
    oscillator = multiply(oscillator, mix_step_);
  }
  for (; i < samples.size(); ++i) {
    const double x = samples[i];
    mixed_[i] = {static_cast<float>(x * oscillator.real()),
                 static_cast<float>(x * oscillator.imag())};
    oscillator = multiply(oscillator, rotation_);
  }
  // Renormalise once per block so rounding cannot make the amplitude drift.
  oscillator_ = oscillator / std::abs(oscillator);

  baseband_resampler_->ProcessSamples(mixed_, &resampled_);
  smoothing_filter_->Filter(resampled_, &filtered_);
  parts_.resize(filtered_.size());
  for (size_t i = 0; i < filtered_.size(); ++i) parts_[i] = filtered_[i].real();
  baseband_real_.Append(parts_);
  for (size_t i = 0; i < filtered_.size(); ++i) parts_[i] = filtered_[i].imag();
  baseband_imaginary_.Append(parts_);
  samples_processed_ += static_cast<int64_t>(samples.size());
}

bool SorvaneDecoder::DetectBroadcaster() {
  if (!initialized_) {
    LOG(ERROR) << "DetectBroadcaster() called before call to Initialize().";
    return false;
  }
  return scorer_->DetectionScore(/*normalize=*/true) >= params_.detection_threshold;
}

bool SorvaneDecoder::GetToken(DecodeResults* decode_results) {
  if (!initialized_) {
    LOG(ERROR) << "GetToken() called before call to Initialize().";
    return false;
  }
  CHECK(decode_results);
  decode_results->ClearDiagnostics();

  // Acquisition scores summed over neighbouring symbol periods, handed out
  // one period (column) at a time; values below the threshold count as 0.
  // One peak per run of positive values (runs continue across columns),
  // then peaks on a common grid form groups.
  const float threshold =
      params_.peak_threshold * params_.box_width * params_.num_symbol_periods_to_sum;
  peaks_.clear();
  bool in_run = false;
  Peak run_peak{};
  audio_dsp::BoxFilter2DByColumn(
      acquisition_scores_.View(0), frame_size_, params_.box_width,
      params_.num_symbol_periods_to_sum, /*allow_ragged=*/true, &box_workspace_,
      [&](int column, const float* values) {
        const int first = column * frame_size_;
        // A value counts when it reaches the threshold and is positive;
        // outside a run, blocks of eight where none counts are skipped
        // whole (most of the buffer, between broadcasts).
        const audio_dsp::Float4 floor = audio_dsp::Splat4(threshold);
        const audio_dsp::Float4 zero = {};
        const auto none_count = [&](const float* x) {
          const audio_dsp::Float4 a = audio_dsp::Load4(x), b = audio_dsp::Load4(x + 4);
          const auto counts = ((a >= floor) & (a > zero)) | ((b >= floor) & (b > zero));
          return (counts[0] | counts[1] | counts[2] | counts[3]) == 0;
        };
        for (int r = 0; r < frame_size_; ++r) {
          if (!in_run) {
            while (r + 8 <= frame_size_ && none_count(values + r)) r += 8;
            if (r == frame_size_) break;
          }
          const float v = values[r] < threshold ? 0.0f : values[r];
          if (v > 0.0f) {
            if (!in_run || v > run_peak.score) run_peak = {first + r, v};
            in_run = true;
          } else if (in_run) {
            peaks_.push_back(run_peak);
            in_run = false;
          }
        }
      });
  if (in_run) peaks_.push_back(run_peak);
  int num_groups = 0;
  for (const Peak& peak : peaks_) {
    bool added = false;
    for (int g = 0; g < num_groups && !added; ++g) added = groups_[g].TryAdd(peak.time, peak.score);
    if (added) continue;
    if (num_groups == static_cast<int>(groups_.size())) {
      groups_.emplace_back(peak.time, frame_size_, params_.max_gap, peak.score,
                           params_.max_phase_error);
    } else {
      groups_[num_groups].Restart(peak.time, peak.score);
    }
    // Room for every peak, so the group's times never grow while adding
    // (a few hundred covers a buffer of tokens; more only when noise is
    // dense with peaks).
    groups_[num_groups++].Reserve(std::max<size_t>(256, peaks_.size()));
  }
  const std::span<const DecodingGroup> groups(groups_.data(), num_groups);

  // Prefer groups that saw every slot of the token period.
  const int period = token_selector_->symbol_period();
  const DecodingGroup* chosen = nullptr;
  for (bool need_all_slots : {true, false}) {
    for (const DecodingGroup& group : groups) {
      if (group.score() <= 0.0f) continue;
      if (need_all_slots && !group.CoversAllSlots(period)) continue;
      if (chosen == nullptr || group.score() > chosen->score()) chosen = &group;
    }
    if (chosen != nullptr) break;
  }
  if (chosen == nullptr) {
    // No candidates and an all-zero table; storage kept for later requests.
    token_selector_->ReleaseCandidates(&decode_results->tokens);
    decode_results->scores_table.setZero();
    return false;
  }

  const int64_t discarded = baseband_real_.num_discarded_samples();
  const auto seconds = [&](int t) {
    return static_cast<float>(static_cast<double>(discarded + t) / baseband_rate_);
  };
  for (int t : chosen->times()) {
    decode_results->detection_times.push_back(seconds(t));
    decode_results->detection_scores.push_back(PeakScore(t));
  }
  if (multipath_ != nullptr) {
    ScoreGroupOverMultipath(*chosen, &decode_results->symbol_scores);
  } else {
    for (int t : chosen->times()) {
      if (!ComputeSymbolScores(RefinePeak(t), &scores_)) continue;
      const int slot = chosen->SlotOf(t);
      auto [it, inserted] = decode_results->symbol_scores.try_emplace(slot, scores_);
      if (!inserted) it->second += scores_;
    }
  }

  token_selector_->SelectTokens(decode_results->symbol_scores, &decode_results->scores_table,
                                &decode_results->tokens);
  for (DecodedToken& token : decode_results->tokens) {
    converter_->SymbolsToToken(token.symbols, &token.bytes);
    token.position = chosen->IndexOfSlot(token.position);
  }
  return !decode_results->tokens.empty();
}

float SorvaneDecoder::PeakScore(int t) const {
  const auto it = std::lower_bound(peaks_.begin(), peaks_.end(), t,
                                   [](const Peak& peak, int time) { return peak.time < time; });
  CHECK(it != peaks_.end() && it->time == t);
  return it->score;
}

void SorvaneDecoder::ScoreGroupOverMultipath(const DecodingGroup& group,
                                             SymbolScoreMap* symbol_scores) {
  // One frame per slot: the detection with the highest summed score (the
  // others are the same frame seen through other paths).
  const int64_t discarded = baseband_real_.num_discarded_samples();
  const BasebandView view{baseband_real_.View(0), baseband_imaginary_.View(0), discarded};
  std::vector<SlotFrame>& frames = slot_frames_;
  frames.clear();
  const SlotFrame* reference = nullptr;
  const std::vector<int>& times = group.times();
  for (size_t i = 0; i < times.size();) {
    const int slot = group.SlotOf(times[i]);
    size_t best = i;
    float best_score = PeakScore(times[i]);
    for (; i < times.size() && group.SlotOf(times[i]) == slot; ++i) {
      const float score = PeakScore(times[i]);
      if (score > best_score) {
        best = i;
        best_score = score;
      }
    }
    frames.push_back({slot, discarded + RefinePeak(times[best]), best_score});
  }
  for (const SlotFrame& frame : frames) {
    if (!multipath_->HasWindow(view, frame.start)) continue;
    if (reference == nullptr || frame.score > reference->score) reference = &frame;
  }
  if (reference == nullptr) return;
  // The group continues the current track when it continues the
  // transmission the track was found on (it begins within max_gap of where
  // that one was last seen) and its strongest frame lies on the track's
  // grid; otherwise it starts a new track with its own Doppler search. A
  // track found on a noise peak must not lend its Doppler to a broadcast
  // that happens to fall on its grid. Nor does a track keep a Doppler
  // searched on a frame much weaker than the group now offers: a request
  // made while a broadcast is still arriving sees only its first frames,
  // whose summed scores are partial, and a search on them can land anywhere.
  const int64_t tolerance = std::lround(params_.max_phase_error * frame_size_);
  const int64_t first = discarded + times.front();
  if (!multipath_->has_track() || reference->score > kResearchGain * track_reference_score_ ||
      first > track_last_seen_ + params_.max_gap ||
      std::abs(reference->start -
               multipath_->FrameStart(multipath_->NearestFrame(reference->start))) > tolerance) {
    multipath_->StartTrack(reference->start,
                           multipath_->SearchDoppler(view, reference->start));
    track_reference_score_ = reference->score;
  }
  track_last_seen_ = discarded + times.back();
  for (const SlotFrame& frame : frames) {
    if (multipath_->Score(view, multipath_->NearestFrame(frame.start), &scores_)) {
      symbol_scores->try_emplace(frame.slot, scores_);
    }
  }
  // Frames that start before the buffer will not be asked for again.
  multipath_->ForgetBefore(multipath_->NearestFrame(discarded) - params_.channel_frames);
}

int SorvaneDecoder::RefinePeak(int t) const {
  // Summing scores across symbol periods smears the peaks of a moving
  // sender: the code drifts by up to max_speed / c of a frame per period,
  // so the summed peak may sit several samples off the frame it stands for,
  // and despreading fails beyond about half a chip. Re-centre on the raw
  // scores of this period and its two neighbours, within the drift that
  // the summed periods can account for.
  const double drift = params_.max_speed / kSpeedOfSound * frame_size_;
  const int radius =
      static_cast<int>(std::ceil(drift * params_.num_symbol_periods_to_sum / 2.0));
  if (radius < 1) return t;
  const std::span<const float> raw = acquisition_scores_.View(0);
  const int size = static_cast<int>(raw.size());
  const auto local_sum = [&](int s) {
    float sum = 0.0f;
    for (int k = -1; k <= 1; ++k) {
      const int i = s + k * frame_size_;
      if (i >= 0 && i < size) sum += raw[i];
    }
    return sum;
  };
  int best = t;
  float best_sum = local_sum(t);
  for (int s = std::max(0, t - radius); s <= std::min(size - 1, t + radius); ++s) {
    const float sum = local_sum(s);
    if (sum > best_sum) {
      best = s;
      best_sum = sum;
    }
  }
  return best;
}

bool SorvaneDecoder::ComputeSymbolScores(int t, FloatVector* symbol_scores) {
  const int start = t - extension_;
  if (start < 0 || start + extended_size_ > baseband_real_.size()) return false;
  const int64_t absolute = baseband_real_.num_discarded_samples() + t;
  if (auto cached = symbol_score_cache_.find(absolute); cached != symbol_score_cache_.end()) {
    *symbol_scores = cached->second;
    return true;
  }
  CHECK(symbol_scores);
  const int extended_size = extended_size_;
  const std::span<const float> baseband_real_extended_frame =
      baseband_real_.View(start).first(extended_size);
  const std::span<const float> baseband_imaginary_extended_frame =
      baseband_imaginary_.View(start).first(extended_size);
  CHECK_EQ(baseband_real_extended_frame.size(), extended_size);
  CHECK_EQ(baseband_imaginary_extended_frame.size(), extended_size);

  // Despread, then find the Doppler offset from windowed phase blocks.
  std::vector<std::complex<float>> z(extended_size);
  for (int i = 0; i < extended_size; ++i) {
    z[i] = std::complex<float>(baseband_real_extended_frame[i],
                               baseband_imaginary_extended_frame[i]) *
           extended_code_[i];
  }
  const int num_blocks = extended_size / phase_block_size_;
  ComplexVector blocks = ComplexVector::Zero(num_blocks);
  for (int i = 0; i < num_blocks * phase_block_size_; ++i) {
    blocks[i / phase_block_size_] += z[i] * extended_window_[i];
  }
  blocks /= static_cast<float>(phase_block_size_);
  const float f = symbol_frequencies_[MaxFilterResponse(symbol_phasors_, blocks).index];

  // Remove the Doppler rotation and the carrier phase from the symbol frame.
  const int frame = frame_size_;
  std::vector<std::complex<float>> corrected(frame);
  std::complex<double> sum;
  const double step = -2.0 * std::numbers::pi * f / frame;
  const std::complex<double> rotation(std::cos(step), std::sin(step));
  std::complex<double> phasor(1.0, 0.0);
  for (int k = 0; k < frame; ++k) {
    corrected[k] = z[extension_ + k] * std::complex<float>(phasor);
    sum += std::complex<double>(corrected[k]);
    phasor *= rotation;
  }
  double phi = std::atan2(sum.imag(), sum.real());
  if (coder_->params().use_quadrature) phi += std::numbers::pi / 2;
  const std::complex<float> derotate(static_cast<float>(std::cos(-phi)),
                                     static_cast<float>(std::sin(-phi)));
  FloatVector real_part(frame);
  for (int k = 0; k < frame; ++k) real_part[k] = (corrected[k] * derotate).real();
  *symbol_scores = coder_->baseband_tones() * real_part;
  symbol_score_cache_.emplace(absolute, *symbol_scores);
  return true;
}

}  // namespace audio_sorvane
