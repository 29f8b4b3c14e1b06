// SPDX-License-Identifier: Apache-2.0
// Runs the voice activity pipeline over one recording, chunk by chunk as the
// engine feeds it, and records what it decided for every 10 ms frame.
#ifndef KVASR_TOOLS_KVASR_VAD_RUN_H_
#define KVASR_TOOLS_KVASR_VAD_RUN_H_

#include <cstdint>
#include <string>
#include <vector>

#include "audio_source.h"
#include "quellan.h"

namespace kvasr_cli {

struct VadFrame {
  float score;     // network score the frame carries
  float smoothed;  // smoothed score
  uint8_t energy_speech;
  uint8_t speech;   // the detector's decision
  uint8_t emitted;  // the frame lies in an emitted speech segment
};

struct VadSegment {
  int begin_frame;  // inclusive
  int end_frame;    // inclusive
};

struct VadRunResult {
  std::vector<VadFrame> frames;
  std::vector<VadSegment> segments;
  // The network's input rows, feat_dim floats per frame (only when asked).
  std::vector<float> features;
  int feat_dim = 0;
  // Running normalisation statistics summed over the calls, for the mean
  // table: divide by stat_calls.
  std::vector<double> running_mean_sum;
  std::vector<double> running_var_sum;
  int stat_calls = 0;
  std::vector<int16_t> samples;  // the whole recording, only when asked
};

struct VadRunOptions {
  int chunk_samples = 1600;
  bool keep_features = false;
  bool keep_samples = false;
};

// Feeds `source` to `pipe` as one utterance. False with `*error` set when
// the audio cannot be read or a chunk fails.
bool RunVad(Cquellan* pipe, AudioSource* source, const VadRunOptions& options, VadRunResult* result,
            std::string* error);

}  // namespace kvasr_cli

#endif  // KVASR_TOOLS_KVASR_VAD_RUN_H_
