#include "audio/audio_modem_encoder.h"

#include <vector>

#include "audio/modem_config.h"
#include "audio/sorvane/crc16_coder.h"
#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace audio_sorvane {
namespace {

using Bytes = std::vector<uint8_t>;

// A 10-byte DSSS token (20 symbols of 4 bits): each split is accepted or
// refused with its message, refusals leaving the output untouched.
TEST(AudioModemEncoderTest, ChecksMessageAndCrcSplit) {
  DsssEncoderConfig config;
  config.token_length_bytes = 10;
  const auto encoder = MakeDsssEncoder(config);
  ASSERT_EQ(encoder->token_length_bytes(), 10);
  EXPECT_EQ(encoder->OutputSampleRate(), 44100.0f);

  std::vector<float> with_crc, raw;
  encoder->Encode(Bytes(8, 7), &with_crc, 2);
  EXPECT_EQ(with_crc.size(), 21u * 1905);
  // The CRC bytes are appended most significant first.
  Bytes token(8, 7);
  Crc16Coder({.num_message_bytes = 8}).Encode(&token);
  encoder->Encode(token, &raw, 0);
  EXPECT_EQ(raw, with_crc);

  struct Refusal {
    int message_bytes, crc_bytes;
    const char* message;
  };
  const Refusal refusals[] = {
      {9, 1, "Unsupported value for num_crc_check_bytes"},
      {12, -2, "num_crc_check_bytes must be non-negative"},
      {8, 0, "token_bytes.size() and num_crc_check_bytes do not add to correct value"},
  };
  for (const Refusal& r : refusals) {
    sorvel_test::ScopedLogCapture capture;
    std::vector<float> out = {1.0f};
    encoder->Encode(Bytes(r.message_bytes, 1), &out, r.crc_bytes);
    EXPECT_EQ(out, std::vector<float>{1.0f});
    EXPECT_TRUE(capture.Contains(sorvel_base::ERROR, r.message)) << r.message;
  }
}

TEST(AudioModemEncoderTest, DtmfHasNoTransition) {
  const auto encoder = MakeDtmfEncoder(DtmfConfig());
  ASSERT_NE(encoder, nullptr);
  EXPECT_EQ(encoder->kind(), AudioModemEncoder::kDtmf);
  std::vector<float> audio, transition = {1.0f};
  encoder->Encode(Bytes(3, 9), &audio, 2);
  EXPECT_EQ(audio.size(), 19872u);
  encoder->MakeStartTransition(audio, &transition);
  EXPECT_TRUE(transition.empty());
  DtmfConfig refused;
  refused.adsr = {{0.1f, 0.0f, 0.0f, 0.0f, 1.0f}};
  EXPECT_EQ(MakeDtmfEncoder(refused), nullptr);
}

#if GTEST_HAS_DEATH_TEST
TEST(AudioModemEncoderDeathTest, RejectsNullEncoders) {
  EXPECT_DEATH(AudioModemEncoder(std::unique_ptr<SorvaneEncoder>()),
               sorvel_test::CheckFailed("dsss_encoder"));
  EXPECT_DEATH(AudioModemEncoder(std::unique_ptr<DtmfEncoder>()),
               sorvel_test::CheckFailed("dtmf_encoder"));
}
#endif

}  // namespace
}  // namespace audio_sorvane
