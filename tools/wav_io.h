// Sound files for the command-line tool. WAV files (RIFF/WAVE with integer
// PCM of 8 to 32 bits or 32/64-bit float, plain or extensible) are read and
// written here; any other format is read through libsndfile, which is loaded
// only when such a file is opened. Loading libsndfile with its codec
// libraries costs a process about 2 MB of resident memory, more than a
// decoder holds, so a tool that decodes WAV or raw input never pays it.
#ifndef TOOLS_WAV_IO_H_
#define TOOLS_WAV_IO_H_

#include <cstdint>
#include <cstdio>
#include <span>
#include <string>
#include <vector>

namespace sorvel_cli {

// Writes mono 16-bit PCM WAV (the same conversion the app receives).
// Returns an empty string or the reason it failed.
std::string WriteWav(const std::string& path, const std::vector<float>& samples,
                     int sample_rate);

// Reads interleaved frames from a sound file, a few at a time.
class SoundFileReader {
 public:
  SoundFileReader() = default;
  ~SoundFileReader();
  SoundFileReader(const SoundFileReader&) = delete;
  SoundFileReader& operator=(const SoundFileReader&) = delete;

  // Opens a file of any format libsndfile reads. Returns "" or the reason.
  std::string Open(const std::string& path);
  // Opens a WAV file image in memory (`image` must outlive the reader).
  std::string Open(std::span<const uint8_t> image);

  int sample_rate() const { return sample_rate_; }
  int channels() const { return channels_; }
  // Whether the file holds 16-bit samples, which Read(int16_t*) gives
  // unchanged.
  bool pcm16() const { return pcm16_; }

  // Up to `frames` frames into `to` (frames * channels() values); fewer,
  // possibly none, at the end of the file. Floats are on the 16-bit scale
  // (-32768 .. 32767), clipped there; the 16-bit read needs pcm16().
  size_t Read(float* to, size_t frames);
  size_t Read(int16_t* to, size_t frames);

 private:
  enum class Encoding { kUnsigned8, kSigned16, kSigned24, kSigned32, kFloat32, kFloat64 };

  std::string OpenWav(const std::string& name);
  std::string OpenWithLibrary(const std::string& path);
  // Copies up to n bytes of the file or image; returns how many it got.
  size_t ReadBytes(void* to, size_t n);
  bool Skip(uint64_t n);
  // Reads up to `frames` frames of the WAV data into bytes_; returns frames.
  size_t ReadWavFrames(size_t frames);
  void Close();

  std::FILE* file_ = nullptr;
  std::span<const uint8_t> image_;
  size_t image_position_ = 0;
  void* library_file_ = nullptr;  // libsndfile's SNDFILE, when it reads the file
  Encoding encoding_ = Encoding::kSigned16;
  int bytes_per_sample_ = 2;
  uint64_t data_left_ = 0;  // bytes of samples not yet read
  int sample_rate_ = 0;
  int channels_ = 0;
  bool pcm16_ = false;
  std::vector<uint8_t> bytes_;
};

struct WavData {
  int sample_rate = 0;
  int channels = 0;
  // Interleaved, on the 16-bit scale (-32768 .. 32767), as the decoders take.
  std::vector<float> samples;
};

// Reads a whole file of any format libsndfile reads. Returns an empty string
// or the reason it failed.
std::string ReadWav(const std::string& path, WavData* data);

// The same from a WAV file image in memory.
std::string ReadWavFromMemory(std::span<const uint8_t> image, WavData* data);

}  // namespace sorvel_cli

#endif  // TOOLS_WAV_IO_H_
