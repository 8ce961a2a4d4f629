#include "tools/modem_options.h"

#include <cctype>
#include <cstdio>

namespace sorvel_cli {

void AddModemOptions(CLI::App* command, ModemOptions* o, bool transmitter) {
  command->add_option("--scheme", o->scheme,
                      "Modulation: dsss (18.5 kHz spread spectrum) or dtmf (multi-tone)")
      ->check(CLI::IsMember({"dsss", "dtmf"}))
      ->capture_default_str();
  command->add_flag("--crc", o->crc, "Tokens end in two CRC-16 check bytes");
  command->add_option("--token-bytes", o->token_bytes,
                      "Bytes per transmitted token, CRC included [dsss 8, dtmf 5]");
  command->add_option("--baseband-decimation-factor", o->decimation_factor,
                      "Decimation of the receiver's baseband [dsss 3, dtmf 16]");
  command->add_option("--sample-rate", o->dsss.coder.sample_rate,
                      "Rate the frames are built at, Hz (dtmf: the sender's output rate)")
      ->capture_default_str();

  auto& d = o->dsss;
  const std::string dsss = "DSSS";
  command->add_flag("--append-check-symbol", d.append_check_symbol,
                    "Tokens carry a check symbol after the data symbols")->group(dsss);
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
                    "The symbol tone rides on the cosine carrier")->group(dsss);
  command->add_option("--carrier-frequency", d.coder.desired_carrier_frequency,
                      "Carrier asked for, Hz (rounded down to whole cycles per frame)")
      ->capture_default_str()->group(dsss);
  if (transmitter) {
    command->add_flag("--high-pass-at-carrier", d.high_pass_at_carrier,
                      "Remove everything below the carrier")->group(dsss);
    command->add_option("--broadcast-sample-rate", d.broadcast_sample_rate, "Output rate, Hz")
        ->capture_default_str()->group(dsss);
    command->add_option("--start-transition-duration", d.start_transition_duration,
                        "Fade-in before the loop, seconds")->capture_default_str()->group(dsss);
  }

  auto& t = o->dtmf;
  const std::string dtmf = "Multi-tone";
  command->add_flag("--use-checksum-symbol", t.use_checksum_symbol,
                    "Tokens carry a checksum symbol")->group(dtmf);
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

std::string ToHex(const std::vector<uint8_t>& bytes) {
  std::string hex;
  char pair[3];
  for (uint8_t b : bytes) {
    std::snprintf(pair, sizeof(pair), "%02x", b);
    hex += pair;
  }
  return hex;
}

std::string CheckHotsoundRate(double rate) {
  const std::string e = audio_sorvane::CheckHotsoundRate(rate);
  return e.empty() ? e : "--" + e;
}

}  // namespace sorvel_cli
