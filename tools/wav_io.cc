#include "tools/wav_io.h"

#include <sndfile.h>

#include <cstdint>

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

std::string ReadWav(const std::string& path, WavData* data) {
  SF_INFO info = {};
  SNDFILE* file = sf_open(path.c_str(), SFM_READ, &info);
  if (file == nullptr) return "cannot read " + path + ": " + sf_strerror(nullptr);
  data->sample_rate = info.samplerate;
  data->channels = info.channels;
  std::vector<int16_t> pcm(static_cast<size_t>(info.frames) * info.channels);
  const sf_count_t read = sf_read_short(file, pcm.data(), static_cast<sf_count_t>(pcm.size()));
  sf_close(file);
  pcm.resize(read);
  data->samples.assign(pcm.begin(), pcm.end());
  return "";
}

}  // namespace sorvel_cli
