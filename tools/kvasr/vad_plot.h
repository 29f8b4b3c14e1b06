// SPDX-License-Identifier: Apache-2.0
// Draws one recording's waveform, smoothed score, decisions and emitted
// segments into a PNG with gnuplot.
#ifndef KVASR_TOOLS_KVASR_VAD_PLOT_H_
#define KVASR_TOOLS_KVASR_VAD_PLOT_H_

#include <string>

#include "vad_run.h"

namespace kvasr_cli {

// False with `*error` set when gnuplot cannot be run or fails.
bool PlotVad(const VadRunResult& run, float threshold, const std::string& title,
             const std::string& png_path, std::string* error);

}  // namespace kvasr_cli

#endif  // KVASR_TOOLS_KVASR_VAD_PLOT_H_
