// SPDX-License-Identifier: Apache-2.0
// Scriptable stand-in for the punctuation library: records every
// punctuator_* call; by default it appends "." to the text and honours the
// buffer size protocol.
#ifndef KVASR_TESTS_DOUBLES_PUNCTUATOR_DOUBLE_H_
#define KVASR_TESTS_DOUBLES_PUNCTUATOR_DOUBLE_H_

#include <cstdint>
#include <string>
#include <vector>

namespace punctuator_double {

struct Call {
  std::string name;
  std::vector<std::string> strings;  // punctuator_init: the eight strings
  int32_t size_in = 0;               // punctuator_do_it: buffer capacity given
};

// A scripted answer of punctuator_do_it: its return value, the size it
// reports and the bytes it writes (at most the capacity).
struct Reply {
  int result = 0;
  int32_t size = 0;
  std::string output;
};

void Reset();
const std::vector<Call>& Calls();
int Count(const std::string& name);
int LiveHandles();
void SetInitFails(bool fails);
void QueueReply(Reply reply);

}  // namespace punctuator_double

#endif  // KVASR_TESTS_DOUBLES_PUNCTUATOR_DOUBLE_H_
