// The modulation of the DSSS modem: one frame ("template") per symbol.
//
// A frame is N = upsampling_factor * code length samples. The spreading code
// u (band-limited interpolation of the chips to N samples) multiplies a
// carrier of C = floor(desired_carrier_frequency * N / sample_rate) whole
// cycles per frame, and symbol k rides on it as a slow tone of
// min_cycles_per_frame + k cycles per frame:
//   template_k[i] = u[i] (Q[i] tone_k[i] + pedestal_amplitude S[i]),
//   S[i] = sin(2 pi C i / N),  Q = S, or cos(2 pi C i / N) with use_quadrature,
//   tone_k[i] = sin(2 pi (min_cycles_per_frame + k) i / N),
// all templates scaled together to a peak of exactly 1. Symbols
// 0 .. 2^bits_per_symbol - 1 carry data; the last one, 2^bits_per_symbol,
// is the start symbol. The receivers correlate against the baseband code
// and tones at N / baseband_decimation_factor samples per frame.
//
// Built once per encoder or decoder; immutable afterwards and safe to share
// between threads (the full-rate templates are built on first use). Invalid parameters end the process through CHECK.
#ifndef AUDIO_SORVANE_SYMBOL_WAVE_CODER_H_
#define AUDIO_SORVANE_SYMBOL_WAVE_CODER_H_

#include <mutex>
#include <span>
#include <vector>

#include "audio/dsp/eigen_types.h"
#include "base/validation.h"

namespace audio_sorvane {

struct SymbolWaveCoderParams {
  SymbolWaveCoderParams();

  std::vector<float> code;               // chips of +-1; default 7 taps, code 0
  float sample_rate = 44100.0f;          // Hz, > 0
  int upsampling_factor = 15;            // samples per chip, > 0
  float desired_carrier_frequency = 18500.0f;  // Hz, in [0, sample_rate / 2]
  int bits_per_symbol = 4;               // > 0
  int min_cycles_per_frame = 4;          // >= 0, tone of symbol 0
  int baseband_decimation_factor = 3;    // divides upsampling_factor
  bool use_quadrature = false;           // tone on the cosine carrier
  float pedestal_amplitude = 1.0f;       // > 0, constant carrier part
};

// Refuses a record the coder cannot be built from (the constructor ends the
// process on it).
sorvel_base::Validation ValidateSymbolWaveCoderParams(const SymbolWaveCoderParams& params);

// Samples per frame at the full rate: one code period, upsampling_factor
// samples per chip.
inline int SamplesPerFrame(const SymbolWaveCoderParams& params) {
  return params.upsampling_factor * static_cast<int>(params.code.size());
}

class SymbolWaveCoder {
 public:
  explicit SymbolWaveCoder(const SymbolWaveCoderParams& params);
  virtual ~SymbolWaveCoder() = default;

  // Template of `symbol`, in [0, alphabet_size()).
  std::span<const float> SymbolWaveform(int symbol) const;
  // Template of the start symbol (the last one).
  std::span<const float> StartWaveform() const;

  const SymbolWaveCoderParams& params() const { return params_; }
  int samples_per_frame() const { return samples_per_frame_; }
  int carrier_cycles_per_frame() const { return carrier_cycles_per_frame_; }
  int alphabet_size() const { return alphabet_size_; }
  // The carrier actually sent: C * sample_rate / N, in Hz.
  float CarrierFrequency() const;
  // The code interpolated to N / baseband_decimation_factor samples.
  const std::vector<float>& baseband_code() const { return baseband_code_; }
  // alphabet_size() rows by N / baseband_decimation_factor columns; row r is
  // sin(2 pi (min_cycles_per_frame + r) i / columns).
  const audio_dsp::FloatMatrix& baseband_tones() const { return baseband_tones_; }

 private:
  SymbolWaveCoderParams params_;
  int samples_per_frame_;
  int carrier_cycles_per_frame_;
  int alphabet_size_;
  std::vector<float> baseband_code_;
  audio_dsp::FloatMatrix baseband_tones_;
  const std::vector<std::vector<float>>& Templates() const;
  mutable std::once_flag templates_once_;
  mutable std::vector<std::vector<float>> templates_;
};

// Band-limited periodic interpolation of `code` (length L) to `length`
// samples, a whole multiple of L: the spectrum is zero-padded (the Nyquist
// bin halved for even L) and scaled by 1 / L.
void InterpolateCode(std::span<const float> code, int length,
                     std::vector<float>* upsampled_code);

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_SYMBOL_WAVE_CODER_H_
