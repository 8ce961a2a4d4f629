#include "tools/encode_command.h"

#include <cmath>
#include <complex>
#include <iostream>
#include <memory>

#include "audio/dsp/kiss_fft.h"
#include "sim/channel_simulator.h"
#include "tools/wav_io.h"

namespace sorvel_cli {
namespace {

// The frequency range holding `fraction` of the energy, trimming equal
// shares from both ends of the spectrum.
std::pair<float, float> EnergyBand(const std::vector<float>& audio, float rate,
                                   double fraction) {
  std::vector<std::complex<float>> spectrum;
  audio_dsp::RealFFTTransformer(static_cast<int>(audio.size()), false)
      .Forward(audio, &spectrum);
  double total = 0.0;
  for (const auto& bin : spectrum) total += std::norm(bin);
  const double tail = total * (1.0 - fraction) / 2;
  size_t low = 0, high = spectrum.size() - 1;
  for (double sum = 0.0; low < high && (sum += std::norm(spectrum[low])) < tail;) ++low;
  for (double sum = 0.0; high > low && (sum += std::norm(spectrum[high])) < tail;) --high;
  const float bin_hz = rate / static_cast<float>(audio.size());
  return {low * bin_hz, high * bin_hz};
}

}  // namespace

std::string PrepareEncoder(ModemOptions& o, const std::string& token_hex,
                           std::unique_ptr<audio_sorvane::AudioModemEncoder>* encoder,
                           std::vector<uint8_t>* message) {
  if (std::string error = ParseHex(token_hex, message); !error.empty()) return error;
  if (std::string error = audio_sorvane::ResolveModemSettings(o); !error.empty()) return error;
  if (std::string error = audio_sorvane::CheckMessageBytes(o, message->size()); !error.empty()) {
    return error;
  }
  *encoder = audio_sorvane::MakeEncoder(o);
  if (!*encoder) return "the ADSR window was refused (see the log line above)";
  return "";
}

void RegisterEncodeCommand(CLI::App* app, int* exit_code) {
  auto options = std::make_shared<ModemOptions>();
  auto token_hex = std::make_shared<std::string>();
  auto loop_seconds = std::make_shared<float>(0.0f);
  auto output = std::make_shared<std::string>();
  CLI::App* command = app->add_subcommand(
      "encode", "Encode a token to a WAV file (16-bit PCM, as the app plays it)");
  command->add_option("--token", *token_hex,
                      "Token (with --crc: message) bytes in hex, e.g. 536f7276656c")
      ->required();
  command->add_option("--loop", *loop_seconds,
                      "Render a looped broadcast of this many seconds (start transition, "
                      "repetitions, fade-out) instead of one token");
  command->add_option("-o,--output", *output, "WAV file to write")->required();
  AddModemOptions(command, options.get(), /*transmitter=*/true);

  command->callback([=] {
    std::unique_ptr<audio_sorvane::AudioModemEncoder> encoder;
    std::vector<uint8_t> message;
    std::string error = PrepareEncoder(*options, *token_hex, &encoder, &message);
    std::vector<float> audio;
    if (error.empty()) {
      encoder->Encode(message, &audio, options->crc ? 2 : 0);
      if (audio.empty()) error = "the encoder refused the token (see the log line above)";
    }
    if (error.empty() && *loop_seconds > 0) audio = sorvel_sim::RenderLoopedBroadcast(*encoder, audio, *loop_seconds);
    const int rate = static_cast<int>(encoder ? encoder->OutputSampleRate() : 0);
    if (error.empty()) error = WriteWav(*output, audio, rate);
    if (!error.empty()) {
      std::cerr << "sorvel encode: " << error << "\n";
      *exit_code = kUsageError;
      return;
    }
    const auto [low, high] = EnergyBand(audio, static_cast<float>(rate), 0.99);
    std::cout << "wrote " << *output << ": " << options->scheme << ", "
              << audio.size() / static_cast<double>(rate) << " s at " << rate
              << " Hz, 99% of the energy in " << std::lround(low) << "-" << std::lround(high)
              << " Hz\n";
  });
}

}  // namespace sorvel_cli
