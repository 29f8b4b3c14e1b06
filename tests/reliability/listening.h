// Runs whole listening periods of the engine with the voice activity module
// on and the summing decoder behind it, and builds their audio from the
// shared corpus.
#ifndef KVASR_TESTS_RELIABILITY_LISTENING_H_
#define KVASR_TESTS_RELIABILITY_LISTENING_H_

#include <cstdint>
#include <string>
#include <vector>

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
  std::vector<summing_decoder::Segment> segments;  // final texts, in order
  std::vector<std::string> messages;               // every message, verbatim
  int failed_calls = 0;                            // process calls that returned false
};

// Initialises an engine on `model_dir`, starts it with `start_params`, feeds
// `audio` in chunks of `chunk` samples, stops and closes it.
Transcript Listen(const std::string& model_dir, const std::string& start_params,
                  const std::vector<int16_t>& audio, int chunk);


}  // namespace kvasr_reliability

#endif  // KVASR_TESTS_RELIABILITY_LISTENING_H_
