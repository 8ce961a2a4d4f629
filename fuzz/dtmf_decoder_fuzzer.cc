// The multi-tone decoder with settings taken from the input (tone sets,
// tones per symbol, frame windows included), then a short audio script with
// token requests between blocks. Any settings the validator accepts, and
// any audio, must run without a crash, a sanitizer report or a fatal check;
// an ADSR window that does not fit the frame is refused, not fatal.
//
// Input: the settings block (ReadDtmfSettings), then the audio script.
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
  const audio_sorvane::DtmfDecoderConfig config = sorvel_fuzz::ReadDtmfSettings(in);
  // Frames too short for the decimation: the validator refuses those.
  if (!audio_sorvane::ValidateDtmfConfig(config.tones).empty()) return 0;
  const auto decoder = audio_sorvane::MakeDtmfDecoder(config);
  if (!decoder) return 0;  // refused ADSR window
  // 16384 frames (0.37 s at 44.1 kHz) at most: enough for a few short-frame
  // tokens, and each run stays a few milliseconds.
  sorvel_fuzz::RunDecoderScript(in, *decoder, config.num_channels, 16384);
  return 0;
}
