// SPDX-License-Identifier: Apache-2.0
// Scriptable stand-in for the voice activity module's entry points.
#ifndef KVASR_TESTS_DOUBLES_QUELLAN_DOUBLE_H_
#define KVASR_TESTS_DOUBLES_QUELLAN_DOUBLE_H_

#include <cstdint>
#include <string>
#include <vector>

namespace quellan_double {

// What one quellan_process_wave call reports.
struct Output {
  std::vector<int16_t> samples;
  int speech = 0;
  int continued = 0;
  int ended = 0;
};

struct Call {
  std::string name;
  int index = 0;
  int len = 0;
  int out_capacity = 0;
};

void Reset();
const std::vector<Call>& Calls();
int LiveHandles();
// quellan_create returns null for this directory.
void SetCreateReturnsNullFor(const std::string& dir);
// Outputs of the following quellan_process_wave calls; silence once exhausted.
void QueueOutput(Output output);

}  // namespace quellan_double

#endif  // KVASR_TESTS_DOUBLES_QUELLAN_DOUBLE_H_
