// The exported C functions: null-checking shims over the engine.
#include <cstdint>
#include <string>

#include "kvasr_offline.h"
#include "moxwing.h"
#include "offline_asr_engine_impl.h"

using vorta::speech::Moxwing;
using vorta::speech::OfflineAsrEngineImpl;

namespace {

OfflineAsrEngineImpl* AsEngine(void* engine) { return static_cast<OfflineAsrEngineImpl*>(engine); }

}  // namespace

extern "C" {

const char* vorta_speech_get_offline_asr_version(void) {
  // Read once and kept for the life of the process, so the pointer handed out
  // never dangles; the decoder library's version does not change while loaded.
  static const std::string version = Moxwing::Version();
  return version.c_str();
}

void* vorta_speech_create_offline_asr_engine(void) { return new OfflineAsrEngineImpl(); }

void vorta_speech_release_offline_asr_engine(void* engine) { delete AsEngine(engine); }

int vorta_speech_offline_asr_init(void* engine, const char* params) {
  if (!engine || !params) return -1;
  return AsEngine(engine)->Init(params) ? 0 : -1;
}

int vorta_speech_offline_asr_start(void* engine, const char* params,
                                   vorta_speech_result_callback callback, void* context) {
  if (!engine || !params) return -1;
  // The context is read back from the engine at each result, so a result
  // always carries the context of the latest start.
  auto sink = [callback, engine](std::string text) {
    if (!callback) return;
    callback(engine, text.c_str(), AsEngine(engine)->GetContext());
  };
  return AsEngine(engine)->AsrStart(params, context, sink) ? 0 : -1;
}

int vorta_speech_offline_asr_stop(void* engine) {
  if (!engine) return -1;
  AsEngine(engine)->Stop();
  return 0;
}

void* vorta_speech_offline_asr_get_context(void* engine) {
  if (!engine) return nullptr;
  return AsEngine(engine)->GetContext();
}

void vorta_speech_offline_asr_close(void* engine) {
  if (engine) AsEngine(engine)->Close();
}

int vorta_speech_offline_asr_process_sound_data(void* engine, const int16_t* samples, int count,
                                                int packet) {
  if (!engine) return -1;
  return AsEngine(engine)->ProcessSoundData(reinterpret_cast<const uint16_t*>(samples), count,
                                            packet)
             ? 0
             : -1;
}

}  // extern "C"
