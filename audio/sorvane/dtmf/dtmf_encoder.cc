#include "audio/sorvane/dtmf/dtmf_encoder.h"

#include <algorithm>
#include <cfloat>
#include <cmath>
#include <numbers>

#include "audio/sorvane/token_selector.h"
#include "base/logging.h"

namespace audio_sorvane {

DtmfEncoder::DtmfEncoder(const DtmfEncoderParams& params)
    : params_(params),
      alphabet_size_(static_cast<int>(params.symbol_table.size())),
      converter_(alphabet_size_, params.spacer_symbol, params.bytes_in_token),
      frame_size_(0) {
  CheckDtmfEncoderParams(params_);
  frame_size_ = FrameSize(params_);
  if (params_.window_samples.empty()) SetSineWindow(&params_);
}

void DtmfEncoder::EncodeToken(const std::vector<uint8_t>& bytes,
                              std::vector<float>* audio_samples) const {
  EncodeSymbols(converter_.BytesToSymbols(bytes), audio_samples);
}

bool DtmfEncoder::IsValidSymbolSequence(const std::vector<int>& symbols) const {
  if (static_cast<int>(symbols.size()) != converter_.symbols_in_token()) return false;
  for (int s : symbols) {
    if (s < 0 || s >= alphabet_size_ || s == params_.spacer_symbol) return false;
  }
  return static_cast<int>(converter_.SymbolsToBytes(symbols).size()) ==
         params_.bytes_in_token;
}

void DtmfEncoder::EncodeSymbols(const std::vector<int>& token_message_symbols,
                                std::vector<float>* audio_samples) const {
  CHECK(IsValidSymbolSequence(token_message_symbols));
  CHECK(audio_samples);
  std::vector<int> sequence;
  sequence.reserve(token_message_symbols.size() + 2);
  sequence.push_back(params_.spacer_symbol);
  sequence.insert(sequence.end(), token_message_symbols.begin(),
                  token_message_symbols.end());
  if (params_.use_checksum_symbol) {
    sequence.push_back(ComputeCheckSymbol(alphabet_size_, token_message_symbols));
  }

  audio_samples->clear();
  audio_samples->reserve(sequence.size() * frame_size_);
  for (int symbol : sequence) SynthesizeFrame(symbol, audio_samples);

  float peak = 0.0f;
  for (float v : *audio_samples) peak = std::max(peak, std::fabs(v));
  if (peak >= FLT_EPSILON) {
    const float scale = params_.max_amplitude / peak;
    for (float& v : *audio_samples) v *= scale;
  }
}

void DtmfEncoder::SynthesizeFrame(int symbol, std::vector<float>* result) const {
  CHECK(result);
  const size_t start = result->size();
  result->resize(start + frame_size_, 0.0f);
  float* frame = result->data() + start;
  for (int index : params_.symbol_table[symbol]) {
    const float w = static_cast<float>(params_.tone_frequencies[index] * 2.0 *
                                       std::numbers::pi / params_.sample_rate);
    for (int i = 0; i < frame_size_; ++i) {
      frame[i] += std::sin(w * static_cast<float>(i));
    }
  }
  const float* window = params_.window_samples.data();
  // Four at a time with a scalar tail, which the compiler turns into one
  // vector multiply per step.
  int i = 0;
  for (; i + 4 <= frame_size_; i += 4) {
    for (int j = 0; j < 4; ++j) frame[i + j] *= window[i + j];
  }
  for (; i < frame_size_; ++i) frame[i] *= window[i];
}

}  // namespace audio_sorvane
