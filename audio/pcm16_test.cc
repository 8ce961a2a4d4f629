#include "audio/pcm16.h"

#include <cmath>
#include <cstdint>
#include <limits>
#include <vector>

#include "gtest/gtest.h"

namespace audio_sorvane {
namespace {

TEST(Pcm16Test, TruncatesTowardZeroAndClamps) {
  struct Case {
    float sample;
    int16_t value;
  };
  const Case cases[] = {
      {1.0f, 32767},        {-1.0f, -32768},   {0.00002f, 0},
      {-0.00002f, 0},       {-0.5f, -16384},   {0.5f, 16384},
      {0.99999f, 32767},    {1e9f, 32767},     {-1e9f, -32768},
      {2.0f, 32767},        {-1.5f, -32768},   {0.0f, 0},
      {-0.000045f, -1},     {std::numeric_limits<float>::infinity(), 32767},
      {std::nanf(""), 0},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(FloatToPcm16(c.sample), c.value) << c.sample;
  }
}

TEST(Pcm16Test, WritesLittleEndianPairs) {
  const std::vector<int8_t> bytes = FloatsToPcm16Le(std::vector<float>{-0.5f, 1.0f, 0.0f});
  const std::vector<int8_t> expected = {0x00, static_cast<int8_t>(0xC0),
                                        static_cast<int8_t>(0xFF), 0x7F,
                                        0x00, 0x00};
  EXPECT_EQ(bytes, expected);
  EXPECT_TRUE(FloatsToPcm16Le({}).empty());
}

}  // namespace
}  // namespace audio_sorvane
