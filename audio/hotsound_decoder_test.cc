#include "audio/hotsound_decoder.h"

#include <chrono>
#include <cstdio>
#include <memory>
#include <string>
#include <vector>

#include "audio/modem_config.h"
#include "gtest/gtest.h"
#include "sim/channel_simulator.h"
#include "tests/test_helpers.h"

namespace audio_sorvane {
namespace {

using Clock = std::chrono::steady_clock;

std::vector<int16_t> ToPcm(const std::vector<float>& x) {
  std::vector<int16_t> pcm(x.size());
  for (size_t i = 0; i < x.size(); ++i) {
    pcm[i] = static_cast<int16_t>(std::clamp(x[i], -32768.0f, 32767.0f));
  }
  return pcm;
}

// Seconds until the detector first fires on `audio`, fed in 10 ms blocks;
// negative if it never does.
double SecondsToTrigger(const std::vector<int16_t>& audio, int rate = 44100) {
  auto detector = MakeHotsoundDetector(rate, 1);
  std::vector<int16_t> block;
  for (size_t start = 0; start < audio.size(); start += rate / 100) {
    block.assign(audio.begin() + start,
                 audio.begin() + std::min(audio.size(), start + rate / 100));
    if (detector->Detected(detector->Process(block))) return (start + block.size()) / double(rate);
  }
  return -1.0;
}

std::vector<float> Broadcast(double seconds, double snr_db, sorvel_sim::NoiseKind noise) {
  const auto encoder = MakeDsssEncoder({});
  std::vector<float> token;
  encoder->Encode({1, 2, 3, 4, 5, 6}, &token, 2);
  std::vector<float> loop = sorvel_sim::RenderLoopedBroadcast(*encoder, token, seconds);
  return sorvel_sim::ApplyChannel(loop, {.level = 8000, .snr_db = snr_db, .noise = noise});
}

// Speech from espeak-ng (22.05 kHz) brought to 44.1 kHz and repeated.
std::vector<int16_t> Speech(double seconds) {
  FILE* pipe = popen(
      "espeak-ng --stdout 'The quick brown fox jumps over the lazy dog. Sorvel sends short "
      "tokens between phones in the same room, quietly and quickly.' 2>/dev/null",
      "r");
  std::vector<char> wav;
  if (pipe != nullptr) {
    char buffer[4096];
    for (size_t n; (n = fread(buffer, 1, sizeof(buffer), pipe)) > 0;) {
      wav.insert(wav.end(), buffer, buffer + n);
    }
    pclose(pipe);
  }
  if (wav.size() < 1000) return {};
  std::vector<float> voice((wav.size() - 44) / 2);
  for (size_t i = 0; i < voice.size(); ++i) {
    voice[i] = static_cast<int16_t>((wav[44 + 2 * i] & 0xff) | (wav[45 + 2 * i] << 8));
  }
  const std::vector<float> up = sorvel_sim::ResampleHighQuality(voice, 22050, 44100);
  std::vector<float> out;
  while (out.size() < seconds * 44100) out.insert(out.end(), up.begin(), up.end());
  for (float& v : out) v *= 4.0f;  // loud speech, peaks near full scale
  return ToPcm(out);
}

TEST(HotsoundDetectorTest, FiresQuicklyOnBroadcastOnly) {
  const double t = SecondsToTrigger(ToPcm(Broadcast(2.0, 0.0, sorvel_sim::NoiseKind::kWhite)));
  EXPECT_GT(t, 0.0);
  EXPECT_LE(t, 0.5);

  const size_t minute = 60 * 44100;
  EXPECT_LT(SecondsToTrigger(std::vector<int16_t>(minute, 0)), 0.0) << "silence";
  EXPECT_LT(SecondsToTrigger(ToPcm(sorvel_sim::MakeNoise(sorvel_sim::NoiseKind::kWhite, minute,
                                                         3000.0, 5))),
            0.0)
      << "white noise";
  EXPECT_LT(SecondsToTrigger(ToPcm(sorvel_sim::MakeNoise(sorvel_sim::NoiseKind::kPink, minute,
                                                         3000.0, 6))),
            0.0)
      << "pink noise";
  const std::vector<int16_t> speech = Speech(60.0);
  if (speech.empty()) GTEST_SKIP() << "espeak-ng is not installed";
  EXPECT_LT(SecondsToTrigger(speech), 0.0) << "speech";
}

TEST(HotsoundDetectorTest, StepAveragesPairs) {
  auto detector = MakeHotsoundDetector(44100, 2);
  std::vector<int16_t> block = {10, 20, -3, -4, 7, 8, 100, -101};
  detector->Process(block);
  EXPECT_EQ(std::vector<int16_t>(block.begin(), block.begin() + 4),
            (std::vector<int16_t>{15, -3, 7, 0}));
  EXPECT_EQ(MakeHotsoundDetector(16000, 1), nullptr);  // carrier above Nyquist
}

class HotsoundDecoderTest : public testing::Test {
 protected:
  HotsoundDecoderTest() {
    DsssDecoderConfig config;
    auto coder = std::make_shared<const SymbolWaveCoder>(MakeSymbolWaveCoderParams({}));
    decoder_ = std::make_unique<HotsoundDecoder>(
        std::make_unique<SorvaneDecoder>(coder, SorvaneDecoderParams()),
        MakeHotsoundDetector(44100, 1), [this] { return now_; });
    decoder_->Initialize(1, 44100.0f);
  }
  void Feed(const std::vector<int16_t>& pcm) {
    for (size_t start = 0; start < pcm.size(); start += 441) {
      decoder_->ProcessSamples(pcm.data() + start,
                               static_cast<int>(std::min<size_t>(441, pcm.size() - start)));
    }
  }

