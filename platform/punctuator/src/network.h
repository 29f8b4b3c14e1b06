// SPDX-License-Identifier: Apache-2.0
// The punctuation and casing network: word and subword embeddings, dilated
// convolutions, an optional bidirectional GRU and two linear heads. Weights
// come from the model file (format in ../README.md).
#ifndef KVASR_PUNCTUATOR_NETWORK_H_
#define KVASR_PUNCTUATOR_NETWORK_H_

#include <cstdint>
#include <string>
#include <vector>

namespace kvasr {
namespace punct {

struct NetworkShape {
  std::string lang;
  uint32_t vocab = 0;
  uint32_t pieces = 0;
  uint32_t dim = 0;
  uint32_t convs = 0;
  uint32_t channels = 0;
  uint32_t kernel = 0;
  uint32_t hidden = 0;
  uint32_t punct_classes = 0;
  uint32_t case_classes = 0;
  uint32_t max_word_bytes = 0;
  uint32_t max_pieces = 0;
  uint32_t window_step = 0;
  uint32_t window_context = 0;
};

// Input of one word: its vocabulary id and its subword ids.
struct WordInput {
  int32_t id = 0;
  int32_t piece_count = 0;
  const int32_t* pieces = nullptr;
};

class Network {
 public:
  // False with a reason in `error` when the file is missing, truncated,
  // corrupt or of another format version.
  bool Load(const std::string& path, std::string* error);

  const NetworkShape& shape() const { return shape_; }
  // Words one Forward call can take.
  int max_window() const {
    return static_cast<int>(shape_.window_step + 2 * shape_.window_context);
  }

  // Logits for `n` <= max_window() words, row-major: punct [n][punct_classes],
  // casing [n][case_classes]. Uses only buffers sized by Load.
  void Forward(const WordInput* words, int n, float* punct, float* casing);

 private:
  struct Gru {
    // [input][gate], gates r, z, n as stored, padded to the gate strides.
    std::vector<float> w_ih, w_hh, b_ih, b_hh;
  };

  void Embed(const WordInput* words, int n);
  void Convolve(int layer, int n);
  void RunGru(const Gru& gru, int n, bool reverse, int out_offset);

  NetworkShape shape_;
  std::vector<float> word_emb_, piece_emb_;
  // Per layer, [kernel tap][input channel][output channel], so a tap is a
  // row of multiply-adds over contiguous outputs; outputs padded to
  // conv_stride_ (the GRU's to its two gate strides) so products run in
  // whole tiles.
  std::vector<std::vector<float>> conv_w_, conv_b_;
  size_t conv_stride_ = 0, input_gate_stride_ = 0, state_gate_stride_ = 0;
  Gru forward_, backward_;
  std::vector<float> punct_w_, punct_b_, case_w_, case_b_;

  std::vector<float> act_a_, act_b_, zeros_, feat_, gates_x_, gates_h_, state_;
};

}  // namespace punct
}  // namespace kvasr

#endif  // KVASR_PUNCTUATOR_NETWORK_H_
