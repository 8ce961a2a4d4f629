#include "tools/simulate_command.h"

#include <cmath>
#include <cstdio>
#include <fstream>
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
  std::vector<float> token;
  encoder->Encode(message, &token, o.modem.crc ? 2 : 0);
  sorvel_sim::ChannelConfig channel = o.channel.config;
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
  int seeds = 20;
  double snr_max = 10, snr_min = -20, snr_step = 2;
  double seconds = 3.0;
  std::string plot;
};

int RunEval(EvalOptions& o) {
  const auto fail = [](const std::string& message) {
    std::cerr << "sorvel eval: " << message << "\n";
    return kUsageError;
  };
  if (std::string e = ResolveChannelOptions(o.channel); !e.empty()) return fail(e);
  std::vector<double> speeds, rt60s;
  try {
    speeds = ParseList(o.speeds);
    rt60s = ParseList(o.rt60s);
  } catch (const std::exception&) {
    return fail("--speed and --rt60 take comma-separated numbers");
  }
  std::vector<std::string> schemes;
  std::stringstream in(o.schemes);
  for (std::string s; std::getline(in, s, ',');) {
    if (s != "dsss" && s != "hotsound" && s != "dtmf") return fail("unknown scheme " + s);
    schemes.push_back(s);
  }
  if (o.seeds < 1 || o.snr_step <= 0 || o.snr_max < o.snr_min || o.seconds <= 0) {
    return fail("need --seeds >= 1, --snr-step > 0, --snr-max >= --snr-min, --seconds > 0");
  }
  std::vector<double> snrs;
  for (double snr = o.snr_max; snr >= o.snr_min - 1e-9; snr -= o.snr_step) snrs.push_back(snr);

  std::vector<sorvel_sim::Curve> curves;
  const size_t total = schemes.size() * speeds.size() * rt60s.size();
  for (const std::string& scheme : schemes) {
    for (double speed : speeds) {
      for (double rt60 : rt60s) {
        sorvel_sim::LinkSetup setup;
        setup.scheme = scheme;
        setup.channel = o.channel.config;
        setup.channel.speed = speed;
        setup.channel.rt60 = rt60;
        setup.seconds = o.seconds;
        std::ostringstream label;
        label << scheme;
        if (speed != 0) label << " " << speed << " m/s";
        if (rt60 != 0) label << " RT60 " << rt60 << " s";
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
  command->add_option("--seeds", o->seeds, "Trials per SNR")->capture_default_str();
  command->add_option("--snr-max", o->snr_max, "Highest SNR, dB")->capture_default_str();
  command->add_option("--snr-min", o->snr_min, "Lowest SNR, dB")->capture_default_str();
  command->add_option("--snr-step", o->snr_step, "SNR step, dB")->capture_default_str();
  command->add_option("--seconds", o->seconds, "Audio per trial, s")->capture_default_str();
  command->add_option("--plot", o->plot, "Write success rate against SNR as an SVG");
  AddChannelOptions(command, &o->channel, /*single_values=*/false);
  command->callback([=] { *exit_code = RunEval(*o); });
}

}  // namespace sorvel_cli
