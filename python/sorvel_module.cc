// The `sorvel` Python module: the encoder and decoder facades and the
// channel simulator, configured with the command-line tool's settings
// (keyword names are its flags in snake_case, with its defaults).
//
// Every setting goes through the library's validators before anything is
// built: building from refused settings ends the process through CHECK,
// which would take the interpreter with it. Refused values raise
// ValueError, values of the wrong type TypeError.
//
// Audio crosses as numpy arrays: encoder output and simulator output are
// int16; decoder input is int16, or float on the 16-bit scale.
#include <algorithm>
#include <cmath>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <span>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

#include "audio/audio_modem_decoder.h"
#include "audio/audio_modem_encoder.h"
#include "audio/modem_config.h"
#include "audio/pcm16.h"
#include "pybind11/numpy.h"
#include "pybind11/pybind11.h"
#include "pybind11/stl.h"
#include "sim/channel_simulator.h"

namespace py = pybind11;

namespace {

using audio_sorvane::AudioModemDecoder;
using audio_sorvane::AudioModemEncoder;
using audio_sorvane::ModemSettings;
using audio_sorvane::ReceiverSettings;

// Everything a keyword can set; the decoder's input is described here too.
struct Settings {
  ModemSettings modem;
  ReceiverSettings receiver;
  float input_rate_hz = 44100.0f;
  int channels = 1;
  int interval_ms = 250;
};

enum Side { kEncoder = 1, kDecoder = 2, kBoth = 3 };

// Keyword values, checked for type. Python's bool is an int, so ints and
// floats refuse it explicitly.
bool IsBool(py::handle h) { return PyBool_Check(h.ptr()); }
bool IsInt(py::handle h) { return !IsBool(h) && PyIndex_Check(h.ptr()); }
bool IsNumber(py::handle h) { return IsInt(h) || PyFloat_Check(h.ptr()); }

bool AsBool(py::handle h, const std::string& name) {
  if (!IsBool(h)) throw py::type_error(name + " must be True or False");
  return h.cast<bool>();
}

int AsInt(py::handle h, const std::string& name) {
  if (!IsInt(h)) throw py::type_error(name + " must be an int");
  const long long v = py::int_(py::reinterpret_borrow<py::object>(h)).cast<long long>();
  if (v < -(1LL << 30) || v > (1LL << 30)) throw py::value_error(name + " is out of range");
  return static_cast<int>(v);
}

float AsFloat(py::handle h, const std::string& name) {
  if (!IsNumber(h)) throw py::type_error(name + " must be a number");
  return static_cast<float>(py::float_(py::reinterpret_borrow<py::object>(h)).cast<double>());
}

std::vector<float> AsFloats(py::handle h, const std::string& name) {
  if (!py::isinstance<py::sequence>(h) || py::isinstance<py::str>(h)) {
    throw py::type_error(name + " must be a sequence of numbers");
  }
  std::vector<float> values;
  for (py::handle item : py::reinterpret_borrow<py::sequence>(h)) {
    values.push_back(AsFloat(item, name + " values"));
  }
  return values;
}

struct Keyword {
  const char* name;
  int sides;
  const char* help;  // with the default
  std::function<void(py::handle, const std::string&, Settings&)> set;
};

// One table for both classes, so that they take the same names; the
// docstrings list it.
const std::vector<Keyword>& Keywords() {
  using S = Settings;
  using H = py::handle;
  using N = const std::string&;
  static const std::vector<Keyword> table = {
      {"crc", kBoth, "tokens end in two CRC-16 check bytes [False]",
       [](H h, N n, S& s) { s.modem.crc = AsBool(h, n); }},
      {"token_bytes", kBoth, "bytes per transmitted token, CRC included [dsss 8, dtmf 5]",
       [](H h, N n, S& s) {
         if (!h.is_none()) s.modem.token_bytes = AsInt(h, n);
       }},
      {"baseband_decimation_factor", kBoth,
       "decimation of the receiver's baseband [dsss 3, dtmf 16]",
       [](H h, N n, S& s) {
         if (!h.is_none()) s.modem.decimation_factor = AsInt(h, n);
       }},
      {"sample_rate", kEncoder,
       "rate the frames are built at, Hz (dtmf: the output rate) [44100]",
       [](H h, N n, S& s) { s.modem.dsss.coder.sample_rate = AsFloat(h, n); }},
      {"coder_sample_rate", kDecoder,
       "rate the sender built its frames at, Hz (the encoder's sample_rate keyword) [44100]",
       [](H h, N n, S& s) { s.modem.dsss.coder.sample_rate = AsFloat(h, n); }},
      {"append_check_symbol", kBoth, "dsss: tokens carry a check symbol [False]",
       [](H h, N n, S& s) { s.modem.dsss.append_check_symbol = AsBool(h, n); }},
      {"number_of_taps", kBoth, "dsss: spreading code register length, 5..11 [7]",
       [](H h, N n, S& s) { s.modem.dsss.coder.number_of_taps = AsInt(h, n); }},
      {"code_number", kBoth, "dsss: spreading code of that length, 0..2 (5, 6 taps) or 0..3 [0]",
       [](H h, N n, S& s) { s.modem.dsss.coder.code_number = AsInt(h, n); }},
      {"upsampling_factor", kBoth, "dsss: samples per chip [15]",
       [](H h, N n, S& s) { s.modem.dsss.coder.upsampling_factor = AsInt(h, n); }},
      {"bits_per_symbol", kBoth, "dsss: 1, 2, 4 or 8 [4]",
       [](H h, N n, S& s) { s.modem.dsss.coder.bits_per_symbol = AsInt(h, n); }},
      {"min_cycles_per_frame", kBoth, "dsss: tone cycles per frame of symbol 0 [4]",
       [](H h, N n, S& s) { s.modem.dsss.coder.min_cycles_per_frame = AsInt(h, n); }},
      {"use_quadrature", kBoth, "dsss: the symbol tone rides on the cosine carrier [False]",
       [](H h, N n, S& s) { s.modem.dsss.coder.use_quadrature = AsBool(h, n); }},
      {"carrier_frequency", kBoth, "dsss: carrier asked for, Hz [18500]",
       [](H h, N n, S& s) { s.modem.dsss.coder.desired_carrier_frequency = AsFloat(h, n); }},
      {"high_pass_at_carrier", kEncoder, "dsss: remove everything below the carrier [False]",
       [](H h, N n, S& s) { s.modem.dsss.high_pass_at_carrier = AsBool(h, n); }},
      {"broadcast_sample_rate", kEncoder, "dsss: output rate, Hz [44100]",
       [](H h, N n, S& s) { s.modem.dsss.broadcast_sample_rate = AsInt(h, n); }},
      {"start_transition_duration", kEncoder, "dsss: fade-in before a loop, s [0.005]",
       [](H h, N n, S& s) { s.modem.dsss.start_transition_duration = AsFloat(h, n); }},
      {"use_checksum_symbol", kBoth, "dtmf: tokens carry a checksum symbol [False]",
       [](H h, N n, S& s) { s.modem.dtmf.use_checksum_symbol = AsBool(h, n); }},
      {"tones_per_symbol", kBoth, "dtmf: tones sounding together [2]",
       [](H h, N n, S& s) { s.modem.dtmf.tones_per_symbol = AsInt(h, n); }},
      {"tone_frequencies", kBoth, "dtmf: tones, Hz [ten pentatonic tones from 740 Hz]",
       [](H h, N n, S& s) {
         if (!h.is_none()) s.modem.dtmf.tone_frequencies = AsFloats(h, n);
       }},
      {"window_duration", kBoth, "dtmf: symbol frame, s [0.05]",
       [](H h, N n, S& s) { s.modem.dtmf.window_duration = AsFloat(h, n); }},
      {"adsr", kBoth,
       "dtmf: frame window (attack, decay, sustain, release in s, sustain amplitude) "
       "[half sine]",
       [](H h, N n, S& s) {
         if (!h.is_none()) s.modem.adsr = AsFloats(h, n);
       }},
      {"sample_rate", kDecoder, "rate of the audio given to process(), Hz [44100]",
       [](H h, N n, S& s) { s.input_rate_hz = AsFloat(h, n); }},
      {"channels", kDecoder, "interleaved channels of that audio [1]",
       [](H h, N n, S& s) { s.channels = AsInt(h, n); }},
      {"hotsound", kDecoder, "dsss: wait for the wake-up detector before decoding [False]",
       [](H h, N n, S& s) { s.receiver.hotsound = AsBool(h, n); }},
      {"interval_ms", kDecoder, "ask for tokens every this many ms of audio [250]",
       [](H h, N n, S& s) { s.interval_ms = AsInt(h, n); }},
      {"max_candidates", kDecoder, "candidates per request, best first, 1..6 [2]",
       [](H h, N n, S& s) { s.receiver.max_candidates = AsInt(h, n); }},
      {"detection_duration", kDecoder, "dsss: broadcaster detection window, s [0.175]",
       [](H h, N n, S& s) { s.receiver.detection_duration = AsFloat(h, n); }},
      {"detection_threshold", kDecoder, "dsss: broadcaster detection threshold [4.0]",
       [](H h, N n, S& s) { s.receiver.detection_threshold = AsFloat(h, n); }},
      {"buffer_duration_factor", kDecoder, "audio held, in token durations [dsss 4, dtmf 6]",
       [](H h, N n, S& s) {
         if (!h.is_none()) s.receiver.buffer_duration_factor = AsFloat(h, n);
       }},
  };
  return table;
}

std::string KeywordDoc(Side side) {
  std::string doc;
  for (const Keyword& k : Keywords()) {
    if (k.sides & side) doc += std::string("  ") + k.name + ": " + k.help + "\n";
  }
  return doc;
}

// Settings from the scheme and keywords, resolved and checked.
Settings ReadSettings(const std::string& scheme, const py::kwargs& kwargs, Side side) {
  Settings s;
  s.modem.scheme = scheme;
  for (const auto& [key, value] : kwargs) {
    const std::string name = py::str(key);
    const auto it = std::find_if(Keywords().begin(), Keywords().end(), [&](const Keyword& k) {
      return name == k.name && (k.sides & side);
    });
    if (it == Keywords().end()) {
      throw py::type_error("unexpected keyword argument '" + name + "'");
    }
    it->set(value, name, s);
  }
  if (std::string e = audio_sorvane::ResolveModemSettings(s.modem); !e.empty()) {
    throw py::value_error(e);
  }
  return s;
}

std::vector<uint8_t> AsMessage(const py::object& message) {
  if (!py::isinstance<py::bytes>(message) && !PyByteArray_Check(message.ptr())) {
    throw py::type_error("message must be bytes or bytearray");
  }
  if (py::isinstance<py::bytes>(message)) {
    const std::string text = message.cast<std::string>();
    return {text.begin(), text.end()};
  }
  const auto* data = reinterpret_cast<const uint8_t*>(PyByteArray_AsString(message.ptr()));
  return {data, data + PyByteArray_Size(message.ptr())};
}

// Encodes tokens to int16 audio. Not thread safe: one thread at a time per
// object (the module takes no locks).
class Encoder {
 public:
  Encoder(const std::string& scheme, const py::kwargs& kwargs)
      : settings_(ReadSettings(scheme, kwargs, kEncoder).modem),
        encoder_(audio_sorvane::MakeEncoder(settings_)) {
    if (!encoder_) throw py::value_error("the adsr window does not fit the frame");
  }

