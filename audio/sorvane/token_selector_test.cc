#include "audio/sorvane/token_selector.h"

#include <algorithm>
#include <random>
#include <vector>

#include "audio/dsp/batch_top_n.h"
#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace audio_sorvane {
namespace {

using audio_dsp::FloatVector;

// 5 symbols (spacer 4), 3 data symbols: a period of 4 slots.
TokenSelectorParams SmallParams() {
  return {.alphabet_size = 5, .spacer = 4, .symbols_in_token = 3};
}

FloatVector OneHot(int symbol, float runner_up = -1, int runner_up_symbol = -1) {
  FloatVector v = FloatVector::Zero(5);
  v[symbol] = 1.0f;
  if (runner_up_symbol >= 0) v[runner_up_symbol] = runner_up;
  return v;
}

std::vector<DecodedToken> Select(const TokenSelector& selector, const SymbolScoreMap& map) {
  audio_dsp::FloatMatrix table;
  std::vector<DecodedToken> candidates = {DecodedToken{}};
  selector.SelectTokens(map, &table, &candidates);
  EXPECT_EQ(table.rows(), 5);
  EXPECT_EQ(table.cols(), selector.symbol_period());
  return candidates;
}

// The spacer seen mid-period: the token starts after it, and position is the
// first position of the spacer's slot.
TEST(TokenSelectorTest, RotatesToStartAfterSpacer) {
  const TokenSelector selector(SmallParams());
  // Positions 10..17: slots 2, 3, 0, 1, 2, 3, 0, 1 carry 4 (spacer), 0, 1, 2.
  SymbolScoreMap map;
  const int sequence[] = {4, 0, 1, 2};
  for (int p = 10; p < 18; ++p) map[p] = OneHot(sequence[(p - 10) % 4]);
  const std::vector<DecodedToken> candidates = Select(selector, map);
  ASSERT_EQ(candidates.size(), 1u);
  EXPECT_EQ(candidates[0].symbols, (std::vector<int>{0, 1, 2}));
  EXPECT_EQ(candidates[0].position, 10);
  EXPECT_FLOAT_EQ(candidates[0].score, 4.0f);
  EXPECT_TRUE(candidates[0].bytes.empty());

  map.erase(11);  // slot 3 now only at 15
  map.erase(15);
  EXPECT_TRUE(Select(selector, map).empty());
}

// Verifies the one-third threshold, ranking of the surviving runners-up and
// the return limit, and that sequences without exactly one spacer or with a
// wrong check symbol are dropped.
TEST(TokenSelectorTest, RanksAndValidatesCandidates) {
  const TokenSelector selector(SmallParams());
  SymbolScoreMap map;
  map[0] = OneHot(4);
  map[1] = OneHot(0, 0.8f, 3);   // runner-up 3 survives the threshold
  map[2] = OneHot(1, 0.2f, 2);   // 0.2 < 1/3: dropped before folding
  map[3] = OneHot(2, 0.9f, 4);   // a second spacer would be invalid
  const std::vector<DecodedToken> candidates = Select(selector, map);
  ASSERT_EQ(candidates.size(), 2u);
  EXPECT_EQ(candidates[0].symbols, (std::vector<int>{0, 1, 2}));
  EXPECT_EQ(candidates[1].symbols, (std::vector<int>{3, 1, 2}));
  EXPECT_GT(candidates[0].score, candidates[1].score);

  TokenSelectorParams params = SmallParams();
  params.append_check_symbol = true;  // period 5: spacer, 3 data, check
  const TokenSelector checked(params);
  SymbolScoreMap with_check;
  const int good[] = {4, 1, 2, 3, 2};  // (1 + 2 + 3 + 2) % 4 == 0
  for (int p = 0; p < 5; ++p) with_check[p] = OneHot(good[p]);
  ASSERT_EQ(Select(checked, with_check).size(), 1u);
  EXPECT_EQ(Select(checked, with_check)[0].symbols, (std::vector<int>{1, 2, 3}));
  with_check[4] = OneHot(1);
  EXPECT_TRUE(Select(checked, with_check).empty());
}

TEST(BatchTopNTest, KeepsTheBestInOrder) {
  std::mt19937 rng(4);
  std::vector<float> scores(1000);
  for (float& s : scores) s = std::uniform_real_distribution<float>(0, 1)(rng);
  audio_dsp::BatchTopN<int> top(6);
  for (int i = 0; i < 1000; ++i) top.Add(scores[i], i);
  const auto kept = top.Take();
  std::vector<float> sorted = scores;
  std::sort(sorted.rbegin(), sorted.rend());
  ASSERT_EQ(kept.size(), 6u);
  for (int i = 0; i < 6; ++i) {
    EXPECT_EQ(kept[i].first, sorted[i]);
    EXPECT_EQ(scores[kept[i].second], sorted[i]);
  }
  audio_dsp::BatchTopN<int> few(6);
  few.Add(1.0f, 1);
  few.Add(3.0f, 3);
  EXPECT_EQ(few.Take().front().second, 3);
}

#if GTEST_HAS_DEATH_TEST
// Verifies that score vectors and a spacer outside the alphabet, which
// would index the table out of range, end the process.
TEST(TokenSelectorDeathTest, RejectsIndicesOutsideTheAlphabet) {
  TokenSelectorParams bad_spacer;
  bad_spacer.spacer = 17;
  EXPECT_DEATH(TokenSelector{bad_spacer},
               sorvel_test::CheckFailed("params_.spacer < params_.alphabet_size"));
  const TokenSelector selector(SmallParams());
  audio_dsp::FloatMatrix table;
  std::vector<DecodedToken> out;
  SymbolScoreMap wrong_size;
  wrong_size[0] = FloatVector::Zero(4);
  EXPECT_DEATH(selector.SelectTokens(wrong_size, &table, &out),
               sorvel_test::CheckFailed("scores.size() == params_.alphabet_size"));
}
#endif

}  // namespace
}  // namespace audio_sorvane
