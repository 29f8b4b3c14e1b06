// SPDX-License-Identifier: Apache-2.0
// The text files of a punctuation model: vocabulary, label set, subword
// merges and casing lexicon (formats in ../README.md).
#ifndef KVASR_PUNCTUATOR_RESOURCES_H_
#define KVASR_PUNCTUATOR_RESOURCES_H_

#include <cstdint>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

namespace kvasr {
namespace punct {

// Lines of a model text file after its header "#kvasr-punct-<kind> <version>",
// without comment lines (starting with '#') and empty lines.
bool ReadModelText(const std::string& path, const std::string& kind,
                   std::vector<std::string>* lines, std::string* error);

// The maps below point into the classes' own strings: no copies.
class Vocabulary {
 public:
  Vocabulary() = default;
  Vocabulary(const Vocabulary&) = delete;
  Vocabulary& operator=(const Vocabulary&) = delete;
  bool Load(const std::string& path, std::string* error);
  size_t size() const { return words_.size(); }
  // Id of a lower-case word; 0 (the unknown word) when absent.
  int32_t Find(std::string_view word) const;

 private:
  std::vector<std::string> words_;
  std::unordered_map<std::string_view, int32_t> ids_;
};

enum class MarkKind { kNone, kPause, kEnd };

struct Label {
  std::string name;
  std::string mark;
  MarkKind kind = MarkKind::kNone;
};

bool LoadLabels(const std::string& path, std::vector<Label>* labels, std::string* error);

// Byte-level merges: symbols 0-255 are bytes, merge r makes symbol 256 + r
// (or the symbol of an earlier merge with the same result), and the
// lowest-numbered applicable merge goes first.
class Subwords {
 public:
  static constexpr int32_t kByteSymbols = 256;

  bool Load(const std::string& path, std::string* error);
  int32_t size() const { return kByteSymbols + merge_count_; }
  // Splits `word` (at most `capacity` bytes are used) into symbols written to
  // `out`; returns how many.
  int Encode(std::string_view word, int32_t* out, int capacity) const;

 private:
  struct Merge {
    int32_t rank;
    int32_t symbol;
  };
  std::unordered_map<uint64_t, Merge> merges_;
  int32_t merge_count_ = 0;
};

struct CaseEntry {
  std::string form;
  // Always written this way, whatever the network says.
  bool always = false;
};

class CaseLexicon {
 public:
  CaseLexicon() = default;
  CaseLexicon(const CaseLexicon&) = delete;
  CaseLexicon& operator=(const CaseLexicon&) = delete;
  bool Load(const std::string& path, std::string* error);
  const CaseEntry* Find(std::string_view word) const;

 private:
  std::vector<std::string> keys_;
  std::vector<CaseEntry> entries_;
  std::unordered_map<std::string_view, size_t> index_;
};

}  // namespace punct
}  // namespace kvasr

#endif  // KVASR_PUNCTUATOR_RESOURCES_H_
