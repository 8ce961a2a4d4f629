#include "audio/modem_config.h"

#include <cmath>
#include <algorithm>
#include <functional>
#include <span>
#include <string>
#include <vector>

#include "gtest/gtest.h"
#include "sim/channel_simulator.h"
#include "tests/test_helpers.h"

namespace audio_sorvane {
namespace {

// What a person might type, from the defaults: the modem (both schemes'
// settings), the receiver, its input rate and channel count.
struct Typed {
  ModemSettings modem;
  ReceiverSettings receiver;
  float rate_hz = 44100.0f;
  int channels = 1;
};

// The first objection the checks have, as the CLI, Python and Java report it.
std::string Objection(Typed t) {
  if (std::string e = ResolveModemSettings(t.modem); !e.empty()) return e;
  return CheckReceiverSettings(t.modem, t.receiver, t.rate_hz, t.channels);
}

Typed Dtmf() {
  Typed t;
  t.modem.scheme = "dtmf";
  return t;
}

// Each refused setting comes back as one line naming it, before anything is
// built (building would end the process, or fail later, on most of them).
TEST(ModemConfigTest, RefusesUpFrontNamingTheSetting) {
  struct Case {
    std::function<void(Typed&)> set;
    Typed start;
    const char* says;
  };
  const std::vector<Case> cases = {
      {[](Typed& t) { t.modem.dsss.coder.number_of_taps = 4; }, {}, "number_of_taps"},
      {[](Typed& t) { t.modem.dsss.coder.code_number = 4; }, {}, "code_number"},
      {[](Typed& t) { t.modem.dsss.coder.bits_per_symbol = 3; }, {}, "bits_per_symbol"},
      {[](Typed& t) { t.modem.token_bytes = 2, t.modem.crc = true; }, {}, "no message bytes"},
      {[](Typed& t) { t.modem.token_bytes = 65; }, {}, "token bytes must be at most 64"},
      {[](Typed& t) { t.modem.dsss.coder.upsampling_factor = 33; }, {}, "upsampling_factor"},
      {[](Typed& t) { t.modem.decimation_factor = 4; }, {}, "must divide upsampling_factor"},
      {[](Typed& t) { t.modem.dsss.coder.desired_carrier_frequency = 30000; }, {},
       "carrier frequency"},
      {[](Typed& t) { t.modem.dsss.coder.sample_rate = NAN; }, {}, "frame sample rate"},
      {[](Typed& t) { t.modem.dsss.broadcast_sample_rate = 0; }, {}, "broadcast sample rate"},
      {[](Typed& t) { t.modem.dsss.start_transition_duration = 2; }, {},
       "start_transition_duration"},
      {[](Typed& t) { t.modem.dtmf.window_duration = 0; }, Dtmf(), "window_duration"},
      {[](Typed& t) { t.modem.dtmf.window_duration = 1.5f; }, Dtmf(), "at most 1 s"},
      {[](Typed& t) { t.modem.dtmf.window_duration = 0.0001f; }, Dtmf(),
       "no samples per frame"},
      {[](Typed& t) { t.modem.dtmf.tone_frequencies.assign(33, 1000.0f); }, Dtmf(),
       "at most 32 tone frequencies"},
      {[](Typed& t) { t.modem.dtmf.tone_frequencies = {500, 30000, 900}; }, Dtmf(),
       "tone frequency 30000"},
      {[](Typed& t) { t.modem.dtmf.tones_per_symbol = 3; }, Dtmf(), "used in pairs"},
      {[](Typed& t) { t.modem.adsr = {0.01f, 0.01f}; }, Dtmf(), "adsr takes 5 values"},
      {[](Typed& t) { t.modem.adsr = {0.02f, 0.02f, 0.02f, 0.02f, 0.5f}; }, Dtmf(),
       "Nonzero duration"},
      {[](Typed& t) { t.modem.adsr = {0, 0, 0, 0, 2}; }, Dtmf(), "Sustain amplitude"},
      {[](Typed& t) { t.receiver.buffer_duration_factor = 0; }, {}, "buffer_duration_factor"},
      {[](Typed& t) { t.receiver.buffer_duration_factor = 1.9f; }, {}, "in [2, 12]"},
      {[](Typed& t) { t.receiver.buffer_duration_factor = 0; }, Dtmf(),
       "buffer_duration_factor"},
      {[](Typed& t) { t.receiver.max_candidates = 7; }, {}, "max_candidates"},
      {[](Typed& t) { t.receiver.detection_duration = -1; }, {}, "detection_duration"},
      {[](Typed& t) { t.receiver.detection_threshold = INFINITY; }, {},
       "detection_threshold"},
      {[](Typed& t) { t.channels = 0; }, {}, "1 to 8 channels"},
      {[](Typed& t) { t.channels = 9; }, Dtmf(), "1 to 8 channels"},
      {[](Typed& t) { t.rate_hz = NAN; }, {}, "input rate"},
      {[](Typed& t) { t.rate_hz = 7999; }, Dtmf(), "input rate"},
      {[](Typed& t) { t.rate_hz = 192001; }, Dtmf(), "input rate"},
      {[](Typed& t) { t.rate_hz = 16000; }, {}, "cannot carry the 18500 Hz carrier"},
      {[](Typed& t) { t.receiver.hotsound = true, t.rate_hz = 40992; }, {},
       "hotsound needs a sample rate of at least 40993 Hz"},
      {[](Typed& t) { t.receiver.hotsound = true; }, Dtmf(), "hotsound works with the dsss"},
  };
  for (size_t i = 0; i < cases.size(); ++i) {
    Typed typed = cases[i].start;
    EXPECT_EQ(Objection(typed), "") << "case " << i << " starts from usable settings";
    cases[i].set(typed);
    const std::string objection = Objection(typed);
    EXPECT_NE(objection.find(cases[i].says), std::string::npos)
        << "case " << i << ": \"" << objection << "\"";
    EXPECT_EQ(objection.find('\n'), std::string::npos) << "case " << i;
  }
}

// The extremes the checks let through build an encoder and a decoder that
// take 10 ms blocks and answer requests without a warning; the usual ones
// also decode their token.
TEST(ModemConfigTest, AcceptedExtremesBuildAndRun) {
  struct Case {
    std::function<void(Typed&)> set;
    Typed start;
    bool decodes;
  };
  const std::vector<Case> cases = {
      {[](Typed&) {}, {}, true},
      {[](Typed&) {}, Dtmf(), true},
      {[](Typed& t) { t.receiver.buffer_duration_factor = 2; }, {}, true},
      {[](Typed& t) { t.receiver.buffer_duration_factor = 12; }, {}, true},
      {[](Typed& t) { t.receiver.buffer_duration_factor = 2; }, Dtmf(), true},
      {[](Typed& t) { t.receiver.max_candidates = 6, t.channels = 8, t.rate_hz = 192000; }, {},
       true},
      {[](Typed& t) { t.receiver.hotsound = true, t.rate_hz = 40993; }, {}, false},
      {[](Typed& t) {
         t.modem.dsss.coder.upsampling_factor = 1;
         t.modem.decimation_factor = 1;
         t.modem.dsss.coder.desired_carrier_frequency = 0;
         t.modem.dsss.coder.min_cycles_per_frame = 0;
       },
       {}, false},
      {[](Typed& t) {
         t.modem.dsss.coder.sample_rate = 8000;
         t.modem.dsss.coder.desired_carrier_frequency = 3000;
         t.modem.dsss.broadcast_sample_rate = 8000;
         t.rate_hz = 8000;
       },
       {}, false},  // a four-second token
      {[](Typed& t) { t.modem.dtmf.window_duration = 0.0004f; }, Dtmf(), false},
      {[](Typed& t) { t.modem.adsr = {0, 0, 0.05f, 0, 1}; }, Dtmf(), true},
      {[](Typed& t) { t.modem.dtmf.tone_frequencies = {800, 1200, 1600}; }, Dtmf(), false},
  };
  for (size_t i = 0; i < cases.size(); ++i) {
    sorvel_test::ScopedLogCapture log;
    Typed t = cases[i].start;
    cases[i].set(t);
    ASSERT_EQ(Objection(t), "") << "case " << i;
    ASSERT_EQ(ResolveModemSettings(t.modem), "");
    const auto encoder = MakeEncoder(t.modem);
    ASSERT_NE(encoder, nullptr) << "case " << i;
    std::vector<uint8_t> message(static_cast<size_t>(t.modem.MessageBytes()));
    for (size_t b = 0; b < message.size(); ++b) message[b] = static_cast<uint8_t>(17 * b + 3);
    std::vector<float> token;
    encoder->Encode(message, &token, 0);
    ASSERT_FALSE(token.empty()) << "case " << i;

    // Two seconds of the looped broadcast at half of the 16-bit scale on
    // every channel, in blocks of ten milliseconds.
    const std::vector<float> mono = sorvel_sim::RenderLoopedBroadcast(*encoder, token, 2.0);
    std::vector<float> heard;
    const auto ratio = static_cast<double>(t.rate_hz) / encoder->OutputSampleRate();
    for (size_t n = 0; n < static_cast<size_t>(mono.size() * ratio); ++n) {
      heard.insert(heard.end(), static_cast<size_t>(t.channels),
                   16384.0f * mono[static_cast<size_t>(static_cast<double>(n) / ratio)]);
    }
    const auto decoder = MakeDecoder(t.modem, t.receiver, t.rate_hz, t.channels);
    ASSERT_NE(decoder, nullptr) << "case " << i;
    const size_t block = static_cast<size_t>(t.rate_hz / 100) * static_cast<size_t>(t.channels);
    AudioModemDecoder::DecodeResults results;
    bool heard_token = false;
    for (size_t start = 0; start < heard.size(); start += block) {
      const size_t end = std::min(heard.size(), start + block);
      decoder->ProcessSamples(std::span<const float>(heard).subspan(start, end - start));
      if ((start / block) % 25 != 24) continue;
      decoder->DecodeTokens(&results, t.modem.MessageBytes(), 0);
      for (const auto& decoded : results.tokens) heard_token |= decoded.bytes == message;
    }
    EXPECT_TRUE(heard_token || !cases[i].decodes) << "case " << i;
    for (const auto& entry : log.entries()) {
      EXPECT_EQ(entry.severity, sorvel_base::INFO) << "case " << i << ": " << entry.message;
    }
  }
}

}  // namespace
}  // namespace audio_sorvane
