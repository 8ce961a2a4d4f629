#include "audio/sorvane/compute_buffer_truncation.h"

#include "gtest/gtest.h"

namespace audio_sorvane {
namespace {

// Verifies that a receiver's block plan scales the skip by the channels,
// rounds the drop up to whole frames and never drops more than is held.
// Budget 1000 received samples, one token 400, stereo, 3 received samples
// per baseband sample, frames of 8 baseband samples.
TEST(ComputeBlockTruncationTest, ConvertsToReceiverUnits) {
  constexpr int kGood = 400;
  constexpr int kMax = 1000;
  // 100 frames beside 10 held (33 received): room to spare.
  BlockTruncation plan = ComputeBlockTruncation(200, 2, 3.0, 10, 8, kGood, kMax);
  EXPECT_EQ(plan.skip_samples, 0);
  EXPECT_EQ(plan.drop_baseband, 0);
  // 300 frames beside 300 held (903 received): 203 received samples over,
  // 68 baseband, rounded up to 9 frames.
  plan = ComputeBlockTruncation(600, 2, 3.0, 300, 8, kGood, kMax);
  EXPECT_EQ(plan.skip_samples, 0);
  EXPECT_EQ(plan.drop_baseband, 72);
  // 995 frames beside 5 held (18 received): 13 over, 5 baseband, one frame
  // rounded, capped at the 5 held.
  plan = ComputeBlockTruncation(1990, 2, 3.0f, 5, 8, kGood, kMax);
  EXPECT_EQ(plan.skip_samples, 0);
  EXPECT_EQ(plan.drop_baseband, 5);
  // 1500 frames, more than the budget: the first 500 frames (1000
  // interleaved samples) are skipped.
  plan = ComputeBlockTruncation(3000, 2, 3.0, 100, 8, kGood, kMax);
  EXPECT_EQ(plan.skip_samples, 1000);
}

}  // namespace
}  // namespace audio_sorvane
