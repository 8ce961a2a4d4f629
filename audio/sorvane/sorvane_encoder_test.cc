#include "audio/sorvane/sorvane_encoder.h"

#include <algorithm>
#include <cmath>
#include <complex>
#include <memory>
#include <vector>

#include "audio/dsp/kiss_fft.h"
#include "audio/sorvane/token_selector.h"
#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace audio_sorvane {
namespace {

std::shared_ptr<const SymbolWaveCoder> DefaultCoder() {
  static const auto* coder =
      new std::shared_ptr<const SymbolWaveCoder>(std::make_shared<SymbolWaveCoder>(
          SymbolWaveCoderParams()));
  return *coder;
}

SorvaneEncoder MakeEncoder(bool check_symbol, float rate = 44100.0f,
                           bool high_pass = false) {
  return SorvaneEncoder(DefaultCoder(), {.num_symbols = 16,
                                         .append_check_symbol = check_symbol,
                                         .high_pass_at_carrier = high_pass,
                                         .broadcast_sample_rate = rate});
}

float Peak(const std::vector<float>& x) {
  float peak = 0.0f;
  for (float v : x) peak = std::max(peak, std::fabs(v));
  return peak;
}

TEST(ComputeCheckSymbolTest, BringsSumToMultipleOfDataSymbols) {
  const int symbols[] = {3, 15, 0, 7};  // sum 25
  EXPECT_EQ(ComputeCheckSymbol(17, symbols), 7);  // 25 + 7 = 32
  EXPECT_EQ(ComputeCheckSymbol(17, std::vector<int>{16, 16}), 0);
  EXPECT_EQ(ComputeCheckSymbol(45, std::vector<int>{}), 0);
  EXPECT_EQ(ComputeCheckSymbol(45, std::vector<int>{43}), 1);
}

// Verifies the frame sequence (start frame, data, check symbol), the length
// at the broadcast rate and the peak.
TEST(SorvaneEncoderTest, EncodesStartDataAndCheckFrames) {
  const SymbolWaveCoder& coder = *DefaultCoder();
  const std::vector<uint8_t> token = {0x12, 0x34, 0x56, 0x78, 0x9A, 0xBC, 0xDE, 0xF0};
  std::vector<float> out;
  ASSERT_TRUE(MakeEncoder(true).Encode(token, &out));
  ASSERT_EQ(out.size(), 18u * 1905);
  EXPECT_EQ(Peak(out), 0.5f);
  const std::vector<int> symbols = {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15, 0};
  const float scale = out[0] / coder.StartWaveform()[0];
  const auto frame_matches = [&](int frame, int symbol) {
    for (int i = 0; i < 1905; i += 97) {
      if (std::fabs(out[frame * 1905 + i] - scale * coder.SymbolWaveform(symbol)[i]) > 1e-6) {
        return false;
      }
    }
    return true;
  };
  EXPECT_TRUE(frame_matches(0, 16));
  for (int f = 0; f < 16; ++f) EXPECT_TRUE(frame_matches(f + 1, symbols[f])) << f;
  EXPECT_TRUE(frame_matches(17, ComputeCheckSymbol(17, symbols)));

  ASSERT_TRUE(MakeEncoder(false, 48000.0f).Encode(token, &out));
  EXPECT_EQ(out.size(), 35249u);  // round(17 * 1905 * 48000 / 44100)
}

TEST(SorvaneEncoderTest, HighPassRemovesEverythingBelowCarrier) {
  std::vector<float> out;
  ASSERT_TRUE(MakeEncoder(false, 44100.0f, true).EncodeSymbols(std::vector<int>(16, 5), &out));
  std::vector<std::complex<float>> spectrum;
  audio_dsp::RealFFTTransformer(static_cast<int>(out.size()), false).Forward(out, &spectrum);
  const double bin_hz = 44100.0 / out.size();
  double below = 0.0, total = 0.0;
  for (size_t k = 0; k < spectrum.size(); ++k) {
    total += std::norm(spectrum[k]);
    if (k * bin_hz < 18496.0) below += std::norm(spectrum[k]);
  }
  EXPECT_LT(below / total, 1e-9);
}

TEST(SorvaneEncoderTest, RefusesWrongSymbolCountAndNullOutput) {
  sorvel_test::ScopedLogCapture capture;
  std::vector<float> out = {42.0f};
  EXPECT_FALSE(MakeEncoder(false).Encode({1, 2}, &out));
  EXPECT_TRUE(capture.Contains(sorvel_base::ERROR,
                               "EncodeSymbols() called with input of size 4, but expected 16."));
  EXPECT_EQ(out, std::vector<float>{42.0f});
  EXPECT_FALSE(MakeEncoder(false).EncodeSymbols(std::vector<int>(16), nullptr));
  EXPECT_TRUE(capture.Contains(sorvel_base::ERROR,
                               "EncodeSymbols() called with null output pointer."));
  EXPECT_FALSE(MakeEncoder(false).MakeStartTransition({}, &out));
  EXPECT_TRUE(capture.Contains(sorvel_base::ERROR,
                               "MakeStartTransition() called with empty input."));
  EXPECT_FALSE(MakeEncoder(false).MakeStopTransition(out, nullptr));
  EXPECT_TRUE(capture.Contains(sorvel_base::ERROR,
                               "MakeStopTransition() called with null output pointer."));
}

// 0.005 s at 44.1 kHz is 220.5 samples in float, rounded up to 221; the ramp
// ends where the looped waveform begins, wrapping around a short input; the
// stop transition fades out over the head.
TEST(SorvaneEncoderTest, TransitionsRampIntoAndOutOfTheLoop) {
  std::vector<float> input(1000);
  for (int i = 0; i < 1000; ++i) input[i] = static_cast<float>(i);
  std::vector<float> start, stop;
  const SorvaneEncoder encoder = MakeEncoder(false);
  ASSERT_TRUE(encoder.MakeStartTransition(input, &start));
  ASSERT_EQ(start.size(), 221u);
  EXPECT_FLOAT_EQ(start[0], 1.0f / 222 * 779);
  EXPECT_FLOAT_EQ(start[220], 221.0f / 222 * 999);
  ASSERT_TRUE(encoder.MakeStartTransition(std::vector<float>{1, 2, 3}, &start));
  EXPECT_FLOAT_EQ(start[220], 221.0f / 222 * 3);   // ends on the last sample
  EXPECT_FLOAT_EQ(start[219], 220.0f / 222 * 2);
  ASSERT_TRUE(encoder.MakeStopTransition(input, &stop));
  ASSERT_EQ(stop.size(), 221u);
  EXPECT_FLOAT_EQ(stop[0], 0.0f);
  EXPECT_FLOAT_EQ(stop[10], 211.0f / 222 * 10);
}

#if GTEST_HAS_DEATH_TEST
// Verifies that an encoder without a coder ends the process.
TEST(SorvaneEncoderDeathTest, RejectsMissingCoder) {
  EXPECT_DEATH(SorvaneEncoder(nullptr, {.broadcast_sample_rate = 44100}),
               sorvel_test::CheckFailed("symbol_wave_coder"));
}
#endif

}  // namespace
}  // namespace audio_sorvane
