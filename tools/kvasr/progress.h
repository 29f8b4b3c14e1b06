// SPDX-License-Identifier: Apache-2.0
// A one-line progress bar on standard error.
#ifndef KVASR_TOOLS_KVASR_PROGRESS_H_
#define KVASR_TOOLS_KVASR_PROGRESS_H_

#include <string>

namespace kvasr_cli {

class Progress {
 public:
  // Draws nothing unless `enabled`.
  Progress(std::string label, double total_s, bool enabled);
  void Update(double done_s);
  // Clears the line so that later output starts clean.
  void Finish();

 private:
  std::string label_;
  double total_s_;
  bool enabled_;
  int last_permille_ = -1;
};

}  // namespace kvasr_cli

#endif  // KVASR_TOOLS_KVASR_PROGRESS_H_
