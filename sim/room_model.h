// A physically modelled room between a phone's loudspeaker and another
// phone's microphone: a shoebox with one absorption coefficient on every
// wall, air absorption, a source directivity and the phones' own responses.
//
// The impulse response has two parts. Up to a crossover time (80 ms after
// emission; sooner in rooms so small that more than 100 000 images would
// arrive by then, later for long direct paths) image sources give the early
// reflections: amplitude 1 at 1 m with 1/r spreading, sqrt(1 - alpha) per
// bounce, the source's gain towards the direction the ray leaves in, a
// windowed-sinc fractional delay, and the air's attenuation over the path.
// After the crossover a diffuse tail of Gaussian noise takes over, at the
// energy density the image sources reached, decaying at each frequency with
// the Eyring RT60 of the walls plus the air (the 4mV term).
#ifndef SIM_ROOM_MODEL_H_
#define SIM_ROOM_MODEL_H_

#include <array>
#include <cstdint>
#include <string>
#include <vector>

namespace sorvel_sim {

inline constexpr double kRoomSpeedOfSound = 343.0;  // m/s, air at 20 C

enum class Directivity {
  kOmni,   // the same gain in every direction
  kPhone,  // 0 dB on axis falling to -10 dB behind: 0.658 + 0.342 cos(angle)
};

struct RoomConfig {
  double width = 0.0, depth = 0.0, height = 0.0;  // m; all 0: no physical room
  double rt60 = 0.5;      // s, the walls alone (the air's absorption comes on top)
  double distance = 1.0;  // m, loudspeaker to microphone
  Directivity source = Directivity::kOmni;
  bool phone_speaker = true;     // small loudspeaker response before the room
  bool phone_microphone = true;  // microphone response and AGC after the noise
  double temperature_c = 20.0;
  double relative_humidity = 50.0;  // %

  bool HasSize() const { return width > 0 || depth > 0 || height > 0; }
  double Volume() const { return width * depth * height; }       // m^3
  double Surface() const { return 2 * (width * depth + width * height + depth * height); }  // m^2
};

using Point = std::array<double, 3>;  // m, x along the width, z up

struct Placement {
  Point source = {};
  Point microphone = {};
  Point facing = {1, 0, 0};  // unit vector, the loudspeaker's axis
};

// Why the room cannot be simulated (a size or RT60 that is not a positive
// number, a distance that does not fit with the wall margins), or "".
std::string CheckRoom(const RoomConfig& room);

// Draws positions `room.distance` apart from the seed: both at least 0.5 m
// from every wall (a quarter of the size in rooms narrower than 2 m; less,
// down to 2 cm, when the distance needs it), heights 0.7 to 1.5 m where
// the room allows. The loudspeaker faces the
// microphone within +-60 degrees in azimuth and +-20 degrees in elevation,
// uniformly drawn. Returns false with `error` set when CheckRoom fails.
bool PlaceInRoom(const RoomConfig& room, uint64_t seed, Placement* out, std::string* error);

// The room's impulse response at `rate`, starting at emission: the direct
// path arrives after distance / 343 m/s. Energy beyond the crossover decays
// until the walls-only RT60 has passed. High-passed at 80 Hz (the image
// sources' common sign would leave an offset). `seed` draws the diffuse
// tail.
std::vector<float> RoomImpulseResponse(const RoomConfig& room, const Placement& placement,
                                       double rate, uint64_t seed);

// The time of the direct path, s.
double DirectPathSeconds(const Placement& placement);

// Atmospheric absorption after ISO 9613-1 at sea-level pressure, dB/m.
double AirAbsorptionDbPerMeter(double frequency_hz, double temperature_c,
                               double relative_humidity);

// Wall absorption coefficient that gives `rt60` by Eyring's formula.
double EyringAbsorption(const RoomConfig& room);

// The room's RT60 at a frequency, s: Eyring for the walls plus the air's
// absorption over the volume (0.161 V / (-S ln(1 - alpha) + 4 m V)).
double Rt60WithAir(const RoomConfig& room, double frequency_hz);

// Magnitude responses of a phone's loudspeaker (second-order high-pass at
// 400 Hz, sixth-order low-pass -3 dB at 17 kHz, -5.8 dB at 18.5 kHz) and
// microphone (second-order low-pass, -3 dB at 20 kHz).
double PhoneSpeakerGain(double frequency_hz);
double PhoneMicrophoneGain(double frequency_hz);

// A microphone's automatic gain control on the 16-bit scale: the gain
// aims the RMS (over 50 ms) at -20 dBFS, falling with a 0.2 s time
// constant and rising with 0.5 s, between -30 and +40 dB. Starts at 0 dB.
void ApplyAgc(std::vector<float>* signal, double rate);

}  // namespace sorvel_sim

#endif  // SIM_ROOM_MODEL_H_
