// Link-quality evaluation: how often, and how fast, a token gets through a
// simulated channel. Shared by `sorvel eval` and the benchmarks.
//
// One trial: a random message with CRC-16 in the scheme's default
// configuration, looped as a phone plays it from a random point of the
// loop, through the channel at one SNR and seed, fed to the decoder in
// 10 ms blocks with tokens requested every request_interval. Success means
// the first token the decoder returns is the message, within `seconds`; a
// first token that differs from it is a wrong token.
#ifndef SIM_LINK_EVAL_H_
#define SIM_LINK_EVAL_H_

#include <cmath>
#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "sim/channel_simulator.h"

namespace sorvel_sim {

struct LinkSetup {
  std::string scheme = "dsss";  // dsss, hotsound or dtmf
  ChannelConfig channel;        // snr_db and seed are set per trial
  double seconds = 3.0;         // of received audio
  double request_interval = 0.25;
};

struct TrialResult {
  bool success = false;
  bool wrong_token = false;     // the first token decoded is not the message
  double first_token_seconds = NAN;
  double audio_seconds = 0.0;   // fed to the decoder (it stops at the first token)
  double decode_seconds = 0.0;  // time spent in the decoder
};

TrialResult RunTrial(const LinkSetup& setup, double snr_db, uint64_t seed);

struct CurvePoint {
  double snr_db = 0.0;
  double distance_m = NAN;  // with a physical room
  int successes = 0;
  int wrong_tokens = 0;
  int trials = 0;
  double mean_first_token_seconds = NAN;  // over successes
  double success_rate() const { return trials ? static_cast<double>(successes) / trials : 0.0; }
};

struct Curve {
  std::string label;
  std::vector<CurvePoint> points;  // in the order of the SNRs asked for
  double lowest_snr_db = NAN;      // lowest SNR of the leading run with >= 95 %
  double mean_first_token_seconds = NAN;
  double real_time_factor = 0.0;   // audio seconds per decoder second
};

// Runs `seeds` trials at each SNR (highest first). `progress` (may be
// empty) is called after every trial with (done, total).
Curve EvaluateCurve(const LinkSetup& setup, const std::string& label,
                    const std::vector<double>& snrs_db, int seeds,
                    const std::function<void(int, int)>& progress);

// Runs `seeds` trials at each source-to-microphone distance in the
// physical room of `setup.channel.room`, all at one SNR; the seed of a trial
// also draws its placement. Check the room and every distance with
// CheckRoom first.
Curve EvaluateDistances(const LinkSetup& setup, const std::string& label,
                        const std::vector<double>& distances_m, double snr_db, int seeds,
                        const std::function<void(int, int)>& progress);

// Success rate against SNR, one line per curve, as a standalone SVG.
std::string RenderSvg(const std::vector<Curve>& curves, const std::string& title);

// Success rate against distance, one line per curve, as a standalone SVG.
std::string RenderDistanceSvg(const std::vector<Curve>& curves, const std::string& title);

}  // namespace sorvel_sim

#endif  // SIM_LINK_EVAL_H_
