// Small RAII and conversion helpers shared by the JNI peers.
#ifndef AUDIO_JNI_JNI_UTIL_H_
#define AUDIO_JNI_JNI_UTIL_H_

#include <jni.h>

#include <array>
#include <span>
#include <vector>

#include "audio/modem_config.h"

namespace audio_sorvane {

// Deletes a local reference when it goes out of scope, so that loops and
// long native calls do not pile up references.
template <typename T>
class ScopedLocalRef {
 public:
  ScopedLocalRef(JNIEnv* env, T ref) : env_(env), ref_(ref) {}
  ~ScopedLocalRef() {
    if (ref_ != nullptr) env_->DeleteLocalRef(ref_);
  }
  ScopedLocalRef(const ScopedLocalRef&) = delete;
  ScopedLocalRef& operator=(const ScopedLocalRef&) = delete;

  T get() const { return ref_; }
  explicit operator bool() const { return ref_ != nullptr; }

 private:
  JNIEnv* env_;
  T ref_;
};

// The DSSS coder settings both peers receive, in their argument order.
DsssCoderConfig MakeDsssCoderConfig(jint number_of_taps, jint code_number,
                                    jint upsampling_factor, jint bits_per_symbol,
                                    jint min_cycles_per_frame, jint baseband_decimation_factor,
                                    jboolean use_quadrature, jfloat sample_rate,
                                    jfloat desired_carrier_frequency);

// The multi-tone settings both peers receive, `adsr` being adsr_1 .. adsr_5.
// False when the tone array cannot be read.
bool ReadDtmfConfig(JNIEnv* env, jint bytes_in_token, jboolean use_checksum_symbol,
                    jint baseband_decimation_factor, jint tones_per_symbol,
                    jfloatArray tone_frequencies, jfloat sample_rate, jfloat window_duration,
                    const std::array<float, 5>& adsr, DtmfConfig* config);

// Copies a Java float[] (null reads as empty). False when the elements
// cannot be read.
bool ReadFloatArray(JNIEnv* env, jfloatArray array, std::vector<float>* values);

// A new Java byte[] holding `samples` as 16-bit little-endian PCM (empty
// samples give an empty array); null when allocation fails or an exception
// is pending afterwards.
jbyteArray FloatsToPcmByteArray(JNIEnv* env, std::span<const float> samples);

}  // namespace audio_sorvane

#endif  // AUDIO_JNI_JNI_UTIL_H_
