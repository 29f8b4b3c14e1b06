// SPDX-License-Identifier: Apache-2.0
#include "progress.h"

#include <algorithm>
#include <cstdio>
#include <utility>

namespace kvasr_cli {
namespace {

constexpr int kBarWidth = 30;

}  // namespace

Progress::Progress(std::string label, double total_s, bool enabled)
    : label_(std::move(label)), total_s_(total_s), enabled_(enabled && total_s > 0) {}

void Progress::Update(double done_s) {
  if (!enabled_) return;
  const int permille = static_cast<int>(std::min(1.0, done_s / total_s_) * 1000);
  if (permille == last_permille_) return;  // redraw only when the figure changes
  last_permille_ = permille;
  const int filled = permille * kBarWidth / 1000;
  std::fprintf(stderr, "\r%s [%s%s] %3d%% %.1f/%.1f s", label_.c_str(),
               std::string(filled, '#').c_str(), std::string(kBarWidth - filled, '.').c_str(),
               permille / 10, done_s, total_s_);
  std::fflush(stderr);
}

void Progress::Finish() {
  if (!enabled_ || last_permille_ < 0) return;
  std::fprintf(stderr, "\r\033[K");
  std::fflush(stderr);
}

}  // namespace kvasr_cli
