#include "sim/room_model.h"

#include <algorithm>
#include <cmath>
#include <complex>
#include <cstdio>
#include <numbers>
#include <random>

#include "audio/dsp/kiss_fft.h"
#include "audio/dsp/resampler.h"

namespace sorvel_sim {
namespace {

constexpr double kPi = std::numbers::pi;
constexpr double kDecay60 = 6.907755 * 2;  // ln(1e6): energy falls 60 dB
constexpr double kImageSeconds = 0.08;     // image sources up to this time
constexpr double kMaxImages = 100000;      // caps the early part in tiny rooms
constexpr double kBinSeconds = 0.001;      // images sharing one air filter
constexpr int kTapRadius = 32;             // fractional-delay taps each way
constexpr double kTapBeta = 8.0;           // Kaiser window of those taps

// Allowed interval of one coordinate: `margin` from both walls (a quarter
// of the size in narrow rooms); heights 0.7 to 1.5 m where they fit.
struct Interval {
  double lo, hi;
};

std::array<Interval, 3> PlacementBox(const RoomConfig& room, double margin) {
  const double sizes[3] = {room.width, room.depth, room.height};
  std::array<Interval, 3> box;
  for (int a = 0; a < 3; ++a) {
    const double m = std::min(margin, sizes[a] / 4);
    box[a] = {m, sizes[a] - m};
  }
  const Interval heights = {std::max(box[2].lo, 0.7), std::min(box[2].hi, 1.5)};
  if (heights.lo <= heights.hi) box[2] = heights;
  return box;
}

double BoxDiagonal(const std::array<Interval, 3>& box) {
  double sum = 0.0;
  for (const Interval& i : box) sum += (i.hi - i.lo) * (i.hi - i.lo);
  return std::sqrt(sum);
}

constexpr double kWallMargin = 0.5, kLeastWallMargin = 0.02;  // m

// The box for `distance`: the full wall margin, or the largest smaller one
// (down to 2 cm) with a diagonal long enough.
std::array<Interval, 3> BoxFor(const RoomConfig& room, double distance) {
  if (BoxDiagonal(PlacementBox(room, kWallMargin)) >= distance) {
    return PlacementBox(room, kWallMargin);
  }
  double fits = kLeastWallMargin, fails = kWallMargin;
  for (int i = 0; i < 40; ++i) {
    const double mid = (fits + fails) / 2;
    (BoxDiagonal(PlacementBox(room, mid)) >= distance ? fits : fails) = mid;
  }
  return PlacementBox(room, fits);
}

bool Inside(const std::array<Interval, 3>& box, const Point& p) {
  for (int a = 0; a < 3; ++a) {
    if (p[a] < box[a].lo || p[a] > box[a].hi) return false;
  }
  return true;
}

// Gain of the source towards a direction at `cosine` to its axis.
double DirectivityGain(Directivity kind, double cosine) {
  return kind == Directivity::kPhone ? 0.658 + 0.342 * cosine : 1.0;
}

// Mean of the squared gain over the sphere.
double MeanSquareGain(Directivity kind) {
  return kind == Directivity::kPhone ? 0.658 * 0.658 + 0.342 * 0.342 / 3 : 1.0;
}

int FastFftSize(int n) {
  int size = std::max(n, 2);
  while (size % 2 != 0 || !audio_dsp::IsFastFFTSize(size)) ++size;
  return size;
}

double Distance(const Point& a, const Point& b) {
  return std::hypot(a[0] - b[0], a[1] - b[1], a[2] - b[2]);
}

}  // namespace

double AirAbsorptionDbPerMeter(double frequency_hz, double temperature_c,
                               double relative_humidity) {
  // ISO 9613-1 with the ambient pressure at the reference 101.325 kPa.
  const double t = temperature_c + 273.15;
  const double t_ref = 293.15, t_triple = 273.16;
  const double c = -6.8346 * std::pow(t_triple / t, 1.261) + 4.6151;
  const double h = relative_humidity * std::pow(10.0, c);  // molar water vapour, %
  const double fr_o = 24.0 + 4.04e4 * h * (0.02 + h) / (0.391 + h);
  const double fr_n = std::pow(t / t_ref, -0.5) *
                      (9.0 + 280.0 * h * std::exp(-4.170 * (std::pow(t / t_ref, -1.0 / 3) - 1)));
  const double f2 = frequency_hz * frequency_hz;
  return 8.686 * f2 *
         (1.84e-11 * std::sqrt(t / t_ref) +
          std::pow(t / t_ref, -2.5) *
              (0.01275 * std::exp(-2239.1 / t) / (fr_o + f2 / fr_o) +
               0.1068 * std::exp(-3352.0 / t) / (fr_n + f2 / fr_n)));
}

double EyringAbsorption(const RoomConfig& room) {
  return 1.0 - std::exp(-0.161 * room.Volume() / (room.Surface() * room.rt60));
}

double Rt60WithAir(const RoomConfig& room, double frequency_hz) {
  // m: the air's energy attenuation per metre (dB/m over 10 log10 e).
  const double m =
      AirAbsorptionDbPerMeter(frequency_hz, room.temperature_c, room.relative_humidity) / 4.3429;
  const double walls = 0.161 * room.Volume() / room.rt60;  // -S ln(1 - alpha)
  return 0.161 * room.Volume() / (walls + 4 * m * room.Volume());
}

double PhoneSpeakerGain(double f) {
  if (f <= 0) return 0.0;
  return 1.0 / std::sqrt((1.0 + std::pow(400.0 / f, 4.0)) * (1.0 + std::pow(f / 17000.0, 12.0)));
}

double PhoneMicrophoneGain(double f) { return 1.0 / std::sqrt(1.0 + std::pow(f / 20000.0, 4.0)); }

std::string CheckRoom(const RoomConfig& room) {
  for (double size : {room.width, room.depth, room.height}) {
    if (!(size > 0 && size <= 200)) return "room sizes must be between 0 and 200 m";
  }
  if (!(room.rt60 > 0 && room.rt60 <= 20)) return "the room's RT60 must be between 0 and 20 s";
  if (!(room.temperature_c >= -20 && room.temperature_c <= 50) ||
      !(room.relative_humidity >= 0 && room.relative_humidity <= 100)) {
    return "temperature must be -20 to 50 C, humidity 0 to 100 %";
  }
  const double longest = BoxDiagonal(PlacementBox(room, kLeastWallMargin));
  if (!(room.distance > 0)) return "the distance must be positive";
  if (room.distance > longest) {
    char text[160];
    std::snprintf(text, sizeof(text),
                  "a distance of %g m does not fit in a %gx%gx%g m room (at most %.2f m "
                  "between heights of 0.7 and 1.5 m)",
                  room.distance, room.width, room.depth, room.height, longest);
    return text;
  }
  return "";
}

bool PlaceInRoom(const RoomConfig& room, uint64_t seed, Placement* out, std::string* error) {
  if (std::string e = CheckRoom(room); !e.empty()) {
    if (error) *error = e;
    return false;
  }
  const std::array<Interval, 3> box = BoxFor(room, room.distance);
  std::mt19937_64 rng(seed ^ 0x91ace0ffULL);
  std::uniform_real_distribution<double> unit(0.0, 1.0);
  const double d = room.distance;
  bool placed = false;
  for (int attempt = 0; attempt < 5000 && !placed; ++attempt) {
    for (int a = 0; a < 3; ++a) {
      out->source[a] = box[a].lo + (box[a].hi - box[a].lo) * unit(rng);
    }
    const double z = 2 * unit(rng) - 1, phi = 2 * kPi * unit(rng);
    const double ring = std::sqrt(1 - z * z);
    out->microphone = {out->source[0] + d * ring * std::cos(phi),
                       out->source[1] + d * ring * std::sin(phi), out->source[2] + d * z};
    placed = Inside(box, out->microphone);
  }
  if (!placed) {
    // Distances close to the longest that fits: along one of the box's
    // diagonals.
    const double longest = BoxDiagonal(box);
    for (int a = 0; a < 3; ++a) {
      const double mid = (box[a].lo + box[a].hi) / 2;
      const double half =
          (unit(rng) < 0.5 ? -0.5 : 0.5) * (box[a].hi - box[a].lo) * d / longest;
      out->source[a] = mid - half;
      out->microphone[a] = mid + half;
    }
  }
  const double dx = out->microphone[0] - out->source[0], dy = out->microphone[1] - out->source[1],
               dz = out->microphone[2] - out->source[2];
  const double azimuth = std::atan2(dy, dx) + (unit(rng) - 0.5) * 2 * kPi / 3;
  const double elevation = std::clamp(std::asin(std::clamp(dz / d, -1.0, 1.0)) +
                                          (unit(rng) - 0.5) * 2 * kPi / 9,
                                      -kPi / 2, kPi / 2);
  out->facing = {std::cos(elevation) * std::cos(azimuth), std::cos(elevation) * std::sin(azimuth),
                 std::sin(elevation)};
  return true;
}

double DirectPathSeconds(const Placement& p) {
  return Distance(p.source, p.microphone) / kRoomSpeedOfSound;
}

std::vector<float> RoomImpulseResponse(const RoomConfig& room, const Placement& placement,
                                       double rate, uint64_t seed) {
  const double c = kRoomSpeedOfSound;
  const double volume = room.Volume();
  const double beta = std::sqrt(1.0 - EyringAbsorption(room));
  const double decay = kDecay60 / room.rt60;  // energy, 1/s, walls only
  // Images within the crossover time, fewer in tiny rooms, and always past
  // the direct path.
  const double direct = DirectPathSeconds(placement);
  const double capped = std::cbrt(3 * volume * kMaxImages / (4 * kPi)) / c;
  const double crossover = std::max(std::min(kImageSeconds, capped), direct + 0.01);
  const double radius = crossover * c;
  const size_t crossover_sample = static_cast<size_t>(std::ceil(crossover * rate));
  const size_t length = static_cast<size_t>(std::ceil((crossover + room.rt60) * rate));
  std::vector<float> h(length, 0.0f);

  // The images of one axis: coordinate offset from the microphone, bounces,
  // and whether the ray's component along the axis is mirrored.
  struct AxisImage {
    double offset;
    int bounces;
    double sign;
  };
  const double sizes[3] = {room.width, room.depth, room.height};
  std::vector<AxisImage> axes[3];
  for (int a = 0; a < 3; ++a) {
    const int n_max = static_cast<int>(std::ceil(radius / (2 * sizes[a]))) + 1;
    for (int n = -n_max; n <= n_max; ++n) {
      const double plain = 2 * n * sizes[a] + placement.source[a] - placement.microphone[a];
      const double mirrored = 2 * n * sizes[a] - placement.source[a] - placement.microphone[a];
      if (std::fabs(plain) <= radius) axes[a].push_back({plain, std::abs(2 * n), 1.0});
      if (std::fabs(mirrored) <= radius) axes[a].push_back({mirrored, std::abs(2 * n - 1), -1.0});
    }
  }

  // Each 1 ms bin of arrival times gathers its images' fractional-delay
  // taps in a buffer of its own, later filtered by the air over the bin's
  // mean path.
  const int bin_samples = static_cast<int>(std::ceil(kBinSeconds * rate));
  const int fft_size = FastFftSize(bin_samples + 2 * kTapRadius + 256);
  const int pad = (fft_size - bin_samples) / 2;
  const int num_bins = static_cast<int>(std::ceil(crossover / kBinSeconds)) + 1;
  // Buffer index 0 of bin b is this sample of the response.
  const auto bin_start = [&](int b) {
    return static_cast<long>(std::floor(b * kBinSeconds * rate)) - pad;
  };
  std::vector<std::vector<float>> bins(num_bins);
  const double tap_norm = audio_dsp::BesselI0(kTapBeta);
  const double radius2 = radius * radius;
  double fit_energy = 0.0;  // image energy in the second half, undone decay
  for (const AxisImage& x : axes[0]) {
    for (const AxisImage& y : axes[1]) {
      const double xy2 = x.offset * x.offset + y.offset * y.offset;
      if (xy2 > radius2) continue;
      for (const AxisImage& z : axes[2]) {
        const double r2 = xy2 + z.offset * z.offset;
        if (r2 > radius2) continue;
        const double r = std::max(std::sqrt(r2), 0.01);
        // The ray leaves the real source along the image-to-microphone
        // direction, mirrored on the axes the image was mirrored on.
        const double cosine = -(x.sign * x.offset * placement.facing[0] +
                                y.sign * y.offset * placement.facing[1] +
                                z.sign * z.offset * placement.facing[2]) / r;
        const int bounces = x.bounces + y.bounces + z.bounces;
        const double amplitude =
            std::pow(beta, bounces) * DirectivityGain(room.source, cosine) / r;
        const double t = r / c;
        if (bounces > 0 && t >= crossover / 2) {
          fit_energy += amplitude * amplitude * std::exp(decay * t);
        }
        const int bin = static_cast<int>(t / kBinSeconds);
        std::vector<float>& buffer = bins[bin];
        if (buffer.empty()) buffer.assign(fft_size, 0.0f);
        const double position = t * rate - static_cast<double>(bin_start(bin));
        const int first = static_cast<int>(std::floor(position)) - kTapRadius + 1;
        for (int i = first; i < first + 2 * kTapRadius; ++i) {
          const double u = i - position;
          const double w = u / (kTapRadius + 1);
          const double sinc = std::fabs(u) < 1e-9 ? 1.0 : std::sin(kPi * u) / (kPi * u);
          buffer[i] += static_cast<float>(
              amplitude * sinc * audio_dsp::BesselI0(kTapBeta * std::sqrt(1 - w * w)) / tap_norm);
        }
      }
    }
  }

  audio_dsp::RealFFTTransformer bin_fft(fft_size, /*normalize_inverse=*/true);
  std::vector<double> air_db(fft_size / 2 + 1);  // dB/m at each FFT bin
  for (size_t k = 0; k < air_db.size(); ++k) {
    air_db[k] = AirAbsorptionDbPerMeter(k * rate / fft_size, room.temperature_c,
                                        room.relative_humidity);
  }
  std::vector<std::complex<float>> spectrum;
  for (int b = 0; b < num_bins; ++b) {
    if (bins[b].empty()) continue;
    const double path = (b + 0.5) * kBinSeconds * c;
    bin_fft.Forward(bins[b], &spectrum);
    for (size_t k = 0; k < spectrum.size(); ++k) {
      spectrum[k] *= static_cast<float>(std::pow(10.0, -air_db[k] * path / 20));
    }
    bin_fft.Inverse(spectrum, &bins[b]);
    const long start = bin_start(b);
    for (int i = 0; i < fft_size; ++i) {
      const long at = start + i;
      if (at >= 0 && at < static_cast<long>(length)) h[at] += bins[b][i];
    }
  }

  // The tail: the images' energy density per sample extrapolated to t = 0,
  // or the statistical room's if too few images fell in the fit window.
  const double fit_seconds = crossover - crossover / 2;
  double density = fit_energy / (fit_seconds * rate);
  if (!(density > 0)) density = 4 * kPi * c / (volume * rate) * MeanSquareGain(room.source);
  // Sine-windowed noise blocks at half overlap (the squared windows sum to
  // one), each shaped by the decay of every frequency at its centre.
  const int hop = std::max(16, static_cast<int>(std::lround(rate / 375)));
  const int window = 2 * hop;
  const int tail_fft = FastFftSize(window);
  std::vector<double> tail_decay(tail_fft / 2 + 1);  // energy, 1/s, walls and air
  for (size_t k = 0; k < tail_decay.size(); ++k) {
    tail_decay[k] = kDecay60 / Rt60WithAir(room, k * rate / tail_fft);
  }
  audio_dsp::RealFFTTransformer noise_fft(tail_fft, /*normalize_inverse=*/true);
  std::mt19937_64 rng(seed ^ 0x7a11ULL);
  std::normal_distribution<double> normal;
  std::vector<float> block(tail_fft);
  for (long start = static_cast<long>(crossover_sample) - hop; start < static_cast<long>(length);
       start += hop) {
    for (float& v : block) v = static_cast<float>(normal(rng));
    noise_fft.Forward(block, &spectrum);
    const double centre = (start + hop) / rate;
    for (size_t k = 0; k < spectrum.size(); ++k) {
      spectrum[k] *=
          static_cast<float>(std::sqrt(density) * std::exp(-0.5 * tail_decay[k] * centre));
    }
    noise_fft.Inverse(spectrum, &block);
    for (int i = 0; i < window; ++i) {
      const long at = start + i;
      if (at < static_cast<long>(crossover_sample) || at >= static_cast<long>(length)) continue;
      h[at] += static_cast<float>(block[i] * std::sin(kPi * (i + 0.5) / window));
    }
  }
  // All image sources arrive with the same sign, so their sum carries a
  // large offset at the lowest frequencies that no room has: a causal
  // second-order Butterworth high-pass at 80 Hz removes it.
  const double w0 = 2 * kPi * 80.0 / rate, alpha = std::sin(w0) / std::sqrt(2.0);
  const double a0 = 1 + alpha, a1 = -2 * std::cos(w0) / a0, a2 = (1 - alpha) / a0;
  const double b0 = (1 + std::cos(w0)) / 2 / a0, b1 = -2 * b0, b2 = b0;
  double x1 = 0, x2 = 0, y1 = 0, y2 = 0;
  for (float& v : h) {
    const double y = b0 * v + b1 * x1 + b2 * x2 - a1 * y1 - a2 * y2;
    x2 = x1, x1 = v, y2 = y1, y1 = y;
    v = static_cast<float>(y);
  }
  return h;
}

void ApplyAgc(std::vector<float>* signal, double rate) {
  const double target = 32767.0 * 0.1;  // -20 dBFS RMS
  const double detect = 1 - std::exp(-1 / (0.05 * rate));
  const double attack = 1 - std::exp(-1 / (0.2 * rate));
  const double release = 1 - std::exp(-1 / (0.5 * rate));
  double power = target * target, gain_db = 0.0;
  for (float& v : *signal) {
    power += detect * (static_cast<double>(v) * v - power);
    const double wanted =
        std::clamp(10 * std::log10(target * target / std::max(power, 1e-9)), -30.0, 40.0);
    gain_db += (wanted < gain_db ? attack : release) * (wanted - gain_db);
    v = static_cast<float>(v * std::pow(10.0, gain_db / 20));
  }
}

}  // namespace sorvel_sim
