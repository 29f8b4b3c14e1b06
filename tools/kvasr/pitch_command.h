// SPDX-License-Identifier: Apache-2.0
// `kvasr pitch`: runs the pitch tracker of the voice activity module on a
// recording and prints its raw pitch track, one line per 10 ms frame.
#ifndef KVASR_TOOLS_KVASR_PITCH_COMMAND_H_
#define KVASR_TOOLS_KVASR_PITCH_COMMAND_H_

#include <cstdio>
#include <string>

namespace kvasr_cli {

// Prints "frame<TAB>Hz" lines (0 Hz: unvoiced, silent or not analysed) after
// a '#' header giving the time of each frame. Returns the process exit code;
// errors go to stderr.
int RunPitchCommand(const std::string& input, FILE* out);

}  // namespace kvasr_cli

#endif  // KVASR_TOOLS_KVASR_PITCH_COMMAND_H_
