#include "audio/sorvane/token_selector.h"

#include <algorithm>
#include <queue>
#include <tuple>

#include "audio/dsp/batch_top_n.h"
#include "base/logging.h"

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
  symbol_period_ = params_.symbols_in_token + (params_.append_check_symbol ? 1 : 0) + 1;
}

void TokenSelector::SelectTokens(const SymbolScoreMap& symbol_scores,
                                 audio_dsp::FloatMatrix* scores_table,
                                 std::vector<DecodedToken>* token_candidates) const {
  CHECK(scores_table);
  CHECK(token_candidates);
  token_candidates->clear();
  const int rows = params_.alphabet_size;
  const int period = symbol_period_;

  // Threshold each position, normalise it and fold it onto the period.
  scores_table->setZero(rows, period);
  std::vector<int> first_position(period, -1);
  for (const auto& [position, scores] : symbol_scores) {
    CHECK(scores.size() == params_.alphabet_size);
    const float threshold = params_.token_threshold_factor * scores.maxCoeff();
    audio_dsp::FloatVector kept = (scores.array() - threshold).max(0.0f).matrix();
    const float sum = kept.sum();
    if (sum != 0.0f) kept /= sum;
    const int column = ((position % period) + period) % period;
    scores_table->col(column) += kept;
    if (first_position[column] == -1) first_position[column] = position;
  }
  for (int c = 0; c < period; ++c) {
    const float sum = scores_table->col(c).sum();
    if (sum != 0.0f) scores_table->col(c) /= sum;
  }
  if (std::find(first_position.begin(), first_position.end(), -1) != first_position.end()) {
    return;  // a slot never observed
  }

  // Prune the weakest runners-up until few enough combinations remain. The
  // best entry of each column always stays.
  const int limit = params_.max_candidates_to_consider;
  std::vector<int> counts(period, 0);
  using Entry = std::tuple<float, int, int>;  // value, row, column
  std::priority_queue<Entry, std::vector<Entry>, std::greater<Entry>> runners_up;
  for (int c = 0; c < period; ++c) {
    int best = 0;
    for (int r = 0; r < rows; ++r) {
      if ((*scores_table)(r, c) > (*scores_table)(best, c)) best = r;
    }
    for (int r = 0; r < rows; ++r) {
      const float v = (*scores_table)(r, c);
      if (v > 0.0f) {
        ++counts[c];
        if (r != best) runners_up.emplace(v, r, c);
      }
    }
  }
  const auto combinations = [&] {
    int64_t product = 1;
    for (int count : counts) product = std::min<int64_t>(product * count, limit + 1);
    return product;
  };
  while (combinations() > limit && !runners_up.empty()) {
    const auto [value, r, c] = runners_up.top();
    runners_up.pop();
    (*scores_table)(r, c) = 0.0f;
    --counts[c];
  }

  // Enumerate the combinations as an odometer, column 0 fastest.
  CHECK(scores_table->rows() == params_.alphabet_size);
  CHECK(scores_table->cols() == symbol_period_);
  std::vector<std::vector<int>> choices(period);
  for (int c = 0; c < period; ++c) {
    for (int r = 0; r < rows; ++r) {
      if ((*scores_table)(r, c) > 0.0f) choices[c].push_back(r);
    }
    if (choices[c].empty()) return;
  }
  audio_dsp::BatchTopN<std::vector<int>> top(params_.max_candidates_rank);
  std::vector<int> odometer(period, 0);
  std::vector<int> symbols(period);
  for (int visited = 0; visited < limit; ++visited) {
    float score = 0.0f;
    for (int c = 0; c < period; ++c) {
      symbols[c] = choices[c][odometer[c]];
      score += (*scores_table)(symbols[c], c);
    }
    top.Add(score, symbols);
    int c = 0;
    while (c < period && ++odometer[c] == static_cast<int>(choices[c].size())) {
      odometer[c++] = 0;
    }
    if (c == period) break;  // wrapped: every combination visited
  }

  // Keep candidates with exactly one spacer and a matching check symbol,
  // rotated to start right after the spacer.
  for (auto& [score, sequence] : top.Take()) {
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
    token_candidates->push_back(
        {std::move(sequence), score, {}, first_position[k]});
    if (static_cast<int>(token_candidates->size()) == params_.max_candidates_to_return) {
      break;
    }
  }
}

}  // namespace audio_sorvane
