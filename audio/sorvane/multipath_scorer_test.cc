#include "audio/sorvane/multipath_scorer.h"

#include <algorithm>
#include <cmath>
#include <complex>
#include <numbers>
#include <random>
#include <vector>

#include "audio/modem_config.h"
#include "audio/sorvane/symbol_wave_coder.h"
#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace audio_sorvane {
namespace {

using Complex = std::complex<double>;

// One path of a sparse channel: a delay in baseband samples and a gain.
struct Path {
  int lag;
  Complex gain;
};

struct Channel {
  std::vector<Path> paths;
  double doppler = 0.0;  // carrier cycles per frame, positive when approaching
  double noise = 0.0;    // RMS of each of the real and imaginary parts
  uint64_t seed = 1;
};

// Weak direct path, stronger echoes 3.5 to 11 ms later.
const std::vector<Path> kEchoes = {
    {0, {0.3, 0.0}}, {52, {0.0, 1.0}}, {118, {-0.8, 0.1}}, {165, {0.45, -0.45}}};
const std::vector<Path> kDry = {{0, {1.0, 0.0}}};

// The default DSSS coder (F = 635 baseband samples, C = 799 carrier cycles
// per frame) and the baseband its frames produce after the receiver's
// mixer. Frame 0 leaves the sender at absolute index kStart.
class MultipathScorerTest : public testing::Test {
 protected:
  static constexpr int kFrame = 635;
  static constexpr int kFine = 16;  // oversampling of the code table
  static constexpr int kStart = 2000;

  struct Baseband {
    std::vector<float> real, imag;
    BasebandView View(int64_t from = 0, int64_t to = -1) const {
      if (to < 0) to = static_cast<int64_t>(real.size());
      return {std::span<const float>(real).subspan(from, to - from),
              std::span<const float>(imag).subspan(from, to - from), from};
    }
  };

  MultipathScorerTest() : coder_(MakeSymbolWaveCoderParams({})) {
    InterpolateCode(coder_.params().code, kFrame * kFine, &fine_code_);
  }

  // The band-limited code at fractional position tau of a frame.
  double CodeAt(double tau) const {
    const double x = tau * kFine;
    const int i = static_cast<int>(std::floor(x));
    const double w = x - i;
    const int n = kFrame * kFine;
    return (1.0 - w) * fine_code_[((i % n) + n) % n] + w * fine_code_[((i + 1) % n + n) % n];
  }

  // The sender's time runs faster by 1 + f / C when it approaches: the
  // carrier rises by f cycles per frame and frames shorten by the same
  // factor. Each path adds the frames delayed by its lag; the carrier's
  // shift leaves a rotation of f cycles per frame in the baseband.
  Baseband Receive(const std::vector<int>& symbols, const Channel& channel) const {
    const double scale = 1.0 + channel.doppler / coder_.carrier_cycles_per_frame();
    int max_lag = 0;
    for (const Path& p : channel.paths) max_lag = std::max(max_lag, p.lag);
    const double frames = static_cast<double>(symbols.size());
    const size_t size = kStart + static_cast<size_t>(std::ceil(frames * kFrame / scale)) +
                        max_lag + 2 * kFrame;
    std::mt19937 rng(static_cast<uint32_t>(channel.seed));
    std::normal_distribution<double> noise(0.0, channel.noise);
    const int min_cycles = coder_.params().min_cycles_per_frame;
    Baseband out;
    for (size_t n = 0; n < size; ++n) {
      Complex sum = 0.0;
      for (const Path& p : channel.paths) {
        const double t = scale * (static_cast<double>(n) - kStart - p.lag);
        if (t < 0.0 || t >= frames * kFrame) continue;
        const int k = static_cast<int>(t / kFrame);
        const double tau = t - static_cast<double>(k) * kFrame;
        const double tone = std::sin(2.0 * std::numbers::pi * (min_cycles + symbols[k]) * tau / kFrame);
        sum += p.gain * CodeAt(tau) * (1.0 + tone);
      }
      sum *= std::polar(1.0, 2.0 * std::numbers::pi * channel.doppler * n / kFrame);
      out.real.push_back(static_cast<float>(sum.real() + noise(rng)));
      out.imag.push_back(static_cast<float>(sum.imag() + noise(rng)));
    }
    return out;
  }

  std::vector<int> RandomSymbols(int count, uint32_t seed) const {
    std::mt19937 rng(seed);
    std::uniform_int_distribution<int> symbol(0, coder_.alphabet_size() - 1);
    std::vector<int> symbols(count);
    for (int& s : symbols) s = symbol(rng);
    return symbols;
  }

