// SPDX-License-Identifier: Apache-2.0
#include "vad_dnn.h"

#include <sys/stat.h>

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <cstring>

#include "cpu_dispatch.h"
#include "quellan_log.h"

namespace {

constexpr char kDnnFlag[] = "MYDNN1";
constexpr int kDnnFlagBytes = 8;
constexpr float kScoreFloor = -1000.0f;
constexpr double kPosteriorFloor = 1e-7;
constexpr int kSpeechClass = 1;
constexpr int kNonSpeechClass = 0;

bool read_int32(FILE* f, int32_t* value) { return std::fread(value, sizeof(*value), 1, f) == 1; }

// Bytes between the read position and the end of a regular file; -1 when
// the file's size is not known.
int64_t bytes_left(FILE* f) {
  struct stat st;
  const long at = std::ftell(f);
  if (fstat(fileno(f), &st) != 0 || !S_ISREG(st.st_mode) || at < 0) return -1;
  return std::max<int64_t>(0, static_cast<int64_t>(st.st_size) - at);
}

bool all_finite(const float* values, size_t count) {
  for (size_t i = 0; i < count; ++i) {
    if (!std::isfinite(values[i])) return false;
  }
  return true;
}

void release_layers(VadDnn* dnn) {
  if (dnn->layers == nullptr) return;
  for (int i = 0; i < dnn->layers_num; ++i) {
    std::free(dnn->layers[i].bias);
    std::free(dnn->layers[i].weights);
    std::free(dnn->layers[i].output_buffer);
  }
  std::free(dnn->layers);
  dnn->layers = nullptr;
}

// Outputs summed side by side: a block of this many runs through the inputs
// together, which vectorises while each output still adds its terms in
// ascending input order. One block spans the shipped hidden layer, so its
// independent sums hide each other's addition latency.
constexpr int kOutputBlock = 64;

// out[r][j] = alpha * sum_k w[k][j] * in[r][k] + beta * out[r][j]
// Built twice, for AVX and for the baseline: wider lanes, the same sums in
// the same order.
__attribute__((always_inline)) inline void layer_product_body(const float* in, int rows, int in_dim,
                                                              const float* weights, int out_dim,
                                                              float alpha, float beta, float* out) {
  for (int r = 0; r < rows; ++r) {
    const float* in_row = in + static_cast<size_t>(r) * in_dim;
    float* out_row = out + static_cast<size_t>(r) * out_dim;
    for (int j0 = 0; j0 < out_dim; j0 += kOutputBlock) {
      const int width = out_dim - j0 < kOutputBlock ? out_dim - j0 : kOutputBlock;
      float sum[kOutputBlock] = {};
      if (width == kOutputBlock) {
        for (int k = 0; k < in_dim; ++k) {
          const float* w = weights + static_cast<size_t>(k) * out_dim + j0;
          const float x = in_row[k];
          for (int j = 0; j < kOutputBlock; ++j) sum[j] += w[j] * x;
        }
      } else {
        for (int k = 0; k < in_dim; ++k) {
          const float* w = weights + static_cast<size_t>(k) * out_dim + j0;
          const float x = in_row[k];
          for (int j = 0; j < width; ++j) sum[j] += w[j] * x;
        }
      }
      for (int j = 0; j < width; ++j) {
        out_row[j0 + j] = alpha * sum[j] + beta * out_row[j0 + j];
      }
    }
  }
}

__attribute__((target("avx"))) void layer_product_avx(const float* in, int rows, int in_dim,
                                                      const float* weights, int out_dim,
                                                      float alpha, float beta, float* out) {
  layer_product_body(in, rows, in_dim, weights, out_dim, alpha, beta, out);
}

void layer_product_baseline(const float* in, int rows, int in_dim, const float* weights,
                            int out_dim, float alpha, float beta, float* out) {
  layer_product_body(in, rows, in_dim, weights, out_dim, alpha, beta, out);
}

void layer_product(const float* in, int rows, int in_dim, const float* weights, int out_dim,
                   float alpha, float beta, float* out) {
  if (kvasr_common::HasAvx()) {
    return layer_product_avx(in, rows, in_dim, weights, out_dim, alpha, beta, out);
  }
  layer_product_baseline(in, rows, in_dim, weights, out_dim, alpha, beta, out);
}

void fill_bias(const VadDnnLayer& layer, int rows) {
  for (int r = 0; r < rows; ++r) {
    std::memcpy(layer.output_buffer + static_cast<size_t>(r) * layer.output_dim, layer.bias,
                sizeof(float) * layer.output_dim);
  }
}

}  // namespace