  Clock::time_point now_ = Clock::time_point() + std::chrono::hours(1);
  std::unique_ptr<HotsoundDecoder> decoder_;
};

// The pre-trigger buffer keeps the newest audio up to 14400 samples; a
// longer block contributes its first 14400.
TEST_F(HotsoundDecoderTest, PreTriggerBufferKeepsNewestAudio) {
  std::vector<int16_t> ramp(20000);
  for (int i = 0; i < 20000; ++i) ramp[i] = static_cast<int16_t>(i % 1000);
  decoder_->ProcessSamples(ramp.data(), 20000);
  ASSERT_EQ(decoder_->pre_trigger_count(), 14400);
  EXPECT_EQ(decoder_->pre_trigger_samples()[14399], 14399 % 1000);
  decoder_->ProcessSamples(ramp.data(), 400);
  EXPECT_EQ(decoder_->pre_trigger_count(), 14400);
  EXPECT_EQ(decoder_->pre_trigger_samples()[0], 400);  // oldest 400 dropped
  EXPECT_EQ(decoder_->pre_trigger_samples()[14399], 399);
  DecodeResults results;
  EXPECT_FALSE(decoder_->DecodeTokens(&results));
  EXPECT_FALSE(decoder_->DetectBroadcaster());
}

// Triggered by a broadcast, decodes it, stays triggered through a wipe and
// while failures come within 1000 ms of the last success, and listens again
// after 1001 ms.
TEST_F(HotsoundDecoderTest, TriggersDecodesAndTimesOut) {
  Feed(ToPcm(Broadcast(3.0, 0.0, sorvel_sim::NoiseKind::kWhite)));
  ASSERT_TRUE(decoder_->triggered());
  DecodeResults results;
  ASSERT_TRUE(decoder_->DecodeTokens(&results));
  EXPECT_EQ(results.tokens[0].bytes.size(), 8u);
  decoder_->WipeInternalData();
  EXPECT_TRUE(decoder_->triggered());
  now_ += std::chrono::milliseconds(1000);
  EXPECT_FALSE(decoder_->DecodeTokens(&results));
  EXPECT_TRUE(decoder_->triggered());
  now_ += std::chrono::milliseconds(1);
  EXPECT_FALSE(decoder_->DetectBroadcaster());
  EXPECT_FALSE(decoder_->triggered());
}

#if GTEST_HAS_DEATH_TEST
TEST(HotsoundDecoderDeathTest, NeedsBothParts) {
  auto coder = std::make_shared<const SymbolWaveCoder>(SymbolWaveCoderParams());
  EXPECT_DEATH(HotsoundDecoder(std::make_unique<SorvaneDecoder>(coder, SorvaneDecoderParams()),
                               nullptr),
               sorvel_test::CheckFailed("hotsound_detector"));
}
#endif

}  // namespace
}  // namespace audio_sorvane
