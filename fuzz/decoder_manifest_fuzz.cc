// SPDX-License-Identifier: Apache-2.0
// The decoder library's model manifest parser. The first byte chooses how
// the text arrives: from a file with a path, so that relative entries resolve
// against a real folder, or from memory, where the path is unknown.
#include <sys/stat.h>

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>

#include "fuzz_support.h"
#include "manifest.h"

namespace {

// A folder shaped like an acoustic model, so that entries can resolve all
// the way to a complete result.
void MakeModelFolder(const std::string& dir) {
  const std::string model = dir + "/am";
  if (mkdir(model.c_str(), 0700) != 0) std::abort();
  for (const char* name : {"mdef", "means", "variances", "transition_matrices", "sendump"}) {
    kvasr_fuzz::WriteFile(model + "/" + name, "x", 1);
  }
  for (const char* name : {"dict", "lm", "gram"}) kvasr_fuzz::WriteFile(dir + "/" + name, "x", 1);
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  MakeModelFolder(kvasr_fuzz::ScratchDir());
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size == 0) return 0;
  const bool from_file = data[0] & 1;
  ++data;
  --size;
  FILE* f = nullptr;
  static char empty_byte = 0;
  if (from_file) {
    const std::string path = kvasr_fuzz::ScratchDir() + "/model.manifest";
    kvasr_fuzz::WriteFile(path, data, size);
    f = std::fopen(path.c_str(), "rb");
  } else if (size > 0) {
    f = fmemopen(const_cast<uint8_t*>(data), size, "rb");
  } else {
    f = fmemopen(&empty_byte, 1, "rb");
    if (f != nullptr) std::fgetc(f);
  }
  if (f == nullptr) std::abort();
  const auto settings = kvasr::decoder::ReadManifest(f);
  std::fclose(f);
  if (settings && settings->language_model.empty() == settings->grammar.empty()) std::abort();
  return 0;
}
