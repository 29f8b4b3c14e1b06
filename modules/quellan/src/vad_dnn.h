// SPDX-License-Identifier: Apache-2.0
// Feed-forward network that scores spliced feature windows as speech or
// non-speech, read from a flagged binary file and a class-prior file.
#ifndef QUELLAN_VAD_DNN_H_
#define QUELLAN_VAD_DNN_H_

#include <cstdint>
#include <cstdio>

constexpr int kVadDnnMaxHiddenLayers = 16;
// Bounds any one layer dimension so that buffer sizes cannot overflow.
constexpr int kVadDnnMaxLayerDim = 1 << 16;

struct VadDnnLayer {
  int32_t input_dim;
  int32_t output_dim;
  float* bias;           // output_dim
  float* weights;        // input_dim x output_dim, input-major
  float* output_buffer;  // max_frames x output_dim
};

struct VadDnn {
  int32_t max_frames;
  int32_t start_offset;
  int32_t end_offset;
  int32_t feat_dim;
  int32_t input_length;
  int32_t output_length;
  float* input_buffer;   // max_frames x input_length
  float* state_weights;  // output_length class priors
  int32_t layers_num;
  VadDnnLayer* layers;
  int32_t hidden_node_array[kVadDnnMaxHiddenLayers];
};

// Returns the network or null (the reason is printed).
VadDnn* load_vaddnn_file(const char* name);
int load_all_dnn_layers(VadDnn* dnn, FILE* f);
int load_vaddnn_state_weights(VadDnn* dnn, const char* name);
int set_vaddnn_params(VadDnn* dnn, int max_frames, int start_offset, int end_offset);
// Splices the context window of every (skip + 1)-th frame from t0 while it
// lies in [first, last]; rows outside [0, total) repeat the edge row.
int set_vaddnn_feature(VadDnn* dnn, const float* feat, int feat_dim, int t0, int first, int last,
                       int total, int skip, int* rows);
// Writes one score per spliced row: log posterior of speech minus log
// posterior of non-speech, both divided by their priors. Returns rows.
int calc_vaddnn_prob(VadDnn* dnn, int rows, float* score);
void free_vaddnn(VadDnn* dnn);

#endif  // QUELLAN_VAD_DNN_H_
