#include "audio/sorvane/dtmf/tone_sequence_search.h"

#include <cmath>
#include <complex>
#include <random>
#include <vector>

#include "gtest/gtest.h"

namespace audio_sorvane {
namespace {

// Tone masks of a loop whose position p sounds the tones of pairs[p].
std::vector<uint32_t> MasksOf(const std::vector<std::pair<int, int>>& pairs, int num_tones) {
  std::vector<uint32_t> masks(num_tones, 0);
  for (size_t p = 0; p < pairs.size(); ++p) {
    masks[pairs[p].first] |= 1u << p;
    masks[pairs[p].second] |= 1u << p;
  }
  return masks;
}

// The masks with every loop position moved r places on.
std::vector<uint32_t> Rotated(const std::vector<uint32_t>& masks, int period, int r) {
  std::vector<uint32_t> out;
  for (uint32_t m : masks) out.push_back(((m << r) | (m >> (period - r))) & ((1u << period) - 1));
  return out;
}

// Frames of the loop through per-tone rooms: y_k(n) = sum_j h_k[j] a_k(n - j)
// with a decaying tail of random phase, plus complex Gaussian noise. The
// loop has been playing long before frame 0.
audio_dsp::ComplexMatrix RoomFrames(const std::vector<uint32_t>& masks, int period, int frames,
                                    int taps, double decay_per_frame, double noise,
                                    uint64_t seed) {
  std::mt19937_64 rng(seed);
  std::normal_distribution<double> normal;
  std::uniform_real_distribution<double> angle(0.0, 2.0 * M_PI);
  const int tones = static_cast<int>(masks.size());
  audio_dsp::ComplexMatrix y(frames, tones);
  for (int k = 0; k < tones; ++k) {
    std::vector<std::complex<double>> h(taps);
    for (int j = 0; j < taps; ++j) h[j] = std::polar(std::pow(decay_per_frame, j), angle(rng));
    for (int n = 0; n < frames; ++n) {
      std::complex<double> v(noise * normal(rng), noise * normal(rng));
      for (int j = 0; j < taps; ++j) {
        const int p = ((n - j) % period + period) % period;
        if (masks[k] >> p & 1) v += h[j];
      }
      y(n, k) = std::complex<float>(v);
    }
  }
  return y;
}

// Verifies that the masks come back from frames whose room tails are
// nearly as strong as the direct frame, with and without noise. The loop
// may come back moved by a few positions as a whole (the taps move with
// it); that reads as the same token.
TEST(ToneSequenceSearchTest, RecoversLoopThroughRoom) {
  struct Case {
    int room_taps;
    double decay_per_frame;  // amplitude per frame
    double noise;            // per frame and tone, against a direct tap of 1
    uint64_t seed;
  };
  const Case cases[] = {{6, 0.9, 0.0, 1}, {6, 0.8, 0.1, 2}, {6, 0.6, 0.1, 3}, {6, 0.9, 0.1, 4}};
  const std::vector<std::pair<int, int>> loop = {{8, 9}, {0, 1}, {0, 2}, {3, 7}, {4, 5},
                                                 {1, 6}, {2, 9}, {5, 8}, {6, 7}};
  const std::vector<uint32_t> truth = MasksOf(loop, 10);
  ToneSequenceSearch search({.num_tones = 10, .period = 9, .tones_per_symbol = 2, .num_taps = 6});
  for (const Case& c : cases) {
    SCOPED_TRACE(c.seed);
    const audio_dsp::ComplexMatrix y =
        RoomFrames(truth, 9, 36, c.room_taps, c.decay_per_frame, c.noise, c.seed);
    std::vector<uint32_t> masks;
    double cost = -1.0;
    ASSERT_TRUE(search.Search(y, &masks, &cost));
    bool found = false;
    for (int r = 0; r < 9; ++r) found |= masks == Rotated(truth, 9, r);
    EXPECT_TRUE(found);
    // The fit leaves the noise (2 noise^2 per frame and tone) or less.
    EXPECT_LE(cost, 2.0 * c.noise * c.noise * 36 * 10 + 1e-5 * y.cwiseAbs2().sum());
    EXPECT_NEAR(search.residual(0, 0), y.col(0).cwiseAbs2().sum(), 1e-3 * y.col(0).cwiseAbs2().sum());
  }
}

// Verifies that every position of the answer holds tones_per_symbol tones
// even when the per-tone best masks disagree (pure noise), and that fewer
// frames than one loop give no answer.
TEST(ToneSequenceSearchTest, AnswerKeepsToneCounts) {
  for (int tones_per_symbol : {1, 2, 3}) {
    ToneSequenceSearch search(
        {.num_tones = 8, .period = 7, .tones_per_symbol = tones_per_symbol, .num_taps = 4});
    const audio_dsp::ComplexMatrix noise =
        RoomFrames(std::vector<uint32_t>(8, 0), 7, 28, 1, 0.0, 1.0, 7);
    std::vector<uint32_t> masks;
    double cost = 0.0;
    ASSERT_TRUE(search.Search(noise, &masks, &cost)) << tones_per_symbol;
    for (int p = 0; p < 7; ++p) {
      int count = 0;
      for (uint32_t m : masks) count += m >> p & 1;
      EXPECT_EQ(count, tones_per_symbol) << "position " << p;
    }
    EXPECT_FALSE(search.Search(noise.topRows(6), &masks, &cost));
  }
}

// Verifies the limits the search accepts.
TEST(ToneSequenceSearchTest, SupportedLimits) {
  struct Case {
    ToneSequenceSearchParams params;
    bool supported;
  };
  const Case cases[] = {
      {{}, true},
      {{.period = 12}, true},
      {{.period = 13}, false},             // too many masks
      {{.period = 9, .num_taps = 10}, false},  // taps beyond the loop
      {{.num_tones = 33}, false},
      {{.num_tones = 12, .period = 12, .tones_per_symbol = 4}, false},  // 5^12 states
      {{.masks_per_tone = 0}, false},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(ToneSequenceSearch::Supported(c.params), c.supported)
        << c.params.num_tones << " tones, period " << c.params.period << ", "
        << c.params.num_taps << " taps";
  }
}

}  // namespace
}  // namespace audio_sorvane
