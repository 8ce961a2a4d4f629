#include "audio/sorvane/dtmf/dtmf_decoder.h"

#include <algorithm>
#include <cmath>
#include <complex>
#include <numbers>

#include "audio/dsp/acoustics.h"
#include "audio/dsp/float4.h"
#include "audio/dsp/gamma_filter.h"
#include "audio/dsp/number_util.h"
#include "audio/dsp/resampler.h"
#include "audio/sorvane/compute_buffer_truncation.h"
#include "base/logging.h"

namespace audio_sorvane {
namespace {

using audio_dsp::Float8;
using audio_dsp::Load8;
using audio_dsp::Max8;
using audio_dsp::Min8;
using audio_dsp::Splat8;
using audio_dsp::kSpeedOfSound;
using audio_dsp::Store8;

// Half the 3 dB bandwidth of a half-sine window of T seconds is 0.594 / T Hz
// (|W(f)|^2 falls to half at f = 0.5945 / T).
constexpr double kHalfSineHalfBandwidthCycles = 0.594;

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

sorvel_base::Validation ValidateDtmfDecoderParams(const DtmfDecoderParams& params) {
  SORVEL_RETURN_IF_INVALID(ValidateDtmfEncoderParams(params));
  SORVEL_REQUIRE(params.max_meters_per_second >= 0.0,
                 "max_meters_per_second must not be negative, got ", params.max_meters_per_second);
  SORVEL_REQUIRE(params.max_buffer_duration_in_seconds > 0.0,
                 "the buffer duration must be positive, got ",
                 params.max_buffer_duration_in_seconds, " s");
  const ToneNormalizationParams& normalization = params.tone_normalization_params;
  SORVEL_REQUIRE(params.tone_normalization_params.window_size >= 0.0,
                 "the normalisation window must not be negative, got ", normalization.window_size);
  SORVEL_REQUIRE(params.tone_normalization_params.cross_frequency_weight >= 0.0,
                 "cross_frequency_weight must not be negative, got ",
                 normalization.cross_frequency_weight);
  SORVEL_REQUIRE(params.tone_normalization_params.division_floor >= 0.0,
                 "division_floor must not be negative, got ", normalization.division_floor);
  SORVEL_REQUIRE(params.noise_estimate_filter_order > 0,
                 "noise_estimate_filter_order must be positive, got ",
                 params.noise_estimate_filter_order);
  SORVEL_REQUIRE(params.noise_estimate_filter_stddev > 0.0,
                 "noise_estimate_filter_stddev must be positive, got ",
                 params.noise_estimate_filter_stddev);
  SORVEL_REQUIRE(params.acquisition_threshold >= 0.0,
                 "acquisition_threshold must not be negative, got ", params.acquisition_threshold);
  SORVEL_REQUIRE(params.max_candidates_rank > 0, "max_candidates_rank must be positive, got ",
                 params.max_candidates_rank);
  SORVEL_REQUIRE(params.max_candidates_per_decode_token_call > 0,
                 "max_candidates must be positive, got ",
                 params.max_candidates_per_decode_token_call);
  SORVEL_REQUIRE(params.token_threshold_factor >= 0,
                 "token_threshold_factor must not be negative, got ",
                 params.token_threshold_factor);
  const RoomSearchParams& room = params.room_search;
  SORVEL_REQUIRE(params.room_search.settle_frames >= 0, "room_search.settle_frames must not be "
                 "negative, got ", room.settle_frames);
  SORVEL_REQUIRE(params.room_search.max_frames > 0, "room_search.max_frames must be positive, got ",
                 room.max_frames);
  SORVEL_REQUIRE(params.room_search.timing_candidates > 0,
                 "room_search.timing_candidates must be positive, got ", room.timing_candidates);
  SORVEL_REQUIRE(params.room_search.timings_searched > 0,
                 "room_search.timings_searched must be positive, got ", room.timings_searched);
  SORVEL_REQUIRE(params.room_search.max_tokens > 0, "room_search.max_tokens must be positive, got ",
                 room.max_tokens);
  // The tone normalisation's running maximum needs a window of at least one
  // baseband sample.
  const int window_size = static_cast<int>(normalization.window_size *
                                           (FrameSize(params) / params.baseband_decimation_factor));
  SORVEL_REQUIRE(window_size >= 1, "the normalisation window (", normalization.window_size,
                 " frames) is under one baseband sample; use a longer window_duration or a "
                 "smaller baseband_decimation_factor");
  return {};
}

DtmfDecoder::DtmfDecoder(const DtmfDecoderParams& params)
    : params_(params),
      converter_(static_cast<int>(params.symbol_table.size()), params.spacer_symbol,
                 params.bytes_in_token),
      token_selector_(std::make_unique<TokenSelector>(
          SelectorParams(params, converter_.symbols_in_token()))) {
  CHECK_VALID(ValidateDtmfDecoderParams(params));

  num_frequencies_ = static_cast<int>(params_.tone_frequencies.size());
  frame_size_ = FrameSize(params_);
  baseband_frame_size_ = frame_size_ / params_.baseband_decimation_factor;
  frame_duration_ = static_cast<float>(frame_size_) / params_.sample_rate;
  baseband_sample_rate_ =
      params_.sample_rate / static_cast<float>(params_.baseband_decimation_factor);

  // Tone filter bandwidth: the largest Doppler shift plus half the 3 dB
  // bandwidth of one (half-sine windowed) symbol frame.
  const float highest = *std::max_element(params_.tone_frequencies.begin(),
                                          params_.tone_frequencies.end());
  const double cutoff = static_cast<double>(highest * params_.max_meters_per_second) /
                            kSpeedOfSound +
                        kHalfSineHalfBandwidthCycles / frame_duration_;
  tone_bank_ = std::make_unique<ToneFilterBank>(params_.baseband_decimation_factor,
                                                params_.sample_rate, params_.tone_frequencies,
                                                cutoff, params_.use_reference_paths);
  const int order = params_.noise_estimate_filter_order;
  smoother_ = std::make_unique<AlignedGammaSmoother>(
      order, baseband_sample_rate_,
      audio_dsp::GammaFilterPoleFromStddev(
          params_.noise_estimate_filter_stddev * baseband_frame_size_, order));
  column_scores_.resize(num_frequencies_);
  top8_.resize(params_.tones_per_symbol);
  folded_.resize(baseband_frame_size_);

  // The coherent path, when the token layout fits the search's limits. The
  // search's tables are built on its first use.
  const RoomSearchParams& room = params_.room_search;
  ToneSequenceSearchParams search;
  search.num_tones = num_frequencies_;
  search.period = token_selector_->symbol_period();
  search.tones_per_symbol = params_.tones_per_symbol;
  search.num_taps = room.num_taps;
  search.masks_per_tone = room.masks_per_tone;
  search_params_ = search;
  if (room.enabled && ToneSequenceSearch::Supported(search)) {
    search_supported_ = true;
    for (int k = 0; k < num_frequencies_; ++k) {
      frame_phase_steps_.push_back(static_cast<uint32_t>(params_.baseband_decimation_factor) *
                                   tone_bank_->filter(k).phase_increment());
    }
    const int period = baseband_frame_size_;
    const double phi = std::numbers::pi / period;
    window_twiddles_.reserve(2 * period);
    start_twiddles_.reserve(2 * period);
    for (int j = 0; j < 2 * period; ++j) {
      window_twiddles_.push_back(std::polar(1.0, phi * (j + 0.5)));
      start_twiddles_.push_back(std::polar(1.0, phi * j));
    }
    const int candidates = room.timing_candidates;
    candidate_at_.assign(period, -1);
    for (int c = 0; c < candidates; ++c) {
      candidate_offset_.push_back(c * period / candidates);
      candidate_at_[candidate_offset_.back() % period] = c;
    }
    running_a_.resize(num_frequencies_);
    running_b_.resize(num_frequencies_);
    window_a_.resize(static_cast<size_t>(candidates) * num_frequencies_);
    window_b_.resize(window_a_.size());
    window_start_.resize(candidates);
    frame_values_.resize(static_cast<size_t>(candidates) * room.max_frames * num_frequencies_);
    frame_starts_.resize(static_cast<size_t>(candidates) * room.max_frames);
    frame_count_.resize(candidates);
    frame_next_.resize(candidates);
    for (size_t s = 0; s < params_.symbol_table.size(); ++s) {
      uint32_t bits = 0;
      for (int tone : params_.symbol_table[s]) bits |= 1u << tone;
      symbol_of_tones_[bits] = static_cast<int>(s);
    }
  }
}

void ColumnRing::Init(int rows, int capacity) {
  rows_ = rows;
  capacity_ = std::max(capacity, 1);
  const size_t size = static_cast<size_t>(rows_) * capacity_;
  if (data_.size() != size) {
    data_.assign(size, 0.0f);
    data_.shrink_to_fit();
  }
}

void ColumnRing::Reserve(int capacity, int64_t from, int64_t to) {
  if (capacity <= capacity_) return;
  ColumnRing grown;
  grown.Init(rows_, capacity);
  std::vector<float> row(static_cast<size_t>(to - from));
  for (int r = 0; r < rows_; ++r) {
    Read(r, from, static_cast<int>(to - from), row.data());
    grown.Write(r, from, row.data(), static_cast<int>(to - from));
  }
  *this = std::move(grown);
}

void ColumnRing::Write(int row, int64_t position, const float* values, int count) {
  float* base = data_.data() + static_cast<size_t>(row) * capacity_;
  int at = static_cast<int>(position % capacity_);
  while (count > 0) {
    const int n = std::min(count, capacity_ - at);
    std::copy_n(values, n, base + at);
    values += n;
    count -= n;
    at = 0;
  }
}

void ColumnRing::Read(int row, int64_t position, int count, float* values) const {
  const auto [a, b] = Pieces(row, position, count);
  std::copy(a.begin(), a.end(), values);
  std::copy(b.begin(), b.end(), values + a.size());
}

std::pair<std::span<const float>, std::span<const float>> ColumnRing::Pieces(
    int row, int64_t position, int count) const {
  const float* base = data_.data() + static_cast<size_t>(row) * capacity_;
  const int at = static_cast<int>(position % capacity_);
  const int n = std::min(count, capacity_ - at);
  return {std::span<const float>(base + at, n), std::span<const float>(base, count - n)};
}

void BlockMaxima::Init(const ColumnRing& values) {
  CHECK(values.capacity() % kBlock == 0);
  maxima_.Init(values.rows(), values.capacity() / kBlock);
}

void BlockMaxima::ComputeBlock(const ColumnRing& values, int64_t block) {
  // Blocks never straddle the values ring's wrap (capacity % kBlock == 0).
  for (int r = 0; r < values.rows(); ++r) {
    const float* v = values.Pieces(r, block * kBlock, kBlock).first.data();
    float m = v[0];
    for (int i = 1; i < kBlock; ++i) m = std::max(m, v[i]);
    maxima_.at(r, block) = m;
  }
}

void BlockMaxima::Update(const ColumnRing& values, int64_t from, int64_t to) {
  for (int64_t block = from / kBlock; (block + 1) * kBlock <= to; ++block) {
    ComputeBlock(values, block);
  }
}

void BlockMaxima::Rebuild(const ColumnRing& values, int64_t from, int64_t to) {
  Init(values);
  for (int64_t block = (from + kBlock - 1) / kBlock; (block + 1) * kBlock <= to; ++block) {
    ComputeBlock(values, block);
  }
}

namespace {

// The largest of `count` values from `values` on, with a ring wrap after
// `before_wrap` of them, folded into m.
float RangeMax(const float* values, int before_wrap, const float* wrapped, int count, float m) {
  for (int piece = 0; piece < 2 && count > 0; ++piece) {
    const float* v = piece == 0 ? values : wrapped;
    const int n = piece == 0 ? std::min(count, before_wrap) : count;
    int j = 0;
    if (n >= 4) {
      audio_dsp::Float4 a = audio_dsp::Load4(v);
      for (j = 4; j + 4 <= n; j += 4) a = audio_dsp::Max4(a, audio_dsp::Load4(v + j));
      m = std::max(m, audio_dsp::MaxLane4(a));
    }
    for (; j < n; ++j) m = std::max(m, v[j]);
    count -= n;
  }
  return m;
}

}  // namespace

// [first, last] = head values, whole blocks, tail values; the ring offsets
// are the same for every row.
void BlockMaxima::Max(const ColumnRing& values, int64_t first, int64_t last,
                      float* maxima) const {
  const int capacity = values.capacity();
  const int block_capacity = maxima_.capacity();
  const int64_t first_block = (first + kBlock - 1) / kBlock;
  const int64_t end_block = (last + 1) / kBlock;  // past the last whole block
  const bool has_blocks = first_block < end_block;
  const int head = has_blocks ? static_cast<int>(first_block * kBlock - first)
                              : static_cast<int>(last - first + 1);
  const int blocks = has_blocks ? static_cast<int>(end_block - first_block) : 0;
  const int64_t tail_first = has_blocks ? end_block * kBlock : last + 1;
  const int tail = static_cast<int>(last + 1 - tail_first);
  const int head_at = static_cast<int>(first % capacity);
  const int tail_at = static_cast<int>(tail_first % capacity);
  const int block_at = static_cast<int>(first_block % block_capacity);
  for (int r = 0; r < values.rows(); ++r) {
    const float* row = values.row(r);
    const float* block_row = maxima_.row(r);
    float m = RangeMax(block_row + block_at, block_capacity - block_at, block_row, blocks,
                       -INFINITY);
    m = RangeMax(row + head_at, capacity - head_at, row, head, m);
    maxima[r] = RangeMax(row + tail_at, capacity - tail_at, row, tail, m);
  }
}

void BlockMaxima::MaxReference(const ColumnRing& values, int64_t first, int64_t last,
                               float* maxima) {
  for (int r = 0; r < values.rows(); ++r) {
    float m = -INFINITY;
    for (int64_t p = first; p <= last; ++p) m = std::max(m, values.at(r, p));
    maxima[r] = m;
  }
}

void DtmfDecoder::Init(int num_channels, float received_sample_rate) {
  CHECK(received_sample_rate > 0.0);
  CHECK(num_channels >= 1);
  received_sample_rate_ = received_sample_rate;
  num_channels_ = num_channels;
  received_per_baseband_ = received_sample_rate_ / baseband_sample_rate_;
  const int frames = token_selector_->symbol_period();
  max_good_block_size_ =
      static_cast<int>(std::lround(frame_duration_ * received_sample_rate_ * frames));
  max_buffer_size_ = static_cast<int>(
      std::lround(params_.max_buffer_duration_in_seconds * received_sample_rate_));
  if (received_sample_rate_ == params_.sample_rate) {
    received_resampler_.reset();
  } else {
    received_resampler_ = std::make_unique<audio_dsp::RationalFactorResampler<float>>(
        audio_dsp::DefaultResamplingKernel(received_sample_rate_, params_.sample_rate),
        audio_dsp::kDefaultMaxDenominator);
    CHECK(received_resampler_->Valid()) << "Failed to initialize RationalFactorResampler.";
  }
  tone_strength_buffer_size_ = 0;
  begin_ = 0;
  tone_bank_->Reset();
  // The buffers hold at most the budget's worth of baseband samples (see
  // ProcessSamples); a little more covers the resampler's rounding.
  const int capacity = audio_dsp::RoundUpToMultiple(
      static_cast<int>(std::ceil(max_buffer_size_ / received_per_baseband_)) + 64,
      BlockMaxima::kBlock);
  strengths_.Init(num_frequencies_, capacity);
  strength_blocks_.Init(strengths_);
  columns_.Init(2, capacity);
  acquisition_.reserve(std::max<size_t>(smoother_->PaddedLength(capacity), ColumnScratchSize()));
  for (SlotCache* cache : {&slot_cache_, &next_slot_cache_}) {
    cache->positions.clear();
    cache->scores.clear();
    cache->positions.reserve(capacity / baseband_frame_size_ + 2);
    cache->scores.reserve(cache->positions.capacity() * num_frequencies_);
  }
  last_search_end_ = -1;
  columns_begin_ = 0;
  columns_length_ = 0;
  block_position_ = 0;
  std::fill(running_a_.begin(), running_a_.end(), 0.0);
  std::fill(running_b_.begin(), running_b_.end(), 0.0);
  for (size_t c = 0; c < window_start_.size(); ++c) {
    // A window starting at 0 opens with empty sums; the others open when
    // the stream reaches their offset.
    window_start_[c] = candidate_offset_[c] == 0 ? 0 : -1;
    frame_count_[c] = frame_next_[c] = 0;
  }
  std::fill(window_a_.begin(), window_a_.end(), 0.0);
  std::fill(window_b_.begin(), window_b_.end(), 0.0);
  initialized_ = true;
}

void DtmfDecoder::Reset() { Init(num_channels_, received_sample_rate_); }

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
  // Drops whole symbol periods, so the symbol phase of the buffers is kept.
  const BlockTruncation truncation = ComputeBlockTruncation(
      static_cast<int>(received_samples.size()), num_channels_, received_per_baseband_,
      tone_strength_buffer_size_, baseband_frame_size_, max_good_block_size_, max_buffer_size_);
  const int skip_samples = truncation.skip_samples;
  if (skip_samples >= 1) {
    Init(num_channels_, received_sample_rate_);
    ProcessSamples(received_samples.subspan(
        std::min<size_t>(static_cast<size_t>(skip_samples), received_samples.size())));
    return;
  }
  if (truncation.drop_baseband >= 1) {
    const int drop = truncation.drop_baseband;
    begin_ += drop;
    tone_strength_buffer_size_ -= drop;
  }

