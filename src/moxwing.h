// SPDX-License-Identifier: Apache-2.0
// Decoder adapter: one instance of the decoder library behind the mw* functions.
#ifndef KVASR_SRC_MOXWING_H_
#define KVASR_SRC_MOXWING_H_

#include <chrono>
#include <cstdint>
#include <functional>
#include <string>
#include <system_error>

namespace vorta {
namespace speech {

using DecoderResultHandler = std::function<void(std::error_code, std::string, bool)>;

class Moxwing {
 public:
  Moxwing(std::string model_path, std::string lang);
  ~Moxwing();
  Moxwing(const Moxwing&) = delete;
  Moxwing& operator=(const Moxwing&) = delete;

  // Opens the model file and configures a decoder instance; false when the
  // instance exists already, the file cannot be opened or the library refuses.
  bool Init();
  // Begins a decoding run; results go to `handler` as (status, text, is-break).
  bool Start(DecoderResultHandler handler);
  void Stop();
  // Feeds one chunk; `last` finishes the utterance and restarts the decoder so
  // that it is ready for the next one at once.
  bool SetData(const uint16_t* data, int count, bool last);
  void Release();

  // Process-wide settings from a JSON text; only `moxwing_max_duration`
  // (milliseconds, at least one second) is read.
  static void GlobalInit(const std::string& params);
  static std::chrono::milliseconds MaxDuration();
  static std::string Version();

 private:
  static void OnResult(const char* text, float score, int flag, void* out_handle);
  static void OnSpeechEnd(int reason, void* out_handle);
  void Restart();

  void* handle_ = nullptr;
  std::string model_path_;
  std::string lang_;
  uint64_t fed_samples_ = 0;
  DecoderResultHandler handler_;
};

}  // namespace speech
}  // namespace vorta

#endif  // KVASR_SRC_MOXWING_H_
