// SPDX-License-Identifier: Apache-2.0
// The three C functions the engine's punctuation adapter calls.
#include <exception>
#include <iostream>
#include <memory>

#include "kvasr_punctuator_api.h"
#include "punctuator.h"

#define KVASR_PUNCT_EXPORT extern "C" __attribute__((visibility("default")))

namespace {

std::string OrEmpty(const char* s) { return s ? s : ""; }

}  // namespace

KVASR_PUNCT_EXPORT void* punctuator_init(const char* model_path, const char* vocab_path,
                                         const char* punc_path, const char* num_path,
                                         const char* case_path, const char* xdb_path,
                                         const char* bpe_path, const char* lang) {
  using kvasr::punct::ModelFiles;
  using kvasr::punct::Punctuator;
  const ModelFiles files{OrEmpty(model_path), OrEmpty(vocab_path), OrEmpty(punc_path),
                         OrEmpty(num_path),   OrEmpty(case_path),  OrEmpty(xdb_path),
                         OrEmpty(bpe_path)};
  std::string error;
  std::unique_ptr<Punctuator> p;
  // Nothing may leave a C function; running out of memory is one more
  // failed init.
  try {
    p = Punctuator::Create(files, OrEmpty(lang), &error);
  } catch (const std::exception& e) {
    error = e.what();
  }
  if (!p) {
    std::cerr << "kvasr punctuator: " << error << std::endl;
    return nullptr;
  }
  return p.release();
}

KVASR_PUNCT_EXPORT int punctuator_do_it(void* handle, const char* text, char* out, int32_t* size) {
  if (!handle) return kvasr::punct::kFailed;
  try {
    return static_cast<kvasr::punct::Punctuator*>(handle)->Run(text, out, size);
  } catch (const std::exception&) {
    return kvasr::punct::kFailed;
  }
}

KVASR_PUNCT_EXPORT void punctuator_relese(void* handle) {
  delete static_cast<kvasr::punct::Punctuator*>(handle);
}
