#include "audio/jni/decoder_registry.h"

#include <algorithm>
#include <utility>

#include "base/logging.h"

namespace audio_sorvane {

DecoderRegistry& DecoderRegistry::Get() {
  static auto* registry = new DecoderRegistry();
  return *registry;
}

std::unique_ptr<AudioModemDecoder>& DecoderRegistry::Slot(int decoder_id) {
  if (decoder_id == -1) return default_decoder_;
  CHECK(decoder_id >= 0 && decoder_id < static_cast<int>(decoders_.size()));
  return decoders_[decoder_id];
}

void DecoderRegistry::Store(int decoder_id, std::unique_ptr<AudioModemDecoder> decoder) {
  if (decoder_id >= static_cast<int>(decoders_.size())) decoders_.resize(decoder_id + 1);
  // The old decoder goes when `old` does, after the new one is in place.
  std::unique_ptr<AudioModemDecoder> old = std::exchange(Slot(decoder_id), std::move(decoder));
}

AudioModemDecoder* DecoderRegistry::Find(int decoder_id) { return Slot(decoder_id).get(); }

AudioModemDecoder* DecoderRegistry::Lookup(int decoder_id, const char* operation) {
  AudioModemDecoder* decoder = Find(decoder_id);
  if (decoder == nullptr) {
    LOG(ERROR) << operation << ": no decoder with id " << decoder_id;
  }
  return decoder;
}

bool DecoderRegistry::InitializeDsss(int decoder_id, const DsssDecoderConfig& config) {
  Store(decoder_id, MakeDsssDecoder(config));
  return true;
}

bool DecoderRegistry::InitializeDtmf(int decoder_id, const DtmfDecoderConfig& config) {
  std::unique_ptr<AudioModemDecoder> decoder = MakeDtmfDecoder(config);
  if (!decoder) return false;  // refused ADSR window: registry unchanged
  Store(decoder_id, std::move(decoder));
  return true;
}

void DecoderRegistry::ProcessSamples(int decoder_id, const int16_t* samples, int count) {
  AudioModemDecoder* decoder = Lookup(decoder_id, "ProcessSamples");
  if (decoder == nullptr) return;
  decoder->ProcessPcm16(samples, count);
}

void DecoderRegistry::ProcessSamplesWithHotsound(int decoder_id, const int16_t* samples,
                                                 int count) {
  AudioModemDecoder* decoder = Lookup(decoder_id, "ProcessSamplesWithHotsound");
  if (decoder == nullptr) return;
  decoder->ProcessSamplesInt16(samples, count);
}

bool DecoderRegistry::DecodeTokens(int decoder_id,
                                   AudioModemDecoder::DecodeResults* decode_results,
                                   int num_message_bytes, int num_crc_check_bytes) {
  AudioModemDecoder* decoder = Lookup(decoder_id, "GetTokens");
  if (decoder == nullptr) return false;
  return decoder->DecodeTokens(decode_results, num_message_bytes, num_crc_check_bytes);
}

bool DecoderRegistry::DetectBroadcaster(int decoder_id) {
  AudioModemDecoder* decoder = Lookup(decoder_id, "DetectBroadcaster");
  return decoder != nullptr && decoder->DetectBroadcaster();
}

void DecoderRegistry::WipeInternalData(int decoder_id) {
  AudioModemDecoder* decoder = Lookup(decoder_id, "WipeInternalData");
  if (decoder != nullptr) decoder->WipeInternalData();
}

int DecoderRegistry::GetMaxSafeInputSize(int decoder_id) {
  AudioModemDecoder* decoder = Lookup(decoder_id, "GetMaxSafeInputSize");
  return decoder == nullptr ? 0 : 2 * decoder->GetMaxSafeInputSize();
}

void DecoderRegistry::Release(int decoder_id) {
  std::unique_ptr<AudioModemDecoder> old = std::move(Slot(decoder_id));
}

}  // namespace audio_sorvane
