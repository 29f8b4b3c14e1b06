// SPDX-License-Identifier: Apache-2.0
#include "punctuator.h"

#include <cstdint>
#include <iostream>
#include <utility>

#include "kvasr_punctuator_api.h"

namespace vorta {
namespace speech {
namespace {

constexpr int32_t kFirstBufferBytes = 4096;
// Far beyond any recognised text; a larger request is a library fault.
constexpr int32_t kMaxBufferBytes = 16 * 1024 * 1024;
constexpr int kDone = 0;
constexpr int kBufferTooSmall = 1;

}  // namespace

Punctuator::Punctuator(std::string model_path, std::string vocab_path, std::string punc_path,
                       std::string num_path, std::string case_path, std::string xdb_path,
                       std::string bpe_path, std::string lang, bool punc_all)
    : model_path_(std::move(model_path)),
      vocab_path_(std::move(vocab_path)),
      punc_path_(std::move(punc_path)),
      num_path_(std::move(num_path)),
      case_path_(std::move(case_path)),
      xdb_path_(std::move(xdb_path)),
      bpe_path_(std::move(bpe_path)),
      punc_all_(punc_all),
      lang_(std::move(lang)) {}

Punctuator::~Punctuator() { Release(); }

bool Punctuator::Init() {
  if (handle_) return false;
  handle_ = punctuator_init(model_path_.c_str(), vocab_path_.c_str(), punc_path_.c_str(),
                            num_path_.c_str(), case_path_.c_str(), xdb_path_.c_str(),
                            bpe_path_.c_str(), lang_.c_str());
  if (!handle_) {
    std::cout << "punctuator init failed" << std::endl;
    return false;
  }
  return true;
}

std::string Punctuator::Punctuate(const std::string& text, bool is_break) {
  if (!punc_all_ && !is_break) return std::string();
  if (!handle_) return std::string();

  std::string output(kFirstBufferBytes, '\0');
  int32_t size = kFirstBufferBytes;
  int r = punctuator_do_it(handle_, text.c_str(), &output[0], &size);
  if (r == kBufferTooSmall) {
    // One retry with the size the library asked for; a library that asks
    // for nothing usable is treated as failing.
    if (size <= 0 || size > kMaxBufferBytes) return std::string();
    output.assign(static_cast<size_t>(size), '\0');
    r = punctuator_do_it(handle_, text.c_str(), &output[0], &size);
  }
  // A reported length beyond the buffer would read past it.
  if (r != kDone || size < 0 || static_cast<size_t>(size) > output.size()) return std::string();
  output.resize(static_cast<size_t>(size));
  return output;
}

void Punctuator::Release() {
  if (!handle_) return;
  punctuator_relese(handle_);
  handle_ = nullptr;
}

}  // namespace speech
}  // namespace vorta
