// The DSSS link end to end: the project's encoder, the channel simulator and
// the decoder, with the default parameters unless a case says otherwise.
#include <memory>
#include <random>
#include <string>
#include <vector>

#include "audio/modem_config.h"
#include "audio/sorvane/crc16_coder.h"
#include "audio/sorvane/sorvane_decoder.h"
#include "gtest/gtest.h"
#include "sim/channel_simulator.h"
#include "tests/test_helpers.h"

namespace audio_sorvane {
namespace {

using Bytes = std::vector<uint8_t>;

struct Link {
  DsssEncoderConfig encoder;
  Bytes token = {0x53, 0x6f, 0x72, 0x76, 0x65, 0x6c, 0x0a, 0x99};

  std::unique_ptr<SorvaneDecoder> MakeDecoder(int channels, float rate) const {
    SorvaneDecoderParams params;
    params.symbols_in_token =
        DsssSymbolsPerToken(encoder.coder.bits_per_symbol, encoder.token_length_bytes);
    params.append_check_symbol = encoder.append_check_symbol;
    auto decoder = std::make_unique<SorvaneDecoder>(
        std::make_shared<const SymbolWaveCoder>(MakeSymbolWaveCoderParams(encoder.coder)),
        params);
    decoder->Initialize(channels, rate);
    return decoder;
  }

