// SPDX-License-Identifier: Apache-2.0
#include "resources.h"

#include <fstream>

namespace kvasr {
namespace punct {
namespace {

constexpr int kTextFormatVersion = 1;
constexpr char kHeaderPrefix[] = "#kvasr-punct-";

uint64_t PairKey(int32_t left, int32_t right) {
  return static_cast<uint64_t>(static_cast<uint32_t>(left)) << 32 | static_cast<uint32_t>(right);
}

// Splits on tabs; the last field keeps any further tabs.
std::vector<std::string> SplitTabs(const std::string& line, size_t fields) {
  std::vector<std::string> out;
  size_t start = 0;
  while (out.size() + 1 < fields) {
    const size_t tab = line.find('\t', start);
    if (tab == std::string::npos) break;
    out.push_back(line.substr(start, tab - start));
    start = tab + 1;
  }
  out.push_back(line.substr(start));
  return out;
}

}  // namespace

bool ReadModelText(const std::string& path, const std::string& kind,
                   std::vector<std::string>* lines, std::string* error) {
  std::ifstream in(path);
  if (!in) {
    *error = "cannot open " + kind + " file '" + path + "'";
    return false;
  }
  std::string line;
  const std::string prefix = kHeaderPrefix + kind + " ";
  if (!std::getline(in, line) || line.compare(0, prefix.size(), prefix) != 0) {
    *error =
        "'" + path + "' is not a " + kind + " file (first line must start with '" + prefix + "')";
    return false;
  }
  if (line.substr(prefix.size()) != std::to_string(kTextFormatVersion)) {
    *error = kind + " file '" + path + "' has format version '" + line.substr(prefix.size()) +
             "', this library reads version " + std::to_string(kTextFormatVersion);
    return false;
  }
  lines->clear();
  while (std::getline(in, line)) {
    if (!line.empty() && line.back() == '\r') line.pop_back();
    if (line.empty() || line[0] == '#') continue;
    lines->push_back(line);
  }
  return true;
}

bool Vocabulary::Load(const std::string& path, std::string* error) {
  if (!ReadModelText(path, "vocab", &words_, error)) return false;
  if (words_.empty()) {
    *error = "vocab file '" + path + "' has no words";
    return false;
  }
  ids_.clear();
  for (size_t i = 0; i < words_.size(); ++i) ids_.emplace(words_[i], static_cast<int32_t>(i));
  return true;
}

int32_t Vocabulary::Find(std::string_view word) const {
  const auto it = ids_.find(word);
  return it == ids_.end() ? 0 : it->second;
}

bool LoadLabels(const std::string& path, std::vector<Label>* labels, std::string* error) {
  std::vector<std::string> lines;
  if (!ReadModelText(path, "labels", &lines, error)) return false;
  labels->clear();
  for (const std::string& line : lines) {
    std::vector<std::string> f = SplitTabs(line, 3);
    Label label;
    if (f.size() == 3) {
      label.name = f[0];
      label.mark = f[1];
      if (f[2] == "none")
        label.kind = MarkKind::kNone;
      else if (f[2] == "pause")
        label.kind = MarkKind::kPause;
      else if (f[2] == "end")
        label.kind = MarkKind::kEnd;
      else
        f[2].clear();
    }
    if (f.size() != 3 || label.name.empty() || f[2].empty()) {
      *error = "punc file '" + path + "': bad line '" + line + "'";
      return false;
    }
    labels->push_back(std::move(label));
  }
  if (labels->empty()) {
    *error = "punc file '" + path + "' has no labels";
    return false;
  }
  return true;
}

bool Subwords::Load(const std::string& path, std::string* error) {
  std::vector<std::string> lines;
  if (!ReadModelText(path, "bpe", &lines, error)) return false;
  std::unordered_map<std::string, int32_t> symbols;
  for (int32_t b = 0; b < kByteSymbols; ++b)
    symbols.emplace(std::string(1, static_cast<char>(b)), b);
  merges_.clear();
  merge_count_ = 0;
  for (const std::string& line : lines) {
    const size_t space = line.find(' ');
    const auto left =
        space == std::string::npos ? symbols.end() : symbols.find(line.substr(0, space));
    const auto right =
        space == std::string::npos ? symbols.end() : symbols.find(line.substr(space + 1));
    if (left == symbols.end() || right == symbols.end()) {
      *error = "bpe file '" + path + "': merge '" + line + "' uses an unknown piece";
      return false;
    }
    const int32_t symbol =
        symbols.emplace(line.substr(0, space) + line.substr(space + 1), size()).first->second;
    merges_.emplace(PairKey(left->second, right->second), Merge{merge_count_++, symbol});
  }
  return true;
}

int Subwords::Encode(std::string_view word, int32_t* out, int capacity) const {
  int n = 0;
  for (size_t i = 0; i < word.size() && n < capacity; ++i)
    out[n++] = static_cast<unsigned char>(word[i]);
  for (;;) {
    int best_at = -1;
    const Merge* best = nullptr;
    for (int j = 0; j + 1 < n; ++j) {
      const auto it = merges_.find(PairKey(out[j], out[j + 1]));
      if (it != merges_.end() && (!best || it->second.rank < best->rank)) {
        best = &it->second;
        best_at = j;
      }
    }
    if (!best) return n;
    out[best_at] = best->symbol;
    for (int j = best_at + 1; j + 1 < n; ++j) out[j] = out[j + 1];
    --n;
  }
}

bool CaseLexicon::Load(const std::string& path, std::string* error) {
  std::vector<std::string> lines;
  if (!ReadModelText(path, "case", &lines, error)) return false;
  keys_.clear();
  entries_.clear();
  for (const std::string& line : lines) {
    std::vector<std::string> f = SplitTabs(line, 3);
    if (f.size() != 3 || f[0].empty() || f[1].size() != f[0].size() ||
        (f[2] != "always" && f[2] != "model")) {
      *error = "case file '" + path + "': bad line '" + line + "'";
      return false;
    }
    keys_.push_back(std::move(f[0]));
    entries_.push_back(CaseEntry{std::move(f[1]), f[2] == "always"});
  }
  index_.clear();
  for (size_t i = 0; i < keys_.size(); ++i) index_.emplace(keys_[i], i);
  return true;
}

const CaseEntry* CaseLexicon::Find(std::string_view word) const {
  const auto it = index_.find(word);
  return it == index_.end() ? nullptr : &entries_[it->second];
}

}  // namespace punct
}  // namespace kvasr