  // Frames 0 .. count - 1 whose best score is not the symbol sent; -1 when
  // one cannot be scored.
  int SymbolErrors(MultipathScorer& scorer, const BasebandView& view,
                   const std::vector<int>& symbols, int count) const {
    int errors = 0;
    audio_dsp::FloatVector scores;
    for (int k = 0; k < count; ++k) {
      if (!scorer.Score(view, k, &scores)) return -1;
      int best = 0;
      scores.maxCoeff(&best);
      errors += best != symbols[k];
    }
    return errors;
  }

  // SymbolErrors of a new scorer with `params` that tracks from `start`
  // at rest.
  int ErrorsFromStart(const MultipathScorerParams& params, const Baseband& baseband,
                      const std::vector<int>& symbols, int count, int start = kStart) const {
    MultipathScorer scorer(coder_, params);
    scorer.StartTrack(start, 0.0f);
    return SymbolErrors(scorer, baseband.View(), symbols, count);
  }

  SymbolWaveCoder coder_;
  std::vector<float> fine_code_;
};

// Verifies that the Doppler search finds an applied offset within one
// step, towards and away from the receiver, whether the direct path or the
// echoes carry most of the energy.
TEST_F(MultipathScorerTest, SearchDopplerFindsOffset) {
  struct Case {
    double doppler;
    const std::vector<Path>* paths;
    int anchor_lag;  // the path the search starts on
  };
  const Case cases[] = {{-1.5, &kDry, 0},    {0.0, &kDry, 0},     {1.8, &kDry, 0},
                        {-1.5, &kEchoes, 0}, {0.0, &kEchoes, 52}, {1.8, &kEchoes, 52},
                        {2.2, &kEchoes, 0}};
  const MultipathScorerParams params;
  const std::vector<int> symbols = RandomSymbols(8, 5);
  uint64_t seed = 11;
  for (const Case& c : cases) {
    const Baseband baseband = Receive(symbols, {*c.paths, c.doppler, 2.0, seed++});
    MultipathScorer scorer(coder_, params);
    const float found = scorer.SearchDoppler(baseband.View(), kStart + c.anchor_lag);
    EXPECT_NEAR(found, c.doppler, params.doppler_step * 1.01)
        << "doppler " << c.doppler << ", " << c.paths->size() << " paths";
  }
}

// Verifies that transforms shorter than the receiver's lag window (10 ms
// before the frame, 20 ms after: 1076 samples), the overhang added
// directly, find the Doppler offset and score the frames as transforms
// holding the window whole do: in echoes (lags combined through transforms)
// and in a dry channel (combined directly), at rest and moving. The long
// echoes reach the lags whose correlations run past the transform.
TEST_F(MultipathScorerTest, OverhangingTransformMatchesWholeWindow) {
  const std::vector<Path> long_echoes = {
      {0, {0.5, 0.0}}, {60, {0.0, 0.6}}, {130, {-0.6, 0.2}}, {200, {0.4, 0.4}}, {275, {0.0, -0.9}}};
  MultipathScorerParams receiver;
  receiver.lead = 147;
  receiver.span = 294;
  MultipathScorerParams whole = receiver;
  whole.whole_window_transform = true;
  const std::vector<int> symbols = RandomSymbols(12, 9);
  for (const std::vector<Path>* paths : {&long_echoes, &kDry}) {
    for (double doppler : {0.0, 1.3}) {
      SCOPED_TRACE(testing::Message() << paths->size() << " paths, doppler " << doppler);
      const Baseband baseband = Receive(symbols, {*paths, doppler, 2.0, 17});
      MultipathScorer fast(coder_, receiver), reference(coder_, whole);
      EXPECT_EQ(fast.transform_size(), 1024);
      EXPECT_EQ(reference.transform_size(), 2048);
      const float found = reference.SearchDoppler(baseband.View(), kStart);
      EXPECT_EQ(fast.SearchDoppler(baseband.View(), kStart), found);
      fast.StartTrack(kStart, found);
      reference.StartTrack(kStart, found);
      audio_dsp::FloatVector a, b;
      for (int k = 0; k < 8; ++k) {
        ASSERT_TRUE(fast.Score(baseband.View(), k, &a));
        ASSERT_TRUE(reference.Score(baseband.View(), k, &b));
        EXPECT_LE((a - b).cwiseAbs().maxCoeff(), 1e-4f * b.cwiseAbs().maxCoeff()) << "frame " << k;
      }
    }
  }
}

// Verifies that every frame of a random sequence scores highest on the
// symbol sent through a channel whose echoes are stronger than the direct
// path, with the frame grid anchored on the direct path, on the strongest
// echo or 3 ms off either way; and that combining the lags is what does it:
// with more noise the strongest lag alone makes several times the errors.
TEST_F(MultipathScorerTest, ScoreGathersEchoesAroundAnchor) {
  constexpr int kFrames = 60;
  const std::vector<int> symbols = RandomSymbols(kFrames + 5, 21);
  const Baseband baseband = Receive(symbols, {kEchoes, 0.0, 4.0, 3});
  for (int anchor : {-44, 0, 44, 52}) {
    EXPECT_EQ(ErrorsFromStart({}, baseband, symbols, kFrames, kStart + anchor), 0)
        << "anchor " << anchor;
  }

  const Baseband noisy = Receive(symbols, {kEchoes, 0.0, 5.5, 4});
  MultipathScorerParams strongest_only;
  strongest_only.gate = 1e9f;
  const int rake_errors = ErrorsFromStart({}, noisy, symbols, kFrames);
  const int strongest_errors = ErrorsFromStart(strongest_only, noisy, symbols, kFrames);
  EXPECT_LT(2 * rake_errors, strongest_errors) << rake_errors << " vs " << strongest_errors;
  EXPECT_GE(strongest_errors, 4);
}

// Verifies that a moving sender is followed over a long sequence: the
// searched offset sets a frame period that keeps the grid on the frames
// and every symbol scores right.
TEST_F(MultipathScorerTest, ScoreFollowsMovingSender) {
  constexpr int kFrames = 40;
  const std::vector<int> symbols = RandomSymbols(kFrames + 5, 22);
  for (double doppler : {-1.7, 1.9}) {
    const Baseband baseband = Receive(symbols, {kEchoes, doppler, 3.0, 8});
    MultipathScorer scorer(coder_, {});
    scorer.StartTrack(kStart + 52, scorer.SearchDoppler(baseband.View(), kStart + 52));
    EXPECT_EQ(SymbolErrors(scorer, baseband.View(), symbols, kFrames), 0) << doppler;
  }
}

// Verifies that in a dry channel at low SNR the lags around the path get
// no weight: the scorer makes about as many symbol errors as scoring at the
// known lag alone (a few more from its channel estimate), where weighting
// every lag would make three times as many.
TEST_F(MultipathScorerTest, DryChannelGatesNoiseLags) {
  constexpr int kFrames = 100;
  const std::vector<int> symbols = RandomSymbols(kFrames + 5, 23);
  const Baseband baseband = Receive(symbols, {kDry, 0.0, 6.0, 4});
  MultipathScorerParams one_lag;
  one_lag.lead = 0;
  one_lag.span = 0;
  const int single_errors = ErrorsFromStart(one_lag, baseband, symbols, kFrames);
  ASSERT_GE(single_errors, 8);
  EXPECT_LE(ErrorsFromStart({}, baseband, symbols, kFrames),
            single_errors + single_errors / 4 + 3);
}

// Verifies the period of a moving sender: an approaching one (positive
// offset) compresses time by 1 + f / C, C = 799 carrier cycles per frame,
// and the track's grid follows the frames it sends.
TEST_F(MultipathScorerTest, PeriodFollowsDoppler) {
  MultipathScorer scorer(coder_, {});
  ASSERT_EQ(coder_.carrier_cycles_per_frame(), 799);
  EXPECT_DOUBLE_EQ(scorer.Period(0.0f), kFrame);
  for (float doppler : {-2.3f, -0.6f, 0.9f, 2.3f}) {
    const double expected = kFrame / (1.0 + doppler / 799.0);
    EXPECT_NEAR(scorer.Period(doppler), expected, 1e-6) << doppler;
    EXPECT_EQ(scorer.Period(doppler) < kFrame, doppler > 0.0f) << doppler;
    // 0.3 % of 635 samples: about 1.8 samples a frame at 1 m/s.
    scorer.StartTrack(kStart, doppler);
    EXPECT_DOUBLE_EQ(scorer.period(), scorer.Period(doppler));
    for (int k : {-3, 0, 1, 17, 200}) {
      EXPECT_NEAR(static_cast<double>(scorer.FrameStart(k)), kStart + k * expected, 0.5)
          << doppler << " frame " << k;
      EXPECT_EQ(scorer.NearestFrame(scorer.FrameStart(k) + 300), k);
      EXPECT_EQ(scorer.NearestFrame(scorer.FrameStart(k) - 300), k);
    }
  }
}

// Verifies the track's mechanics: a frame is scored only once the windows
// of its later neighbours are in the view; streaming views that slide
// along the buffer give the scores of one view holding everything; scored
// frames stay cached after their audio is gone until ForgetBefore drops
// them; StartTrack and Reset forget the cached frames.
TEST_F(MultipathScorerTest, TrackScoresOnceAndIndependentlyOfView) {
  constexpr int kFrames = 24;
  const std::vector<int> symbols = RandomSymbols(kFrames, 31);
  const Baseband baseband = Receive(symbols, {kEchoes, 0.0, 3.0, 5});
  const MultipathScorerParams params;
  const int64_t size = static_cast<int64_t>(baseband.real.size());

  // Everything in one view.
  MultipathScorer whole(coder_, params);
  EXPECT_FALSE(whole.has_track());
  whole.StartTrack(kStart, 0.0f);
  EXPECT_TRUE(whole.has_track());
  std::vector<audio_dsp::FloatVector> expected;
  audio_dsp::FloatVector scores;
  while (whole.Score(baseband.View(), static_cast<int64_t>(expected.size()), &scores)) {
    expected.push_back(scores);
  }
  // The last frames wait for neighbours after the end of the buffer.
  const int64_t last_end = whole.FrameStart(static_cast<int64_t>(expected.size()) +
                                            params.channel_frames) + kFrame + params.span;
  ASSERT_GT(last_end, size);
  ASSERT_GE(expected.size(), static_cast<size_t>(kFrames - params.channel_frames));

  // A frame waits for the window of its last sounded neighbour (the
  // channel is sounded on even frames) to the last sample.
  {
    MultipathScorer scorer(coder_, params);
    scorer.StartTrack(kStart, 0.0f);
    const int last_sounded = (5 + params.channel_frames) / 2 * 2;
    const int64_t end = scorer.FrameStart(last_sounded) + kFrame + params.span;
    EXPECT_FALSE(scorer.Score(baseband.View(0, end - 1), 5, &scores));
    ASSERT_TRUE(scorer.Score(baseband.View(0, end), 5, &scores));
    EXPECT_TRUE(scores.isApprox(expected[5], 1e-5f));
  }

  // Views of 12 frames, the buffer advancing by 10 ms blocks; each frame
  // is scored as soon as it can be, and what lies more than
  // channel_frames before the view is forgotten, as the decoder does.
  MultipathScorer streaming(coder_, params);
  streaming.StartTrack(kStart, 0.0f);
  std::vector<audio_dsp::FloatVector> streamed;
  for (int64_t end = 147; end < size + 147; end += 147) {
    const int64_t to = std::min(end, size);
    const int64_t from = std::max<int64_t>(0, to - 12 * kFrame);
    const BasebandView view = baseband.View(from, to);
    while (streaming.Score(view, static_cast<int64_t>(streamed.size()), &scores)) {
      streamed.push_back(scores);
    }
    streaming.ForgetBefore(streaming.NearestFrame(from) - params.channel_frames);
  }
  ASSERT_EQ(streamed.size(), expected.size());
  for (size_t k = 0; k < expected.size(); ++k) {
    EXPECT_TRUE(streamed[k].isApprox(expected[k], 1e-5f)) << "frame " << k;
  }

  // Scored frames answer from the cache, also once their audio is gone.
  const BasebandView late = baseband.View(whole.FrameStart(10), size);
  ASSERT_TRUE(whole.Score(late, 3, &scores));
  EXPECT_EQ(scores, expected[3]);
  whole.ForgetBefore(4);
  EXPECT_FALSE(whole.Score(late, 3, &scores));
  ASSERT_TRUE(whole.Score(late, 4, &scores));
  EXPECT_EQ(scores, expected[4]);

  // A new track two frames later (the same frames sounded): index k is the
  // old k + 2, recomputed.
  whole.StartTrack(whole.FrameStart(2), 0.0f);
  ASSERT_TRUE(whole.Score(baseband.View(), 6, &scores));
  EXPECT_TRUE(scores.isApprox(expected[8], 1e-5f));
  EXPECT_FALSE(scores.isApprox(expected[6], 1e-2f));

  whole.Reset();
  EXPECT_FALSE(whole.has_track());
  whole.StartTrack(kStart, 0.0f);
  ASSERT_TRUE(whole.Score(baseband.View(), 6, &scores));
  EXPECT_TRUE(scores.isApprox(expected[6], 1e-5f));
}

#if GTEST_HAS_DEATH_TEST
using MultipathScorerDeathTest = MultipathScorerTest;

// Verifies that scoring without a track and searching without the window
// in the view end the process.
TEST_F(MultipathScorerDeathTest, ScoringWithoutTrackOrWindowIsFatal) {
  const Baseband baseband = Receive({1, 2, 3}, {kDry, 0.0, 0.0, 1});
  MultipathScorer scorer(coder_, {});
  audio_dsp::FloatVector scores;
  EXPECT_DEATH(scorer.Score(baseband.View(), 0, &scores), sorvel_test::CheckFailed("has_track_"));
  EXPECT_DEATH(scorer.SearchDoppler(baseband.View(), 10),
               sorvel_test::CheckFailed("HasWindow(view, start)"));
}
#endif

}  // namespace
}  // namespace audio_sorvane