  py::array_t<int16_t> Encode(const py::object& message, double loop_seconds) const {
    const std::vector<uint8_t> bytes = AsMessage(message);
    if (std::string e = audio_sorvane::CheckMessageBytes(settings_, bytes.size()); !e.empty()) {
      throw py::value_error(e);
    }
    // An hour of broadcast is already more than a test or an app plays.
    if (!(loop_seconds >= 0.0 && loop_seconds <= 3600.0)) {
      throw py::value_error("loop_seconds must be in [0, 3600]");
    }
    std::vector<float> audio;
    encoder_->Encode(bytes, &audio, settings_.crc ? 2 : 0);
    if (audio.empty()) throw py::value_error("the encoder refused the message");
    if (loop_seconds > 0) audio = sorvel_sim::RenderLoopedBroadcast(*encoder_, audio, loop_seconds);
    py::array_t<int16_t> pcm(static_cast<py::ssize_t>(audio.size()));
    std::transform(audio.begin(), audio.end(), pcm.mutable_data(), audio_sorvane::FloatToPcm16);
    return pcm;
  }

  int sample_rate() const { return static_cast<int>(encoder_->OutputSampleRate()); }
  const ModemSettings& settings() const { return settings_; }

 private:
  ModemSettings settings_;
  std::unique_ptr<AudioModemEncoder> encoder_;
};

// Interleaved samples on the 16-bit scale from an int16 or float array, 1-D
// (interleaved) or 2-D (frames, channels). Floats are clamped to the
// 16-bit range, as a microphone clips; NaN and infinity are refused.
std::vector<float> ReadSamples(const py::handle& input, int channels) {
  if (!py::isinstance<py::array>(input)) {
    throw py::type_error("samples must be a numpy array (int16, or float on the 16-bit scale)");
  }
  const auto array = py::reinterpret_borrow<py::array>(input);
  const py::dtype dtype = array.dtype();
  const bool is_int16 = dtype.is(py::dtype::of<int16_t>());
  if (!is_int16 && dtype.kind() != 'f') {
    throw py::type_error("samples must be int16, or float on the 16-bit scale; got " +
                         py::str(static_cast<py::handle>(dtype)).cast<std::string>());
  }
  if (array.ndim() == 2 && array.shape(1) != channels) {
    throw py::value_error("samples have " + std::to_string(array.shape(1)) +
                          " channels (columns); the decoder takes " + std::to_string(channels));
  }
  if (array.ndim() == 1 && array.shape(0) % channels != 0) {
    throw py::value_error(std::to_string(array.shape(0)) +
                          " interleaved samples are not a whole number of " +
                          std::to_string(channels) + "-channel frames");
  }
  if (array.ndim() != 1 && array.ndim() != 2) {
    throw py::value_error("samples must be 1-D (interleaved) or 2-D (frames, channels)");
  }
  std::vector<float> samples(static_cast<size_t>(array.size()));
  if (is_int16) {
    const auto c = py::array_t<int16_t, py::array::c_style | py::array::forcecast>::ensure(array);
    std::copy_n(c.data(), samples.size(), samples.begin());
    return samples;
  }
  const auto c = py::array_t<float, py::array::c_style | py::array::forcecast>::ensure(array);
  for (size_t i = 0; i < samples.size(); ++i) {
    const float v = c.data()[i];
    if (!std::isfinite(v)) throw py::value_error("samples must be finite");
    samples[i] = std::clamp(v, -32768.0f, 32767.0f);
  }
  return samples;
}

// Feeds audio to a decoder and collects tokens, asking for them every
// interval of audio as `sorvel decode` does (the decoder holds only a few
// seconds). Not thread safe: one thread at a time per object.
class Decoder {
 public:
  Decoder(const std::string& scheme, const py::kwargs& kwargs)
      : settings_(ReadSettings(scheme, kwargs, kDecoder)) {
    if (settings_.interval_ms <= 0) throw py::value_error("interval_ms must be positive");
    if (std::string e = audio_sorvane::CheckReceiverSettings(
            settings_.modem, settings_.receiver, settings_.input_rate_hz, settings_.channels);
        !e.empty()) {
      throw py::value_error(e);
    }
    interval_frames_ = std::max<int64_t>(
        1, std::llround(settings_.interval_ms / 1000.0 * settings_.input_rate_hz));
    block_frames_ = std::max<int64_t>(1, std::llround(settings_.input_rate_hz / 100));
    Build();
  }
  Decoder(const Decoder&) = delete;  // the hotsound clock points at frames_
  Decoder& operator=(const Decoder&) = delete;