  std::span<const float> mono = received_samples;
  if (num_channels_ > 1) {
    CHECK(received_samples.size() % num_channels_ == 0);
    mono_.resize(received_samples.size() / num_channels_);
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
  // Scratch rows for the bank's outputs, grown only for larger blocks.
  const int most = tone_bank_->MaxOutputs(static_cast<int>(mono.size()));
  if (bank_strength_rows_.empty() ||
      bank_strengths_.size() < static_cast<size_t>(most) * num_frequencies_) {
    bank_strengths_.resize(static_cast<size_t>(most) * num_frequencies_);
    bank_strength_rows_.resize(num_frequencies_);
    for (int i = 0; i < num_frequencies_; ++i) {
      bank_strength_rows_[i] = bank_strengths_.data() + static_cast<size_t>(i) * most;
    }
    if (search_supported_) {
      bank_sums_.resize(static_cast<size_t>(most) * num_frequencies_);
      bank_sum_rows_.resize(num_frequencies_);
      for (int i = 0; i < num_frequencies_; ++i) {
        bank_sum_rows_[i] = bank_sums_.data() + static_cast<size_t>(i) * most;
      }
    }
  }
  const int added = tone_bank_->ProcessSamples(
      mono, bank_strength_rows_.data(), search_supported_ ? bank_sum_rows_.data() : nullptr);
  const int64_t end = begin_ + tone_strength_buffer_size_;
  if (tone_strength_buffer_size_ + added > strengths_.capacity()) {
    const int capacity = audio_dsp::RoundUpToMultiple(2 * (tone_strength_buffer_size_ + added),
                                                      BlockMaxima::kBlock);
    strengths_.Reserve(capacity, begin_, end);
    strength_blocks_.Rebuild(strengths_, begin_, end);
    columns_.Reserve(capacity, columns_begin_, columns_begin_ + columns_length_);
  }
  for (int i = 0; i < num_frequencies_; ++i) {
    strengths_.Write(i, end, bank_strength_rows_[i], added);
  }
  strength_blocks_.Update(strengths_, end, end + added);
  if (search_supported_) TrackFrames(added);
  tone_strength_buffer_size_ += added;
}

// The matched-filter sums of the frames completed by the newest `count`
// block sums (see window_twiddles_).
void DtmfDecoder::TrackFrames(int count) {
  const int period = baseband_frame_size_;
  const int tones = num_frequencies_;
  const int max_frames = params_.room_search.max_frames;
  // j mod 2P and (j + 1) mod P, advanced with j.
  int twiddle = static_cast<int>(block_position_ % (2 * period));
  int next_phase = static_cast<int>((block_position_ + 1) % period);
  for (int n = 0; n < count; ++n, twiddle = twiddle + 1 == 2 * period ? 0 : twiddle + 1,
           next_phase = next_phase + 1 == period ? 0 : next_phase + 1) {
    const int64_t j = block_position_++;
    // running_a += w z and running_b += conj(w) z, written out: the
    // operators' NaN handling keeps them from vectorising.
    const double w_re = window_twiddles_[twiddle].real();
    const double w_im = window_twiddles_[twiddle].imag();
    double* a_sums = reinterpret_cast<double*>(running_a_.data());
    double* b_sums = reinterpret_cast<double*>(running_b_.data());
    for (int k = 0; k < tones; ++k) {
      const double z_re = bank_sum_rows_[k][n].real(), z_im = bank_sum_rows_[k][n].imag();
      a_sums[2 * k] += w_re * z_re - w_im * z_im;
      a_sums[2 * k + 1] += w_re * z_im + w_im * z_re;
      b_sums[2 * k] += w_re * z_re + w_im * z_im;
      b_sums[2 * k + 1] += w_re * z_im - w_im * z_re;
    }
    const int c = candidate_at_[next_phase];
    if (c < 0) continue;
    // Position j + 1 starts candidate c's next window and ends its open one.
    const int64_t s = window_start_[c];
    std::complex<double>* a = &window_a_[static_cast<size_t>(c) * tones];
    std::complex<double>* b = &window_b_[static_cast<size_t>(c) * tones];
    if (s >= 0 && s + period == j + 1) {
      const std::complex<double> turn = start_twiddles_[s % (2 * period)];
      const int slot = frame_next_[c];
      std::complex<float>* out =
          &frame_values_[(static_cast<size_t>(c) * max_frames + slot) * tones];
      for (int k = 0; k < tones; ++k) {
        const std::complex<double> sum =
            std::conj(turn) * (running_a_[k] - a[k]) - turn * (running_b_[k] - b[k]);
        // sum / 2i
        out[k] = std::complex<float>(std::complex<double>(sum.imag() * 0.5, -sum.real() * 0.5));
      }
      frame_starts_[static_cast<size_t>(c) * max_frames + slot] = s;
      frame_next_[c] = (slot + 1) % max_frames;
      frame_count_[c] = std::min(frame_count_[c] + 1, max_frames);
    }
    window_start_[c] = j + 1;
    std::copy_n(running_a_.data(), tones, a);
    std::copy_n(running_b_.data(), tones, b);
  }
}

// Tone normalisation and the per-column acquisition terms. A column's values
// depend only on the raw strengths inside its max-filter window, clipped to
// the buffer, and raw strengths never change once buffered. So the columns
// computed by the previous call are kept where their window is unchanged
// (it lay inside the old buffer and still lies inside, or the front did not
// move), and only the new tail and, after a drop, the new head are computed.
// The result is identical to computing every column afresh. Columns live in
// a ring keyed by stream position, so kept columns are not moved.
void DtmfDecoder::UpdateColumnScores() {
  const int length = tone_strength_buffer_size_;
  const int window = static_cast<int>(
      params_.tone_normalization_params.window_size * baseband_frame_size_);
  const int ahead = std::max(window - 1, 0) / 2;
  const int64_t begin = begin_;
  const int64_t old_begin = columns_begin_;
  const int old_length = columns_length_;

  // Reusable columns, in positions of the current buffer.
  int reuse_from = 0, reuse_to = 0;
  if (old_length > 0 && begin >= old_begin && begin - old_begin <= old_length) {
    const int shift = static_cast<int>(begin - old_begin);
    reuse_from = shift == 0 ? 0 : std::max(window - 1 - ahead, 0);
    reuse_to = std::min(old_length - shift - ahead, length);
    if (reuse_to <= reuse_from) reuse_from = reuse_to = 0;
  }
  if (reuse_to > reuse_from) {
    ComputeColumns(0, reuse_from);
    ComputeColumns(reuse_to, length);
  } else {
    ComputeColumns(0, length);
  }
  columns_begin_ = begin;
  columns_length_ = length;
}

// Columns [first, last) of the acquisition's signal (the weakest of the
// tones_per_symbol strongest normalised tones) and unsmoothed noise (the
// mean of the other tones), in chunks so that the scratch stays small.
size_t DtmfDecoder::ColumnScratchSize() const {
  // ComputeColumns' rows of raw values and levels (half a window of
  // columns, padded by 8), its van Herk values, and a chunk's signal and
  // noise.
  const int window = std::max(
      static_cast<int>(params_.tone_normalization_params.window_size * baseband_frame_size_), 1);
  const int chunk = (window + 1) / 2;
  return 2 * static_cast<size_t>(chunk + 8) * num_frequencies_ + 2 * static_cast<size_t>(window) +
         2 * static_cast<size_t>(chunk);
}

void DtmfDecoder::ComputeColumns(int first, int last) {
  if (first >= last) return;
  const ToneNormalizationParams& norm = params_.tone_normalization_params;
  const int length = tone_strength_buffer_size_;
  const int window_size = static_cast<int>(norm.window_size * baseband_frame_size_);
  CHECK(window_size >= 1);  // as the running-maximum filter checks it
  const int window = window_size;
  const int ahead = (window - 1) / 2;
  const int back = window - 1 - ahead;
  const int rows = num_frequencies_;
  // Half a window's worth of columns per chunk (the scratch then fits in
  // the smoother's share of the buffer); rows padded by 8 floats so a group
  // of eight columns can always be loaded whole.
  const int chunk = (window + 1) / 2;
  const int stride = chunk + 8;
  // Scratch in the acquisition buffer, whose values are computed only
  // after the columns (one buffer instead of two).
  if (acquisition_.size() < ColumnScratchSize()) acquisition_.resize(ColumnScratchSize());
  float* const chunk_raw = acquisition_.data();
  float* const chunk_levels = chunk_raw + static_cast<size_t>(stride) * rows;
  float* const max_scratch = chunk_levels + static_cast<size_t>(stride) * rows;
  float* const chunk_signal = max_scratch + 2 * static_cast<size_t>(window);
  float* const chunk_noise = chunk_signal + chunk;
  const int k = num_frequencies_ - params_.tones_per_symbol;
  const int top_count = params_.tones_per_symbol;
  Float8* top = top8_.data();
  for (int c0 = first; c0 < last; c0 += chunk) {
    const int c1 = std::min(last, c0 + chunk);
    const int count = c1 - c0;
    const int offset = 0;
    // Local levels (running maxima over the windows clipped to the buffer)
    // by blocks of one window (van Herk / Gil-Werman): the windows of these
    // columns start in block A = [a, a + window) and end in A or in the
    // next block B, so each is max(suffix of A from its start, prefix of B
    // to its end). Positions outside the buffer count as -inf, which clips
    // the windows. Max is exact, so the levels equal a direct scan's.
    const int a = c0 - back;
    const int span = window + count - 1;  // A, then B up to the last end
    const int valid_from = std::clamp(-a, 0, span);
    const int valid_to = std::clamp(length - a, valid_from, span);
    float* values = max_scratch;
    for (int i = 0; i < rows; ++i) {
      std::fill(values, values + valid_from, -INFINITY);
      strengths_.Read(i, begin_ + a + valid_from, valid_to - valid_from, values + valid_from);
      std::fill(values + valid_to, values + span, -INFINITY);
      float* raw = chunk_raw + static_cast<size_t>(i) * stride;
      std::copy_n(values + back, count, raw);
      // A's suffix and B's prefix maxima, side by side (two independent
      // chains).
      float suffix = -INFINITY, prefix = -INFINITY;
      const int both = std::min(window, span - window);
      for (int p = 0; p < both; ++p) {
        values[window - 1 - p] = suffix = std::max(suffix, values[window - 1 - p]);
        values[window + p] = prefix = std::max(prefix, values[window + p]);
      }
      for (int p = window - 1 - both; p >= 0; --p) values[p] = suffix = std::max(suffix, values[p]);
      for (int p = window + both; p < span; ++p) values[p] = prefix = std::max(prefix, values[p]);
      float* levels = chunk_levels + static_cast<size_t>(i) * stride;
      levels[0] = values[0];
      for (int t = 1; t < count; ++t) levels[t] = std::max(values[t], values[window + t - 1]);
    }
    // Per column: the strongest local level, the normalised tones, their
    // sum and the tones_per_symbol largest (kept sorted by a max / min
    // exchange, which yields the same values as an insertion). Eight
    // columns at a time in the lanes of a Float8; a column's arithmetic is
    // the same, in the same order, as done one column at a time.
    const Float8 weight = Splat8(norm.cross_frequency_weight);
    const Float8 floor = Splat8(norm.division_floor);
    const auto column_group = [&](int t, Float8* signal, Float8* noise) {
      Float8 strongest = Load8(chunk_levels + t);
      for (int i = 1; i < rows; ++i) {
        strongest = Max8(strongest, Load8(chunk_levels + i * stride + t));
      }
      for (int j = 0; j < top_count; ++j) top[j] = Splat8(-INFINITY);  // descending
      Float8 sum = Splat8(0.0f);
      for (int i = 0; i < rows; ++i) {
        const Float8 level = Load8(chunk_levels + i * stride + t);
        Float8 v = Load8(chunk_raw + static_cast<size_t>(i) * stride + offset + t) /
                   (level + weight * (strongest - level) + floor);
        sum += v;
        for (int j = 0; j < top_count; ++j) {
          const Float8 high = Max8(top[j], v);
          v = Min8(top[j], v);
          top[j] = high;
        }
      }
      Float8 top_sum = Splat8(0.0f);
      for (int j = 0; j < top_count; ++j) top_sum += top[j];
      *signal = top[top_count - 1];  // the k-th smallest value
      *noise = k > 0 ? (sum - top_sum) / Splat8(static_cast<float>(k)) : Splat8(0.0f);
    };
    int t = 0;
    for (; t + 8 <= count; t += 8) {
      Float8 signal, noise;
      column_group(t, &signal, &noise);
      Store8(chunk_signal + t, signal);
      Store8(chunk_noise + t, noise);
    }
    if (t < count) {
      // The last few columns through a padded group (the lanes past
      // `count` read scratch values and are not kept).
      Float8 signal, noise;
      column_group(t, &signal, &noise);
      for (int l = 0; t + l < count; ++l) {
        chunk_signal[t + l] = signal[l];
        chunk_noise[t + l] = noise[l];
      }
    }
    columns_.Write(0, begin_ + c0, chunk_signal, count);
    columns_.Write(1, begin_ + c0, chunk_noise, count);
  }
}

// The normalised scores of every tone at buffer column t; the local levels
// are the maxima over the column's clipped window.
void DtmfDecoder::ToneScoresAt(int t, float* scores) const {
  const ToneNormalizationParams& norm = params_.tone_normalization_params;
  const int length = tone_strength_buffer_size_;
  const int window = static_cast<int>(norm.window_size * baseband_frame_size_);
  const int ahead = std::max(window - 1, 0) / 2;
  const int lo = std::max(0, t + ahead - window + 1);
  const int hi = std::min(length - 1, t + ahead);
  if (params_.use_reference_paths) {
    BlockMaxima::MaxReference(strengths_, begin_ + lo, begin_ + hi, scores);
  } else {
    strength_blocks_.Max(strengths_, begin_ + lo, begin_ + hi, scores);
  }
  float strongest = -INFINITY;
  for (int i = 0; i < num_frequencies_; ++i) strongest = std::max(strongest, scores[i]);
  for (int i = 0; i < num_frequencies_; ++i) {
    const float level = scores[i];
    scores[i] = strengths_.at(i, begin_ + t) /
                (level + norm.cross_frequency_weight * (strongest - level) + norm.division_floor);
  }
}

bool DtmfDecoder::GetToken(DecodeResults* decode_results) {
  if (!initialized_) {
    LOG(ERROR) << "GetToken() called before call to Init().";
    return false;
  }
  CHECK(decode_results);
  decode_results->ClearDiagnostics();
  // Candidates and the table are overwritten in place; an empty answer keeps
  // their storage for later requests.
  const auto nothing = [&] {
    token_selector_->ReleaseCandidates(&decode_results->tokens);
    decode_results->scores_table.setZero();
    return false;
  };
  const int length = tone_strength_buffer_size_;
  if (length == 0) return nothing();

  UpdateColumnScores();
  // Smoothed noise, then the acquisition scores in place.
  // acquisition_ has room for the smoother's padding (reserved at Init).
  acquisition_.resize(smoother_->PaddedLength(length));
  const auto [noise_a, noise_b] = columns_.Pieces(1, begin_, length);
  if (params_.use_reference_paths) {
    smoother_->SmoothReference(noise_a, noise_b, acquisition_.data());
  } else {
    std::copy(noise_a.begin(), noise_a.end(), acquisition_.begin());
    std::copy(noise_b.begin(), noise_b.end(), acquisition_.begin() + noise_a.size());
    smoother_->SmoothInPlace(acquisition_.data(), length);
  }
  acquisition_.resize(length);
  {
    const auto [signal_a, signal_b] = columns_.Pieces(0, begin_, length);
    float* acquisition = acquisition_.data();
    for (const std::span<const float> piece : {signal_a, signal_b}) {
      for (float signal : piece) {
        *acquisition = signal / (1e-12f + *acquisition);
        ++acquisition;
      }
    }
  }
  const std::vector<float>& acquisition_scores = acquisition_;

  // Symbol timing: the phase of the acquisition folded over whole periods.
  const int period = baseband_frame_size_;
  std::fill(folded_.begin(), folded_.end(), 0.0);
  for (int k = 0; k < length / period; ++k) {
    const float* scores = acquisition_scores.data() + static_cast<size_t>(k) * period;
    for (int p = 0; p < period; ++p) folded_[p] += scores[p];
  }
  const std::complex<double> step = std::polar(1.0, 2.0 * std::numbers::pi / period);
  std::complex<double> phasor(1.0, 0.0), sum;
  for (int p = 0; p < period; ++p) {
    sum += folded_[p] * phasor;
    phasor *= step;
  }
  const double angle = std::atan2(sum.imag(), sum.real());
  const int t0 = audio_dsp::PositiveModulo(
      static_cast<int>(std::lround(angle * period / (2.0 * std::numbers::pi))), period);

  // Per-symbol scores at every symbol-spaced time with enough acquisition.
  CHECK(acquisition_scores.size() == static_cast<size_t>(tone_strength_buffer_size_));
  const int alphabet = static_cast<int>(params_.symbol_table.size());
  const float discarded_seconds = static_cast<float>(begin_) / baseband_sample_rate_;
  const int window = static_cast<int>(params_.tone_normalization_params.window_size * period);
  const int ahead = std::max(window - 1, 0) / 2;
  const size_t tones = static_cast<size_t>(num_frequencies_);
  size_t cached = 0;
  next_slot_cache_.positions.clear();
  next_slot_cache_.scores.clear();
  for (int slot = 0, t = t0; t < length; ++slot, t += period) {
    float score = acquisition_scores[t];
    if (t > period && t + period < length) {
      score = std::max(score, std::min(acquisition_scores[t - period],
                                       acquisition_scores[t + period]));
    }
    if (score < params_.acquisition_threshold) continue;
    // Scores of a slot whose window lies inside the buffer come from the
    // last request when it computed them; the values are the same.
    const int64_t position = begin_ + t;
    const bool inside = t + ahead - window + 1 >= 0 && t + ahead <= length - 1;
    while (cached < slot_cache_.positions.size() && slot_cache_.positions[cached] < position) {
      ++cached;
    }
    if (inside && !params_.use_reference_paths && cached < slot_cache_.positions.size() &&
        slot_cache_.positions[cached] == position) {
      std::copy_n(slot_cache_.scores.data() + cached * tones, tones, column_scores_.data());
    } else {
      ToneScoresAt(t, column_scores_.data());
    }
    if (inside) {
      next_slot_cache_.positions.push_back(position);
      next_slot_cache_.scores.insert(next_slot_cache_.scores.end(), column_scores_.begin(),
                                     column_scores_.end());
    }
    slot_scores_.resize(alphabet);
    for (int s = 0; s < alphabet; ++s) {
      float weakest = INFINITY;
      for (int tone : params_.symbol_table[s]) weakest = std::min(weakest, column_scores_[tone]);
      slot_scores_[s] = weakest;
    }
    decode_results->symbol_scores.try_emplace(slot, slot_scores_);
    decode_results->detection_times.push_back(discarded_seconds + t / baseband_sample_rate_);
    decode_results->detection_scores.push_back(score);
  }

  // The selector fills the candidate list in place; those of the right
  // length are kept, in order.
  std::vector<DecodedToken>& candidates = decode_results->tokens;
  std::swap(slot_cache_, next_slot_cache_);
  token_selector_->SelectTokens(decode_results->symbol_scores, &decode_results->scores_table,
                                &candidates);
  size_t kept = 0;
  for (size_t i = 0; i < candidates.size(); ++i) {
    converter_.SymbolsToBytes(candidates[i].symbols, &candidates[i].bytes);
    if (static_cast<int>(candidates[i].bytes.size()) != params_.bytes_in_token) continue;
    if (kept != i) std::swap(candidates[kept], candidates[i]);
    ++kept;
  }
  rejected_.clear();
  while (candidates.size() > kept) {
    rejected_.push_back(std::move(candidates.back()));
    candidates.pop_back();
  }
  token_selector_->ReleaseCandidates(&rejected_);
  return !candidates.empty();
}

}  // namespace audio_sorvane

namespace audio_sorvane {

// The frames of one timing candidate come from TrackFrames. The block sums
// carry the receiver oscillator's phase, which advances by a tone-dependent
// amount from frame to frame while every transmitted frame starts at phase
// 0; turning each frame back by the oscillator phase at its start leaves
// one constant phase per tone, which the room taps absorb.
int DtmfDecoder::FrameAmplitudes(int candidate, int64_t earliest,
                                 audio_dsp::ComplexMatrix* frames) const {
  const int max_frames = params_.room_search.max_frames;
  const int tones = num_frequencies_;
  const int held = frame_count_[candidate];
  // The held frames, oldest first, from the ring.
  const int oldest = (frame_next_[candidate] - held + max_frames) % max_frames;
  int skip = 0;
  while (skip < held &&
         frame_starts_[static_cast<size_t>(candidate) * max_frames + (oldest + skip) % max_frames] <
             earliest) {
    ++skip;
  }
  const int count = held - skip;
  frames->resize(count, tones);
  for (int n = 0; n < count; ++n) {
    const int slot = (oldest + skip + n) % max_frames;
    const int64_t start = frame_starts_[static_cast<size_t>(candidate) * max_frames + slot];
    const std::complex<float>* values =
        &frame_values_[(static_cast<size_t>(candidate) * max_frames + slot) * tones];
    for (int k = 0; k < tones; ++k) {
      const uint32_t phase = static_cast<uint32_t>(start) * frame_phase_steps_[k];
      const double angle = -2.0 * std::numbers::pi * (phase / 4294967296.0);
      (*frames)(n, k) = values[k] * std::complex<float>(static_cast<float>(std::cos(angle)),
                                                        static_cast<float>(std::sin(angle)));
    }
  }
  return count;
}

bool DtmfDecoder::LoopRepeats(int first, int count) const {
  const int frame = baseband_frame_size_;
  const int loop = search_params_.period;
  double xy = 0.0, xx = 0.0, yy = 0.0;
  std::vector<double>& x = repeat_scratch_;
  x.resize(count);
  for (int k = 0; k < num_frequencies_; ++k) {
    double mean = 0.0;
    for (int n = 0; n < count; ++n) {
      x[n] = strengths_.at(k, begin_ + first + n * frame + frame / 2);
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
  const int period = search_params_.period;
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
  // Storage of earlier answers stays for later requests.
  token_selector_->ReleaseCandidates(&decode_results->tokens);
  decode_results->ClearDiagnostics();
  if (!search_supported_) return false;
  const RoomSearchParams& room = params_.room_search;
  const int frame = baseband_frame_size_;
  const int length = tone_strength_buffer_size_;
  const int64_t begin = begin_;
  const int earliest =
      static_cast<int>(std::max<int64_t>(0, int64_t{room.settle_frames} * frame - begin));
  const int loop = search_params_.period;
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
  if (!sequence_search_) sequence_search_ = std::make_unique<ToneSequenceSearch>(search_params_);
  for (int c = 0; c < room.timing_candidates; ++c) {
    // The newest whole frames of this timing inside the buffer, past the
    // settling frames (TrackFrames keeps at most max_frames of them).
    const int count = FrameAmplitudes(c, begin + earliest, &frames);
    if (count < 2 * loop) continue;
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
