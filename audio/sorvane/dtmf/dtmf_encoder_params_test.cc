#include "audio/sorvane/dtmf/dtmf_encoder_params.h"

#include <vector>

#include "gmock/gmock.h"
#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace audio_sorvane {
namespace {

using sorvel_test::CheckFailed;

TEST(DtmfEncoderParamsTest, Defaults) {
  const DtmfEncoderParams params;
  EXPECT_THAT(params.tone_frequencies,
              testing::Pointwise(testing::FloatNear(1e-3),
                                 {740.0f, 830.6219f, 932.3416f, 1108.7473f, 1244.5267f,
                                  1480.0f, 1661.2438f, 1864.6832f, 2217.4946f, 2489.0535f}));
  ASSERT_EQ(params.symbol_table.size(), 45u);
  EXPECT_EQ(params.symbol_table[8], (std::vector<int>{0, 9}));
  EXPECT_EQ(params.symbol_table[9], (std::vector<int>{1, 2}));
  EXPECT_EQ(params.symbol_table[44], (std::vector<int>{8, 9}));
  EXPECT_EQ(params.spacer_symbol, 44);
  EXPECT_EQ(FrameSize(params), 2208);
  EXPECT_EQ(SymbolsInToken(params), 8);
  EXPECT_FLOAT_EQ(TokenDurationSeconds(params), 9 * 2208 / 44100.0f);

  DtmfEncoderParams custom;
  SetToneFrequencies({500, 600, 700, 800}, 3, &custom);
  EXPECT_EQ(custom.symbol_table.size(), 4u);
  EXPECT_EQ(custom.symbol_table[3], (std::vector<int>{1, 2, 3}));
  EXPECT_EQ(custom.spacer_symbol, 3);
  EXPECT_EQ(custom.tones_per_symbol, 2);  // left to the caller
}

// Verifies each ADSR stage, the zero-length-stage midpoint, the tolerance on
// the total duration and the refusals, which keep the old window.
TEST(DtmfEncoderParamsTest, AdsrWindow) {
  DtmfEncoderParams params;
  ASSERT_TRUE(SetAdsrWindow(&params, 0.0f, 0.0f, 0.05f, 0.0f, 0.25f));
  ASSERT_EQ(params.window_samples.size(), 2208u);
  EXPECT_EQ(params.window_samples[0], 0.5f);
  EXPECT_EQ(params.window_samples[1], 0.25f);
  EXPECT_EQ(params.window_samples[2204], 0.25f);  // t = 0.04998 s
  EXPECT_EQ(params.window_samples[2207], 0.0f);   // past the 0.05 s total

  ASSERT_TRUE(SetAdsrWindow(&params, 0.01f, 0.01f, 0.01f, 0.01f, 0.5f));
  EXPECT_EQ(params.window_samples[0], 0.0f);
  EXPECT_NEAR(params.window_samples[220], 0.5f, 0.01f);   // mid-attack
  EXPECT_NEAR(params.window_samples[441], 1.0f, 0.01f);   // attack peak
  EXPECT_EQ(params.window_samples[1000], 0.5f);            // sustain
  EXPECT_NEAR(params.window_samples[1544], 0.25f, 0.01f);  // mid-release
  EXPECT_EQ(params.window_samples[1800], 0.0f);
  EXPECT_TRUE(SetAdsrWindow(&params, 0.0f, 0.0f, 0.05f * 1.0000004f, 0.0f, 1.0f));

  const std::vector<float> kept = params.window_samples;
  sorvel_test::ScopedLogCapture capture;
  EXPECT_FALSE(SetAdsrWindow(&params, 0.0f, 0.0f, 0.0501f, 0.0f, 1.0f));
  EXPECT_TRUE(capture.Contains(sorvel_base::ERROR,
                               "SetAdsrWindow(): Nonzero duration 0.0501 exceeds 0.05."));
  EXPECT_FALSE(SetAdsrWindow(&params, -0.01f, 0.0f, 0.0f, 0.0f, 1.0f));
  EXPECT_TRUE(capture.Contains(sorvel_base::ERROR,
                               "SetAdsrWindow(): Time parameters must be nonnegative."));
  EXPECT_FALSE(SetAdsrWindow(&params, 0.0f, 0.0f, 0.0f, 0.0f, 1.5f));
  EXPECT_TRUE(capture.Contains(sorvel_base::ERROR,
                               "SetAdsrWindow(): Sustain amplitude 1.5 is outside of [0, 1]."));
  EXPECT_FALSE(SetAdsrWindow(nullptr, 0.0f, 0.0f, 0.0f, 0.0f, 1.0f));
  EXPECT_TRUE(capture.Contains(sorvel_base::ERROR, "SetAdsrWindow(): Called with null pointer."));
  EXPECT_EQ(params.window_samples, kept);
}

TEST(DtmfEncoderParamsTest, SineWindowStartsAtZero) {
  DtmfEncoderParams params;
  SetSineWindow(&params);
  ASSERT_EQ(params.window_samples.size(), 2208u);
  EXPECT_EQ(params.window_samples[0], 0.0f);
  EXPECT_FLOAT_EQ(params.window_samples[1104], 1.0f);
  EXPECT_GT(params.window_samples[2207], 0.0f);  // the zero lies past the frame
}

#if GTEST_HAS_DEATH_TEST
// Verifies that records whose tables would be indexed out of range end the
// process.
TEST(DtmfEncoderParamsDeathTest, CheckRejectsIndicesOutOfRange) {
  struct Case {
    void (*mutate)(DtmfEncoderParams*);
    const char* check;
  };
  const Case cases[] = {
      {[](DtmfEncoderParams* p) { p->window_samples = {1.0f}; },
       "static_cast<int>(params.window_samples.size()) == frame_size"},
      {[](DtmfEncoderParams* p) { p->symbol_table[0] = {0, 10}; },
       "index < static_cast<int>(params.tone_frequencies.size())"},
      {[](DtmfEncoderParams* p) { p->spacer_symbol = 45; },
       "params.spacer_symbol < static_cast<int>(params.symbol_table.size())"},
  };
  for (const Case& c : cases) {
    DtmfEncoderParams params;
    c.mutate(&params);
    EXPECT_DEATH(CheckDtmfEncoderParams(params), CheckFailed(c.check)) << c.check;
  }
}
#endif

}  // namespace
}  // namespace audio_sorvane
