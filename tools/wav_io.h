// WAV files for the command-line tool, through libsndfile: 16-bit PCM out,
// any format libsndfile reads in.
#ifndef TOOLS_WAV_IO_H_
#define TOOLS_WAV_IO_H_

#include <cstdint>
#include <span>
#include <string>
#include <vector>

namespace sorvel_cli {

// Writes mono 16-bit PCM (the same conversion the app receives). Returns an
// empty string or the reason it failed.
std::string WriteWav(const std::string& path, const std::vector<float>& samples,
                     int sample_rate);

struct WavData {
  int sample_rate = 0;
  int channels = 0;
  // Interleaved, on the 16-bit scale (-32768 .. 32767), as the decoders take.
  std::vector<float> samples;
};

// Reads any file libsndfile understands. Returns an empty string or the
// reason it failed.
std::string ReadWav(const std::string& path, WavData* data);

// The same from a file image in memory.
std::string ReadWavFromMemory(std::span<const uint8_t> image, WavData* data);

}  // namespace sorvel_cli

#endif  // TOOLS_WAV_IO_H_
