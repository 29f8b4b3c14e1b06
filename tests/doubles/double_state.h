// SPDX-License-Identifier: Apache-2.0
// What every double keeps for the whole process, since the library calls it
// stands in for carry no test context: the calls made to it in order and the
// handles it gave out and has not taken back. A double's own state extends
// DoubleState and is reached through Instance; Reset replaces it whole.
#ifndef KVASR_TESTS_DOUBLES_DOUBLE_STATE_H_
#define KVASR_TESTS_DOUBLES_DOUBLE_STATE_H_

#include <algorithm>
#include <cstdint>
#include <set>
#include <string>
#include <vector>

namespace doubles {

template <typename Call>
struct DoubleState {
  std::vector<Call> calls;
  std::set<void*> handles;
  uintptr_t next_handle = 1;

  // A distinct non-null token, never dereferenced.
  void* OpenHandle() {
    void* handle = reinterpret_cast<void*>(next_handle++ << 4);
    handles.insert(handle);
    return handle;
  }

  bool IsOpen(void* handle) const { return handles.count(handle) != 0; }

  int Count(const std::string& name) const {
    return static_cast<int>(
        std::count_if(calls.begin(), calls.end(), [&](const Call& c) { return c.name == name; }));
  }
};

template <typename State>
State& Instance() {
  static State state;
  return state;
}

}  // namespace doubles

#endif  // KVASR_TESTS_DOUBLES_DOUBLE_STATE_H_
