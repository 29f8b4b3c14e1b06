// SPDX-License-Identifier: Apache-2.0
// `kvasr transcribe`: recognise files or standard input through the public API.
#ifndef KVASR_TOOLS_KVASR_TRANSCRIBE_H_
#define KVASR_TOOLS_KVASR_TRANSCRIBE_H_

#include <cstdint>
#include <cstdio>
#include <string>
#include <vector>

namespace kvasr_cli {

struct TranscribeOptions {
  std::vector<std::string> inputs;
  std::string decoder_model;   // empty: the default manifest
  std::string vad_dir;         // empty: the default VAD model folder
  std::string punct_settings;  // empty: the default settings when punct is set
  std::string grammar;         // JSGF file in place of the model's language model
  std::string lang = "en-US";
  bool vad = true;
  bool punct = false;
  bool json = false;
  bool progress = true;
  int chunk_ms = 100;
  uint32_t max_silence_before_ms = 0;  // 0: no limit
  uint32_t max_silence_after_ms = 0;
};

// Exit status: 0 when every input was transcribed, 1 when some input failed,
// 2 when the models could not be loaded. Texts go to `out`, errors to stderr.
int RunTranscribe(const TranscribeOptions& options, FILE* out);

}  // namespace kvasr_cli

#endif  // KVASR_TOOLS_KVASR_TRANSCRIBE_H_
