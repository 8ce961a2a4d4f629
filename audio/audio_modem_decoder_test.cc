#include "audio/audio_modem_decoder.h"

#include <vector>

#include "audio/modem_config.h"
#include "audio/sorvane/crc16_coder.h"
#include "gtest/gtest.h"
#include "sim/channel_simulator.h"
#include "tests/test_helpers.h"

namespace audio_sorvane {
namespace {

using Bytes = std::vector<uint8_t>;

// A 10-byte DSSS link (20 symbols of 4 bits) carrying `token` in a loop.
std::unique_ptr<AudioModemDecoder> DecoderThatHeard(const Bytes& token) {
  DsssEncoderConfig encoder_config;
  encoder_config.token_length_bytes = 10;
  const auto encoder = MakeDsssEncoder(encoder_config);
  std::vector<float> audio;
  encoder->Encode(token, &audio, 0);
  DsssDecoderConfig config;
  config.token_length_bytes = 10;
  auto decoder = MakeDsssDecoder(config);
  decoder->ProcessSamples(
      sorvel_sim::ApplyChannel(sorvel_sim::RenderLoopedBroadcast(*encoder, audio, 3.0), {}));
  return decoder;
}

// Verifies the split checks and their messages, CRC checking and stripping,
// and that raw tokens come back as they are.
TEST(AudioModemDecoderTest, SplitsAndCrcChecks) {
  Bytes token = {1, 2, 3, 4, 5, 6, 7, 8};
  Crc16Coder({.num_message_bytes = 8}).Encode(&token);
  const auto decoder = DecoderThatHeard(token);

  AudioModemDecoder::DecodeResults results;
  ASSERT_TRUE(decoder->DecodeTokens(&results, 8, 2));
  EXPECT_EQ(results.tokens[0].bytes, Bytes(token.begin(), token.begin() + 8));
  EXPECT_FALSE(results.detection_times.empty());
  ASSERT_TRUE(decoder->DecodeTokens(&results, 10, 0));
  EXPECT_EQ(results.tokens[0].bytes, token);
  EXPECT_TRUE(decoder->DetectBroadcaster());

  struct Refusal {
    int message, crc;
    const char* text;
  };
  const Refusal refusals[] = {
      {9, 1, "Unsupported value for num_crc_check_bytes"},
      {0, 10, "num_message_bytes must be positive"},
      {12, -2, "num_crc_check_bytes must be non-negative"},
      {8, 0, "num_message_bytes and num_crc_check_bytes do not add to correct value"},
  };
  for (const Refusal& r : refusals) {
    sorvel_test::ScopedLogCapture capture;
    results.tokens.assign(1, {});
    EXPECT_FALSE(decoder->DecodeTokens(&results, r.message, r.crc));
    EXPECT_TRUE(capture.Contains(sorvel_base::ERROR, r.text)) << r.text;
  }
}

TEST(AudioModemDecoderTest, CorruptedCandidatesFailTheCrc) {
  const auto decoder = DecoderThatHeard({1, 2, 3, 4, 5, 6, 7, 8, 9, 10});  // no valid CRC
  AudioModemDecoder::DecodeResults results;
  EXPECT_FALSE(decoder->DecodeTokens(&results, 8, 2));
  EXPECT_TRUE(results.tokens.empty());
  EXPECT_TRUE(decoder->DecodeTokens(&results, 10, 0));
  decoder->WipeInternalData();
  EXPECT_FALSE(decoder->DecodeTokens(&results, 10, 0));

  const auto dtmf = MakeDtmfDecoder({});
  EXPECT_FALSE(dtmf->DetectBroadcaster());
  EXPECT_EQ(dtmf->GetMaxSafeInputSize(),
            static_cast<int>(std::lround(6 * 9 * 2208 - 9 * 2208)));
}

#if GTEST_HAS_DEATH_TEST
TEST(AudioModemDecoderDeathTest, RejectsNullDecoders) {
  EXPECT_DEATH(AudioModemDecoder(std::unique_ptr<SorvaneDecoder>()),
               sorvel_test::CheckFailed("dsss_decoder"));
  EXPECT_DEATH(AudioModemDecoder(std::unique_ptr<DtmfDecoder>()),
               sorvel_test::CheckFailed("dtmf_decoder"));
}
#endif

}  // namespace
}  // namespace audio_sorvane
