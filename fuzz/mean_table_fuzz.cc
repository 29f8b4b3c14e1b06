// SPDX-License-Identifier: Apache-2.0
// The cepstral mean table: any bytes must be taken or refused when the
// feature extractor is built, and a taken table must normalise audio.
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <vector>

#include "plp.h"
#include "plp_config.h"

namespace {

constexpr int kFrames = 64;

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  PlpConfig conf;
  plp_set_defaults(&conf, kFrames, nullptr);
  // fmemopen refuses an empty buffer; an empty file is still a case.
  static char empty_byte = 0;
  FILE* table =
      size > 0 ? fmemopen(const_cast<uint8_t*>(data), size, "rb") : fmemopen(&empty_byte, 1, "rb");
  if (table == nullptr) std::abort();
  if (size == 0) std::fgetc(table);
  try {
    PLP plp(&conf, table);
    std::fclose(table);
    plp.reset();
    std::vector<int16_t> wave(static_cast<size_t>(kFrames / 2) * plp.frame_shift_samples());
    uint32_t seed = static_cast<uint32_t>(size);
    for (int16_t& s : wave) {
      seed = seed * 1664525u + 1013904223u;
      s = static_cast<int16_t>(seed >> 16);
    }
    std::vector<float> out(static_cast<size_t>(kFrames) * plp.feat_dim());
    int frames = 0;
    if (plp.extract_feature(wave.data(), static_cast<int>(wave.size()), out.data(), kFrames,
                            &frames, -1) < 0) {
      std::abort();
    }
  } catch (const std::exception&) {
    std::fclose(table);
  }
  return 0;
}