VadDnn* load_vaddnn_file(const char* name) {
  if (name == nullptr || name[0] == '\0') {
    QUELLAN_WARN("dnnName is NULL in load_dnnfile\n\n");
    return nullptr;
  }
  VadDnn* dnn = static_cast<VadDnn*>(std::calloc(1, sizeof(VadDnn)));
  if (dnn == nullptr) {
    QUELLAN_WARN("Failed to alloc memory for dnn in load_dnnfile\n\n");
    return nullptr;
  }
  FILE* f = std::fopen(name, "rb");
  if (f == nullptr) {
    QUELLAN_WARN("Failed to open file:%s\n\n", name);
    free_vaddnn(dnn);
    return nullptr;
  }
  bool ok = false;
  char flag[kDnnFlagBytes + 1] = {};
  int32_t hidden_layers = 0;
  if (std::fread(flag, 1, kDnnFlagBytes, f) != kDnnFlagBytes ||
      std::strncmp(flag, kDnnFlag, kDnnFlagBytes) != 0) {
    QUELLAN_WARN("Failed to load DNN_FLAG from file[%s], flag[%s]\n\n", name, flag);
  } else if (!read_int32(f, &dnn->input_length) || dnn->input_length < 1 ||
             dnn->input_length > kVadDnnMaxLayerDim) {
    QUELLAN_WARN("Failed to load input_length from file[%s]\n\n", name);
  } else if (!read_int32(f, &dnn->output_length) || dnn->output_length < 1 ||
             dnn->output_length > kVadDnnMaxLayerDim) {
    QUELLAN_WARN("Failed to load output_length from file[%s]\n\n", name);
  } else if (!read_int32(f, &hidden_layers) || hidden_layers < 0 ||
             hidden_layers > kVadDnnMaxHiddenLayers) {
    QUELLAN_WARN("Failed to load layers_num from file[%s]\n\n", name);
  } else {
    ok = true;
    for (int i = 0; i < hidden_layers && ok; ++i) {
      ok = read_int32(f, &dnn->hidden_node_array[i]) && dnn->hidden_node_array[i] >= 1 &&
           dnn->hidden_node_array[i] <= kVadDnnMaxLayerDim;
    }
    if (!ok) {
      QUELLAN_WARN("Failed to load hidden_node_array from file[%s]\n\n", name);
    }
  }
  if (ok) {
    dnn->layers_num = hidden_layers + 1;
    if (load_all_dnn_layers(dnn, f) != 0) {
      QUELLAN_WARN("Failed to load all dnn layers in load_dnnfile\n\n");
      ok = false;
    }
  }
  std::fclose(f);
  if (!ok) {
    free_vaddnn(dnn);
    return nullptr;
  }
  return dnn;
}

int load_all_dnn_layers(VadDnn* dnn, FILE* f) {
  if (dnn == nullptr || f == nullptr || dnn->layers_num < 1) {
    QUELLAN_WARN("Illegal params in load_all_dnn_layers\n\n");
    return -1;
  }
  release_layers(dnn);
  dnn->layers = static_cast<VadDnnLayer*>(std::calloc(dnn->layers_num, sizeof(VadDnnLayer)));
  if (dnn->layers == nullptr) {
    QUELLAN_WARN("Failed to alloc memory for dnn->layers in load_all_dnn_layers\n\n");
    return -1;
  }
  const int last = dnn->layers_num - 1;
  // Dimensions within their bounds can still ask for gigabytes; a file too
  // short to hold them is refused before anything that large is allocated.
  int64_t left = bytes_left(f);
  for (int i = 0; i <= last; ++i) {
    // Without hidden layers the single layer maps the input straight to the
    // classes.
    dnn->layers[i].input_dim = i == 0 ? dnn->input_length : dnn->hidden_node_array[i - 1];
    dnn->layers[i].output_dim = i == last ? dnn->output_length : dnn->hidden_node_array[i];
  }
  for (int i = 0; i <= last; ++i) {
    VadDnnLayer& layer = dnn->layers[i];
    const size_t weight_count = static_cast<size_t>(layer.input_dim) * layer.output_dim;
    if (left >= 0) {
      const int64_t bias_bytes = static_cast<int64_t>(sizeof(float)) * layer.output_dim;
      const int64_t weight_bytes = static_cast<int64_t>(sizeof(float) * weight_count);
      if (left < bias_bytes || left - bias_bytes < weight_bytes) {
        QUELLAN_WARN("Failed to load layers[%d].%s in load_all_dnn_layers\n\n", i,
                     left < bias_bytes ? "bias" : "weights");
        release_layers(dnn);
        return -1;
      }
      left -= bias_bytes + weight_bytes;
    }
    layer.bias = static_cast<float*>(std::malloc(sizeof(float) * layer.output_dim));
    if (layer.bias == nullptr) {
      QUELLAN_WARN(
          "Failed to alloc memory for layers[%d].bias in "
          "load_all_dnn_layers\n\n",
          i);
      release_layers(dnn);
      return -1;
    }
    layer.weights = static_cast<float*>(std::malloc(sizeof(float) * weight_count));
    if (layer.weights == nullptr) {
      release_layers(dnn);
      return -1;
    }
    if (std::fread(layer.bias, sizeof(float), layer.output_dim, f) !=
        static_cast<size_t>(layer.output_dim)) {
      QUELLAN_WARN("Failed to load layers[%d].bias in load_all_dnn_layers\n\n", i);
      release_layers(dnn);
      return -1;
    }
    if (std::fread(layer.weights, sizeof(float), weight_count, f) != weight_count) {
      QUELLAN_WARN("Failed to load layers[%d].weights in load_all_dnn_layers\n\n", i);
      release_layers(dnn);
      return -1;
    }
    // A NaN or infinity would silently turn every score into NaN, which
    // never counts as speech.
    if (!all_finite(layer.bias, layer.output_dim) || !all_finite(layer.weights, weight_count)) {
      QUELLAN_WARN(
          "layers[%d] holds a value that is not a finite number in "
          "load_all_dnn_layers\n\n",
          i);
      release_layers(dnn);
      return -1;
    }
  }
  return 0;
}

