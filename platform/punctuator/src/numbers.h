// SPDX-License-Identifier: Apache-2.0
// Spelled numbers to digits where a reader expects digits ("twenty three" ->
// "23", "nineteen ninety five" -> "1995", "three point five" -> "3.5"), from
// the word table of the num file and the fixed phrases of the xdb file.
#ifndef KVASR_PUNCTUATOR_NUMBERS_H_
#define KVASR_PUNCTUATOR_NUMBERS_H_

#include <cstdint>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

namespace kvasr {
namespace punct {

// A stretch of input words and what to write for it: with `number` set, the
// digits at [text_offset, text_offset + text_size) of the scratch text;
// otherwise the single word, unchanged.
struct Span {
  int first = 0;
  int last = 0;
  bool number = false;
  size_t text_offset = 0;
  size_t text_size = 0;
};

class NumberRules {
 public:
  NumberRules() = default;
  NumberRules(const NumberRules&) = delete;
  NumberRules& operator=(const NumberRules&) = delete;

  // `xdb_path` may be empty: no fixed phrases.
  bool Load(const std::string& num_path, const std::string& xdb_path, std::string* error);

  // Splits `words` (lower case) into spans. A number never runs past a word
  // whose `stop_after` is set (a mark follows it). The texts of the spans
  // live in `scratch`, which is reused across calls.
  void Apply(const std::vector<std::string_view>& words, const std::vector<bool>& stop_after,
             std::vector<Span>* spans, std::string* scratch) const;

  enum class Kind { kUnit, kTeen, kTens, kHundred, kScale, kOrdinal, kDecade, kPoint, kAnd, kOh };

 private:
  struct Word {
    Kind kind;
    int64_t value;
  };
  struct Parsed {
    int end = 0;  // one past the last word used
    bool keep_words = false;
  };

  const Word* Lookup(std::string_view w) const;
  int KeepPhraseLength(const std::vector<std::string_view>& words, int at, int limit) const;
  Parsed Parse(const std::vector<std::string_view>& words, int at, int limit,
               std::string* out) const;
  bool ParseYear(const std::vector<std::string_view>& words, int at, int limit, Parsed* p,
                 std::string* out) const;

  std::vector<std::string> keys_;
  std::unordered_map<std::string_view, Word> words_;
  std::vector<std::vector<std::string>> keep_phrases_;
  int64_t keep_below_ = 10;
  int64_t round_from_ = 1000000;
};

}  // namespace punct
}  // namespace kvasr

#endif  // KVASR_PUNCTUATOR_NUMBERS_H_
