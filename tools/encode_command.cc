#include "tools/encode_command.h"

#include <cctype>
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

void AddEncodeOptions(CLI::App* command, EncodeOptions* o) {
  command->add_option("--scheme", o->scheme, "Modulation: dsss (18.5 kHz spread spectrum) or dtmf (multi-tone)")
      ->check(CLI::IsMember({"dsss", "dtmf"}))
      ->capture_default_str();
  command->add_option("--token-bytes", o->token_bytes,
                      "Bytes per transmitted token, CRC included [dsss 8, dtmf 5]");
  command->add_option("--baseband-decimation-factor", o->decimation_factor,
                      "Decimation of the receiver's baseband [dsss 3, dtmf 16]");
  command->add_option("--sample-rate", o->dsss.coder.sample_rate,
                      "Rate the frames are built at, Hz (dtmf: the output rate)")
      ->capture_default_str();

  auto& d = o->dsss;
  const std::string dsss = "DSSS";
  command->add_flag("--append-check-symbol", d.append_check_symbol,
                    "Append a check symbol after the data symbols")->group(dsss);
  command->add_flag("--high-pass-at-carrier", d.high_pass_at_carrier,
                    "Remove everything below the carrier")->group(dsss);
  command->add_option("--number-of-taps", d.coder.number_of_taps,
                      "Spreading code register length, 5..11")->capture_default_str()->group(dsss);
  command->add_option("--code-number", d.coder.code_number,
                      "Spreading code of that length, 0..2 (5, 6 taps) or 0..3")
      ->capture_default_str()->group(dsss);
  command->add_option("--upsampling-factor", d.coder.upsampling_factor, "Samples per chip")
      ->capture_default_str()->group(dsss);
  command->add_option("--bits-per-symbol", d.coder.bits_per_symbol, "1, 2, 4 or 8")
      ->capture_default_str()->group(dsss);
  command->add_option("--min-cycles-per-frame", d.coder.min_cycles_per_frame,
                      "Tone cycles per frame of symbol 0")->capture_default_str()->group(dsss);
  command->add_flag("--use-quadrature", d.coder.use_quadrature,
                    "Put the symbol tone on the cosine carrier")->group(dsss);
  command->add_option("--broadcast-sample-rate", d.broadcast_sample_rate, "Output rate, Hz")
      ->capture_default_str()->group(dsss);
  command->add_option("--carrier-frequency", d.coder.desired_carrier_frequency,
                      "Carrier asked for, Hz (rounded down to whole cycles per frame)")
      ->capture_default_str()->group(dsss);
  command->add_option("--start-transition-duration", d.start_transition_duration,
                      "Fade-in before the loop, seconds")->capture_default_str()->group(dsss);

  auto& t = o->dtmf;
  const std::string dtmf = "Multi-tone";
  command->add_flag("--use-checksum-symbol", t.use_checksum_symbol,
                    "Append a checksum symbol")->group(dtmf);
  command->add_option("--tones-per-symbol", t.tones_per_symbol, "Tones sounding together")
      ->capture_default_str()->group(dtmf);
  command->add_option("--tone-frequencies", t.tone_frequencies,
                      "Comma-separated tones, Hz [ten pentatonic tones from 740 Hz]")
      ->delimiter(',')->group(dtmf);
  command->add_option("--window-duration", t.window_duration, "Symbol frame, seconds")
      ->capture_default_str()->group(dtmf);
  command->add_option("--adsr", o->adsr,
                      "Frame window: attack,decay,sustain,release (s),sustain amplitude "
                      "[half sine]")
      ->delimiter(',')->expected(5)->group(dtmf);
}

std::string ParseHex(const std::string& hex, std::vector<uint8_t>* bytes) {
  std::string digits;
  for (char c : hex) {
    if (std::isxdigit(static_cast<unsigned char>(c))) {
      digits += c;
    } else if (c != ' ' && c != ':' && c != '-') {
      return std::string("token: '") + c + "' is not a hex digit";
    }
  }
  if (digits.size() % 2 != 0) return "token: odd number of hex digits";
  bytes->clear();
  for (size_t i = 0; i < digits.size(); i += 2) {
    bytes->push_back(static_cast<uint8_t>(std::stoi(digits.substr(i, 2), nullptr, 16)));
  }
  return "";
}

std::string PrepareEncoder(EncodeOptions& o,
                           std::unique_ptr<audio_sorvane::AudioModemEncoder>* encoder,
                           std::vector<uint8_t>* message) {
  if (std::string error = ParseHex(o.token_hex, message); !error.empty()) return error;
  const bool is_dsss = o.scheme == "dsss";
  const int token_bytes = o.token_bytes.value_or(is_dsss ? 8 : 5);
  const int expected = token_bytes - (o.crc ? 2 : 0);
  if (static_cast<int>(message->size()) != expected || expected <= 0) {
    return "token has " + std::to_string(message->size()) + " bytes; the " + o.scheme +
           " scheme sends " + std::to_string(token_bytes) + "-byte tokens, so give " +
           std::to_string(expected) + (o.crc ? " message bytes (the CRC adds 2)" : " bytes");
  }
  if (is_dsss) {
    o.dsss.token_length_bytes = token_bytes;
    o.dsss.coder.baseband_decimation_factor = o.decimation_factor.value_or(3);
    if (std::string e = audio_sorvane::ValidateDsssCoderConfig(o.dsss.coder); !e.empty()) return e;
    if (o.dsss.broadcast_sample_rate <= 0) return "broadcast sample rate must be positive";
    *encoder = audio_sorvane::MakeDsssEncoder(o.dsss);
  } else {
    o.dtmf.bytes_in_token = token_bytes;
    o.dtmf.sample_rate = o.dsss.coder.sample_rate;
    o.dtmf.baseband_decimation_factor = o.decimation_factor.value_or(16);
    if (!o.adsr.empty()) o.dtmf.adsr = {{o.adsr[0], o.adsr[1], o.adsr[2], o.adsr[3], o.adsr[4]}};
    if (std::string e = audio_sorvane::ValidateDtmfConfig(o.dtmf); !e.empty()) return e;
    *encoder = audio_sorvane::MakeDtmfEncoder(o.dtmf);
    if (!*encoder) return "the ADSR window was refused (see the log line above)";
  }
  return "";
}

void RegisterEncodeCommand(CLI::App* app, int* exit_code) {
  auto options = std::make_shared<EncodeOptions>();
  auto loop_seconds = std::make_shared<float>(0.0f);
  auto output = std::make_shared<std::string>();
  CLI::App* command = app->add_subcommand(
      "encode", "Encode a token to a WAV file (16-bit PCM, as the app plays it)");
  command->add_option("--token", options->token_hex, "Token bytes in hex, e.g. 0102a0b0c0d0")
      ->required();
  command->add_flag("--crc", options->crc, "Append two CRC-16 check bytes to the message");
  command->add_option("--loop", *loop_seconds,
                      "Render a looped broadcast of this many seconds (start transition, "
                      "repetitions, fade-out) instead of one token");
  command->add_option("-o,--output", *output, "WAV file to write")->required();
  AddEncodeOptions(command, options.get());

  command->callback([=] {
    std::unique_ptr<audio_sorvane::AudioModemEncoder> encoder;
    std::vector<uint8_t> message;
    std::string error = PrepareEncoder(*options, &encoder, &message);
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
