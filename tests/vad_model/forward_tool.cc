// SPDX-License-Identifier: Apache-2.0
// Scores feature rows with the module's network code, for comparison with
// the trainer's own forward pass.
//
//   vad_forward_tool MODEL_DIR ROWS.f32 OUT.f32
//
// ROWS holds 39 floats per frame of one utterance; every frame is spliced
// with its context (edge rows repeated) and scored; OUT gets one float32
// score per frame.
#include <cstdio>
#include <fstream>
#include <iterator>
#include <memory>
#include <string>
#include <vector>

#include "vad_dnn.h"

namespace {

constexpr int kFeatDim = 39;
constexpr int kLeftContextFrames = 5;
constexpr int kRightContextFrames = 5;

struct DnnCloser {
  void operator()(VadDnn* dnn) const { free_vaddnn(dnn); }
};

}  // namespace

int main(int argc, char** argv) {
  if (argc != 4) {
    std::fputs("usage: vad_forward_tool MODEL_DIR ROWS.f32 OUT.f32\n", stderr);
    return 2;
  }
  const std::string dir = argv[1];
  std::ifstream in(argv[2], std::ios::binary);
  const std::string bytes((std::istreambuf_iterator<char>(in)), {});
  const int frames = static_cast<int>(bytes.size() / (sizeof(float) * kFeatDim));
  if (frames < 1) {
    std::fprintf(stderr, "no rows in %s\n", argv[2]);
    return 1;
  }
  std::vector<float> rows(static_cast<size_t>(frames) * kFeatDim);
  std::copy(bytes.data(), bytes.data() + rows.size() * sizeof(float),
            reinterpret_cast<char*>(rows.data()));

  std::unique_ptr<VadDnn, DnnCloser> dnn(load_vaddnn_file((dir + "/quellan_data_b").c_str()));
  int spliced = 0;
  std::vector<float> scores(frames);
  if (!dnn || set_vaddnn_params(dnn.get(), frames, kLeftContextFrames, kRightContextFrames) != 0 ||
      load_vaddnn_state_weights(dnn.get(), (dir + "/quellan_data_c").c_str()) != 0 ||
      set_vaddnn_feature(dnn.get(), rows.data(), kFeatDim, 0, 0, frames - 1, frames, 0, &spliced) !=
          0 ||
      spliced != frames || calc_vaddnn_prob(dnn.get(), frames, scores.data()) != frames) {
    std::fprintf(stderr, "the module could not score %s with %s\n", argv[2], dir.c_str());
    return 1;
  }
  std::ofstream out(argv[3], std::ios::binary | std::ios::trunc);
  out.write(reinterpret_cast<const char*>(scores.data()),
            static_cast<std::streamsize>(scores.size() * sizeof(float)));
  return out.good() ? 0 : 1;
}
