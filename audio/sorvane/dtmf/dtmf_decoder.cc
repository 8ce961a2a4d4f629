#include "audio/sorvane/dtmf/dtmf_decoder.h"

#include <algorithm>
#include <cmath>
#include <complex>
#include <numbers>

#include "audio/dsp/gamma_filter.h"
#include "audio/dsp/max_filter.h"
#include "audio/dsp/number_util.h"
#include "audio/dsp/resampler.h"
#include "audio/sorvane/compute_buffer_truncation.h"
#include "base/logging.h"

namespace audio_sorvane {
namespace {

constexpr double kSpeedOfSound = 340.0;  // m/s

TokenSelectorParams SelectorParams(const DtmfDecoderParams& params, int symbols_in_token) {
  TokenSelectorParams selector;
  selector.alphabet_size = static_cast<int>(params.symbol_table.size());
  selector.spacer = params.spacer_symbol;
  selector.symbols_in_token = symbols_in_token;
  selector.append_check_symbol = params.use_checksum_symbol;
  selector.max_candidates_rank = params.max_candidates_rank;
  selector.max_candidates_to_return = params.max_candidates_per_decode_token_call;
  selector.token_threshold_factor = params.token_threshold_factor;
  return selector;
}

}  // namespace

DtmfDecoder::DtmfDecoder(const DtmfDecoderParams& params)
    : params_(params),
      converter_(static_cast<int>(params.symbol_table.size()), params.spacer_symbol,
                 params.bytes_in_token),
      token_selector_(std::make_unique<TokenSelector>(
          SelectorParams(params, converter_.symbols_in_token()))) {
  CheckDtmfEncoderParams(params);
  CHECK(params.max_meters_per_second >= 0.0);
  CHECK(params.max_buffer_duration_in_seconds > 0.0);
  CHECK(params.tone_normalization_params.window_size >= 0.0);
  CHECK(params.tone_normalization_params.cross_frequency_weight >= 0.0);
  CHECK(params.tone_normalization_params.division_floor >= 0.0);
  CHECK(params.noise_estimate_filter_order > 0);
  CHECK(params.noise_estimate_filter_stddev > 0.0);
  CHECK(params.acquisition_threshold >= 0.0);
  CHECK(params.max_candidates_rank > 0);
  CHECK(params.max_candidates_per_decode_token_call > 0);
  CHECK(params.token_threshold_factor >= 0);
  CHECK(params.room_search.settle_frames >= 0);
  CHECK(params.room_search.max_frames > 0);
  CHECK(params.room_search.timing_candidates > 0);
  CHECK(params.room_search.timings_searched > 0);
  CHECK(params.room_search.max_tokens > 0);

  num_frequencies_ = static_cast<int>(params_.tone_frequencies.size());
  frame_size_ = FrameSize(params_);
  baseband_frame_size_ = frame_size_ / params_.baseband_decimation_factor;
  frame_duration_ = static_cast<float>(frame_size_) / params_.sample_rate;
  baseband_sample_rate_ =
      params_.sample_rate / static_cast<float>(params_.baseband_decimation_factor);

  // Tone filter bandwidth: the largest Doppler shift plus the bandwidth of
  // one symbol frame.
  const float highest = *std::max_element(params_.tone_frequencies.begin(),
                                          params_.tone_frequencies.end());
  const double cutoff = static_cast<double>(highest * params_.max_meters_per_second) /
                            kSpeedOfSound +
                        0.594 / frame_duration_;
  for (float tone : params_.tone_frequencies) {
    tone_strength_filters_.emplace_back(params_.baseband_decimation_factor,
                                        params_.sample_rate, tone, cutoff);
  }
  tone_strength_buffers_.resize(num_frequencies_);

  // The coherent path, when the token layout fits the search's limits.
  const RoomSearchParams& room = params_.room_search;
  ToneSequenceSearchParams search;
  search.num_tones = num_frequencies_;
  search.period = converter_.symbols_in_token() + (params_.use_checksum_symbol ? 1 : 0) + 1;
  search.tones_per_symbol = params_.tones_per_symbol;
  search.num_taps = room.num_taps;
  search.masks_per_tone = room.masks_per_tone;
  if (room.enabled && ToneSequenceSearch::Supported(search)) {
    sequence_search_ = std::make_unique<ToneSequenceSearch>(search);
    tone_block_buffers_.resize(num_frequencies_);
    for (const ToneStrengthFilter& filter : tone_strength_filters_) {
      frame_phase_steps_.push_back(static_cast<uint32_t>(params_.baseband_decimation_factor) *
                                   filter.phase_increment());
    }
    frame_window_.resize(baseband_frame_size_);
    for (int m = 0; m < baseband_frame_size_; ++m) {
      frame_window_[m] = static_cast<float>(
          std::sin(std::numbers::pi * (m + 0.5) / baseband_frame_size_));
    }
    for (size_t s = 0; s < params_.symbol_table.size(); ++s) {
      uint32_t bits = 0;
      for (int tone : params_.symbol_table[s]) bits |= 1u << tone;
      symbol_of_tones_[bits] = static_cast<int>(s);
    }
  }
}

void DtmfDecoder::Init(int num_channels, float received_sample_rate) {
  CHECK(received_sample_rate > 0.0);
  CHECK(num_channels >= 1);
  received_sample_rate_ = received_sample_rate;
  num_channels_ = num_channels;
  received_per_baseband_ = received_sample_rate_ / baseband_sample_rate_;
  const int frames = converter_.symbols_in_token() + (params_.use_checksum_symbol ? 1 : 0) + 1;
  max_good_block_size_ =
      static_cast<int>(std::lround(frame_duration_ * received_sample_rate_ * frames));
  max_buffer_size_ = static_cast<int>(
      std::lround(params_.max_buffer_duration_in_seconds * received_sample_rate_));
  if (received_sample_rate_ == params_.sample_rate) {
    received_resampler_.reset();
  } else {
    received_resampler_ = std::make_unique<audio_dsp::RationalFactorResampler<float>>(
        audio_dsp::DefaultResamplingKernel(received_sample_rate_, params_.sample_rate), 2000);
    CHECK(received_resampler_->Valid()) << "Failed to initialize RationalFactorResampler.";
  }
  tone_strength_buffer_size_ = 0;
  for (ToneStrengthFilter& filter : tone_strength_filters_) filter.Reset();
  for (StreamBuffer& buffer : tone_strength_buffers_) buffer.Clear();
  for (StreamBuffer& buffer : tone_block_buffers_) buffer.Clear();
  last_search_end_ = -1;
  tone_scores_.resize(0, 0);
  column_signal_.clear();
  column_noise_.clear();
  columns_begin_ = 0;
  initialized_ = true;
}

void DtmfDecoder::Reset() {
  for (StreamBuffer& buffer : tone_strength_buffers_) buffer.Clear();
  Init(num_channels_, received_sample_rate_);
}

int DtmfDecoder::GetMaxSafeInputSize() const {
  if (!initialized_) return 0;
  return MaxSafeInputSize(max_buffer_size_, max_good_block_size_, num_channels_);
}

void DtmfDecoder::ProcessSamples(std::span<const float> received_samples) {
  if (!initialized_) {
    LOG(ERROR) << "ProcessSamples() called before call to Init().";
    return;
  }
  if (received_samples.empty()) return;
  const int frames = static_cast<int>(received_samples.size()) / num_channels_;
  const int buffered = static_cast<int>(
      std::ceil(received_per_baseband_ * (tone_strength_buffer_size_ + 1)));
  const BufferTruncation truncation =
      ComputeBufferTruncation(frames, buffered, max_good_block_size_, max_buffer_size_);
  const int skip_samples = truncation.skip * num_channels_;
  const int drop_baseband =
      static_cast<int>(std::ceil(truncation.drop / received_per_baseband_));
  if (skip_samples >= 1) {
    Init(num_channels_, received_sample_rate_);
    ProcessSamples(received_samples.subspan(
        std::min<size_t>(static_cast<size_t>(skip_samples), received_samples.size())));
    return;
  }
  if (drop_baseband >= 1) {
    // Whole symbol periods, so the symbol phase of the buffers is kept.
    const int drop = std::min(audio_dsp::RoundUpToMultiple(drop_baseband, baseband_frame_size_),
                              tone_strength_buffer_size_);
    for (StreamBuffer& buffer : tone_strength_buffers_) buffer.Discard(drop);
    for (StreamBuffer& buffer : tone_block_buffers_) buffer.Discard(2 * drop);
    tone_strength_buffer_size_ -= drop;
  }

  std::span<const float> mono = received_samples;
  if (num_channels_ > 1) {
    CHECK(received_samples.size() % num_channels_ == 0);
    mono_.assign(received_samples.size() / num_channels_, 0.0f);
    for (size_t i = 0; i < mono_.size(); ++i) {
      float sum = 0.0f;
      for (int c = 0; c < num_channels_; ++c) sum += received_samples[i * num_channels_ + c];
      mono_[i] = sum / static_cast<float>(num_channels_);
    }
    mono = mono_;
  }
  if (received_resampler_) {
    received_resampler_->ProcessSamples(mono, &resampled_);
    mono = resampled_;
  }
  int added = 0;
  for (int i = 0; i < num_frequencies_; ++i) {
    if (sequence_search_) {
      tone_strength_filters_[i].ProcessSamples(mono, &strengths_, &block_sums_);
      tone_block_buffers_[i].Append(std::span<const float>(
          reinterpret_cast<const float*>(block_sums_.data()), 2 * block_sums_.size()));
    } else {
      tone_strength_filters_[i].ProcessSamples(mono, &strengths_);
    }
    tone_strength_buffers_[i].Append(strengths_);
    if (i == 0) added = static_cast<int>(strengths_.size());
    CHECK_EQ(tone_strength_buffers_[i].size(), tone_strength_buffer_size_ + added);
  }
  tone_strength_buffer_size_ += added;
}

// Delay-compensated gamma smoothing: the filter's delay d is removed by
// priming its stages with the mean of the first d inputs, dropping the first
// d outputs and flushing with the mean of the last d inputs, so that the
// smoothed value at i describes the noise around i, not d samples earlier.
void DtmfDecoder::SmoothNoise(std::vector<float>* noise) const {
  std::vector<float>& x = *noise;
  const int length = static_cast<int>(x.size());
  if (length == 0) return;
  const int order = params_.noise_estimate_filter_order;
  const double pole = audio_dsp::GammaFilterPoleFromStddev(
      params_.noise_estimate_filter_stddev * baseband_frame_size_, order);
  const int d = audio_dsp::GammaFilterDelay(order, pole);
  const auto mean = [&](int begin, int end) {
    double sum = 0.0;
    for (int i = begin; i < end; ++i) sum += x[i];
    return static_cast<float>(sum / (end - begin));
  };
  if (length <= d) {
    std::fill(x.begin(), x.end(), mean(0, length));
    return;
  }
  const float head = d > 0 ? mean(0, d) : x[0];
  const float tail = d > 0 ? mean(length - d, length) : x[length - 1];
  audio_dsp::GammaFilter filter(order, baseband_sample_rate_, pole);
  filter.SetState(head);
  std::vector<float> scratch(d);
  filter.ProcessBlock(x.data(), d, scratch.data());  // warm-up, output unused
  filter.ProcessBlock(x.data() + d, length - d, x.data());
  std::fill(scratch.begin(), scratch.end(), tail);
  filter.ProcessBlock(scratch.data(), d, x.data() + (length - d));
}

// Tone normalisation and the per-column acquisition terms. A column's values
// depend only on the raw strengths inside its max-filter window, clipped to
// the buffer, and raw strengths never change once buffered. So the columns
// computed by the previous call are copied where their window is unchanged
// (it lay inside the old buffer and still lies inside, or the front did not
// move), and only the new tail and, after a drop, the new head are computed.
// The result is identical to computing every column afresh.
void DtmfDecoder::UpdateColumnScores() {
  const int length = tone_strength_buffer_size_;
  const int window = static_cast<int>(
      params_.tone_normalization_params.window_size * baseband_frame_size_);
  const int ahead = std::max(window - 1, 0) / 2;
  const int begin = tone_strength_buffers_[0].num_discarded_samples();
  const int old_begin = columns_begin_;
  const int old_length = static_cast<int>(column_signal_.size());

  // Reusable columns, in positions of the current buffer.
  int reuse_from = 0, reuse_to = 0;
  if (old_length > 0 && begin >= old_begin) {
    const int shift = begin - old_begin;
    reuse_from = shift == 0 ? 0 : std::max(window - 1 - ahead, 0);
    reuse_to = std::min(old_length - shift - ahead, length);
    if (reuse_to <= reuse_from) reuse_from = reuse_to = 0;
  }

  audio_dsp::RowMajorFloatMatrix scores(num_frequencies_, length);
  std::vector<float> signal(length), noise(length);
  if (reuse_to > reuse_from) {
    const int shift = begin - old_begin;
    const int count = reuse_to - reuse_from;
    for (int i = 0; i < num_frequencies_; ++i) {
      std::copy_n(tone_scores_.row(i).data() + reuse_from + shift, count,
                  scores.row(i).data() + reuse_from);
    }
    std::copy_n(column_signal_.begin() + reuse_from + shift, count, signal.begin() + reuse_from);
    std::copy_n(column_noise_.begin() + reuse_from + shift, count, noise.begin() + reuse_from);
    ComputeColumns(0, reuse_from, &scores, &signal, &noise);
    ComputeColumns(reuse_to, length, &scores, &signal, &noise);
  } else {
    ComputeColumns(0, length, &scores, &signal, &noise);
  }
  tone_scores_ = std::move(scores);
  column_signal_ = std::move(signal);
  column_noise_ = std::move(noise);
  columns_begin_ = begin;
}

// Columns [first, last) of the tone scores, and for each the acquisition's
// signal (the weakest of the tones_per_symbol strongest tones) and unsmoothed
// noise (the mean of the other tones).
void DtmfDecoder::ComputeColumns(int first, int last, audio_dsp::RowMajorFloatMatrix* scores,
                                 std::vector<float>* signal, std::vector<float>* noise) {
  if (first >= last) return;
  const ToneNormalizationParams& norm = params_.tone_normalization_params;
  const int length = tone_strength_buffer_size_;
  const int window = static_cast<int>(norm.window_size * baseband_frame_size_);
  const int ahead = std::max(window - 1, 0) / 2;
  // The raw strengths every window of these columns can reach.
  const int from = std::max(0, first + ahead - window + 1);
  const int to = std::min(length, last + ahead);
  const int rows = num_frequencies_;
  const int count = last - first;

  // Local level of every tone (running maximum), and the strongest of them.
  local_.resize(rows, to - from);
  std::vector<const float*> raw(rows);
  for (int i = 0; i < rows; ++i) {
    raw[i] = tone_strength_buffers_[i].View(0).data();
    audio_dsp::MaxFilter(raw[i] + from, to - from, window, local_.row(i).data());
  }
  const int offset = first - from;
  std::vector<float> strongest(local_.row(0).data() + offset,
                               local_.row(0).data() + offset + count);
  for (int i = 1; i < rows; ++i) {
    const float* levels = local_.row(i).data() + offset;
    for (int t = 0; t < count; ++t) strongest[t] = std::max(strongest[t], levels[t]);
  }
  // Each tone over its level, partly levelled across tones.
  for (int i = 0; i < rows; ++i) {
    const float* levels = local_.row(i).data() + offset;
    const float* strengths = raw[i] + first;
    float* out = scores->row(i).data() + first;
    for (int t = 0; t < count; ++t) {
      const float level = levels[t] + norm.cross_frequency_weight * (strongest[t] - levels[t]) +
                          norm.division_floor;
      out[t] = strengths[t] / level;
    }
  }

  // With few tones per symbol, keeping the strongest ones in a small sorted
  // array is cheaper than a partial sort of every column.
  const int k = num_frequencies_ - params_.tones_per_symbol;
  const int top_count = params_.tones_per_symbol;
  std::vector<float> top(top_count);
  for (int t = first; t < last; ++t) {
    std::fill(top.begin(), top.end(), -INFINITY);  // descending
    float sum = 0.0f;
    for (int i = 0; i < rows; ++i) {
      const float v = (*scores)(i, t);
      sum += v;
      if (v > top[top_count - 1]) {
        int j = top_count - 1;
        for (; j > 0 && top[j - 1] < v; --j) top[j] = top[j - 1];
        top[j] = v;
      }
    }
    (*signal)[t] = top[top_count - 1];  // the k-th smallest value
    float top_sum = 0.0f;
    for (float v : top) top_sum += v;
    (*noise)[t] = k > 0 ? (sum - top_sum) / static_cast<float>(k) : 0.0f;
  }
}

bool DtmfDecoder::GetToken(DecodeResults* decode_results) {
  if (!initialized_) {
    LOG(ERROR) << "GetToken() called before call to Init().";
    return false;
  }
  CHECK(decode_results);
  decode_results->Clear();
  const int length = tone_strength_buffer_size_;
  if (length == 0) return false;

  UpdateColumnScores();
  const audio_dsp::RowMajorFloatMatrix& tone_scores = tone_scores_;
  CHECK(tone_scores.rows() == num_frequencies_);
  CHECK(tone_scores.cols() == tone_strength_buffer_size_);
  std::vector<float> noise = column_noise_;
  SmoothNoise(&noise);
  std::vector<float> acquisition_scores(length);
  for (int t = 0; t < length; ++t) {
    acquisition_scores[t] = column_signal_[t] / (1e-12f + noise[t]);
  }

  // Symbol timing: the phase of the acquisition folded over whole periods.
  const int period = baseband_frame_size_;
  std::vector<double> folded(period, 0.0);
  for (int p = 0; p < (length / period) * period; ++p) folded[p % period] += acquisition_scores[p];
  const std::complex<double> step = std::polar(1.0, 2.0 * std::numbers::pi / period);
  std::complex<double> phasor(1.0, 0.0), sum;
  for (int p = 0; p < period; ++p) {
    sum += folded[p] * phasor;
    phasor *= step;
  }
  const double angle = std::atan2(sum.imag(), sum.real());
  const int t0 = audio_dsp::PositiveModulo(
      static_cast<int>(std::lround(angle * period / (2.0 * std::numbers::pi))), period);

  // Per-symbol scores at every symbol-spaced time with enough acquisition.
  CHECK(acquisition_scores.size() == static_cast<size_t>(tone_strength_buffer_size_));
  const int alphabet = static_cast<int>(params_.symbol_table.size());
  const float discarded_seconds =
      static_cast<float>(tone_strength_buffers_[0].num_discarded_samples()) / baseband_sample_rate_;
  for (int slot = 0, t = t0; t < length; ++slot, t += period) {
    float score = acquisition_scores[t];
    if (t > period && t + period < length) {
      score = std::max(score, std::min(acquisition_scores[t - period],
                                       acquisition_scores[t + period]));
    }
    if (score < params_.acquisition_threshold) continue;
    audio_dsp::FloatVector symbol_scores(alphabet);
    for (int s = 0; s < alphabet; ++s) {
      float weakest = INFINITY;
      for (int tone : params_.symbol_table[s]) weakest = std::min(weakest, tone_scores(tone, t));
      symbol_scores[s] = weakest;
    }
    decode_results->symbol_scores.emplace(slot, std::move(symbol_scores));
    decode_results->detection_times.push_back(discarded_seconds + t / baseband_sample_rate_);
    decode_results->detection_scores.push_back(score);
  }

  std::vector<DecodedToken> candidates;
  token_selector_->SelectTokens(decode_results->symbol_scores, &decode_results->scores_table,
                                &candidates);
  for (DecodedToken& candidate : candidates) {
    candidate.bytes = converter_.SymbolsToBytes(candidate.symbols);
    if (static_cast<int>(candidate.bytes.size()) == params_.bytes_in_token) {
      decode_results->tokens.push_back(std::move(candidate));
    }
  }
  return !decode_results->tokens.empty();
}

}  // namespace audio_sorvane

