// Sounds a receiver hears that are not broadcasts, for the wake-up tests
// and the false-wake tool: speech (espeak-ng), recorded music (the
// Frozen-Bubble module of Debian's fb-music-high, rendered by xmp) and
// clicks. All at 44.1 kHz on the 16-bit scale (not clipped).
#ifndef SIM_INTERFERERS_H_
#define SIM_INTERFERERS_H_

#include <cstddef>
#include <cstdint>
#include <vector>

namespace sorvel_sim {

// About 40 s of speech: several sentences in a few voices, resampled from
// espeak-ng's 22.05 kHz, peaks near `peak`. Empty if espeak-ng is missing.
std::vector<float> RenderSpeech(double peak);

// The module's 207 s (or its first `seconds`, if positive) as mono, scaled
// to peaks near `peak`. Empty if xmp or the module is missing.
std::vector<float> RenderMusic(double peak, int seconds = 0);

// `num_samples` of transients over faint noise (RMS 3): single-sample
// spikes, decaying knocks and taps at random times and levels up to
// `peak`, and stretches of regular ticks (a clock, a finger drumming).
std::vector<float> MakeClicks(size_t num_samples, double peak, uint64_t seed);

}  // namespace sorvel_sim

#endif  // SIM_INTERFERERS_H_