  void Process(const py::handle& input) {
    const std::vector<float> samples = ReadSamples(input, settings_.channels);
    py::gil_scoped_release release;
    Feed(samples);
  }

  py::list Tokens() {
    {
      py::gil_scoped_release release;
      Request();
    }
    py::list tokens;
    for (const auto& t : found_) tokens.append(py::bytes(reinterpret_cast<const char*>(t.data()), t.size()));
    found_.clear();
    return tokens;
  }

  // The tokens of a recording that has ended, including a broadcast it
  // ends with: the decoder hears half a second of silence first.
  py::list Finish() {
    {
      py::gil_scoped_release release;
      decoder_->FinishInput();
    }
    return Tokens();
  }

  bool DetectBroadcaster() { return decoder_->DetectBroadcaster(); }

  void Reset() {
    Build();
    found_.clear();
    seen_.clear();
  }

  const Settings& settings() const { return settings_; }

 private:
  // A new decoder rather than WipeInternalData: the hotsound kind keeps
  // its wake-up state over a wipe.
  void Build() {
    frames_ = 0;
    next_request_ = interval_frames_;
    decoder_ = audio_sorvane::MakeDecoder(
        settings_.modem, settings_.receiver, settings_.input_rate_hz, settings_.channels,
        audio_sorvane::AudioTimeClock(&frames_, settings_.input_rate_hz));
    if (!decoder_) throw py::value_error("the adsr window does not fit the frame");
  }

