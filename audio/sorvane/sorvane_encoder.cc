#include "audio/sorvane/sorvane_encoder.h"

#include <algorithm>
#include <cmath>
#include <utility>

#include "audio/dsp/kiss_fft_util.h"
#include "audio/sorvane/token_selector.h"
#include "base/logging.h"

namespace audio_sorvane {

sorvel_base::Validation ValidateSorvaneEncoderParams(const SorvaneEncoderParams& params) {
  SORVEL_REQUIRE_AS(params.broadcast_sample_rate > 0.0, "params_.broadcast_sample_rate > 0.0",
                    "broadcast sample rate must be positive, got ", params.broadcast_sample_rate);
  return {};
}

SorvaneEncoder::SorvaneEncoder(
    std::shared_ptr<const SymbolWaveCoder> symbol_wave_coder,
    const SorvaneEncoderParams& params)
    : params_(params) {
  CHECK(symbol_wave_coder);
  symbol_wave_coder_ = std::move(symbol_wave_coder);
  converter_ = std::make_unique<TokenSymbolConverter>(
      symbol_wave_coder_->params().bits_per_symbol);
  CHECK_VALID(ValidateSorvaneEncoderParams(params_));
}

bool SorvaneEncoder::Encode(const std::vector<uint8_t>& token_bytes,
                            std::vector<float>* output) const {
  std::vector<int> symbols;
  converter_->TokenToSymbols(token_bytes, &symbols);
  VLOG(1) << "Converted " << token_bytes.size() << " bytes to " << symbols.size()
          << " symbols.";
  return EncodeSymbols(symbols, output);
}

bool SorvaneEncoder::EncodeSymbols(const std::vector<int>& symbols,
                                   std::vector<float>* output) const {
  if (static_cast<int>(symbols.size()) != params_.num_symbols) {
    LOG(ERROR) << "EncodeSymbols() called with input of size " << symbols.size()
               << ", but expected " << params_.num_symbols << ".";
    return false;
  }
  if (output == nullptr) {
    LOG(ERROR) << "EncodeSymbols() called with null output pointer.";
    return false;
  }
  const SymbolWaveCoder& coder = *symbol_wave_coder_;
  std::vector<int> sequence = symbols;
  if (params_.append_check_symbol) {
    sequence.push_back(ComputeCheckSymbol(coder.alphabet_size(), symbols));
  }

  output->clear();
  output->reserve((sequence.size() + 1) * coder.samples_per_frame());
  const std::span<const float> start = coder.StartWaveform();
  output->insert(output->end(), start.begin(), start.end());
  for (int symbol : sequence) {
    const std::span<const float> frame = coder.SymbolWaveform(symbol);
    output->insert(output->end(), frame.begin(), frame.end());
  }

  const float sample_rate = coder.params().sample_rate;
  if (params_.high_pass_at_carrier && !output->empty()) {
    audio_dsp::HighPassFilter(*output, output, coder.CarrierFrequency(),
                              sample_rate);
  }
  audio_dsp::FftResample(*output, output, sample_rate,
                         params_.broadcast_sample_rate);

  float peak = 0.0f;
  for (float v : *output) peak = std::max(peak, std::fabs(v));
  if (peak > 0.0f) {
    const float scale = params_.peak_amplitude / peak;
    for (float& v : *output) v *= scale;
  }
  return true;
}

namespace {

// Logs and refuses an empty input or a null output of a transition call.
bool TransitionArgumentsValid(const char* caller, std::span<const float> input,
                              const std::vector<float>* output) {
  if (input.empty()) {
    LOG(ERROR) << caller << "() called with empty input.";
    return false;
  }
  if (output == nullptr) {
    LOG(ERROR) << caller << "() called with null output pointer.";
    return false;
  }
  return true;
}

// n samples of `input` repeated cyclically under a linear ramp: rising
// (k / (n + 1), k = 1..n) and ending on input's last sample, or falling
// (k = n..1) from its first, so that either joins the broadcast without a
// step.
bool MakeRamp(const char* caller, int n, std::span<const float> input,
              std::vector<float>* output, bool rising) {
  if (!TransitionArgumentsValid(caller, input, output)) return false;
  const int length = static_cast<int>(input.size());
  output->resize(n);
  if (n == 0) return true;
  int s = rising ? length - 1 - (n - 1) % length : 0;
  for (int i = 0; i < n; ++i) {
    const int k = rising ? i + 1 : n - i;
    (*output)[i] = static_cast<float>(k) / static_cast<float>(n + 1) * input[s];
    if (++s == length) s = 0;
  }
  return true;
}

}  // namespace

int SorvaneEncoder::TransitionLength() const {
  return std::max(0, static_cast<int>(std::lround(params_.broadcast_sample_rate *
                                                  params_.transition_duration)));
}

bool SorvaneEncoder::MakeStartTransition(std::span<const float> input,
                                         std::vector<float>* output) const {
  return MakeRamp("MakeStartTransition", TransitionLength(), input, output, /*rising=*/true);
}

bool SorvaneEncoder::MakeStopTransition(std::span<const float> input,
                                        std::vector<float>* output) const {
  return MakeRamp("MakeStopTransition", TransitionLength(), input, output, /*rising=*/false);
}

}  // namespace audio_sorvane
