// The decoders of the NativeDecoder peer, addressed by id, without JNI.
//
// Ids 0, 1, 2, ... index a vector of slots that grows on demand (storing
// under an id past the end adds empty slots up to it) and never shrinks;
// id -1 is a separate default slot. Initialising an id replaces its decoder:
// the old one is destroyed after the new one is in place. Releasing empties
// the slot.
//
// Any id other than -1 that is negative or, except when initialising, at or
// past the end of the vector is a programming error and ends the process.
// Calling a decoding operation on an empty slot (never initialised, or
// released) is run-time misuse: it is logged as an error and the call
// returns false, 0 or nothing.
//
// Not thread safe: calls for one decoder come from one thread at a time and
// initialise or release calls must not overlap any other call.
#ifndef AUDIO_JNI_DECODER_REGISTRY_H_
#define AUDIO_JNI_DECODER_REGISTRY_H_

#include <cstdint>
#include <memory>
#include <vector>

#include "audio/audio_modem_decoder.h"
#include "audio/modem_config.h"

namespace audio_sorvane {

class DecoderRegistry {
 public:
  // The registry the JNI functions use; never destroyed.
  static DecoderRegistry& Get();

  // Builds and stores a decoder. DSSS settings out of range end the process
  // in the modem's checks; the multi-tone one returns false, leaving the
  // registry unchanged, when the ADSR window is refused.
  bool InitializeDsss(int decoder_id, const DsssDecoderConfig& config);
  bool InitializeDtmf(int decoder_id, const DtmfDecoderConfig& config);

  // 16-bit samples on their own scale (1000 stays 1000.0).
  void ProcessSamples(int decoder_id, const int16_t* samples, int count);
  // For hotsound decoders; other kinds ignore the samples.
  void ProcessSamplesWithHotsound(int decoder_id, const int16_t* samples, int count);
  bool DecodeTokens(int decoder_id, AudioModemDecoder::DecodeResults* decode_results,
                    int num_message_bytes, int num_crc_check_bytes);
  bool DetectBroadcaster(int decoder_id);
  void WipeInternalData(int decoder_id);
  // In bytes of 16-bit samples.
  int GetMaxSafeInputSize(int decoder_id);
  // Empties the slot; releasing an empty slot does nothing.
  void Release(int decoder_id);

  // Slots in the vector (the default slot not counted).
  int size() const { return static_cast<int>(decoders_.size()); }
  // The decoder in the slot, or null when it is empty.
  AudioModemDecoder* Find(int decoder_id);

 private:
  std::unique_ptr<AudioModemDecoder>& Slot(int decoder_id);
  void Store(int decoder_id, std::unique_ptr<AudioModemDecoder> decoder);
  // The decoder, or null after logging that the slot is empty.
  AudioModemDecoder* Lookup(int decoder_id, const char* operation);

  std::vector<std::unique_ptr<AudioModemDecoder>> decoders_;
  std::unique_ptr<AudioModemDecoder> default_decoder_;
};

}  // namespace audio_sorvane

#endif  // AUDIO_JNI_DECODER_REGISTRY_H_
