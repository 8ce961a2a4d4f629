#include "audio/sorvane/dtmf/dtmf_encoder.h"

#include <algorithm>
#include <cmath>
#include <numbers>
#include <vector>

#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace audio_sorvane {
namespace {

// The frame of a tone pair, windowed, before the burst's peak scaling.
std::vector<float> ReferenceFrame(const DtmfEncoderParams& params, int symbol,
                                  const std::vector<float>& window) {
  std::vector<float> frame(window.size(), 0.0f);
  for (int index : params.symbol_table[symbol]) {
    const float w = static_cast<float>(params.tone_frequencies[index] * 2.0 *
                                       std::numbers::pi / params.sample_rate);
    for (size_t i = 0; i < frame.size(); ++i) frame[i] += std::sin(w * static_cast<float>(i));
  }
  for (size_t i = 0; i < frame.size(); ++i) frame[i] *= window[i];
  return frame;
}

// An all-zero token is the spacer frame and eight frames of symbol 0, each
// starting from phase zero under the half-sine window, scaled to peak 1.
TEST(DtmfEncoderTest, ZeroTokenIsSpacerThenSymbolZero) {
  const DtmfEncoderParams params;
  const DtmfEncoder encoder(params);
  std::vector<float> audio;
  encoder.EncodeToken(std::vector<uint8_t>(5, 0), &audio);
  ASSERT_EQ(audio.size(), 19872u);
  float peak = 0.0f;
  for (float v : audio) peak = std::max(peak, std::fabs(v));
  EXPECT_FLOAT_EQ(peak, 1.0f);

  const std::vector<float>& window = encoder.params().window_samples;
  const std::vector<float> spacer = ReferenceFrame(params, 44, window);
  const std::vector<float> zero = ReferenceFrame(params, 0, window);
  const float scale = audio[1] / spacer[1];
  for (int frame = 0; frame < 9; ++frame) {
    const std::vector<float>& expected = frame == 0 ? spacer : zero;
    EXPECT_EQ(audio[frame * 2208], 0.0f);
    for (int i = 0; i < 2208; i += 101) {
      ASSERT_NEAR(audio[frame * 2208 + i], scale * expected[i], 1e-5) << frame << ", " << i;
    }
  }
  std::vector<float> again;
  encoder.EncodeToken(std::vector<uint8_t>(5, 0), &again);
  EXPECT_EQ(again, audio);
}

// With a checksum the burst gains one frame; symbols summing to a multiple
// of 44 give checksum symbol 0 (the same frame as the data symbol 0).
TEST(DtmfEncoderTest, ChecksumFrame) {
  DtmfEncoderParams params;
  params.use_checksum_symbol = true;
  const DtmfEncoder encoder(params);
  std::vector<float> audio;
  encoder.EncodeSymbols({1, 43, 0, 0, 0, 0, 0, 0}, &audio);
  ASSERT_EQ(audio.size(), 10u * 2208);
  for (int i = 0; i < 2208; i += 50) EXPECT_EQ(audio[9 * 2208 + i], audio[3 * 2208 + i]);
}

#if GTEST_HAS_DEATH_TEST
// Verifies that a symbol sequence of the wrong length ends the process.
TEST(DtmfEncoderDeathTest, RejectsInvalidSymbolSequences) {
  const DtmfEncoder encoder{DtmfEncoderParams()};
  std::vector<float> audio;
  const std::string check =
      sorvel_test::CheckFailed("IsValidSymbolSequence(token_message_symbols)");
  EXPECT_DEATH(encoder.EncodeSymbols(std::vector<int>(7, 0), &audio), check);
}
#endif

}  // namespace
}  // namespace audio_sorvane
