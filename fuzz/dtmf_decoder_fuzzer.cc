// The multi-tone decoder with settings taken from the input (tone sets,
// tones per symbol, frame windows included), then a short audio script with
// token requests between blocks. Any settings the validator accepts, and
// any audio, must run without a crash, a sanitizer report or a fatal check;
// an ADSR window that does not fit the frame is refused, not fatal.
// Each run builds its decoder: a wiped multi-tone decoder can answer
// differently from a new one (fuzz/regressions/dtmf_decoder), because its
// tone oscillators run on across the reset and meet the audio at another
// phase; zeroing them there makes the two agree on that input. With
// SORVEL_FUZZ_CHECK_REUSE set, decoders are kept and wiped, and each run is
// compared with one on a new decoder.
//
// Input: the settings block (ReadDtmfSettings), then the audio script.
#include <cstddef>
#include <cstdint>
#include <vector>

#include "audio/modem_config.h"
#include "fuzz/fuzz_support.h"

namespace {

// Frames per run: 8192 (0.19 s at 44.1 kHz) hold a token of short frames.
constexpr int kMaxFrames = 8192;

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  sorvel_fuzz::QuietLogs();
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static sorvel_fuzz::DecoderCache cache(sorvel_fuzz::CheckReuse() ? 256 : 0);
  sorvel_fuzz::FuzzInput in(data, size);
  const audio_sorvane::DtmfDecoderConfig config = sorvel_fuzz::ReadDtmfSettings(in);
  // Frames too short for the decimation: the validator refuses those.
  if (!audio_sorvane::ValidateDtmfConfig(config.tones).empty()) return 0;
  sorvel_fuzz::RunCached(
      cache, sorvel_fuzz::SettingsKey(config),
      [&] { return audio_sorvane::MakeDtmfDecoder(config); },  // null: refused ADSR window
      [&](audio_sorvane::AudioModemDecoder& decoder) {
        sorvel_fuzz::FuzzInput script = in;
        return sorvel_fuzz::RunDecoderScript(script, decoder, config.num_channels, kMaxFrames);
      });
  return 0;
}
