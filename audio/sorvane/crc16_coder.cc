#include "audio/sorvane/crc16_coder.h"

#include "base/logging.h"

namespace audio_sorvane {

Crc16Coder::Crc16Coder(const Crc16CoderParams& params) : params_(params) {
  CHECK(params_.num_message_bytes > 0);
}

void Crc16Coder::Encode(std::vector<uint8_t>* message) const {
  CHECK(message);
  CHECK(static_cast<int>(message->size()) == params_.num_message_bytes);
  const uint16_t crc = Compute(*message);
  // Most significant byte first, unlike the usual order for this CRC; the
  // receivers depend on it.
  message->push_back(static_cast<uint8_t>(crc >> 8));
  message->push_back(static_cast<uint8_t>(crc & 0xff));
}

bool Crc16Coder::Verify(const std::vector<uint8_t>& token) const {
  CHECK(static_cast<int>(token.size()) == BytesInToken());
  const int n = params_.num_message_bytes;
  const uint16_t received = static_cast<uint16_t>((token[n] << 8) | token[n + 1]);
  return received == Compute(token);
}

uint16_t Crc16Coder::Compute(const std::vector<uint8_t>& bytes) const {
  CHECK(static_cast<int>(bytes.size()) >= params_.num_message_bytes);
  uint16_t r = 0;
  for (int i = 0; i < params_.num_message_bytes; ++i) {
    r ^= bytes[i];
    for (int bit = 0; bit < 8; ++bit) {
      r = (r & 1) ? static_cast<uint16_t>((r >> 1) ^ 0x8408) : (r >> 1);
    }
  }
  return r;
}

}  // namespace audio_sorvane
