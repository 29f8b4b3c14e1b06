// SPDX-License-Identifier: Apache-2.0
// The C interface driven by a byte stream that chooses the calls: engines are
// created, initialised (the voice activity module on or off, with small test
// models), started, fed chunks of any size and content, stopped, closed and
// released in any order. Every message must be well-formed JSON, and an
// engine that timed out must stay silent until it is started again.
#include <fuzzer/FuzzedDataProvider.h>

#include <cpprest/json.h>

#include <array>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <iterator>
#include <string>
#include <vector>

#include "decoder_double.h"
#include "fuzz_support.h"
#include "kvasr_offline.h"
#include "model_files.h"

namespace {

constexpr int kMaxEngines = 2;
constexpr int kMaxCalls = 64;
constexpr int kMaxChunk = 40000;  // 2.5 s
constexpr int kTimeoutStatus = -100;

struct Slot {
  void* engine = nullptr;
  bool timed_out = false;
};

struct Fixtures {
  std::string decoder_model;
  std::string speech_models;  // every frame above the energy gate is speech
  std::string silent_models;  // nothing is speech
};

const Fixtures& fixtures() {
  static const Fixtures f = [] {
    Fixtures x;
    x.decoder_model = kvasr_fuzz::ScratchDir() + "/m";
    kvasr_fuzz::WriteFile(x.decoder_model, "model", 5);
    x.speech_models = quellan_test::MakeModelDir(16.0f);
    x.silent_models = quellan_test::MakeModelDir(-16.0f);
    return x;
  }();
  return f;
}

void CheckMessage(void*, const char* text, void* context) {
  Slot* slot = static_cast<Slot*>(context);
  if (text == nullptr || slot == nullptr || slot->timed_out) std::abort();
  const web::json::value message = web::json::value::parse(text);  // throws when malformed
  const web::json::value& result = message.at(U("result"));
  if (!message.at(U("message")).is_string() || !result.at(U("text")).is_string() ||
      !result.at(U("isBreak")).is_boolean()) {
    std::abort();
  }
  if (message.at(U("status")).as_integer() == kTimeoutStatus) slot->timed_out = true;
}

std::string InitParams(FuzzedDataProvider& in) {
  const Fixtures& f = fixtures();
  const std::string decoder = R"("local_moxwing_model_file_path":")" + f.decoder_model + R"(",)";
  switch (in.ConsumeIntegralInRange(0, 5)) {
    case 0:
      return "{" + decoder + R"("local_vad_model_dir_path":")" + f.speech_models +
             R"(","lang":"en-US","vad_enabled":true})";
    case 1:
      return "{" + decoder + R"("local_vad_model_dir_path":")" + f.silent_models +
             R"(","lang":"en-US","vad_enabled":true})";
    case 2:
      return "{" + decoder + R"("local_vad_model_dir_path":"","lang":"fr","vad_enabled":false})";
    case 3:
      return "{" + decoder + R"("local_vad_model_dir_path":")" + f.speech_models +
             R"(","lang":"en","vad_enabled":true,"local_punc_settings":{"model_path":"p",)"
             R"("punc_all":true}})";
    case 4: return "{" + decoder + R"("lang":"en","vad_enabled":true})";
    default: return in.ConsumeRandomLengthString(300);
  }
}

std::string StartParams(FuzzedDataProvider& in) {
  if (in.ConsumeBool()) return in.ConsumeRandomLengthString(100);
  const int before =
      in.ConsumeBool() ? in.ConsumeIntegralInRange(0, 6000) : in.ConsumeIntegral<int32_t>();
  const int after =
      in.ConsumeBool() ? in.ConsumeIntegralInRange(0, 6000) : in.ConsumeIntegral<int32_t>();
  return R"({"asr":{"max_mute_time_before_voice":)" + std::to_string(before) +
         R"(,"max_mute_time_after_voice":)" + std::to_string(after) + "}}";
}

