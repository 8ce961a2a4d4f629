// The one entry point that turns a token into audio, whichever scheme was
// configured: checks the caller's message/CRC split against the token length
// the encoder transmits, appends CRC-16 check bytes when asked for, and hands
// the full token to the DSSS or multi-tone encoder.
//
// Rejected input is logged at ERROR and leaves the output untouched; the
// caller sees empty audio. Not thread safe.
#ifndef AUDIO_AUDIO_MODEM_ENCODER_H_
#define AUDIO_AUDIO_MODEM_ENCODER_H_

#include <cstdint>
#include <memory>
#include <span>
#include <vector>

#include "audio/sorvane/dtmf/dtmf_encoder.h"
#include "audio/sorvane/sorvane_encoder.h"

namespace audio_sorvane {

class AudioModemEncoder {
 public:
  enum Kind : int { kDsss = 0, kDtmf = 1 };

  explicit AudioModemEncoder(std::unique_ptr<SorvaneEncoder> dsss_encoder);
  explicit AudioModemEncoder(std::unique_ptr<DtmfEncoder> dtmf_encoder);

  // Encodes token_bytes (the message) followed by num_crc_check_bytes (0 or
  // 2) CRC-16 bytes; together they must make token_length_bytes(). Audio is
  // float at full scale +-1.0 at OutputSampleRate().
  void Encode(const std::vector<uint8_t>& token_bytes,
              std::vector<float>* audio_samples, int num_crc_check_bytes) const;

  // The fade-in to play before looping `audio_samples` (DSSS); always empty
  // for the multi-tone scheme.
  void MakeStartTransition(std::span<const float> audio_samples,
                           std::vector<float>* transition) const;
  // The fade-out to play after the last repetition (DSSS); empty otherwise.
  void MakeStopTransition(std::span<const float> audio_samples,
                          std::vector<float>* transition) const;

  float OutputSampleRate() const;
  Kind kind() const { return kind_; }
  // Message plus check bytes that one token carries.
  int token_length_bytes() const { return token_length_bytes_; }
  // The scheme encoder in use; the other one is null.
  const SorvaneEncoder* dsss_encoder() const { return dsss_encoder_.get(); }
  const DtmfEncoder* dtmf_encoder() const { return dtmf_encoder_.get(); }

 private:
  using TransitionMaker = bool (SorvaneEncoder::*)(std::span<const float>,
                                                   std::vector<float>*) const;
  // The DSSS encoder's transition, or an empty one for the multi-tone scheme.
  void Transition(TransitionMaker make, std::span<const float> audio_samples,
                  std::vector<float>* transition) const;
  std::unique_ptr<SorvaneEncoder> dsss_encoder_;
  std::unique_ptr<DtmfEncoder> dtmf_encoder_;
  Kind kind_;
  int token_length_bytes_;
};

}  // namespace audio_sorvane

#endif  // AUDIO_AUDIO_MODEM_ENCODER_H_
