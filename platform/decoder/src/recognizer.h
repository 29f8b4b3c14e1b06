// SPDX-License-Identifier: Apache-2.0
// One streaming recogniser instance over PocketSphinx: utterances, partial
// and final results, and speech-end detection. What the handle of the mw*
// functions points to.
#ifndef KVASR_PLATFORM_DECODER_RECOGNIZER_H_
#define KVASR_PLATFORM_DECODER_RECOGNIZER_H_

#include <cstdint>
#include <memory>
#include <string>

#include "kvasr_decoder_api.h"
#include "manifest.h"
#include "speech_end_detector.h"

struct ps_decoder_s;

namespace kvasr::decoder {

class Recognizer {
 public:
  // Null (after a line on standard error) if the recogniser cannot be built.
  static std::unique_ptr<Recognizer> Create(const ModelSettings& settings);
  ~Recognizer();
  Recognizer(const Recognizer&) = delete;
  Recognizer& operator=(const Recognizer&) = delete;

  void SetSpeechEndDetection(bool enabled) { speech_end_enabled_ = enabled; }
  void SetAutoStop(bool enabled) { auto_stop_ = enabled; }
  // Both in milliseconds; see SpeechEndDetector::SetLimits.
  int SetSpeechEndLimits(int32_t leading_silence_ms, int32_t trailing_silence_ms);
  void SetOutHandle(void* out_handle) { out_handle_ = out_handle; }
  void SetOnResult(mw_result_callback callback) { on_result_ = callback; }
  void SetOnSpeechEnd(mw_speech_end_callback callback) { on_speech_end_ = callback; }

  // The int results are 0 or a KVASR_DECODER_ERR_* value.
  int Start();
  int Feed(const int16_t* samples, int64_t count, bool last);
  int Stop();

  // Destruction asked for from inside a callback waits until the call that
  // ran the callback returns; no callback runs in between.
  bool InCallback() const { return callback_depth_ > 0; }
  void RequestDestroy() { destroy_requested_ = true; }
  bool destroy_requested() const { return destroy_requested_; }

 private:
  Recognizer(ps_decoder_s* ps, int64_t frame_shift_samples, int64_t hangover_samples);

  int BeginUtterance();
  void FinishUtterance();
  void DeliverPartial();
  void DeliverResult(const char* text, float score, int flag);
  void DeliverSpeechEnd(int reason);
  float MeanWordPosterior();

  ps_decoder_s* const ps_;
  // Audio goes to the recogniser one frame shift at a time so that the
  // front end's speech state is seen at frame resolution.
  const int64_t frame_shift_samples_;
  SpeechEndDetector detector_;

  bool speech_end_enabled_ = false;
  bool auto_stop_ = false;
  void* out_handle_ = nullptr;
  mw_result_callback on_result_ = nullptr;
  mw_speech_end_callback on_speech_end_ = nullptr;

  bool utterance_active_ = false;
  std::string last_partial_;
  int callback_depth_ = 0;
  bool destroy_requested_ = false;
};

}  // namespace kvasr::decoder

#endif  // KVASR_PLATFORM_DECODER_RECOGNIZER_H_
