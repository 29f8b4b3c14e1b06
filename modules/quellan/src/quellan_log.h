// SPDX-License-Identifier: Apache-2.0
// One-line warnings of the voice activity module, written to standard output.
#ifndef QUELLAN_LOG_H_
#define QUELLAN_LOG_H_

#include <cstdio>
#include <stdexcept>

namespace quellan {

// Messages name the source file from its modules/ folder on, so that a log
// reads the same whichever directory the tree was built in.
constexpr const char* source_path(const char* file) {
  const char* found = file;
  for (const char* p = file; *p != '\0'; ++p) {
    const char* prefix = "modules/";
    int i = 0;
    while (prefix[i] != '\0' && p[i] == prefix[i]) ++i;
    if (prefix[i] == '\0') found = p;
  }
  return found;
}

}  // namespace quellan

#define QUELLAN_WARN(format, ...)                                                         \
  std::fprintf(stdout, "WARNING * [%s:%d<<%s>>] " format, quellan::source_path(__FILE__), \
               __LINE__, __func__, ##__VA_ARGS__)

// A constructor that cannot build its object: the warning line, then the one
// exception every constructor of the module throws. A macro so that the line
// names the constructor, not a helper.
#define QUELLAN_INIT_FAIL(format, ...)           \
  do {                                           \
    QUELLAN_WARN(format, ##__VA_ARGS__);         \
    throw std::runtime_error("init vad failed"); \
  } while (0)

#endif  // QUELLAN_LOG_H_
