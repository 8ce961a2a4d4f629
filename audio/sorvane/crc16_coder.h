// CRC-16 framing of tokens.
//
// A token is `num_message_bytes` message bytes followed by two check bytes,
// the CRC-16/KERMIT of the message (polynomial 0x1021 bit-reflected as 0x8408,
// initial value 0, no final XOR), most significant byte first. The check
// value of "123456789" is 0x2189, so that message is followed by 21 89.
//
// Holds only its parameters; thread-compatible. Sizes that do not match the
// parameters are programming errors and end the process through CHECK.
#ifndef AUDIO_SORVANE_CRC16_CODER_H_
#define AUDIO_SORVANE_CRC16_CODER_H_

#include <cstdint>
#include <vector>

namespace audio_sorvane {

struct Crc16CoderParams {
  // Message bytes per token; must be positive.
  int num_message_bytes = 0;
};

class Crc16Coder {
 public:
  explicit Crc16Coder(const Crc16CoderParams& params);

  // num_message_bytes + 2.
  int BytesInToken() const { return params_.num_message_bytes + 2; }

  // Appends the two check bytes to `message`, which must hold exactly
  // num_message_bytes bytes.
  void Encode(std::vector<uint8_t>* message) const;

  // True when the two bytes after the message equal the message's CRC.
  // `token` must hold exactly BytesInToken() bytes.
  [[nodiscard]] bool Verify(const std::vector<uint8_t>& token) const;

  // The CRC of the first num_message_bytes bytes; anything after them is
  // ignored. `bytes` must hold at least num_message_bytes bytes.
  [[nodiscard]] uint16_t Compute(const std::vector<uint8_t>& bytes) const;

 private:
  Crc16CoderParams params_;
};

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_CRC16_CODER_H_
