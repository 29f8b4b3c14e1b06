// SPDX-License-Identifier: Apache-2.0
#include "summing_decoder.h"

#include <cinttypes>
#include <cstdio>
#include <string>

#include "kvasr_decoder_api.h"

namespace summing_decoder {
namespace {

constexpr uint64_t kFnvOffset = 14695981039346656037ull;
constexpr uint64_t kFnvPrime = 1099511628211ull;

struct Decoder {
  void* out_handle = nullptr;
  mw_result_callback on_result = nullptr;
  int64_t samples = 0;
  uint64_t hash = kFnvOffset;
};

uint64_t Mix(uint64_t hash, int16_t sample) {
  const uint16_t bits = static_cast<uint16_t>(sample);
  hash = (hash ^ (bits & 0xFF)) * kFnvPrime;
  return (hash ^ (bits >> 8)) * kFnvPrime;
}

// Reports what was decoded since the last report, as a final text.
void Flush(Decoder* d) {
  if (d->samples == 0) return;
  char text[64];
  std::snprintf(text, sizeof text, "n%" PRId64 " h%016" PRIx64, d->samples, d->hash);
  d->samples = 0;
  d->hash = kFnvOffset;
  if (d->on_result) d->on_result(text, 1.0f, 1, d->out_handle);
}

}  // namespace

bool ParseSamples(const std::string& text, int64_t* samples) {
  uint64_t hash = 0;
  return std::sscanf(text.c_str(), "n%" SCNd64 " h%" SCNx64, samples, &hash) == 2;
}

}  // namespace summing_decoder

using summing_decoder::Decoder;

extern "C" {

void* mwDecoderInit(FILE*, int, int) { return new Decoder(); }
void mwDecoderDestroy(void* decoder) { delete static_cast<Decoder*>(decoder); }
int mwSetVadEnabled(void*, int) { return 0; }
int mwSetAutoStopEnabled(void*, int) { return 0; }
int mwSetVadThreshold(void*, int32_t, int32_t) { return 0; }
int mwSetOnSpeechEnd(void*, mw_speech_end_callback) { return 0; }

int mwSetOutHandle(void* decoder, void* out_handle) {
  static_cast<Decoder*>(decoder)->out_handle = out_handle;
  return 0;
}

int mwSetOnResult(void* decoder, mw_result_callback callback) {
  static_cast<Decoder*>(decoder)->on_result = callback;
  return 0;
}

int mwStartDecode(void* decoder) {
  Decoder* d = static_cast<Decoder*>(decoder);
  d->samples = 0;
  d->hash = summing_decoder::kFnvOffset;
  return 0;
}

int mwSetData(void* decoder, const int16_t* samples, int64_t count, int last) {
  Decoder* d = static_cast<Decoder*>(decoder);
  for (int64_t i = 0; i < count; ++i) d->hash = summing_decoder::Mix(d->hash, samples[i]);
  d->samples += count > 0 ? count : 0;
  if (last) summing_decoder::Flush(d);
  return 0;
}

int mwStopDecode(void* decoder) {
  summing_decoder::Flush(static_cast<Decoder*>(decoder));
  return 0;
}

const char* mwGetVersion(void) { return "summing decoder"; }

}  // extern "C"
