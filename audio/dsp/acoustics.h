// Physical constants of sound in air shared by the receivers and the channel
// simulator.
#ifndef AUDIO_DSP_ACOUSTICS_H_
#define AUDIO_DSP_ACOUSTICS_H_

namespace audio_dsp {

// Speed of sound in air, m/s (dry air at about 15 degrees C). Converts the
// relative speed of sender and receiver into a Doppler factor.
inline constexpr double kSpeedOfSound = 340.0;

}  // namespace audio_dsp

#endif  // AUDIO_DSP_ACOUSTICS_H_
