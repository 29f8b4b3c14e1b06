// SPDX-License-Identifier: Apache-2.0
// The model manifest: a small versioned text file naming the recogniser's
// model files. The format is described in platform/decoder/README.md.
#ifndef KVASR_PLATFORM_DECODER_MANIFEST_H_
#define KVASR_PLATFORM_DECODER_MANIFEST_H_

#include <cstdio>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace kvasr::decoder {

struct ModelSettings {
  // All paths absolute or relative to the working directory, already checked
  // to exist.
  std::string acoustic_model_dir;
  std::string dictionary;
  std::string filler_dictionary;  // empty: the acoustic model's own
  // Exactly one of the two is set.
  std::string language_model;
  std::string grammar;
  bool log_to_stderr = false;
  // Recogniser options as (name without the leading dash, value), in
  // manifest order; names are checked by the recogniser.
  std::vector<std::pair<std::string, std::string>> options;
};

// Reads the manifest from the current position of `file` to its end. On any
// fault writes one line naming it to standard error and returns nothing.
std::optional<ModelSettings> ReadManifest(FILE* file);

// Writes "kvasr_decoder: <message>" and a line end to standard error.
void ReportError(const std::string& message);

}  // namespace kvasr::decoder

#endif  // KVASR_PLATFORM_DECODER_MANIFEST_H_
