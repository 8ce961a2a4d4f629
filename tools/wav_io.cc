#include "tools/wav_io.h"

#include <sndfile.h>

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <cstring>

#include "audio/pcm16.h"

namespace sorvel_cli {

std::string WriteWav(const std::string& path, const std::vector<float>& samples,
                     int sample_rate) {
  SF_INFO info = {};
  info.samplerate = sample_rate;
  info.channels = 1;
  info.format = SF_FORMAT_WAV | SF_FORMAT_PCM_16;
  SNDFILE* file = sf_open(path.c_str(), SFM_WRITE, &info);
  if (file == nullptr) return "cannot write " + path + ": " + sf_strerror(nullptr);
  std::vector<int16_t> pcm(samples.size());
  for (size_t i = 0; i < samples.size(); ++i) pcm[i] = audio_sorvane::FloatToPcm16(samples[i]);
  const sf_count_t written = sf_write_short(file, pcm.data(), static_cast<sf_count_t>(pcm.size()));
  const int close_error = sf_close(file);
  if (written != static_cast<sf_count_t>(pcm.size()) || close_error != 0) {
    return "cannot write " + path + ": short write";
  }
  return "";
}

namespace {

// Reads every frame as floats (short reads of a float file return only -1,
// 0 and 1) scaled to the 16-bit range, in bounded chunks so that a header
// claiming a huge length cannot make us allocate it up front.
std::string ReadAll(SNDFILE* file, const SF_INFO& info, const std::string& name,
                    WavData* data) {
  if (info.channels < 1 || info.samplerate < 1) {
    sf_close(file);
    return "cannot read " + name + ": no audio";
  }
  data->sample_rate = info.samplerate;
  data->channels = info.channels;
  data->samples.clear();
  std::vector<float> chunk(4096 * static_cast<size_t>(info.channels));
  for (sf_count_t got; (got = sf_readf_float(file, chunk.data(), 4096)) > 0;) {
    for (sf_count_t i = 0; i < got * info.channels; ++i) {
      data->samples.push_back(std::clamp(chunk[i] * 32768.0f, -32768.0f, 32767.0f));
    }
  }
  sf_close(file);
  return "";
}

struct MemoryFile {
  std::span<const uint8_t> image;
  sf_count_t position = 0;
};

}  // namespace

std::string ReadWav(const std::string& path, WavData* data) {
  SF_INFO info = {};
  SNDFILE* file = sf_open(path.c_str(), SFM_READ, &info);
  if (file == nullptr) return "cannot read " + path + ": " + sf_strerror(nullptr);
  return ReadAll(file, info, path, data);
}

std::string ReadWavFromMemory(std::span<const uint8_t> image, WavData* data) {
  SF_VIRTUAL_IO io = {};
  io.get_filelen = [](void* user) {
    return static_cast<sf_count_t>(static_cast<MemoryFile*>(user)->image.size());
  };
  io.seek = [](sf_count_t offset, int whence, void* user) {
    auto* f = static_cast<MemoryFile*>(user);
    const sf_count_t size = static_cast<sf_count_t>(f->image.size());
    sf_count_t target = whence == SEEK_SET ? offset
                        : whence == SEEK_CUR ? f->position + offset
                                             : size + offset;
    f->position = std::clamp<sf_count_t>(target, 0, size);
    return f->position;
  };
  io.read = [](void* out, sf_count_t count, void* user) {
    auto* f = static_cast<MemoryFile*>(user);
    const sf_count_t n =
        std::clamp<sf_count_t>(count, 0, static_cast<sf_count_t>(f->image.size()) - f->position);
    std::memcpy(out, f->image.data() + f->position, static_cast<size_t>(n));
    f->position += n;
    return n;
  };
  io.write = [](const void*, sf_count_t, void*) -> sf_count_t { return 0; };
  io.tell = [](void* user) { return static_cast<MemoryFile*>(user)->position; };
  MemoryFile memory{image};
  SF_INFO info = {};
  SNDFILE* file = sf_open_virtual(&io, SFM_READ, &info, &memory);
  if (file == nullptr) return std::string("cannot read the image: ") + sf_strerror(nullptr);
  return ReadAll(file, info, "the image", data);
}

}  // namespace sorvel_cli
