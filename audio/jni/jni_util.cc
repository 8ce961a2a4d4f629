#include "audio/jni/jni_util.h"

#include <vector>

#include "audio/pcm16.h"

namespace audio_sorvane {

DsssCoderConfig MakeDsssCoderConfig(jint number_of_taps, jint code_number,
                                    jint upsampling_factor, jint bits_per_symbol,
                                    jint min_cycles_per_frame, jint baseband_decimation_factor,
                                    jboolean use_quadrature, jfloat sample_rate,
                                    jfloat desired_carrier_frequency) {
  DsssCoderConfig coder;
  coder.number_of_taps = number_of_taps;
  coder.code_number = code_number;
  coder.upsampling_factor = upsampling_factor;
  coder.bits_per_symbol = bits_per_symbol;
  coder.min_cycles_per_frame = min_cycles_per_frame;
  coder.baseband_decimation_factor = baseband_decimation_factor;
  coder.use_quadrature = use_quadrature;
  coder.sample_rate = sample_rate;
  coder.desired_carrier_frequency = desired_carrier_frequency;
  return coder;
}

bool ReadFloatArray(JNIEnv* env, jfloatArray array, std::vector<float>* values) {
  values->clear();
  if (array == nullptr) return true;
  const jsize count = env->GetArrayLength(array);
  if (count == 0) return true;
  jfloat* elements = env->GetFloatArrayElements(array, nullptr);
  if (elements == nullptr) return false;
  values->assign(elements, elements + count);
  env->ReleaseFloatArrayElements(array, elements, JNI_ABORT);
  return true;
}

bool ReadDtmfConfig(JNIEnv* env, jint bytes_in_token, jboolean use_checksum_symbol,
                    jint baseband_decimation_factor, jint tones_per_symbol,
                    jfloatArray tone_frequencies, jfloat sample_rate, jfloat window_duration,
                    const std::array<float, 5>& adsr, DtmfConfig* config) {
  config->bytes_in_token = bytes_in_token;
  config->use_checksum_symbol = use_checksum_symbol;
  config->baseband_decimation_factor = baseband_decimation_factor;
  config->tones_per_symbol = tones_per_symbol;
  config->sample_rate = sample_rate;
  config->window_duration = window_duration;
  config->adsr = adsr;
  return ReadFloatArray(env, tone_frequencies, &config->tone_frequencies);
}

jbyteArray FloatsToPcmByteArray(JNIEnv* env, std::span<const float> samples) {
  const std::vector<int8_t> bytes = FloatsToPcm16Le(samples);
  const jsize size = static_cast<jsize>(bytes.size());
  jbyteArray array = env->NewByteArray(size);
  if (array == nullptr) return nullptr;
  env->SetByteArrayRegion(array, 0, size, bytes.data());
  if (env->ExceptionCheck()) {
    env->DeleteLocalRef(array);
    return nullptr;
  }
  return array;
}

}  // namespace audio_sorvane
