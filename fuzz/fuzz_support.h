// SPDX-License-Identifier: Apache-2.0
// What the fuzz targets share: a private scratch folder and whole-file writes.
#ifndef KVASR_FUZZ_FUZZ_SUPPORT_H_
#define KVASR_FUZZ_FUZZ_SUPPORT_H_

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>

#include "temp_dir.h"

namespace kvasr_fuzz {

// A fresh folder, made once per process; the loaders under test take paths.
inline const std::string& ScratchDir() {
  static const std::string dir = kvasr_test::ProcessTempDir();
  return dir;
}

inline void WriteFile(const std::string& path, const void* data, size_t size) {
  FILE* f = std::fopen(path.c_str(), "wb");
  if (f == nullptr) std::abort();
  if (size > 0 && std::fwrite(data, 1, size, f) != size) std::abort();
  std::fclose(f);
}

}  // namespace kvasr_fuzz

#endif  // KVASR_FUZZ_FUZZ_SUPPORT_H_
