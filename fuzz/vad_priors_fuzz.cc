// SPDX-License-Identifier: Apache-2.0
// The detector's class-prior file, read against a fixed small network; the
// network then scores a batch with whatever priors were accepted.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string>
#include <vector>

#include "fuzz_support.h"
#include "vad_dnn.h"

namespace {

constexpr int kWidth = 4;
constexpr int kClasses = 3;
constexpr int kRows = 2;

// A 4-input, 3-class network without hidden layers.
VadDnn* LoadNetwork() {
  std::vector<int32_t> head = {kWidth, kClasses, 0};
  std::string bytes("MYDNN1\0\0", 8);
  bytes.append(reinterpret_cast<const char*>(head.data()), head.size() * sizeof(int32_t));
  std::vector<float> values(kClasses + kWidth * kClasses);
  for (size_t i = 0; i < values.size(); ++i) values[i] = 0.25f * static_cast<float>(i % 5) - 0.5f;
  bytes.append(reinterpret_cast<const char*>(values.data()), values.size() * sizeof(float));
  const std::string path = kvasr_fuzz::ScratchDir() + "/network";
  kvasr_fuzz::WriteFile(path, bytes.data(), bytes.size());
  VadDnn* dnn = load_vaddnn_file(path.c_str());
  if (dnn == nullptr || set_vaddnn_params(dnn, kRows, 0, 0) != 0) std::abort();
  return dnn;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static VadDnn* const dnn = LoadNetwork();
  const std::string path = kvasr_fuzz::ScratchDir() + "/priors";
  kvasr_fuzz::WriteFile(path, data, size);
  if (load_vaddnn_state_weights(dnn, path.c_str()) != 0) {
    if (dnn->state_weights != nullptr) std::abort();  // a refusal keeps nothing
    return 0;
  }
  const float feat[kRows * kWidth] = {1, -2, 3, -4, 0.5f, 0, -0.5f, 8};
  int rows = 0;
  float score[kRows];
  if (set_vaddnn_feature(dnn, feat, kWidth, 0, 0, kRows - 1, kRows, 0, &rows) != 0 ||
      calc_vaddnn_prob(dnn, rows, score) != kRows) {
    std::abort();
  }
  return 0;
}
