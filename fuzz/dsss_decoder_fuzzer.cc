// The DSSS decoder with settings taken from the input, then a short audio
// script (fuzz_support.h) with token requests between blocks. Any settings
// the validators accept, and any audio, must run without a crash, a
// sanitizer report or a fatal check, and tokens must have the decoder's
// length.
//
// Input: the settings block (ReadDsssSettings), then the script.
#include <cstddef>
#include <cstdint>
#include <vector>

#include "audio/modem_config.h"
#include "fuzz/fuzz_support.h"

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  sorvel_fuzz::QuietLogs();
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  sorvel_fuzz::FuzzInput in(data, size);
  const audio_sorvane::DsssDecoderConfig config = sorvel_fuzz::ReadDsssSettings(in, false);
  if (!audio_sorvane::ValidateDsssCoderConfig(config.coder).empty()) __builtin_trap();
  const auto decoder = audio_sorvane::MakeDsssDecoder(config);
  // 16384 frames (0.37 s at 44.1 kHz) at most: enough for a few short-frame
  // tokens, and each run stays a few milliseconds.
  sorvel_fuzz::RunDecoderScript(in, *decoder, config.num_channels, 16384);
  return 0;
}
