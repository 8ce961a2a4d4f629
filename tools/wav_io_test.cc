#include "tools/wav_io.h"

#include <sndfile.h>

#include <cmath>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "audio/pcm16.h"
#include "gtest/gtest.h"

namespace sorvel_cli {
namespace {

constexpr int kRate = 22050;
constexpr int kChannels = 2;

// A test signal that reaches both ends of the range and a value between
// every pair of 16-bit steps.
std::vector<float> Signal() {
  std::vector<float> samples;
  for (int i = 0; i < 3000; ++i) {
    samples.push_back(static_cast<float>(std::sin(0.01 * i)));
    samples.push_back(static_cast<float>(i % 7 - 3) * 0.3f + 1e-5f * static_cast<float>(i % 50));
  }
  samples[0] = 1.0f;
  samples[1] = -1.0f;
  return samples;
}

std::string TempPath(const std::string& name) {
  return testing::TempDir() + "/wav_io_test_" + name;
}

// Writes `samples` with libsndfile in `format`.
void WriteWithLibrary(const std::string& path, int format, const std::vector<float>& samples) {
  SF_INFO info = {};
  info.samplerate = kRate;
  info.channels = kChannels;
  info.format = format;
  SNDFILE* file = sf_open(path.c_str(), SFM_WRITE, &info);
  ASSERT_NE(file, nullptr) << sf_strerror(nullptr);
  sf_writef_float(file, samples.data(), static_cast<sf_count_t>(samples.size() / kChannels));
  sf_close(file);
}

// libsndfile's reading of the file, on the 16-bit scale.
std::vector<float> ReadWithLibrary(const std::string& path) {
  SF_INFO info = {};
  SNDFILE* file = sf_open(path.c_str(), SFM_READ, &info);
  EXPECT_NE(file, nullptr);
  if (file == nullptr) return {};
  std::vector<float> samples, piece(256 * info.channels);
  for (sf_count_t n; (n = sf_readf_float(file, piece.data(), 256)) > 0;) {
    samples.insert(samples.end(), piece.begin(), piece.begin() + n * info.channels);
  }
  sf_close(file);
  for (float& v : samples) v = std::fmin(std::fmax(v * 32768.0f, -32768.0f), 32767.0f);
  return samples;
}

std::vector<uint8_t> Bytes(const std::string& path) {
  std::vector<uint8_t> bytes;
  std::FILE* file = std::fopen(path.c_str(), "rb");
  for (int c; file != nullptr && (c = std::fgetc(file)) != EOF;) bytes.push_back(static_cast<uint8_t>(c));
  if (file != nullptr) std::fclose(file);
  return bytes;
}

// Every encoding the reader handles itself, in plain and extensible WAV,
// and one it leaves to libsndfile, read as libsndfile reads them: from the
// file in odd-sized pieces, and from its image in memory.
TEST(SoundFileReaderTest, ReadsWhatLibsndfileReads) {
  const std::vector<float> signal = Signal();
  struct Case {
    const char* name;
    int format;
    bool pcm16;
  };
  const Case cases[] = {
      {"u8", SF_FORMAT_WAV | SF_FORMAT_PCM_U8, false},
      {"s16", SF_FORMAT_WAV | SF_FORMAT_PCM_16, true},
      {"s24", SF_FORMAT_WAV | SF_FORMAT_PCM_24, false},
      {"s32", SF_FORMAT_WAV | SF_FORMAT_PCM_32, false},
      {"f32", SF_FORMAT_WAV | SF_FORMAT_FLOAT, false},
      {"f64", SF_FORMAT_WAV | SF_FORMAT_DOUBLE, false},
      {"wavex_s24", SF_FORMAT_WAVEX | SF_FORMAT_PCM_24, false},
      {"wavex_f32", SF_FORMAT_WAVEX | SF_FORMAT_FLOAT, false},
      {"flac", SF_FORMAT_FLAC | SF_FORMAT_PCM_16, true},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    const std::string path = TempPath(c.name);
    WriteWithLibrary(path, c.format, signal);
    const std::vector<float> expected = ReadWithLibrary(path);
    ASSERT_EQ(expected.size(), signal.size());

    SoundFileReader reader;
    ASSERT_EQ(reader.Open(path), "");
    EXPECT_EQ(reader.sample_rate(), kRate);
    EXPECT_EQ(reader.channels(), kChannels);
    EXPECT_EQ(reader.pcm16(), c.pcm16);
    std::vector<float> got;
    std::vector<float> piece(7 * kChannels);
    for (size_t n; (n = reader.Read(piece.data(), 7)) > 0;) {
      got.insert(got.end(), piece.begin(), piece.begin() + static_cast<std::ptrdiff_t>(n * kChannels));
    }
    EXPECT_EQ(got, expected);

    if ((c.format & SF_FORMAT_TYPEMASK) != SF_FORMAT_FLAC) {
      const std::vector<uint8_t> image = Bytes(path);
      WavData data;
      ASSERT_EQ(ReadWavFromMemory(image, &data), "");
      EXPECT_EQ(data.samples, expected);
    }
    if (c.pcm16) {
      ASSERT_EQ(reader.Open(path), "");
      std::vector<int16_t> shorts(signal.size());
      ASSERT_EQ(reader.Read(shorts.data(), signal.size() / kChannels), signal.size() / kChannels);
      for (size_t i = 0; i < shorts.size(); ++i) ASSERT_EQ(shorts[i], expected[i]) << i;
    }
    std::remove(path.c_str());
  }
}

// The tool's own files: a 44-byte header and the samples as the app
// receives them, which libsndfile reads back unchanged.
TEST(SoundFileReaderTest, WrittenFilesAreSixteenBitMono) {
  const std::vector<float> signal = {0.0f, 0.5f, -0.5f, 1.5f, -1.5f, 1e-4f};
  const std::string path = TempPath("written.wav");
  ASSERT_EQ(WriteWav(path, signal, 48000), "");
  EXPECT_EQ(Bytes(path).size(), 44 + 2 * signal.size());
  WavData data;
  ASSERT_EQ(ReadWav(path, &data), "");
  EXPECT_EQ(data.sample_rate, 48000);
  EXPECT_EQ(data.channels, 1);
  EXPECT_EQ(data.samples, ReadWithLibrary(path));
  ASSERT_EQ(data.samples.size(), signal.size());
  for (size_t i = 0; i < signal.size(); ++i) {
    EXPECT_EQ(data.samples[i], audio_sorvane::FloatToPcm16(signal[i]));
  }
  std::remove(path.c_str());
  EXPECT_NE(WriteWav(TempPath("missing/x.wav"), signal, 48000), "");
}

// A header with the fields given, then `data_bytes` of the data chunk
// (whose size field says `data_size`).
std::vector<uint8_t> Header(uint16_t tag, uint16_t channels, uint32_t rate, uint16_t bits,
                            uint16_t block_align, uint32_t data_size,
                            const std::vector<uint8_t>& extra_chunk = {}) {
  std::vector<uint8_t> h;
  const auto put = [&](uint32_t v, int bytes) {
    for (int i = 0; i < bytes; ++i) h.push_back(static_cast<uint8_t>(v >> (8 * i)));
  };
  const auto tag4 = [&](const char* s) {
    for (int i = 0; i < 4; ++i) h.push_back(static_cast<uint8_t>(s[i]));
  };
  tag4("RIFF");
  put(0, 4);
  tag4("WAVE");
  h.insert(h.end(), extra_chunk.begin(), extra_chunk.end());
  tag4("fmt ");
  put(16, 4);
  put(tag, 2);
  put(channels, 2);
  put(rate, 4);
  put(rate * block_align, 4);
  put(block_align, 2);
  put(bits, 2);
  tag4("data");
  put(data_size, 4);
  return h;
}

// Damaged and unusual headers: refused with a reason, or read as far as
// the samples go, never past the image.
TEST(SoundFileReaderTest, DamagedHeaders) {
  const std::vector<uint8_t> samples = {1, 0, 2, 0, 3, 0, 4, 0, 5};  // 4.5 frames
  // A LIST chunk of odd size, padded to an even one.
  const std::vector<uint8_t> list = {'L', 'I', 'S', 'T', 3, 0, 0, 0, 'a', 'b', 'c', 0};
  struct Case {
    const char* name;
    std::vector<uint8_t> image;
    size_t frames;  // read when the header is accepted
    bool accepted;
  };
  const auto with_samples = [&](std::vector<uint8_t> header) {
    header.insert(header.end(), samples.begin(), samples.end());
    return header;
  };
  const std::vector<Case> cases = {
      {"plain", with_samples(Header(1, 1, 8000, 16, 2, 8)), 4, true},
      {"padded chunk first", with_samples(Header(1, 1, 8000, 16, 2, 8, list)), 4, true},
      {"data size past the end", with_samples(Header(1, 1, 8000, 16, 2, 1000)), 4, true},
      {"data size unknown", with_samples(Header(1, 1, 8000, 16, 2, 0xFFFFFFFF)), 4, true},
      {"data size shorter", with_samples(Header(1, 1, 8000, 16, 2, 4)), 2, true},
      {"no channels", with_samples(Header(1, 0, 8000, 16, 2, 8)), 0, false},
      {"no rate", with_samples(Header(1, 1, 0, 16, 2, 8)), 0, false},
      {"block size wrong", with_samples(Header(1, 2, 8000, 16, 2, 8)), 0, false},
      {"compressed", with_samples(Header(2, 1, 8000, 4, 256, 8)), 0, false},
      {"cut in the header", std::vector<uint8_t>(samples.begin(), samples.begin() + 3), 0, false},
      {"cut after RIFF", {'R', 'I', 'F', 'F', 0, 0, 0, 0, 'W', 'A', 'V', 'E', 'f', 'm'}, 0, false},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    WavData data;
    const std::string error = ReadWavFromMemory(c.image, &data);
    EXPECT_EQ(error.empty(), c.accepted) << error;
    if (c.accepted) {
      EXPECT_EQ(data.samples.size(), c.frames);
    }
  }
}

// A file that is no sound file at all goes to libsndfile, which refuses
// it with its reason; a missing file is named.
TEST(SoundFileReaderTest, RefusesWhatNothingReads) {
  const std::string path = TempPath("text.wav");
  std::FILE* file = std::fopen(path.c_str(), "wb");
  ASSERT_NE(file, nullptr);
  std::fputs("not audio at all, just some text", file);
  std::fclose(file);
  SoundFileReader reader;
  EXPECT_NE(reader.Open(path), "");
  std::remove(path.c_str());
  const std::string missing = reader.Open(TempPath("missing.wav"));
  EXPECT_NE(missing.find("missing.wav"), std::string::npos) << missing;
}

}  // namespace
}  // namespace sorvel_cli