  // In blocks of 10 ms at most, as the command-line tool feeds, so that
  // requests fall on the same audio whatever blocks the caller passes and
  // the hotsound clock moves with the audio.
  void Feed(std::span<const float> samples) {
    const size_t channels = static_cast<size_t>(settings_.channels);
    while (!samples.empty()) {
      const int64_t safe_frames = std::max(1, decoder_->GetMaxSafeInputSize()) / settings_.channels;
      const int64_t frames = std::min({static_cast<int64_t>(samples.size() / channels),
                                       next_request_ - frames_, block_frames_,
                                       std::max<int64_t>(1, safe_frames)});
      decoder_->ProcessSamples(samples.first(static_cast<size_t>(frames) * channels));
      samples = samples.subspan(static_cast<size_t>(frames) * channels);
      frames_ += frames;
      if (frames_ == next_request_) {
        Request();
        next_request_ += interval_frames_;
      }
    }
  }

  // Each distinct token once, in the order heard (best first per request).
  void Request() {
    AudioModemDecoder::DecodeResults results;
    if (!decoder_->DecodeTokens(&results, settings_.modem.MessageBytes(),
                                settings_.modem.crc ? 2 : 0)) {
      return;
    }
    for (const auto& token : results.tokens) {
      if (seen_.insert(token.bytes).second) found_.push_back(token.bytes);
    }
  }

