// The record that fixes the multi-tone signal, shared by encoder and decoder
// so that both agree on tones and symbols, with its defaults, validation and
// the helpers that fill its window and tables.
//
// Defaults: 44.1 kHz, frames of 2208 samples (0.05 s rounded to a multiple
// of the decimation factor 16), ten pentatonic tones from 740 Hz over two
// octaves, symbols = the 45 pairs of those tones in lexicographic order, the
// last pair {8, 9} being the spacer that opens every token, 5-byte tokens.
#ifndef AUDIO_SORVANE_DTMF_DTMF_ENCODER_PARAMS_H_
#define AUDIO_SORVANE_DTMF_DTMF_ENCODER_PARAMS_H_

#include <vector>

#include "base/validation.h"

namespace audio_sorvane {

struct DtmfEncoderParams {
  DtmfEncoderParams();

  float sample_rate = 44100.0f;        // Hz
  int baseband_decimation_factor = 16;  // frames are multiples of this
  float window_duration = 0.05f;        // nominal frame length, seconds
  // Per-sample frame window, frame_size long; empty until set (the encoder
  // then uses the half-sine window).
  std::vector<float> window_samples;
  std::vector<float> tone_frequencies;  // Hz
  int tones_per_symbol = 2;
  // Entry s: indices into tone_frequencies sounded together for symbol s.
  std::vector<std::vector<int>> symbol_table;
  int spacer_symbol = 0;  // symbol_table.size() - 1 by default
  int bytes_in_token = 5;
  bool use_checksum_symbol = false;
  float max_amplitude = 1.0f;  // peak of an encoded token
};

// `octaves` * 5 tones: semitone offsets {0, 2, 4, 7, 9} above each octave's
// base, the base doubling per octave.
std::vector<float> MakePentatonicTones(int octaves, float base_frequency);

// All k-element subsets of {0 .. tone_count - 1}, lexicographic.
std::vector<std::vector<int>> MakeSymbolTable(int tone_count, int k);

// baseband_decimation_factor * round(window_duration * sample_rate /
// baseband_decimation_factor): 2208 with the defaults.
int FrameSize(const DtmfEncoderParams& params);

// Data symbols per token (8 with the defaults).
int SymbolsInToken(const DtmfEncoderParams& params);

// (SymbolsInToken + 1 spacer (+ 1 checksum)) * frame_size / sample_rate.
float TokenDurationSeconds(const DtmfEncoderParams& params);

// Replaces the tones, rebuilds the symbol table from tones_per_symbol-element
// combinations and makes the last symbol the spacer. Does not store
// tones_per_symbol itself.
void SetToneFrequencies(const std::vector<float>& frequencies,
                        int tones_per_symbol, DtmfEncoderParams* params);

// Fills window_samples with an attack-decay-sustain-release envelope of
// frame_size samples (durations in seconds, sustain_amplitude in [0, 1]).
// On a bad argument logs one error and returns false, leaving the window
// as it was.
bool SetAdsrWindow(DtmfEncoderParams* params, float attack, float decay,
                   float sustain, float release, float sustain_amplitude);

// Refuses the arguments SetAdsrWindow would refuse; the message is the
// sentence it logs.
sorvel_base::Validation ValidateAdsrWindow(const DtmfEncoderParams& params, float attack,
                                           float decay, float sustain, float release,
                                           float sustain_amplitude);

// Fills window_samples with sin(pi i / frame_size), i = 0 .. frame_size - 1.
void SetSineWindow(DtmfEncoderParams* params);

// Refuses a record the encoder or decoder cannot be built from. An empty
// window is valid.
sorvel_base::Validation ValidateDtmfEncoderParams(const DtmfEncoderParams& params);

// Ends the process on a record ValidateDtmfEncoderParams refuses.
void CheckDtmfEncoderParams(const DtmfEncoderParams& params);

}  // namespace audio_sorvane

#endif  // AUDIO_SORVANE_DTMF_DTMF_ENCODER_PARAMS_H_
