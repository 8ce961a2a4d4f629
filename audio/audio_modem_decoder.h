// The one object through which received audio reaches whichever decoder was
// configured (DSSS, DSSS behind the hotsound detector, or multi-tone) and
// through which tokens come back: it checks the caller's message/CRC split,
// verifies and strips CRC-16 bytes and returns the surviving tokens.
//
// Not thread safe. Bad splits are logged errors with a false result; a null
// decoder at construction is fatal.
#ifndef AUDIO_AUDIO_MODEM_DECODER_H_
#define AUDIO_AUDIO_MODEM_DECODER_H_

#include <cstdint>
#include <memory>
#include <span>
#include <vector>

#include "audio/hotsound_decoder.h"
#include "audio/sorvane/dtmf/dtmf_decoder.h"
#include "audio/sorvane/sorvane_decoder.h"

namespace audio_sorvane {

class AudioModemDecoder {
 public:
  enum Kind : int { kDsss = 0, kHotsound = 1, kDtmf = 2 };

  struct TokenResult {
    std::vector<uint8_t> bytes;  // the message, check bytes stripped
    int32_t position = 0;        // the candidate's position (Dsss: group index)
    int32_t score_millis = 0;    // the candidate's score * 1000
  };

  struct DecodeResults {
    std::vector<TokenResult> tokens;
    // Diagnostics copied from the decoder when CRCs are checked.
    std::vector<float> detection_times;
    std::vector<float> detection_scores;
  };

  explicit AudioModemDecoder(std::unique_ptr<SorvaneDecoder> dsss_decoder);
  explicit AudioModemDecoder(std::unique_ptr<HotsoundDecoder> hotsound_decoder);
  explicit AudioModemDecoder(std::unique_ptr<DtmfDecoder> dtmf_decoder);

  // Once, after construction: the interleaved channel count and rate (Hz).
  void Initialize(int num_channels, float input_sample_rate);
  // Samples on the 16-bit scale (not normalised), channels interleaved.
  void ProcessSamples(std::span<const float> samples);
  // 16-bit samples on their own scale (1000 stays 1000.0), converted into a
  // buffer the decoder keeps, then as ProcessSamples.
  void ProcessPcm16(const int16_t* samples, int count);
  // Raw 16-bit samples for the hotsound kind; other kinds ignore them.
  void ProcessSamplesInt16(const int16_t* samples, int count);
  // Tokens of num_message_bytes + num_crc_check_bytes (0 or 2) bytes. With
  // CRCs, true if at least one token passed; without, true whenever the
  // decoder produced candidates.
  bool DecodeTokens(DecodeResults* decode_results, int num_message_bytes,
                    int num_crc_check_bytes);
  bool DetectBroadcaster();
  // Drops all buffered audio and state of the decoder.
  void WipeInternalData();
  // Samples one call can take without cutting into a buffered token.
  int GetMaxSafeInputSize() const;
  // The input has ended (a recording, a closed stream): feeds the half
  // second of digital silence the decoders need to finish a broadcast the
  // input ends with, since they score a frame only once they have heard a
  // few frames past it. The next DecodeTokens then hears that broadcast;
  // later input follows the silence.
  void FinishInput();

  Kind kind() const { return kind_; }
  int token_length_bytes() const { return token_length_bytes_; }

 private:
  std::unique_ptr<SorvaneDecoder> dsss_decoder_;
  std::unique_ptr<DtmfDecoder> dtmf_decoder_;
  std::unique_ptr<HotsoundDecoder> hotsound_decoder_;
  Kind kind_;
  int token_length_bytes_ = 0;
  int num_channels_ = 1;
  float input_sample_rate_ = 0.0f;
  std::vector<int16_t> int16_samples_;
  std::vector<float> float_samples_;
  audio_sorvane::DecodeResults raw_;  // the decoder's results, reused per request
  std::vector<TokenResult> spare_tokens_;  // results cut from earlier lists
};

}  // namespace audio_sorvane

#endif  // AUDIO_AUDIO_MODEM_DECODER_H_
