// Sends one token through the installed library and hears it back.
#include <cstdio>
#include <vector>

#include "audio/modem_config.h"

int main() {
  using namespace audio_sorvane;
  const std::vector<uint8_t> message = {0x48, 0x65, 0x6c, 0x6c, 0x6f, 0x21};
  const auto encoder = MakeDsssEncoder({});
  std::vector<float> token;
  encoder->Encode(message, &token, 2);
  std::vector<float> audio(22050, 0.0f);  // the decoder takes the 16-bit scale
  for (int repeat = 0; repeat < 3; ++repeat) {
    for (float sample : token) audio.push_back(16384.0f * sample);
  }
  audio.resize(audio.size() + 22050, 0.0f);
  const auto decoder = MakeDsssDecoder({});
  decoder->ProcessSamples(audio);
  AudioModemDecoder::DecodeResults results;
  if (!decoder->DecodeTokens(&results, static_cast<int>(message.size()), 2)) return 1;
  const bool heard = results.tokens.front().bytes == message;
  std::printf("%s\n", heard ? "heard the token" : "heard another token");
  return heard ? 0 : 1;
}
