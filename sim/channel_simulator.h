// A simulated acoustic channel between a phone's speaker and another phone's
// microphone, for tests, benchmarks and `sorvel simulate` / `sorvel eval`.
//
// In order: the broadcast (what the sender plays, full scale +-1) is sped up
// or slowed down by the relative motion (Doppler, at 340 m/s) and resampled
// to the receiver's rate; scaled to `level` on the 16-bit scale the decoders
// take; convolved with a room (a direct path plus exponentially decaying
// noise with the given RT60); rolled off above the microphone's band limit;
// placed between leading and trailing silence; buried in white or pink
// noise at a full-band SNR (signal power measured over the broadcast only,
// noise power over the full band); mixed with an interfering recording;
// amplified by `gain_db` and clipped. Deterministic for a given seed.
//
// With a physical room (`room` has a size) the room's model replaces the
// exponential-noise one: the broadcast goes through the phone's loudspeaker
// response, the room's impulse response for a placement drawn from the
// seed (`level` is then the peak at 1 m on the loudspeaker's axis, the
// direct path delays the broadcast by distance / 343 m/s), and after the
// noise and interference through the microphone's response and AGC;
// everything is clipped at full scale (or `clip` if lower).
#ifndef SIM_CHANNEL_SIMULATOR_H_
#define SIM_CHANNEL_SIMULATOR_H_

#include <cmath>
#include <cstdint>
#include <span>
#include <string>
#include <vector>

#include "audio/audio_modem_encoder.h"
#include "audio/dsp/acoustics.h"
#include "sim/room_model.h"

namespace sorvel_sim {

using audio_dsp::kSpeedOfSound;  // m/s, as the receivers assume

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
  double rt60 = 0.0;              // s, reverberation time; 0: no room
  double direct_to_reverberant_db = 3.0;  // energy of the direct path over the tail
  double band_limit = 0.0;        // Hz, microphone roll-off (-3 dB); 0: none
  double gain_db = 0.0;           // applied to everything before clipping
  double clip = 0.0;              // fraction of full scale to clip at; 0: none
  // An interfering recording at the receiver's rate on the 16-bit scale
  // (looped to length), and its gain.
  std::vector<float> interference = {};
  double interference_gain_db = 0.0;
  RoomConfig room = {};  // with a size: the physical room instead of rt60
};

// Why ApplyChannel cannot simulate `config` (a rate that is not positive,
// a speed of sound or more, a negative RT60, band limit or clip, a room
// that fails CheckRoom), or "". The distance must be positive even
// without a room.
std::string CheckChannel(const ChannelConfig& config);

// The received signal, channels interleaved, on the 16-bit scale (not
// rounded; clipped only as configured). Empty when the physical room fails
// CheckRoom.
std::vector<float> ApplyChannel(std::span<const float> broadcast, const ChannelConfig& config);

// Resamples a whole signal with a long windowed-sinc kernel that keeps
// content up to 0.47 of the lower rate (the 18.5 kHz carrier survives
// 44.1 -> 48 kHz). For speed changes, input_rate = rate * (1 + v / c).
std::vector<float> ResampleHighQuality(std::span<const float> input, double input_rate,
                                       double output_rate);

// `num_samples` of Gaussian noise with the given RMS: white, or pink
// (-3 dB per octave). Deterministic for a seed.
std::vector<float> MakeNoise(NoiseKind kind, size_t num_samples, double rms, uint64_t seed);

// A room's impulse response at `rate`: 1 at time 0 (the direct path), then
// from 3 ms on Gaussian noise decaying by 60 dB over `rt60` seconds, its
// energy `direct_to_reverberant_db` below the direct path's.
std::vector<float> RoomImpulseResponse(double rt60, double direct_to_reverberant_db,
                                       double rate, uint64_t seed);

// Linear convolution through zero-padded FFTs: size a + b - 1.
std::vector<float> Convolve(std::span<const float> a, std::span<const float> b);

// Mean square of the samples.
double Power(std::span<const float> samples);

}  // namespace sorvel_sim

#endif  // SIM_CHANNEL_SIMULATOR_H_
