// SPDX-License-Identifier: Apache-2.0
// The detector's network file: any bytes must load into a usable network or
// be refused with a message, and a loaded network must score a batch.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string>
#include <vector>

#include "fuzz_support.h"
#include "vad_dnn.h"

namespace {

constexpr int kRows = 3;

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string path = kvasr_fuzz::ScratchDir() + "/network";
  kvasr_fuzz::WriteFile(path, data, size);
  VadDnn* dnn = load_vaddnn_file(path.c_str());
  if (dnn == nullptr) return 0;

  // No context frames: one input row per feature row, whatever the width.
  if (set_vaddnn_params(dnn, kRows, 0, 0) != 0) std::abort();
  std::vector<float> priors(static_cast<size_t>(dnn->output_length) + 1, 0.5f);
  priors[0] = 0.0f;  // the ignored leading word
  const std::string priors_path = kvasr_fuzz::ScratchDir() + "/priors";
  kvasr_fuzz::WriteFile(priors_path, priors.data(), priors.size() * sizeof(float));
  if (load_vaddnn_state_weights(dnn, priors_path.c_str()) != 0) std::abort();

  const int width = dnn->input_length;
  std::vector<float> feat(static_cast<size_t>(kRows) * width);
  for (size_t i = 0; i < feat.size(); ++i) feat[i] = static_cast<float>(i % 17) - 8.0f;
  int rows = 0;
  if (set_vaddnn_feature(dnn, feat.data(), width, 0, 0, kRows - 1, kRows, 0, &rows) != 0 ||
      rows != kRows) {
    std::abort();
  }
  float score[kRows];
  const int scored = calc_vaddnn_prob(dnn, rows, score);
  // Only a single-class network may refuse to score.
  if (scored != rows && !(scored == -1 && dnn->output_length < 2)) std::abort();
  free_vaddnn(dnn);
  return 0;
}
