#include "audio/jni/decoder_registry.h"

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "audio/modem_config.h"
#include "gtest/gtest.h"
#include "tests/test_helpers.h"

namespace audio_sorvane {
namespace {

// Initialising past the end adds empty slots up to the id; releasing
// empties a slot without shrinking the vector; the default slot is apart.
TEST(DecoderRegistryTest, SlotsGrowAndEmpty) {
  DecoderRegistry registry;
  EXPECT_TRUE(registry.InitializeDtmf(3, {}));
  EXPECT_EQ(registry.size(), 4);
  for (int id : {-1, 0, 1, 2}) EXPECT_EQ(registry.Find(id), nullptr) << id;
  ASSERT_NE(registry.Find(3), nullptr);
  EXPECT_EQ(registry.GetMaxSafeInputSize(3), 2 * registry.Find(3)->GetMaxSafeInputSize());

  EXPECT_TRUE(registry.InitializeDsss(-1, {}));
  EXPECT_EQ(registry.size(), 4);
  EXPECT_NE(registry.Find(-1), nullptr);

  registry.Release(3);
  registry.Release(3);  // an empty slot: nothing happens
  EXPECT_EQ(registry.size(), 4);
  EXPECT_EQ(registry.Find(3), nullptr);
  EXPECT_NE(registry.Find(-1), nullptr);
}

// A refused ADSR window leaves the slot as it was.
TEST(DecoderRegistryTest, RefusedWindowKeepsDecoder) {
  DecoderRegistry registry;
  ASSERT_TRUE(registry.InitializeDtmf(0, {}));
  const AudioModemDecoder* before = registry.Find(0);
  DtmfDecoderConfig refused;
  refused.tones.adsr = {{1.0f, 0.0f, 0.0f, 0.0f, 0.5f}};  // longer than the frame
  EXPECT_FALSE(registry.InitializeDtmf(0, refused));
  EXPECT_EQ(registry.Find(0), before);
}

// Every operation on an empty slot (never initialised, released, or the
// empty default slot) logs an error and returns false, 0 or nothing.
TEST(DecoderRegistryTest, EmptySlotCallsAreLoggedAndHarmless) {
  DecoderRegistry registry;
  ASSERT_TRUE(registry.InitializeDsss(2, {}));
  registry.Release(2);
  const std::vector<int16_t> samples(64, 1000);
  AudioModemDecoder::DecodeResults results;
  const std::vector<std::pair<std::string, std::function<bool(int)>>> calls = {
      {"ProcessSamples",
       [&](int id) {
         registry.ProcessSamples(id, samples.data(), 64);
         return false;
       }},
      {"ProcessSamplesWithHotsound",
       [&](int id) {
         registry.ProcessSamplesWithHotsound(id, samples.data(), 64);
         return false;
       }},
      {"GetTokens", [&](int id) { return registry.DecodeTokens(id, &results, 6, 2); }},
      {"DetectBroadcaster", [&](int id) { return registry.DetectBroadcaster(id); }},
      {"WipeInternalData",
       [&](int id) {
         registry.WipeInternalData(id);
         return false;
       }},
      {"GetMaxSafeInputSize", [&](int id) { return registry.GetMaxSafeInputSize(id) != 0; }},
  };
  for (int id : {-1, 0, 2}) {
    for (const auto& [name, call] : calls) {
      sorvel_test::ScopedLogCapture log;
      EXPECT_FALSE(call(id)) << name << " " << id;
      EXPECT_TRUE(log.Contains(sorvel_base::ERROR,
                               name + ": no decoder with id " + std::to_string(id)))
          << name << " " << id;
    }
  }
  EXPECT_EQ(registry.size(), 3);
}

// Ids past the end (other than when initialising) and below -1 are
// programming errors.
TEST(DecoderRegistryDeathTest, IdsOutOfRangeAreFatal) {
  DecoderRegistry registry;
  ASSERT_TRUE(registry.InitializeDtmf(0, {}));
  EXPECT_DEATH(registry.DetectBroadcaster(1), "Check failed");
  EXPECT_DEATH(registry.Release(-2), "Check failed");
}

}  // namespace
}  // namespace audio_sorvane
