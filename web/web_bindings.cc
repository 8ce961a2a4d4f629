// The JavaScript face of web_modem.h (embind). Settings are a plain object,
// {scheme: "dsss", crc: false, sampleRateHz: 44100, hotsound: false}; any
// field may be left out. Problems come back as messages, never as
// exceptions:
//
//   encode(settings, hex, loopSeconds)
//       -> {error: "", samples: Float32Array, pcm16: Int16Array, sampleRateHz}
//   const d = new Decoder();
//   d.configure(settings)   -> "" or the problem
//   d.process(float32Array) -> array of hex tokens first heard in the block
//   d.reset(); d.delete();
//   messageBytes(settings)  -> bytes a token's message has (0: bad settings)
#include <emscripten/bind.h>
#include <emscripten/val.h>

#include <cmath>
#include <string>
#include <vector>

#include "audio/pcm16.h"
#include "base/logging.h"
#include "web/web_modem.h"

namespace sorvel_web {
namespace {

using emscripten::val;

bool IsNumber(const val& v) { return v.typeOf().as<std::string>() == "number"; }
bool IsString(const val& v) { return v.typeOf().as<std::string>() == "string"; }

// Reads the settings object field by field; "" or the first bad field.
std::string ReadSettings(const val& object, WebModemSettings* settings) {
  if (object.isUndefined() || object.isNull()) return "";
  if (object.typeOf().as<std::string>() != "object") return "settings must be an object";
  const val scheme = object["scheme"];
  if (!scheme.isUndefined()) {
    if (!IsString(scheme)) return "scheme must be a string";
    settings->scheme = scheme.as<std::string>();
  }
  const val crc = object["crc"];
  if (!crc.isUndefined()) settings->crc = crc.as<bool>();
  const val hotsound = object["hotsound"];
  if (!hotsound.isUndefined()) settings->hotsound = hotsound.as<bool>();
  const val rate = object["sampleRateHz"];
  if (!rate.isUndefined()) {
    // Range first: converting a larger double to int is undefined.
    const double hz = IsNumber(rate) ? rate.as<double>() : 0.0;
    if (!(hz >= kMinSampleRateHz && hz <= kMaxSampleRateHz) || hz != std::floor(hz)) {
      return "sampleRateHz must be a whole number in [" + std::to_string(kMinSampleRateHz) +
             ", " + std::to_string(kMaxSampleRateHz) + "]";
    }
    settings->sample_rate_hz = static_cast<int>(hz);
  }
  return "";
}

val Encode(const val& settings_object, const val& hex, const val& loop_seconds) {
  WebModemSettings settings;
  EncodeResult encoded;
  encoded.error = ReadSettings(settings_object, &settings);
  if (encoded.error.empty() && !IsString(hex)) encoded.error = "the token must be a string";
  if (encoded.error.empty() && !IsNumber(loop_seconds)) {
    encoded.error = "the loop must be a number of seconds";
  }
  if (encoded.error.empty()) {
    encoded = EncodeToken(settings, hex.as<std::string>(), loop_seconds.as<double>());
  } else {
    LOG(ERROR) << encoded.error;
  }
  val result = val::object();
  result.set("error", encoded.error);
  result.set("sampleRateHz", settings.sample_rate_hz);
  std::vector<int16_t> pcm16(encoded.samples.size());
  for (size_t i = 0; i < pcm16.size(); ++i) {
    pcm16[i] = audio_sorvane::FloatToPcm16(encoded.samples[i]);
  }
  // slice() copies out of the module's memory, which later calls may move.
  result.set("samples", val(emscripten::typed_memory_view(encoded.samples.size(),
                                                          encoded.samples.data()))
                            .call<val>("slice"));
  result.set("pcm16",
             val(emscripten::typed_memory_view(pcm16.size(), pcm16.data())).call<val>("slice"));
  return result;
}

int JsMessageBytes(const val& settings_object) {
  WebModemSettings settings;
  if (!ReadSettings(settings_object, &settings).empty() || !ValidateSettings(settings).empty()) {
    return 0;
  }
  return MessageBytes(settings);
}

class JsDecoder {
 public:
  std::string Configure(const val& settings_object) {
    WebModemSettings settings;
    if (std::string e = ReadSettings(settings_object, &settings); !e.empty()) {
      LOG(ERROR) << e;
      return e;
    }
    return decoder_.Configure(settings);
  }

  val Process(const val& block) {
    val heard = val::array();
    if (!block.instanceof(val::global("Float32Array"))) {
      LOG(ERROR) << "process takes a Float32Array; block dropped";
      return heard;
    }
    // Copied into a buffer that keeps its capacity: the AudioWorklet calls
    // this every render quantum, so the steady state allocates nothing.
    samples_.resize(block["length"].as<size_t>());
    val(emscripten::typed_memory_view(samples_.size(), samples_.data())).call<void>("set", block);
    for (const std::string& token : decoder_.Process(samples_)) heard.call<void>("push", token);
    return heard;
  }

  // At the end of a recording: the tokens a broadcast it ends with adds.
  val Finish() {
    val heard = val::array();
    for (const std::string& token : decoder_.Finish()) heard.call<void>("push", token);
    return heard;
  }

  void Reset() { decoder_.Reset(); }

 private:
  WebDecoder decoder_;
  std::vector<float> samples_;
};

EMSCRIPTEN_BINDINGS(sorvel_web) {
  emscripten::function("encode", &Encode);
  emscripten::function("messageBytes", &JsMessageBytes);
  emscripten::class_<JsDecoder>("Decoder")
      .constructor<>()
      .function("configure", &JsDecoder::Configure)
      .function("process", &JsDecoder::Process)
      .function("finish", &JsDecoder::Finish)
      .function("reset", &JsDecoder::Reset);
}

}  // namespace
}  // namespace sorvel_web
