// Native side of com.tessal.android.orv.audiomodem.NativeSettings: the Java
// API asks here whether the library would take a set of settings, so that it
// refuses them with the library's own message before they reach a native
// peer (whose constructors would end the process on them). Nothing is built.
#include <jni.h>

#include <string>
#include <vector>

#include "audio/jni/jni_util.h"
#include "audio/modem_config.h"

namespace {

using audio_sorvane::ModemSettings;
using audio_sorvane::ReceiverSettings;

// The library's objection to a sender and a receiver of `modem`, or "".
std::string Objection(ModemSettings modem, int max_candidates, float input_sample_rate,
                      int channels, bool hotsound) {
  if (std::string e = audio_sorvane::ResolveModemSettings(modem); !e.empty()) return e;
  ReceiverSettings receiver;
  receiver.hotsound = hotsound;
  receiver.max_candidates = max_candidates;
  return audio_sorvane::CheckReceiverSettings(modem, receiver, input_sample_rate, channels);
}

// The settings both schemes share.
ModemSettings Modem(const char* scheme, bool crc, int token_bytes, int decimation_factor,
                    float sample_rate) {
  ModemSettings modem;
  modem.scheme = scheme;
  modem.crc = crc;
  modem.token_bytes = token_bytes;
  modem.decimation_factor = decimation_factor;
  modem.dsss.coder.sample_rate = sample_rate;  // the frame rate of either scheme
  return modem;
}

jstring ToJava(JNIEnv* env, const std::string& objection) {
  return objection.empty() ? nullptr : env->NewStringUTF(objection.c_str());
}

}  // namespace

extern "C" {

JNIEXPORT jstring JNICALL Java_com_tessal_android_orv_audiomodem_NativeSettings_nativeCheckDsss(
    JNIEnv* env, jclass, jint token_length_bytes, jboolean crc, jboolean append_check_symbol,
    jint number_of_taps, jint code_number, jint upsampling_factor, jint bits_per_symbol,
    jint min_cycles_per_frame, jint baseband_decimation_factor, jboolean use_quadrature,
    jfloat sample_rate, jfloat desired_carrier_frequency, jint broadcast_sample_rate,
    jfloat start_transition_duration, jint max_candidates, jfloat input_sample_rate,
    jint channels, jboolean hotsound) {
  ModemSettings modem =
      Modem("dsss", crc, token_length_bytes, baseband_decimation_factor, sample_rate);
  modem.dsss.coder = audio_sorvane::MakeDsssCoderConfig(
      number_of_taps, code_number, upsampling_factor, bits_per_symbol, min_cycles_per_frame,
      baseband_decimation_factor, use_quadrature, sample_rate, desired_carrier_frequency);
  modem.dsss.append_check_symbol = append_check_symbol;
  modem.dsss.broadcast_sample_rate = broadcast_sample_rate;
  modem.dsss.start_transition_duration = start_transition_duration;
  return ToJava(env, Objection(modem, max_candidates, input_sample_rate, channels, hotsound));
}

JNIEXPORT jstring JNICALL Java_com_tessal_android_orv_audiomodem_NativeSettings_nativeCheckDtmf(
    JNIEnv* env, jclass, jint bytes_in_token, jboolean crc, jboolean use_checksum_symbol,
    jint baseband_decimation_factor, jint tones_per_symbol, jfloatArray tone_frequencies,
    jfloat sample_rate, jfloat window_duration, jfloatArray adsr, jint max_candidates,
    jfloat input_sample_rate, jint channels) {
  ModemSettings modem =
      Modem("dtmf", crc, bytes_in_token, baseband_decimation_factor, sample_rate);
  modem.dtmf.use_checksum_symbol = use_checksum_symbol;
  modem.dtmf.tones_per_symbol = tones_per_symbol;
  modem.dtmf.window_duration = window_duration;
  if (!audio_sorvane::ReadFloatArray(env, tone_frequencies, &modem.dtmf.tone_frequencies) ||
      !audio_sorvane::ReadFloatArray(env, adsr, &modem.adsr)) {
    return nullptr;  // the pending exception reaches Java
  }
  return ToJava(env, Objection(modem, max_candidates, input_sample_rate, channels, false));
}

}  // extern "C"
