#include "audio/sorvane/symbol_wave_coder.h"

#include <algorithm>
#include <cmath>
#include <vector>

#include "audio/sorvane/code_signal_generator.h"
#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace audio_sorvane {
namespace {

using sorvel_test::CheckFailed;

TEST(SymbolWaveCoderTest, DefaultGeometryAndPeak) {
  const SymbolWaveCoder coder{SymbolWaveCoderParams()};
  EXPECT_EQ(coder.samples_per_frame(), 1905);
  EXPECT_EQ(coder.carrier_cycles_per_frame(), 799);
  EXPECT_NEAR(coder.CarrierFrequency(), 18496.54f, 0.01f);
  EXPECT_EQ(coder.alphabet_size(), 17);
  EXPECT_EQ(coder.baseband_code().size(), 635u);
  EXPECT_EQ(coder.baseband_tones().rows(), 17);
  EXPECT_EQ(coder.baseband_tones().cols(), 635);
  float peak = 0.0f;
  for (int k = 0; k < 17; ++k) {
    ASSERT_EQ(coder.SymbolWaveform(k).size(), 1905u);
    for (float v : coder.SymbolWaveform(k)) peak = std::max(peak, std::fabs(v));
  }
  EXPECT_EQ(peak, 1.0f);
  EXPECT_EQ(coder.StartWaveform().data(), coder.SymbolWaveform(16).data());
}

// Verifies the template formula for one symbol (up to the common scale) and
// that the quadrature option moves the tone to the cosine carrier.
TEST(SymbolWaveCoderTest, TemplatesFollowTheModulation) {
  SymbolWaveCoderParams params;
  const SymbolWaveCoder coder(params);
  std::vector<float> u;
  InterpolateCode(params.code, 1905, &u);
  const double pi = std::acos(-1.0);
  std::vector<double> expected(1905);
  double scale = 0.0;
  for (int i = 0; i < 1905; ++i) {
    const double s = std::sin(799 * 2 * pi * i / 1905);
    const double tone = std::sin(2 * pi * (4 + 3) * i / 1905);
    expected[i] = u[i] * (s * tone + s);
    if (std::fabs(expected[i]) > 1e-3) scale = coder.SymbolWaveform(3)[i] / expected[i];
  }
  for (int i = 0; i < 1905; ++i) {
    ASSERT_NEAR(coder.SymbolWaveform(3)[i], scale * expected[i], 1e-5) << i;
  }
  params.use_quadrature = true;
  const SymbolWaveCoder quadrature(params);
  EXPECT_FALSE(std::equal(quadrature.SymbolWaveform(3).begin(),
                          quadrature.SymbolWaveform(3).end(),
                          coder.SymbolWaveform(3).begin()));
}

// Band-limited interpolation passes through the chips at their sample
// instants and keeps the code's scale.
TEST(SymbolWaveCoderTest, InterpolationPassesThroughChips) {
  for (int taps : {5, 7}) {
    const std::vector<float> code = GenerateCodeSignal(taps, 1);
    std::vector<float> up;
    InterpolateCode(code, 5 * static_cast<int>(code.size()), &up);
    ASSERT_EQ(up.size(), 5 * code.size());
    for (size_t i = 0; i < code.size(); ++i) EXPECT_NEAR(up[5 * i], code[i], 1e-4);
  }
}

#if GTEST_HAS_DEATH_TEST
// Verifies that a symbol outside the alphabet ends the process instead of
// reading past the templates.
TEST(SymbolWaveCoderDeathTest, RejectsSymbolsOutsideTheAlphabet) {
  const SymbolWaveCoder coder{SymbolWaveCoderParams()};
  EXPECT_DEATH(coder.SymbolWaveform(17), CheckFailed("symbol < alphabet_size_"));
}
#endif

}  // namespace
}  // namespace audio_sorvane
