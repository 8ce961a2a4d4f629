#include "audio/sorvane/token_selector.h"

#include <algorithm>
#include <cstring>
#include <tuple>

#include "audio/dsp/batch_top_n.h"
#include "base/logging.h"
#include "base/refill.h"

namespace audio_sorvane {

int ComputeCheckSymbol(int alphabet_size, std::span<const int> symbols) {
  CHECK(alphabet_size >= 2);
  const uint32_t m = static_cast<uint32_t>(alphabet_size - 1);
  // Unsigned: the sum wraps instead of overflowing, as on the transmitters.
  uint32_t sum = 0;
  for (int s : symbols) sum += static_cast<uint32_t>(s);
  return static_cast<int>((m - sum % m) % m);
}

TokenSelector::TokenSelector(const TokenSelectorParams& params) : params_(params) {
  CHECK(params_.alphabet_size >= 3);
  CHECK(params_.spacer >= 0);
  CHECK(params_.spacer < params_.alphabet_size);
  CHECK(params_.symbols_in_token > 0);
  CHECK(params_.max_candidates_to_return > 0);
  CHECK(params_.max_candidates_to_consider >= params_.max_candidates_rank);
  CHECK(params_.max_candidates_rank >= params_.max_candidates_to_return);
  CHECK(params_.token_threshold_factor >= 0);
  symbol_period_ = FramesPerToken(params_.symbols_in_token, params_.append_check_symbol);
  scratch_.top = audio_dsp::BatchTopN<int>(params_.max_candidates_rank);
  // Scratch at its largest sizes, so selections never grow it.
  scratch_.runners_up.reserve(static_cast<size_t>(params_.alphabet_size) * symbol_period_);
  scratch_.runner_up_keys.reserve(scratch_.runners_up.capacity());
  scratch_.choices.resize(symbol_period_);
  for (std::vector<int>& choices : scratch_.choices) choices.reserve(params_.alphabet_size);
  scratch_.spare_candidates.resize(params_.max_candidates_to_return);
  for (DecodedToken& spare : scratch_.spare_candidates) {
    spare.symbols.reserve(symbol_period_);
    spare.bytes.reserve(symbol_period_);  // a byte takes at least one symbol
  }
}

void TokenSelector::ReleaseCandidates(std::vector<DecodedToken>* token_candidates) const {
  CHECK(token_candidates);
  while (!token_candidates->empty()) {
    scratch_.spare_candidates.push_back(std::move(token_candidates->back()));
    token_candidates->pop_back();
  }
}

void TokenSelector::SelectTokens(const SymbolScoreMap& symbol_scores,
                                 audio_dsp::FloatMatrix* scores_table,
                                 std::vector<DecodedToken>* token_candidates) const {
  CHECK(scores_table);
  CHECK(token_candidates);
  // Candidates overwrite the entries already in the list, keeping their
  // storage; on every way out the list is cut to the new count, the entries
  // cut off kept as spares for later selections.
  sorvel_base::Refill<DecodedToken> candidates(token_candidates, &scratch_.spare_candidates);
  const int rows = params_.alphabet_size;
  const int period = symbol_period_;
  Scratch& s = scratch_;

  // Threshold each position, normalise it and fold it onto the period.
  scores_table->setZero(rows, period);
  s.first_position.assign(period, -1);
  for (const auto& [position, scores] : symbol_scores) {
    CHECK(scores.size() == params_.alphabet_size);
    const float threshold = params_.token_threshold_factor * scores.maxCoeff();
    s.kept = (scores.array() - threshold).max(0.0f).matrix();
    const float sum = s.kept.sum();
    if (sum != 0.0f) s.kept /= sum;
    const int column = ((position % period) + period) % period;
    scores_table->col(column) += s.kept;
    if (s.first_position[column] == -1) s.first_position[column] = position;
  }
  for (int c = 0; c < period; ++c) {
    const float sum = scores_table->col(c).sum();
    if (sum != 0.0f) scores_table->col(c) /= sum;
  }
  if (std::find(s.first_position.begin(), s.first_position.end(), -1) !=
      s.first_position.end()) {
    return;  // a slot never observed
  }

  // Prune the weakest runners-up until few enough combinations remain. The
  // best entry of each column always stays. Runners-up go in ascending
  // (value, row, column) order: the order a min-heap would pop them in
  // (entries are distinct), for the price of one sort.
  const int limit = params_.max_candidates_to_consider;
  s.counts.assign(period, 0);
  std::vector<Entry>& runners_up = s.runners_up;
  runners_up.clear();
  for (int c = 0; c < period; ++c) {
    int best = 0;
    for (int r = 0; r < rows; ++r) {
      if ((*scores_table)(r, c) > (*scores_table)(best, c)) best = r;
    }
    for (int r = 0; r < rows; ++r) {
      const float v = (*scores_table)(r, c);
      if (v > 0.0f) {
        ++s.counts[c];
        if (r != best) runners_up.emplace_back(v, r, c);
      }
    }
  }
  const auto combinations = [&] {
    int64_t product = 1;
    for (int count : s.counts) product = std::min<int64_t>(product * count, limit + 1);
    return product;
  };
  if (combinations() > limit && (rows > 0xffff || period > 0xffff)) {
    std::sort(runners_up.begin(), runners_up.end());
    for (const auto& [value, r, c] : runners_up) {
      (*scores_table)(r, c) = 0.0f;
      --s.counts[c];
      if (combinations() <= limit) break;
    }
  } else if (combinations() > limit) {
    // Values are positive floats, whose bit patterns order like the values:
    // (value bits, row, column) packed into one integer sorts in the
    // tuples' order.
    std::vector<uint64_t>& keys = s.runner_up_keys;
    keys.clear();
    for (const auto& [value, r, c] : runners_up) {
      // memcpy rather than std::bit_cast, which the browser build's libc++
      // lacks.
      uint32_t bits;
      std::memcpy(&bits, &value, sizeof(bits));
      keys.push_back(uint64_t{bits} << 32 |
                     static_cast<uint64_t>(r) << 16 | static_cast<uint64_t>(c));
    }
    std::sort(keys.begin(), keys.end());
    for (const uint64_t key : keys) {
      const int r = static_cast<int>(key >> 16 & 0xffff), c = static_cast<int>(key & 0xffff);
      (*scores_table)(r, c) = 0.0f;
      --s.counts[c];
      if (combinations() <= limit) break;
    }
  }

  // Enumerate the combinations as an odometer, column 0 fastest; the best
  // are kept by their number in that order.
  CHECK(scores_table->rows() == params_.alphabet_size);
  CHECK(scores_table->cols() == symbol_period_);
  s.choices.resize(period);
  for (int c = 0; c < period; ++c) {
    s.choices[c].clear();
    for (int r = 0; r < rows; ++r) {
      if ((*scores_table)(r, c) > 0.0f) s.choices[c].push_back(r);
    }
    if (s.choices[c].empty()) return;
  }
  s.top.Clear();
  s.odometer.assign(period, 0);
  for (int visited = 0; visited < limit; ++visited) {
    float score = 0.0f;
    for (int c = 0; c < period; ++c) score += (*scores_table)(s.choices[c][s.odometer[c]], c);
    s.top.Add(score, visited);
    int c = 0;
    while (c < period && ++s.odometer[c] == static_cast<int>(s.choices[c].size())) {
      s.odometer[c++] = 0;
    }
    if (c == period) break;  // wrapped: every combination visited
  }

  // Keep candidates with exactly one spacer and a matching check symbol,
  // rotated to start right after the spacer.
  std::vector<int>& sequence = s.sequence;
  for (const auto& [score, number] : s.top.Sorted()) {
    sequence.resize(period);
    for (int c = 0, rest = number; c < period; ++c) {
      const int size = static_cast<int>(s.choices[c].size());
      sequence[c] = s.choices[c][rest % size];
      rest /= size;
    }
    if (std::count(sequence.begin(), sequence.end(), params_.spacer) != 1) continue;
    const int k = static_cast<int>(
        std::find(sequence.begin(), sequence.end(), params_.spacer) - sequence.begin());
    std::rotate(sequence.begin(), sequence.begin() + k, sequence.end());
    sequence.erase(sequence.begin());
    if (params_.append_check_symbol) {
      const int check = sequence.back();
      sequence.pop_back();
      if (check != ComputeCheckSymbol(params_.alphabet_size, sequence)) continue;
    }
    DecodedToken& candidate = candidates.Next();
    candidate.symbols.assign(sequence.begin(), sequence.end());
    candidate.score = score;
    candidate.bytes.clear();
    candidate.position = s.first_position[k];
    if (static_cast<int>(candidates.count()) == params_.max_candidates_to_return) break;
  }
}

}  // namespace audio_sorvane
