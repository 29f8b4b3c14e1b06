// SPDX-License-Identifier: Apache-2.0
#include "vad_plot.h"

#include <algorithm>
#include <cstdio>

namespace kvasr_cli {
namespace {

constexpr int kFrameShiftSamples = 160;
constexpr double kFrameSeconds = 0.01;
constexpr double kFullScale = 32768.0;
constexpr char kPngSize[] = "1400,700";

// Gnuplot's string quoting: single quotes, doubled inside.
std::string Quote(const std::string& text) {
  std::string quoted = "'";
  for (char c : text) quoted += c == '\'' ? std::string("''") : std::string(1, c);
  return quoted + "'";
}

}  // namespace

bool PlotVad(const VadRunResult& run, float threshold, const std::string& title,
             const std::string& png_path, std::string* error) {
  FILE* gp = popen("gnuplot", "w");
  if (gp == nullptr) {
    *error = "cannot run gnuplot";
    return false;
  }
  // Waveform as the range of each frame's samples.
  std::fputs("$wave << EOD\n", gp);
  const size_t frames = run.samples.size() / kFrameShiftSamples;
  for (size_t f = 0; f < frames; ++f) {
    const auto begin = run.samples.begin() + static_cast<long>(f * kFrameShiftSamples);
    const auto [lo, hi] = std::minmax_element(begin, begin + kFrameShiftSamples);
    std::fprintf(gp, "%.2f %.5f %.5f\n", f * kFrameSeconds, *lo / kFullScale, *hi / kFullScale);
  }
  std::fputs("EOD\n$frames << EOD\n", gp);
  for (size_t f = 0; f < run.frames.size(); ++f) {
    const VadFrame& v = run.frames[f];
    std::fprintf(gp, "%.2f %.4f %d %d\n", f * kFrameSeconds, v.smoothed, v.speech, v.emitted);
  }
  std::fputs("EOD\n", gp);
  std::fprintf(gp,
               "set terminal pngcairo size %s\n"
               "set output %s\n"
               "set multiplot layout 2,1 title %s noenhanced\n"
               "set key opaque\n"
               "set xlabel 'seconds'\n"
               "set ylabel 'amplitude'\n"
               "set yrange [-1:1]\n"
               "plot $frames using 1:($4*2-1):(-1) with filledcurves lc rgb '#c8e6c9' "
               "title 'emitted segment', "
               "$wave using 1:2:3 with filledcurves lc rgb '#1565c0' title 'waveform'\n"
               "set ylabel 'smoothed score'\n"
               "set autoscale y\n"
               "plot $frames using 1:2 with lines lc rgb '#e65100' title 'smoothed score', "
               "%g with lines dt 2 lc rgb 'black' title 'threshold', "
               "$frames using 1:($3*4-2) with steps lc rgb '#2e7d32' "
               "title 'decision (high = speech)'\n"
               "unset multiplot\n",
               kPngSize, Quote(png_path).c_str(), Quote(title).c_str(), threshold);
  const int status = pclose(gp);
  if (status != 0) {
    *error = "gnuplot failed";
    return false;
  }
  return true;
}

}  // namespace kvasr_cli
