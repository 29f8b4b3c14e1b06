// SPDX-License-Identifier: Apache-2.0
#include "network.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <fstream>
#include <iterator>

#include "cpu_dispatch.h"

namespace kvasr {
namespace punct {
namespace {

constexpr char kMagic[8] = {'K', 'V', 'P', 'U', 'N', 'C', 'T', '\0'};
constexpr uint32_t kFormatVersion = 1;
constexpr size_t kHeaderFields = 13;
constexpr size_t kHeaderBytes = sizeof(kMagic) + 4 + 4 + 4 * kHeaderFields;
constexpr size_t kChecksumBytes = 4;
// Bounds that no sensible model exceeds; they keep a corrupt header from
// asking for absurd allocations.
constexpr uint32_t kMaxVocab = 4u << 20;
constexpr uint32_t kMaxWidth = 4096;
constexpr uint32_t kMaxLayers = 16;
constexpr uint32_t kMaxKernel = 15;
constexpr uint32_t kMaxWindow = 4096;
constexpr uint32_t kMaxWordBytes = 1024;

uint32_t ReadU32(const unsigned char* p) {
  return static_cast<uint32_t>(p[0]) | static_cast<uint32_t>(p[1]) << 8 |
         static_cast<uint32_t>(p[2]) << 16 | static_cast<uint32_t>(p[3]) << 24;
}

uint32_t Fnv1a(const unsigned char* data, size_t n) {
  uint32_t h = 0x811C9DC5u;
  for (size_t i = 0; i < n; ++i) h = (h ^ data[i]) * 0x01000193u;
  return h;
}

float HalfToFloat(uint16_t h) {
  const uint32_t sign = static_cast<uint32_t>(h & 0x8000u) << 16;
  const uint32_t exp = (h >> 10) & 0x1Fu;
  const uint32_t mant = h & 0x3FFu;
  float magnitude;
  if (exp == 0) {
    magnitude = std::ldexp(static_cast<float>(mant), -24);
  } else if (exp == 0x1F) {
    magnitude = mant ? NAN : INFINITY;
  } else {
    magnitude = std::ldexp(static_cast<float>(mant | 0x400u), static_cast<int>(exp) - 25);
  }
  return sign ? -magnitude : magnitude;
}

// Reads float16 values in file order.
class HalfReader {
 public:
  explicit HalfReader(const unsigned char* p) : p_(p) {}

  std::vector<float> Take(size_t count) {
    std::vector<float> v(count);
    for (size_t i = 0; i < count; ++i, p_ += 2)
      v[i] = HalfToFloat(static_cast<uint16_t>(p_[0] | p_[1] << 8));
    return v;
  }

