// SPDX-License-Identifier: Apache-2.0
// Punctuation adapter: one instance of the punctuation library behind the
// punctuator_* functions.
#ifndef KVASR_SRC_PUNCTUATOR_H_
#define KVASR_SRC_PUNCTUATOR_H_

#include <string>

namespace vorta {
namespace speech {

class Punctuator {
 public:
  Punctuator(std::string model_path, std::string vocab_path, std::string punc_path,
             std::string num_path, std::string case_path, std::string xdb_path,
             std::string bpe_path, std::string lang, bool punc_all);
  ~Punctuator();
  Punctuator(const Punctuator&) = delete;
  Punctuator& operator=(const Punctuator&) = delete;

  // Loads the model; false when already loaded or the library refuses.
  bool Init();
  // The punctuated text, or "" when the library fails or when `text` is a
  // partial result and partial results are to be left alone.
  std::string Punctuate(const std::string& text, bool is_break);
  void Release();

 private:
  std::string model_path_;
  std::string vocab_path_;
  std::string punc_path_;
  std::string num_path_;
  std::string case_path_;
  std::string xdb_path_;
  std::string bpe_path_;
  bool punc_all_;
  void* handle_ = nullptr;
  std::string lang_;
};

}  // namespace speech
}  // namespace vorta

#endif  // KVASR_SRC_PUNCTUATOR_H_