namespace audio_sorvane {

// Frame n's window starts at buffer index first + n * P. The block sums
// carry the receiver oscillator's phase, which advances by a tone-dependent
// amount from frame to frame while every transmitted frame starts at phase
// 0; turning each frame back by the oscillator phase at its start leaves
// one constant phase per tone, which the room taps absorb.
void DtmfDecoder::FrameAmplitudes(int first, int count, audio_dsp::ComplexMatrix* frames) const {
  const int period = baseband_frame_size_;
  const uint32_t begin =
      static_cast<uint32_t>(tone_strength_buffers_[0].num_discarded_samples());
  frames->resize(count, num_frequencies_);
  for (int k = 0; k < num_frequencies_; ++k) {
    const float* z = tone_block_buffers_[k].View(0).data();
    for (int n = 0; n < count; ++n) {
      const int start = first + n * period;
      float re = 0.0f, im = 0.0f;
      for (int m = 0; m < period; ++m) {
        re += frame_window_[m] * z[2 * (start + m)];
        im += frame_window_[m] * z[2 * (start + m) + 1];
      }
      const uint32_t phase = (begin + static_cast<uint32_t>(start)) * frame_phase_steps_[k];
      const double angle = -2.0 * std::numbers::pi * (phase / 4294967296.0);
      (*frames)(n, k) = std::complex<float>(re, im) *
                        std::complex<float>(static_cast<float>(std::cos(angle)),
                                            static_cast<float>(std::sin(angle)));
    }
  }
}

bool DtmfDecoder::LoopRepeats(int first, int count) const {
  const int frame = baseband_frame_size_;
  const int loop = sequence_search_->params().period;
  double xy = 0.0, xx = 0.0, yy = 0.0;
  std::vector<double> x(count);
  for (int k = 0; k < num_frequencies_; ++k) {
    const std::span<const float> strengths = tone_strength_buffers_[k].View(0);
    double mean = 0.0;
    for (int n = 0; n < count; ++n) {
      x[n] = strengths[first + n * frame + frame / 2];
      mean += x[n];
    }
    mean /= count;
    for (int n = 0; n + loop < count; ++n) {
      const double a = x[n] - mean, b = x[n + loop] - mean;
      xy += a * b;
      xx += a * a;
      yy += b * b;
    }
  }
  return xx > 0.0 && yy > 0.0 &&
         xy >= params_.room_search.min_loop_correlation * std::sqrt(xx * yy);
}

bool DtmfDecoder::TokenFromMasks(const std::vector<uint32_t>& tone_masks,
                                 DecodedToken* token) const {
  const int period = sequence_search_->params().period;
  std::vector<int> loop(period);
  int spacer_at = -1;
  for (int p = 0; p < period; ++p) {
    uint32_t bits = 0;
    for (int k = 0; k < num_frequencies_; ++k) {
      if (tone_masks[k] >> p & 1) bits |= 1u << k;
    }
    const auto it = symbol_of_tones_.find(bits);
    if (it == symbol_of_tones_.end()) return false;
    loop[p] = it->second;
    if (loop[p] == params_.spacer_symbol) {
      if (spacer_at >= 0) return false;
      spacer_at = p;
    }
  }
  if (spacer_at < 0) return false;
  std::vector<int> symbols(period - 1);
  for (int i = 0; i < period - 1; ++i) symbols[i] = loop[(spacer_at + 1 + i) % period];
  if (params_.use_checksum_symbol) {
    const int check = symbols.back();
    symbols.pop_back();
    if (ComputeCheckSymbol(static_cast<int>(params_.symbol_table.size()), symbols) != check) {
      return false;
    }
  }
  token->bytes = converter_.SymbolsToBytes(symbols);
  if (static_cast<int>(token->bytes.size()) != params_.bytes_in_token) return false;
  token->symbols = std::move(symbols);
  token->position = spacer_at;
  return true;
}

bool DtmfDecoder::GetReverberantToken(DecodeResults* decode_results) {
  if (!initialized_) {
    LOG(ERROR) << "GetReverberantToken() called before call to Init().";
    return false;
  }
  CHECK(decode_results);
  decode_results->Clear();
  if (!sequence_search_) return false;
  const RoomSearchParams& room = params_.room_search;
  const int frame = baseband_frame_size_;
  const int length = tone_strength_buffer_size_;
  const int begin = tone_strength_buffers_[0].num_discarded_samples();
  const int earliest = std::max(0, room.settle_frames * frame - begin);
  const int loop = sequence_search_->params().period;
  // Once per frame of new audio, and only for audio that repeats.
  const int64_t end = static_cast<int64_t>(begin) + length;
  if (last_search_end_ >= 0 && end - last_search_end_ < frame) return false;
  last_search_end_ = end;
  {
    const int count = std::min(std::max(length - earliest, 0) / frame, room.max_frames);
    if (count < 2 * loop || !LoopRepeats(length - count * frame, count)) return false;
  }

  struct Fit {
    double cost;
    std::vector<uint32_t> masks;
  };
  std::vector<Fit> fits;
  audio_dsp::ComplexMatrix frames;
  for (int c = 0; c < room.timing_candidates; ++c) {
    const int offset = c * frame / room.timing_candidates;
    int first = earliest + audio_dsp::PositiveModulo(offset - (begin + earliest), frame);
    int count = std::max(length - first, 0) / frame;
    if (count > room.max_frames) {
      first += (count - room.max_frames) * frame;
      count = room.max_frames;
    }
    if (count < 2 * loop) continue;
    FrameAmplitudes(first, count, &frames);
    Fit fit;
    if (!sequence_search_->Search(frames, &fit.masks, &fit.cost)) continue;
    const double energy = frames.cwiseAbs2().sum();
    if (!(energy > 0.0)) continue;
    fit.cost /= energy;
    fits.push_back(std::move(fit));
  }
  std::sort(fits.begin(), fits.end(),
            [](const Fit& a, const Fit& b) { return a.cost < b.cost; });
  for (const Fit& fit : fits) {
    if (static_cast<int>(decode_results->tokens.size()) >= room.max_tokens) break;
    DecodedToken token;
    if (!TokenFromMasks(fit.masks, &token)) continue;
    token.score = static_cast<float>(1.0 - fit.cost);
    const bool seen = std::any_of(
        decode_results->tokens.begin(), decode_results->tokens.end(),
        [&](const DecodedToken& t) { return t.symbols == token.symbols; });
    if (!seen) decode_results->tokens.push_back(std::move(token));
  }
  return !decode_results->tokens.empty();
}

}  // namespace audio_sorvane
