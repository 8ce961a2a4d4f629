// The DSSS transmitter: token bytes -> symbols -> concatenated frames (start
// frame first) -> optional high-pass at the carrier -> resampling to the
// broadcast rate -> peak normalisation. Also makes the short fade-in played
// before a looped broadcast and the fade-out that ends one.
//
// Immutable after construction (shares the read-only SymbolWaveCoder).
// Wrong symbol counts and null outputs are logged errors with a false result;
// construction faults end the process through CHECK.
#ifndef AUDIO_SORVANE_SORVANE_ENCODER_H_
#define AUDIO_SORVANE_SORVANE_ENCODER_H_

#include <cstdint>
#include <memory>
#include <span>
#include <vector>

#include "audio/sorvane/symbol_wave_coder.h"
#include "audio/sorvane/token_symbol_converter.h"
#include "base/validation.h"

namespace audio_sorvane {

struct SorvaneEncoderParams {
  // Symbols per token: (8 / bits_per_symbol) * token bytes.
  int num_symbols = 16;
  // Append ComputeCheckSymbol of the data symbols after them.
  bool append_check_symbol = false;
  // Remove everything below the carrier frequency.
  bool high_pass_at_carrier = false;
  // Absolute peak of the finished waveform, full scale 1.0.
  float peak_amplitude = 0.5f;
  // Length of the start transition, seconds.
  float transition_duration = 0.005f;
  // Output rate in Hz; must be set (> 0).
  float broadcast_sample_rate = 0.0f;
};

// Refuses a record the encoder cannot be built from (the constructor ends
// the process on it).
sorvel_base::Validation ValidateSorvaneEncoderParams(const SorvaneEncoderParams& params);

class SorvaneEncoder {
 public:
  SorvaneEncoder(std::shared_ptr<const SymbolWaveCoder> symbol_wave_coder,
                 const SorvaneEncoderParams& params);

  // Encodes a token of num_symbols * bits_per_symbol / 8 bytes.
  bool Encode(const std::vector<uint8_t>& token_bytes,
              std::vector<float>* output) const;
  // Encodes num_symbols data symbols; replaces `output` with
  // (num_symbols + check + 1) frames at the broadcast rate.
  bool EncodeSymbols(const std::vector<int>& symbols,
                     std::vector<float>* output) const;

  // A fade-in of round(broadcast_sample_rate * transition_duration) samples
  // taken from the end of `input` seen as periodic, so that it leads straight
  // into the first sample of the looped waveform: output[i] =
  // (i + 1) / (n + 1) * input[(L - n + i) mod L].
  bool MakeStartTransition(std::span<const float> input,
                           std::vector<float>* output) const;
  // The mirror image: a fade-out over the head of the waveform, played after
  // the last full repetition: output[i] = (n - i) / (n + 1) * input[i mod L].
  bool MakeStopTransition(std::span<const float> input,
                          std::vector<float>* output) const;

  const SymbolWaveCoder& symbol_wave_coder() const { return *symbol_wave_coder_; }
  const SorvaneEncoderParams& params() const { return params_; }

 private:
  int TransitionLength() const;

  std::shared_ptr<const SymbolWaveCoder> symbol_wave_coder_;
  std::unique_ptr<TokenSymbolConverter> converter_;
  SorvaneEncoderParams params_;
};

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_SORVANE_ENCODER_H_
