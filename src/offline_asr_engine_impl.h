// SPDX-License-Identifier: Apache-2.0
// The engine behind each handle of the C interface: lifecycle, parameters,
// audio path and result messages.
#ifndef KVASR_SRC_OFFLINE_ASR_ENGINE_IMPL_H_
#define KVASR_SRC_OFFLINE_ASR_ENGINE_IMPL_H_

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <system_error>

namespace web {
namespace json {
class value;
}  // namespace json
}  // namespace web

namespace vorta {
namespace speech {

class Moxwing;
class Punctuator;
class Vad;

using ResultSink = std::function<void(std::string)>;

class OfflineAsrEngineImpl {
 public:
  enum State : int32_t { kNotInitialized = 0, kInitialized = 1, kStarted = 2 };

  OfflineAsrEngineImpl();
  ~OfflineAsrEngineImpl();
  OfflineAsrEngineImpl(const OfflineAsrEngineImpl&) = delete;
  OfflineAsrEngineImpl& operator=(const OfflineAsrEngineImpl&) = delete;

  bool Init(std::string params);
  bool AsrStart(std::string params, void* context, ResultSink sink);
  void Stop();
  void Close();
  bool ProcessSoundData(const uint16_t* data, int count, int packet);
  void* GetContext();

  int32_t state() const { return state_; }
  uint32_t max_mute_before_voice() const { return max_mute_before_voice_; }
  uint32_t max_mute_after_voice() const { return max_mute_after_voice_; }
  bool has_vad() const { return vad_ != nullptr; }
  bool has_decoder() const { return decoder_ != nullptr; }
  bool has_punctuator() const { return punctuator_ != nullptr; }

 private:
  void InitLocalAsr(web::json::value& params, const std::string& lang);
  void OnDecoderResult(std::error_code status, std::string text, bool is_break);
  void OnMuteTimeout();

  std::shared_ptr<Vad> vad_;
  std::shared_ptr<Moxwing> decoder_;
  void* context_ = nullptr;
  ResultSink sink_;
  int32_t state_ = kNotInitialized;
  const std::string log_prefix_;
  uint32_t max_mute_before_voice_ = 0;  // samples
  uint32_t max_mute_after_voice_ = 0;   // samples
  bool voice_seen_ = false;
  uint32_t mute_samples_ = 0;
  std::string lang_;
  std::shared_ptr<Punctuator> punctuator_;
};

}  // namespace speech
}  // namespace vorta

#endif  // KVASR_SRC_OFFLINE_ASR_ENGINE_IMPL_H_
