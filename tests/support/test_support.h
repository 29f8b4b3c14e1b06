// SPDX-License-Identifier: Apache-2.0
// Helpers shared by the tests: temporary files, captured standard output.
#ifndef KVASR_TESTS_SUPPORT_TEST_SUPPORT_H_
#define KVASR_TESTS_SUPPORT_TEST_SUPPORT_H_

#include <gtest/gtest.h>

#include <fstream>
#include <string>

#include "temp_dir.h"

namespace kvasr_test {

// A file that exists for the life of the object.
class TempFile {
 public:
  explicit TempFile(const std::string& content) : path_(dir_.path() + "/file") {
    std::ofstream(path_, std::ios::binary) << content;
  }
  const std::string& path() const { return path_; }

 private:
  TempDir dir_;
  std::string path_;
};

// Standard output of everything run inside `body`.
template <typename F>
std::string Stdout(F&& body) {
  testing::internal::CaptureStdout();
  body();
  return testing::internal::GetCapturedStdout();
}

}  // namespace kvasr_test

#endif  // KVASR_TESTS_SUPPORT_TEST_SUPPORT_H_
