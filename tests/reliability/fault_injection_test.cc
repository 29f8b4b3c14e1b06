// SPDX-License-Identifier: Apache-2.0
// Allocation failures during init: whichever allocation fails, init either
// absorbs it or fails cleanly, leaving an uninitialised engine that can be
// initialised again and released.
#include <gtest/gtest.h>

#include <cstdio>
#include <new>
#include <string>
#include <vector>

#include "failing_allocator.h"
#include "kvasr_offline.h"
#include "model_files.h"
#include "offline_asr_engine_impl.h"

namespace vorta {
namespace speech {
namespace {

TEST(FaultInjectionTest, EveryAllocationOfInitMayFail) {
  const std::string dir = quellan_test::MakeModelDir(16.0f);
  const std::string params =
      R"({"local_moxwing_model_file_path":"/dev/null","local_vad_model_dir_path":")" + dir +
      R"(","lang":"en-US","vad_enabled":true,"local_punc_settings":{"model_path":"p"}})";
  const std::vector<uint16_t> chunk(1600, 1000);
  int refused = 0;
  long n = 1;
  for (;; ++n) {
    SCOPED_TRACE("allocation " + std::to_string(n));
    auto* engine = new OfflineAsrEngineImpl();
    testing::internal::CaptureStdout();
    kvasr_reliability::FailAllocation(n);
    // Through the C function: nothing may escape to a C caller, not even
    // from the copy of the parameter text made before init runs.
    const bool initialised = vorta_speech_offline_asr_init(engine, params.c_str()) == 0;
    const bool failed_one = kvasr_reliability::AllocationFailed();
    kvasr_reliability::FailAllocation(0);
    // Back ends made before the failure stay until the next init replaces
    // them or the engine goes; only the state tells.
    const bool uninitialised = engine->state() == OfflineAsrEngineImpl::kNotInitialized;
    const bool reinitialised = initialised || engine->Init(params);
    // Whatever init absorbed, the engine works.
    const bool started = engine->AsrStart(R"({"asr":{}})", nullptr, [](std::string) {});
    const bool fed =
        started && engine->ProcessSoundData(chunk.data(), static_cast<int>(chunk.size()), -1);
    const std::string log = testing::internal::GetCapturedStdout();
    if (!initialised) {
      ++refused;
      EXPECT_TRUE(failed_one) << "init failed without an allocation failing\n" << log;
      EXPECT_TRUE(uninitialised) << log;
    }
    EXPECT_TRUE(reinitialised) << "a failed init must not spoil the next\n" << log;
    EXPECT_TRUE(fed) << log;
    delete engine;
    if (testing::Test::HasFailure()) break;
    if (!failed_one) break;  // init needed fewer than n allocations
  }
  std::printf("init makes %ld allocations; failing one of them refused init %d times\n", n - 1,
              refused);
  EXPECT_EQ(refused, n - 1);
}

}  // namespace
}  // namespace speech
}  // namespace vorta
