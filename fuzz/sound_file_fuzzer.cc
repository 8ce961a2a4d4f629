// The command-line tool's WAV reader on arbitrary file images, then the
// samples through a decoder when the header describes something a phone
// could record.
#include <cstddef>
#include <cstdint>
#include <span>

#include "audio/modem_config.h"
#include "tools/wav_io.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  sorvel_cli::WavData wav;
  if (!sorvel_cli::ReadWavFromMemory(std::span<const uint8_t>(data, size), &wav).empty()) {
    return 0;
  }
  if (wav.channels < 1 || wav.channels > 8 || wav.sample_rate < 8000 ||
      wav.sample_rate > 192000 || wav.samples.size() % wav.channels != 0) {
    return 0;
  }
  audio_sorvane::DtmfDecoderConfig config;
  config.num_channels = wav.channels;
  config.input_sample_rate = static_cast<float>(wav.sample_rate);
  const auto decoder = audio_sorvane::MakeDtmfDecoder(config);
  decoder->ProcessSamples(wav.samples);
  audio_sorvane::AudioModemDecoder::DecodeResults results;
  decoder->DecodeTokens(&results, 3, 2);
  return 0;
}
