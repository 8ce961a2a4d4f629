// The DSSS and multi-tone links through the physical room model: the
// receiver facade as an app builds it (DSSS plain and behind hotsound), a
// random message looped from a random point, fed in 10 ms blocks, the first
// token it returns judged.
#include <string>

#include "gtest/gtest.h"
#include "sim/link_eval.h"

namespace sorvel_sim {
namespace {

struct Room {
  const char* name;
  double width, depth, height, rt60;
};

constexpr Room kRooms[] = {{"office", 4.0, 3.0, 2.5, 0.4},
                           {"living room", 6.0, 5.0, 2.7, 0.6},
                           {"hall", 10.0, 8.0, 3.5, 1.0}};

// One trial of `scheme` in `room` at `distance` m: 3 s of audio at +10 dB
// white noise, an omni source, the phones' loudspeaker and microphone on.
TrialResult RoomTrial(const Room& room, double distance, const char* scheme, uint64_t seed,
                      double request_interval = 0.25, double leading_silence = 0.0) {
  LinkSetup setup;
  setup.scheme = scheme;
  setup.request_interval = request_interval;
  setup.channel.leading_silence = leading_silence;
  setup.seconds = 3.0;
  setup.channel.room = {.width = room.width,
                        .depth = room.depth,
                        .height = room.height,
                        .rt60 = room.rt60,
                        .distance = distance};
  EXPECT_EQ(CheckRoom(setup.channel.room), "");
  return RunTrial(setup, 10.0, seed);
}

// Verifies that a token gets through each room at 3 and 5 m, where most of
// the energy arrives after the direct path, within 3 s at +10 dB white
// noise, for the plain DSSS decoder and the one behind hotsound (an omni
// source, the phones' loudspeaker and microphone responses on).
TEST(RoomEndToEndTest, DecodesInReverberantRooms) {
  uint64_t seed = 40;
  for (const Room& room : kRooms) {
    for (double distance : {3.0, 5.0}) {
      for (const char* scheme : {"dsss", "hotsound"}) {
        const TrialResult result = RoomTrial(room, distance, scheme, seed++);
        EXPECT_TRUE(result.success)
            << scheme << " in the " << room.name << " at " << distance << " m"
            << (result.wrong_token ? ": wrong token" : ": no token");
      }
    }
  }
}

// Verifies that an app asking for tokens after every 10 ms block hears as
// much as one asking every quarter second, a second of noise before the
// broadcast, in the office at 1 m and from a sender moving away at 1 m/s
// (-10 dB): the requests made while the broadcast is still arriving see
// only its first frames, and what they conclude about the sender's Doppler
// must not stick.
TEST(RoomEndToEndTest, RequestsOnEveryBlockLoseNothing) {
  for (uint64_t seed = 90; seed < 96; ++seed) {
    for (const char* scheme : {"dsss", "hotsound"}) {
      const TrialResult room = RoomTrial(kRooms[0], 1.0, scheme, seed, 0.01, 1.0);
      EXPECT_TRUE(room.success) << scheme << " in the office, seed " << seed
                                << (room.wrong_token ? ": wrong token" : ": no token");
      LinkSetup setup;
      setup.scheme = scheme;
      setup.request_interval = 0.01;
      setup.channel.leading_silence = 1.0;
      setup.channel.speed = -1.0;
      const TrialResult moving = RunTrial(setup, -10.0, seed);
      EXPECT_TRUE(moving.success) << scheme << " moving, seed " << seed
                                  << (moving.wrong_token ? ": wrong token" : ": no token");
    }
  }
}

// Verifies that a multi-tone token gets through each room at 1 and 2 m
// within 3 s at +10 dB white noise, where the tones of earlier frames still
// ring when a frame is scored (omni source, phone loudspeaker and
// microphone).
// The placements are fixed; over 60 placements about one in 50 fails in the
// hall at 2 m, so a failure here after a change is worth measuring with
// `sorvel eval` before it is dismissed.
TEST(RoomEndToEndTest, MultiToneDecodesInReverberantRooms) {
  uint64_t seed = 80;
  for (const Room& room : kRooms) {
    for (double distance : {1.0, 2.0}) {
      const TrialResult result = RoomTrial(room, distance, "dtmf", seed++);
      EXPECT_TRUE(result.success) << "the " << room.name << " at " << distance << " m"
                                  << (result.wrong_token ? ": wrong token" : ": no token");
    }
  }
}

// Verifies that the decoder keeps its sensitivity without a room: a still
// sender at -16 dB and one moving at 1 m/s either way at -10 dB get through
// within 3 s.
TEST(RoomEndToEndTest, DryChannelKeepsSensitivity) {
  struct Case {
    double speed;  // m/s, positive when approaching
    double snr_db;
    uint64_t seed;
  };
  const Case cases[] = {{0.0, -16.0, 61}, {1.0, -10.0, 62}, {-1.0, -10.0, 63}};
  for (const Case& c : cases) {
    LinkSetup setup;
    setup.seconds = 3.0;
    setup.channel.speed = c.speed;
    const TrialResult result = RunTrial(setup, c.snr_db, c.seed);
    EXPECT_TRUE(result.success) << c.speed << " m/s at " << c.snr_db << " dB"
                                << (result.wrong_token ? ": wrong token" : ": no token");
  }
}

}  // namespace
}  // namespace sorvel_sim
