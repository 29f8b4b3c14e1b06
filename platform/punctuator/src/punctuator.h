// SPDX-License-Identifier: Apache-2.0
// One loaded model and the buffers of one text: words in, network windows,
// marks and casing, spelled numbers to digits, text out.
#ifndef KVASR_PUNCTUATOR_PUNCTUATOR_H_
#define KVASR_PUNCTUATOR_PUNCTUATOR_H_

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "network.h"
#include "numbers.h"
#include "resources.h"

namespace kvasr {
namespace punct {

struct ModelFiles {
  std::string model, vocab, punc, num, casing, xdb, bpe;
};

// Results of punctuator_do_it.
constexpr int kDone = 0;
constexpr int kBufferTooSmall = 1;
constexpr int kFailed = 2;

class Punctuator {
 public:
  // Null with the reason in `error` when a file is missing or bad, the files
  // do not fit together, or the language is not one the library knows.
  static std::unique_ptr<Punctuator> Create(const ModelFiles& files, const std::string& lang,
                                            std::string* error);

  // The buffer protocol of punctuator_do_it.
  int Run(const char* text, char* out, int32_t* size);

  // The network's raw output for `text`, window by window as Run sees it:
  // [words][punct classes] and [words][casing classes].
  void Logits(const char* text, std::vector<float>* punct, std::vector<float>* casing);

  const std::string& Punctuate(const char* text);

 private:
  Punctuator() = default;
  bool Load(const ModelFiles& files, const std::string& lang, std::string* error);
  void Tokenise(const char* text);
  // Runs the network over the words; `visit(word, punct logits, casing
  // logits)` gets each word's rows once.
  template <typename Visit>
  void RunNetwork(Visit visit);
  void Predict();
  void Compose();
  void AppendWord(int i, bool sentence_start);

  Network network_;
  Vocabulary vocab_;
  std::vector<Label> labels_;
  Subwords subwords_;
  CaseLexicon case_lexicon_;
  NumberRules numbers_;
  bool have_numbers_ = false;
  int end_label_ = -1;

  std::string last_text_;
  bool have_last_ = false;
  std::string lower_;
  std::vector<std::string_view> words_;
  std::vector<int32_t> pieces_;
  std::vector<WordInput> inputs_;
  std::vector<float> punct_logits_, case_logits_;
  std::vector<int> label_, casing_;
  std::vector<bool> stop_after_;
  std::vector<Span> spans_;
  std::string number_text_;
  std::string output_;
};

}  // namespace punct
}  // namespace kvasr

#endif  // KVASR_PUNCTUATOR_PUNCTUATOR_H_
