// Native side of com.tessal.android.orv.audiomodem.NativeEncoder.
//
// One process-wide encoder slot: initialise replaces it (the old encoder is
// destroyed after the new one is in place), release empties it. Calls must
// be serialised by the Java side; nothing here locks. nativeEncode on an
// empty slot is a caller error and is not tested for.
#include <jni.h>

#include <cstdint>
#include <memory>
#include <utility>
#include <vector>

#include "audio/audio_modem_encoder.h"
#include "audio/jni/jni_util.h"
#include "audio/modem_config.h"
#include "base/logging.h"

namespace {

using audio_sorvane::AudioModemEncoder;
using audio_sorvane::ScopedLocalRef;

std::unique_ptr<AudioModemEncoder>& EncoderSlot() {
  static auto* slot = new std::unique_ptr<AudioModemEncoder>();
  return *slot;
}

void ReplaceEncoder(std::unique_ptr<AudioModemEncoder> encoder) {
  // Swap first, so the slot never holds a destroyed encoder.
  std::unique_ptr<AudioModemEncoder> old = std::exchange(EncoderSlot(), std::move(encoder));
}

}  // namespace

extern "C" {

JNIEXPORT jboolean JNICALL
Java_com_tessal_android_orv_audiomodem_NativeEncoder_nativeInitializeDsss(
    JNIEnv*, jclass, jint token_length_bytes, jboolean append_check_symbol,
    jboolean high_pass_at_carrier, jint number_of_taps, jint code_number,
    jint upsampling_factor, jint bits_per_symbol, jint min_cycles_per_frame,
    jint baseband_decimation_factor, jboolean use_quadrature,
    jint broadcast_sample_rate, jfloat sample_rate,
    jfloat desired_carrier_frequency, jfloat start_transition_duration) {
  audio_sorvane::DsssEncoderConfig config;
  config.coder = audio_sorvane::MakeDsssCoderConfig(
      number_of_taps, code_number, upsampling_factor, bits_per_symbol, min_cycles_per_frame,
      baseband_decimation_factor, use_quadrature, sample_rate, desired_carrier_frequency);
  config.token_length_bytes = token_length_bytes;
  config.append_check_symbol = append_check_symbol;
  config.high_pass_at_carrier = high_pass_at_carrier;
  config.broadcast_sample_rate = broadcast_sample_rate;
  config.start_transition_duration = start_transition_duration;
  ReplaceEncoder(audio_sorvane::MakeDsssEncoder(config));
  return JNI_TRUE;
}

JNIEXPORT jboolean JNICALL
Java_com_tessal_android_orv_audiomodem_NativeEncoder_nativeInitializeDtmf(
    JNIEnv* env, jclass, jint bytes_in_token, jboolean use_checksum_symbol,
    jint baseband_decimation_factor, jint tones_per_symbol,
    jfloatArray tone_frequencies, jfloat sample_rate, jfloat window_duration,
    jfloat adsr_1, jfloat adsr_2, jfloat adsr_3, jfloat adsr_4, jfloat adsr_5) {
  audio_sorvane::DtmfConfig config;
  if (!audio_sorvane::ReadDtmfConfig(env, bytes_in_token, use_checksum_symbol,
                                     baseband_decimation_factor, tones_per_symbol,
                                     tone_frequencies, sample_rate, window_duration,
                                     {adsr_1, adsr_2, adsr_3, adsr_4, adsr_5}, &config)) {
    return JNI_FALSE;
  }
  std::unique_ptr<AudioModemEncoder> encoder = audio_sorvane::MakeDtmfEncoder(config);
  if (!encoder) return JNI_FALSE;  // refused ADSR window: keep the old encoder
  ReplaceEncoder(std::move(encoder));
  return JNI_TRUE;
}

JNIEXPORT void JNICALL Java_com_tessal_android_orv_audiomodem_NativeEncoder_nativeEncode(
    JNIEnv* env, jclass, jbyteArray token, jobject results, jint num_crc_check_bytes) {
  const jsize n = env->GetArrayLength(token);
  if (n == 0) return;
  std::vector<uint8_t> token_bytes(n);
  env->GetByteArrayRegion(token, 0, n, reinterpret_cast<jbyte*>(token_bytes.data()));
  if (env->ExceptionCheck()) return;

  const AudioModemEncoder& encoder = *EncoderSlot();
  std::vector<float> audio;
  encoder.Encode(token_bytes, &audio, num_crc_check_bytes);

  ScopedLocalRef<jclass> results_class(env, env->GetObjectClass(results));
  if (!results_class) return;
  const jmethodID set_encode_results =
      env->GetMethodID(results_class.get(), "setEncodeResults", "([B[BF)V");
  if (set_encode_results == nullptr) return;

  ScopedLocalRef<jbyteArray> audio_bytes(
      env, audio_sorvane::FloatsToPcmByteArray(env, audio));
  if (!audio_bytes) return;
  std::vector<float> transition;
  if (!audio.empty()) encoder.MakeStartTransition(audio, &transition);
  ScopedLocalRef<jbyteArray> transition_bytes(
      env, audio_sorvane::FloatsToPcmByteArray(env, transition));
  if (!transition_bytes) return;
  env->CallVoidMethod(results, set_encode_results, audio_bytes.get(),
                      transition_bytes.get(), encoder.OutputSampleRate());
}

JNIEXPORT void JNICALL
Java_com_tessal_android_orv_audiomodem_NativeEncoder_nativeRelease(JNIEnv*, jclass) {
  std::unique_ptr<AudioModemEncoder> old = std::move(EncoderSlot());
}

}  // extern "C"
