#include "sim/interferers.h"

#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <numbers>
#include <random>
#include <string>

#include "sim/channel_simulator.h"

namespace sorvel_sim {
namespace {

// The samples of a 16-bit PCM WAV file (channels averaged), or empty.
std::vector<float> ReadWav16(const std::string& path) {
  std::vector<char> bytes;
  if (FILE* f = std::fopen(path.c_str(), "rb")) {
    char buffer[65536];
    for (size_t n; (n = std::fread(buffer, 1, sizeof(buffer), f)) > 0;) {
      bytes.insert(bytes.end(), buffer, buffer + n);
    }
    std::fclose(f);
  }
  const auto u16 = [&](size_t at) {
    return static_cast<int>(static_cast<uint8_t>(bytes[at]) | (static_cast<uint8_t>(bytes[at + 1]) << 8));
  };
  const auto u32 = [&](size_t at) { return static_cast<size_t>(u16(at)) | (static_cast<size_t>(u16(at + 2)) << 16); };
  int channels = 1;
  for (size_t at = 12; at + 8 <= bytes.size();) {
    const std::string id(bytes.data() + at, 4);
    const size_t size = std::min(u32(at + 4), bytes.size() - at - 8);
    if (id == "fmt " && size >= 16) channels = std::max(1, u16(at + 10));
    if (id == "data") {
      std::vector<float> out(size / 2 / channels);
      for (size_t i = 0; i < out.size(); ++i) {
        float sum = 0.0f;
        for (int c = 0; c < channels; ++c) {
          sum += static_cast<int16_t>(u16(at + 8 + 2 * (i * channels + c)));
        }
        out[i] = sum / channels;
      }
      return out;
    }
    at += 8 + size + (size & 1);
  }
  return {};
}

std::string TempPath() {
  char path[] = "/tmp/sorvel-interferer-XXXXXX";
  const int fd = mkstemp(path);
  if (fd < 0) return "";
  close(fd);
  return path;
}

void ScaleToPeak(std::vector<float>* x, double peak) {
  float top = 0.0f;
  for (float v : *x) top = std::max(top, std::fabs(v));
  if (top > 0.0f) {
    for (float& v : *x) v = static_cast<float>(v * peak / top);
  }
}

}  // namespace

std::vector<float> RenderSpeech(double peak) {
  static const char* const kLines[][2] = {
      {"en", "The quick brown fox jumps over the lazy dog. Sorvel sends short tokens between "
             "phones in the same room, quietly and quickly."},
      {"en-us+f3", "Is this the right meeting room? I thought we booked the one on the second "
                   "floor, next to the kitchen, at half past three."},
      {"de", "Sechs sehr schlaue Schwestern sitzen still auf siebzig schiefen Stühlen."},
      {"fr+m4", "Les chaussettes de l'archiduchesse sont-elles sèches, archi-sèches?"},
      {"en-gb+f2", "Shh! Listen: sixty-six sizzling sausages, sixteen swans and a hissing kettle."},
  };
  const std::string path = TempPath();
  std::vector<float> speech;
  for (const auto& [voice, text] : kLines) {
    const std::string command = std::string("espeak-ng -v ") + voice + " -w " + path + " \"" +
                                text + "\" 2>/dev/null";
    if (path.empty() || std::system(command.c_str()) != 0) break;
    const std::vector<float> line = ReadWav16(path);
    speech.insert(speech.end(), line.begin(), line.end());
    speech.insert(speech.end(), 11025, 0.0f);  // half a second between lines
  }
  if (!path.empty()) std::remove(path.c_str());
  if (speech.size() < 22050) return {};
  speech = ResampleHighQuality(speech, 22050.0, 44100.0);
  ScaleToPeak(&speech, peak);
  return speech;
}

std::vector<float> RenderMusic(double peak, int seconds) {
  const char* module = "/usr/share/games/frozen-bubble/snd/frozen-mainzik-2p.xm";
  const std::string path = TempPath();
  if (path.empty()) return {};
  const std::string wav = path + ".wav";
  const std::string command =
      std::string("xmp -q -f 44100 ") +
      (seconds > 0 ? "-t " + std::to_string(seconds) + " " : std::string()) + "-o " + wav + " " +
      module + " >/dev/null 2>&1";
  std::vector<float> music;
  if (std::system(command.c_str()) == 0) music = ReadWav16(wav);
  std::remove(wav.c_str());
  std::remove(path.c_str());
  ScaleToPeak(&music, peak);
  return music;
}

std::vector<float> MakeClicks(size_t num_samples, double peak, uint64_t seed) {
  std::vector<float> out = MakeNoise(NoiseKind::kWhite, num_samples, 3.0, seed);
  std::mt19937_64 rng(seed);
  std::uniform_real_distribution<double> unit(0.0, 1.0);
  const auto level = [&] { return peak * std::pow(10.0, -2.0 * unit(rng)) * (unit(rng) < 0.5 ? -1 : 1); };
  const auto add_knock = [&](size_t at, double amplitude, double decay_samples, double hz) {
    for (size_t i = 0; i < 8 * decay_samples && at + i < num_samples; ++i) {
      out[at + i] += static_cast<float>(amplitude * std::exp(-i / decay_samples) *
                                        std::cos(2 * std::numbers::pi * hz * i / 44100.0));
    }
  };
  for (size_t at = 0; at < num_samples;) {
    const double kind = unit(rng);
    if (kind < 0.3) {
      out[at] += static_cast<float>(level());  // a spike
    } else if (kind < 0.6) {
      add_knock(at, level(), 20.0 + 400.0 * unit(rng), 200.0 + 8000.0 * unit(rng));
    } else if (kind < 0.8) {
      add_knock(at, level(), 1.0 + 4.0 * unit(rng), 0.0);  // a tap
    } else {
      // Regular ticks for a second or two, from 2 to 40 per second.
      const double period = 44100.0 / (2.0 + 38.0 * unit(rng));
      const double amplitude = level();
      for (double t = 0; t < 44100.0 * (1.0 + unit(rng)); t += period) {
        add_knock(at + static_cast<size_t>(t), amplitude, 3.0, 0.0);
      }
    }
    at += static_cast<size_t>(44100.0 * 0.5 * -std::log(1.0 - unit(rng)));  // 2 per second
  }
  return out;
}

}  // namespace sorvel_sim