int load_vaddnn_state_weights(VadDnn* dnn, const char* name) {
  if (dnn == nullptr) {
    QUELLAN_WARN("Illegal params in load_state_weights\n\n");
    return -1;
  }
  FILE* f = name == nullptr ? nullptr : std::fopen(name, "rb");
  if (f == nullptr) {
    QUELLAN_WARN("Failed to open file %s for reading\n", name == nullptr ? "(null)" : name);
    return -1;
  }
  std::free(dnn->state_weights);
  dnn->state_weights = static_cast<float*>(std::malloc(sizeof(float) * dnn->output_length));
  if (dnn->state_weights == nullptr) {
    QUELLAN_WARN("Failed to alloc memory for state_weights\n\n");
    std::fclose(f);
    return -1;
  }
  int32_t unused_header = 0;
  if (!read_int32(f, &unused_header) ||
      std::fread(dnn->state_weights, sizeof(float), dnn->output_length, f) !=
          static_cast<size_t>(dnn->output_length)) {
    QUELLAN_WARN("Failed to load state_weights\n\n");
    std::free(dnn->state_weights);
    dnn->state_weights = nullptr;
    std::fclose(f);
    return -1;
  }
  std::fclose(f);
  // Posteriors are divided by the priors: only positive finite ones give
  // finite scores.
  for (int j = 0; j < dnn->output_length; ++j) {
    if (!(dnn->state_weights[j] > 0.0f) || !std::isfinite(dnn->state_weights[j])) {
      QUELLAN_WARN("state_weights[%d] is not a positive finite number\n\n", j);
      std::free(dnn->state_weights);
      dnn->state_weights = nullptr;
      return -1;
    }
  }
  return 0;
}

int set_vaddnn_params(VadDnn* dnn, int max_frames, int start_offset, int end_offset) {
  if (dnn == nullptr || dnn->layers == nullptr || max_frames < 0 || start_offset < 0 ||
      end_offset < 0) {
    QUELLAN_WARN("Illegal params in set_dnn_params.\n\n");
    return -1;
  }
  dnn->max_frames = max_frames;
  dnn->start_offset = start_offset;
  dnn->end_offset = end_offset;
  const int64_t window_frames = 1 + static_cast<int64_t>(start_offset) + end_offset;
  if (dnn->input_length % window_frames != 0) {
    QUELLAN_WARN("input length is not compatible with offset\n\n");
    return -1;
  }
  dnn->feat_dim = static_cast<int32_t>(dnn->input_length / window_frames);
  std::free(dnn->input_buffer);
  dnn->input_buffer = static_cast<float*>(
      std::calloc(static_cast<size_t>(max_frames) * dnn->input_length, sizeof(float)));
  if (dnn->input_buffer == nullptr) {
    QUELLAN_WARN("Failed to alloc memory for input_buffer\n\n");
    return -1;
  }
  for (int i = 0; i < dnn->layers_num; ++i) {
    VadDnnLayer& layer = dnn->layers[i];
    std::free(layer.output_buffer);
    layer.output_buffer = static_cast<float*>(
        std::calloc(static_cast<size_t>(max_frames) * layer.output_dim, sizeof(float)));
    if (layer.output_buffer == nullptr) {
      QUELLAN_WARN("Failed to alloc memory for output_buffer for layer[%d]\n\n", i);
      return -1;
    }
  }
  return 0;
}

