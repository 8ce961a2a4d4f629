// Token candidate selection shared by both receivers, and the check symbol
// shared with both transmitters.
//
// A token on the air is a cyclic sequence of symbol_period symbols: the data
// symbols, an optional check symbol and one spacer marking the start. The
// selector thresholds each observed score vector (dropping symbols below a
// third of the best at that position), folds all positions onto one token
// period, prunes the least likely symbols until at most
// max_candidates_to_consider combinations remain, ranks the combinations by
// summed score and returns those with exactly one spacer and a matching
// check symbol, rotated to start after the spacer.
//
// Not thread safe: a selection reuses scratch storage kept by the selector, so
// that steady requests allocate nothing. Invalid parameters and mismatched sizes end
// the process through CHECK; a slot never observed just gives no candidates.
#ifndef AUDIO_SORVANE_TOKEN_SELECTOR_H_
#define AUDIO_SORVANE_TOKEN_SELECTOR_H_

#include <cstdint>
#include <span>
#include <tuple>
#include <vector>

#include "audio/dsp/batch_top_n.h"
#include "audio/dsp/eigen_types.h"
#include "audio/sorvane/decode_results.h"
#include "audio/sorvane/symbol_score_map.h"

namespace audio_sorvane {

// The check symbol appended after the data symbols: with m = alphabet_size - 1
// (the number of data symbols) and S the sum of `symbols`,
// (m - (S mod m)) mod m, which brings the sum to a multiple of m. Always a
// data symbol, never the spacer. Requires alphabet_size >= 2.
int ComputeCheckSymbol(int alphabet_size, std::span<const int> symbols);

// Symbol frames one token takes on the air, its period in a loop: the data
// symbols, the check symbol if there is one, and the spacer.
constexpr int FramesPerToken(int symbols_in_token, bool append_check_symbol) {
  return symbols_in_token + (append_check_symbol ? 1 : 0) + 1;
}

// Seconds one token lasts on the air: `frames_per_token` frames of
// `samples_per_frame` samples at `sample_rate` Hz.
inline float TokenDurationSeconds(int frames_per_token, int samples_per_frame,
                                  float sample_rate) {
  return static_cast<float>(frames_per_token * samples_per_frame) / sample_rate;
}

struct TokenSelectorParams {
  int alphabet_size = 17;  // symbols including the spacer
  int spacer = 16;
  int symbols_in_token = 16;
  bool append_check_symbol = false;
  int max_candidates_to_consider = 128;
  int max_candidates_rank = 6;
  int max_candidates_to_return = 2;
  float token_threshold_factor = 1.0f / 3.0f;
};

class TokenSelector {
 public:
  explicit TokenSelector(const TokenSelectorParams& params);

  // Fills `scores_table` (alphabet_size x symbol_period) and replaces
  // `token_candidates`, best first (possibly none).
  void SelectTokens(const SymbolScoreMap& symbol_scores,
                    audio_dsp::FloatMatrix* scores_table,
                    std::vector<DecodedToken>* token_candidates) const;

  // Empties `token_candidates`, keeping the entries' storage for later
  // selections.
  void ReleaseCandidates(std::vector<DecodedToken>* token_candidates) const;

  int symbol_period() const { return symbol_period_; }
  const TokenSelectorParams& params() const { return params_; }

 private:
  using Entry = std::tuple<float, int, int>;  // value, row, column
  struct Scratch {
    std::vector<int> first_position;
    audio_dsp::FloatVector kept;
    std::vector<int> counts;
    std::vector<Entry> runners_up;
    std::vector<uint64_t> runner_up_keys;
    std::vector<std::vector<int>> choices;
    std::vector<int> odometer;
    std::vector<int> sequence;
    audio_dsp::BatchTopN<int> top{1};
    std::vector<DecodedToken> spare_candidates;
  };

  TokenSelectorParams params_;
  int symbol_period_;
  mutable Scratch scratch_;
};

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_TOKEN_SELECTOR_H_
