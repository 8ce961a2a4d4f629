// Native side of com.tessal.android.orv.audiomodem.NativeDecoder.
//
// Each function reads its Java arguments and hands them to the decoder
// registry (decoder_registry.h), which keeps the decoders by id: ids 0, 1,
// 2, ... and the default slot -1. Ids past the end, or negative other than
// -1, end the process; operations on an empty slot are logged and do
// nothing. Nothing here locks: calls for one decoder come from one thread at
// a time and initialise/release must not overlap other calls.
#include <jni.h>

#include <cstdint>

#include "audio/audio_modem_decoder.h"
#include "audio/jni/decoder_registry.h"
#include "audio/jni/jni_util.h"
#include "audio/modem_config.h"
#include "base/logging.h"

namespace {

using audio_sorvane::AudioModemDecoder;
using audio_sorvane::DecoderRegistry;
using audio_sorvane::ScopedLocalRef;

// The 16-bit samples of a direct buffer after the checks, in this order.
struct PcmBlock {
  const int16_t* samples;
  int count;
};

PcmBlock CheckedBlock(JNIEnv* env, jobject buffer, jint offset_bytes, jint length_bytes) {
  void* direct_buffer = env->GetDirectBufferAddress(buffer);
  CHECK(direct_buffer != nullptr);
  CHECK(length_bytes % 2 == 0);
  const jlong capacity_bytes = env->GetDirectBufferCapacity(buffer);
  CHECK(length_bytes + offset_bytes <= capacity_bytes);
  CHECK(offset_bytes >= 0);
  CHECK(offset_bytes % 2 == 0);
  // A non-zero offset shortens the block by the offset: callers that pass
  // offset 0 get length_bytes / 2 samples.
  return {static_cast<const int16_t*>(direct_buffer) + offset_bytes / 2,
          length_bytes / 2 - offset_bytes / 2};
}

}  // namespace

