// Writes seed inputs for the fuzzers: encoded tokens in each scheme, in the
// decoder fuzzer's block format, as WAV images, and as settings blocks
// followed by audio scripts (fuzz_support.h) for the per-decoder and
// registry fuzzers.
//   make_seeds <corpus root>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "audio/modem_config.h"
#include "audio/pcm16.h"
#include "fuzz/fuzz_support.h"
#include "sim/channel_simulator.h"
#include "tools/wav_io.h"

namespace {

void Write(const std::filesystem::path& path, const std::vector<uint8_t>& bytes) {
  std::ofstream(path, std::ios::binary).write(reinterpret_cast<const char*>(bytes.data()),
                                              static_cast<std::streamsize>(bytes.size()));
}

using Bytes = std::vector<uint8_t>;

void AppendSample(float value, Bytes* out) {
  const int16_t v = static_cast<int16_t>(std::clamp(value, -32768.0f, 32767.0f));
  out->push_back(static_cast<uint8_t>(v & 0xff));
  out->push_back(static_cast<uint8_t>((v >> 8) & 0xff));
}

// One loop of a broadcast received at 44.1 kHz with noise, as an audio
// script: the loop in blocks of 256 frames, played `loops` times in all,
// then requests for tokens with and without CRC bytes.
Bytes ScriptOf(const audio_sorvane::AudioModemEncoder& encoder, const std::vector<uint8_t>& message,
               int loops) {
  std::vector<float> token;
  encoder.Encode(message, &token, 2);
  const std::vector<float> received =
      sorvel_sim::ApplyChannel(token, {.input_rate = encoder.OutputSampleRate(), .snr_db = 20.0});
  Bytes script;
  for (size_t start = 0; start < received.size(); start += 256) {
    const size_t end = std::min(received.size(), start + 256);
    script.push_back(0);
    script.push_back(static_cast<uint8_t>(end - start - 1));
    for (size_t i = start; i < end; ++i) AppendSample(received[i], &script);
  }
  script.insert(script.end(), {3, static_cast<uint8_t>(loops - 2), 4, 0, 4, 2, 4, 4});
  return script;
}

// Settings bytes (ReadDsssSettings) for a short DSSS frame: a 31-chip code
// at 4 samples per chip and 4-byte tokens, 1116 samples a token.
Bytes ShortDsssSettings() {
  using sorvel_fuzz::PickByte;
  Bytes settings(sorvel_fuzz::kDsssSettingsBytes, 0);
  settings[0] = PickByte(1, 12, 8, 4);  // token bytes
  settings[2] = PickByte(5, 11, 7, 5);  // taps
  settings[4] = PickByte(1, 8, 3, 1);   // decimation
  settings[5] = PickByte(1, 12, 5, 4);  // upsampling multiple
  return settings;
}

// Settings bytes (ReadDtmfSettings) for 8 ms frames and 4-byte tokens;
// with `own_tones`, six tones from 1 kHz taken two at a time and an ADSR
// window.
Bytes ShortDtmfSettings(bool own_tones) {
  Bytes settings(sorvel_fuzz::kDtmfSettingsBytes, 0);
  settings[0] = sorvel_fuzz::PickByte(1, 12, 5, 4);
  settings[4] = 11;  // window about 8 ms
  if (own_tones) {
    settings[1] = 2;  // ADSR
    settings[5] = 4;  // six tones
    for (int i = 0; i < 6; ++i) {
      settings[6 + i] = static_cast<uint8_t>((1000 + 500 * i) * 256 / 22050);
    }
    settings[18] = 1;  // the second usable count: pairs
    for (int i = 19; i < 24; ++i) settings[i] = 128;
  }
  return settings;
}

Bytes Concat(std::initializer_list<Bytes> parts) {
  Bytes out;
  for (const Bytes& part : parts) out.insert(out.end(), part.begin(), part.end());
  return out;
}

void WriteDecoderScripts(const std::filesystem::path& root) {
  // DSSS: a short frame, and the default settings with a second of noise.
  const Bytes dsss = ShortDsssSettings();
  sorvel_fuzz::FuzzInput dsss_in(dsss.data(), dsss.size());
  const audio_sorvane::DsssDecoderConfig dsss_config = sorvel_fuzz::ReadDsssSettings(dsss_in, false);
  const auto dsss_encoder = audio_sorvane::MakeDsssEncoder(
      {.coder = dsss_config.coder, .token_length_bytes = dsss_config.token_length_bytes});
  Write(root / "dsss_decoder" / "short_frame", Concat({dsss, ScriptOf(*dsss_encoder, {7, 9}, 4)}));
  Write(root / "dsss_decoder" / "default_noise",
        Concat({Bytes(sorvel_fuzz::kDsssSettingsBytes, 0), {2, 100, 40, 1, 60, 4, 4, 4, 0}}));

  // Hotsound: the default broadcast, which the wake-up detector listens for.
  const auto default_encoder = audio_sorvane::MakeDsssEncoder({});
  for (uint8_t path : {0, 1}) {
    Write(root / "hotsound_decoder" / ("default_path" + std::to_string(path)),
          Concat({Bytes(sorvel_fuzz::kDsssSettingsBytes, 0), {path},
                  ScriptOf(*default_encoder, {1, 2, 3, 4, 5, 6}, 2)}));
  }

  // Multi-tone: short frames with the default tones and with six of our own.
  for (bool own : {false, true}) {
    const Bytes dtmf = ShortDtmfSettings(own);
    sorvel_fuzz::FuzzInput in(dtmf.data(), dtmf.size());
    const auto encoder = audio_sorvane::MakeDtmfEncoder(sorvel_fuzz::ReadDtmfSettings(in).tones);
    Write(root / "dtmf_decoder" / (own ? "own_tones" : "default_tones"),
          Concat({dtmf, ScriptOf(*encoder, {7, 9}, 3)}));
  }

  // Registry: DSSS in slot 0 and multi-tone in slot 2, audio for slot 0,
  // tokens, then calls on released, never initialised and empty slots.
  const Bytes dtmf = ShortDtmfSettings(false);
  std::vector<float> token;
  dsss_encoder->Encode({7, 9}, &token, 2);
  Bytes seed = Concat({{0, 1, 0}, dsss, {1, 3}, dtmf});
  for (size_t start = 0; start < token.size(); start += 256) {
    const size_t end = std::min(token.size(), start + 256);
    seed.insert(seed.end(), {2, 1, static_cast<uint8_t>(end - start - 1)});
    for (size_t i = start; i < end; ++i) AppendSample(token[i] * 8000.0f, &seed);
  }
  seed.insert(seed.end(), {4, 1, 1, 4, 1, 0, 8, 1, 4, 1, 1, 5, 2, 7, 0, 6, 3, 3, 1, 0, 0, 0});
  Write(root / "decoder_registry" / "slots", seed);
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 2) return 2;
  const std::filesystem::path root = argv[1];
  for (const char* dir : {"decoder", "symbol", "token_selector", "sound_file", "dsss_decoder",
                          "hotsound_decoder", "dtmf_decoder", "decoder_registry"}) {
    std::filesystem::create_directories(root / dir);
  }
  const auto dsss = audio_sorvane::MakeDsssEncoder({});
  const auto dtmf = audio_sorvane::MakeDtmfEncoder({});
  for (int scheme = 0; scheme < 3; ++scheme) {
    const auto& encoder = scheme == 2 ? *dtmf : *dsss;
    std::vector<float> token;
    encoder.Encode(scheme == 2 ? std::vector<uint8_t>{1, 2, 3} : std::vector<uint8_t>{1, 2, 3, 4, 5, 6},
                   &token, 2);
    const std::vector<float> received = sorvel_sim::ApplyChannel(
        sorvel_sim::RenderLoopedBroadcast(encoder, token, 1.2), {.snr_db = 10.0});
    std::vector<uint8_t> input = {static_cast<uint8_t>(scheme)};
    for (size_t start = 0; start < received.size(); start += 440) {
      input.push_back(54);  // (54 + 1) * 8 = 440 frames
      for (size_t i = start; i < std::min(received.size(), start + 440); ++i) {
        const int16_t v = static_cast<int16_t>(std::clamp(received[i], -32768.0f, 32767.0f));
        input.push_back(static_cast<uint8_t>(v & 0xff));
        input.push_back(static_cast<uint8_t>((v >> 8) & 0xff));
      }
    }
    Write(root / "decoder" / ("scheme" + std::to_string(scheme)), input);
    const std::string wav = (root / "sound_file" / ("scheme" + std::to_string(scheme) + ".wav")).string();
    std::vector<float> short_token(token.begin(), token.begin() + std::min<size_t>(token.size(), 8000));
    sorvel_cli::WriteWav(wav, short_token, 44100);
  }
  Write(root / "symbol" / "seed", {44, 44, 2, 1, 2, 3, 4, 5});
  Write(root / "token_selector" / "seed", std::vector<uint8_t>(200, 80));
  WriteDecoderScripts(root);
  return 0;
}
