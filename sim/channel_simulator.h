// A simulated acoustic channel between a phone's speaker and another phone's
// microphone, for tests, benchmarks and `sorvel simulate`.
//
// The broadcast (what the sender plays, full scale +-1) is delayed by a
// leading silence, sped up or slowed down by the relative motion (Doppler,
// at 340 m/s), resampled to the receiver's rate, scaled to the 16-bit scale
// the decoders take, and buried in noise at a full-band SNR: signal power is
// measured over the broadcast only (not the silence), noise power over the
// full band. Deterministic for a given seed.
#ifndef SIM_CHANNEL_SIMULATOR_H_
#define SIM_CHANNEL_SIMULATOR_H_

#include <cmath>
#include <cstdint>
#include <span>
#include <vector>

#include "audio/audio_modem_encoder.h"

namespace sorvel_sim {

inline constexpr double kSpeedOfSound = 340.0;  // m/s

// What a phone plays: for DSSS the start transition, the token repeated to
// fill `seconds` (at least once) and the fade-out; for the multi-tone scheme
// the bursts back to back. Full scale +-1 at the encoder's output rate.
std::vector<float> RenderLoopedBroadcast(const audio_sorvane::AudioModemEncoder& encoder,
                                         const std::vector<float>& token_audio,
                                         double seconds);

enum class NoiseKind { kWhite, kPink };

struct ChannelConfig {
  double input_rate = 44100.0;    // Hz, rate of the broadcast
  double output_rate = 44100.0;   // Hz, the receiver's microphone
  double speed = 0.0;             // m/s, positive when approaching
  double leading_silence = 0.0;   // seconds before the broadcast starts
  double trailing_silence = 0.0;  // seconds after it ends
  double level = 16384.0;         // peak of the broadcast at the receiver
  double snr_db = INFINITY;       // full-band SNR; infinity: no noise
  NoiseKind noise = NoiseKind::kWhite;
  int channels = 1;               // the signal is copied to every channel
  uint64_t seed = 1;
};

// The received signal, channels interleaved, on the 16-bit scale (not
// clipped or rounded).
std::vector<float> ApplyChannel(std::span<const float> broadcast, const ChannelConfig& config);

// Resamples a whole signal with a long windowed-sinc kernel that keeps
// content up to 0.47 of the lower rate (the 18.5 kHz carrier survives
// 44.1 -> 48 kHz). For speed changes, input_rate = rate * (1 + v / c).
std::vector<float> ResampleHighQuality(std::span<const float> input, double input_rate,
                                       double output_rate);

// `num_samples` of Gaussian noise with the given RMS: white, or pink
// (-3 dB per octave). Deterministic for a seed.
std::vector<float> MakeNoise(NoiseKind kind, size_t num_samples, double rms, uint64_t seed);

// Mean square of the samples.
double Power(std::span<const float> samples);

}  // namespace sorvel_sim

#endif  // SIM_CHANNEL_SIMULATOR_H_
