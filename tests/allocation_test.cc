// A phone listens all day, so once the decoders have warmed up, feeding them
// audio and asking for tokens must not touch the heap: every block and
// request in steady state runs on memory the decoder already holds. This
// binary interposes malloc and its siblings (operator new, Eigen and the
// standard containers all end there) and counts the calls made while a
// decoder streams.
#include <malloc.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <random>
#include <span>
#include <vector>

#include "audio/jni/decoder_registry.h"
#include "audio/modem_config.h"
#include "gtest/gtest.h"
#include "sim/channel_simulator.h"

#if defined(__SANITIZE_ADDRESS__)
#define SORVEL_COUNT_ALLOCATIONS 0  // the sanitizer owns malloc
#else
#define SORVEL_COUNT_ALLOCATIONS 1
#endif

namespace {

std::atomic<bool> counting{false};
std::atomic<int64_t> allocations{0};

[[maybe_unused]] void Count() {
  if (counting.load(std::memory_order_relaxed)) {
    allocations.fetch_add(1, std::memory_order_relaxed);
  }
}

}  // namespace

#if SORVEL_COUNT_ALLOCATIONS
extern "C" {
void* __libc_malloc(size_t size);
void* __libc_calloc(size_t count, size_t size);
void* __libc_realloc(void* pointer, size_t size);
void* __libc_memalign(size_t alignment, size_t size);
void __libc_free(void* pointer);

void* malloc(size_t size) {
  Count();
  return __libc_malloc(size);
}
void* calloc(size_t count, size_t size) {
  Count();
  return __libc_calloc(count, size);
}
void* realloc(void* pointer, size_t size) {
  Count();
  return __libc_realloc(pointer, size);
}
void* memalign(size_t alignment, size_t size) {
  Count();
  return __libc_memalign(alignment, size);
}
void* aligned_alloc(size_t alignment, size_t size) {
  Count();
  return __libc_memalign(alignment, size);
}
int posix_memalign(void** pointer, size_t alignment, size_t size) {
  Count();
  *pointer = __libc_memalign(alignment, size);
  return *pointer != nullptr || size == 0 ? 0 : ENOMEM;
}
void free(void* pointer) { __libc_free(pointer); }
}  // extern "C"
#endif

namespace audio_sorvane {
namespace {

// The heap calls made while `run` runs.
template <typename Run>
int64_t CountAllocations(Run run) {
  allocations = 0;
  counting = true;
  run();
  counting = false;
  return allocations.load();
}

std::vector<float> Broadcast(bool dtmf, double seconds, double snr_db, uint32_t seed) {
  const auto encoder = dtmf ? MakeDtmfEncoder({}) : MakeDsssEncoder({});
  std::vector<uint8_t> message = {0x53, 0x6f, 0x72, 0x76, 0x65, 0x6c};  // "Sorvel"
  message.resize(encoder->token_length_bytes() - 2);
  std::vector<float> token;
  encoder->Encode(message, &token, 2);
  return sorvel_sim::ApplyChannel(sorvel_sim::RenderLoopedBroadcast(*encoder, token, seconds),
                                  {.snr_db = snr_db, .seed = seed});
}

std::vector<float> Noise(double seconds, uint32_t seed) {
  std::mt19937 rng(seed);
  std::normal_distribution<float> normal(0.0f, 1000.0f);
  std::vector<float> noise(static_cast<size_t>(seconds * 44100));
  for (float& v : noise) v = normal(rng);
  return noise;
}

// Streams `audio` in 10 ms blocks, asking for tokens every 250 ms; returns
// how many requests found the token.
int Stream(AudioModemDecoder& decoder, const std::vector<float>& audio,
           AudioModemDecoder::DecodeResults* results) {
  int found = 0;
  for (size_t start = 0, n = 0; start + 441 <= audio.size(); start += 441, ++n) {
    decoder.ProcessSamples(std::span<const float>(audio).subspan(start, 441));
    if (n % 25 == 24) {
      found += decoder.DecodeTokens(results, decoder.token_length_bytes() - 2, 2);
      decoder.DetectBroadcaster();
    }
  }
  return found;
}

struct Kind {
  const char* name;
  std::unique_ptr<AudioModemDecoder> (*make)();
  bool dtmf;
};

TEST(AllocationTest, SteadyStreamingAndRequestsAllocateNothing) {
  if (!SORVEL_COUNT_ALLOCATIONS) GTEST_SKIP() << "malloc belongs to the sanitizer";
  const Kind kinds[] = {
      {"dsss", [] { return MakeDsssDecoder({}); }, false},
      {"hotsound",
       [] {
         DsssDecoderConfig config;
         config.with_hotsound = true;
         return MakeDsssDecoder(config);
       },
       false},
      {"dtmf", [] { return MakeDtmfDecoder({}); }, true},
  };
  for (const Kind& kind : kinds) {
    SCOPED_TRACE(kind.name);
    auto decoder = kind.make();
    AudioModemDecoder::DecodeResults results;
    // A broadcast is heard for a while, then keeps being heard; then the
    // room falls quiet for a while, and stays quiet.
    const std::vector<float> broadcast = Broadcast(kind.dtmf, 16.0, 0.0, 1);
    const std::vector<float> warm(broadcast.begin(), broadcast.begin() + 12 * 44100);
    const std::vector<float> more(broadcast.begin() + 12 * 44100, broadcast.end());
    ASSERT_GT(Stream(*decoder, warm, &results), 0);
    int found = 0;
    EXPECT_EQ(CountAllocations([&] { found = Stream(*decoder, more, &results); }), 0)
        << "while decoding a broadcast";
    EXPECT_GT(found, 0);
    const std::vector<float> noise = Noise(14.0, 3);
    const std::vector<float> quiet(noise.begin(), noise.begin() + 10 * 44100);
    const std::vector<float> still(noise.begin() + 10 * 44100, noise.end());
    Stream(*decoder, quiet, &results);
    EXPECT_EQ(CountAllocations([&] { Stream(*decoder, still, &results); }), 0)
        << "while listening to noise";
  }
}

// The path the app takes: 16-bit blocks and requests through the registry
// the NativeDecoder peer drives.
TEST(AllocationTest, RegistryBlocksAndRequestsAllocateNothing) {
  if (!SORVEL_COUNT_ALLOCATIONS) GTEST_SKIP() << "malloc belongs to the sanitizer";
  DecoderRegistry registry;
  ASSERT_TRUE(registry.InitializeDsss(0, {}));
  const std::vector<float> audio = Broadcast(false, 16.0, 0.0, 5);
  std::vector<int16_t> pcm(audio.size());
  for (size_t i = 0; i < audio.size(); ++i) {
    pcm[i] = static_cast<int16_t>(std::clamp(audio[i], -32768.0f, 32767.0f));
  }
  AudioModemDecoder::DecodeResults results;
  int found = 0;
  const auto stream = [&](size_t begin, size_t end) {
    for (size_t start = begin, n = 0; start + 441 <= end; start += 441, ++n) {
      registry.ProcessSamples(0, pcm.data() + start, 441);
      if (n % 25 == 24) found += registry.DecodeTokens(0, &results, 6, 2);
    }
  };
  stream(0, 12 * 44100);
  ASSERT_GT(found, 0);
  EXPECT_EQ(CountAllocations([&] { stream(12 * 44100, pcm.size()); }), 0);
}

}  // namespace
}  // namespace audio_sorvane
