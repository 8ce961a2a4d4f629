#include "audio/sorvane/code_signal_generator.h"

#include <cstdint>

#include "base/logging.h"

namespace audio_sorvane {
namespace {

// Feedback tap sets, indexed by [number_of_taps - kMinTaps][code_number].
// Each set has an even number of taps and its largest offset is
// number_of_taps - 1; each yields a maximal-length sequence.
const std::vector<std::vector<std::vector<int>>>& TapTable() {
  static const auto* const table = new std::vector<std::vector<std::vector<int>>>{
      {{2, 4}, {1, 2, 3, 4}, {0, 2, 3, 4}},                          // 5
      {{4, 5}, {0, 3, 4, 5}, {1, 2, 4, 5}},                          // 6
      {{3, 4, 5, 6}, {1, 4, 5, 6}, {1, 3, 5, 6}, {0, 3, 5, 6}},      // 7
      {{0, 5, 6, 7}, {2, 4, 6, 7}, {1, 2, 6, 7}, {3, 4, 5, 7}},      // 8
      {{1, 6, 7, 8}, {4, 5, 7, 8}, {3, 4, 7, 8}, {0, 4, 7, 8}},      // 9
      {{5, 6, 8, 9}, {0, 5, 8, 9}, {1, 4, 8, 9}, {1, 3, 8, 9}},      // 10
      {{1, 6, 9, 10}, {3, 6, 8, 10}, {1, 6, 8, 10}, {3, 5, 7, 10}},  // 11
  };
  return *table;
}

}  // namespace

int NumCodesForTaps(int number_of_taps) { return number_of_taps <= 6 ? 3 : 4; }

sorvel_base::Validation ValidateCodeChoice(int number_of_taps, int code_number) {
  SORVEL_REQUIRE(number_of_taps >= kMinTaps, "number_of_taps must be in [", kMinTaps, ", ",
                 kMaxTaps, "], got ", number_of_taps);
  SORVEL_REQUIRE(number_of_taps <= 11, "number_of_taps must be in [", kMinTaps, ", ", kMaxTaps,
                 "], got ", number_of_taps);
  SORVEL_REQUIRE(code_number >= 0, "code_number must not be negative, got ", code_number);
  SORVEL_REQUIRE_AS(code_number < NumCodesForTaps(number_of_taps),
                    "code_number <= number_of_taps <= 6 ? 2 : 3", "code_number must be in [0, ",
                    NumCodesForTaps(number_of_taps) - 1, "] for ", number_of_taps,
                    " taps, got ", code_number);
  return {};
}

const std::vector<int>& CodeTaps(int number_of_taps, int code_number) {
  CHECK_VALID(ValidateCodeChoice(number_of_taps, code_number));
  return TapTable()[number_of_taps - kMinTaps][code_number];
}

void GenerateCodeSignal(int number_of_taps, int code_number,
                        std::vector<float>* code_signal) {
  CHECK(code_signal != nullptr);
  const std::vector<int>& taps = CodeTaps(number_of_taps, code_number);

  // The register is a ring written backwards, so ring[(p + t) % length]
  // holds the bit produced t + 1 steps ago.
  const uint32_t length = static_cast<uint32_t>(taps.back()) + 1;
  std::vector<uint32_t> ring(length, 1);
  uint32_t p = 0;

  const int num_chips = (1 << number_of_taps) - 1;
  code_signal->clear();
  code_signal->reserve(num_chips);
  for (int i = 0; i < num_chips; ++i) {
    uint32_t bit = 0;
    for (int t : taps) bit ^= ring[(p + static_cast<uint32_t>(t)) % length];
    if (p == 0) p = length;
    ring[--p] = bit;
    code_signal->push_back(2.0f * static_cast<float>(bit) - 1.0f);
  }
}

std::vector<float> GenerateCodeSignal(int number_of_taps, int code_number) {
  std::vector<float> code;
  GenerateCodeSignal(number_of_taps, code_number, &code);
  return code;
}

}  // namespace audio_sorvane
