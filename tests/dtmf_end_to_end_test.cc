// The multi-tone link end to end: encoder, channel simulator, decoder.
#include <memory>
#include <vector>

#include "audio/modem_config.h"
#include "audio/sorvane/dtmf/dtmf_decoder.h"
#include "gtest/gtest.h"
#include "sim/channel_simulator.h"
#include "tests/test_helpers.h"

namespace audio_sorvane {
namespace {

using Bytes = std::vector<uint8_t>;

std::vector<float> Received(const DtmfConfig& tones, const Bytes& token,
                            sorvel_sim::ChannelConfig channel) {
  const auto encoder = MakeDtmfEncoder(tones);
  std::vector<float> audio;
  encoder->Encode(token, &audio, 0);
  channel.input_rate = tones.sample_rate;
  return sorvel_sim::ApplyChannel(sorvel_sim::RenderLoopedBroadcast(*encoder, audio, 3.0),
                                  channel);
}

// Feeds 10 ms blocks, asking every 250 ms; the best candidate at the end.
Bytes Decode(DtmfDecoder& decoder, const std::vector<float>& signal, int channels, float rate) {
  const size_t block = static_cast<size_t>(rate / 100) * channels;
  DecodeResults results;
  Bytes best;
  for (size_t start = 0, n = 0; start < signal.size(); start += block, ++n) {
    decoder.ProcessSamples(
        std::span<const float>(signal).subspan(start, std::min(block, signal.size() - start)));
    if (n % 25 == 24 && decoder.GetToken(&results)) best = results.tokens[0].bytes;
  }
  if (decoder.GetToken(&results)) best = results.tokens[0].bytes;
  return best;
}

Bytes DecodeLink(const DtmfConfig& tones, const Bytes& token, sorvel_sim::ChannelConfig channel) {
  DtmfEncoderParams params;
  EXPECT_TRUE(MakeDtmfEncoderParams(tones, &params));
  DtmfDecoder decoder{DtmfDecoderParams(params)};
  decoder.Init(channel.channels, static_cast<float>(channel.output_rate));
  EXPECT_EQ(decoder.uses_resampler(), channel.output_rate != tones.sample_rate);
  return Decode(decoder, Received(tones, token, channel), channel.channels,
                static_cast<float>(channel.output_rate));
}

TEST(DtmfEndToEndTest, DecodesAcrossRatesChannelsNoiseAndMotion) {
  const Bytes token = {0x53, 0x6f, 0x72, 0x76, 0x65};
  const sorvel_sim::ChannelConfig channels[] = {
      {.leading_silence = 0.3},          {.output_rate = 48000},
      {.output_rate = 16000},            {.channels = 2},
      {.snr_db = 0.0, .seed = 3},        {.speed = 1.0},
      {.speed = -1.0, .snr_db = 10.0},
  };
  for (const auto& channel : channels) {
    EXPECT_EQ(DecodeLink({}, token, channel), token)
        << channel.output_rate << " Hz, " << channel.channels << " channels, SNR "
        << channel.snr_db << " dB, " << channel.speed << " m/s";
  }
  DtmfConfig checksum;
  checksum.use_checksum_symbol = true;
  checksum.bytes_in_token = 8;
  const Bytes long_token = {1, 2, 3, 4, 5, 6, 7, 8};
  EXPECT_EQ(DecodeLink(checksum, long_token, {}), long_token);
}

// Before Init calls are logged; an empty buffer yields nothing; a block
// longer than the buffer restarts the decoder, keeping only its end.
TEST(DtmfEndToEndTest, LifecycleAndBufferBudget) {
  DtmfDecoder decoder{DtmfDecoderParams()};
  DecodeResults results;
  {
    sorvel_test::ScopedLogCapture capture;
    decoder.ProcessSamples(std::vector<float>(10));
    EXPECT_FALSE(decoder.GetToken(&results));
    EXPECT_TRUE(capture.Contains(sorvel_base::ERROR, "ProcessSamples() called before call to Init()."));
    EXPECT_TRUE(capture.Contains(sorvel_base::ERROR, "GetToken() called before call to Init()."));
  }
  decoder.Init(1, 44100.0f);
  EXPECT_FALSE(decoder.GetToken(&results));
  sorvel_test::ScopedLogCapture capture;
  decoder.ProcessSamples(std::vector<float>(4 * 44100, 0.0f));  // 3 s buffer
  EXPECT_TRUE(capture.Contains(sorvel_base::WARNING, "exceeds maximum buffer size 132300"));
  EXPECT_LE(decoder.tone_strength_buffer_size(), 3 * 44100 / 16 + 1);
  const Bytes token = {9, 8, 7, 6, 5};
  EXPECT_EQ(Decode(decoder, Received({}, token, {}), 1, 44100.0f), token);
}

// Each request reuses the columns the previous one computed; the results
// must equal those of a decoder that computes everything afresh, including
// after the buffer has started dropping its oldest values.
TEST(DtmfEndToEndTest, RepeatedRequestsMatchAFreshComputation) {
  const std::vector<float> signal =
      Received({}, {1, 2, 3, 4, 5}, {.leading_silence = 1.0, .snr_db = 0.0, .seed = 5});
  const size_t block = 441;
  const auto feed = [&](DtmfDecoder& decoder, size_t from, size_t to) {
    for (size_t start = from; start < to; start += block) {
      decoder.ProcessSamples(std::span<const float>(signal).subspan(start, block));
    }
  };
  DtmfDecoder incremental{DtmfDecoderParams()};
  incremental.Init(1, 44100.0f);
  DecodeResults results, fresh_results;
  size_t fed = 0;
  for (const double seconds : {0.8, 2.5, 3.4, 3.9}) {
    const size_t until = static_cast<size_t>(seconds * 100) * block;
    for (; fed < until; fed += block) {
      feed(incremental, fed, fed + block);
      incremental.GetToken(&results);
    }
    DtmfDecoder fresh{DtmfDecoderParams()};
    fresh.Init(1, 44100.0f);
    feed(fresh, 0, until);
    fresh.GetToken(&fresh_results);
    ASSERT_FALSE(results.detection_scores.empty()) << seconds;
    EXPECT_EQ(results.detection_times, fresh_results.detection_times) << seconds;
    EXPECT_EQ(results.detection_scores, fresh_results.detection_scores) << seconds;
    EXPECT_EQ(results.scores_table, fresh_results.scores_table) << seconds;
  }
}

#if GTEST_HAS_DEATH_TEST
TEST(DtmfEndToEndDeathTest, ShapeFaults) {
  DtmfDecoder stereo{DtmfDecoderParams()};
  stereo.Init(2, 44100.0f);
  EXPECT_DEATH(stereo.ProcessSamples(std::vector<float>(7)),
               sorvel_test::CheckFailed("received_samples.size() % num_channels_ == 0"));
  // A normalisation window under one baseband sample is refused when the
  // decoder is built, not at its first request.
  DtmfDecoderParams tiny;
  tiny.tone_normalization_params.window_size = 0.001f;
  EXPECT_DEATH(DtmfDecoder{tiny}, sorvel_test::CheckFailed("window_size >= 1"));
}
#endif

}  // namespace
}  // namespace audio_sorvane
