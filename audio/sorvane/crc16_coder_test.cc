#include "audio/sorvane/crc16_coder.h"

#include <string>
#include <vector>

#include "gmock/gmock.h"
#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace audio_sorvane {
namespace {

using sorvel_test::CheckFailed;
using testing::ElementsAreArray;

Crc16Coder Coder(int num_message_bytes) {
  return Crc16Coder(Crc16CoderParams{.num_message_bytes = num_message_bytes});
}

// Reference values of CRC-16/KERMIT, and the big-endian placement of the
// check bytes behind the message.
TEST(Crc16CoderTest, ReferenceValuesAndByteOrder) {
  struct Case {
    std::vector<uint8_t> message;
    uint16_t crc;
  };
  const std::string digits = "123456789";
  const Case cases[] = {
      {{digits.begin(), digits.end()}, 0x2189},
      {{1, 2, 3, 4, 5}, 0xED9B},
      {{0, 0}, 0x0000},
      {{0xFF}, 0x0F78},
  };
  for (const Case& c : cases) {
    const Crc16Coder coder = Coder(static_cast<int>(c.message.size()));
    EXPECT_EQ(coder.BytesInToken(), static_cast<int>(c.message.size()) + 2);
    EXPECT_EQ(coder.Compute(c.message), c.crc);
    std::vector<uint8_t> token = c.message;
    coder.Encode(&token);
    std::vector<uint8_t> expected = c.message;
    expected.push_back(c.crc >> 8);
    expected.push_back(c.crc & 0xff);
    EXPECT_THAT(token, ElementsAreArray(expected));
    EXPECT_TRUE(coder.Verify(token));
  }
}

// Verifies that verification catches swapped check bytes and a flipped bit
// anywhere in the token, and accepts the all-zero token.
TEST(Crc16CoderTest, VerifyDetectsCorruption) {
  const Crc16Coder coder = Coder(5);
  EXPECT_FALSE(coder.Verify({1, 2, 3, 4, 5, 0x9B, 0xED}));
  EXPECT_TRUE(coder.Verify({1, 2, 3, 4, 5, 0xED, 0x9B}));
  EXPECT_TRUE(coder.Verify(std::vector<uint8_t>(7, 0)));
  const std::vector<uint8_t> good = {1, 2, 3, 4, 5, 0xED, 0x9B};
  for (size_t byte = 0; byte < good.size(); ++byte) {
    for (int bit = 0; bit < 8; ++bit) {
      std::vector<uint8_t> bad = good;
      bad[byte] ^= static_cast<uint8_t>(1 << bit);
      EXPECT_FALSE(coder.Verify(bad)) << "byte " << byte << " bit " << bit;
    }
  }
}

TEST(Crc16CoderTest, ComputeCoversOnlyTheMessageBytes) {
  const Crc16Coder coder = Coder(5);
  EXPECT_EQ(coder.Compute({1, 2, 3, 4, 5, 0xAA, 0xBB, 0xCC}), 0xED9B);
  EXPECT_EQ(coder.Compute({1, 2, 3, 4, 5, 0xED, 0x9B}), coder.Compute({1, 2, 3, 4, 5}));
}

#if GTEST_HAS_DEATH_TEST
// Buffers of the wrong size end the process.
TEST(Crc16CoderDeathTest, RejectsWrongSizes) {
  const Crc16Coder coder = Coder(5);
  std::vector<uint8_t> short_message = {1, 2, 3, 4};
  EXPECT_DEATH(coder.Encode(&short_message),
               CheckFailed("static_cast<int>(message->size()) == "
                           "params_.num_message_bytes"));
  EXPECT_DEATH((void)coder.Verify({1, 2, 3, 4, 5, 6}),
               CheckFailed("static_cast<int>(token.size()) == BytesInToken()"));
  EXPECT_DEATH((void)coder.Compute({1, 2, 3, 4}),
               CheckFailed("static_cast<int>(bytes.size()) >= "
                           "params_.num_message_bytes"));
}
#endif

}  // namespace
}  // namespace audio_sorvane
