#include "sim/channel_simulator.h"

#include <cmath>
#include <complex>
#include <numbers>
#include <vector>

#include "audio/dsp/kiss_fft.h"
#include "gtest/gtest.h"

namespace sorvel_sim {
namespace {

std::vector<float> Tone(double frequency, double rate, double seconds) {
  std::vector<float> x(static_cast<size_t>(seconds * rate));
  for (size_t i = 0; i < x.size(); ++i) {
    x[i] = static_cast<float>(0.5 * std::sin(2 * std::numbers::pi * frequency * i / rate));
  }
  return x;
}

// The frequency of the strongest bin, refined by parabolic interpolation.
double PeakFrequency(const std::vector<float>& x, double rate) {
  const int n = static_cast<int>(x.size()) / 2 * 2;
  std::vector<std::complex<float>> spectrum;
  audio_dsp::RealFFTTransformer(n, false).Forward(std::span(x).first(n), &spectrum);
  int k = 1;
  for (int i = 1; i + 1 < static_cast<int>(spectrum.size()); ++i) {
    if (std::abs(spectrum[i]) > std::abs(spectrum[k])) k = i;
  }
  const double a = std::log(std::abs(spectrum[k - 1])), b = std::log(std::abs(spectrum[k])),
               c = std::log(std::abs(spectrum[k + 1]));
  return (k + 0.5 * (a - c) / (a - 2 * b + c)) * rate / n;
}

// Verifies that the noise added has the asked full-band SNR against the
// broadcast's own power, silence excluded, for both noise colours.
TEST(ChannelSimulatorTest, SnrIsTheAskedSnr) {
  const std::vector<float> broadcast = Tone(1000.0, 44100, 1.0);
  for (NoiseKind kind : {NoiseKind::kWhite, NoiseKind::kPink}) {
    for (double snr : {10.0, 0.0, -15.0}) {
      ChannelConfig config{.leading_silence = 0.5, .trailing_silence = 0.5, .snr_db = snr,
                           .noise = kind, .seed = 4};
      const std::vector<float> noisy = ApplyChannel(broadcast, config);
      config.snr_db = INFINITY;
      const std::vector<float> clean = ApplyChannel(broadcast, config);
      ASSERT_EQ(noisy.size(), clean.size());
      std::vector<float> noise(noisy.size());
      for (size_t i = 0; i < noise.size(); ++i) noise[i] = noisy[i] - clean[i];
      const double signal_power = Power(std::span(clean).subspan(22050, 44100));
      EXPECT_NEAR(10 * std::log10(signal_power / Power(noise)), snr, 0.01) << snr;
    }
  }
}

// Motion at v shifts every frequency by (1 + v / c); the receiver rate does
// not change what frequency is heard.
TEST(ChannelSimulatorTest, SpeedShiftsTheCarrier) {
  const std::vector<float> carrier = Tone(18500.0, 44100, 1.0);
  for (double speed : {-1.0, 0.0, 1.0}) {
    for (double rate : {44100.0, 48000.0}) {
      const std::vector<float> heard =
          ApplyChannel(carrier, {.output_rate = rate, .speed = speed});
      EXPECT_NEAR(PeakFrequency(heard, rate), 18500.0 * (1 + speed / kSpeedOfSound), 0.5)
          << speed << " m/s at " << rate << " Hz";
    }
  }
}

TEST(ChannelSimulatorTest, SameSeedSameAudio) {
  const std::vector<float> broadcast = Tone(3000.0, 44100, 0.5);
  ChannelConfig config{.snr_db = 0.0, .seed = 11, .rt60 = 0.3};
  const std::vector<float> a = ApplyChannel(broadcast, config);
  EXPECT_EQ(a, ApplyChannel(broadcast, config));
  config.seed = 12;
  EXPECT_NE(a, ApplyChannel(broadcast, config));
}

// The room's tail decays by 60 dB over RT60 and carries the asked share of
// the energy; the band limit is -3 dB at the limit and about -24 dB an
// octave above; clipping bounds every sample.
TEST(ChannelSimulatorTest, RoomBandLimitAndClipping) {
  const std::vector<float> h = RoomImpulseResponse(0.3, 3.0, 48000, 1);
  double early = 0, late = 0, tail = 0;
  for (size_t i = 144; i < h.size(); ++i) {
    tail += h[i] * h[i];
    if (i < 144 + 2400) early += h[i] * h[i];
    if (i >= 144 + 7200 && i < 144 + 9600) late += h[i] * h[i];
  }
  EXPECT_NEAR(10 * std::log10(1.0 / tail), 3.0, 0.01);
  // 0.15 s apart: 30 dB of decay, within the noise of the estimate.
  EXPECT_NEAR(10 * std::log10(early / late), 30.0, 2.0);

  for (auto [frequency, expected_db] : {std::pair{4000.0, -3.01}, {8000.0, -24.08}}) {
    const std::vector<float> tone = Tone(frequency, 48000, 0.5);
    const std::vector<float> limited =
        ApplyChannel(tone, {.input_rate = 48000, .output_rate = 48000, .band_limit = 4000.0});
    const std::vector<float> full = ApplyChannel(tone, {.input_rate = 48000, .output_rate = 48000});
    EXPECT_NEAR(10 * std::log10(Power(std::span(limited).subspan(4800, 14400)) /
                                Power(std::span(full).subspan(4800, 14400))),
                expected_db, 0.1)
        << frequency;
  }
  const std::vector<float> loud = ApplyChannel(Tone(500.0, 44100, 0.1),
                                               {.gain_db = 20.0, .clip = 0.5});
  for (float v : loud) ASSERT_LE(std::fabs(v), 0.5f * 32767.0f);
}

}  // namespace
}  // namespace sorvel_sim
