#include "audio/hotsound_decoder.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <memory>
#include <span>
#include <string>
#include <utility>
#include <vector>

#include "audio/modem_config.h"
#include "gtest/gtest.h"
#include "sim/channel_simulator.h"
#include "sim/interferers.h"
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
// negative if it never does. `peak` receives the highest score.
double SecondsToTrigger(const std::vector<int16_t>& audio, float* peak = nullptr, int rate = 44100) {
  auto detector = MakeHotsoundDetector(rate, 1);
  double fired = -1.0;
  float top = 0.0f;
  for (size_t start = 0; start < audio.size(); start += rate / 100) {
    const size_t n = std::min<size_t>(rate / 100, audio.size() - start);
    const float score = detector->Process(std::span<const int16_t>(audio).subspan(start, n));
    top = std::max(top, score);
    if (fired < 0 && detector->Detected(score)) fired = (start + n) / double(rate);
  }
  if (peak != nullptr) *peak = top;
  return fired;
}

// `seconds` of the looped test token through `channel`, peaking at `level`.
std::vector<int16_t> Heard(double seconds, sorvel_sim::ChannelConfig channel,
                           double level = 8000.0) {
  const auto encoder = MakeDsssEncoder({});
  std::vector<float> token;
  encoder->Encode({1, 2, 3, 4, 5, 6}, &token, 2);
  channel.level = level;
  return ToPcm(sorvel_sim::ApplyChannel(
      sorvel_sim::RenderLoopedBroadcast(*encoder, token, seconds), channel));
}

std::vector<float> BandLimited(const std::vector<float>& x) {
  float peak = 0.0f;
  for (float v : x) peak = std::max(peak, std::fabs(v));
  return sorvel_sim::ApplyChannel(x, {.level = peak, .band_limit = 16000.0});
}

// Wakes within half a second of the start of broadcasts that the DSSS
// decoder still decodes, after a second of the noise alone and a part of
// the detector's hop that differs from case to case: weak ones in
// white and pink noise, phones moving at up to 1 m/s, a 48 kHz microphone,
// reverberant rooms at several metres.
TEST(HotsoundDetectorTest, WakesWithinHalfASecond) {
  using sorvel_sim::NoiseKind;
  const sorvel_sim::RoomConfig living{
      .width = 6.0, .depth = 5.0, .height = 2.7, .rt60 = 0.6, .distance = 5.0};
  const sorvel_sim::RoomConfig office{
      .width = 4.0, .depth = 3.0, .height = 2.5, .rt60 = 0.4, .distance = 3.0};
  const struct {
    const char* name;
    sorvel_sim::ChannelConfig channel;
  } kCases[] = {
      {"white -14 dB", {.snr_db = -14.0}},
      {"pink -18 dB", {.snr_db = -18.0, .noise = NoiseKind::kPink}},
      {"approaching 1 m/s, -12 dB", {.speed = 1.0, .snr_db = -12.0}},
      {"receding 1 m/s, -12 dB", {.speed = -1.0, .snr_db = -12.0}},
      // Carriers half a bin between whole-bin offsets.
      {"hand drift 0.2 m/s, -16 dB", {.speed = 0.2, .snr_db = -16.0}},
      {"walking 0.65 m/s, -16 dB", {.speed = 0.65, .snr_db = -16.0}},
      {"48 kHz, -10 dB", {.output_rate = 48000.0, .snr_db = -10.0}},
      // +10 dB, the code's energy spread over the early reflections.
      {"living room at 5 m", {.snr_db = 10.0, .room = living}},
      {"living room at 5 m, seed 2", {.snr_db = 10.0, .seed = 2, .room = living}},
      {"office at 3 m", {.snr_db = 10.0, .seed = 3, .room = office}},
  };
  double lead = 1.0;
  for (auto [name, channel] : kCases) {
    lead += 0.0117;  // ten cases over most of the 108 ms hop
    channel.leading_silence = lead;
    const double t =
        SecondsToTrigger(Heard(1.0, channel), nullptr, static_cast<int>(channel.output_rate));
    EXPECT_GT(t, lead) << name;
    EXPECT_LE(t, lead + 0.5) << name;
  }
}

