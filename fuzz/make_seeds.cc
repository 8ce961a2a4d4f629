// Writes seed inputs for the fuzzers: encoded tokens in each scheme, in the
// decoder fuzzer's block format and as WAV images.
//   make_seeds <corpus root>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "audio/modem_config.h"
#include "audio/pcm16.h"
#include "sim/channel_simulator.h"
#include "tools/wav_io.h"

namespace {

void Write(const std::filesystem::path& path, const std::vector<uint8_t>& bytes) {
  std::ofstream(path, std::ios::binary).write(reinterpret_cast<const char*>(bytes.data()),
                                              static_cast<std::streamsize>(bytes.size()));
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 2) return 2;
  const std::filesystem::path root = argv[1];
  for (const char* dir : {"decoder", "symbol", "token_selector", "sound_file"}) {
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
  return 0;
}
