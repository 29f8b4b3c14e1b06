// SPDX-License-Identifier: Apache-2.0
// `kvasr vad`: runs the voice activity detector on recordings and prints
// speech segments or per-frame decisions.
#ifndef KVASR_TOOLS_KVASR_VAD_COMMAND_H_
#define KVASR_TOOLS_KVASR_VAD_COMMAND_H_

#include <cstdio>
#include <string>
#include <vector>

namespace kvasr_cli {

struct VadOptions {
  std::vector<std::string> inputs;
  std::string vad_dir;  // empty: the shipped model
  int chunk_ms = 100;
  bool frames = false;    // one line per frame instead of segments
  std::string plot_path;  // PNG of waveform, score and segments
  std::string dump_dir;   // network inputs and frame records per input
};

// Returns the process exit code; results go to `out`, errors to stderr.
int RunVadCommand(VadOptions options, FILE* out);

}  // namespace kvasr_cli

#endif  // KVASR_TOOLS_KVASR_VAD_COMMAND_H_
