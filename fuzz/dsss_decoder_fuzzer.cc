// The DSSS decoder with settings taken from the input, then a short audio
// script (fuzz_support.h) with token requests between blocks. Any settings
// the validators accept, and any audio, must run without a crash, a
// sanitizer report or a fatal check, and tokens must have the decoder's
// length. Decoders are kept between runs by their settings and wiped before
// each run.
//
// Input: the settings block (ReadDsssSettings), then the script.
#include <cstddef>
#include <cstdint>
#include <vector>

#include "audio/modem_config.h"
#include "fuzz/fuzz_support.h"

namespace {

// Frames per run: 4096 (93 ms at 44.1 kHz) hold a short-frame token, and a
// run costs well under a millisecond outside the sanitizers.
constexpr int kMaxFrames = 4096;

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  sorvel_fuzz::QuietLogs();
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static sorvel_fuzz::DecoderCache cache(256);
  sorvel_fuzz::FuzzInput in(data, size);
  const audio_sorvane::DsssDecoderConfig config = sorvel_fuzz::ReadDsssSettings(in, false);
  if (!audio_sorvane::ValidateDsssCoderConfig(config.coder).empty()) __builtin_trap();
  sorvel_fuzz::RunCached(
      cache, sorvel_fuzz::SettingsKey(config),
      [&] { return audio_sorvane::MakeDsssDecoder(config); },
      [&](audio_sorvane::AudioModemDecoder& decoder) {
        sorvel_fuzz::FuzzInput script = in;
        return sorvel_fuzz::RunDecoderScript(script, decoder, config.num_channels, kMaxFrames);
      });
  return 0;
}
