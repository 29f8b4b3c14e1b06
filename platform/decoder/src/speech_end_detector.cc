// SPDX-License-Identifier: Apache-2.0
#include "speech_end_detector.h"

#include "kvasr_decoder_constants.h"

namespace kvasr::decoder {

void SpeechEndDetector::Reset() {
  phase_ = Phase::kAwaitingSpeech;
  silence_samples_ = 0;
}

int SpeechEndDetector::Update(bool in_speech, int64_t count) {
  if (in_speech) {
    phase_ = Phase::kInSpeech;
    return 0;
  }
  switch (phase_) {
    case Phase::kAwaitingSpeech:
      silence_samples_ += count;
      if (leading_limit_samples_ > 0 && silence_samples_ >= leading_limit_samples_) {
        phase_ = Phase::kEnded;
        return KVASR_DECODER_SPEECH_END_NO_SPEECH;
      }
      return 0;
    case Phase::kInSpeech:
      // The front end has just heard its hangover's worth of silence.
      phase_ = Phase::kTrailingSilence;
      silence_samples_ = hangover_samples_;
      break;
    case Phase::kTrailingSilence: silence_samples_ += count; break;
    case Phase::kEnded: return 0;
  }
  if (silence_samples_ >= trailing_limit_samples_) {
    phase_ = Phase::kEnded;
    return KVASR_DECODER_SPEECH_END_SILENCE;
  }
  return 0;
}

}  // namespace kvasr::decoder
