// SPDX-License-Identifier: Apache-2.0
#include "librivox.h"

#include <sndfile.h>
#include <unistd.h>

#include <algorithm>
#include <fstream>
#include <sstream>

namespace kvasr_test {

std::string TestDataPath(const std::string& relative) {
  return std::string(KVASR_TEST_DATA) + "/" + relative;
}

bool HaveLibrivox() { return access(TestDataPath("librivox/transcription").c_str(), R_OK) == 0; }

std::vector<std::string> Words(const std::string& text) {
  std::istringstream in(text);
  std::vector<std::string> words;
  for (std::string word; in >> word;) words.push_back(word);
  return words;
}

// Lines "<s> words </s> (file-id)".
std::vector<LibrivoxReference> LibrivoxReferences() {
  std::ifstream in(TestDataPath("librivox/transcription"));
  std::vector<LibrivoxReference> references;
  for (std::string line; std::getline(in, line);) {
    const size_t open = line.rfind('(');
    const size_t close = line.rfind(')');
    if (open == std::string::npos || close == std::string::npos || close < open) continue;
    LibrivoxReference reference;
    const std::string full_id = line.substr(open + 1, close - open - 1);
    reference.id = full_id.substr(full_id.rfind('-') + 1);
    for (std::string& word : Words(line.substr(0, open))) {
      if (word != "<s>" && word != "</s>") reference.words.push_back(word);
    }
    references.push_back(reference);
  }
  return references;
}

std::vector<int16_t> LibrivoxClip(const std::string& id) {
  const std::string path =
      TestDataPath("librivox/sense_and_sensibility_01_austen_64kb-" + id + ".wav");
  SF_INFO info{};
  SNDFILE* file = sf_open(path.c_str(), SFM_READ, &info);
  std::vector<int16_t> samples;
  if (!file) return samples;
  if (info.samplerate == 16000 && info.channels == 1) {
    samples.resize(static_cast<size_t>(info.frames));
    samples.resize(static_cast<size_t>(sf_read_short(file, samples.data(), info.frames)));
  }
  sf_close(file);
  return samples;
}

size_t EditDistance(const std::vector<std::string>& reference,
                    const std::vector<std::string>& hypothesis) {
  std::vector<size_t> row(hypothesis.size() + 1);
  for (size_t j = 0; j < row.size(); ++j) row[j] = j;
  for (size_t i = 1; i <= reference.size(); ++i) {
    size_t diagonal = row[0];
    row[0] = i;
    for (size_t j = 1; j <= hypothesis.size(); ++j) {
      const size_t above = row[j];
      row[j] = std::min(
          {row[j] + 1, row[j - 1] + 1, diagonal + (reference[i - 1] == hypothesis[j - 1] ? 0 : 1)});
      diagonal = above;
    }
  }
  return row[hypothesis.size()];
}

}  // namespace kvasr_test