  // What the microphone hears: `seconds` of looped broadcast through `channel`.
  std::vector<float> Received(double seconds, sorvel_sim::ChannelConfig channel) const {
    const auto modem = MakeDsssEncoder(encoder);
    std::vector<float> audio;
    modem->Encode(token, &audio, 0);
    channel.input_rate = encoder.broadcast_sample_rate;
    return sorvel_sim::ApplyChannel(sorvel_sim::RenderLoopedBroadcast(*modem, audio, seconds),
                                    channel);
  }
};

// Feeds `signal` in blocks of `block` samples, asking for a token every
// quarter second of input, and returns the best candidate's bytes at the end.
Bytes Decode(SorvaneDecoder& decoder, const std::vector<float>& signal, size_t block,
             size_t samples_per_request) {
  DecodeResults results;
  Bytes best;
  size_t since_request = 0;
  for (size_t start = 0; start < signal.size(); start += block) {
    const size_t size = std::min(block, signal.size() - start);
    decoder.ProcessSamples(std::span<const float>(signal).subspan(start, size));
    since_request += size;
    if (since_request >= samples_per_request || start + size == signal.size()) {
      since_request = 0;
      if (decoder.GetToken(&results)) best = results.tokens[0].bytes;
    }
  }
  return best;
}

Bytes DecodeLink(const Link& link, double seconds, sorvel_sim::ChannelConfig channel,
                 size_t block = 0) {
  const int channels = channel.channels;
  const float rate = static_cast<float>(channel.output_rate);
  auto decoder = link.MakeDecoder(channels, rate);
  if (block == 0) block = static_cast<size_t>(rate / 100) * channels;
  return Decode(*decoder, link.Received(seconds, channel), block,
                static_cast<size_t>(rate / 4) * channels);
}

// Verifies decoding of a clean loop fed in 10 ms blocks, and broadcaster
// detection while it plays but not on silence or on white noise alone.
TEST(DsssEndToEndTest, CleanLoopDecodesAndIsDetected) {
  const Link link;
  auto decoder = link.MakeDecoder(1, 44100.0f);
  EXPECT_EQ(Decode(*decoder, link.Received(3.0, {.leading_silence = 0.3}), 441, 11025),
            link.token);
  EXPECT_TRUE(decoder->DetectBroadcaster());

  auto quiet = link.MakeDecoder(1, 44100.0f);
  Decode(*quiet, std::vector<float>(3 * 44100, 0.0f), 441, 11025);
  EXPECT_FALSE(quiet->DetectBroadcaster());
  std::mt19937 rng(3);
  std::normal_distribution<float> normal(0.0f, 3000.0f);
  std::vector<float> noise(3 * 44100);
  for (float& v : noise) v = normal(rng);
  Decode(*quiet, noise, 441, 11025);
  EXPECT_FALSE(quiet->DetectBroadcaster());
  DecodeResults results;
  EXPECT_FALSE(quiet->GetToken(&results) && results.tokens[0].bytes == link.token);
}

// Receiver rates, channel counts and block sizes (10 ms blocks at 44.1 kHz
// are the case above), a sender moving at +-0.3 % (about 1 m/s between two
// phones), and noise.
TEST(DsssEndToEndTest, DecodesAcrossReceiversMotionAndNoise) {
  const Link link;
  constexpr double kOneMetrePerSecond = 0.003 * sorvel_sim::kSpeedOfSound;
  const struct {
    sorvel_sim::ChannelConfig channel;
    size_t block;  // 0: 10 ms
  } cases[] = {
      {{.output_rate = 48000}, 0}, {{.output_rate = 96000}, 0}, {{.channels = 2}, 0},
      {{}, 1}, {{}, 4096}, {{}, 1u << 20},
      {{.speed = kOneMetrePerSecond}, 0}, {{.speed = -kOneMetrePerSecond}, 0},
      {{.snr_db = 0.0, .seed = 7}, 0},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(DecodeLink(link, 3.0, c.channel, c.block), link.token)
        << c.channel.output_rate << " Hz, " << c.channel.channels << " channels, blocks of "
        << c.block << ", " << c.channel.speed << " m/s, SNR " << c.channel.snr_db << " dB";
  }
}

TEST(DsssEndToEndTest, OtherTokenShapesAndCodes) {
  std::vector<Link> links(4);
  links[0].encoder.append_check_symbol = true;
  links[1].encoder.token_length_bytes = 10;
  links[1].token = {1, 2, 3, 4, 5, 6, 7, 8, 9, 10};
  links[2].encoder.coder.bits_per_symbol = 2;
  links[3].encoder.coder.number_of_taps = 8;
  links[3].encoder.coder.code_number = 1;
  for (size_t i = 0; i < links.size(); ++i) {
    EXPECT_EQ(DecodeLink(links[i], 4.0, {}), links[i].token) << "case " << i;
  }
}

// A block longer than the buffer is cut with a warning and decoding goes on;
// streaming much longer than the buffer keeps every buffer within bounds.
TEST(DsssEndToEndTest, OverlongInputAndBoundedBuffers) {
  const Link link;
  auto decoder = link.MakeDecoder(1, 44100.0f);
  {
    sorvel_test::ScopedLogCapture capture;
    const std::vector<float> huge(static_cast<size_t>(decoder->max_buffer_size()) + 5000, 0.0f);
    decoder->ProcessSamples(huge);
    EXPECT_TRUE(capture.Contains(sorvel_base::WARNING,
                                 "exceeds maximum buffer size 132300, 5000 samples skipped"));
  }
  EXPECT_EQ(Decode(*decoder, link.Received(3.0, {}), 441, 11025), link.token);

  const int max_baseband = 14700 * 3 + 2 * 635;  // 3 s of baseband and a frame's slack
  int largest = 0;
  const std::vector<float> more = link.Received(20.0, {.snr_db = 10.0});
  DecodeResults results;
  for (size_t start = 0; start + 441 <= more.size(); start += 441) {
    decoder->ProcessSamples(std::span<const float>(more).subspan(start, 441));
    largest = std::max(largest, decoder->baseband_buffer_size());
    ASSERT_LE(decoder->score_buffer_size(), decoder->baseband_buffer_size());
    if (start % 11025 == 0) decoder->GetToken(&results);
    ASSERT_LE(decoder->symbol_score_cache_size(), 200);
  }
  EXPECT_LE(largest, max_baseband);
  EXPECT_GT(largest, 14700 * 2);
}

// A receiver that listened to noise first may have tracked a noise peak;
// a broadcast whose frames happen to fall on that track's grid must still
// get a Doppler search of its own. These leads put the broadcast on the
// grid of such a track.
TEST(DsssEndToEndTest, BroadcastAfterNoiseIsNotScoredOnANoiseTrack) {
  Link link;
  link.token = {0xfe, 0x07, 0x92, 0x61, 0xc0, 0x45, 0x00, 0x00};
  std::vector<uint8_t> message(link.token.begin(), link.token.begin() + 6);
  Crc16Coder({.num_message_bytes = 6}).Encode(&message);
  link.token = message;
  for (double lead : {5.04, 5.08}) {
    SCOPED_TRACE(lead);
    EXPECT_EQ(DecodeLink(link, 4.0, {.leading_silence = lead, .snr_db = 20.0}), link.token);
  }
}

// Days of listening move every stream position past 2^31 and 2^32 baseband
// samples. A decoder started just below each boundary, fed audio that crosses
// it while the buffers discard, must hear what a fresh decoder hears at the
// same times.
TEST(DsssEndToEndTest, StreamPositionsCrossThe32BitBoundaries) {
  const Link link;
  std::vector<float> signal(2 * 44100, 0.0f);  // the broadcast starts at 2 s
  const std::vector<float> broadcast = link.Received(5.0, {.snr_db = 5.0});
  signal.insert(signal.end(), broadcast.begin(), broadcast.end());
  const int64_t lead = 3 * 14700;  // the boundary falls 3 s in, mid-broadcast
  struct Heard {
    Bytes bytes;
    int position = -1;
    std::vector<double> times;  // relative to the origin, s
    int64_t frames = 0;  // scored since the origin
  };
  const auto listen = [&](int64_t origin) {
    auto decoder = link.MakeDecoder(1, 44100.0f);
    decoder->SetStreamOrigin(origin);
    DecodeResults results;
    Heard heard;
    for (size_t start = 0; start + 441 <= signal.size(); start += 441) {
      decoder->ProcessSamples(std::span<const float>(signal).subspan(start, 441));
      if ((start / 441) % 25 == 24 && decoder->GetToken(&results)) {
        heard.bytes = results.tokens[0].bytes;
        heard.position = results.tokens[0].position;
        heard.times.clear();
        for (float t : results.detection_times) heard.times.push_back(t - origin / 14700.0);
      }
    }
    heard.frames = decoder->acquisition_scorer().frame_counter() - origin;
    return heard;
  };
  const Heard fresh = listen(0);
  ASSERT_EQ(fresh.bytes, link.token);
  for (int64_t boundary : {int64_t{1} << 31, int64_t{1} << 32}) {
    SCOPED_TRACE(boundary);
    const Heard late = listen(boundary - lead);
    EXPECT_EQ(late.bytes, fresh.bytes);
    EXPECT_EQ(late.position, fresh.position);
    EXPECT_EQ(late.frames, fresh.frames);
    ASSERT_EQ(late.times.size(), fresh.times.size());
    // Detection times are floats in seconds: 2^32 / 14700 s is ~3e5 s,
    // where a float resolves 1/32 s.
    for (size_t i = 0; i < late.times.size(); ++i) EXPECT_NEAR(late.times[i], fresh.times[i], 0.05);
  }
}

TEST(DsssEndToEndTest, CallsBeforeInitializeAreLoggedErrors) {
  SorvaneDecoder decoder(std::make_shared<const SymbolWaveCoder>(SymbolWaveCoderParams()), {});
  sorvel_test::ScopedLogCapture capture;
  decoder.ProcessSamples(std::vector<float>(10));
  DecodeResults results;
  EXPECT_FALSE(decoder.GetToken(&results));
  EXPECT_FALSE(decoder.DetectBroadcaster());
  for (std::string call : {"ProcessSamples", "GetToken", "DetectBroadcaster"}) {
    EXPECT_TRUE(capture.Contains(sorvel_base::ERROR, call + "() called before call to Initialize()."));
  }
}

#if GTEST_HAS_DEATH_TEST
TEST(DsssEndToEndDeathTest, StereoBlocksMustHoldWholeFrames) {
  const Link link;
  auto decoder = link.MakeDecoder(2, 44100.0f);
  EXPECT_DEATH(decoder->ProcessSamples(std::vector<float>(7)),
               sorvel_test::CheckFailed("received_samples.size() % num_channels_ == 0"));
}
#endif

}  // namespace
}  // namespace audio_sorvane
