#include "audio/sorvane/sorvane_decoder.h"

#include <cmath>
#include <complex>
#include <memory>
#include <numbers>
#include <tuple>
#include <vector>

#include "audio/dsp/eigen_types.h"
#include "gtest/gtest.h"

namespace audio_sorvane {

// Reaches the decoder's buffers and private steps, so that each step can be
// fed synthetic input whose right answer is known.
class SorvaneDecoderTestPeer {
 public:
  explicit SorvaneDecoderTestPeer(SorvaneDecoder* decoder) : decoder_(decoder) {}

  void AppendBaseband(const std::vector<std::complex<float>>& samples) {
    std::vector<float> real, imag;
    for (const std::complex<float>& z : samples) {
      real.push_back(z.real());
      imag.push_back(z.imag());
    }
    decoder_->baseband_real_.Append(real);
    decoder_->baseband_imaginary_.Append(imag);
  }
  void AppendAcquisitionScores(const std::vector<float>& scores) {
    decoder_->acquisition_scores_.Append(scores);
  }
  int RefinePeak(int t) const { return decoder_->RefinePeak(t); }
  bool ComputeSymbolScores(int t, audio_dsp::FloatVector* scores) {
    return decoder_->ComputeSymbolScores(t, scores);
  }
  int frame_size() const { return decoder_->frame_size_; }
  int extension() const { return decoder_->extension_; }
  int extended_size() const { return decoder_->extended_size_; }
  float baseband_rate() const { return decoder_->baseband_rate_; }

