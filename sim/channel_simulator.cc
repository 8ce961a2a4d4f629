#include "sim/channel_simulator.h"

#include <algorithm>
#include <numbers>
#include <random>

#include <complex>

#include "audio/dsp/kiss_fft.h"
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
      WidebandKernel(input_rate, output_rate), audio_dsp::kDefaultMaxDenominator);
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

namespace {

// The smallest even length >= n that the FFT handles without Bluestein.
int FastEvenSize(size_t n) {
  int size = static_cast<int>(std::max<size_t>(n, 2));
  while (size % 2 != 0 || !audio_dsp::IsFastFFTSize(size)) ++size;
  return size;
}

// Multiplies the spectrum of the zero-padded signal by gain(f).
template <typename Gain>
void FilterInFrequency(std::vector<float>* signal, double rate, Gain gain) {
  const size_t n = signal->size();
  const int size = FastEvenSize(n + 4096);  // padding absorbs the short response
  std::vector<float> padded(size, 0.0f);
  std::copy(signal->begin(), signal->end(), padded.begin());
  audio_dsp::RealFFTTransformer fft(size, /*normalize_inverse=*/true);
  std::vector<std::complex<float>> spectrum;
  fft.Forward(padded, &spectrum);
  for (size_t k = 0; k < spectrum.size(); ++k) {
    spectrum[k] *= static_cast<float>(gain(k * rate / size));
  }
  fft.Inverse(spectrum, &padded);
  std::copy_n(padded.begin(), n, signal->begin());
}

}  // namespace

std::vector<float> Convolve(std::span<const float> a, std::span<const float> b) {
  if (a.empty() || b.empty()) return {};
  const size_t n = a.size() + b.size() - 1;
  const int size = FastEvenSize(n);
  audio_dsp::RealFFTTransformer fft(size, /*normalize_inverse=*/true);
  std::vector<float> pa(size, 0.0f), pb(size, 0.0f);
  std::copy(a.begin(), a.end(), pa.begin());
  std::copy(b.begin(), b.end(), pb.begin());
  std::vector<std::complex<float>> sa, sb;
  fft.Forward(pa, &sa);
  fft.Forward(pb, &sb);
  for (size_t k = 0; k < sa.size(); ++k) sa[k] *= sb[k];
  fft.Inverse(sa, &pa);
  pa.resize(n);
  return pa;
}

std::vector<float> RoomImpulseResponse(double rt60, double direct_to_reverberant_db,
                                       double rate, uint64_t seed) {
  const size_t start = static_cast<size_t>(0.003 * rate);
  const size_t length = start + static_cast<size_t>(rt60 * rate);
  std::vector<float> h(std::max<size_t>(length, 1), 0.0f);
  h[0] = 1.0f;
  if (length <= start) return h;
  std::mt19937_64 rng(seed ^ 0x5eed5eedULL);
  std::normal_distribution<double> normal;
  // exp(-6.908 t / rt60) is -60 dB at t = rt60.
  const double decay = 6.907755 / (rt60 * rate);
  double energy = 0.0;
  for (size_t i = start; i < length; ++i) {
    h[i] = static_cast<float>(normal(rng) * std::exp(-decay * (i - start)));
    energy += static_cast<double>(h[i]) * h[i];
  }
  const double scale = std::sqrt(std::pow(10.0, -direct_to_reverberant_db / 10.0) / energy);
  for (size_t i = start; i < length; ++i) h[i] = static_cast<float>(h[i] * scale);
  return h;
}

