// Fuzzes the three decoders with arbitrary 16-bit audio in arbitrary block
// sizes, requesting tokens between blocks. Within the library's contract
// (blocks of whole frames) no input may crash, trip a sanitizer or reach a
// fatal check.
//
// Input: byte 0 picks the decoder (DSSS, hotsound or multi-tone; mono or
// stereo; 44.1 or 48 kHz); then blocks, each a size byte n followed by
// (n + 1) * 8 frames of little-endian samples (fewer at the end).
#include <cstddef>
#include <cstdint>
#include <memory>
#include <vector>

#include "audio/modem_config.h"
#include "fuzz/fuzz_support.h"

namespace {

using audio_sorvane::AudioModemDecoder;

// The decoder the config byte picks. DSSS decoders are kept between runs
// (8 settings in all) and wiped; the others are built per run, as a wipe
// leaves the hotsound wake-up state as it was and a wiped multi-tone decoder
// can answer differently from a new one.
AudioModemDecoder* PickDecoder(uint8_t config, int channels, float rate,
                               std::unique_ptr<AudioModemDecoder>& fresh) {
  static sorvel_fuzz::DecoderCache cache(8);
  if (config % 3 != 2) {
    audio_sorvane::DsssDecoderConfig dsss;
    dsss.num_channels = channels;
    dsss.input_sample_rate = rate;
    dsss.with_hotsound = config % 3 == 1;
    dsss.append_check_symbol = (config & 16) != 0;
    if (dsss.with_hotsound) {
      fresh = audio_sorvane::MakeDsssDecoder(dsss);
      return fresh.get();
    }
    return cache.Get(sorvel_fuzz::SettingsKey(dsss),
                     [&] { return audio_sorvane::MakeDsssDecoder(dsss); });
  }
  audio_sorvane::DtmfDecoderConfig dtmf;
  dtmf.num_channels = channels;
  dtmf.input_sample_rate = rate;
  dtmf.tones.use_checksum_symbol = (config & 16) != 0;
  fresh = audio_sorvane::MakeDtmfDecoder(dtmf);
  return fresh.get();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size < 1) return 0;
  const uint8_t config = data[0];
  const int channels = (config & 4) ? 2 : 1;
  const float rate = (config & 8) ? 48000.0f : 44100.0f;
  std::unique_ptr<AudioModemDecoder> fresh;
  AudioModemDecoder* decoder = PickDecoder(config, channels, rate, fresh);
  const int message_bytes = decoder->token_length_bytes() - 2;
  AudioModemDecoder::DecodeResults results;
  std::vector<float> block;
  size_t pos = 1;
  int blocks = 0;
  while (pos < size) {
    const size_t frames = (static_cast<size_t>(data[pos++]) + 1) * 8;
    const size_t available = (size - pos) / (2 * channels);
    const size_t count = std::min(frames, available) * channels;
    block.resize(count);
    for (size_t i = 0; i < count; ++i, pos += 2) {
      block[i] = static_cast<int16_t>(data[pos] | (data[pos + 1] << 8));
    }
    decoder->ProcessSamples(block);
    if (++blocks % 4 == 0) {
      decoder->DecodeTokens(&results, message_bytes, 2);
      decoder->DecodeTokens(&results, message_bytes + 2, 0);
      decoder->DetectBroadcaster();
    }
    if (count == 0) break;
  }
  decoder->DecodeTokens(&results, message_bytes, 2);
  if (config & 32) decoder->WipeInternalData();
  decoder->GetMaxSafeInputSize();
  return 0;
}
