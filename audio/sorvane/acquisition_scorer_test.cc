#include "audio/sorvane/acquisition_scorer.h"

#include <random>
#include <vector>

#include "audio/sorvane/code_signal_generator.h"
#include "audio/sorvane/symbol_wave_coder.h"
#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace audio_sorvane {
namespace {

// A 31-chip code at 2 samples per chip (F = 62), three frequencies.
class AcquisitionScorerTest : public testing::Test {
 protected:
  AcquisitionScorerTest() {
    InterpolateCode(GenerateCodeSignal(5, 0), 62, &code_);
    // The code repeated, in noise, on the real axis.
    std::mt19937 rng(9);
    std::normal_distribution<float> noise(0.0f, 0.3f);
    for (int i = 0; i < 3000; ++i) {
      real_.push_back(code_[i % 62] + noise(rng));
      imaginary_.push_back(noise(rng));
    }
  }
  AcquisitionScorer MakeScorer() const { return AcquisitionScorer(code_, frequencies_, 4, 200, 40.0f); }

  std::vector<float> code_;
  std::vector<float> frequencies_ = {-0.5f, 0.0f, 0.5f};
  std::vector<float> real_, imaginary_;
};

// Width 40: v = 1600 / 24, a = 1 + (1 - sqrt(1 + 2v)) / v, N = round(2a / (1 - a)).
TEST_F(AcquisitionScorerTest, NoiseSmootherDesign) {
  const AcquisitionScorer scorer = MakeScorer();
  EXPECT_EQ(scorer.noise_delay(), 11);
  EXPECT_NEAR(scorer.noise_alpha(), 0.15885, 1e-4);
  EXPECT_EQ(AcquisitionScorer(code_, frequencies_, 16, 2573, 750.0f).noise_delay(), 216);
}

// Verifies that scores start N frames late, peak once per code period on
// the code phase, do not depend on block sizes (the same bits), and that the detection
// score appears once F + frames exceed the window.
TEST_F(AcquisitionScorerTest, ScoresPeaksOnCodePhaseInAnyBlocks) {
  AcquisitionScorer whole = MakeScorer();
  std::vector<float> scores;
  EXPECT_EQ(whole.DetectionScore(true), 0.0f);
  whole.ScoreSamples(real_, imaginary_, &scores);
  // 3000 - 62 + 1 frames, the first N only feed the smoother.
  ASSERT_EQ(scores.size(), 3000u - 61 - 11);
  for (int k = 200; k + 62 < static_cast<int>(scores.size()); k += 62) {
    const int peak = static_cast<int>(
        std::max_element(scores.begin() + k, scores.begin() + k + 62) - scores.begin());
    EXPECT_EQ(peak % 62, 0) << k;
    EXPECT_GT(scores[peak], 5.0f);
  }
  EXPECT_GT(whole.DetectionScore(true), 2.0f);

  AcquisitionScorer pieces = MakeScorer();
  std::vector<float> streamed, block;
  for (size_t start = 0, size = 1; start < real_.size(); start += size, size = size * 3 % 97 + 1) {
    size = std::min(size, real_.size() - start);
    pieces.ScoreSamples(std::span(real_).subspan(start, size),
                        std::span(imaginary_).subspan(start, size), &block);
    streamed.insert(streamed.end(), block.begin(), block.end());
  }
  ASSERT_EQ(streamed.size(), scores.size());
  for (size_t i = 0; i < scores.size(); ++i) ASSERT_EQ(streamed[i], scores[i]) << i;
  EXPECT_EQ(pieces.DetectionScore(true), whole.DetectionScore(true));

  pieces.Reset();
  EXPECT_EQ(pieces.DetectionScore(true), 0.0f);
  const std::vector<float> zeros(1000, 0.0f);
  pieces.ScoreSamples(zeros, zeros, &block);
  for (float s : block) EXPECT_EQ(s, 0.0f);
  EXPECT_EQ(pieces.DetectionScore(true), 0.0f);
}

// The fast path pairs mirror frequencies only on a symmetric grid; either
// way it scores as the direct reference form does, within float rounding,
// on random baseband fed in random blocks.
TEST_F(AcquisitionScorerTest, FastPathMatchesReference) {
  struct Case {
    std::vector<float> frequencies;
    bool paired;
  };
  const Case cases[] = {
      {{-0.5f, 0.0f, 0.5f}, true},
      {{-0.9f, -0.6f, -0.3f, 0.0f, 0.3f, 0.6f, 0.9f}, true},
      {{-0.45f, -0.15f, 0.15f, 0.45f}, true},  // no zero row
      {{-0.5f, 0.0f, 0.25f}, false},            // not symmetric: direct form
  };
  std::mt19937 rng(4);
  std::normal_distribution<float> normal(0.0f, 1.0f);
  std::vector<float> real(5000), imaginary(5000);
  for (size_t i = 0; i < real.size(); ++i) {
    real[i] = normal(rng) + (i % 700 < 300 ? code_[i % 62] : 0.0f);
    imaginary[i] = normal(rng);
  }
  for (const Case& c : cases) {
    AcquisitionScorer fast(code_, c.frequencies, 4, 200, 40.0f, AcquisitionPath::kFast);
    AcquisitionScorer reference(code_, c.frequencies, 4, 200, 40.0f, AcquisitionPath::kReference);
    EXPECT_EQ(fast.paired(), c.paired);
    EXPECT_FALSE(reference.paired());
    std::vector<float> expected, got, block;
    reference.ScoreSamples(real, imaginary, &expected);
    std::uniform_int_distribution<size_t> size(1, 300);
    for (size_t start = 0, n = 0; start < real.size(); start += n) {
      n = std::min(size(rng), real.size() - start);
      fast.ScoreSamples(std::span(real).subspan(start, n), std::span(imaginary).subspan(start, n),
                        &block);
      got.insert(got.end(), block.begin(), block.end());
    }
    ASSERT_EQ(got.size(), expected.size());
    for (size_t i = 0; i < got.size(); ++i) {
      ASSERT_NEAR(got[i], expected[i], 1e-4f * std::max(expected[i], 1.0f)) << i;
    }
    EXPECT_NEAR(fast.DetectionScore(true), reference.DetectionScore(true),
                1e-4f * reference.DetectionScore(true));
  }
}

#if GTEST_HAS_DEATH_TEST
using AcquisitionScorerDeathTest = AcquisitionScorerTest;

// Verifies that real and imaginary blocks of different sizes end the
// process.
TEST_F(AcquisitionScorerDeathTest, MismatchedBlocksAreFatal) {
  AcquisitionScorer scorer = MakeScorer();
  std::vector<float> scores;
  EXPECT_DEATH(scorer.ScoreSamples(std::vector<float>(5), std::vector<float>(4), &scores),
               "Baseband signal size mismatch: 5 vs. 4.*Check failed: "
               "baseband_real_signal.size\\(\\) == baseband_imaginary_signal.size\\(\\)");
}
#endif

}  // namespace
}  // namespace audio_sorvane
