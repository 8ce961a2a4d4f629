// Soak: hours of noise with a broadcast every few minutes, streamed in 10 ms
// blocks through each decoder kind with tokens requested every 250 ms, as
// fast as the decoders go. Every broadcast must be decoded, the decoders'
// buffers must stay within their budgets and the heap must stay flat: the
// heap in use (mallinfo2) and the RSS are sampled every hour of stream time
// (every tenth of the run if it is shorter than two hours) and printed as a
// table. The heap's floor (its smallest sample) over the last quarter of the
// run may not exceed its floor over the first quarter, from the first
// sample after the start on, by more than kHeapMarginBytes.
//
//   sorvel_soak [--minutes M | --hours H] [--every SECONDS] [--kinds dsss,hotsound,dtmf]
//       defaults: 120 minutes, a broadcast every 180 s, all three kinds
//   sorvel_soak --pcm dsss|dtmf --sent FILE [--minutes M | --hours H] [--every SECONDS]
//       writes the same audio as raw 16-bit little-endian PCM at 44.1 kHz to
//       standard output and each broadcast's message bytes, in hex, to FILE
//       (tools/stream_soak.sh pipes it into `sorvel decode -`).
#include <malloc.h>
#include <sys/resource.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include "audio/hotsound_decoder.h"
#include "audio/modem_config.h"
#include "audio/sorvane/crc16_coder.h"
#include "audio/sorvane/dtmf/dtmf_decoder.h"
#include "sim/channel_simulator.h"

namespace {

using audio_sorvane::DecodeResults;

constexpr double kRate = 44100.0;
constexpr size_t kBlock = 441;  // 10 ms
// Growth allowed of the heap's floor. Single samples move by up to 90 kB
// with the buffers in flight at the moment; the floor moves by a few kB.
// Any leak per token request (1.4 million in 100 hours) or of 100 bytes per
// broadcast (600) exceeds it.
constexpr long kHeapMarginBytes = 32 * 1024;

// 10 ms blocks of white noise (RMS 1000) with a broadcast of a fresh random
// message every `every` seconds, starting 1 s into each period. The noise
// comes from a precomputed Gaussian buffer read at a random offset and sign
// per block: every block is white and blocks are independent, and the
// decoders, not a per-sample generator, set the pace.
class SoakAudio {
 public:
  SoakAudio(bool dtmf, double seconds, double every)
      : dtmf_(dtmf),
        encoder_(dtmf ? audio_sorvane::MakeDtmfEncoder({}) : audio_sorvane::MakeDsssEncoder({})),
        total_(static_cast<int64_t>(seconds * kRate)),
        period_(static_cast<int64_t>(every * kRate)),
        noise_(1 << 18) {
    std::normal_distribution<float> gauss(0.0f, 1000.0f);
    for (float& v : noise_) v = gauss(rng_);
    token_.reserve(8);
  }

  // The next block on the 16-bit scale; false at the end of the stream.
  // `*begins` tells whether a new broadcast's period starts in this block.
  bool Next(std::vector<float>* block, bool* begins) {
    if (position_ + static_cast<int64_t>(kBlock) > total_) return false;
    const int64_t phase = position_ % period_;
    // A broadcast starts only if it ends, and can be heard, before the end.
    *begins = phase < static_cast<int64_t>(kBlock) && position_ + 10 * kRate <= total_;
    if (*begins) NewBroadcast();
    const uint64_t r = rng_();
    const size_t offset = r % (noise_.size() - kBlock);
    const float sign = (r >> 63) ? -1.0f : 1.0f;
    block->resize(kBlock);
    for (size_t i = 0; i < kBlock; ++i) {
      const size_t t = static_cast<size_t>(phase) + i;
      (*block)[i] = sign * noise_[offset + i] + (t < broadcast_.size() ? broadcast_[t] : 0.0f);
    }
    position_ += kBlock;
    return true;
  }

  // The latest broadcast's message, and its token (message and CRC bytes).
  const std::vector<uint8_t>& message() const { return message_; }
  const std::vector<uint8_t>& token() const { return token_; }
  int broadcasts() const { return broadcasts_; }
  int64_t position() const { return position_; }  // samples delivered

 private:
  void NewBroadcast() {
    message_.assign(dtmf_ ? 3 : 6, 0);
    for (uint8_t& b : message_) b = static_cast<uint8_t>(rng_());
    std::vector<float> audio;
    encoder_->Encode(message_, &audio, 2);
    token_ = message_;
    audio_sorvane::Crc16Coder({.num_message_bytes = static_cast<int>(message_.size())})
        .Encode(&token_);
    const std::vector<float> loop = sorvel_sim::RenderLoopedBroadcast(*encoder_, audio, 4.0);
    broadcast_.assign(static_cast<size_t>(kRate), 0.0f);
    for (float v : loop) broadcast_.push_back(v * 16384.0f / 0.5f * (dtmf_ ? 0.5f : 1.0f));
    ++broadcasts_;
  }

