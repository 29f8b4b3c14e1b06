// SPDX-License-Identifier: Apache-2.0
// Whole listening periods of the engine with the voice activity module on and
// the summing decoder behind it, and their audio from the shared corpus.
#ifndef KVASR_TESTS_RELIABILITY_LISTENING_H_
#define KVASR_TESTS_RELIABILITY_LISTENING_H_

#include <cstdint>
#include <string>
#include <vector>

#include "offline_asr_engine_impl.h"
#include "summing_decoder.h"

namespace kvasr_reliability {

constexpr int kSamplesPerSecond = 16000;

// Speech clips of the corpus, by path relative to it; empty when a clip is
// missing (callers skip).
std::vector<std::vector<int16_t>> LoadClips(const std::vector<std::string>& relative_paths);

// Quiet room noise (a few units of amplitude, below the energy gate) of the
// given length; `seed` varies it.
std::vector<int16_t> QuietNoise(size_t samples, uint32_t seed);

// Everything the host saw of one listening period.
struct Transcript {
  std::vector<int64_t> segment_samples;  // of each final text, in order
  std::vector<std::string> messages;     // every message, verbatim
};

// An engine initialised on `model_dir` and started with `start_params`;
// throws std::runtime_error when either fails.
class Listener {
 public:
  Listener(const std::string& model_dir, const std::string& start_params);
  // Feeds `audio` in chunks of `chunk` samples; returns how many were refused.
  int Feed(const std::vector<int16_t>& audio, int chunk);
  const Transcript& transcript() const { return transcript_; }
  // Stops and closes the engine, which may deliver a last final text.
  Transcript Finish();

 private:
  vorta::speech::OfflineAsrEngineImpl engine_;
  Transcript transcript_;
};

}  // namespace kvasr_reliability

#endif  // KVASR_TESTS_RELIABILITY_LISTENING_H_
