// SPDX-License-Identifier: Apache-2.0
// What a path names, following links: the checks behind "is not a file" and
// "is not a directory" messages.
#ifndef KVASR_COMMON_FILE_KIND_H_
#define KVASR_COMMON_FILE_KIND_H_

#include <sys/stat.h>

#include <string>

namespace kvasr_common {

inline bool IsFile(const std::string& path) {
  struct stat st;
  return stat(path.c_str(), &st) == 0 && S_ISREG(st.st_mode);
}

inline bool IsDirectory(const std::string& path) {
  struct stat st;
  return stat(path.c_str(), &st) == 0 && S_ISDIR(st.st_mode);
}

}  // namespace kvasr_common

#endif  // KVASR_COMMON_FILE_KIND_H_