// Silence, loud noise, a quiet hum or the input's own bytes.
std::vector<int16_t> Samples(FuzzedDataProvider& in, int count) {
  std::vector<int16_t> samples(static_cast<size_t>(count > 0 ? count : 1));
  const int kind = in.ConsumeIntegralInRange(0, 3);
  uint32_t seed = in.ConsumeIntegral<uint32_t>();
  for (size_t i = 0; i < samples.size(); ++i) {
    seed = seed * 1664525u + 1013904223u;
    switch (kind) {
      case 0: samples[i] = 0; break;
      case 1: samples[i] = static_cast<int16_t>(seed >> 16); break;
      case 2: samples[i] = static_cast<int16_t>((seed >> 28) - 8); break;
      default: samples[i] = in.ConsumeIntegral<int16_t>(); break;
    }
  }
  return samples;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  FuzzedDataProvider in(data, size);
  decoder_double::Reset();
  std::array<Slot, kMaxEngines> slots;
  for (int call = 0; call < kMaxCalls && in.remaining_bytes() > 0; ++call) {
    Slot& slot = slots[in.ConsumeIntegralInRange(0, kMaxEngines - 1)];
    void* engine = slot.engine;
    switch (in.ConsumeIntegralInRange(0, 10)) {
      case 0:
        if (engine == nullptr) slot.engine = vorta_speech_create_offline_asr_engine();
        break;
      case 1:
        decoder_double::SetInitFails(in.ConsumeIntegralInRange(0, 7) == 0);
        vorta_speech_offline_asr_init(engine, InitParams(in).c_str());
        break;
      case 2: {
        const std::string params = StartParams(in);
        if (vorta_speech_offline_asr_start(engine, params.c_str(),
                                           in.ConsumeBool() ? CheckMessage : nullptr, &slot) == 0) {
          slot.timed_out = false;
        }
        break;
      }
      case 3:
      case 4: {
        const int count = in.ConsumeBool() ? in.ConsumeIntegralInRange(-4, 400)
                                           : in.ConsumeIntegralInRange(-4, kMaxChunk);
        const int packet = in.ConsumeIntegralInRange(-3, 3);
        const std::vector<int16_t> samples = Samples(in, count);
        vorta_speech_offline_asr_process_sound_data(
            engine, in.ConsumeIntegralInRange(0, 15) == 0 ? nullptr : samples.data(), count,
            packet);
        break;
      }
      case 5: vorta_speech_offline_asr_stop(engine); break;
      case 6: vorta_speech_offline_asr_close(engine); break;
      case 7:
        vorta_speech_release_offline_asr_engine(engine);
        slot = Slot();
        break;
      case 8:
        if (engine != nullptr && vorta_speech_offline_asr_get_context(engine) != nullptr &&
            vorta_speech_offline_asr_get_context(engine) != &slot) {
          std::abort();
        }
        break;
      case 9: {
        // Texts the decoder reports from inside the next feed or stop. They
        // are passed on byte for byte, so only valid UTF-8 can come out as
        // valid JSON: the pieces cover quoting, control characters and
        // multi-byte characters.
        static const char* const kPieces[] = {
            "word", " ", "\"", "\\", "\n", "\x01", "\x7f", "\xc3\xa9", "\xe0\xb8\xaa", "/", "{}"};
        std::string text;
        for (int n = in.ConsumeIntegralInRange(0, 8); n > 0; --n) {
          text += kPieces[in.ConsumeIntegralInRange<size_t>(0, std::size(kPieces) - 1)];
        }
        const int flag = in.ConsumeIntegralInRange(-1, 1);
        if (in.ConsumeBool()) {
          decoder_double::QueueOnSetData({decoder_double::Result(text, flag)});
        } else {
          decoder_double::QueueOnStop({decoder_double::Result(text, flag)});
        }
        decoder_double::QueueSetDataResult(in.ConsumeIntegralInRange(-1, 0));
        break;
      }
      default:
        if (vorta_speech_get_offline_asr_version() == nullptr) std::abort();
        break;
    }
  }
  for (Slot& slot : slots) vorta_speech_release_offline_asr_engine(slot.engine);
  if (decoder_double::LiveDecoders() != 0) std::abort();
  return 0;
}
