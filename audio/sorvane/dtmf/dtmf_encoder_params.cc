#include "audio/sorvane/dtmf/dtmf_encoder_params.h"

#include <cmath>
#include <numbers>

#include "audio/dsp/number_util.h"
#include "audio/sorvane/dtmf/byte_symbol_converter.h"
#include "audio/sorvane/token_selector.h"
#include "base/logging.h"

namespace audio_sorvane {

DtmfEncoderParams::DtmfEncoderParams()
    : tone_frequencies(MakePentatonicTones(2, 740.0f)),
      symbol_table(MakeSymbolTable(static_cast<int>(tone_frequencies.size()),
                                   tones_per_symbol)),
      spacer_symbol(static_cast<int>(symbol_table.size()) - 1) {}

std::vector<float> MakePentatonicTones(int octaves, float base_frequency) {
  constexpr int kOffsets[] = {0, 2, 4, 7, 9};
  std::vector<float> tones;
  for (int octave = 0; octave < octaves; ++octave) {
    for (int offset : kOffsets) {
      const float ratio = static_cast<float>(std::pow(2.0, offset / 12.0));
      tones.push_back(ratio * base_frequency);
    }
    base_frequency *= 2.0f;
  }
  return tones;
}

std::vector<std::vector<int>> MakeSymbolTable(int tone_count, int k) {
  std::vector<std::vector<int>> table;
  for (audio_dsp::Combinations c(tone_count, k); !c.Done(); c.Next()) {
    table.push_back(c.GetCombination());
  }
  return table;
}

int FrameSize(const DtmfEncoderParams& params) {
  const float factor = static_cast<float>(params.baseband_decimation_factor);
  return params.baseband_decimation_factor *
         static_cast<int>(std::round(params.window_duration * params.sample_rate / factor));
}

int SymbolsInToken(const DtmfEncoderParams& params) {
  return ByteSymbolConverter(static_cast<int>(params.symbol_table.size()),
                             params.spacer_symbol, params.bytes_in_token)
      .symbols_in_token();
}

float TokenDurationSeconds(const DtmfEncoderParams& params) {
  return TokenDurationSeconds(FramesPerToken(SymbolsInToken(params), params.use_checksum_symbol),
                              FrameSize(params), params.sample_rate);
}

void SetToneFrequencies(const std::vector<float>& frequencies,
                        int tones_per_symbol, DtmfEncoderParams* params) {
  CHECK(params);
  if (&params->tone_frequencies != &frequencies) {
    params->tone_frequencies = frequencies;
  }
  params->symbol_table = MakeSymbolTable(
      static_cast<int>(params->tone_frequencies.size()), tones_per_symbol);
  params->spacer_symbol = static_cast<int>(params->symbol_table.size()) - 1;
}

sorvel_base::Validation ValidateAdsrWindow(const DtmfEncoderParams& params, float attack,
                                           float decay, float sustain, float release,
                                           float sustain_amplitude) {
  SORVEL_REQUIRE(params.sample_rate > 0, "Called with invalid sample rate.");
  // Written so that NaN fails too.
  SORVEL_REQUIRE(attack >= 0 && decay >= 0 && sustain >= 0 && release >= 0,
                 "Time parameters must be nonnegative.");
  SORVEL_REQUIRE(sustain_amplitude >= 0.0f && sustain_amplitude <= 1.0f, "Sustain amplitude ",
                 sustain_amplitude, " is outside of [0, 1].");
  const float total = attack + decay + sustain + release;
  // A few ulps of slack, so that stages summing to the window duration up to
  // rounding pass.
  SORVEL_REQUIRE(total <= params.window_duration * 1.0000005f, "Nonzero duration ", total,
                 " exceeds ", params.window_duration, ".");
  return {};
}

bool SetAdsrWindow(DtmfEncoderParams* params, float attack, float decay,
                   float sustain, float release, float sustain_amplitude) {
  if (params == nullptr) {
    LOG(ERROR) << "SetAdsrWindow(): Called with null pointer.";
    return false;
  }
  if (auto v = ValidateAdsrWindow(*params, attack, decay, sustain, release, sustain_amplitude);
      !v.ok()) {
    LOG(ERROR) << "SetAdsrWindow(): " << v.message();
    return false;
  }
  const float total = attack + decay + sustain + release;

  const auto smooth_step = [](float x) { return x * x * (3.0f - 2.0f * x); };
  const float s = sustain_amplitude;
  const int frame_size = FrameSize(*params);
  std::vector<float>& window = params->window_samples;
  window.clear();
  window.reserve(frame_size);
  for (int i = 0; i < frame_size; ++i) {
    const float t = static_cast<float>(i) / params->sample_rate;
    float value;
    if (t <= attack) {
      value = attack > 0 ? smooth_step(t / attack) : 0.5f;
    } else if (t <= attack + decay) {
      value = (1.0f - s) * (decay > 0 ? smooth_step((attack + decay - t) / decay) : 0.5f) + s;
    } else if (t <= attack + decay + sustain) {
      value = s;
    } else if (t <= total) {
      value = (release > 0 ? smooth_step((total - t) / release) : 0.5f) * s;
    } else {
      value = 0.0f;
    }
    window.push_back(value);
  }
  return true;
}

void SetSineWindow(DtmfEncoderParams* params) {
  CHECK(params);
  const int frame_size = FrameSize(*params);
  params->window_samples.resize(frame_size);
  for (int i = 0; i < frame_size; ++i) {
    const float ratio = static_cast<float>(i) / static_cast<float>(frame_size);
    const float sample = static_cast<float>(std::sin(std::numbers::pi * ratio));
    using std::isfinite;
    CHECK(isfinite(sample));
    CHECK(sample >= 0.0);
    params->window_samples[i] = sample;
  }
}

sorvel_base::Validation ValidateDtmfEncoderParams(const DtmfEncoderParams& params) {
  SORVEL_REQUIRE(params.sample_rate > 0.0f, "sample_rate must be positive, got ",
                 params.sample_rate);
  SORVEL_REQUIRE(params.baseband_decimation_factor > 0,
                 "baseband_decimation_factor must be positive, got ",
                 params.baseband_decimation_factor);
  SORVEL_REQUIRE(params.window_duration > 0.0f, "window_duration must be positive, got ",
                 params.window_duration, " s");
  const int frame_size = FrameSize(params);
  SORVEL_REQUIRE(frame_size > 0, "window_duration ", params.window_duration,
                 " s gives no samples per frame");
  if (!params.window_samples.empty()) {
    SORVEL_REQUIRE(static_cast<int>(params.window_samples.size()) == frame_size,
                   "the window has ", params.window_samples.size(), " samples, a frame ",
                   frame_size);
    for (float sample : params.window_samples) {
      SORVEL_REQUIRE(std::isfinite(sample), "window samples must be finite");
      SORVEL_REQUIRE(sample >= 0.0, "window samples must not be negative, got ", sample);
    }
  }
  const float nyquist_frequency = params.sample_rate * 0.5f;
  for (float frequency : params.tone_frequencies) {
    SORVEL_REQUIRE(frequency >= 0.0, "tone frequency ", frequency, " Hz must be in [0, ",
                   nyquist_frequency, ")");
    SORVEL_REQUIRE(frequency < nyquist_frequency, "tone frequency ", frequency,
                   " Hz must be in [0, ", nyquist_frequency, ")");
  }
  const size_t tones = params.tone_frequencies.size();
  SORVEL_REQUIRE(params.symbol_table.size() >= 3, "the symbol table needs at least 3 symbols, has ",
                 params.symbol_table.size());
  SORVEL_REQUIRE(params.tone_frequencies.size() * (params.tone_frequencies.size() - 1) / 2 >=
                     params.symbol_table.size(),
                 tones, " tones give at most ", tones * (tones - 1) / 2, " symbols; the table has ",
                 params.symbol_table.size());
  SORVEL_REQUIRE(params.tones_per_symbol > 0, "tones_per_symbol must be positive, got ",
                 params.tones_per_symbol);
  for (const std::vector<int>& symbol_frequencies : params.symbol_table) {
    SORVEL_REQUIRE(static_cast<int>(symbol_frequencies.size()) == params.tones_per_symbol,
                   "every symbol must have tones_per_symbol (", params.tones_per_symbol,
                   ") tones");
    for (int index : symbol_frequencies) {
      SORVEL_REQUIRE(index >= 0, "tone index ", index, " is negative");
      SORVEL_REQUIRE(index < static_cast<int>(params.tone_frequencies.size()), "tone index ",
                     index, " is past the ", tones, " tones");
    }
  }
  SORVEL_REQUIRE(params.spacer_symbol >= 0, "spacer_symbol must not be negative, got ",
                 params.spacer_symbol);
  SORVEL_REQUIRE(params.spacer_symbol < static_cast<int>(params.symbol_table.size()),
                 "spacer_symbol must be below the ", params.symbol_table.size(),
                 " symbols, got ", params.spacer_symbol);
  SORVEL_REQUIRE(params.bytes_in_token > 0, "token bytes must be positive, got ",
                 params.bytes_in_token);
  SORVEL_REQUIRE(params.max_amplitude > 0.0, "max_amplitude must be positive, got ",
                 params.max_amplitude);
  return {};
}

void CheckDtmfEncoderParams(const DtmfEncoderParams& params) {
  CHECK_VALID(ValidateDtmfEncoderParams(params));
}

}  // namespace audio_sorvane
