// SPDX-License-Identifier: Apache-2.0
// The exported C functions: null-checking shims over the engine.
//
// No exception may cross into a C caller. The engine reports its own
// failures as false; what can still escape it is std::bad_alloc (or another
// std::exception from the standard library), which becomes -1 here.
#include <cstdint>
#include <exception>
#include <new>
#include <string>

#include "kvasr_offline.h"
#include "moxwing.h"
#include "offline_asr_engine_impl.h"

using vorta::speech::Moxwing;
using vorta::speech::OfflineAsrEngineImpl;

namespace {

OfflineAsrEngineImpl* AsEngine(void* engine) { return static_cast<OfflineAsrEngineImpl*>(engine); }

template <typename Operation>
int StatusOf(Operation operation) {
  try {
    return operation() ? 0 : -1;
  } catch (const std::exception&) {
    return -1;
  }
}

}  // namespace

extern "C" {

const char* vorta_speech_get_offline_asr_version(void) {
  // Read once and kept for the life of the process, so the pointer handed out
  // never dangles; the decoder library's version does not change while loaded.
  static const std::string version = Moxwing::Version();
  return version.c_str();
}

void* vorta_speech_create_offline_asr_engine(void) {
  return new (std::nothrow) OfflineAsrEngineImpl();
}

void vorta_speech_release_offline_asr_engine(void* engine) {
  StatusOf([engine] {
    delete AsEngine(engine);
    return true;
  });
}

int vorta_speech_offline_asr_init(void* engine, const char* params) {
  if (!engine || !params) return -1;
  return StatusOf([&] { return AsEngine(engine)->Init(params); });
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
  return StatusOf([&] { return AsEngine(engine)->AsrStart(params, context, sink); });
}

int vorta_speech_offline_asr_stop(void* engine) {
  if (!engine) return -1;
  StatusOf([engine] {
    AsEngine(engine)->Stop();
    return true;
  });
  return 0;
}

void* vorta_speech_offline_asr_get_context(void* engine) {
  if (!engine) return nullptr;
  return AsEngine(engine)->GetContext();
}

void vorta_speech_offline_asr_close(void* engine) {
  if (!engine) return;
  StatusOf([engine] {
    AsEngine(engine)->Close();
    return true;
  });
}

int vorta_speech_offline_asr_process_sound_data(void* engine, const int16_t* samples, int count,
                                                int packet) {
  if (!engine) return -1;
  return StatusOf([&] {
    return AsEngine(engine)->ProcessSoundData(reinterpret_cast<const uint16_t*>(samples), count,
                                              packet);
  });
}

}  // extern "C"
