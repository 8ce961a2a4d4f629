#include "web/web_modem.h"

#include <cmath>
#include <string>
#include <tuple>
#include <vector>

#include "gmock/gmock.h"
#include "gtest/gtest.h"

namespace sorvel_web {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

WebModemSettings Settings(const std::string& scheme, bool crc, int rate_hz) {
  WebModemSettings s;
  s.scheme = scheme;
  s.crc = crc;
  s.sample_rate_hz = rate_hz;
  return s;
}

// Feeds `audio` (full scale +-1) in 128-frame blocks, as the page's worklet
// hands out render quanta, and collects every reported token.
std::vector<std::string> Listen(WebDecoder& decoder, const std::vector<float>& audio) {
  std::vector<std::string> heard;
  std::vector<float> block;
  for (size_t start = 0; start < audio.size(); start += 128) {
    block.clear();
    for (size_t i = start; i < std::min(audio.size(), start + 128); ++i) {
      block.push_back(audio[i] * 32768.0f);
    }
    for (std::string& token : decoder.Process(block)) heard.push_back(token);
  }
  return heard;
}

// Verifies that settings a person can pick wrongly are refused with a
// message naming the problem, and that the defaults are accepted.
TEST(WebModemSettingsTest, RefusesUnusableSettingsWithAMessage) {
  EXPECT_EQ(ValidateSettings(WebModemSettings()), "");
  EXPECT_EQ(ValidateSettings(Settings("dtmf", true, 22050)), "");
  EXPECT_THAT(ValidateSettings(Settings("fsk", false, 44100)), HasSubstr("dsss or dtmf"));
  EXPECT_THAT(ValidateSettings(Settings("dsss", false, 4000)), HasSubstr("sample rate"));
  EXPECT_THAT(ValidateSettings(Settings("dtmf", false, 1000000)), HasSubstr("sample rate"));
  // The DSSS carrier does not fit below half of 22.05 kHz.
  EXPECT_THAT(ValidateSettings(Settings("dsss", false, 22050)), HasSubstr("carrier"));
  WebModemSettings gated = Settings("dtmf", false, 44100);
  gated.hotsound = true;
  EXPECT_THAT(ValidateSettings(gated), HasSubstr("dsss"));
}

// Verifies that a bad token, loop length or setting gives a message and no
// audio.
TEST(WebModemEncodeTest, RefusesBadInputWithAMessage) {
  const WebModemSettings dsss_crc = Settings("dsss", true, 48000);
  const struct {
    WebModemSettings settings;
    std::string hex;
    double loop_seconds;
    std::string problem;
  } cases[] = {
      {dsss_crc, "53zz72", 0.0, "'z' is not a hex digit"},
      {dsss_crc, "536f7", 0.0, "odd number"},
      {dsss_crc, "536f7276656c00", 0.0, "give 6 message bytes"},
      {Settings("dtmf", false, 48000), "536f7276656c", 0.0, "give 5 bytes"},
      {dsss_crc, "536f7276656c", -1.0, "loop"},
      {dsss_crc, "536f7276656c", 1e9, "loop"},
      {dsss_crc, "536f7276656c", std::nan(""), "loop"},
      {Settings("dsss", true, 22050), "536f7276656c", 0.0, "carrier"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.hex + " " + c.settings.scheme);
    const EncodeResult result = EncodeToken(c.settings, c.hex, c.loop_seconds);
    EXPECT_THAT(result.error, HasSubstr(c.problem));
    EXPECT_THAT(result.samples, IsEmpty());
  }
}

// Verifies that a loop is at least as long as asked and longer than one
// token, and stays within full scale.
TEST(WebModemEncodeTest, LoopCoversTheRequestedTime) {
  const WebModemSettings s = Settings("dsss", true, 48000);
  const EncodeResult token = EncodeToken(s, "53:6f:72:76:65:6c", 0.0);
  const EncodeResult loop = EncodeToken(s, "536f7276656c", 2.0);
  ASSERT_EQ(token.error, "");
  ASSERT_EQ(loop.error, "");
  EXPECT_GE(loop.samples.size(), 2 * 48000u);
  EXPECT_GT(loop.samples.size(), token.samples.size());
  for (float v : loop.samples) ASSERT_LE(std::abs(v), 1.0f);
}

class WebModemRoundTripTest
    : public ::testing::TestWithParam<std::tuple<std::string, bool, int>> {};

// Verifies that a broadcast encoded at the page's rate comes back from the
// streaming decoder fed in render quanta, reported once: looped for 4 s,
// or a single one that ends the recording, heard once Finish tells the
// decoder the recording has ended.
TEST_P(WebModemRoundTripTest, DecodesTheBroadcastOnce) {
  const auto& [scheme, crc, rate_hz] = GetParam();
  const WebModemSettings s = Settings(scheme, crc, rate_hz);
  const std::string message = scheme == "dsss" ? (crc ? "536f7276656c" : "536f7276656c2121")
                                               : (crc ? "536f72" : "536f727665");
  for (double loop_seconds : {4.0, 0.0}) {
    SCOPED_TRACE(loop_seconds);
    const EncodeResult broadcast = EncodeToken(s, message, loop_seconds);
    ASSERT_EQ(broadcast.error, "");
    WebDecoder decoder;
    ASSERT_EQ(decoder.Configure(s), "");
    std::vector<std::string> heard = Listen(decoder, broadcast.samples);
    for (const std::string& token : decoder.Finish()) heard.push_back(token);
    EXPECT_THAT(heard, ElementsAre(message));
  }
}

INSTANTIATE_TEST_SUITE_P(SchemesAndRates, WebModemRoundTripTest,
                         ::testing::Combine(::testing::Values("dsss", "dtmf"),
                                            ::testing::Bool(),
                                            ::testing::Values(44100, 48000)));

// Verifies that audio before Configure is dropped, that a refused
// reconfiguration keeps the working decoder, and that Reset lets a token be
// reported again.
TEST(WebDecoderTest, MisuseKeepsTheDecoderWorking) {
  const WebModemSettings s = Settings("dsss", true, 48000);
  const EncodeResult broadcast = EncodeToken(s, "536f7276656c", 4.0);
  ASSERT_EQ(broadcast.error, "");

  WebDecoder decoder;
  EXPECT_FALSE(decoder.configured());
  EXPECT_THAT(Listen(decoder, broadcast.samples), IsEmpty());

  ASSERT_EQ(decoder.Configure(s), "");
  EXPECT_THAT(decoder.Configure(Settings("dsss", true, 22050)), HasSubstr("carrier"));
  EXPECT_TRUE(decoder.configured());
  EXPECT_THAT(Listen(decoder, broadcast.samples), ElementsAre("536f7276656c"));
  // The same broadcast again: already reported.
  EXPECT_THAT(Listen(decoder, broadcast.samples), IsEmpty());
  decoder.Reset();
  EXPECT_THAT(Listen(decoder, broadcast.samples), ElementsAre("536f7276656c"));
}

// Verifies that the decoder behind the wake-up detector, whose timeout runs
// on the audio fed rather than the wall clock, decodes a broadcast.
TEST(WebDecoderTest, DecodesBehindTheWakeUpDetector) {
  WebModemSettings s = Settings("dsss", true, 48000);
  const EncodeResult broadcast = EncodeToken(s, "536f7276656c", 4.0);
  ASSERT_EQ(broadcast.error, "");
  s.hotsound = true;
  WebDecoder decoder;
  ASSERT_EQ(decoder.Configure(s), "");
  std::vector<float> audio(48000, 0.0f);  // a second of silence first
  audio.insert(audio.end(), broadcast.samples.begin(), broadcast.samples.end());
  EXPECT_THAT(Listen(decoder, audio), ElementsAre("536f7276656c"));
}

}  // namespace
}  // namespace sorvel_web
