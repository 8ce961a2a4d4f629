// What the receivers return: token candidates (DecodedToken) and, per token
// request, the candidates with the diagnostics behind them (DecodeResults).
// Filled by the token selector and by both receivers.
//
// Plain records, not thread safe; no preconditions.
#ifndef AUDIO_SORVANE_DECODE_RESULTS_H_
#define AUDIO_SORVANE_DECODE_RESULTS_H_

#include <cstdint>
#include <vector>

#include "audio/dsp/eigen_types.h"
#include "audio/sorvane/symbol_score_map.h"

namespace audio_sorvane {

// A token candidate.
struct DecodedToken {
  std::vector<int> symbols;    // data symbols, from right after the spacer
  float score = 0.0f;          // summed normalised scores
  std::vector<uint8_t> bytes;  // filled by the receivers
  int position = 0;            // where the candidate's spacer was observed
};

// What one token request returns.
struct DecodeResults {
  std::vector<DecodedToken> tokens;
  // Diagnostics: the chosen group's detection times (s) and filtered scores.
  std::vector<float> detection_times;
  std::vector<float> detection_scores;
  SymbolScoreMap symbol_scores;
  audio_dsp::FloatMatrix scores_table;

  // Empties everything, keeping allocated capacity for the next request.
  void Clear() {
    tokens.clear();
    scores_table.resize(0, 0);
    ClearDiagnostics();
  }
  // Empties the detections and symbol scores, leaving the candidates and the
  // table for the token selector to overwrite in place.
  void ClearDiagnostics() {
    detection_times.clear();
    detection_scores.clear();
    symbol_scores.clear();
  }
};

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_DECODE_RESULTS_H_
