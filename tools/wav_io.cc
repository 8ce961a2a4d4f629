#include "tools/wav_io.h"

#include <dlfcn.h>
#include <sndfile.h>

#include <algorithm>
#include <bit>
#include <cerrno>
#include <cmath>
#include <cstring>
#include <limits>
#include <type_traits>

#include "audio/pcm16.h"

namespace sorvel_cli {
namespace {

uint16_t Le16(const uint8_t* p) { return static_cast<uint16_t>(p[0] | p[1] << 8); }
uint32_t Le32(const uint8_t* p) {
  return static_cast<uint32_t>(p[0]) | static_cast<uint32_t>(p[1]) << 8 |
         static_cast<uint32_t>(p[2]) << 16 | static_cast<uint32_t>(p[3]) << 24;
}
void PutLe16(uint32_t v, uint8_t* p) {
  p[0] = static_cast<uint8_t>(v);
  p[1] = static_cast<uint8_t>(v >> 8);
}
void PutLe32(uint32_t v, uint8_t* p) {
  PutLe16(v, p);
  PutLe16(v >> 16, p + 2);
}

constexpr uint16_t kFormatPcm = 1;
constexpr uint16_t kFormatFloat = 3;
constexpr uint16_t kFormatExtensible = 0xFFFE;
// The tail of the sub-format GUID of extensible WAV files, after its first
// two bytes (the format tag).
constexpr uint8_t kGuidTail[14] = {0x00, 0x00, 0x00, 0x00, 0x10, 0x00, 0x80,
                                   0x00, 0x00, 0xAA, 0x00, 0x38, 0x9B, 0x71};
// The size a data chunk of unknown length (a recording still being written)
// carries: read to the end of the file.
constexpr uint32_t kUnknownSize = 0xFFFFFFFF;
// OpenWav's answer for files it leaves to libsndfile.
constexpr const char* kOtherFormat = "other format";
// More channels than any sound card: a header claiming them is damaged.
constexpr int kMaxChannels = 1024;

// libsndfile's entry points, looked up on first use.
struct Sndfile {
  decltype(&sf_open) open = nullptr;
  decltype(&sf_close) close = nullptr;
  decltype(&sf_readf_float) readf_float = nullptr;
  decltype(&sf_readf_short) readf_short = nullptr;
  decltype(&sf_strerror) strerror = nullptr;
  std::string error;  // why it is unusable, or ""
};

const Sndfile& LoadSndfile() {
  static const Sndfile library = [] {
    Sndfile s;
    void* handle = dlopen("libsndfile.so.1", RTLD_NOW | RTLD_LOCAL);
    if (handle == nullptr) {
      const char* why = dlerror();
      s.error = why != nullptr ? why : "libsndfile.so.1 not found";
      return s;
    }
    const auto find = [&](const char* name, auto* pointer) {
      *pointer = reinterpret_cast<std::remove_reference_t<decltype(*pointer)>>(dlsym(handle, name));
      if (*pointer == nullptr && s.error.empty()) s.error = std::string("libsndfile lacks ") + name;
    };
    find("sf_open", &s.open);
    find("sf_close", &s.close);
    find("sf_readf_float", &s.readf_float);
    find("sf_readf_short", &s.readf_short);
    find("sf_strerror", &s.strerror);
    return s;
  }();
  return library;
}

}  // namespace

std::string WriteWav(const std::string& path, const std::vector<float>& samples,
                     int sample_rate) {
  const uint64_t data_bytes = 2 * static_cast<uint64_t>(samples.size());
  if (data_bytes > std::numeric_limits<uint32_t>::max() - 36) {
    return "cannot write " + path + ": too long for a WAV file";
  }
  if (sample_rate <= 0) return "cannot write " + path + ": no sample rate";
  std::vector<uint8_t> image(44 + data_bytes);
  uint8_t* h = image.data();
  std::memcpy(h, "RIFF", 4);
  PutLe32(static_cast<uint32_t>(36 + data_bytes), h + 4);
  std::memcpy(h + 8, "WAVEfmt ", 8);
  PutLe32(16, h + 16);
  PutLe16(kFormatPcm, h + 20);
  PutLe16(1, h + 22);  // channels
  PutLe32(static_cast<uint32_t>(sample_rate), h + 24);
  PutLe32(static_cast<uint32_t>(sample_rate) * 2, h + 28);  // bytes per second
  PutLe16(2, h + 32);                                        // bytes per frame
  PutLe16(16, h + 34);                                       // bits per sample
  std::memcpy(h + 36, "data", 4);
  PutLe32(static_cast<uint32_t>(data_bytes), h + 40);
  for (size_t i = 0; i < samples.size(); ++i) {
    PutLe16(static_cast<uint16_t>(audio_sorvane::FloatToPcm16(samples[i])), h + 44 + 2 * i);
  }
  std::FILE* file = std::fopen(path.c_str(), "wb");
  if (file == nullptr) return "cannot write " + path + ": " + std::strerror(errno);
  const bool written = std::fwrite(image.data(), 1, image.size(), file) == image.size();
  if (std::fclose(file) != 0 || !written) return "cannot write " + path + ": short write";
  return "";
}

SoundFileReader::~SoundFileReader() { Close(); }

void SoundFileReader::Close() {
  if (file_ != nullptr) std::fclose(file_);
  if (library_file_ != nullptr) LoadSndfile().close(static_cast<SNDFILE*>(library_file_));
  file_ = nullptr;
  library_file_ = nullptr;
  image_ = {};
  image_position_ = 0;
  data_left_ = 0;
}

std::string SoundFileReader::Open(const std::string& path) {
  Close();
  file_ = std::fopen(path.c_str(), "rb");
  if (file_ == nullptr) return "cannot read " + path + ": " + std::strerror(errno);
  std::string error = OpenWav(path);
  if (error != kOtherFormat) return error;
  std::fclose(file_);
  file_ = nullptr;
  return OpenWithLibrary(path);
}

std::string SoundFileReader::Open(std::span<const uint8_t> image) {
  Close();
  image_ = image;
  std::string error = OpenWav("the image");
  if (error == kOtherFormat) return "cannot read the image: not a WAV file this tool reads";
  return error;
}

size_t SoundFileReader::ReadBytes(void* to, size_t n) {
  if (file_ != nullptr) return std::fread(to, 1, n, file_);
  const size_t got = std::min(n, image_.size() - image_position_);
  if (got > 0) std::memcpy(to, image_.data() + image_position_, got);
  image_position_ += got;
  return got;
}

bool SoundFileReader::Skip(uint64_t n) {
  uint8_t scratch[4096];
  while (n > 0) {
    const size_t step = static_cast<size_t>(std::min<uint64_t>(n, sizeof(scratch)));
    if (ReadBytes(scratch, step) != step) return false;
    n -= step;
  }
  return true;
}

// Parses the RIFF header up to the start of the samples. kOtherFormat
// when the file is no WAV file, or one in an encoding read elsewhere.
std::string SoundFileReader::OpenWav(const std::string& name) {
  const auto bad = [&](const char* why) { return "cannot read " + name + ": " + why; };
  uint8_t riff[12];
  if (ReadBytes(riff, 12) != 12 || std::memcmp(riff, "RIFF", 4) != 0 ||
      std::memcmp(riff + 8, "WAVE", 4) != 0) {
    return kOtherFormat;
  }
  bool have_format = false;
  for (;;) {
    uint8_t header[8];
    if (ReadBytes(header, 8) != 8) return bad(have_format ? "no data chunk" : "no fmt chunk");
    const uint32_t size = Le32(header + 4);
    if (std::memcmp(header, "data", 4) == 0) {
      if (!have_format) return bad("data chunk before the fmt chunk");
      data_left_ = size == kUnknownSize ? std::numeric_limits<uint64_t>::max() : size;
      return "";
    }
    if (std::memcmp(header, "fmt ", 4) != 0) {
      // Chunks are padded to an even size.
      if (!Skip(static_cast<uint64_t>(size) + (size & 1))) return bad("truncated header");
      continue;
    }
    uint8_t format[40] = {};
    if (size < 16) return bad("malformed fmt chunk");
    const size_t kept = std::min<size_t>(size, sizeof(format));
    if (ReadBytes(format, kept) != kept || !Skip(size - kept + (size & 1))) {
      return bad("truncated header");
    }
    uint16_t tag = Le16(format);
    const int channels = Le16(format + 2);
    const uint32_t rate = Le32(format + 4);
    const int block_align = Le16(format + 12);
    const int bits = Le16(format + 14);
    if (tag == kFormatExtensible) {
      if (size < 40) return bad("malformed fmt chunk");
      if (std::memcmp(format + 26, kGuidTail, sizeof(kGuidTail)) != 0) return kOtherFormat;
      tag = Le16(format + 24);
    }
    if (channels < 1 || channels > kMaxChannels) return bad("no audio channels");
    if (rate < 1 || rate > static_cast<uint32_t>(std::numeric_limits<int>::max())) {
      return bad("no sample rate");
    }
    if (tag == kFormatPcm && (bits == 8 || bits == 16 || bits == 24 || bits == 32)) {
      encoding_ = bits == 8    ? Encoding::kUnsigned8
                  : bits == 16 ? Encoding::kSigned16
                  : bits == 24 ? Encoding::kSigned24
                               : Encoding::kSigned32;
    } else if (tag == kFormatFloat && (bits == 32 || bits == 64)) {
      encoding_ = bits == 32 ? Encoding::kFloat32 : Encoding::kFloat64;
    } else {
      return kOtherFormat;  // compressed or unusual sizes: libsndfile's
    }
    bytes_per_sample_ = bits / 8;
    if (block_align != channels * bytes_per_sample_) return bad("malformed fmt chunk");
    channels_ = channels;
    sample_rate_ = static_cast<int>(rate);
    pcm16_ = encoding_ == Encoding::kSigned16;
    have_format = true;
  }
}

std::string SoundFileReader::OpenWithLibrary(const std::string& path) {
  const Sndfile& library = LoadSndfile();
  if (!library.error.empty()) {
    return "cannot read " + path + ": not a WAV file, and other formats need libsndfile (" +
           library.error + ")";
  }
  SF_INFO info = {};
  SNDFILE* file = library.open(path.c_str(), SFM_READ, &info);
  if (file == nullptr) return "cannot read " + path + ": " + library.strerror(nullptr);
  if (info.channels < 1 || info.samplerate < 1) {
    library.close(file);
    return "cannot read " + path + ": no audio";
  }
  library_file_ = file;
  channels_ = info.channels;
  sample_rate_ = info.samplerate;
  pcm16_ = (info.format & SF_FORMAT_SUBMASK) == SF_FORMAT_PCM_16;
  return "";
}

size_t SoundFileReader::ReadWavFrames(size_t frames) {
  const size_t frame_bytes = static_cast<size_t>(channels_) * bytes_per_sample_;
  const size_t wanted = static_cast<size_t>(
      std::min<uint64_t>(data_left_ / frame_bytes, frames) * frame_bytes);
  bytes_.resize(wanted);
  const size_t got = ReadBytes(bytes_.data(), wanted) / frame_bytes;
  data_left_ = got * frame_bytes == wanted ? data_left_ - wanted : 0;
  return got;
}

size_t SoundFileReader::Read(float* to, size_t frames) {
  if (library_file_ != nullptr) {
    // Normalised floats (-1 .. 1) scaled to the 16-bit range.
    const auto got = static_cast<size_t>(LoadSndfile().readf_float(
        static_cast<SNDFILE*>(library_file_), to, static_cast<sf_count_t>(frames)));
    for (size_t i = 0; i < got * channels_; ++i) {
      to[i] = std::clamp(to[i] * 32768.0f, -32768.0f, 32767.0f);
    }
    return got;
  }
  const size_t got = ReadWavFrames(frames);
  const uint8_t* p = bytes_.data();
  for (size_t i = 0; i < got * channels_; ++i, p += bytes_per_sample_) {
    float v = 0.0f;
    switch (encoding_) {
      case Encoding::kUnsigned8:
        v = static_cast<float>((p[0] - 128) * 256);
        break;
      case Encoding::kSigned16:
        v = static_cast<int16_t>(Le16(p));
        break;
      case Encoding::kSigned24:
        // Sign-extended through the top of a 32-bit value; the scaling is exact.
        v = static_cast<float>(static_cast<int32_t>(static_cast<uint32_t>(p[0]) << 8 |
                                                    static_cast<uint32_t>(p[1]) << 16 |
                                                    static_cast<uint32_t>(p[2]) << 24)) /
            65536.0f;
        break;
      case Encoding::kSigned32:
        v = static_cast<float>(static_cast<int32_t>(Le32(p))) / 65536.0f;
        break;
      case Encoding::kFloat32: {
        const uint32_t bits = Le32(p);
        float f;
        std::memcpy(&f, &bits, sizeof(f));
        v = f * 32768.0f;
        break;
      }
      case Encoding::kFloat64: {
        const uint64_t bits = Le32(p) | static_cast<uint64_t>(Le32(p + 4)) << 32;
        double d;
        std::memcpy(&d, &bits, sizeof(d));
        v = static_cast<float>(d) * 32768.0f;
        break;
      }
    }
    to[i] = std::clamp(v, -32768.0f, 32767.0f);
  }
  return got;
}

size_t SoundFileReader::Read(int16_t* to, size_t frames) {
  if (library_file_ != nullptr) {
    return static_cast<size_t>(LoadSndfile().readf_short(static_cast<SNDFILE*>(library_file_), to,
                                                         static_cast<sf_count_t>(frames)));
  }
  if (encoding_ == Encoding::kSigned16) {
    const size_t got = ReadWavFrames(frames);
    if constexpr (std::endian::native == std::endian::little) {
      std::memcpy(to, bytes_.data(), got * channels_ * sizeof(int16_t));
    } else {
      for (size_t i = 0; i < got * channels_; ++i) to[i] = static_cast<int16_t>(Le16(&bytes_[2 * i]));
    }
    return got;
  }
  // Other encodings through the float conversion, rounded.
  std::vector<float> values(frames * channels_);
  const size_t got = Read(values.data(), frames);
  for (size_t i = 0; i < got * channels_; ++i) {
    to[i] = static_cast<int16_t>(std::lrint(values[i]));
  }
  return got;
}

namespace {

std::string ReadAll(SoundFileReader& reader, WavData* data) {
  data->sample_rate = reader.sample_rate();
  data->channels = reader.channels();
  data->samples.clear();
  // Bounded chunks: a header claiming a huge length cannot make us
  // allocate it up front.
  constexpr size_t kChunkFrames = 4096;
  std::vector<float> chunk(kChunkFrames * reader.channels());
  for (size_t got; (got = reader.Read(chunk.data(), kChunkFrames)) > 0;) {
    data->samples.insert(data->samples.end(), chunk.begin(),
                         chunk.begin() + static_cast<std::ptrdiff_t>(got * reader.channels()));
  }
  return "";
}

}  // namespace

std::string ReadWav(const std::string& path, WavData* data) {
  SoundFileReader reader;
  if (std::string e = reader.Open(path); !e.empty()) return e;
  return ReadAll(reader, data);
}

std::string ReadWavFromMemory(std::span<const uint8_t> image, WavData* data) {
  SoundFileReader reader;
  if (std::string e = reader.Open(image); !e.empty()) return e;
  return ReadAll(reader, data);
}

}  // namespace sorvel_cli
