// SPDX-License-Identifier: Apache-2.0
// Temporary directories for the tests and fuzz targets. Every one is removed
// with what it holds: runs of the suite must not pile folders up in /tmp.
#ifndef KVASR_TESTS_SUPPORT_TEMP_DIR_H_
#define KVASR_TESTS_SUPPORT_TEMP_DIR_H_

#include <stdlib.h>

#include <cstdlib>
#include <deque>
#include <filesystem>
#include <mutex>
#include <stdexcept>
#include <string>
#include <system_error>

namespace kvasr_test {

// A fresh empty directory under $TMPDIR (or /tmp) for the life of the object.
// Throws std::runtime_error when it cannot be made.
class TempDir {
 public:
  TempDir() {
    const char* base = std::getenv("TMPDIR");
    std::string pattern = std::string(base != nullptr ? base : "/tmp") + "/kvasr-test-XXXXXX";
    if (mkdtemp(pattern.data()) == nullptr) throw std::runtime_error("mkdtemp failed");
    path_ = pattern;
  }
  ~TempDir() {
    std::error_code ignored;
    std::filesystem::remove_all(path_, ignored);
  }
  TempDir(const TempDir&) = delete;
  TempDir& operator=(const TempDir&) = delete;

  const std::string& path() const { return path_; }

 private:
  std::string path_;
};

// A fresh directory that lives until the process exits normally, for helpers
// that hand out bare paths.
inline std::string ProcessTempDir() {
  static std::mutex mutex;
  static std::deque<TempDir> dirs;  // growing a deque leaves its elements in place
  std::lock_guard<std::mutex> lock(mutex);
  return dirs.emplace_back().path();
}

}  // namespace kvasr_test

#endif  // KVASR_TESTS_SUPPORT_TEMP_DIR_H_
