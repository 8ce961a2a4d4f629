// The multi-tone transmitter: a token becomes one burst of frames, a spacer
// frame first, then one frame per data symbol (least significant digit
// first) and optionally a checksum frame. A frame sounds its symbol's tones
// together, each starting at phase zero, shaped by the frame window; the
// burst is scaled to a peak of max_amplitude. No phase is carried between
// frames or tokens, so equal tokens give equal samples.
//
// Immutable after construction. Parameter faults, wrong token lengths and
// invalid symbol sequences end the process through CHECK.
#ifndef AUDIO_SORVANE_DTMF_DTMF_ENCODER_H_
#define AUDIO_SORVANE_DTMF_DTMF_ENCODER_H_

#include <cstdint>
#include <vector>

#include "audio/sorvane/dtmf/byte_symbol_converter.h"
#include "audio/sorvane/dtmf/dtmf_encoder_params.h"

namespace audio_sorvane {

class DtmfEncoder {
 public:
  // Validates `params`; an empty window becomes the half-sine window.
  explicit DtmfEncoder(const DtmfEncoderParams& params);

  // Replaces `audio_samples` with the burst of a bytes_in_token-byte token.
  void EncodeToken(const std::vector<uint8_t>& bytes,
                   std::vector<float>* audio_samples) const;
  // The same from the data symbols.
  void EncodeSymbols(const std::vector<int>& token_message_symbols,
                     std::vector<float>* audio_samples) const;
  // True for symbols_in_token data symbols (no spacer) whose value fits in
  // bytes_in_token bytes.
  bool IsValidSymbolSequence(const std::vector<int>& symbols) const;

  const DtmfEncoderParams& params() const { return params_; }
  int frame_size() const { return frame_size_; }

 private:
  // Appends the windowed frame of `symbol` to `result`.
  void SynthesizeFrame(int symbol, std::vector<float>* result) const;

  DtmfEncoderParams params_;
  int alphabet_size_;
  ByteSymbolConverter converter_;
  int frame_size_;
};

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_DTMF_DTMF_ENCODER_H_