  Settings settings_;
  std::unique_ptr<AudioModemDecoder> decoder_;
  int64_t frames_ = 0;  // fed since construction or reset()
  int64_t next_request_ = 0;
  int64_t interval_frames_ = 1;
  int64_t block_frames_ = 1;
  std::set<std::vector<uint8_t>> seen_;
  std::vector<std::vector<uint8_t>> found_;  // not yet returned by tokens()
};

// Mono audio, full scale +-1, from int16 or float on the 16-bit scale.
std::vector<float> ReadBroadcast(const py::handle& pcm) {
  if (py::isinstance<py::array>(pcm) && py::reinterpret_borrow<py::array>(pcm).ndim() != 1) {
    throw py::value_error("pcm must be 1-D (mono)");
  }
  std::vector<float> samples = ReadSamples(pcm, 1);
  if (samples.empty()) throw py::value_error("pcm is empty");
  for (float& v : samples) v /= 32768.0f;
  return samples;
}

py::array_t<int16_t> Simulate(const py::handle& pcm, double sample_rate, double output_rate,
                              double snr_db, const std::string& noise, double speed, double rt60,
                              uint64_t seed, double band_limit, double clip, double gain_db,
                              int channels, double leading_silence, double trailing_silence,
                              const py::object& interference,
                              double interference_gain_db,
                              const std::optional<std::tuple<double, double, double>>& room,
                              double distance, const std::string& source, bool phone_speaker,
                              bool phone_microphone) {
  const std::vector<float> broadcast = ReadBroadcast(pcm);
  sorvel_sim::ChannelConfig c;
  c.input_rate = sample_rate;
  c.output_rate = output_rate;
  c.snr_db = snr_db;
  if (noise != "white" && noise != "pink") {
    throw py::value_error("noise must be white or pink, got '" + noise + "'");
  }
  c.noise = noise == "pink" ? sorvel_sim::NoiseKind::kPink : sorvel_sim::NoiseKind::kWhite;
  c.speed = speed;
  c.rt60 = rt60;
  c.seed = seed;
  c.band_limit = band_limit;
  c.clip = clip;
  c.gain_db = gain_db;
  c.channels = channels;
  c.leading_silence = leading_silence;
  c.trailing_silence = trailing_silence;
  if (!interference.is_none()) {
    c.interference = ReadSamples(interference, 1);
    if (c.interference.empty()) throw py::value_error("interference is empty");
  }
  c.interference_gain_db = interference_gain_db;
  if (source != "omni" && source != "phone") {
    throw py::value_error("source must be omni or phone, got '" + source + "'");
  }
  c.room.source =
      source == "phone" ? sorvel_sim::Directivity::kPhone : sorvel_sim::Directivity::kOmni;
  c.room.distance = distance;
  c.room.phone_speaker = phone_speaker;
  c.room.phone_microphone = phone_microphone;
  if (room) {
    std::tie(c.room.width, c.room.depth, c.room.height) = *room;
    if (!(rt60 > 0)) throw py::value_error("a room needs its rt60 (s)");
    c.room.rt60 = rt60;
  }
  if (std::string e = sorvel_sim::CheckChannel(c); !e.empty()) throw py::value_error(e);
  std::vector<float> received;
  {
    py::gil_scoped_release release;
    received = sorvel_sim::ApplyChannel(broadcast, c);
  }
  std::vector<py::ssize_t> shape = {static_cast<py::ssize_t>(received.size() / channels)};
  if (channels > 1) shape.push_back(channels);
  py::array_t<int16_t> out(shape);
  // What a phone delivers: rounded 16-bit integers.
  std::transform(received.begin(), received.end(), out.mutable_data(), [](float v) {
    return static_cast<int16_t>(std::clamp(std::round(v), -32768.0f, 32767.0f));
  });
  return out;
}

const char kEncoderDoc[] = R"(Encoder(scheme="dsss", **settings)

Turns message bytes into the audio a phone plays. scheme is "dsss"
(18.5 kHz spread spectrum) or "dtmf" (multi-tone). Settings, as keywords
(the command-line tool's flags in snake_case, its defaults in brackets):
)";

const char kDecoderDoc[] = R"(Decoder(scheme="dsss", **settings)

Finds tokens in received audio. process() takes the audio in blocks of any
length; it asks the decoder for tokens every interval_ms of audio, as
`sorvel decode` does, since the decoder holds only a few seconds of it.
tokens() asks once more and returns the tokens heard since the last call.
The hotsound decoder's one-second timeout runs on the audio's time, so a
recording may be decoded faster than real time. Settings, as keywords
(defaults in brackets):
)";

