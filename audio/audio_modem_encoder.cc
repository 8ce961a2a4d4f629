#include "audio/audio_modem_encoder.h"

#include <utility>

#include "audio/sorvane/crc16_coder.h"
#include "base/logging.h"

namespace audio_sorvane {

AudioModemEncoder::AudioModemEncoder(std::unique_ptr<SorvaneEncoder> dsss_encoder)
    : kind_(kDsss), token_length_bytes_(0) {
  CHECK(dsss_encoder);
  dsss_encoder_ = std::move(dsss_encoder);
  token_length_bytes_ = dsss_encoder_->symbol_wave_coder().params().bits_per_symbol *
                        dsss_encoder_->params().num_symbols / 8;
}

AudioModemEncoder::AudioModemEncoder(std::unique_ptr<DtmfEncoder> dtmf_encoder)
    : kind_(kDtmf), token_length_bytes_(0) {
  CHECK(dtmf_encoder);
  dtmf_encoder_ = std::move(dtmf_encoder);
  token_length_bytes_ = dtmf_encoder_->params().bytes_in_token;
}

void AudioModemEncoder::Encode(const std::vector<uint8_t>& token_bytes,
                               std::vector<float>* audio_samples,
                               int num_crc_check_bytes) const {
  if (static_cast<int>(token_bytes.size()) + num_crc_check_bytes !=
      token_length_bytes_) {
    LOG(ERROR) << "token_bytes.size() and num_crc_check_bytes "
               << "do not add to correct value";
    return;
  }
  if (num_crc_check_bytes < 0) {
    LOG(ERROR) << "num_crc_check_bytes must be non-negative";
    return;
  }
  std::vector<uint8_t> token = token_bytes;
  if (num_crc_check_bytes == 2) {
    Crc16Coder({.num_message_bytes = static_cast<int>(token_bytes.size())})
        .Encode(&token);
  } else if (num_crc_check_bytes != 0) {
    LOG(ERROR) << "Unsupported value for num_crc_check_bytes";
    return;
  }
  if (kind_ == kDtmf) {
    dtmf_encoder_->EncodeToken(token, audio_samples);
  } else {
    dsss_encoder_->Encode(token, audio_samples);
  }
}

void AudioModemEncoder::MakeStartTransition(std::span<const float> audio_samples,
                                            std::vector<float>* transition) const {
  Transition(&SorvaneEncoder::MakeStartTransition, audio_samples, transition);
}

void AudioModemEncoder::MakeStopTransition(std::span<const float> audio_samples,
                                           std::vector<float>* transition) const {
  Transition(&SorvaneEncoder::MakeStopTransition, audio_samples, transition);
}

void AudioModemEncoder::Transition(TransitionMaker make, std::span<const float> audio_samples,
                                   std::vector<float>* transition) const {
  if (kind_ == kDsss) {
    (dsss_encoder_.get()->*make)(audio_samples, transition);
  } else if (transition != nullptr) {
    transition->clear();
  }
}

float AudioModemEncoder::OutputSampleRate() const {
  switch (kind_) {
    case kDsss:
      return dsss_encoder_->params().broadcast_sample_rate;
    case kDtmf:
      return dtmf_encoder_->params().sample_rate;
  }
  return 0.0f;
}

}  // namespace audio_sorvane
