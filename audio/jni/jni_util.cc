#include "audio/jni/jni_util.h"

#include <vector>

#include "audio/pcm16.h"

namespace audio_sorvane {

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
