#include "audio/sorvane/dtmf/dtmf_decoder.h"

#include <cmath>
#include <cstdint>
#include <numbers>
#include <set>
#include <vector>

#include "audio/sorvane/dtmf/byte_symbol_converter.h"
#include "gtest/gtest.h"

namespace audio_sorvane {

// Appends tone strengths to a decoder's buffers as the tone filters would,
// so that the token request can be fed strengths whose symbols and timing
// are known.
class DtmfDecoderTestPeer {
 public:
  explicit DtmfDecoderTestPeer(DtmfDecoder* decoder) : decoder_(decoder) {}

  // One row per tone, all of one length.
  void AppendStrengths(const std::vector<std::vector<float>>& rows) {
    DtmfDecoder& d = *decoder_;
    const int added = static_cast<int>(rows[0].size());
    ASSERT_LE(d.tone_strength_buffer_size_ + added, d.strengths_.capacity());
    const int64_t end = d.begin_ + d.tone_strength_buffer_size_;
    for (int i = 0; i < d.num_frequencies_; ++i) d.strengths_.Write(i, end, rows[i].data(), added);
    d.strength_blocks_.Update(d.strengths_, end, end + added);
    d.tone_strength_buffer_size_ += added;
  }

 private:
  DtmfDecoder* decoder_;
};

namespace {

constexpr float kFloor = 0.01f;      // every tone, always
constexpr float kAmplitude = 1e4f;   // a sounding tone's peak strength
const std::vector<uint8_t> kToken = {0x12, 0x34, 0x56, 0x78, 0x9a};

DtmfDecoderParams Params() {
  DtmfDecoderParams params;
  params.room_search.enabled = false;
  return params;
}

// The symbols on the air, looped: the spacer, then the token's symbols.
std::vector<int> Loop(const DtmfDecoderParams& params) {
  const ByteSymbolConverter converter(static_cast<int>(params.symbol_table.size()),
                                      params.spacer_symbol, params.bytes_in_token);
  std::vector<int> loop = {params.spacer_symbol};
  for (int s : converter.BytesToSymbols(kToken)) loop.push_back(s);
  return loop;
}

// Tone strengths of `num_frames` looped frames starting `delay` samples
// into the buffer (silence before): a sounding tone rises and falls as
// sin^2 over its frame, peaking mid-frame. Frames in `silent` sound nothing.
std::vector<std::vector<float>> Strengths(const DtmfDecoderParams& params, int period, int delay,
                                          int num_frames, const std::set<int>& silent = {}) {
  const std::vector<int> loop = Loop(params);
  const int length = delay + num_frames * period;
  std::vector<std::vector<float>> rows(params.tone_frequencies.size(),
                                       std::vector<float>(length, kFloor));
  for (int j = 0; j < num_frames; ++j) {
    if (silent.contains(j)) continue;
    for (int tone : params.symbol_table[loop[j % loop.size()]]) {
      for (int m = 0; m < period; ++m) {
        const double rise = std::sin(std::numbers::pi * m / period);
        rows[tone][delay + j * period + m] += static_cast<float>(kAmplitude * rise * rise);
      }
    }
  }
  return rows;
}

int CircularDistance(int a, int b, int period) {
  const int d = ((a - b) % period + period) % period;
  return std::min(d, period - d);
}

// Verifies that the token request finds the symbol timing (the middle of
// each frame, wherever the frames start), reads each recorded slot as the
// symbol sent in it with a normalised score near 1, and decodes the token.
TEST(DtmfDecoderTest, FindsTimingSymbolsAndToken) {
  const DtmfDecoderParams params = Params();
  const std::vector<int> loop = Loop(params);
  for (int delay : {0, 30, 69, 120}) {
    SCOPED_TRACE(::testing::Message() << "delay " << delay);
    DtmfDecoder decoder(params);
    decoder.Init(1, params.sample_rate);
    const int period = decoder.baseband_frame_size();
    ASSERT_EQ(period, 138);
    DtmfDecoderTestPeer peer(&decoder);
    const int num_frames = 2 * static_cast<int>(loop.size()) + 2;
    peer.AppendStrengths(Strengths(params, period, delay, num_frames));

    DecodeResults results;
    ASSERT_TRUE(decoder.GetToken(&results));
    ASSERT_FALSE(results.tokens.empty());
    EXPECT_EQ(results.tokens[0].bytes, kToken);

    const float rate = params.sample_rate / params.baseband_decimation_factor;
    ASSERT_EQ(results.detection_times.size(), results.symbol_scores.size());
    const int t0 = static_cast<int>(std::lround(results.detection_times[0] * rate)) % period;
    EXPECT_LE(CircularDistance(t0, delay + period / 2, period), 2) << "t0 " << t0;
    size_t i = 0;
    for (const auto& [slot, scores] : results.symbol_scores) {
      const int t = static_cast<int>(std::lround(results.detection_times[i++] * rate));
      EXPECT_EQ(t, t0 + slot * period);
      const int frame = (t - delay) / period;
      ASSERT_GE(t, delay);
      Eigen::Index best;
      scores.maxCoeff(&best);
      EXPECT_EQ(best, loop[frame % loop.size()]) << "slot " << slot;
      EXPECT_NEAR(scores[best], 1.0f, 0.01f) << "slot " << slot;
    }
  }
}

// Verifies which slots are recorded when frames drop out: a silent frame
// between two sounding ones still counts, one at either end of the buffer
// or next to another silent frame does not, and slot numbers keep counting
// across the skipped ones.
TEST(DtmfDecoderTest, SlotChoiceKeepsWeakSlotsBetweenStrongOnes) {
  const DtmfDecoderParams params = Params();
  constexpr int kFrames = 12;
  struct Case {
    std::set<int> silent;
    std::set<int> missing;  // slots not recorded
  } cases[] = {
      {{}, {}},         {{5}, {}},        {{5, 6}, {5, 6}},
      {{0}, {0}},       {{kFrames - 1}, {kFrames - 1}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(::testing::Message() << "silent frames " << c.silent.size() << " from "
                                      << (c.silent.empty() ? -1 : *c.silent.begin()));
    DtmfDecoder decoder(params);
    decoder.Init(1, params.sample_rate);
    const int period = decoder.baseband_frame_size();
    DtmfDecoderTestPeer peer(&decoder);
    // Frames start at 0, so slot k is the middle of frame k.
    peer.AppendStrengths(Strengths(params, period, 0, kFrames, c.silent));
    DecodeResults results;
    decoder.GetToken(&results);
    std::set<int> expected;
    for (int k = 0; k < kFrames; ++k) {
      if (!c.missing.contains(k)) expected.insert(k);
    }
    std::set<int> recorded;
    for (const auto& entry : results.symbol_scores) recorded.insert(entry.first);
    EXPECT_EQ(recorded, expected);
  }
}

}  // namespace
}  // namespace audio_sorvane
