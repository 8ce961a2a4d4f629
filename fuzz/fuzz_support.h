// What the decoder fuzzers share: reading an input from the front, decoder
// settings drawn from it within the ranges the settings validators and the
// command-line tool accept, and a short audio script that can still stand
// for long stretches of sound.
//
// Settings take one byte each, and a byte of 0 gives the modem's default, so
// an all-zero settings block is the default decoder and seeds stay simple.
// Reads past the end give 0.
#ifndef FUZZ_FUZZ_SUPPORT_H_
#define FUZZ_FUZZ_SUPPORT_H_

#include <cstddef>
#include <cstdint>
#include <functional>
#include <span>
#include <vector>

#include "audio/audio_modem_decoder.h"
#include "audio/modem_config.h"

namespace sorvel_fuzz {

class FuzzInput {
 public:
  FuzzInput(const uint8_t* data, size_t size) : data_(data), size_(size) {}

  bool empty() const { return pos_ >= size_; }
  uint8_t Byte() { return pos_ < size_ ? data_[pos_++] : 0; }
  // lo..hi (at most 256 values); the byte 0 gives `fallback`.
  int Pick(int lo, int hi, int fallback);
  int16_t Sample() { return static_cast<int16_t>(Byte() | (Byte() << 8)); }

 private:
  const uint8_t* data_;
  size_t size_;
  size_t pos_ = 0;
};

// The byte that Pick(lo, hi, fallback) turns into `value`, for seeds.
uint8_t PickByte(int lo, int hi, int fallback, int value);

// Input rates a phone or a file may have, odd ones included; index 0 is
// 44.1 kHz.
std::span<const float> SampleRates();

// Number of settings bytes the readers below take.
inline constexpr int kDsssSettingsBytes = 16;
inline constexpr int kDtmfSettingsBytes = 28;

// DSSS receiver settings. With `hotsound`, the input rate is one the wake-up
// detector can listen at. Each value is in the range the validators accept;
// the frame length is bounded so that building the decoder stays cheap.
audio_sorvane::DsssDecoderConfig ReadDsssSettings(FuzzInput& in, bool hotsound);

// Multi-tone receiver settings in the validators' ranges (ADSR windows that
// do not fit the frame included: those are refused when the decoder is
// built). The result passes ValidateDtmfConfig.
audio_sorvane::DtmfDecoderConfig ReadDtmfSettings(FuzzInput& in);

// Runs the rest of the input as an audio script of one-byte operations:
//   0 n          n + 1 frames of little-endian samples follow
//   1 n          (n + 1) * 256 frames of silence
//   2 n a        (n + 1) * 256 frames of noise of amplitude 128 * a
//   3 n          the audio since the previous 3 again, n % 4 + 1 times (a
//                looped broadcast costs one loop of input)
//   4 a          `act(a)`: ask for tokens, check for a broadcaster, ...
// Blocks hold whole frames of `channels` samples. At most `max_frames`
// frames are fed in all, so every run stays short.
void RunAudioScript(FuzzInput& in, int channels, int max_frames,
                    const std::function<void(std::span<const int16_t>)>& feed,
                    const std::function<void(uint8_t)>& act);

// The requests the tools and the app make of a decoder, chosen by `a`:
// tokens with and without CRC bytes (and, rarely, a wrong split), broadcaster
// detection, the safe input size, wiping. Tokens must have the decoder's
// length.
void Act(audio_sorvane::AudioModemDecoder& decoder, uint8_t a);

// Requests (Act) per run at most: a token request scores every candidate
// over the multipath search and costs more than the audio it looks at.
inline constexpr int kMaxRequests = 4;

// Runs the audio script on `decoder`: blocks go to `feed` (by default the
// decoder's 16-bit path), requests to Act up to kMaxRequests, and one
// request at the end if the script made none.
void RunDecoderScript(FuzzInput& in, audio_sorvane::AudioModemDecoder& decoder, int channels,
                      int max_frames,
                      const std::function<void(std::span<const int16_t>)>& feed = nullptr);

// Drops log lines below FATAL: misuse that the fuzzers make on purpose logs
// on every run and would slow them down. Fatal checks still print.
void QuietLogs();

}  // namespace sorvel_fuzz

#endif  // FUZZ_FUZZ_SUPPORT_H_
