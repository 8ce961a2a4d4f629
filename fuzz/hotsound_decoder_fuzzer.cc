// The hotsound decoder (a DSSS decoder behind the wake-up detector) with
// settings taken from the input, fed through the facade's float and 16-bit
// paths. Its activity clock runs on the audio fed, so runs repeat exactly.
// Any settings the validators and the tool accept, and any audio, must run
// without a crash, a sanitizer report or a fatal check. Each run builds its
// decoder: a wipe leaves the wake-up state (detector, pre-trigger audio,
// activity time) as it was, so a kept decoder would carry one run into the
// next.
//
// Input: the settings block (ReadDsssSettings with the hotsound rates), one
// byte whose low bit picks the 16-bit path, then the audio script.
#include <chrono>
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
  audio_sorvane::DsssDecoderConfig config = sorvel_fuzz::ReadDsssSettings(in, true);
  if (!audio_sorvane::ValidateDsssCoderConfig(config.coder).empty()) __builtin_trap();
  int64_t frames = 0;
  const int64_t rate = static_cast<int64_t>(config.input_sample_rate);
  config.hotsound_clock = [&] {
    return std::chrono::steady_clock::time_point() +
           std::chrono::microseconds(frames * 1000000 / rate);
  };
  const auto decoder = audio_sorvane::MakeDsssDecoder(config);
  const bool int16_path = in.Byte() & 1;
  // Two seconds of audio at most: enough to wake, decode and time out.
  sorvel_fuzz::RunDecoderScript(
      in, *decoder, config.num_channels, static_cast<int>(2 * config.input_sample_rate),
      [&](std::span<const int16_t> block) {
        frames += static_cast<int64_t>(block.size()) / config.num_channels;
        if (int16_path) {
          decoder->ProcessSamplesInt16(block.data(), static_cast<int>(block.size()));
        } else {
          decoder->ProcessPcm16(block.data(), static_cast<int>(block.size()));
        }
      });
  return 0;
}