// A few seconds of each kind of sound that is not a broadcast, from faint to
// loud, stay clear of the threshold.
TEST(HotsoundDetectorTest, NoWakeOnInterferers) {
  using sorvel_sim::NoiseKind;
  const size_t seconds = 6 * 44100;
  std::vector<std::pair<std::string, std::vector<float>>> sounds = {
      {"digital silence", std::vector<float>(seconds, 0.0f)},
      {"white noise -60 dBFS", sorvel_sim::MakeNoise(NoiseKind::kWhite, seconds, 33.0, 5)},
      {"white noise -10 dBFS", sorvel_sim::MakeNoise(NoiseKind::kWhite, seconds, 10000.0, 6)},
      {"pink noise -60 dBFS", sorvel_sim::MakeNoise(NoiseKind::kPink, seconds, 33.0, 7)},
      {"pink noise -10 dBFS", sorvel_sim::MakeNoise(NoiseKind::kPink, seconds, 10000.0, 8)},
      {"white noise through a 16 kHz microphone",
       BandLimited(sorvel_sim::MakeNoise(NoiseKind::kWhite, seconds, 1000.0, 9))},
      {"clicks", sorvel_sim::MakeClicks(seconds, 30000.0, 10)},
  };
  std::vector<float> speech = sorvel_sim::RenderSpeech(30000.0);
  if (!speech.empty()) {
    speech.resize(std::min(speech.size(), 2 * seconds));
    sounds.emplace_back("speech", speech);
    sounds.emplace_back("speech through a 16 kHz microphone", BandLimited(speech));
  }
  const std::vector<float> music = sorvel_sim::RenderMusic(30000.0, 70);
  if (music.size() >= 60 * 44100 + seconds) {
    // From the thick of it (drums, cymbals), also through a phone
    // microphone, and from the intro.
    const std::vector<float> thick(music.begin() + 60 * 44100, music.begin() + 60 * 44100 + seconds);
    sounds.emplace_back("music", thick);
    sounds.emplace_back("music through a 16 kHz microphone", BandLimited(thick));
    sounds.emplace_back("music intro", std::vector<float>(music.begin(), music.begin() + seconds));
  }
  for (const auto& [name, sound] : sounds) {
    float peak = 0.0f;
    EXPECT_LT(SecondsToTrigger(ToPcm(sound), &peak), 0.0) << name;
    EXPECT_LT(peak, 0.9f * HotsoundDetector::kThreshold) << name;
  }
  if (speech.empty() || music.size() < 60 * 44100 + seconds) {
    GTEST_SKIP() << "espeak-ng, xmp or fb-music-high is not installed (tools/install-deps.sh)";
  }
}

// The detector scores fixed windows of the stream: blocks of any size give
// the same scores and fire on the same window.
TEST(HotsoundDetectorTest, BlockSizeDoesNotMatter) {
  const std::vector<int16_t> audio = Heard(1.5, {.leading_silence = 1.0, .snr_db = -6.0});
  std::vector<size_t> fired;
  std::vector<float> last;
  const size_t kSizes[] = {1, 7, 441, 100000};
  for (size_t size : kSizes) {
    auto detector = MakeHotsoundDetector(44100, 1);
    size_t at = 0;
    std::vector<int16_t> block;
    for (size_t start = 0; start < audio.size(); start += size) {
      block.assign(audio.begin() + start, audio.begin() + std::min(audio.size(), start + size));
      if (detector->Detected(detector->Process(block)) && at == 0) at = start + block.size();
    }
    ASSERT_GT(at, 0u) << size;
    fired.push_back(at);
    last.push_back(detector->score());
  }
  for (size_t i = 1; i < fired.size(); ++i) {
    // The block that holds the firing window's end.
    EXPECT_EQ(fired[i], std::min(audio.size(), (fired[0] + kSizes[i] - 1) / kSizes[i] * kSizes[i]))
        << kSizes[i];
    EXPECT_EQ(last[i], last[0]) << kSizes[i];
  }
}

// The eight-lane track steps (where the processor has them) score as the
// four-lane ones do, up to the rounding of fused multiply-adds.
TEST(HotsoundDetectorTest, WideAndNarrowStepsAgree) {
  auto wide = MakeHotsoundDetector(44100, 1);
  if (!wide->UseWideSteps(true)) GTEST_SKIP() << "no eight-lane steps on this processor";
  auto narrow = MakeHotsoundDetector(44100, 1);
  ASSERT_TRUE(narrow->UseWideSteps(false));
  const std::vector<int16_t> audio = Heard(
      1.5, {.speed = 1.0, .leading_silence = 1.0, .snr_db = -10.0, .noise = sorvel_sim::NoiseKind::kPink});
  std::vector<int16_t> a, b;
  float top = 0.0f;  // the comparison must cover a broadcast's scores
  for (size_t start = 0; start < audio.size(); start += 1000) {
    a.assign(audio.begin() + start, audio.begin() + std::min(audio.size(), start + 1000));
    b = a;
    const float expected = narrow->Process(b);
    EXPECT_NEAR(wide->Process(a), expected, 1e-5f * std::max(1.0f, expected)) << start;
    top = std::max(top, expected);
  }
  EXPECT_TRUE(narrow->Detected(top));
}

