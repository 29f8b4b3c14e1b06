// SPDX-License-Identifier: Apache-2.0
// The LibriVox recordings of Debian's pocketsphinx-testdata with their
// reference transcripts, and word error counting.
#ifndef KVASR_TESTS_SUPPORT_LIBRIVOX_H_
#define KVASR_TESTS_SUPPORT_LIBRIVOX_H_

#include <cstdint>
#include <string>
#include <vector>

namespace kvasr_test {

struct LibrivoxReference {
  std::string id;                  // e.g. "0880"
  std::vector<std::string> words;  // the reference transcript
};

// A file of the package's data folder.
std::string TestDataPath(const std::string& relative);
bool HaveLibrivox();

// The five recordings' references, in the order of the transcription file.
std::vector<LibrivoxReference> LibrivoxReferences();

// Samples of a recording by its number (16 kHz mono); empty when unreadable.
std::vector<int16_t> LibrivoxClip(const std::string& id);

std::vector<std::string> Words(const std::string& text);

// Word-level edit distance: substitutions, insertions and deletions.
size_t EditDistance(const std::vector<std::string>& reference,
                    const std::vector<std::string>& hypothesis);

}  // namespace kvasr_test

#define KVASR_REQUIRE_LIBRIVOX()   \
  if (!kvasr_test::HaveLibrivox()) \
  GTEST_SKIP() << "recordings missing: install the Debian package pocketsphinx-testdata"

#endif  // KVASR_TESTS_SUPPORT_LIBRIVOX_H_
