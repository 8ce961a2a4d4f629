// The fast paths of the multi-tone receiver against their direct reference
// forms, on random inputs cut into random blocks.
#include <algorithm>
#include <cmath>
#include <complex>
#include <random>
#include <vector>

#include "audio/dsp/gamma_filter.h"
#include "audio/dsp/max_filter.h"
#include "audio/sorvane/dtmf/dtmf_decoder.h"
#include "audio/sorvane/dtmf/noise_smoother.h"
#include "audio/sorvane/dtmf/tone_strength_filter.h"
#include "gtest/gtest.h"

namespace audio_sorvane {
namespace {

std::vector<float> RandomSignal(int n, uint32_t seed) {
  std::mt19937 rng(seed);
  std::normal_distribution<float> noise(0.0f, 3000.0f);
  std::vector<float> x(n);
  for (int i = 0; i < n; ++i) {
    x[i] = noise(rng) + 8000.0f * static_cast<float>(std::sin(2.0 * 3.14159265 * 987.0 * i / 44100.0));
  }
  return x;
}

// Block sums: the reference quantises the oscillator phase to 4096 steps
// (at most pi / 4096 rad per sample), so |fast - reference| <= 1e-3 *
// sum |x| over the block (plus float rounding). Strengths are smoothed block
// sums squared: |fast - reference| <= 2e-3 * (max strength) + small.
TEST(ToneFilterBankTest, FastPathMatchesReferenceOnRandomSplits) {
  const std::vector<float> tones = {740.0f, 831.0f, 987.0f, 1108.0f, 1244.0f,
                                    1480.0f, 1661.0f, 1975.0f, 2217.0f};
  for (uint32_t seed : {1u, 2u, 3u}) {
    const std::vector<float> x = RandomSignal(20000, seed);
    ToneFilterBank fast(16, 44100.0, tones, 12.0, /*reference=*/false);
    ToneFilterBank reference(16, 44100.0, tones, 12.0, /*reference=*/true);
    const int n = static_cast<int>(tones.size());
    std::vector<std::vector<float>> out_fast(n), out_ref(n);
    std::vector<std::vector<std::complex<float>>> sums_fast(n), sums_ref(n);
    std::mt19937 rng(seed);
    std::uniform_int_distribution<int> block(1, 700);
    for (size_t start = 0; start < x.size();) {
      const size_t count = std::min<size_t>(block(rng), x.size() - start);
      const std::span<const float> in(x.data() + start, count);
      const int most = fast.MaxOutputs(static_cast<int>(count));
      std::vector<float> sf(most * n), sr(most * n);
      std::vector<std::complex<float>> zf(most * n), zr(most * n);
      std::vector<float*> pf(n), pr(n);
      std::vector<std::complex<float>*> qf(n), qr(n);
      for (int t = 0; t < n; ++t) {
        pf[t] = sf.data() + t * most;
        pr[t] = sr.data() + t * most;
        qf[t] = zf.data() + t * most;
        qr[t] = zr.data() + t * most;
      }
      const int got_fast = fast.ProcessSamples(in, pf.data(), qf.data());
      const int got_ref = reference.ProcessSamples(in, pr.data(), qr.data());
      ASSERT_EQ(got_fast, got_ref);
      for (int t = 0; t < n; ++t) {
        out_fast[t].insert(out_fast[t].end(), pf[t], pf[t] + got_fast);
        out_ref[t].insert(out_ref[t].end(), pr[t], pr[t] + got_ref);
        sums_fast[t].insert(sums_fast[t].end(), qf[t], qf[t] + got_fast);
        sums_ref[t].insert(sums_ref[t].end(), qr[t], qr[t] + got_ref);
      }
      start += count;
    }
    for (int t = 0; t < n; ++t) {
      ASSERT_EQ(out_fast[t].size(), x.size() / 16);
      const float peak = *std::max_element(out_ref[t].begin(), out_ref[t].end());
      for (size_t b = 0; b < out_fast[t].size(); ++b) {
        float absolute = 0.0f;
        for (int i = 0; i < 16; ++i) absolute += std::abs(x[b * 16 + i]);
        EXPECT_LE(std::abs(sums_fast[t][b] - sums_ref[t][b]), 1e-3f * absolute + 1e-2f)
            << "tone " << t << " block " << b;
        EXPECT_NEAR(out_fast[t][b], out_ref[t][b], 2e-3f * peak + 1.0f) << "tone " << t;
      }
    }
  }
}

// The single-tone fast path is the bank's arithmetic for one tone.
TEST(ToneStrengthFilterTest, FastPathMatchesReference) {
  const std::vector<float> x = RandomSignal(9000, 7);
  ToneStrengthFilter fast(16, 44100.0, 987.0, 12.0), reference(16, 44100.0, 987.0, 12.0);
  std::vector<float> a, b, all_a, all_b;
  std::mt19937 rng(7);
  std::uniform_int_distribution<int> block(1, 300);
  for (size_t start = 0; start < x.size();) {
    const size_t count = std::min<size_t>(block(rng), x.size() - start);
    fast.ProcessSamples(std::span<const float>(x.data() + start, count), &a);
    reference.ProcessSamplesReference(std::span<const float>(x.data() + start, count), &b);
    all_a.insert(all_a.end(), a.begin(), a.end());
    all_b.insert(all_b.end(), b.begin(), b.end());
    start += count;
  }
  ASSERT_EQ(all_a.size(), all_b.size());
  const float peak = *std::max_element(all_b.begin(), all_b.end());
  for (size_t i = 0; i < all_a.size(); ++i) EXPECT_NEAR(all_a[i], all_b[i], 2e-3f * peak + 1.0f);
}

// The segmented smoother equals the serial one within float rounding:
// |fast - reference| <= 1e-5 * max |x|; on either path equal inputs give
// bit-identical outputs, however the input is split in two pieces.
TEST(AlignedGammaSmootherTest, FastPathMatchesReference) {
  std::mt19937 rng(11);
  std::uniform_real_distribution<float> level(0.1f, 2.0f);
  for (int order : {1, 2, 4, 6}) {
    const double pole = audio_dsp::GammaFilterPoleFromStddev(8.0 * 138, order);
    AlignedGammaSmoother smoother(order, 2756.25, pole);
    for (int length : {0, 1, 7, smoother.delay(), smoother.delay() + 1, 3000, 7442, 8269}) {
      std::vector<float> x(length);
      float peak = 0.0f;
      for (float& v : x) peak = std::max(peak, v = level(rng));
      std::vector<float> fast(length), reference(length), split(length);
      const int cut = length / 3;
      smoother.Smooth(std::span<const float>(x), {}, fast.data());
      smoother.SmoothReference(std::span<const float>(x.data(), cut),
                               std::span<const float>(x.data() + cut, length - cut),
                               reference.data());
      smoother.Smooth(std::span<const float>(x.data(), cut),
                      std::span<const float>(x.data() + cut, length - cut), split.data());
      EXPECT_EQ(fast, split) << order << " " << length;
      std::vector<float> in_place(smoother.PaddedLength(length));
      std::copy(x.begin(), x.end(), in_place.begin());
      smoother.SmoothInPlace(in_place.data(), length);
      in_place.resize(length);
      EXPECT_EQ(fast, in_place) << order << " " << length;
      for (int i = 0; i < length; ++i) {
        ASSERT_NEAR(fast[i], reference[i], 1e-5f * peak) << order << " " << length << " " << i;
      }
    }
  }
}

TEST(MaxFilterTest, ScratchFormEqualsAllocatingForm) {
  const std::vector<float> x = RandomSignal(1000, 5);
  for (int window : {1, 2, 5, 552, 2000}) {
    std::vector<float> a(x.size()), b(x.size()), scratch(2 * x.size());
    audio_dsp::MaxFilter(x.data(), static_cast<int>(x.size()), window, a.data());
    audio_dsp::MaxFilter(x.data(), static_cast<int>(x.size()), window, b.data(), scratch.data());
    EXPECT_EQ(a, b) << window;
  }
}

// Block maxima give exactly the direct scan's maxima for ranges of every
// length and alignment, across the ring's wrap, while values are appended in
// random pieces and dropped from the front, and after the ring grows.
TEST(BlockMaximaTest, MaxEqualsDirectScanOnRandomAppendsAndDrops) {
  std::mt19937 rng(17);
  std::normal_distribution<float> value(0.0f, 1.0f);
  std::uniform_int_distribution<int> piece(1, 40);
  ColumnRing ring;
  ring.Init(3, 10 * BlockMaxima::kBlock);
  BlockMaxima blocks;
  blocks.Init(ring);
  int64_t begin = 0, end = 0;
  std::vector<float> row(40), fast(3), reference(3);
  for (int round = 0; round < 400; ++round) {
    if (round == 200) {  // grow, keeping what is buffered
      ring.Reserve(17 * BlockMaxima::kBlock, begin, end);
      blocks.Rebuild(ring, begin, end);
    }
    const int added = piece(rng);
    begin = std::max(begin, end + added - ring.capacity());
    for (int r = 0; r < 3; ++r) {
      for (int i = 0; i < added; ++i) row[i] = value(rng);
      ring.Write(r, end, row.data(), added);
    }
    blocks.Update(ring, end, end + added);
    end += added;
    begin += std::uniform_int_distribution<int64_t>(0, (end - begin) / 4)(rng);
    for (int q = 0; q < 20; ++q) {
      std::uniform_int_distribution<int64_t> at(begin, end - 1);
      int64_t first = at(rng), last = at(rng);
      if (first > last) std::swap(first, last);
      blocks.Max(ring, first, last, fast.data());
      BlockMaxima::MaxReference(ring, first, last, reference.data());
      ASSERT_EQ(fast, reference) << first << ".." << last;
    }
  }
}

// The decoder switch: both paths keep their buffers in step on random
// blocks; their scores differ within the tolerances above, so slots right at
// the acquisition threshold may differ (tokens are compared end to end).
TEST(DtmfDecoderPathsTest, BothPathsKeepTheirBuffersInStep) {
  DtmfDecoderParams fast_params, reference_params;
  reference_params.use_reference_paths = true;
  DtmfDecoder fast(fast_params), reference(reference_params);
  fast.Init(1, 44100.0f);
  reference.Init(1, 44100.0f);
  const std::vector<float> x = RandomSignal(4 * 44100, 13);
  std::mt19937 rng(13);
  std::uniform_int_distribution<int> block(1, 3000);
  DecodeResults a, b;
  for (size_t start = 0; start < x.size();) {
    const size_t count = std::min<size_t>(block(rng), x.size() - start);
    fast.ProcessSamples(std::span<const float>(x.data() + start, count));
    reference.ProcessSamples(std::span<const float>(x.data() + start, count));
    start += count;
    ASSERT_EQ(fast.tone_strength_buffer_size(), reference.tone_strength_buffer_size());
    fast.GetToken(&a);
    reference.GetToken(&b);
  }
}

}  // namespace
}  // namespace audio_sorvane