// With a step of two the detector hears interleaved stereo as the pair
// averages (truncated toward zero), in blocks of any length, and leaves the
// blocks as they were.
TEST(HotsoundDetectorTest, StepHearsPairAverages) {
  const std::vector<int16_t> left = Heard(1.5, {.leading_silence = 0.5, .snr_db = -6.0});
  const std::vector<int16_t> right = Heard(
      1.5, {.leading_silence = 0.5, .snr_db = -6.0, .noise = sorvel_sim::NoiseKind::kPink, .seed = 2});
  const size_t frames = std::min(left.size(), right.size());
  std::vector<int16_t> stereo, mono;
  for (size_t i = 0; i < frames; ++i) {
    stereo.insert(stereo.end(), {left[i], right[i]});
    mono.push_back(static_cast<int16_t>((left[i] + right[i]) / 2));
  }
  const std::vector<int16_t> original = stereo;
  auto reference = MakeHotsoundDetector(44100, 1);
  for (size_t start = 0; start < mono.size(); start += 441) {
    reference->Process(std::span<const int16_t>(mono).subspan(start, std::min<size_t>(441, mono.size() - start)));
  }
  ASSERT_TRUE(reference->Detected(reference->score()));
  auto paired = MakeHotsoundDetector(44100, 2);
  for (size_t start = 0; start < stereo.size(); start += 882) {
    paired->Process(std::span<const int16_t>(stereo).subspan(start, std::min<size_t>(882, stereo.size() - start)));
  }
  EXPECT_EQ(paired->score(), reference->score());
  EXPECT_EQ(stereo, original);
}

// The carrier and its band must fit below half the rate.
TEST(HotsoundDetectorTest, RefusesRatesWithoutRoomForTheBand) {
  for (int rate : {16000, 32000, 40000}) EXPECT_EQ(MakeHotsoundDetector(rate, 1), nullptr) << rate;
  for (int rate : {44100, 48000, 96000}) EXPECT_NE(MakeHotsoundDetector(rate, 1), nullptr) << rate;
}

class HotsoundDecoderTest : public testing::Test {
 protected:
  HotsoundDecoderTest() {
    auto coder = std::make_shared<const SymbolWaveCoder>(MakeSymbolWaveCoderParams({}));
    decoder_ = std::make_unique<HotsoundDecoder>(
        std::make_unique<SorvaneDecoder>(coder, SorvaneDecoderParams()),
        MakeHotsoundDetector(44100, 1), [this] { return now_; });
    decoder_->Initialize(1, 44100.0f);
  }
  // Feeds 10 ms blocks as a phone delivers them, the clock following the
  // audio, asking for tokens every 250 ms. Returns the tokens found; counts
  // the blocks after which the decoder was awake and its wake-ups.
  int Listen(const std::vector<int16_t>& pcm, int* awake_blocks = nullptr, int* wakes = nullptr) {
    int found = 0;
    for (size_t start = 0, n = 1; start < pcm.size(); start += 441, ++n) {
      const bool was_awake = decoder_->triggered();
      decoder_->ProcessSamples(pcm.data() + start,
                               static_cast<int>(std::min<size_t>(441, pcm.size() - start)));
      now_ += std::chrono::milliseconds(10);
      DecodeResults results;
      if (n % 25 == 0) found += decoder_->DecodeTokens(&results);
      if (awake_blocks != nullptr) *awake_blocks += decoder_->triggered();
      if (wakes != nullptr) *wakes += decoder_->triggered() && !was_awake;
    }
    return found;
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
  Listen(Heard(3.0, {.snr_db = 0.0}));
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

// After a broadcast the decoder goes back to sleep within about a second
// of the last token and stays asleep on quiet audio, digital silence
// included; a new broadcast wakes it again.
TEST_F(HotsoundDecoderTest, SleepsAfterBroadcastUntilTheNext) {
  const struct {
    const char* name;
    std::vector<int16_t> quiet;
  } kCases[] = {
      {"quiet room", ToPcm(sorvel_sim::MakeNoise(sorvel_sim::NoiseKind::kWhite, 20 * 44100, 33.0, 3))},
      {"digital silence", std::vector<int16_t>(20 * 44100, 0)},
  };
  const std::vector<int16_t> strong = Heard(3.0, {}, 28000.0);  // near full scale, no noise
  for (const auto& c : kCases) {
    ASSERT_GE(Listen(strong), 1) << c.name;
    int awake = 0, wakes = 0;
    Listen(c.quiet, &awake, &wakes);
    EXPECT_FALSE(decoder_->triggered()) << c.name;
    EXPECT_EQ(wakes, 0) << c.name;
    // The DSSS decoder finds the token in its ~3 s of buffered audio for a
    // while; a second after that, plus a request interval, it sleeps.
    EXPECT_LE(awake, 500) << c.name;
    ASSERT_GE(Listen(Heard(3.0, {.snr_db = 0.0})), 1) << c.name;
    Listen(std::vector<int16_t>(6 * 44100, 0));
    EXPECT_FALSE(decoder_->triggered()) << c.name;
  }
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
