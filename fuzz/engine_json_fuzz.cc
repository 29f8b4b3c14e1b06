// SPDX-License-Identifier: Apache-2.0
// The init and start parameter texts, through the engine with the test
// doubles as back ends. The input is the init text, a zero byte, then the
// start text; without a zero byte the same text serves as both.
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "decoder_double.h"
#include "fuzz_support.h"
#include "moxwing.h"
#include "offline_asr_engine_impl.h"
#include "punctuator_double.h"
#include "quellan_double.h"

using vorta::speech::Moxwing;
using vorta::speech::OfflineAsrEngineImpl;

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  // Seeds name the decoder model "m", relative to the working directory.
  if (chdir(kvasr_fuzz::ScratchDir().c_str()) != 0) std::abort();
  kvasr_fuzz::WriteFile("m", "model", 5);
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const char* text = reinterpret_cast<const char*>(data);
  const void* zero = std::memchr(data, 0, size);
  const size_t init_size = zero ? static_cast<const uint8_t*>(zero) - data : size;
  const std::string init(text, init_size);
  const std::string start = zero ? std::string(text + init_size + 1, size - init_size - 1) : init;

  decoder_double::Reset();
  punctuator_double::Reset();
  quellan_double::Reset();
  // A final text on stop, so that a started engine sends a message.
  decoder_double::QueueOnStop({decoder_double::Result("text", 1)});

  Moxwing::GlobalInit(init);
  int messages = 0;
  {
    OfflineAsrEngineImpl engine;
    if (engine.Init(init)) {
      if (engine.state() != OfflineAsrEngineImpl::kInitialized) std::abort();
      if (engine.AsrStart(start, nullptr, [&messages](std::string) { ++messages; })) {
        if (engine.state() != OfflineAsrEngineImpl::kStarted) std::abort();
        const std::vector<uint16_t> chunk(160, 0);
        engine.ProcessSoundData(chunk.data(), static_cast<int>(chunk.size()), -1);
      }
      engine.Stop();
      engine.Close();
    } else if (engine.state() != OfflineAsrEngineImpl::kNotInitialized) {
      std::abort();
    }
  }
  // Whatever was created is released with the engine.
  if (decoder_double::LiveDecoders() != 0 || punctuator_double::LiveHandles() != 0 ||
      quellan_double::LiveHandles() != 0) {
    std::abort();
  }
  return 0;
}