const char kThreadDoc[] =
    "\nNot thread safe: an object must not be used from two threads at once\n"
    "(separate objects may). Refused settings raise ValueError, settings of the\n"
    "wrong type TypeError.\n";

}  // namespace

PYBIND11_MODULE(sorvel, m) {
  m.doc() = "Sorvel acoustic data modem: encoder, decoder and channel simulator.";

  py::class_<Encoder>(m, "Encoder", (kEncoderDoc + KeywordDoc(kEncoder) + kThreadDoc).c_str())
      .def(py::init<const std::string&, const py::kwargs&>(), py::arg("scheme") = "dsss")
      .def("encode", &Encoder::Encode, py::arg("message"), py::arg("loop_seconds") = 0.0,
           "Returns a numpy int16 array at sample_rate.\n\n"
           "message: the message bytes (token bytes less the CRC bytes with crc=True).\n"
           "loop_seconds > 0 renders a looped broadcast of at least that long (start\n"
           "transition, repetitions, fade-out), as `sorvel encode --loop`.")
      .def_property_readonly("sample_rate", &Encoder::sample_rate, "output rate, Hz")
      .def_property_readonly("scheme", [](const Encoder& e) { return e.settings().scheme; })
      .def_property_readonly("crc", [](const Encoder& e) { return e.settings().crc; })
      .def_property_readonly("message_bytes",
                             [](const Encoder& e) { return e.settings().MessageBytes(); });

  py::class_<Decoder>(m, "Decoder", (kDecoderDoc + KeywordDoc(kDecoder) + kThreadDoc).c_str())
      .def(py::init<const std::string&, const py::kwargs&>(), py::arg("scheme") = "dsss")
      .def("process", &Decoder::Process, py::arg("samples"),
           "samples: numpy int16, or float on the 16-bit scale (clamped to\n"
           "it); 1-D with channels interleaved or 2-D (frames, channels). The GIL is\n"
           "released while decoding.")
      .def("tokens", &Decoder::Tokens,
           "A list of bytes: the message bytes of each distinct token heard\n"
           "since the last call and not reported before, best first per request.\n"
           "Without crc, lower-ranked candidates are alternatives nothing vouches for.")
      .def("finish", &Decoder::Finish,
           "tokens() at the end of a recording. The decoder scores a frame only\n"
           "once it has heard a little past it, so a broadcast that ends the audio\n"
           "is heard only after this call (which feeds it half a second of silence;\n"
           "later audio follows that silence).")
      .def("detect_broadcaster", &Decoder::DetectBroadcaster,
           "dsss only: whether a broadcast is heard")
      .def("reset", &Decoder::Reset, "Forgets the audio and the tokens heard")
      .def_property_readonly("sample_rate",
                             [](const Decoder& d) { return d.settings().input_rate_hz; })
      .def_property_readonly("channels", [](const Decoder& d) { return d.settings().channels; })
      .def_property_readonly("scheme", [](const Decoder& d) { return d.settings().modem.scheme; })
      .def_property_readonly("crc", [](const Decoder& d) { return d.settings().modem.crc; })
      .def_property_readonly("hotsound",
                             [](const Decoder& d) { return d.settings().receiver.hotsound; })
      .def_property_readonly("message_bytes",
                             [](const Decoder& d) { return d.settings().modem.MessageBytes(); });

  m.def("simulate", &Simulate, py::arg("pcm"), py::kw_only(), py::arg("sample_rate") = 44100.0,
        py::arg("output_rate") = 44100.0, py::arg("snr_db") = INFINITY,
        py::arg("noise") = "white", py::arg("speed") = 0.0, py::arg("rt60") = 0.0,
        py::arg("seed") = 1, py::arg("band_limit") = 0.0, py::arg("clip") = 0.0,
        py::arg("gain_db") = 0.0, py::arg("channels") = 1, py::arg("leading_silence") = 0.0,
        py::arg("trailing_silence") = 0.0, py::arg("interference") = py::none(),
        py::arg("interference_gain_db") = 0.0, py::arg("room") = py::none(),
        py::arg("distance") = 1.0, py::arg("source") = "omni", py::arg("phone_speaker") = true,
        py::arg("phone_microphone") = true,
        R"(What a phone's microphone hears of a broadcast (`sorvel simulate`): pcm is
mono int16 (or float on the 16-bit scale) at sample_rate; the result is at
output_rate, rounded to int16, (frames, channels) when channels > 1.
  snr_db: full-band SNR over the broadcast, dB (inf: no noise)
  noise: "white" or "pink"; seed: noise and room seed
  speed: sender moving towards the receiver, m/s
  rt60: reverberation time, s (0: no room; with room: the walls' RT60)
  band_limit: microphone roll-off above this frequency, Hz (0: none)
  clip: clip at this fraction of full scale (0: none); gain_db: gain before it
  leading_silence, trailing_silence: s around the broadcast
  interference: mono recording at output_rate on the 16-bit scale, looped,
    at interference_gain_db
  room: (width, depth, height) in m for the physical room model, with
    distance (m), source ("omni" or "phone"), phone_speaker, phone_microphone
The GIL is released while simulating.)");
}