  const bool dtmf_;
  const std::unique_ptr<audio_sorvane::AudioModemEncoder> encoder_;
  const int64_t total_, period_;
  std::mt19937_64 rng_{17};
  std::vector<float> noise_, broadcast_;
  std::vector<uint8_t> message_, token_;
  int broadcasts_ = 0;
  int64_t position_ = 0;
};

struct Options {
  double seconds = 120 * 60.0;
  double every = 180.0;
  std::vector<std::string> kinds = {"dsss", "hotsound", "dtmf"};
  std::string pcm;   // scheme of the raw PCM written to stdout; empty: soak
  std::string sent;  // where --pcm lists the broadcasts
};

struct Result {
  int broadcasts = 0;
  int decoded = 0;
  bool within_budget = true;
  bool heap_flat = true;
};

long HeapInUse() { return static_cast<long>(mallinfo2().uordblks); }

long RssKb() {
  long pages_total = 0, pages_resident = 0;
  if (FILE* f = std::fopen("/proc/self/statm", "r")) {
    if (std::fscanf(f, "%ld %ld", &pages_total, &pages_resident) != 2) pages_resident = 0;
    std::fclose(f);
  }
  return pages_resident * (sysconf(_SC_PAGESIZE) / 1024);
}

// Streams the soak audio through one decoder. `feed` takes a block,
// `decode` returns the first candidate's bytes (empty if none),
// `buffer_ok` checks the held buffers. A broadcast counts as decoded when
// its token comes back before the next one starts. Nothing here allocates
// per broadcast or per request, so the heap samples are the decoder's.
template <typename Feed, typename Decode, typename BufferOk>
Result Soak(const char* name, bool dtmf, const Options& o, Feed feed, Decode decode,
            BufferOk buffer_ok) {
  SoakAudio audio(dtmf, o.seconds, o.every);
  const bool hourly = o.seconds >= 2 * 3600.0;
  const int64_t interval = static_cast<int64_t>((hourly ? 3600.0 : o.seconds / 10) * kRate);
  const char* unit = hourly ? "hour" : "minute";
  const double unit_samples = (hourly ? 3600.0 : 60.0) * kRate;
  std::printf("%s: %8s %12s %10s\n", name, unit, "heap bytes", "RSS kB");
  const auto sample = [&](int64_t position) {
    const long heap = HeapInUse(), rss = RssKb();
    std::printf("%s: %8.2f %12ld %10ld\n", name, position / unit_samples, heap, rss);
    std::fflush(stdout);
    return heap;
  };
  sample(0);
  std::vector<float> block;
  Result result;
  bool begins = false, heard = false;
  std::vector<long> heap;  // after the start, one per interval
  heap.reserve(static_cast<size_t>(o.seconds * kRate / std::max<int64_t>(interval, 1)) + 2);
  int64_t next_sample = interval, broadcast_start = 0;
  const auto tally = [&] {
    result.decoded += heard;
    if (!heard) {
      std::printf("%s: MISSED the broadcast at %.2f %ss\n", name,
                  broadcast_start / unit_samples, unit);
    }
  };
  for (int64_t n = 0; audio.Next(&block, &begins); ++n) {
    if (begins) {
      if (audio.broadcasts() > 1) tally();
      heard = false;
      broadcast_start = audio.position() - static_cast<int64_t>(kBlock);
    }
    feed(block);
    if (n % 25 == 24) {
      const std::vector<uint8_t> bytes = decode();
      heard = heard || (audio.broadcasts() > 0 && bytes == audio.token());
      result.within_budget = result.within_budget && buffer_ok();
    }
    if (interval > 0 && audio.position() >= next_sample) {
      heap.push_back(sample(audio.position()));
      next_sample += interval;
    }
  }
  if (audio.broadcasts() > 0) tally();
  result.broadcasts = audio.broadcasts();
  const size_t quarter = std::max<size_t>(1, heap.size() / 4);
  if (heap.size() >= 2) {
    const long first = *std::min_element(heap.begin(), heap.begin() + quarter);
    const long last = *std::min_element(heap.end() - quarter, heap.end());
    result.heap_flat = last - first <= kHeapMarginBytes;
    std::printf("%s: heap floor %ld bytes over the first %zu samples after the start, %ld "
                "bytes over the last %zu: growth %ld bytes (margin %ld)\n",
                name, first, quarter, last, quarter, last - first, kHeapMarginBytes);
  }
  return result;
}

long PeakRssKb() {
  rusage usage;
  getrusage(RUSAGE_SELF, &usage);
  return usage.ru_maxrss;
}

std::string Hex(const std::vector<uint8_t>& bytes) {
  std::string hex;
  char pair[3];
  for (uint8_t b : bytes) {
    std::snprintf(pair, sizeof(pair), "%02x", b);
    hex += pair;
  }
  return hex;
}

// --pcm: the soak audio as raw 16-bit little-endian PCM on stdout.
int WritePcm(const Options& o) {
  FILE* sent = std::fopen(o.sent.c_str(), "w");
  if (sent == nullptr) {
    std::fprintf(stderr, "sorvel_soak: cannot write %s: %s\n", o.sent.c_str(),
                 std::strerror(errno));
    return 2;
  }
  SoakAudio audio(o.pcm == "dtmf", o.seconds, o.every);
  std::vector<float> block;
  std::vector<uint8_t> bytes(2 * kBlock);
  bool begins = false;
  while (audio.Next(&block, &begins)) {
    if (begins) {
      std::fprintf(sent, "%s\n", Hex(audio.message()).c_str());
      std::fflush(sent);
    }
    for (size_t i = 0; i < kBlock; ++i) {
      const auto v = static_cast<int16_t>(std::lrint(std::clamp(block[i], -32768.0f, 32767.0f)));
      bytes[2 * i] = static_cast<uint8_t>(v & 0xff);
      bytes[2 * i + 1] = static_cast<uint8_t>((v >> 8) & 0xff);
    }
    if (std::fwrite(bytes.data(), 1, bytes.size(), stdout) != bytes.size()) {
      std::fprintf(stderr, "sorvel_soak: writing the audio failed after %.1f s\n",
                   audio.position() / kRate);
      std::fclose(sent);
      return 1;
    }
  }
  std::fclose(sent);
  return std::fflush(stdout) == 0 ? 0 : 1;
}

constexpr const char* kUsage =
    "usage: sorvel_soak [--minutes M | --hours H] [--every SECONDS] [--kinds dsss,hotsound,dtmf]\n"
    "       sorvel_soak --pcm dsss|dtmf --sent FILE [--minutes M | --hours H] [--every SECONDS]\n";

// Reads a positive number into `*value`; false, with `*problem` set, otherwise.
bool ParsePositive(const char* flag, const char* text, double* value, std::string* problem) {
  char* end = nullptr;
  const double v = std::strtod(text, &end);
  if (end == text || *end != '\0' || !std::isfinite(v) || v <= 0) {
    *problem = std::string(flag) + " must be a positive number, got '" + text + "'";
    return false;
  }
  *value = v;
  return true;
}

// Empty, or what is wrong with the command line.
std::string ParseOptions(int argc, char** argv, Options* o) {
  std::string problem;
  for (int i = 1; i < argc; i += 2) {
    const std::string flag = argv[i];
    if (flag == "--help" || flag == "-h") return "help";
    if (i + 1 >= argc) return flag + " needs a value";
    const char* value = argv[i + 1];
    double v = 0;
    if (flag == "--minutes" || flag == "--hours") {
      if (!ParsePositive(flag.c_str(), value, &v, &problem)) return problem;
      o->seconds = v * (flag == "--hours" ? 3600 : 60);
    } else if (flag == "--every") {
      if (!ParsePositive(flag.c_str(), value, &v, &problem)) return problem;
      o->every = v;
    } else if (flag == "--kinds") {
      o->kinds.clear();
      std::string list = value;
      for (size_t start = 0; start <= list.size();) {
        const size_t comma = std::min(list.find(',', start), list.size());
        const std::string kind = list.substr(start, comma - start);
        if (kind != "dsss" && kind != "hotsound" && kind != "dtmf") {
          return "--kinds takes dsss, hotsound and dtmf, got '" + kind + "'";
        }
        o->kinds.push_back(kind);
        start = comma + 1;
      }
    } else if (flag == "--pcm") {
      o->pcm = value;
      if (o->pcm != "dsss" && o->pcm != "dtmf") {
        return "--pcm takes dsss or dtmf, got '" + o->pcm + "'";
      }
    } else if (flag == "--sent") {
      o->sent = value;
    } else {
      return "unknown option '" + flag + "'";
    }
  }
  // A broadcast takes 1 s of lead and 4 s of sound, and the decoder needs
  // a few seconds more to report it before the next one.
  if (o->every < 10) return "--every must be at least 10 seconds";
  if (o->seconds < 10) return "the soak must last at least 10 seconds";
  if (o->seconds > 10000 * 3600.0) return "the soak must last at most 10000 hours";
  if (!o->pcm.empty() && o->sent.empty()) return "--pcm needs --sent FILE";
  if (o->pcm.empty() && !o->sent.empty()) return "--sent goes with --pcm";
  return "";
}

}  // namespace