 private:
  SorvaneDecoder* decoder_;
};

namespace {

std::shared_ptr<const SymbolWaveCoder> Coder(bool use_quadrature = false) {
  SymbolWaveCoderParams params;
  params.use_quadrature = use_quadrature;
  return std::make_shared<const SymbolWaveCoder>(params);
}

// Baseband of `symbol` repeated over `length` samples, its frames starting
// at `start` + k F, shifted by `doppler` cycles per frame and turned by
// `phase` (radians): the code times the symbol's tone plus the constant
// carrier (pedestal), the tone in quadrature to it when the coder says so.
std::vector<std::complex<float>> SymbolBaseband(const SymbolWaveCoder& coder, int symbol,
                                                int start, int length, double doppler,
                                                double phase) {
  const std::vector<float>& code = coder.baseband_code();
  const int frame = static_cast<int>(code.size());
  const double pedestal = coder.params().pedestal_amplitude;
  std::vector<std::complex<float>> out(length);
  for (int n = 0; n < length; ++n) {
    const int k = ((n - start) % frame + frame) % frame;
    const double tone = coder.baseband_tones()(symbol, k);
    const std::complex<double> shape = coder.params().use_quadrature
                                           ? std::complex<double>(pedestal, tone)
                                           : std::complex<double>(pedestal + tone, 0.0);
    const double angle = 2.0 * std::numbers::pi * doppler * (n - start) / frame + phase;
    out[n] = std::complex<float>(static_cast<double>(code[k]) * shape * std::polar(1.0, angle));
  }
  return out;
}

class SorvaneDecoderTest : public ::testing::Test {
 protected:
  SorvaneDecoder MakeDecoder(SorvaneDecoderParams params = {}, bool use_quadrature = false) {
    SorvaneDecoder decoder(Coder(use_quadrature), params);
    decoder.Initialize(1, 44100.0f);
    return decoder;
  }
};

// Verifies that a symbol frame shifted by a Doppler offset and turned by any
// carrier phase scores as high as the same frame received without either,
// and that its own symbol wins, for both carrier layouts.
TEST_F(SorvaneDecoderTest, SymbolScoresUndoDopplerAndPhase) {
  struct Case {
    int symbol;
    double doppler;  // cycles per frame
    double phase;    // radians
    bool use_quadrature;
    float min_fraction;  // of the unshifted frame's score
  } cases[] = {
      {3, 0.0, 0.0, false, 0.999f},   {3, 1.5, 2.0, false, 0.995f},
      {0, -2.1, -2.8, false, 0.995f}, {16, 0.45, 1.0, false, 0.995f},
      {9, 1.0, -1.2, false, 0.97f},   // between two grid frequencies
      {5, -0.9, 0.7, true, 0.995f},   {12, 2.25, 3.0, true, 0.995f},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(::testing::Message() << "symbol " << c.symbol << " doppler " << c.doppler
                                      << " phase " << c.phase << " quadrature "
                                      << c.use_quadrature);
    const auto scores_of = [&](double doppler, double phase) {
      SorvaneDecoder decoder = MakeDecoder({}, c.use_quadrature);
      SorvaneDecoderTestPeer peer(&decoder);
      const int t = 2 * peer.frame_size() + 37;
      peer.AppendBaseband(SymbolBaseband(decoder.symbol_wave_coder(), c.symbol, t,
                                         t + 3 * peer.frame_size(), doppler, phase));
      audio_dsp::FloatVector scores;
      EXPECT_TRUE(peer.ComputeSymbolScores(t, &scores));
      return scores;
    };
    const audio_dsp::FloatVector reference = scores_of(0.0, 0.0);
    const audio_dsp::FloatVector scores = scores_of(c.doppler, c.phase);
    ASSERT_EQ(scores.size(), 17);
    Eigen::Index best;
    scores.maxCoeff(&best);
    EXPECT_EQ(best, c.symbol);
    EXPECT_GE(scores[c.symbol], c.min_fraction * reference[c.symbol]);
    EXPECT_LE(scores[c.symbol], 1.001f * reference[c.symbol]);
    // The other tones are orthogonal to the sent one; what they pick up is
    // the pedestal through the code's ripple (below a quarter here).
    audio_dsp::FloatVector others = scores;
    others[c.symbol] = 0.0f;
    EXPECT_LT(others.cwiseAbs().maxCoeff(), 0.25f * scores[c.symbol]);
  }
}

// Verifies that a frame is scored only when its whole extended frame lies
// inside the buffer.
TEST_F(SorvaneDecoderTest, SymbolScoresNeedTheWholeExtendedFrame) {
  SorvaneDecoder decoder = MakeDecoder();
  SorvaneDecoderTestPeer peer(&decoder);
  const int size = 3 * peer.frame_size();
  peer.AppendBaseband(SymbolBaseband(decoder.symbol_wave_coder(), 1, 0, size, 0.0, 0.0));
  const int first = peer.extension();
  const int last = size - peer.extended_size() + peer.extension();
  audio_dsp::FloatVector scores;
  EXPECT_FALSE(peer.ComputeSymbolScores(first - 1, &scores));
  EXPECT_TRUE(peer.ComputeSymbolScores(first, &scores));
  EXPECT_TRUE(peer.ComputeSymbolScores(last, &scores));
  EXPECT_FALSE(peer.ComputeSymbolScores(last + 1, &scores));
}

// Verifies that peak refinement moves a group time onto the frame start
// that the raw scores of three neighbouring periods agree on, within the
// drift that max_speed allows over the summed periods (9 samples here).
TEST_F(SorvaneDecoderTest, RefinePeakFindsTheOffsetOfTheRawPeak) {
  struct Case {
    const char* name;
    float max_speed;
    // Raw score spikes: offset from the group time, the periods holding
    // them (relative), and their height.
    std::vector<std::tuple<int, std::vector<int>, float>> spikes;
    int expected_offset;
  } cases[] = {
      {"on time", 1.0f, {{0, {-1, 0, 1}, 1.0f}}, 0},
      {"late", 1.0f, {{5, {-1, 0, 1}, 1.0f}}, 5},
      {"early, at the radius", 1.0f, {{-9, {-1, 0, 1}, 1.0f}}, -9},
      {"beyond the radius", 1.0f, {{12, {-1, 0, 1}, 1.0f}}, 0},
      {"three periods outweigh one", 1.0f, {{3, {0}, 2.0f}, {-4, {-1, 0, 1}, 1.0f}}, -4},
      {"a still sender is not moved", 0.0f, {{3, {-1, 0, 1}, 1.0f}}, 0},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    SorvaneDecoderParams params;
    params.max_speed = c.max_speed;
    SorvaneDecoder decoder = MakeDecoder(params);
    SorvaneDecoderTestPeer peer(&decoder);
    const int frame = peer.frame_size();
    const int t = 2 * frame + 100;
    std::vector<float> raw(5 * frame, 0.0f);
    for (const auto& [offset, periods, height] : c.spikes) {
      for (int p : periods) raw[t + offset + p * frame] = height;
    }
    peer.AppendAcquisitionScores(raw);
    EXPECT_EQ(peer.RefinePeak(t), t + c.expected_offset);
  }
}

// Verifies how GetToken chooses among transmissions on different symbol
// grids: the strongest of those that cover every slot of the token period,
// else the strongest incomplete one. Every run of raw scores above the
// threshold is one peak at its largest value.
TEST_F(SorvaneDecoderTest, GroupChoicePrefersCompleteThenStronger) {
  struct Grid {
    int offset;       // baseband samples into each frame
    int first_frame;  // frames holding a peak
    int num_frames;
    float height;
  };
  struct Case {
    const char* name;
    std::vector<Grid> grids;
    int expected_offset;  // -1: none chosen
  } cases[] = {
      {"stronger of two complete", {{100, 0, 10, 10.0f}, {400, 0, 10, 20.0f}}, 400},
      {"stronger listed first", {{100, 0, 10, 30.0f}, {400, 0, 10, 20.0f}}, 100},
      {"complete beats stronger incomplete", {{100, 0, 10, 10.0f}, {400, 2, 3, 50.0f}}, 100},
      {"incomplete when alone", {{400, 2, 3, 50.0f}}, 400},
      {"below the threshold", {{100, 0, 10, 4.0f}}, -1},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    SorvaneDecoderParams params;
    params.symbols_in_token = 4;  // a token period of five slots
    params.num_symbol_periods_to_sum = 1;
    params.peak_threshold = 5.0f;
    SorvaneDecoder decoder = MakeDecoder(params);
    SorvaneDecoderTestPeer peer(&decoder);
    const int frame = peer.frame_size();
    std::vector<float> raw(11 * frame, 0.0f);
    for (const Grid& grid : c.grids) {
      for (int k = grid.first_frame; k < grid.first_frame + grid.num_frames; ++k) {
        const int t = grid.offset + k * frame;
        raw[t - 1] = raw[t + 1] = 0.6f * grid.height;
        raw[t] = grid.height;
      }
    }
    peer.AppendAcquisitionScores(raw);
    DecodeResults results;
    EXPECT_FALSE(decoder.GetToken(&results));  // no baseband to score
    if (c.expected_offset < 0) {
      EXPECT_TRUE(results.detection_times.empty());
      continue;
    }
    ASSERT_FALSE(results.detection_times.empty());
    const float height = c.grids[0].offset == c.expected_offset ? c.grids[0].height
                                                                : c.grids[1].height;
    for (size_t i = 0; i < results.detection_times.size(); ++i) {
      const long t = std::lround(results.detection_times[i] * peer.baseband_rate());
      EXPECT_EQ(t % frame, c.expected_offset) << "time " << t;
      EXPECT_FLOAT_EQ(results.detection_scores[i], height);
    }
  }
}

}  // namespace
}  // namespace audio_sorvane
