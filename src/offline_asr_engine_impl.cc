// SPDX-License-Identifier: Apache-2.0
#include "offline_asr_engine_impl.h"

#include <exception>
#include <iostream>
#include <stdexcept>
#include <utility>
#include <vector>

#include <cpprest/json.h>

#include "json_number.h"
#include "moxwing.h"
#include "punctuator.h"
#include "vad/kv_vad.h"

namespace vorta {
namespace speech {
namespace {

constexpr uint32_t kSamplesPerMs = 16;
constexpr uint32_t kNoLimit = 0xFFFFFFFFu;
constexpr int kTimeoutStatus = -100;

using web::json::value;

// Optional keys: a value of another JSON type counts as a missing key.
std::string StringOrEmpty(const value& object, const char* key) {
  if (!object.is_object() || !object.has_field(U(key))) return std::string();
  const value& v = object.at(U(key));
  return v.is_string() ? v.as_string() : std::string();
}

bool BoolOrFalse(const value& object, const char* key) {
  if (!object.is_object() || !object.has_field(U(key))) return false;
  const value& v = object.at(U(key));
  return v.is_boolean() && v.as_bool();
}

// A silence limit in samples.
// compat: ms x 16 wraps in 32 bits, absent = all ones first; exact sums move hosts' time-outs.
uint32_t MuteLimitSamples(const value& asr, const char* key) {
  uint32_t ms = kNoLimit;
  if (asr.has_field(U(key)) && asr.at(U(key)).is_number()) {
    ms = static_cast<uint32_t>(JsonToInt32(asr.at(U(key)).as_number()));
  }
  const uint32_t samples = ms * kSamplesPerMs;
  return samples == 0 ? kNoLimit : samples;
}

// Texts from the decoder or punctuation library are passed through as they
// are, except that bytes which are not UTF-8 become U+FFFD: hosts must be
// able to parse every message.
std::string ValidUtf8(const std::string& text) {
  static const char kReplacement[] = "\xEF\xBF\xBD";
  std::string out;
  out.reserve(text.size());
  size_t i = 0;
  while (i < text.size()) {
    const unsigned char lead = static_cast<unsigned char>(text[i]);
    size_t length = 0;
    uint32_t min_code = 0;
    if (lead < 0x80) {
      length = 1;
    } else if (lead >= 0xC2 && lead <= 0xDF) {
      length = 2;
      min_code = 0x80;
    } else if (lead >= 0xE0 && lead <= 0xEF) {
      length = 3;
      min_code = 0x800;
    } else if (lead >= 0xF0 && lead <= 0xF4) {
      length = 4;
      min_code = 0x10000;
    }
    bool valid = length > 0 && i + length <= text.size();
    uint32_t code = length == 1 ? lead : lead & (0x7F >> length);
    for (size_t k = 1; valid && k < length; ++k) {
      const unsigned char c = static_cast<unsigned char>(text[i + k]);
      valid = (c & 0xC0) == 0x80;
      code = (code << 6) | (c & 0x3F);
    }
    // Overlong forms, surrogates and values beyond U+10FFFF are not UTF-8.
    valid = valid && code >= min_code && code <= 0x10FFFF && (code < 0xD800 || code > 0xDFFF);
    if (valid) {
      out.append(text, i, length);
      i += length;
    } else {
      out += kReplacement;
      ++i;
    }
  }
  return out;
}

// Objects keep their keys sorted, which fixes the key order of the message.
std::string BuildResultMessage(int status, const std::string& message, const std::string& text,
                               bool is_break) {
  value result = value::object(false);
  result[U("isBreak")] = value::boolean(is_break);
  result[U("text")] = value::string(ValidUtf8(text));
  value root = value::object(false);
  root[U("message")] = value::string(message);
  root[U("result")] = std::move(result);
  root[U("status")] = value::number(status);
  return root.serialize();
}

}  // namespace

OfflineAsrEngineImpl::OfflineAsrEngineImpl() : log_prefix_("OfflineAsrEngineImpl->") {}

OfflineAsrEngineImpl::~OfflineAsrEngineImpl() { Close(); }

bool OfflineAsrEngineImpl::Init(std::string params) {
  std::cout << "init params:" << params << std::endl;
  if (state_ != kNotInitialized) {
    std::cout << log_prefix_ << "asr state invalid" << std::endl;
    return false;
  }
  try {
    value root = value::parse(params);
    const std::string vad_dir = root[U("local_vad_model_dir_path")].as_string();
    const std::string lang = StringOrEmpty(root, "lang");
    const bool vad_enabled = BoolOrFalse(root, "vad_enabled");
    if (lang.empty()) {
      // compat: the established wording of this message; hosts match the text.
      std::cout << log_prefix_ << "language can not empty" << std::endl;
      return false;
    }
    if (vad_enabled) {
      vad_ = std::make_shared<Vad>(vad_dir);
      if (!vad_->Init()) throw std::runtime_error("init vad failed");
    } else {
      // A segment buffer left by an earlier failed Init must not filter the
      // audio of an engine initialised without one.
      vad_ = nullptr;
    }
    // compat: a refused decoder and the VAD made before it stay until the next Init drops them.
    InitLocalAsr(root, lang);
    state_ = kInitialized;
    lang_ = lang;
    return true;
  } catch (const std::exception& e) {
    std::cout << log_prefix_ << "asr init exception:" << e.what() << std::endl;
    return false;
  }
}

void OfflineAsrEngineImpl::InitLocalAsr(value& params, const std::string& lang) {
  const std::string model_path = params[U("local_moxwing_model_file_path")].as_string();
  decoder_ = std::make_shared<Moxwing>(model_path, lang);
  if (!decoder_->Init()) throw std::runtime_error("init local asr failed");

  // Punctuation is not offered for Thai.
  if (!params.has_field(U("local_punc_settings"))) return;
  const value& settings = params.at(U("local_punc_settings"));
  if (!settings.is_object() || lang.compare(0, 2, "th") == 0) return;

  punctuator_ = std::make_shared<Punctuator>(
      StringOrEmpty(settings, "model_path"), StringOrEmpty(settings, "vocab_path"),
      StringOrEmpty(settings, "punc_path"), StringOrEmpty(settings, "num_path"),
      StringOrEmpty(settings, "case_path"), StringOrEmpty(settings, "xdb_path"),
      StringOrEmpty(settings, "bpe_path"), lang.substr(0, 2), BoolOrFalse(settings, "punc_all"));
  if (!punctuator_->Init()) {
    decoder_ = nullptr;
    punctuator_ = nullptr;
    throw std::runtime_error("init local punc failed");
  }
}

bool OfflineAsrEngineImpl::AsrStart(std::string params, void* context, ResultSink sink) {
  if (state_ != kInitialized) {
    std::cout << log_prefix_ << "current state not initialized" << std::endl;
    return false;
  }
  sink_ = std::move(sink);
  context_ = context;
  try {
    value root = value::parse(params);
    value& asr = root[U("asr")];
    asr.as_object();  // required: throws "not an object" otherwise
    max_mute_before_voice_ = MuteLimitSamples(asr, "max_mute_time_before_voice");
    max_mute_after_voice_ = MuteLimitSamples(asr, "max_mute_time_after_voice");
    if (vad_ && !vad_->Start()) throw std::runtime_error("vad start fail");
    if (!decoder_) throw std::runtime_error("asr decoder is null");
    if (!decoder_->Start([this](std::error_code status, std::string text, bool is_break) {
          OnDecoderResult(status, std::move(text), is_break);
        })) {
      throw std::runtime_error("start local asr failed");
    }
    state_ = kStarted;
    return true;
  } catch (const std::exception& e) {
    std::cout << log_prefix_ << "asr start exception:" << e.what() << std::endl;
    return false;
  }
}

void OfflineAsrEngineImpl::Stop() {
  if (state_ != kStarted) return;
  if (vad_) vad_->Reset();
  if (decoder_) decoder_->Stop();
  voice_seen_ = false;
  mute_samples_ = 0;
  max_mute_after_voice_ = 0;
  max_mute_before_voice_ = 0;
  state_ = kInitialized;
}

void OfflineAsrEngineImpl::Close() {
  Stop();
  if (state_ != kInitialized) return;
  if (vad_) {
    vad_->Release();
    vad_ = nullptr;
  }
  if (decoder_) {
    decoder_->Release();
    decoder_ = nullptr;
  }
  punctuator_ = nullptr;
  sink_ = nullptr;
  context_ = nullptr;
  state_ = kNotInitialized;
}

void* OfflineAsrEngineImpl::GetContext() { return context_; }

bool OfflineAsrEngineImpl::ProcessSoundData(const uint16_t* data, int count, int packet) {
  if (!data || count <= 0) return false;
  if (state_ != kStarted) {
    std::cout << log_prefix_ << "not started yet" << std::endl;
    return false;
  }
  bool ok = true;
  bool last = packet < 0;
  std::vector<uint16_t> segment;
  if (vad_) {
    mute_samples_ += static_cast<uint32_t>(count);
    vad_->ProcessIn(data, static_cast<size_t>(count), last);
    segment = vad_->TakeSegment(&last);
    data = segment.data();
    count = static_cast<int>(segment.size());
    if (segment.empty()) {
      const uint32_t limit = voice_seen_ ? max_mute_after_voice_ : max_mute_before_voice_;
      if (mute_samples_ >= limit) {
        std::cout << log_prefix_ << "vad mute timeout" << std::endl;
        OnMuteTimeout();
        return false;
      }
    } else {
      voice_seen_ = true;
      mute_samples_ = 0;
    }
  }
  // With the VAD on this also runs for an empty chunk, so that a last flag
  // still reaches the decoder and restarts it.
  if (decoder_) ok = decoder_->SetData(data, count, last);
  return ok;
}

void OfflineAsrEngineImpl::OnMuteTimeout() {
  // Stop may deliver a final result through the sink; the time-out message
  // must follow it even though Stop leaves the engine able to be closed.
  ResultSink sink = sink_;
  Stop();
  if (sink) sink(BuildResultMessage(kTimeoutStatus, "vad mute timeout", "", true));
}

void OfflineAsrEngineImpl::OnDecoderResult(std::error_code status, std::string text,
                                           bool is_break) {
  if (!sink_) return;
  if (punctuator_) {
    std::string punctuated = punctuator_->Punctuate(text, is_break);
    if (!punctuated.empty()) {
      text = std::move(punctuated);
    } else {
      // compat: also logged for every partial text left alone; hosts' logs always had these lines.
      std::cout << log_prefix_ << "punc failed: " << text << std::endl;
    }
  }
  sink_(BuildResultMessage(status.value(), status.message(), text, is_break));
}

}  // namespace speech
}  // namespace vorta