int main(int argc, char** argv) {
  Options o;
  if (const std::string problem = ParseOptions(argc, argv, &o); !problem.empty()) {
    if (problem == "help") {
      std::fputs(kUsage, stdout);
      return 0;
    }
    std::fprintf(stderr, "sorvel_soak: %s\n%s", problem.c_str(), kUsage);
    return 2;
  }
  if (!o.pcm.empty()) return WritePcm(o);

  bool ok = true;
  const auto report = [&](const char* name, const Result& r) {
    std::printf("%-9s %d/%d broadcasts decoded, buffers %s, heap %s, peak RSS so far %ld kB\n",
                name, r.decoded, r.broadcasts, r.within_budget ? "within budget" : "OVER BUDGET",
                r.heap_flat ? "flat" : "GROWING", PeakRssKb());
    std::fflush(stdout);
    ok = ok && r.decoded == r.broadcasts && r.within_budget && r.heap_flat;
  };
  const auto wanted = [&](const char* kind) {
    return std::find(o.kinds.begin(), o.kinds.end(), kind) != o.kinds.end();
  };
  std::printf("soak: %.0f minutes of noise, a broadcast every %.0f s, 10 ms blocks\n",
              o.seconds / 60, o.every);
  std::fflush(stdout);
  const auto coder = std::make_shared<const audio_sorvane::SymbolWaveCoder>(
      audio_sorvane::MakeSymbolWaveCoderParams({}));
  if (wanted("dsss")) {
    audio_sorvane::SorvaneDecoder dsss(coder, {});
    dsss.Initialize(1, 44100.0f);
    DecodeResults results;
    report("dsss", Soak(
        "dsss", false, o, [&](const std::vector<float>& b) { dsss.ProcessSamples(b); },
        [&] { return dsss.GetToken(&results) ? results.tokens[0].bytes : std::vector<uint8_t>(); },
        [&] {
          return dsss.baseband_buffer_size() <= dsss.max_buffer_size() / 3 + 2 * 635 &&
                 dsss.symbol_score_cache_size() <= 400;
        }));
  }
  if (wanted("hotsound")) {
    // The decoder's activity timeout runs on the stream's time, not the
    // wall clock: the soak goes hundreds of times faster than real time.
    int64_t frames = 0;
    audio_sorvane::HotsoundDecoder hotsound(
        std::make_unique<audio_sorvane::SorvaneDecoder>(coder, audio_sorvane::SorvaneDecoderParams()),
        audio_sorvane::MakeHotsoundDetector(44100, 1), [&frames] {
          return std::chrono::steady_clock::time_point() +
                 std::chrono::microseconds(frames * 1000000 / 44100);
        });
    hotsound.Initialize(1, 44100.0f);
    DecodeResults results;
    std::vector<int16_t> pcm;
    report("hotsound", Soak(
        "hotsound", false, o,
        [&](const std::vector<float>& b) {
          pcm.assign(b.size(), 0);
          for (size_t i = 0; i < b.size(); ++i) {
            pcm[i] = static_cast<int16_t>(std::clamp(b[i], -32768.0f, 32767.0f));
          }
          hotsound.ProcessSamples(pcm.data(), static_cast<int>(pcm.size()));
          frames += static_cast<int64_t>(b.size());
        },
        [&] {
          return hotsound.DecodeTokens(&results) ? results.tokens[0].bytes : std::vector<uint8_t>();
        },
        [&] {
          return hotsound.pre_trigger_count() <= audio_sorvane::HotsoundDecoder::kPreTriggerCapacity &&
                 hotsound.dsss_decoder().baseband_buffer_size() <=
                     hotsound.dsss_decoder().max_buffer_size() / 3 + 2 * 635;
        }));
  }
  if (wanted("dtmf")) {
    audio_sorvane::DtmfDecoder dtmf{audio_sorvane::DtmfDecoderParams()};
    dtmf.Init(1, 44100.0f);
    DecodeResults results;
    report("dtmf", Soak(
        "dtmf", true, o, [&](const std::vector<float>& b) { dtmf.ProcessSamples(b); },
        [&] { return dtmf.GetToken(&results) ? results.tokens[0].bytes : std::vector<uint8_t>(); },
        [&] { return dtmf.tone_strength_buffer_size() <= 3 * 44100 / 16 + 138; }));
  }
  std::printf("%s\n", ok ? "soak passed" : "soak FAILED");
  return ok ? 0 : 1;
}
