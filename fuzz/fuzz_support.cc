#include "fuzz/fuzz_support.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "audio/hotsound_detector.h"
#include "audio/sorvane/code_signal_generator.h"
#include "base/logging.h"

namespace sorvel_fuzz {

using audio_sorvane::DsssDecoderConfig;
using audio_sorvane::DtmfDecoderConfig;

int FuzzInput::Pick(int lo, int hi, int fallback) {
  const int span = hi - lo + 1;
  return lo + (Byte() + (fallback - lo)) % span;
}

uint8_t PickByte(int lo, int hi, int fallback, int value) {
  const int span = hi - lo + 1;
  return static_cast<uint8_t>(((value - fallback) % span + span) % span);
}

std::span<const float> SampleRates() {
  static constexpr std::array<float, 16> kRates = {
      44100.0f, 48000.0f, 8000.0f,  11025.0f, 16000.0f, 22050.0f, 24000.0f, 32000.0f,
      88200.0f, 96000.0f, 44099.6f, 47999.9f, 12345.6f, 37800.0f, 64000.0f, 192000.0f};
  return kRates;
}

float Level(uint8_t b, float lo, float hi, float fallback) {
  if (b == 0) return fallback;
  const int level = (b - 1) * kLevels / 255;  // 1 gives lo, 255 hi
  return lo + (hi - lo) * static_cast<float>(level) / (kLevels - 1);
}

namespace {

// Bounds on the DSSS frame (samples per frame, and that times the alphabet)
// above which the upsampling multiple, the decimation and then the code
// length are cut down. The coder renders a template per symbol and the
// decoder's tables grow with the frame: a 2047-chip code at 96 samples per
// chip, or 257 symbols of 8192 samples, makes each run take a second.
constexpr int kMaxSamplesPerFrame = 8192;
constexpr int kMaxTemplateSamples = 1 << 17;

}  // namespace

DsssDecoderConfig ReadDsssSettings(FuzzInput& in, bool hotsound) {
  DsssDecoderConfig c;
  c.token_length_bytes = in.Pick(1, 12, 8);
  const uint8_t flags = in.Byte();
  c.append_check_symbol = flags & 1;
  c.save_received_samples = flags & 2;
  c.coder.use_quadrature = flags & 4;
  auto& coder = c.coder;
  coder.number_of_taps = in.Pick(audio_sorvane::kMinTaps, audio_sorvane::kMaxTaps, 7);
  coder.code_number =
      in.Pick(0, audio_sorvane::NumCodesForTaps(coder.number_of_taps) - 1, 0);
  coder.baseband_decimation_factor = in.Pick(1, 8, 3);
  int multiple = in.Pick(1, 12, 5);
  static constexpr int kBits[] = {4, 1, 2, 8};
  coder.bits_per_symbol = kBits[in.Byte() % 4];
  const int max_frame = std::min(kMaxSamplesPerFrame,
                                 kMaxTemplateSamples / ((1 << coder.bits_per_symbol) + 1));
  while (coder.number_of_taps > audio_sorvane::kMinTaps &&
         (1 << coder.number_of_taps) - 1 > max_frame) {
    --coder.number_of_taps;
    coder.code_number = 0;
  }
  const int chips = (1 << coder.number_of_taps) - 1;
  if (chips * coder.baseband_decimation_factor > max_frame) coder.baseband_decimation_factor = 1;
  multiple = std::max(1, std::min(multiple, max_frame / (chips * coder.baseband_decimation_factor)));
  coder.upsampling_factor = coder.baseband_decimation_factor * multiple;
  coder.min_cycles_per_frame = in.Pick(0, 16, 4);
  const auto rates = SampleRates();
  coder.sample_rate = rates[in.Byte() % rates.size()];
  // The wake-up detector listens only at rates that hold its band.
  std::vector<float> inputs;
  for (float rate : rates) {
    if (!hotsound || audio_sorvane::HotsoundDetector::RateFits(
                         std::floor(rate), audio_sorvane::HotsoundDetectorConfig().frequency)) {
      inputs.push_back(rate);
    }
  }
  c.input_sample_rate = inputs[in.Byte() % inputs.size()];
  // The tool refuses carriers above half the input rate; the validator those
  // above half the coder's rate.
  const float max_carrier = std::min(coder.sample_rate, c.input_sample_rate) / 2;
  coder.desired_carrier_frequency =
      std::min(Level(in.Byte(), 0.0f, max_carrier, 18500.0f), max_carrier);
  c.num_channels = in.Pick(1, 4, 1);
  c.max_candidates_to_return = in.Pick(1, 6, 2);
  c.with_hotsound = hotsound;
  c.detection_duration = Level(in.Byte(), 0.0f, 1.0f, 0.175f);
  c.detection_threshold = Level(in.Byte(), 0.0f, 20.0f, 4.0f);
  c.buffer_duration_factor = Level(in.Byte(), 0.25f, 12.0f, 4.0f);
  return c;
}

DtmfDecoderConfig ReadDtmfSettings(FuzzInput& in) {
  DtmfDecoderConfig c;
  auto& t = c.tones;
  t.bytes_in_token = in.Pick(1, 12, 5);
  const uint8_t flags = in.Byte();
  t.use_checksum_symbol = flags & 1;
  t.baseband_decimation_factor = in.Pick(1, 64, 16);
  const auto rates = SampleRates();
  t.sample_rate = rates[in.Byte() % rates.size()];
  t.window_duration = Level(in.Byte(), 0.002f, 0.2f, 0.05f);
  // 0: the ten default tones in pairs; else 3 to 12 tones of our own.
  const int tones = in.Byte() % 11;
  std::vector<float> frequencies;
  for (int i = 0; i < 12; ++i) {
    // 64 steps below half the rate.
    const float f = (in.Byte() & ~3) / 256.0f * t.sample_rate / 2;
    if (tones != 0 && i < tones + 2) frequencies.push_back(f);
  }
  const uint8_t k = in.Byte();
  if (!frequencies.empty()) {
    // Tones per symbol that give between 3 and n(n-1)/2 symbols.
    const int n = static_cast<int>(frequencies.size());
    std::vector<int> usable;
    for (int per = 1; per < n; ++per) {
      const size_t symbols = audio_sorvane::MakeSymbolTable(n, per).size();
      if (symbols >= 3 && symbols <= static_cast<size_t>(n * (n - 1) / 2)) usable.push_back(per);
    }
    t.tones_per_symbol = usable[k % usable.size()];
    t.tone_frequencies = frequencies;
  }
  if (flags & 2) {
    const float w = t.window_duration;
    const auto part = [&] { return Level(in.Byte(), 0.0f, 1.0f, 0.0f); };
    t.adsr = {{part() * w / 3, part() * w / 3, part() * w / 3, part() * w / 3, part()}};
  } else {
    for (int i = 0; i < 5; ++i) in.Byte();
  }
  c.input_sample_rate = rates[in.Byte() % rates.size()];
  c.num_channels = in.Pick(1, 4, 1);
  c.max_candidates_per_decode_token_call = in.Pick(1, 6, 2);
  c.buffer_duration_factor = Level(in.Byte(), 0.25f, 12.0f, 6.0f);
  return c;
}

void RunAudioScript(FuzzInput& in, int channels, int max_frames,
                    const std::function<void(std::span<const int16_t>)>& feed,
                    const std::function<void(uint8_t)>& act) {
  std::vector<int16_t> block;
  std::vector<int16_t> loop;  // everything fed since the last loop
  uint32_t noise = 1;
  int fed = 0;
  const auto send = [&](std::span<const int16_t> samples, bool record) {
    const int frames = static_cast<int>(samples.size()) / channels;
    if (frames == 0) return true;
    if (fed + frames > max_frames) return false;
    fed += frames;
    if (record) loop.insert(loop.end(), samples.begin(), samples.end());
    feed(samples);
    return true;
  };
  while (!in.empty()) {
    const uint8_t op = in.Byte() % 5;
    const int n = in.Byte();
    switch (op) {
      case 0:
        block.resize(static_cast<size_t>(n + 1) * channels);
        for (int16_t& s : block) s = in.Sample();
        send(block, true);
        break;
      case 1:
        if (fed + (n + 1) * 256 > max_frames) break;  // not rendered past the budget
        block.assign(static_cast<size_t>(n + 1) * 256 * channels, 0);
        send(block, true);
        break;
      case 2: {
        const int amplitude = 128 * in.Byte();
        if (fed + (n + 1) * 256 > max_frames) break;
        block.resize(static_cast<size_t>(n + 1) * 256 * channels);
        for (int16_t& s : block) {
          noise = noise * 1664525u + 1013904223u;
          s = static_cast<int16_t>(static_cast<int>(noise >> 16) % (amplitude + 1) -
                                   amplitude / 2);
        }
        send(block, true);
        break;
      }
      case 3: {
        // Fed again in blocks of the size the script last used.
        const size_t step = std::max<size_t>(block.size(), channels);
        bool fits = true;
        for (int i = 0; i <= n % 4 && fits; ++i) {
          for (size_t start = 0; start < loop.size() && fits; start += step) {
            const size_t count = std::min(step, loop.size() - start);
            fits = send(std::span<const int16_t>(loop).subspan(start, count), false);
          }
        }
        loop.clear();
        break;
      }
      default:
        act(static_cast<uint8_t>(n));
        break;
    }
  }
}

void Digest::Add(int64_t value) {
  for (int i = 0; i < 8; ++i) {
    hash_ = (hash_ ^ static_cast<uint8_t>(value >> (8 * i))) * 1099511628211ull;
  }
}

void Act(audio_sorvane::AudioModemDecoder& decoder, uint8_t a, Digest& digest) {
  audio_sorvane::AudioModemDecoder::DecodeResults results;
  const int length = decoder.token_length_bytes();
  int expected = -1;  // bytes per returned token
  switch (a % 8) {
    case 0:
    case 1:
      if (length > 2 && decoder.DecodeTokens(&results, length - 2, 2)) expected = length - 2;
      for (float t : results.detection_times) digest.Add(std::lround(t * 1e4f));
      break;
    case 2:
    case 3:
      if (decoder.DecodeTokens(&results, length, 0)) expected = length;
      break;
    case 4:
      digest.Add(decoder.DetectBroadcaster());
      break;
    case 5: {
      const int size = decoder.GetMaxSafeInputSize();
      if (size < 0) __builtin_trap();
      digest.Add(size);
      break;
    }
    case 6:
      decoder.WipeInternalData();
      break;
    default: {
      // Splits the facade refuses with a logged error.
      const int crc = (a >> 3) % 3;
      if (decoder.DecodeTokens(&results, length - 1 - crc, crc)) __builtin_trap();
      break;
    }
  }
  digest.Add(expected);
  for (const auto& token : results.tokens) {
    if (static_cast<int>(token.bytes.size()) != expected) __builtin_trap();
    for (uint8_t b : token.bytes) digest.Add(b);
    digest.Add(token.position);
    digest.Add(token.score_millis);
  }
}

namespace {

class FatalOnlySink : public sorvel_base::LogSink {
 public:
  void Send(sorvel_base::LogSeverity, const char*, int, std::string_view) override {}
};

}  // namespace

void QuietLogs() {
  static FatalOnlySink sink;
  sorvel_base::SetLogSink(&sink);
}

uint64_t RunDecoderScript(FuzzInput& in, audio_sorvane::AudioModemDecoder& decoder,
                          int channels, int max_frames,
                          const std::function<void(std::span<const int16_t>)>& feed) {
  Digest digest;
  int requests = 0;
  RunAudioScript(
      in, channels, max_frames,
      [&](std::span<const int16_t> block) {
        if (feed) {
          feed(block);
        } else {
          decoder.ProcessPcm16(block.data(), static_cast<int>(block.size()));
        }
      },
      [&](uint8_t a) {
        if (++requests <= kMaxRequests) Act(decoder, a, digest);
      });
  if (requests == 0) Act(decoder, 0, digest);
  return digest.value();
}

namespace {

// Appends the bytes of each value.
template <typename... T>
void Append(std::string& key, const T&... values) {
  (key.append(reinterpret_cast<const char*>(&values), sizeof(values)), ...);
}

}  // namespace

std::string SettingsKey(const DsssDecoderConfig& c) {
  std::string key = "dsss";
  const auto& coder = c.coder;
  Append(key, coder.number_of_taps, coder.code_number, coder.upsampling_factor,
         coder.bits_per_symbol, coder.min_cycles_per_frame, coder.baseband_decimation_factor,
         coder.use_quadrature, coder.sample_rate, coder.desired_carrier_frequency);
  Append(key, c.token_length_bytes, c.append_check_symbol, c.save_received_samples,
         c.max_candidates_to_return, c.num_channels, c.with_hotsound, c.detection_duration,
         c.detection_threshold, c.input_sample_rate, c.buffer_duration_factor);
  return key;
}

std::string SettingsKey(const DtmfDecoderConfig& c) {
  std::string key = "dtmf";
  const auto& t = c.tones;
  Append(key, t.bytes_in_token, t.use_checksum_symbol, t.baseband_decimation_factor,
         t.tones_per_symbol, t.sample_rate, t.window_duration, t.adsr.has_value());
  for (float f : t.tone_frequencies) Append(key, f);
  if (t.adsr) Append(key, *t.adsr);
  Append(key, c.max_candidates_per_decode_token_call, c.num_channels, c.input_sample_rate,
         c.buffer_duration_factor);
  return key;
}

DecoderCache::~DecoderCache() {
  if (std::getenv("SORVEL_FUZZ_CACHE_STATS") != nullptr) {
    std::fprintf(stderr, "decoder cache: %llu uses, %llu builds\n",
                 static_cast<unsigned long long>(uses_), static_cast<unsigned long long>(builds_));
  }
}

audio_sorvane::AudioModemDecoder* DecoderCache::Get(const std::string& key, const Maker& make) {
  ++uses_;
  for (Entry& entry : entries_) {
    if (capacity_ > 0 && entry.key == key) {
      entry.last_use = uses_;
      if (entry.decoder) entry.decoder->WipeInternalData();
      return entry.decoder.get();
    }
  }
  ++builds_;
  if (!entries_.empty() && entries_.size() >= std::max<size_t>(capacity_, 1)) {
    const auto oldest = std::min_element(
        entries_.begin(), entries_.end(),
        [](const Entry& a, const Entry& b) { return a.last_use < b.last_use; });
    entries_.erase(oldest);
  }
  entries_.push_back({key, make(), uses_});
  return entries_.back().decoder.get();
}

bool CheckReuse() {
  static const bool check = std::getenv("SORVEL_FUZZ_CHECK_REUSE") != nullptr;
  return check;
}

void RunCached(DecoderCache& cache, const std::string& key, const DecoderCache::Maker& make,
               const std::function<uint64_t(audio_sorvane::AudioModemDecoder&)>& run) {
  audio_sorvane::AudioModemDecoder* decoder = cache.Get(key, make);
  if (decoder == nullptr) return;
  const uint64_t reused = run(*decoder);
  if (!CheckReuse()) return;
  const auto fresh = make();
  if (run(*fresh) != reused) {
    std::fprintf(stderr, "A wiped decoder answered differently from a new one\n");
    __builtin_trap();
  }
}

}  // namespace sorvel_fuzz
