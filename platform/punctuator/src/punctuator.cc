// SPDX-License-Identifier: Apache-2.0
#include "punctuator.h"

#include <algorithm>
#include <cstring>
#include <limits>

namespace kvasr {
namespace punct {
namespace {

// Number words, casing rules and the trained files are English.
constexpr const char* kSupportedLanguages[] = {"en"};
constexpr int kCaseClasses = 4;
enum CaseClass { kLower = 0, kCapital = 1, kUpper = 2, kLexiconForm = 3 };
// Marks a recogniser might leave on a word; the network decides anew.
constexpr std::string_view kStrippedMarks = ",.?!;:";

bool IsSpace(char c) {
  return c == ' ' || c == '\t' || c == '\n' || c == '\r' || c == '\f' || c == '\v';
}
char AsciiLower(char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; }
char AsciiUpper(char c) { return c >= 'a' && c <= 'z' ? static_cast<char>(c - 'a' + 'A') : c; }

bool Require(const std::string& path, const char* what, std::string* error) {
  if (!path.empty()) return true;
  *error = std::string("this model needs a ") + what + " file, none was given";
  return false;
}

}  // namespace

std::unique_ptr<Punctuator> Punctuator::Create(const ModelFiles& files, const std::string& lang,
                                               std::string* error) {
  std::unique_ptr<Punctuator> p(new Punctuator());
  if (!p->Load(files, lang, error)) return nullptr;
  return p;
}

bool Punctuator::Load(const ModelFiles& f, const std::string& lang, std::string* error) {
  if (std::find(std::begin(kSupportedLanguages), std::end(kSupportedLanguages), lang) ==
      std::end(kSupportedLanguages)) {
    *error = "unsupported language '" + lang + "'";
    return false;
  }
  if (!Require(f.model, "model", error) || !Require(f.vocab, "vocab", error) ||
      !Require(f.punc, "punc", error) || !Require(f.bpe, "bpe", error))
    return false;
  if (!network_.Load(f.model, error) || !vocab_.Load(f.vocab, error) ||
      !LoadLabels(f.punc, &labels_, error) || !subwords_.Load(f.bpe, error))
    return false;
  if (!f.casing.empty() && !case_lexicon_.Load(f.casing, error)) return false;
  have_numbers_ = !f.num.empty();
  if (have_numbers_ && !numbers_.Load(f.num, f.xdb, error)) return false;

  const NetworkShape& s = network_.shape();
  const auto mismatch = [&](const std::string& what, size_t file, size_t model) {
    *error = what + " has " + std::to_string(file) + " entries, the model expects " +
             std::to_string(model);
    return false;
  };
  if (s.lang != lang) {
    *error = "model file '" + f.model + "' is for language '" + s.lang + "', not '" + lang + "'";
    return false;
  }
  if (vocab_.size() != s.vocab)
    return mismatch("vocab file '" + f.vocab + "'", vocab_.size(), s.vocab);
  if (labels_.size() != s.punct_classes)
    return mismatch("punc file '" + f.punc + "'", labels_.size(), s.punct_classes);
  if (static_cast<uint32_t>(subwords_.size()) != s.pieces)
    return mismatch("bpe file '" + f.bpe + "'", static_cast<size_t>(subwords_.size()), s.pieces);
  if (s.case_classes != kCaseClasses)
    return mismatch("the model's casing head", s.case_classes, kCaseClasses);
  end_label_ = -1;
  for (size_t i = 0; i < labels_.size() && end_label_ < 0; ++i)
    if (labels_[i].kind == MarkKind::kEnd) end_label_ = static_cast<int>(i);

  const size_t window = static_cast<size_t>(network_.max_window());
  punct_logits_.assign(window * s.punct_classes, 0.0f);
  case_logits_.assign(window * s.case_classes, 0.0f);
  return true;
}

void Punctuator::Tokenise(const char* text) {
  lower_.assign(text);
  std::transform(lower_.begin(), lower_.end(), lower_.begin(), AsciiLower);
  words_.clear();
  size_t i = 0;
  const size_t n = lower_.size();
  while (i < n) {
    while (i < n && IsSpace(lower_[i])) ++i;
    const size_t start = i;
    while (i < n && !IsSpace(lower_[i])) ++i;
    std::string_view w(lower_.data() + start, i - start);
    while (!w.empty() && kStrippedMarks.find(w.back()) != std::string_view::npos)
      w.remove_suffix(1);
    if (!w.empty()) words_.push_back(w);
  }
}

template <typename Visit>
void Punctuator::RunNetwork(Visit visit) {
  const NetworkShape& s = network_.shape();
  const int n = static_cast<int>(words_.size());
  pieces_.resize(static_cast<size_t>(n) * s.max_word_bytes);
  inputs_.resize(static_cast<size_t>(n));
  for (int t = 0; t < n; ++t) {
    int32_t* pieces = &pieces_[static_cast<size_t>(t) * s.max_word_bytes];
    const int count = subwords_.Encode(words_[t], pieces, static_cast<int>(s.max_word_bytes));
    inputs_[t] =
        WordInput{vocab_.Find(words_[t]), std::min(count, static_cast<int>(s.max_pieces)), pieces};
  }
  const int step = static_cast<int>(s.window_step);
  const int context = static_cast<int>(s.window_context);
  for (int start = 0; start < n; start += step) {
    const int first = std::max(0, start - context);
    const int stop = std::min(n, start + step);
    const int last = std::min(n, stop + context);
    network_.Forward(&inputs_[first], last - first, punct_logits_.data(), case_logits_.data());
    for (int t = start; t < stop; ++t)
      visit(t, &punct_logits_[static_cast<size_t>(t - first) * s.punct_classes],
            &case_logits_[static_cast<size_t>(t - first) * s.case_classes]);
  }
}

void Punctuator::Logits(const char* text, std::vector<float>* punct, std::vector<float>* casing) {
  have_last_ = false;
  Tokenise(text);
  const NetworkShape& s = network_.shape();
  punct->assign(words_.size() * s.punct_classes, 0.0f);
  casing->assign(words_.size() * s.case_classes, 0.0f);
  RunNetwork([&](int t, const float* p, const float* c) {
    std::copy_n(p, s.punct_classes, punct->begin() + static_cast<ptrdiff_t>(t) * s.punct_classes);
    std::copy_n(c, s.case_classes, casing->begin() + static_cast<ptrdiff_t>(t) * s.case_classes);
  });
}

void Punctuator::Predict() {
  const NetworkShape& s = network_.shape();
  label_.resize(words_.size());
  casing_.resize(words_.size());
  RunNetwork([&](int t, const float* p, const float* c) {
    label_[t] = static_cast<int>(std::max_element(p, p + s.punct_classes) - p);
    casing_[t] = static_cast<int>(std::max_element(c, c + s.case_classes) - c);
  });
  // A text handed over whole is a finished utterance: it ends a sentence.
  if (!label_.empty() && end_label_ >= 0 && labels_[label_.back()].kind != MarkKind::kEnd)
    label_.back() = end_label_;
}

void Punctuator::AppendWord(int i, bool sentence_start) {
  const std::string_view w = words_[i];
  const CaseEntry* entry = case_lexicon_.Find(w);
  const size_t at = output_.size();
  if (entry && entry->always) {
    output_.append(entry->form);
  } else {
    output_.append(w);
    switch (casing_[i]) {
      case kCapital: output_[at] = AsciiUpper(output_[at]); break;
      case kUpper:
        std::transform(output_.begin() + static_cast<ptrdiff_t>(at), output_.end(),
                       output_.begin() + static_cast<ptrdiff_t>(at), AsciiUpper);
        break;
      case kLexiconForm:
        if (entry)
          output_.replace(at, w.size(), entry->form);
        else
          output_[at] = AsciiUpper(output_[at]);
        break;
      default: break;
    }
  }
  if (sentence_start) output_[at] = AsciiUpper(output_[at]);
}

void Punctuator::Compose() {
  stop_after_.resize(words_.size());
  for (size_t i = 0; i < words_.size(); ++i)
    stop_after_[i] = labels_[label_[i]].kind != MarkKind::kNone;
  if (have_numbers_) {
    numbers_.Apply(words_, stop_after_, &spans_, &number_text_);
  } else {
    spans_.clear();
    for (size_t i = 0; i < words_.size(); ++i)
      spans_.push_back(Span{static_cast<int>(i), static_cast<int>(i), false, 0, 0});
  }
  output_.clear();
  bool sentence_start = true;
  for (const Span& span : spans_) {
    if (!output_.empty()) output_.push_back(' ');
    if (span.number)
      output_.append(number_text_, span.text_offset, span.text_size);
    else
      AppendWord(span.first, sentence_start);
    const Label& label = labels_[label_[span.last]];
    output_.append(label.mark);
    sentence_start = label.kind == MarkKind::kEnd;
  }
}

const std::string& Punctuator::Punctuate(const char* text) {
  // The engine asks twice for one text when the first buffer is too small.
  if (have_last_ && last_text_ == text) return output_;
  Tokenise(text);
  Predict();
  Compose();
  last_text_.assign(text);
  have_last_ = true;
  return output_;
}

int Punctuator::Run(const char* text, char* out, int32_t* size) {
  if (!text || !size || *size < 0 || (!out && *size > 0)) return kFailed;
  const std::string& result = Punctuate(text);
  if (result.size() > static_cast<size_t>(std::numeric_limits<int32_t>::max())) return kFailed;
  const int32_t needed = static_cast<int32_t>(result.size());
  if (needed > *size) {
    *size = needed;
    return kBufferTooSmall;
  }
  if (needed > 0) std::memcpy(out, result.data(), result.size());
  *size = needed;
  return kDone;
}

}  // namespace punct
}  // namespace kvasr