 private:
  const unsigned char* p_;
};

// Lanes of floats: eight for the AVX2 build (one register), four for the
// baseline (one SSE register).
typedef float Lanes8 __attribute__((vector_size(8 * sizeof(float))));
typedef float Lanes4 __attribute__((vector_size(4 * sizeof(float))));

// Rows computed together: each weight vector loaded serves all of them.
constexpr int kTimeBlock = 4;
// Outputs per tile, chosen so a tile's sums fill about half the vector
// registers (4 rows x 2 AVX registers; 4 x 2 SSE); the recurrent product has
// a single row and takes wider tiles to keep enough sums in flight.
constexpr size_t kRowsOutBlock = 16;
constexpr size_t kRowsOutBlockBaseline = 8;
constexpr size_t kStateOutBlock = 64;
constexpr size_t kStateOutBlockBaseline = 32;

// out[r][o] = bias[o] + sum over parts p and inputs i of
// in[r * parts + p][i] * w[(p * cin + i) * stride + o], for o < cout. A part
// is a convolution tap (one part for a plain matrix product). Weights and
// bias are padded with zeros to `stride`, a multiple of kOut, so every tile
// is whole.
template <typename V, int kRows, size_t kOut>
__attribute__((always_inline)) inline void ProductTiles(const float* const* in, int parts,
                                                        size_t cin, const float* w, size_t stride,
                                                        const float* bias, size_t cout,
                                                        float* const* out) {
  constexpr size_t kLanes = sizeof(V) / sizeof(float);
  constexpr size_t kVectors = kOut / kLanes;
  for (size_t o0 = 0; o0 < cout; o0 += kOut) {
    // Fully unrolled so the sums live in registers, not on the stack;
    // memcpy is the unaligned load (weights and biases are float-aligned).
    V acc[kRows][kVectors];
#pragma GCC unroll 8
    for (int r = 0; r < kRows; ++r)
#pragma GCC unroll 8
      for (size_t v = 0; v < kVectors; ++v)
        std::memcpy(&acc[r][v], bias + o0 + v * kLanes, sizeof(V));
    for (int p = 0; p < parts; ++p) {
      const float* wp = w + static_cast<size_t>(p) * cin * stride + o0;
      for (size_t i = 0; i < cin; ++i) {
        const float* wi = wp + i * stride;
#pragma GCC unroll 8
        for (int r = 0; r < kRows; ++r) {
          const float a = in[r * parts + p][i];
#pragma GCC unroll 8
          for (size_t v = 0; v < kVectors; ++v) {
            V wv;
            std::memcpy(&wv, wi + v * kLanes, sizeof wv);
            acc[r][v] += a * wv;
          }
        }
      }
    }
    const size_t width = std::min(kOut, cout - o0);
    for (int r = 0; r < kRows; ++r)
      std::copy_n(reinterpret_cast<const float*>(acc[r]), width, out[r] + o0);
  }
}

__attribute__((target("avx2,fma"))) void RowsProductAvx2(const float* const* in, int parts,
                                                         size_t cin, const float* w, size_t stride,
                                                         const float* bias, size_t cout,
                                                         float* const* out) {
  ProductTiles<Lanes8, kTimeBlock, kRowsOutBlock>(in, parts, cin, w, stride, bias, cout, out);
}

__attribute__((target("avx2,fma"))) void StateProductAvx2(const float* in, size_t cin,
                                                          const float* w, size_t stride,
                                                          const float* bias, size_t cout,
                                                          float* out) {
  ProductTiles<Lanes8, 1, kStateOutBlock>(&in, 1, cin, w, stride, bias, cout, &out);
}

void RowsProduct(const float* const* in, int parts, size_t cin, const float* w, size_t stride,
                 const float* bias, size_t cout, float* const* out) {
  if (kvasr_common::HasAvx2Fma()) {
    return RowsProductAvx2(in, parts, cin, w, stride, bias, cout, out);
  }
  ProductTiles<Lanes4, kTimeBlock, kRowsOutBlockBaseline>(in, parts, cin, w, stride, bias, cout,
                                                          out);
}

// The product of the recurrent state (one row) with a gate matrix.
void StateProduct(const float* in, size_t cin, const float* w, size_t stride, const float* bias,
                  size_t cout, float* out) {
  if (kvasr_common::HasAvx2Fma()) return StateProductAvx2(in, cin, w, stride, bias, cout, out);
  ProductTiles<Lanes4, 1, kStateOutBlockBaseline>(&in, 1, cin, w, stride, bias, cout, &out);
}

size_t RoundUp(size_t n, size_t block) { return (n + block - 1) / block * block; }

// [rows][cols] to [cols][stride], the columns past `rows` zero.
std::vector<float> TransposePadded(const std::vector<float>& m, size_t rows, size_t cols,
                                   size_t stride) {
  std::vector<float> t(cols * stride, 0.0f);
  for (size_t r = 0; r < rows; ++r)
    for (size_t c = 0; c < cols; ++c) t[c * stride + r] = m[r * cols + c];
  return t;
}

std::vector<float> Padded(std::vector<float> v, size_t size) {
  v.resize(size, 0.0f);
  return v;
}

float Sigmoid(float x) { return 1.0f / (1.0f + std::exp(-x)); }

}  // namespace

bool Network::Load(const std::string& path, std::string* error) {
  std::ifstream in(path, std::ios::binary);
  if (!in) {
    *error = "cannot open model file '" + path + "'";
    return false;
  }
  const std::vector<unsigned char> bytes((std::istreambuf_iterator<char>(in)),
                                         std::istreambuf_iterator<char>());
  if (bytes.size() < kHeaderBytes + kChecksumBytes ||
      std::memcmp(bytes.data(), kMagic, sizeof(kMagic)) != 0) {
    *error = "'" + path + "' is not a punctuation model file";
    return false;
  }
  const size_t payload = bytes.size() - kChecksumBytes;
  if (Fnv1a(bytes.data(), payload) != ReadU32(bytes.data() + payload)) {
    *error = "model file '" + path + "' is corrupt (checksum mismatch)";
    return false;
  }
  const unsigned char* h = bytes.data() + sizeof(kMagic);
  if (ReadU32(h) != kFormatVersion) {
    *error = "model file '" + path + "' has format version " + std::to_string(ReadU32(h)) +
             ", this library reads version " + std::to_string(kFormatVersion);
    return false;
  }
  const char* lang = reinterpret_cast<const char*>(h + 4);
  shape_.lang.assign(lang, strnlen(lang, 4));
  uint32_t f[kHeaderFields];
  for (size_t i = 0; i < kHeaderFields; ++i) f[i] = ReadU32(h + 8 + 4 * i);
  NetworkShape& s = shape_;
  s.vocab = f[0], s.pieces = f[1], s.dim = f[2], s.convs = f[3], s.channels = f[4];
  s.kernel = f[5], s.hidden = f[6], s.punct_classes = f[7], s.case_classes = f[8];
  s.max_word_bytes = f[9], s.max_pieces = f[10], s.window_step = f[11], s.window_context = f[12];

  const bool sane =
      s.vocab >= 1 && s.vocab <= kMaxVocab && s.pieces <= kMaxVocab && s.dim >= 1 &&
      s.dim <= kMaxWidth && s.convs <= kMaxLayers && s.channels <= kMaxWidth &&
      (s.convs == 0 || (s.channels >= 1 && s.kernel % 2 == 1 && s.kernel <= kMaxKernel)) &&
      s.hidden <= kMaxWidth && s.punct_classes >= 1 && s.punct_classes <= kMaxWidth &&
      s.case_classes >= 1 && s.case_classes <= kMaxWidth && s.max_word_bytes >= 1 &&
      s.max_word_bytes <= kMaxWordBytes && s.max_pieces >= 1 && s.max_pieces <= kMaxWordBytes &&
      s.window_step >= 1 && s.window_step + 2 * s.window_context <= kMaxWindow;
  if (!sane) {
    *error = "model file '" + path + "' has an impossible shape";
    return false;
  }
  const size_t conv_in0 = s.dim;
  const size_t width = s.convs ? s.channels : s.dim;
  const size_t feat = s.hidden ? 2 * s.hidden : width;
  size_t expected = size_t{s.vocab} * s.dim + size_t{s.pieces} * s.dim;
  for (uint32_t l = 0; l < s.convs; ++l)
    expected += size_t{s.channels} * (l ? s.channels : conv_in0) * s.kernel + s.channels;
  if (s.hidden) expected += 2 * (3 * size_t{s.hidden} * (width + s.hidden) + 6 * size_t{s.hidden});
  expected += (size_t{s.punct_classes} + s.case_classes) * (feat + 1);
  if (payload - kHeaderBytes != 2 * expected) {
    *error = "model file '" + path + "' has " + std::to_string(payload - kHeaderBytes) +
             " weight bytes, its header implies " + std::to_string(2 * expected);
    return false;
  }

  // The size check above guarantees every Take stays inside the file.
  HalfReader r(bytes.data() + kHeaderBytes);
  conv_stride_ = RoundUp(s.channels, kRowsOutBlock);
  input_gate_stride_ = RoundUp(3 * size_t{s.hidden}, kRowsOutBlock);
  state_gate_stride_ = RoundUp(3 * size_t{s.hidden}, kStateOutBlock);
  word_emb_ = r.Take(size_t{s.vocab} * s.dim);
  piece_emb_ = r.Take(size_t{s.pieces} * s.dim);
  conv_w_.assign(s.convs, {});
  conv_b_.assign(s.convs, {});
  for (uint32_t l = 0; l < s.convs; ++l) {
    const size_t cin = l ? s.channels : conv_in0;
    // Stored [out][in][tap]; reordered to [tap][in][out], outputs padded.
    const std::vector<float> w = r.Take(size_t{s.channels} * cin * s.kernel);
    std::vector<float>& dst = conv_w_[l];
    dst.assign(s.kernel * cin * conv_stride_, 0.0f);
    for (size_t o = 0; o < s.channels; ++o)
      for (size_t i = 0; i < cin; ++i)
        for (size_t k = 0; k < s.kernel; ++k)
          dst[(k * cin + i) * conv_stride_ + o] = w[(o * cin + i) * s.kernel + k];
    conv_b_[l] = Padded(r.Take(s.channels), conv_stride_);
  }
  if (s.hidden) {
    const size_t gates = 3 * size_t{s.hidden};
    for (Gru* g : {&forward_, &backward_}) {
      g->w_ih = TransposePadded(r.Take(gates * width), gates, width, input_gate_stride_);
      g->w_hh = TransposePadded(r.Take(gates * s.hidden), gates, s.hidden, state_gate_stride_);
      g->b_ih = Padded(r.Take(gates), input_gate_stride_);
      g->b_hh = Padded(r.Take(gates), state_gate_stride_);
    }
  }
  punct_w_ = r.Take(size_t{s.punct_classes} * feat);
  punct_b_ = r.Take(s.punct_classes);
  case_w_ = r.Take(size_t{s.case_classes} * feat);
  case_b_ = r.Take(s.case_classes);

  const size_t window = static_cast<size_t>(max_window());
  const size_t act = std::max<size_t>(s.dim, s.channels);
  act_a_.assign(window * act, 0.0f);
  // Spare rows take the outputs of the last time block past the text.
  act_b_.assign((window + kTimeBlock) * act, 0.0f);
  zeros_.assign(act, 0.0f);
  feat_.assign(window * feat, 0.0f);
  gates_x_.assign((window + kTimeBlock) * 3 * s.hidden, 0.0f);
  gates_h_.assign(3 * s.hidden, 0.0f);
  state_.assign(s.hidden, 0.0f);
  return true;
}

void Network::Embed(const WordInput* words, int n) {
  const size_t dim = shape_.dim;
  for (int t = 0; t < n; ++t) {
    float* x = &act_a_[t * dim];
    const int32_t id =
        words[t].id >= 0 && static_cast<uint32_t>(words[t].id) < shape_.vocab ? words[t].id : 0;
    std::copy_n(&word_emb_[id * dim], dim, x);
    // Mean of the subword vectors, summed first as the trainer does.
    float* bag = &act_b_[t * dim];
    std::fill_n(bag, dim, 0.0f);
    int used = 0;
    for (int p = 0; p < words[t].piece_count; ++p) {
      const int32_t piece = words[t].pieces[p];
      if (piece < 0 || static_cast<uint32_t>(piece) >= shape_.pieces) continue;
      const float* e = &piece_emb_[piece * dim];
      for (size_t j = 0; j < dim; ++j) bag[j] += e[j];
      ++used;
    }
    if (used == 0) continue;
    const float scale = 1.0f / static_cast<float>(used);
    for (size_t j = 0; j < dim; ++j) x[j] += bag[j] * scale;
  }
}

void Network::Convolve(int layer, int n) {
  const size_t cin = layer ? shape_.channels : shape_.dim;
  const size_t cout = shape_.channels;
  const int kernel = static_cast<int>(shape_.kernel);
  const int half = kernel / 2;
  const int dilation = 1 << layer;
  // Input in act_a_, output in act_b_; taps outside the text read zeros.
  const float* in[kTimeBlock * kMaxKernel];
  float* out[kTimeBlock];
  for (int t0 = 0; t0 < n; t0 += kTimeBlock) {
    for (int j = 0; j < kTimeBlock; ++j) {
      out[j] = &act_b_[static_cast<size_t>(t0 + j) * cout];
      for (int k = 0; k < kernel; ++k) {
        const int src = t0 + j + (k - half) * dilation;
        in[j * kernel + k] = t0 + j < n && src >= 0 && src < n
                                 ? &act_a_[static_cast<size_t>(src) * cin]
                                 : zeros_.data();
      }
    }
    RowsProduct(in, kernel, cin, conv_w_[layer].data(), conv_stride_, conv_b_[layer].data(), cout,
                out);
  }
  // The first layer changes width; the others add to what they are given.
  for (int t = 0; t < n; ++t) {
    float* yt = &act_b_[t * cout];
    float* xt = &act_a_[t * cout];
    for (size_t o = 0; o < cout; ++o) {
      const float v = std::max(yt[o], 0.0f);
      xt[o] = layer ? xt[o] + v : v;
    }
  }
}

void Network::RunGru(const Gru& g, int n, bool reverse, int out_offset) {
  const size_t hid = shape_.hidden;
  const size_t gates = 3 * hid;
  const size_t width = shape_.convs ? shape_.channels : shape_.dim;
  const size_t feat = 2 * hid;
  const float* in[kTimeBlock];
  float* out[kTimeBlock];
  for (int t0 = 0; t0 < n; t0 += kTimeBlock) {
    for (int j = 0; j < kTimeBlock; ++j) {
      in[j] = t0 + j < n ? &act_a_[static_cast<size_t>(t0 + j) * width] : zeros_.data();
      out[j] = &gates_x_[static_cast<size_t>(t0 + j) * gates];
    }
    RowsProduct(in, 1, width, g.w_ih.data(), input_gate_stride_, g.b_ih.data(), gates, out);
  }
  std::fill(state_.begin(), state_.end(), 0.0f);
  for (int step = 0; step < n; ++step) {
    const int t = reverse ? n - 1 - step : step;
    StateProduct(state_.data(), hid, g.w_hh.data(), state_gate_stride_, g.b_hh.data(), gates,
                 gates_h_.data());
    const float* gx = &gates_x_[t * gates];
    const float* gh = gates_h_.data();
    float* o = &feat_[t * feat + out_offset];
    for (size_t j = 0; j < hid; ++j) {
      const float r = Sigmoid(gx[j] + gh[j]);
      const float z = Sigmoid(gx[hid + j] + gh[hid + j]);
      const float cand = std::tanh(gx[2 * hid + j] + r * gh[2 * hid + j]);
      state_[j] = (1.0f - z) * cand + z * state_[j];
      o[j] = state_[j];
    }
  }
}

void Network::Forward(const WordInput* words, int n, float* punct, float* casing) {
  n = std::min(n, max_window());
  if (n <= 0) return;
  Embed(words, n);
  for (uint32_t l = 0; l < shape_.convs; ++l) Convolve(static_cast<int>(l), n);
  const size_t width = shape_.convs ? shape_.channels : shape_.dim;
  size_t feat = width;
  const float* features = act_a_.data();
  if (shape_.hidden) {
    RunGru(forward_, n, false, 0);
    RunGru(backward_, n, true, static_cast<int>(shape_.hidden));
    feat = 2 * shape_.hidden;
    features = feat_.data();
  }
  const auto head = [&](const std::vector<float>& w, const std::vector<float>& b, size_t classes,
                        float* out) {
    for (int t = 0; t < n; ++t) {
      const float* f = features + t * feat;
      for (size_t c = 0; c < classes; ++c) {
        float sum = b[c];
        const float* wc = &w[c * feat];
        for (size_t j = 0; j < feat; ++j) sum += wc[j] * f[j];
        out[t * classes + c] = sum;
      }
    }
  };
  head(punct_w_, punct_b_, shape_.punct_classes, punct);
  head(case_w_, case_b_, shape_.case_classes, casing);
}

}  // namespace punct
}  // namespace kvasr
