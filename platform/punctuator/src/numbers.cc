// SPDX-License-Identifier: Apache-2.0
#include "numbers.h"

#include <cstdlib>
#include <limits>

#include "resources.h"

namespace kvasr {
namespace punct {
namespace {

using Kind = NumberRules::Kind;

// Numbers of this size or more get thousands separators ("10,000"); smaller
// ones are often years and read better without.
constexpr int64_t kGroupDigitsFrom = 10000;
constexpr int64_t kMaxValue = int64_t{1} << 53;
// "a" stands for one before hundred and the scales.
constexpr std::string_view kArticle = "a";

bool ParseKind(const std::string& s, Kind* kind) {
  static const std::pair<const char*, Kind> kNames[] = {
      {"unit", Kind::kUnit},     {"teen", Kind::kTeen},
      {"tens", Kind::kTens},     {"hundred", Kind::kHundred},
      {"scale", Kind::kScale},   {"ordinal", Kind::kOrdinal},
      {"decade", Kind::kDecade}, {"point", Kind::kPoint},
      {"and", Kind::kAnd},       {"oh", Kind::kOh}};
  for (const auto& [name, k] : kNames) {
    if (s == name) {
      *kind = k;
      return true;
    }
  }
  return false;
}

// The role an ordinal's value plays in the number it ends.
Kind OrdinalRole(int64_t v) {
  if (v < 10) return Kind::kUnit;
  if (v < 20) return Kind::kTeen;
  if (v < 100) return Kind::kTens;
  if (v == 100) return Kind::kHundred;
  return Kind::kScale;
}

const char* OrdinalSuffix(int64_t v) {
  if (v % 100 >= 11 && v % 100 <= 13) return "th";
  switch (v % 10) {
    case 1: return "st";
    case 2: return "nd";
    case 3: return "rd";
    default: return "th";
  }
}

void AppendDigits(int64_t v, bool group, std::string* out) {
  char buf[32];
  int n = 0;
  int since_separator = 0;
  do {
    if (group && since_separator == 3) {
      buf[n++] = ',';
      since_separator = 0;
    }
    buf[n++] = static_cast<char>('0' + v % 10);
    ++since_separator;
    v /= 10;
  } while (v > 0);
  while (n > 0) out->push_back(buf[--n]);
}

// What may follow "and" inside a number: "one hundred and five", "...and first".
bool OpensTail(Kind k, int64_t value) {
  if (k == Kind::kOrdinal) return value < 100;
  return k == Kind::kUnit || k == Kind::kTeen || k == Kind::kTens;
}

}  // namespace

bool NumberRules::Load(const std::string& num_path, const std::string& xdb_path,
                       std::string* error) {
  std::vector<std::string> lines;
  if (!ReadModelText(num_path, "num", &lines, error)) return false;
  struct Row {
    std::string word;
    Word w;
  };
  std::vector<Row> rows;
  for (const std::string& line : lines) {
    const size_t a = line.find(' ');
    const size_t b = a == std::string::npos ? a : line.find(' ', a + 1);
    const std::string head = line.substr(0, a);
    const std::string word = a == std::string::npos ? "" : line.substr(a + 1, b - a - 1);
    const std::string value = b == std::string::npos ? "" : line.substr(b + 1);
    char* end = nullptr;
    const long long v = std::strtoll(value.c_str(), &end, 10);
    const bool number_ok = !value.empty() && *end == '\0' && v >= 0 && v < kMaxValue;
    Kind kind;
    if (head == "set" && number_ok && word == "keep_below") {
      keep_below_ = v;
    } else if (head == "set" && number_ok && word == "round_from") {
      round_from_ = v;
    } else if (ParseKind(head, &kind) && !word.empty() && number_ok) {
      rows.push_back(Row{word, Word{kind, v}});
    } else {
      *error = "num file '" + num_path + "': bad line '" + line + "'";
      return false;
    }
  }
  keys_.clear();
  words_.clear();
  keys_.reserve(rows.size());
  for (const Row& r : rows) keys_.push_back(r.word);
  for (size_t i = 0; i < rows.size(); ++i) words_.emplace(keys_[i], rows[i].w);

  keep_phrases_.clear();
  if (xdb_path.empty()) return true;
  if (!ReadModelText(xdb_path, "xdb", &lines, error)) return false;
  for (const std::string& line : lines) {
    const size_t tab = line.find('\t');
    if (tab == std::string::npos || line.compare(0, tab, "keep") != 0 || tab + 1 == line.size()) {
      *error = "xdb file '" + xdb_path + "': bad line '" + line + "'";
      return false;
    }
    std::vector<std::string> phrase;
    size_t start = tab + 1;
    while (start < line.size()) {
      size_t space = line.find(' ', start);
      if (space == std::string::npos) space = line.size();
      if (space > start) phrase.push_back(line.substr(start, space - start));
      start = space + 1;
    }
    keep_phrases_.push_back(std::move(phrase));
  }
  return true;
}

const NumberRules::Word* NumberRules::Lookup(std::string_view w) const {
  const auto it = words_.find(w);
  return it == words_.end() ? nullptr : &it->second;
}

int NumberRules::KeepPhraseLength(const std::vector<std::string_view>& words, int at,
                                  int limit) const {
  for (const std::vector<std::string>& phrase : keep_phrases_) {
    const int n = static_cast<int>(phrase.size());
    if (at + n - 1 > limit) continue;
    int k = 0;
    while (k < n && words[at + k] == phrase[k]) ++k;
    if (k == n) return n;
  }
  return 0;
}

// "nineteen ninety five", "twenty twelve", "eighteen oh five", "nineteen
// sixties": a first pair of digits from eleven to twenty said as one word,
// then the last two.
bool NumberRules::ParseYear(const std::vector<std::string_view>& words, int at, int limit,
                            Parsed* p, std::string* out) const {
  constexpr int64_t kFirstMin = 11, kFirstMax = 20;
  const Word* first = Lookup(words[at]);
  if (!first || !(first->kind == Kind::kTeen || first->kind == Kind::kTens) ||
      first->value < kFirstMin || first->value > kFirstMax || at + 1 > limit)
    return false;
  const Word* second = Lookup(words[at + 1]);
  if (!second) return false;
  int64_t low = 0;
  int end = at + 2;
  bool decade = false;
  if (second->kind == Kind::kOh) {
    const Word* digit = at + 2 <= limit ? Lookup(words[at + 2]) : nullptr;
    if (!digit || digit->kind != Kind::kUnit || digit->value == 0) return false;
    low = digit->value;
    end = at + 3;
  } else if (second->kind == Kind::kTeen) {
    low = second->value;
  } else if (second->kind == Kind::kTens) {
    low = second->value;
    const Word* unit = at + 2 <= limit ? Lookup(words[at + 2]) : nullptr;
    if (unit && unit->kind == Kind::kUnit && unit->value > 0) {
      low += unit->value;
      end = at + 3;
    }
  } else if (second->kind == Kind::kDecade) {
    low = second->value;
    decade = true;
  } else {
    return false;
  }
  AppendDigits(first->value * 100 + low, false, out);
  if (decade) out->push_back('s');
  p->end = end;
  return true;
}

NumberRules::Parsed NumberRules::Parse(const std::vector<std::string_view>& words, int at,
                                       int limit, std::string* out) const {
  Parsed p;
  p.end = at;
  if (ParseYear(words, at, limit, &p, out)) return p;

  int i = at;
  int64_t total = 0, group = 0;
  int64_t last_scale = std::numeric_limits<int64_t>::max();
  bool have = false, after_tens = false, ordinal = false, leading_article = false;
  Kind last = Kind::kAnd;  // what may start a number may follow "and"
  if (words[i] == kArticle && i + 1 <= limit) {
    const Word* next = Lookup(words[i + 1]);
    if (next && (next->kind == Kind::kHundred || next->kind == Kind::kScale)) {
      group = 1;
      have = true;
      last = Kind::kUnit;
      leading_article = true;
      ++i;
    }
  }
  const auto opens_group = [&] {
    return !have || last == Kind::kHundred || last == Kind::kScale || last == Kind::kAnd;
  };
  for (; i <= limit; ++i) {
    const Word* w = Lookup(words[i]);
    if (!w) break;
    Kind role = w->kind == Kind::kOrdinal ? OrdinalRole(w->value) : w->kind;
    bool ok = false;
    switch (role) {
      case Kind::kUnit:
        ok = opens_group() || (last == Kind::kTens && after_tens);
        if (ok) group += w->value;
        break;
      case Kind::kTeen:
      case Kind::kTens:
        ok = opens_group();
        if (ok) group += w->value;
        break;
      case Kind::kHundred:
        ok = have && group > 0 && group < 100 &&
             (last == Kind::kUnit || last == Kind::kTeen || last == Kind::kTens);
        if (ok) group *= 100;
        break;
      case Kind::kScale:
        ok = have && group > 0 && w->value < last_scale && last != Kind::kAnd;
        if (ok) {
          total += group * w->value;
          group = 0;
          last_scale = w->value;
        }
        break;
      case Kind::kAnd: {
        const Word* next = i + 1 <= limit ? Lookup(words[i + 1]) : nullptr;
        ok = have && (last == Kind::kHundred || last == Kind::kScale) && next &&
             OpensTail(next->kind, next->value);
        break;
      }
      default: break;
    }
    if (!ok || total + group >= kMaxValue) break;
    after_tens = role == Kind::kTens && w->kind != Kind::kOrdinal;
    last = role;
    have = true;
    if (w->kind == Kind::kOrdinal) {
      ordinal = true;
      ++i;
      break;
    }
  }
  const int numeric_words = i - at;
  if (!have || numeric_words == 0 || (leading_article && numeric_words == 1)) return p;
  const int64_t value = total + group;

  // Decimals: "point" then single digits.
  std::string decimals;
  int end = i;
  if (!ordinal && end + 1 <= limit && words[end] == "point") {
    int j = end + 1;
    for (; j <= limit; ++j) {
      const Word* d = Lookup(words[j]);
      if (!d || !(d->kind == Kind::kUnit || d->kind == Kind::kOh)) break;
      decimals.push_back(static_cast<char>('0' + d->value));
    }
    if (!decimals.empty()) end = j;
  }
  // A round "a hundred", "a million" reads better as words; so does a lone
  // small number ("one of them").
  if (leading_article && numeric_words == 2 && decimals.empty()) {
    p.end = end;
    p.keep_words = true;
    return p;
  }
  if (numeric_words == 1 && value < keep_below_ && decimals.empty()) return p;

  // "3 million", "2.5 billion": a round large number keeps its scale word.
  const Word* after = end <= limit ? Lookup(words[end]) : nullptr;
  if (!decimals.empty() && after && after->kind == Kind::kScale && after->value >= round_from_ &&
      total == 0) {
    AppendDigits(value, false, out);
    out->push_back('.');
    out->append(decimals);
    out->push_back(' ');
    out->append(words[end]);
    p.end = end + 1;
    return p;
  }
  if (!ordinal && decimals.empty() && group == 0 && last == Kind::kScale &&
      last_scale >= round_from_ && total / last_scale < 1000) {
    AppendDigits(total / last_scale, false, out);
    out->push_back(' ');
    out->append(words[i - 1]);
    p.end = i;
    return p;
  }
  AppendDigits(value, value >= kGroupDigitsFrom, out);
  if (ordinal) out->append(OrdinalSuffix(value));
  if (!decimals.empty()) {
    out->push_back('.');
    out->append(decimals);
  }
  p.end = end;
  return p;
}

void NumberRules::Apply(const std::vector<std::string_view>& words,
                        const std::vector<bool>& stop_after, std::vector<Span>* spans,
                        std::string* scratch) const {
  spans->clear();
  scratch->clear();
  const int n = static_cast<int>(words.size());
  const auto plain = [&](int from, int to) {
    for (int k = from; k < to; ++k) spans->push_back(Span{k, k, false, 0, 0});
  };
  int i = 0;
  int limit = -1;  // the first word at or after i that a mark follows
  while (i < n) {
    if (limit < i) {
      limit = i;
      while (limit + 1 < n && !stop_after[limit]) ++limit;
    }
    const int keep = KeepPhraseLength(words, i, limit);
    if (keep > 0) {
      plain(i, i + keep);
      i += keep;
      continue;
    }
    const size_t mark = scratch->size();
    const Parsed p = Parse(words, i, limit, scratch);
    if (p.end > i && !p.keep_words) {
      spans->push_back(Span{i, p.end - 1, true, mark, scratch->size() - mark});
      i = p.end;
      continue;
    }
    scratch->resize(mark);
    const int to = p.end > i ? p.end : i + 1;
    plain(i, to);
    i = to;
  }
}

}  // namespace punct
}  // namespace kvasr
