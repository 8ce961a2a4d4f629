#include "audio/audio_modem_decoder.h"

#include <algorithm>
#include <cmath>
#include <utility>

#include "audio/sorvane/crc16_coder.h"
#include "base/logging.h"
#include "base/refill.h"

namespace audio_sorvane {

AudioModemDecoder::AudioModemDecoder(std::unique_ptr<SorvaneDecoder> dsss_decoder)
    : kind_(kDsss) {
  CHECK(dsss_decoder);
  dsss_decoder_ = std::move(dsss_decoder);
  token_length_bytes_ = dsss_decoder_->token_length_bytes();
}

AudioModemDecoder::AudioModemDecoder(std::unique_ptr<HotsoundDecoder> hotsound_decoder)
    : kind_(kHotsound) {
  CHECK(hotsound_decoder);
  hotsound_decoder_ = std::move(hotsound_decoder);
  token_length_bytes_ = hotsound_decoder_->token_length_bytes();
}

AudioModemDecoder::AudioModemDecoder(std::unique_ptr<DtmfDecoder> dtmf_decoder)
    : kind_(kDtmf) {
  CHECK(dtmf_decoder);
  dtmf_decoder_ = std::move(dtmf_decoder);
  token_length_bytes_ = dtmf_decoder_->params().bytes_in_token;
}

void AudioModemDecoder::Initialize(int num_channels, float input_sample_rate) {
  num_channels_ = num_channels;
  input_sample_rate_ = input_sample_rate;
  switch (kind_) {
    case kDsss:
      dsss_decoder_->Initialize(num_channels, input_sample_rate);
      break;
    case kHotsound:
      hotsound_decoder_->Initialize(num_channels, input_sample_rate);
      break;
    case kDtmf:
      dtmf_decoder_->Init(num_channels, input_sample_rate);
      break;
  }
}

void AudioModemDecoder::ProcessSamples(std::span<const float> samples) {
  switch (kind_) {
    case kDsss:
      dsss_decoder_->ProcessSamples(samples);
      break;
    case kDtmf:
      dtmf_decoder_->ProcessSamples(samples);
      break;
    case kHotsound:
      int16_samples_.resize(samples.size());
      for (size_t i = 0; i < samples.size(); ++i) {
        // Clamped (NaN to -32768) and then truncated by the conversion: the
        // same values as std::trunc, without its library call per sample.
        float v = samples[i] > -32768.0f ? samples[i] : -32768.0f;
        v = v < 32767.0f ? v : 32767.0f;
        int16_samples_[i] = static_cast<int16_t>(static_cast<int32_t>(v));
      }
      hotsound_decoder_->ProcessSamples(int16_samples_.data(),
                                        static_cast<int>(int16_samples_.size()));
      break;
  }
}

void AudioModemDecoder::ProcessPcm16(const int16_t* samples, int count) {
  // The detector takes 16-bit samples as they are.
  if (kind_ == kHotsound) {
    hotsound_decoder_->ProcessSamples(samples, std::max(count, 0));
    return;
  }
  float_samples_.assign(samples, samples + std::max(count, 0));
  ProcessSamples(float_samples_);
}

void AudioModemDecoder::FinishInput() {
  constexpr double kSilenceSeconds = 0.5;
  if (input_sample_rate_ <= 0.0f) return;  // not initialised: nothing buffered
  // In 10 ms blocks, as audio arrives.
  const int block_frames = std::max(1, static_cast<int>(input_sample_rate_ / 100));
  const int frames = static_cast<int>(std::lround(kSilenceSeconds * input_sample_rate_));
  float_samples_.assign(static_cast<size_t>(block_frames) * num_channels_, 0.0f);
  for (int fed = 0; fed < frames; fed += block_frames) ProcessSamples(float_samples_);
}

void AudioModemDecoder::ProcessSamplesInt16(const int16_t* samples, int count) {
  if (kind_ == kHotsound) hotsound_decoder_->ProcessSamples(samples, count);
}

bool AudioModemDecoder::DecodeTokens(DecodeResults* decode_results, int num_message_bytes,
                                     int num_crc_check_bytes) {
  CHECK(decode_results);
  if (num_message_bytes + num_crc_check_bytes != token_length_bytes_) {
    LOG(ERROR) << "num_message_bytes and num_crc_check_bytes "
               << "do not add to correct value";
    return false;
  }
  if (num_message_bytes < 1) {
    LOG(ERROR) << "num_message_bytes must be positive";
    return false;
  }
  if (num_crc_check_bytes < 0) {
    LOG(ERROR) << "num_crc_check_bytes must be non-negative";
    return false;
  }
  // Results overwrite the entries already in the list, keeping their
  // storage, so that steady requests allocate nothing.
  sorvel_base::Refill<TokenResult> tokens(&decode_results->tokens, &spare_tokens_);
  const auto add = [&](const DecodedToken& candidate, size_t num_bytes) {
    TokenResult& token = tokens.Next();
    token.bytes.assign(candidate.bytes.begin(), candidate.bytes.begin() + num_bytes);
    token.position = candidate.position;
    token.score_millis = static_cast<int32_t>(std::lround(candidate.score * 1000.0f));
  };

  audio_sorvane::DecodeResults& raw = raw_;
  raw.detection_times.reserve(256);  // see below
  raw.detection_scores.reserve(256);
  bool found = false;
  switch (kind_) {
    case kDsss:
      found = dsss_decoder_->GetToken(&raw);
      break;
    case kHotsound:
      found = hotsound_decoder_->DecodeTokens(&raw);
      break;
    case kDtmf:
      found = dtmf_decoder_->GetToken(&raw);
      break;
  }
  // In a reverberant room the energy scores of the multi-tone receiver
  // may give no candidate that passes the CRC; its coherent room-model
  // search is then asked as well. The CRC decides, so this is only done
  // when check bytes are present.
  const bool try_room = kind_ == kDtmf && num_crc_check_bytes == 2;
  if (!found && !try_room) return false;

  if (num_crc_check_bytes == 0) {
    for (const DecodedToken& candidate : raw.tokens) add(candidate, candidate.bytes.size());
    return true;
  }
  if (num_crc_check_bytes == 2) {
    const Crc16Coder coder({.num_message_bytes = num_message_bytes});
    for (const DecodedToken& candidate : raw.tokens) {
      if (!coder.Verify(candidate.bytes)) continue;
      add(candidate, candidate.bytes.size() - 2);
    }
    // Room for a buffer's worth of detections up front, so that later
    // requests do not grow the lists.
    constexpr size_t kDetections = 256;
    decode_results->detection_times.reserve(kDetections);
    decode_results->detection_scores.reserve(kDetections);
    decode_results->detection_times.assign(raw.detection_times.begin(),
                                           raw.detection_times.end());
    decode_results->detection_scores.assign(raw.detection_scores.begin(),
                                            raw.detection_scores.end());
    if (tokens.count() == 0 && try_room && dtmf_decoder_->GetReverberantToken(&raw)) {
      for (const DecodedToken& candidate : raw.tokens) {
        if (!coder.Verify(candidate.bytes)) continue;
        add(candidate, candidate.bytes.size() - 2);
        break;  // the best fit that passes: later ones only add false-pass risk
      }
    }
    return tokens.count() > 0;
  }
  LOG(ERROR) << "Unsupported value for num_crc_check_bytes";
  return false;
}

bool AudioModemDecoder::DetectBroadcaster() {
  switch (kind_) {
    case kDsss:
      return dsss_decoder_->DetectBroadcaster();
    case kHotsound:
      return hotsound_decoder_->DetectBroadcaster();
    case kDtmf:
      return false;
  }
  return false;
}

void AudioModemDecoder::WipeInternalData() {
  switch (kind_) {
    case kDsss:
      dsss_decoder_->WipeInternalData();
      break;
    case kHotsound:
      hotsound_decoder_->WipeInternalData();
      break;
    case kDtmf:
      dtmf_decoder_->Reset();
      break;
  }
}

int AudioModemDecoder::GetMaxSafeInputSize() const {
  switch (kind_) {
    case kDsss:
      return dsss_decoder_->GetMaxSafeInputSize();
    case kHotsound:
      return hotsound_decoder_->GetMaxSafeInputSize();
    case kDtmf:
      return dtmf_decoder_->GetMaxSafeInputSize();
  }
  return 0;
}

}  // namespace audio_sorvane