std::string CheckChannel(const ChannelConfig& c) {
  if (!(c.room.distance > 0)) return "distance must be positive";
  if (!(c.input_rate > 0 && c.input_rate <= 1e6) || !(c.output_rate > 0 && c.output_rate <= 1e6)) {
    return "sample rates must be positive (at most 1 MHz)";
  }
  if (!(std::fabs(c.speed) < kSpeedOfSound)) return "speed must be below the speed of sound";
  if (!(c.rt60 >= 0 && c.rt60 <= 20) || !(c.band_limit >= 0) || !(c.clip >= 0)) {
    return "rt60 (at most 20 s), band_limit and clip must not be negative";
  }
  if (std::isnan(c.snr_db) || !std::isfinite(c.gain_db) ||
      !std::isfinite(c.interference_gain_db) || !(c.leading_silence >= 0) ||
      !(c.trailing_silence >= 0) || c.channels < 1) {
    return "snr_db must be a number, gains finite, silences not negative, channels positive";
  }
  if (c.room.HasSize()) return CheckRoom(c.room);
  return "";
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
  const size_t broadcast_length = signal.size();
  const RoomConfig& room = config.room;
  const bool physical = room.HasSize();
  size_t delay = 0;  // samples of the direct path
  if (physical) {
    Placement placement;
    if (!PlaceInRoom(room, config.seed, &placement, nullptr)) return {};
    if (room.phone_speaker) FilterInFrequency(&signal, config.output_rate, PhoneSpeakerGain);
    signal =
        Convolve(signal, RoomImpulseResponse(room, placement, config.output_rate, config.seed));
    delay = static_cast<size_t>(std::lround(DirectPathSeconds(placement) * config.output_rate));
  } else if (config.rt60 > 0.0) {
    signal = Convolve(signal, RoomImpulseResponse(config.rt60, config.direct_to_reverberant_db,
                                                  config.output_rate, config.seed));
  }
  if (config.band_limit > 0.0) {
    // A fourth-order Butterworth magnitude: -3 dB at the limit, -24 dB an
    // octave above.
    FilterInFrequency(&signal, config.output_rate, [&](double f) {
      return 1.0 / std::sqrt(1.0 + std::pow(f / config.band_limit, 8.0));
    });
  }
  const size_t arrival = std::min(delay, signal.size());
  const double signal_power = Power(std::span<const float>(signal).subspan(
      arrival, std::min(broadcast_length, signal.size() - arrival)));

  const size_t lead = static_cast<size_t>(std::lround(config.leading_silence * config.output_rate));
  const size_t trail =
      static_cast<size_t>(std::lround(config.trailing_silence * config.output_rate));
  std::vector<float> mono(lead + broadcast_length + trail, 0.0f);
  std::copy_n(signal.begin(), std::min(signal.size(), mono.size() - lead), mono.begin() + lead);

  if (std::isfinite(config.snr_db) && signal_power > 0.0) {
    const double noise_rms = std::sqrt(signal_power / std::pow(10.0, config.snr_db / 10.0));
    const std::vector<float> noise = MakeNoise(config.noise, mono.size(), noise_rms, config.seed);
    for (size_t i = 0; i < mono.size(); ++i) mono[i] += noise[i];
  }
  if (!config.interference.empty()) {
    const float gain = static_cast<float>(std::pow(10.0, config.interference_gain_db / 20.0));
    for (size_t i = 0; i < mono.size(); ++i) {
      mono[i] += gain * config.interference[i % config.interference.size()];
    }
  }
  if (physical && room.phone_microphone) {
    FilterInFrequency(&mono, config.output_rate, PhoneMicrophoneGain);
    ApplyAgc(&mono, config.output_rate);
  }
  if (config.gain_db != 0.0) {
    const float gain = static_cast<float>(std::pow(10.0, config.gain_db / 20.0));
    for (float& v : mono) v *= gain;
  }
  if (config.clip > 0.0 || physical) {
    double fraction = config.clip > 0.0 ? config.clip : 1.0;
    if (physical) fraction = std::min(fraction, 1.0);  // the microphone's full scale
    const float limit = static_cast<float>(fraction * 32767.0);
    for (float& v : mono) v = std::clamp(v, -limit, limit);
  }

  if (config.channels <= 1) return mono;
  std::vector<float> interleaved(mono.size() * config.channels);
  for (size_t i = 0; i < mono.size(); ++i) {
    for (int c = 0; c < config.channels; ++c) interleaved[i * config.channels + c] = mono[i];
  }
  return interleaved;
}

}  // namespace sorvel_sim
