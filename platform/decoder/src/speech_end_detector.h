// SPDX-License-Identifier: Apache-2.0
// Turns the recogniser front end's running speech/silence state into the
// speech-end events of one utterance, with two time limits.
#ifndef KVASR_PLATFORM_DECODER_SPEECH_END_DETECTOR_H_
#define KVASR_PLATFORM_DECODER_SPEECH_END_DETECTOR_H_

#include <cstdint>

namespace kvasr::decoder {

class SpeechEndDetector {
 public:
  // `hangover_samples`: how much silence the front end needs before it
  // reports that speech stopped. Trailing limits shorter than that act as
  // the hangover itself.
  explicit SpeechEndDetector(int64_t hangover_samples) : hangover_samples_(hangover_samples) {}

  // `leading_samples` (0: none): silence from the utterance start after
  // which the utterance counts as empty. `trailing_samples`: silence after
  // speech that ends it.
  void SetLimits(int64_t leading_samples, int64_t trailing_samples) {
    leading_limit_samples_ = leading_samples;
    trailing_limit_samples_ = trailing_samples;
  }

  void Reset();

  // Accounts for `count` samples after which the front end reports
  // `in_speech`. Returns a KVASR_DECODER_SPEECH_END_* reason when speech end
  // is seen, else 0. Speech that resumes afterwards can end again; the
  // leading limit fires at most once per utterance.
  int Update(bool in_speech, int64_t count);

 private:
  enum class Phase { kAwaitingSpeech, kInSpeech, kTrailingSilence, kEnded };

  const int64_t hangover_samples_;
  int64_t leading_limit_samples_ = 0;
  int64_t trailing_limit_samples_ = 0;
  Phase phase_ = Phase::kAwaitingSpeech;
  int64_t silence_samples_ = 0;
};

}  // namespace kvasr::decoder

#endif  // KVASR_PLATFORM_DECODER_SPEECH_END_DETECTOR_H_
