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
// Immutable after construction. Invalid parameters and mismatched sizes end
// the process through CHECK; a slot never observed just gives no candidates.
#ifndef AUDIO_SORVANE_TOKEN_SELECTOR_H_
#define AUDIO_SORVANE_TOKEN_SELECTOR_H_

#include <cstdint>
#include <map>
#include <span>
#include <vector>

#include "audio/dsp/eigen_types.h"

namespace audio_sorvane {

// The check symbol appended after the data symbols: with m = alphabet_size - 1
// (the number of data symbols) and S the sum of `symbols`,
// (m - (S mod m)) mod m, which brings the sum to a multiple of m. Always a
// data symbol, never the spacer. Requires alphabet_size >= 2.
int ComputeCheckSymbol(int alphabet_size, std::span<const int> symbols);

// A token candidate.
struct DecodedToken {
  std::vector<int> symbols;    // data symbols, from right after the spacer
  float score = 0.0f;          // summed normalised scores
  std::vector<uint8_t> bytes;  // filled by the receivers
  int position = 0;            // where the candidate's spacer was observed
};

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

// Symbol position (a running symbol index) -> one score per symbol value.
using SymbolScoreMap = std::map<int, audio_dsp::FloatVector>;

class TokenSelector {
 public:
  explicit TokenSelector(const TokenSelectorParams& params);

  // Fills `scores_table` (alphabet_size x symbol_period) and replaces
  // `token_candidates`, best first (possibly none).
  void SelectTokens(const SymbolScoreMap& symbol_scores,
                    audio_dsp::FloatMatrix* scores_table,
                    std::vector<DecodedToken>* token_candidates) const;

  int symbol_period() const { return symbol_period_; }
  const TokenSelectorParams& params() const { return params_; }

 private:
  TokenSelectorParams params_;
  int symbol_period_;
};

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_TOKEN_SELECTOR_H_
