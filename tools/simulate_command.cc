#include "tools/simulate_command.h"

#include <cmath>
#include <cstdio>
#include <fstream>
#include <functional>
#include <iostream>
#include <memory>
#include <sstream>
#include <string>
#include <vector>

#include "sim/channel_simulator.h"
#include "sim/link_eval.h"
#include "tools/channel_options.h"
#include "tools/decode_command.h"
#include "tools/encode_command.h"
#include "tools/wav_io.h"

namespace sorvel_cli {
namespace {

struct SimulateOptions {
  ModemOptions modem;
  ChannelOptions channel;
  ReceiverOptions receiver;
  std::string token_hex;
  double seconds = 5.0;
  double lead = 0.5;
  std::string output;
};

int RunSimulate(SimulateOptions& o) {
  const auto fail = [](const std::string& message) {
    std::cerr << "sorvel simulate: " << message << "\n";
    return kUsageError;
  };
  std::unique_ptr<audio_sorvane::AudioModemEncoder> encoder;
  std::vector<uint8_t> message;
  if (std::string e = PrepareEncoder(o.modem, o.token_hex, &encoder, &message); !e.empty()) {
    return fail(e);
  }
  if (std::string e = ResolveChannelOptions(o.channel); !e.empty()) return fail(e);
  if (o.seconds <= 0 || o.lead < 0) return fail("--seconds must be positive, --lead not negative");
  sorvel_sim::ChannelConfig channel = o.channel.config;
  if (o.channel.rooms.size() > 1) return fail("simulate takes one --room");
  if (!o.channel.rooms.empty()) {
    if (std::string e = sorvel_cli::MakeRoom(o.channel.rooms[0], channel.rt60, channel.room,
                                             &channel.room);
        !e.empty()) {
      return fail(e);
    }
  }
  std::vector<float> token;
  encoder->Encode(message, &token, o.modem.crc ? 2 : 0);
  channel.input_rate = encoder->OutputSampleRate();
  channel.leading_silence = o.lead;
  const std::vector<float> received =
      sorvel_sim::ApplyChannel(sorvel_sim::RenderLoopedBroadcast(*encoder, token, o.seconds), channel);
  const float rate = static_cast<float>(channel.output_rate);

  if (!o.output.empty()) {
    std::vector<float> full_scale(received.size());
    for (size_t i = 0; i < received.size(); ++i) full_scale[i] = received[i] / 32768.0f;
    if (std::string e = WriteWav(o.output, full_scale, static_cast<int>(rate)); !e.empty()) {
      return fail(e);
    }
    std::printf("wrote %s: %.2f s at %.0f Hz\n", o.output.c_str(), received.size() / rate, rate);
    return 0;
  }
  StreamDecoder decoder;
  if (std::string e = decoder.Start(o.modem, o.receiver, rate, 1); !e.empty()) return fail(e);
  std::vector<float> block;
  const size_t step = static_cast<size_t>(rate / 100);
  for (size_t start = 0; start < received.size(); start += step) {
    // What a phone delivers: 16-bit integers.
    block.assign(received.begin() + start, received.begin() + std::min(received.size(), start + step));
    for (float& v : block) v = std::clamp(std::round(v), -32768.0f, 32767.0f);
    decoder.Feed(block);
  }
  const int found = decoder.Finish();
  if (found == 0) {
    std::printf("no token decoded from %.2f s of audio\n", received.size() / rate);
    return 1;
  }
  std::printf("first token %.3f s into the stream (%.3f s after the broadcast began)\n",
              decoder.first_token_seconds(), decoder.first_token_seconds() - o.lead);
  return 0;
}

std::vector<double> ParseList(const std::string& text) {
  std::vector<double> values;
  std::stringstream in(text);
  for (std::string item; std::getline(in, item, ',');) values.push_back(std::stod(item));
  return values;
}

struct EvalOptions {
  ChannelOptions channel;
  std::string schemes = "dsss";
  std::string speeds = "0";
  std::string rt60s = "0";
  std::string distances;
  int seeds = 20;
  double snr = NAN;  // distances: the SNR (default 10 dB); else the only one
  double snr_max = 10, snr_min = -20, snr_step = 2;
  double seconds = 3.0;
  std::string plot;
};

// "5/5 (100%)".
std::string SuccessCell(const sorvel_sim::CurvePoint& p) {
  char text[48];
  std::snprintf(text, sizeof(text), "%d/%d (%.0f%%)", p.successes, p.trials,
                100 * p.success_rate());
  return text;
}

// Success per room and distance at one SNR: a table per room (rows:
// distances, columns: schemes and speeds), the wrong tokens, and the plot.
int RunDistanceEval(const EvalOptions& o, const std::vector<std::string>& schemes,
                    const std::vector<double>& speeds, const std::vector<double>& rt60s,
                    const std::vector<double>& distances,
                    const std::function<int(const std::string&)>& fail) {
  const double snr = std::isnan(o.snr) ? 10.0 : o.snr;
  std::vector<sorvel_sim::RoomConfig> rooms;
  std::vector<std::string> names;
  for (const RoomShape& shape : o.channel.rooms) {
    for (double rt60 : std::isnan(shape.rt60) ? rt60s : std::vector<double>{shape.rt60}) {
      sorvel_sim::RoomConfig room;
      for (double distance : distances) {
        sorvel_sim::RoomConfig base = o.channel.config.room;
        base.distance = distance;
        if (std::string e = MakeRoom(shape, rt60, base, &room); !e.empty()) return fail(e);
      }
      rooms.push_back(room);
      std::ostringstream name;
      name << shape.width << "x" << shape.depth << "x" << shape.height << " m RT60 " << room.rt60
           << " s";
      names.push_back(name.str());
    }
  }

  const auto& room_base = o.channel.config.room;
  std::printf("%s noise at %g dB SNR, %s source, %s, %.0f Hz receiver, %d seeds (placements), "
              "%.1f s of audio per trial\n",
              o.channel.noise.c_str(), snr,
              room_base.source == sorvel_sim::Directivity::kPhone ? "phone" : "omni",
              room_base.phone_speaker && room_base.phone_microphone ? "phone speaker and mic"
              : room_base.phone_speaker    ? "phone speaker, ideal mic"
              : room_base.phone_microphone ? "ideal speaker, phone mic"
                                           : "ideal speaker and mic",
              o.channel.config.output_rate, o.seeds, o.seconds);
  std::vector<sorvel_sim::Curve> all;
  const size_t total = rooms.size() * schemes.size() * speeds.size();
  for (size_t r = 0; r < rooms.size(); ++r) {
    std::vector<sorvel_sim::Curve> curves;
    for (const std::string& scheme : schemes) {
      for (double speed : speeds) {
        sorvel_sim::LinkSetup setup;
        setup.scheme = scheme;
        setup.channel = o.channel.config;
        setup.channel.speed = speed;
        setup.channel.room = rooms[r];
        setup.seconds = o.seconds;
        std::ostringstream label;
        label << scheme;
        if (speed != 0) label << " " << speed << " m/s";
        const size_t index = all.size() + curves.size() + 1;
        curves.push_back(sorvel_sim::EvaluateDistances(
            setup, label.str(), distances, snr, o.seeds, [&](int done, int count) {
              std::fprintf(stderr, "\r%s, %s (%zu/%zu): %d/%d trials ", names[r].c_str(),
                           label.str().c_str(), index, total, done, count);
            }));
        std::fprintf(stderr, "\n");
      }
    }
    std::printf("\nroom %s\n%10s", names[r].c_str(), "distance");
    for (const auto& c : curves) std::printf(" %14s", c.label.c_str());
    std::printf("\n");
    for (size_t i = 0; i < distances.size(); ++i) {
      std::printf("%8.2f m", distances[i]);
      for (const auto& c : curves) std::printf(" %14s", SuccessCell(c.points[i]).c_str());
      std::printf("\n");
    }
    std::string wrong;
    for (const auto& c : curves) {
      for (const auto& p : c.points) {
        if (p.wrong_tokens == 0) continue;
        char text[96];
        std::snprintf(text, sizeof(text), " %s at %g m: %d;", c.label.c_str(), p.distance_m,
                      p.wrong_tokens);
        wrong += text;
      }
    }
    std::printf("wrong tokens (decoded, not the message):%s\n",
                wrong.empty() ? " none" : wrong.c_str());
    for (auto& c : curves) {
      std::printf("%s: mean time to first token %.2f s, decoder %.0fx real time\n",
                  c.label.c_str(), c.mean_first_token_seconds, c.real_time_factor);
      if (rooms.size() > 1) c.label += ", " + names[r];
      all.push_back(std::move(c));
    }
  }
  if (!o.plot.empty()) {
    std::ofstream svg(o.plot);
    std::ostringstream title;
    title << "Sorvel: tokens decoded within " << o.seconds << " s, " << o.channel.noise
          << " noise at " << snr << " dB SNR";
    if (rooms.size() == 1) title << ", " << names[0];
    svg << sorvel_sim::RenderDistanceSvg(all, title.str());
    if (!svg) return fail("cannot write " + o.plot);
    std::printf("plot: %s\n", o.plot.c_str());
  }
  return 0;
}

int RunEval(EvalOptions& o) {
  const auto fail = [](const std::string& message) {
    std::cerr << "sorvel eval: " << message << "\n";
    return kUsageError;
  };
  if (std::string e = ResolveChannelOptions(o.channel); !e.empty()) return fail(e);
  std::vector<double> speeds, rt60s, distances;
  try {
    speeds = ParseList(o.speeds);
    rt60s = ParseList(o.rt60s);
    if (!o.distances.empty()) distances = ParseList(o.distances);
  } catch (const std::exception&) {
    return fail("--speed, --rt60 and --distances take comma-separated numbers");
  }
  if (!o.distances.empty()) {
    if (o.channel.rooms.empty()) return fail("--distances needs --room");
    if (distances.empty()) return fail("--distances is empty");
    for (double d : distances) {
      if (!(d > 0)) return fail("--distances must be positive");
    }
  }
  std::vector<std::string> schemes;
  std::stringstream in(o.schemes);
  for (std::string s; std::getline(in, s, ',');) {
    if (s != "dsss" && s != "hotsound" && s != "dtmf") return fail("unknown scheme " + s);
    if (s == "hotsound") {
      if (std::string e = CheckHotsoundRate(o.channel.config.output_rate); !e.empty()) return fail(e);
    }
    schemes.push_back(s);
  }
  if (o.seeds < 1 || o.snr_step <= 0 || o.snr_max < o.snr_min || o.seconds <= 0) {
    return fail("need --seeds >= 1, --snr-step > 0, --snr-max >= --snr-min, --seconds > 0");
  }
  if (!distances.empty()) return RunDistanceEval(o, schemes, speeds, rt60s, distances, fail);
  if (!std::isnan(o.snr)) o.snr_max = o.snr_min = o.snr;
  // A physical room (at --distance) takes the place of the RT60 list.
  std::vector<sorvel_sim::RoomConfig> rooms;
  std::vector<std::string> room_labels;
  for (const RoomShape& shape : o.channel.rooms) {
    for (double rt60 : std::isnan(shape.rt60) ? rt60s : std::vector<double>{shape.rt60}) {
      sorvel_sim::RoomConfig room;
      if (std::string e = MakeRoom(shape, rt60, o.channel.config.room, &room); !e.empty()) {
        return fail(e);
      }
      rooms.push_back(room);
      std::ostringstream label;
      label << " " << shape.width << "x" << shape.depth << "x" << shape.height << " " << room.rt60
            << " s " << room.distance << " m";
      room_labels.push_back(label.str());
    }
  }
  if (!rooms.empty()) rt60s.assign(rooms.size(), 0.0);
  std::vector<double> snrs;
  for (double snr = o.snr_max; snr >= o.snr_min - 1e-9; snr -= o.snr_step) snrs.push_back(snr);

  std::vector<sorvel_sim::Curve> curves;
  const size_t total = schemes.size() * speeds.size() * rt60s.size();
  for (const std::string& scheme : schemes) {
    for (double speed : speeds) {
      for (size_t r = 0; r < rt60s.size(); ++r) {
        const double rt60 = rt60s[r];
        sorvel_sim::LinkSetup setup;
        setup.scheme = scheme;
        setup.channel = o.channel.config;
        setup.channel.speed = speed;
        setup.channel.rt60 = rt60;
        if (!rooms.empty()) setup.channel.room = rooms[r];
        setup.seconds = o.seconds;
        std::ostringstream label;
        label << scheme;
        if (speed != 0) label << " " << speed << " m/s";
        if (rt60 != 0) label << " RT60 " << rt60 << " s";
        if (!rooms.empty()) label << room_labels[r];
        const size_t index = curves.size() + 1;
        curves.push_back(sorvel_sim::EvaluateCurve(
            setup, label.str(), snrs, o.seeds, [&](int done, int all) {
              std::fprintf(stderr, "\r%s (%zu/%zu): %d/%d trials ", label.str().c_str(), index,
                           total, done, all);
            }));
        std::fprintf(stderr, "\n");
      }
    }
  }

  std::printf("%s noise, %.0f Hz receiver%s, %d seeds, %.1f s of audio per trial\n",
              o.channel.noise.c_str(), o.channel.config.output_rate,
              o.channel.config.band_limit > 0 ? " (band-limited)" : "", o.seeds, o.seconds);
  std::printf("%8s", "SNR dB");
  for (const auto& c : curves) std::printf(" %22s", c.label.c_str());
  std::printf("\n");
  for (size_t i = 0; i < snrs.size(); ++i) {
    std::printf("%8.1f", snrs[i]);
    for (const auto& c : curves) std::printf(" %21.0f%%", 100 * c.points[i].success_rate());
    std::printf("\n");
  }
  for (const auto& c : curves) {
    std::printf("%s: lowest SNR with >= 95%% success %s dB, mean time to first token %.2f s, "
                "decoder %.0fx real time\n",
                c.label.c_str(),
                std::isnan(c.lowest_snr_db) ? "none" : std::to_string(static_cast<int>(c.lowest_snr_db)).c_str(),
                c.mean_first_token_seconds, c.real_time_factor);
  }
  if (!o.plot.empty()) {
    std::ofstream svg(o.plot);
    svg << sorvel_sim::RenderSvg(curves, "Sorvel: tokens decoded within " +
                                             std::to_string(static_cast<int>(o.seconds)) +
                                             " s, " + o.channel.noise + " noise");
    if (!svg) return fail("cannot write " + o.plot);
    std::printf("plot: %s\n", o.plot.c_str());
  }
  return 0;
}

}  // namespace

void RegisterSimulateCommand(CLI::App* app, int* exit_code) {
  auto o = std::make_shared<SimulateOptions>();
  CLI::App* command = app->add_subcommand(
      "simulate", "Play a token through a simulated room and decode it (or write what the "
                  "microphone hears)");
  command->add_option("--token", o->token_hex, "Token (with --crc: message) bytes in hex")
      ->required();
  command->add_option("--seconds", o->seconds, "Seconds of looped broadcast")->capture_default_str();
  command->add_option("--lead", o->lead, "Silence before the broadcast, s")->capture_default_str();
  command->add_option("-o,--output", o->output,
                      "Write the received audio to this WAV instead of decoding it");
  AddModemOptions(command, &o->modem, /*transmitter=*/true);
  AddChannelOptions(command, &o->channel, /*single_values=*/true);
  AddReceiverOptions(command, &o->receiver);
  command->callback([=] { *exit_code = RunSimulate(*o); });
}

void RegisterEvalCommand(CLI::App* app, int* exit_code) {
  auto o = std::make_shared<EvalOptions>();
  CLI::App* command = app->add_subcommand(
      "eval", "Link quality: success rate per SNR over noise seeds, default modem settings");
  command->add_option("--scheme", o->schemes, "Comma-separated: dsss, hotsound, dtmf")
      ->capture_default_str();
  command->add_option("--speed", o->speeds, "Comma-separated speeds, m/s (one curve each)")
      ->capture_default_str();
  command->add_option("--rt60", o->rt60s, "Comma-separated RT60s, s (one curve each)")
      ->capture_default_str();
  command->add_option("--distances", o->distances,
                      "With --room: comma-separated distances, m; success per room and "
                      "distance at one SNR instead of the SNR sweep");
  command->add_option("--snr", o->snr,
                      "With --distances: the SNR, dB (default 10); else the only SNR swept");
  command->add_option("--seeds", o->seeds, "Trials per SNR (per distance: placements)")
      ->capture_default_str();
  command->add_option("--snr-max", o->snr_max, "Highest SNR, dB")->capture_default_str();
  command->add_option("--snr-min", o->snr_min, "Lowest SNR, dB")->capture_default_str();
  command->add_option("--snr-step", o->snr_step, "SNR step, dB")->capture_default_str();
  command->add_option("--seconds", o->seconds, "Audio per trial, s")->capture_default_str();
  command->add_option("--plot", o->plot, "Write success rate against SNR as an SVG");
  AddChannelOptions(command, &o->channel, /*single_values=*/false);
  command->callback([=] { *exit_code = RunEval(*o); });
}

}  // namespace sorvel_cli