int set_vaddnn_feature(VadDnn* dnn, const float* feat, int feat_dim, int t0, int first, int last,
                       int total, int skip, int* rows) {
  if (dnn == nullptr || feat == nullptr || rows == nullptr || feat_dim < 1 || total < 1 ||
      skip < 0 || dnn->input_buffer == nullptr) {
    // compat: "Invalide" is the established spelling of this message; hosts match the text.
    QUELLAN_WARN("Invalide input arguments.\n");
    return -1;
  }
  const int64_t spliced_length =
      static_cast<int64_t>(feat_dim) * (1 + dnn->start_offset + dnn->end_offset);
  if (spliced_length != dnn->input_length) {
    QUELLAN_WARN(
        "feat_dim*(1+dnn->start_offset+dnn->end_offset)[%d] not equal to dnn "
        "model [%d]\n",
        static_cast<int>(spliced_length), dnn->input_length);
    return -1;
  }
  int r = 0;
  for (int t = t0; t >= first && t <= last; t += skip + 1) {
    if (r >= dnn->max_frames) {
      QUELLAN_WARN("Too many rows[%d] for max_frames[%d].\n", r + 1, dnn->max_frames);
      return -1;
    }
    float* row = dnn->input_buffer + static_cast<size_t>(r) * dnn->input_length;
    for (int k = t - dnn->start_offset; k <= t + dnn->end_offset; ++k) {
      const int source = k < 0 ? 0 : (k > total - 1 ? total - 1 : k);
      std::memcpy(row + static_cast<size_t>(k - t + dnn->start_offset) * feat_dim,
                  feat + static_cast<size_t>(source) * feat_dim, sizeof(float) * feat_dim);
    }
    ++r;
  }
  *rows = r;
  return 0;
}

int calc_vaddnn_prob(VadDnn* dnn, int rows, float* score) {
  if (dnn == nullptr || rows <= 0 || score == nullptr || rows > dnn->max_frames ||
      dnn->input_buffer == nullptr || dnn->state_weights == nullptr) {
    // compat: "Invalide" is the established spelling of this message; hosts match the text.
    QUELLAN_WARN("Invalide input arguments.\n");
    return -1;
  }
  if (dnn->output_length < 2) {
    QUELLAN_WARN("DNN output length[%d] is <= 1\n", dnn->output_length);
    return -1;
  }
  const float* input = dnn->input_buffer;
  const int last = dnn->layers_num - 1;
  for (int i = 0; i < last; ++i) {
    const VadDnnLayer& layer = dnn->layers[i];
    fill_bias(layer, rows);
    layer_product(input, rows, layer.input_dim, layer.weights, layer.output_dim, -1.0f, -1.0f,
                  layer.output_buffer);
    const size_t count = static_cast<size_t>(rows) * layer.output_dim;
    for (size_t n = 0; n < count; ++n) {
      // The buffer holds -(xW + b), so this is the logistic of xW + b.
      const float v = layer.output_buffer[n];
      layer.output_buffer[n] = static_cast<float>(1.0 / (1.0 + static_cast<double>(std::exp(v))));
    }
    input = layer.output_buffer;
  }
  const VadDnnLayer& out = dnn->layers[last];
  fill_bias(out, rows);
  layer_product(input, rows, out.input_dim, out.weights, out.output_dim, 1.0f, 1.0f,
                out.output_buffer);
  for (int r = 0; r < rows; ++r) {
    float* row = out.output_buffer + static_cast<size_t>(r) * out.output_dim;
    float sum = 0.0f;
    for (int j = 0; j < out.output_dim; ++j) {
      row[j] = std::exp(row[j]);
      sum += row[j];
    }
    for (int j = 0; j < out.output_dim; ++j) {
      const float posterior = row[j] / sum / dnn->state_weights[j];
      row[j] = static_cast<float>(std::log(static_cast<double>(posterior) + kPosteriorFloor));
    }
    const float speech = row[kSpeechClass] < kScoreFloor ? kScoreFloor : row[kSpeechClass];
    const float non_speech =
        row[kNonSpeechClass] < kScoreFloor ? kScoreFloor : row[kNonSpeechClass];
    score[r] = speech - non_speech;
  }
  return rows;
}

void free_vaddnn(VadDnn* dnn) {
  if (dnn == nullptr) return;
  release_layers(dnn);
  std::free(dnn->input_buffer);
  std::free(dnn->state_weights);
  std::free(dnn);
}
