#include "sim/channel_simulator.h"

#include <algorithm>
#include <numbers>
#include <random>

#include "audio/dsp/rational_factor_resampler.h"
#include "audio/dsp/resampler.h"

namespace sorvel_sim {
namespace {

// A Kaiser-windowed sinc reaching 48 samples of the slower rate each way:
// a transition band narrow enough to keep 0.47 of the lower rate nearly
// untouched.
class WidebandKernel : public audio_dsp::ResamplingKernel {
 public:
  WidebandKernel(double input_rate, double output_rate)
      : ResamplingKernel(input_rate, output_rate,
                         48.0 * std::max(1.0, input_rate / output_rate)),
        cutoff_(2.0 * 0.485 * std::min(input_rate, output_rate) / input_rate),
        norm_(audio_dsp::BesselI0(kBeta)) {}

  double Eval(double x) const override {
    const double u = x / radius_;
    if (std::fabs(u) > 1.0) return 0.0;
    const double y = std::numbers::pi * cutoff_ * x;
    const double sinc = std::fabs(y) < 1e-12 ? 1.0 : std::sin(y) / y;
    return cutoff_ * sinc * audio_dsp::BesselI0(kBeta * std::sqrt(1.0 - u * u)) / norm_;
  }
  bool Valid() const override { return input_sample_rate_ > 0 && output_sample_rate_ > 0; }

 private:
  static constexpr double kBeta = 10.0;
  double cutoff_;
  double norm_;
};

}  // namespace

std::vector<float> RenderLoopedBroadcast(const audio_sorvane::AudioModemEncoder& encoder,
                                         const std::vector<float>& token_audio,
                                         double seconds) {
  std::vector<float> out;
  if (token_audio.empty()) return out;
  encoder.MakeStartTransition(token_audio, &out);
  const double wanted = seconds * encoder.OutputSampleRate();
  const int repeats =
      std::max(1, static_cast<int>(std::ceil(wanted / static_cast<double>(token_audio.size()))));
  for (int r = 0; r < repeats; ++r) out.insert(out.end(), token_audio.begin(), token_audio.end());
  std::vector<float> stop;
  encoder.MakeStopTransition(token_audio, &stop);
  out.insert(out.end(), stop.begin(), stop.end());
  return out;
}

std::vector<float> ResampleHighQuality(std::span<const float> input, double input_rate,
                                       double output_rate) {
  if (input_rate == output_rate) return {input.begin(), input.end()};
  audio_dsp::RationalFactorResampler<float> resampler(
      WidebandKernel(input_rate, output_rate), 2000);
  std::vector<float> out, tail;
  resampler.ProcessSamples(input, &out);
  resampler.Flush(&tail);
  out.insert(out.end(), tail.begin(), tail.end());
  out.resize(static_cast<size_t>(std::lround(input.size() * output_rate / input_rate)));
  return out;
}

std::vector<float> MakeNoise(NoiseKind kind, size_t num_samples, double rms, uint64_t seed) {
  std::mt19937_64 rng(seed);
  std::normal_distribution<double> normal(0.0, 1.0);
  std::vector<double> noise(num_samples);
  if (kind == NoiseKind::kWhite) {
    for (double& v : noise) v = normal(rng);
  } else {
    // Paul Kellet's economy pink filter: -3 dB per octave within 0.5 dB
    // above a few Hz.
    double b0 = 0, b1 = 0, b2 = 0;
    for (double& v : noise) {
      const double w = normal(rng);
      b0 = 0.99765 * b0 + w * 0.0990460;
      b1 = 0.96300 * b1 + w * 0.2965164;
      b2 = 0.57000 * b2 + w * 1.0526913;
      v = b0 + b1 + b2 + w * 0.1848;
    }
  }
  double power = 0.0;
  for (double v : noise) power += v * v;
  const double scale = num_samples > 0 && power > 0 ? rms / std::sqrt(power / num_samples) : 0.0;
  std::vector<float> out(num_samples);
  for (size_t i = 0; i < num_samples; ++i) out[i] = static_cast<float>(noise[i] * scale);
  return out;
}

double Power(std::span<const float> samples) {
  double sum = 0.0;
  for (float v : samples) sum += static_cast<double>(v) * v;
  return samples.empty() ? 0.0 : sum / static_cast<double>(samples.size());
}

std::vector<float> ApplyChannel(std::span<const float> broadcast, const ChannelConfig& config) {
  // Motion: a source approaching at v is heard (1 + v / c) times faster.
  const double speed_factor = 1.0 + config.speed / kSpeedOfSound;
  std::vector<float> signal =
      ResampleHighQuality(broadcast, config.input_rate * speed_factor, config.output_rate);
  float peak = 0.0f;
  for (float v : broadcast) peak = std::max(peak, std::fabs(v));
  if (peak > 0.0f) {
    const float scale = static_cast<float>(config.level / peak);
    for (float& v : signal) v *= scale;
  }
  const double signal_power = Power(signal);

  const size_t lead = static_cast<size_t>(std::lround(config.leading_silence * config.output_rate));
  const size_t trail =
      static_cast<size_t>(std::lround(config.trailing_silence * config.output_rate));
  std::vector<float> mono(lead + signal.size() + trail, 0.0f);
  std::copy(signal.begin(), signal.end(), mono.begin() + lead);

  if (std::isfinite(config.snr_db) && signal_power > 0.0) {
    const double noise_rms = std::sqrt(signal_power / std::pow(10.0, config.snr_db / 10.0));
    const std::vector<float> noise = MakeNoise(config.noise, mono.size(), noise_rms, config.seed);
    for (size_t i = 0; i < mono.size(); ++i) mono[i] += noise[i];
  }

  if (config.channels <= 1) return mono;
  std::vector<float> interleaved(mono.size() * config.channels);
  for (size_t i = 0; i < mono.size(); ++i) {
    for (int c = 0; c < config.channels; ++c) interleaved[i * config.channels + c] = mono[i];
  }
  return interleaved;
}

}  // namespace sorvel_sim
