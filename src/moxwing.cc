// SPDX-License-Identifier: Apache-2.0
#include "moxwing.h"

#include <atomic>
#include <cstdio>
#include <exception>
#include <iostream>
#include <utility>

#include <cpprest/json.h>

#include "json_number.h"
#include "kvasr_decoder_api.h"

namespace vorta {
namespace speech {
namespace {

constexpr int kSamplesPerMs = 16;
constexpr std::chrono::milliseconds::rep kDefaultMaxDurationMs = 30000;
constexpr std::chrono::milliseconds::rep kMinMaxDurationMs = 1000;
// Values the decoder library documents for its end-of-speech detector.
constexpr int32_t kVadThresholdFirst = 5000;
constexpr int32_t kVadThresholdSecond = 1000;

// compat: one limit for every engine in the process; a per-engine one ignores hosts' global init.
// Atomic only so that engines on different threads may read it while a host reconfigures it.
std::atomic<std::chrono::milliseconds::rep> g_max_duration_ms{kDefaultMaxDurationMs};

int LanguageFlag(const std::string& lang) {
  const std::string prefix = lang.substr(0, 2);
  for (const char* group : {"en", "fr", "ru", "de", "es"}) {
    if (prefix == group) return 1;
  }
  return 0;
}

}  // namespace

Moxwing::Moxwing(std::string model_path, std::string lang)
    : model_path_(std::move(model_path)), lang_(std::move(lang)) {}

Moxwing::~Moxwing() { Release(); }

bool Moxwing::Init() {
  if (handle_) return false;
  FILE* file = std::fopen(model_path_.c_str(), "rb");
  if (!file) {
    std::cout << "moxwing model file " << model_path_ << " cannot open" << std::endl;
    return false;
  }
  handle_ = mwDecoderInit(file, 0, LanguageFlag(lang_));
  std::fclose(file);
  if (!handle_) {
    std::cout << "moxwing init failed" << std::endl;
    return false;
  }
  mwSetVadEnabled(handle_, 1);
  mwSetAutoStopEnabled(handle_, 0);
  mwSetVadThreshold(handle_, kVadThresholdFirst, kVadThresholdSecond);
  mwSetOutHandle(handle_, this);
  mwSetOnSpeechEnd(handle_, &Moxwing::OnSpeechEnd);
  mwSetOnResult(handle_, &Moxwing::OnResult);
  return true;
}

bool Moxwing::Start(DecoderResultHandler handler) {
  fed_samples_ = 0;
  handler_ = std::move(handler);
  return mwStartDecode(handle_) >= 0;
}

void Moxwing::Stop() {
  if (handle_) mwStopDecode(handle_);
}

void Moxwing::Restart() {
  Stop();
  // Start takes its handler by value: the stored one is copied, then replaced.
  Start(handler_);
}

bool Moxwing::SetData(const uint16_t* data, int count, bool last) {
  if (!handle_) return false;
  const uint64_t limit_samples =
      static_cast<uint64_t>(g_max_duration_ms.load(std::memory_order_relaxed)) * kSamplesPerMs;
  // compat: sign-extended, as the decoder's own unsigned check; zero-extending restarts elsewhere.
  const uint64_t count_u64 = static_cast<uint64_t>(static_cast<int64_t>(count));
  if (fed_samples_ + count_u64 > limit_samples) Restart();

  const int r = mwSetData(handle_, reinterpret_cast<const int16_t*>(data), count, last ? 1 : 0);
  if (r < 0) {
    std::cout << "moxwing set data failed: " << r << std::endl;
    return false;
  }
  if (last) Restart();
  fed_samples_ += count_u64;
  return true;
}

void Moxwing::Release() {
  if (!handle_) return;
  mwDecoderDestroy(handle_);
  handle_ = nullptr;
  fed_samples_ = 0;
}

void Moxwing::GlobalInit(const std::string& params) {
  try {
    web::json::value root = web::json::value::parse(params);
    web::json::value& duration = root[U("moxwing_max_duration")];
    if (duration.is_number()) {
      g_max_duration_ms.store(JsonToUint32(duration.as_number()), std::memory_order_relaxed);
    }
  } catch (const std::exception& e) {
    std::cout << "moxwing global init exception:" << e.what() << std::endl;
  }
  if (g_max_duration_ms.load(std::memory_order_relaxed) < kMinMaxDurationMs) {
    g_max_duration_ms.store(kDefaultMaxDurationMs, std::memory_order_relaxed);
  }
}

std::chrono::milliseconds Moxwing::MaxDuration() {
  return std::chrono::milliseconds(g_max_duration_ms.load(std::memory_order_relaxed));
}

std::string Moxwing::Version() {
  const char* version = mwGetVersion();
  return version ? version : "";
}

void Moxwing::OnResult(const char* text, float /*score*/, int flag, void* out_handle) {
  std::cout << "asr result:" << (text ? text : "") << std::endl;
  if (!text || !*text) return;
  auto* self = static_cast<Moxwing*>(out_handle);
  if (self && self->handler_) {
    self->handler_(std::error_code(0, std::system_category()), std::string(text), flag > 0);
  }
}

void Moxwing::OnSpeechEnd(int /*reason*/, void* /*out_handle*/) {
  std::cout << "moxwing speech end" << std::endl;
}

}  // namespace speech
}  // namespace vorta