extern "C" {

JNIEXPORT jboolean JNICALL
Java_com_tessal_android_orv_audiomodem_NativeDecoder_nativeInitializeDsss(
    JNIEnv*, jclass, jint decoder_id, jint token_length_bytes, jboolean append_check_symbol,
    jboolean save_received_samples, jint number_of_taps, jint code_number, jint upsampling_factor,
    jint bits_per_symbol, jint min_cycles_per_frame, jint baseband_decimation_factor,
    jboolean use_quadrature, jint max_candidates_to_return, jint num_channels,
    jboolean with_hotsound, jfloat sample_rate, jfloat desired_carrier_frequency,
    jfloat detection_duration, jfloat detection_threshold, jfloat input_sample_rate,
    jfloat buffer_duration_factor) {
  audio_sorvane::DsssDecoderConfig config;
  config.coder = audio_sorvane::MakeDsssCoderConfig(
      number_of_taps, code_number, upsampling_factor, bits_per_symbol, min_cycles_per_frame,
      baseband_decimation_factor, use_quadrature, sample_rate, desired_carrier_frequency);
  config.token_length_bytes = token_length_bytes;
  config.append_check_symbol = append_check_symbol;
  config.save_received_samples = save_received_samples;
  config.max_candidates_to_return = max_candidates_to_return;
  config.num_channels = num_channels;
  config.with_hotsound = with_hotsound;
  config.detection_duration = detection_duration;
  config.detection_threshold = detection_threshold;
  config.input_sample_rate = input_sample_rate;
  config.buffer_duration_factor = buffer_duration_factor;
  return DecoderRegistry::Get().InitializeDsss(decoder_id, config) ? JNI_TRUE : JNI_FALSE;
}

JNIEXPORT jboolean JNICALL
Java_com_tessal_android_orv_audiomodem_NativeDecoder_nativeInitializeDtmf(
    JNIEnv* env, jclass, jint decoder_id, jint bytes_in_token, jboolean use_checksum_symbol,
    jint baseband_decimation_factor, jint tones_per_symbol,
    jint max_candidates_per_decode_token_call, jint num_channels, jfloat sample_rate,
    jfloat window_duration, jfloat /*ignored_float*/, jfloat input_sample_rate, jfloat adsr_1,
    jfloat adsr_2, jfloat adsr_3, jfloat adsr_4, jfloat adsr_5, jfloat buffer_duration_factor,
    jfloatArray tone_frequencies) {
  audio_sorvane::DtmfDecoderConfig config;
  if (!audio_sorvane::ReadDtmfConfig(env, bytes_in_token, use_checksum_symbol,
                                     baseband_decimation_factor, tones_per_symbol,
                                     tone_frequencies, sample_rate, window_duration,
                                     {adsr_1, adsr_2, adsr_3, adsr_4, adsr_5}, &config.tones)) {
    return JNI_FALSE;
  }
  config.max_candidates_per_decode_token_call = max_candidates_per_decode_token_call;
  config.num_channels = num_channels;
  config.input_sample_rate = input_sample_rate;
  config.buffer_duration_factor = buffer_duration_factor;
  // A refused ADSR window leaves the registry unchanged.
  return DecoderRegistry::Get().InitializeDtmf(decoder_id, config) ? JNI_TRUE : JNI_FALSE;
}

JNIEXPORT void JNICALL
Java_com_tessal_android_orv_audiomodem_NativeDecoder_nativeProcessSamples(
    JNIEnv* env, jclass, jint decoder_id, jobject buffer, jint offset_bytes, jint length_bytes) {
  const PcmBlock block = CheckedBlock(env, buffer, offset_bytes, length_bytes);
  DecoderRegistry::Get().ProcessSamples(decoder_id, block.samples, block.count);
}

JNIEXPORT void JNICALL
Java_com_tessal_android_orv_audiomodem_NativeDecoder_nativeProcessSamplesWithHotsound(
    JNIEnv* env, jclass, jint decoder_id, jobject buffer, jint offset_bytes, jint length_bytes) {
  const PcmBlock block = CheckedBlock(env, buffer, offset_bytes, length_bytes);
  DecoderRegistry::Get().ProcessSamplesWithHotsound(decoder_id, block.samples, block.count);
}

JNIEXPORT void JNICALL Java_com_tessal_android_orv_audiomodem_NativeDecoder_nativeGetTokens(
    JNIEnv* env, jclass, jint decoder_id, jobject results, jint num_message_bytes,
    jint num_crc_check_bytes) {
  ScopedLocalRef<jclass> results_class(env, env->GetObjectClass(results));
  if (!results_class) return;
  const jmethodID add_token = env->GetMethodID(results_class.get(), "addToken", "([B)V");
  if (add_token == nullptr) return;

  // Per thread, so that steady requests reuse the lists' storage.
  thread_local AudioModemDecoder::DecodeResults decoded;
  if (!DecoderRegistry::Get().DecodeTokens(decoder_id, &decoded, num_message_bytes,
                                           num_crc_check_bytes)) {
    return;
  }
  for (const AudioModemDecoder::TokenResult& token : decoded.tokens) {
    const jsize size = static_cast<jsize>(token.bytes.size());
    ScopedLocalRef<jbyteArray> array(env, env->NewByteArray(size));
    if (!array) return;
    env->SetByteArrayRegion(array.get(), 0, size,
                            reinterpret_cast<const jbyte*>(token.bytes.data()));
    if (env->ExceptionCheck()) return;
    env->CallVoidMethod(results, add_token, array.get());
    if (env->ExceptionCheck()) return;
  }
}

JNIEXPORT jboolean JNICALL
Java_com_tessal_android_orv_audiomodem_NativeDecoder_nativeDetectBroadcaster(JNIEnv*, jclass,
                                                                           jint decoder_id) {
  return DecoderRegistry::Get().DetectBroadcaster(decoder_id) ? JNI_TRUE : JNI_FALSE;
}

JNIEXPORT void JNICALL
Java_com_tessal_android_orv_audiomodem_NativeDecoder_nativeWipeInternalData(JNIEnv*, jclass,
                                                                          jint decoder_id) {
  DecoderRegistry::Get().WipeInternalData(decoder_id);
}

JNIEXPORT jint JNICALL
Java_com_tessal_android_orv_audiomodem_NativeDecoder_nativeGetMaxSafeInputSize(
    JNIEnv*, jclass, jint decoder_id) {
  return DecoderRegistry::Get().GetMaxSafeInputSize(decoder_id);
}

JNIEXPORT void JNICALL Java_com_tessal_android_orv_audiomodem_NativeDecoder_nativeRelease(
    JNIEnv*, jclass, jint decoder_id) {
  DecoderRegistry::Get().Release(decoder_id);
}

}  // extern "C"
