// Spreading codes of the DSSS modem: maximal-length pseudo-noise sequences of
// +1/-1 chips from a linear feedback shift register.
//
// A code is chosen by `number_of_taps` (register length, 5 to 11) and
// `code_number` (0 to 2 for lengths 5 and 6, 0 to 3 for 7 to 11), which pick
// a feedback tap set from a fixed table. With bits b_k (chip = 2 b_k - 1):
//   b_k = XOR over taps t of b_(k-1-t),   with b_-1 ... b_-L all 1,
// so every code starts with the chip -1. A code has 2^number_of_taps - 1
// chips and is one full period of the sequence. Transmitter and receiver must
// use the same pair.
//
// The table is constant; generation uses only local state, so concurrent
// calls with different outputs are safe. Arguments out of range end the
// process through CHECK before any output is written.
#ifndef AUDIO_SORVANE_CODE_SIGNAL_GENERATOR_H_
#define AUDIO_SORVANE_CODE_SIGNAL_GENERATOR_H_

#include <vector>

#include "base/validation.h"

namespace audio_sorvane {

inline constexpr int kMinTaps = 5;
inline constexpr int kMaxTaps = 11;
inline constexpr int kDefaultNumberOfTaps = 7;
inline constexpr int kDefaultCodeNumber = 0;

// Number of codes available for a register length: 3 for 5 and 6, else 4.
int NumCodesForTaps(int number_of_taps);

// Refuses a (number_of_taps, code_number) pair outside the table.
sorvel_base::Validation ValidateCodeChoice(int number_of_taps, int code_number);

// The feedback tap set (register offsets, largest = number_of_taps - 1).
const std::vector<int>& CodeTaps(int number_of_taps, int code_number);

// Empties `code_signal` (keeping its capacity) and fills it with the
// 2^number_of_taps - 1 chips of the code.
void GenerateCodeSignal(int number_of_taps, int code_number,
                        std::vector<float>* code_signal);

// The same, as a new vector.
std::vector<float> GenerateCodeSignal(int number_of_taps, int code_number);

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_CODE_SIGNAL_GENERATOR_H_
