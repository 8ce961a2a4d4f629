// Sequences of the NativeDecoder peer's calls on the decoder registry that
// the JNI functions use: initialise (DSSS with or without hotsound, or
// multi-tone, with settings from the input), process samples (float and
// 16-bit paths), get tokens, detect broadcaster, wipe, max safe input size
// and release, on ids the input picks. Calls on empty slots (never
// initialised or released) must be logged and harmless; nothing may crash,
// trip a sanitizer or reach a fatal check.
//
// Ids stay within the registry's contract: an id past the end of the slot
// vector (or below -1) ends the process on purpose, so only initialise may
// name an id past the end, which grows the vector; other calls name -1 or
// an existing slot, initialised or not.
//
// Input: one-byte operations, each followed by its arguments:
//   0 id settings...     initialise DSSS (ReadDsssSettings + hotsound flag)
//   1 id settings...     initialise multi-tone (ReadDtmfSettings)
//   2 id n samples...    process n + 1 frames of little-endian samples
//   3 id n samples...    the same through the 16-bit (hotsound) path
//   4 id a               get tokens (a picks the split)
//   5 id / 6 id / 7 id   detect broadcaster / wipe / max safe input size
//   8 id                 release
#include <cstddef>
#include <cstdint>
#include <vector>

#include "audio/jni/decoder_registry.h"
#include "audio/modem_config.h"
#include "fuzz/fuzz_support.h"

namespace {

using audio_sorvane::DecoderRegistry;

// -1 or an existing slot. With `grow`, up to 8 slots past the end.
int PickId(sorvel_fuzz::FuzzInput& in, const DecoderRegistry& registry, bool grow) {
  const int slots = registry.size() + (grow ? 8 : 0);
  return static_cast<int>(in.Byte() % (slots + 1)) - 1;
}

// The channel count of the slot's decoder, or 1 for an empty slot.
int Channels(const std::vector<int>& channels, int id) {
  const size_t index = static_cast<size_t>(id + 1);
  return index < channels.size() ? channels[index] : 1;
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  sorvel_fuzz::QuietLogs();
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  sorvel_fuzz::FuzzInput in(data, size);
  DecoderRegistry registry;
  // Channels of each slot's decoder (index id + 1): blocks hold whole frames.
  std::vector<int> channels;
  std::vector<int16_t> block;
  int64_t fed = 0;
  int initialised = 0;
  while (!in.empty()) {
    const uint8_t op = in.Byte() % 9;
    const int id = PickId(in, registry, op <= 1);
    if (static_cast<size_t>(id + 1) >= channels.size()) channels.resize(id + 2, 1);
    switch (op) {
      case 0: {
        const bool hotsound = in.Byte() & 1;
        const audio_sorvane::DsssDecoderConfig config = sorvel_fuzz::ReadDsssSettings(in, hotsound);
        // Building decoders dominates the run time; a few per input explore
        // the slots as well as many would.
        if (++initialised > 4) return 0;
        registry.InitializeDsss(id, config);
        channels[id + 1] = config.num_channels;
        break;
      }
      case 1: {
        const audio_sorvane::DtmfDecoderConfig config = sorvel_fuzz::ReadDtmfSettings(in);
        if (!audio_sorvane::ValidateDtmfConfig(config.tones).empty()) break;
        if (++initialised > 4) return 0;
        if (registry.InitializeDtmf(id, config)) channels[id + 1] = config.num_channels;
        break;
      }
      case 2:
      case 3: {
        const int frames = in.Byte() + 1;
        block.resize(static_cast<size_t>(frames) * Channels(channels, id));
        for (int16_t& s : block) s = in.Sample();
        // 8192 frames in all: the slots, not the decoders, are explored here.
        if ((fed += frames) > 8192) return 0;
        const int count = static_cast<int>(block.size());
        if (op == 2) {
          registry.ProcessSamples(id, block.data(), count);
        } else {
          registry.ProcessSamplesWithHotsound(id, block.data(), count);
        }
        break;
      }
      case 4: {
        const uint8_t a = in.Byte();
        audio_sorvane::AudioModemDecoder* decoder = registry.Find(id);
        const int length = decoder ? decoder->token_length_bytes() : 1 + a % 12;
        const int crc = (a & 1) ? 2 : 0;
        audio_sorvane::AudioModemDecoder::DecodeResults results;
        if (registry.DecodeTokens(id, &results, length - crc, crc)) {
          if (decoder == nullptr) __builtin_trap();
          for (const auto& token : results.tokens) {
            if (static_cast<int>(token.bytes.size()) != length - crc) __builtin_trap();
          }
        }
        break;
      }
      case 5:
        if (registry.DetectBroadcaster(id) && registry.Find(id) == nullptr) __builtin_trap();
        break;
      case 6:
        registry.WipeInternalData(id);
        break;
      case 7: {
        const int bytes = registry.GetMaxSafeInputSize(id);
        if (bytes < 0 || bytes % 2 != 0 || (registry.Find(id) == nullptr && bytes != 0)) {
          __builtin_trap();
        }
        break;
      }
      default:
        registry.Release(id);
        if (registry.Find(id) != nullptr) __builtin_trap();
        break;
    }
  }
  return 0;
}
