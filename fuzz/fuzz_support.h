// What the decoder fuzzers share: reading an input from the front, decoder
// settings drawn from it within the ranges the settings validators and the
// command-line tool accept, and a short audio script that can still stand
// for long stretches of sound.
//
// Settings take one byte each, and a byte of 0 gives the modem's default, so
// an all-zero settings block is the default decoder and seeds stay simple.
// Reads past the end give 0. Continuous settings take a few dozen levels
// (both ends of their range included), so that mutations of the audio
// script mostly keep the settings and DecoderCache can hand back a decoder
// already built.
#ifndef FUZZ_FUZZ_SUPPORT_H_
#define FUZZ_FUZZ_SUPPORT_H_

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <span>
#include <string>
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

// Levels of a continuous setting read from one byte.
inline constexpr int kLevels = 32;

// A byte as one of kLevels values from lo to hi (neighbouring bytes share a
// level); 0 gives `fallback`.
float Level(uint8_t b, float lo, float hi, float fallback);

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
// frames are fed in all, so every run stays short: audio past that is
// dropped, requests still run.
void RunAudioScript(FuzzInput& in, int channels, int max_frames,
                    const std::function<void(std::span<const int16_t>)>& feed,
                    const std::function<void(uint8_t)>& act);

// FNV-1a hash of what a decoder answered in a run.
class Digest {
 public:
  void Add(int64_t value);
  uint64_t value() const { return hash_; }

 private:
  uint64_t hash_ = 14695981039346656037ull;
};

// The requests the tools and the app make of a decoder, chosen by `a`:
// tokens with and without CRC bytes (and, rarely, a wrong split), broadcaster
// detection, the safe input size, wiping. Tokens must have the decoder's
// length. The answers go into `digest`.
void Act(audio_sorvane::AudioModemDecoder& decoder, uint8_t a, Digest& digest);

// Requests (Act) per run at most: a token request scores every candidate
// over the multipath search and costs more than the audio it looks at.
inline constexpr int kMaxRequests = 4;

// Runs the audio script on `decoder`: blocks go to `feed` (by default the
// decoder's 16-bit path), requests to Act up to kMaxRequests, and one
// request at the end if the script made none. Returns the digest of the
// answers.
uint64_t RunDecoderScript(FuzzInput& in, audio_sorvane::AudioModemDecoder& decoder,
                          int channels, int max_frames,
                          const std::function<void(std::span<const int16_t>)>& feed = nullptr);

// Every field of the settings that shapes the decoder, as a byte string
// (the hotsound clock left out).
std::string SettingsKey(const audio_sorvane::DsssDecoderConfig& config);
std::string SettingsKey(const audio_sorvane::DtmfDecoderConfig& config);

// Decoders kept from run to run by their settings key: building one renders
// the symbol templates, FFT plans and buffers, which costs more than a short
// run. Get hands out the decoder wiped (WipeInternalData puts the DSSS and
// multi-tone decoders back to their state after Initialize), so nothing of
// one run reaches the next; the hotsound kind keeps its wake-up state over
// a wipe and must not be cached, and so does the multi-tone one (a wiped
// multi-tone decoder can answer differently from a new one:
// fuzz/regressions/dtmf_decoder). Holds at most `capacity` decoders and
// drops the least recently used; a capacity of 0 builds on every Get. Not
// thread safe.
class DecoderCache {
 public:
  using Maker = std::function<std::unique_ptr<audio_sorvane::AudioModemDecoder>()>;

  explicit DecoderCache(size_t capacity) : capacity_(capacity) {}
  ~DecoderCache();

  // The wiped decoder for `key`, built by `make` when missing. Null when
  // `make` gives null (remembered as well: refusals stay cheap).
  audio_sorvane::AudioModemDecoder* Get(const std::string& key, const Maker& make);

 private:
  struct Entry {
    std::string key;
    std::unique_ptr<audio_sorvane::AudioModemDecoder> decoder;
    uint64_t last_use = 0;
  };
  size_t capacity_;
  uint64_t uses_ = 0;
  uint64_t builds_ = 0;
  std::vector<Entry> entries_;
};

// Whether SORVEL_FUZZ_CHECK_REUSE is set in the environment.
bool CheckReuse();

// Runs `run` on the cached decoder for `key` (a null decoder skips it).
// With SORVEL_FUZZ_CHECK_REUSE set in the environment it runs again on a
// decoder built afresh and traps when the two answer differently: the check
// that a wiped decoder is as good as a new one.
void RunCached(DecoderCache& cache, const std::string& key, const DecoderCache::Maker& make,
               const std::function<uint64_t(audio_sorvane::AudioModemDecoder&)>& run);

// Drops log lines below FATAL: misuse that the fuzzers make on purpose logs
// on every run and would slow them down. Fatal checks still print.
void QuietLogs();

}  // namespace sorvel_fuzz

#endif  // FUZZ_FUZZ_SUPPORT_H_
