// SPDX-License-Identifier: Apache-2.0
// The public C functions, linked through libkvasr_offline.so with the test
// doubles standing in for the platform libraries.
#include "kvasr_offline.h"

#include <gtest/gtest.h>

#include <string>
#include <tuple>
#include <vector>

#include "decoder_double.h"
#include "test_support.h"

namespace {

using kvasr_test::Stdout;
using Received = std::tuple<void*, std::string, void*>;  // engine, message, context

std::vector<Received> g_received;

void Collect(void* engine, const char* json, void* context) {
  g_received.emplace_back(engine, json, context);
}

class CApiTest : public testing::Test {
 protected:
  void SetUp() override {
    decoder_double::Reset();
    g_received.clear();
    engine_ = vorta_speech_create_offline_asr_engine();
  }
  void TearDown() override {
    Stdout([&] { vorta_speech_release_offline_asr_engine(engine_); });
  }

  void InitAndStart(vorta_speech_result_callback callback) {
    const std::string params = R"({"local_vad_model_dir_path":"unused","lang":"en",)"
                               R"("local_moxwing_model_file_path":")" +
                               model_.path() + "\"}";
    Stdout([&] {
      ASSERT_EQ(vorta_speech_offline_asr_init(engine_, params.c_str()), 0);
      ASSERT_EQ(vorta_speech_offline_asr_start(engine_, R"({"asr":{}})", callback, &context_), 0);
    });
  }

  // Sends `samples` with `packet` while the decoder reports one final "abc".
  int ProcessWithResult(const std::vector<int16_t>& samples, int packet) {
    decoder_double::QueueOnSetData({decoder_double::Result("abc", 1)});
    int status = 0;
    Stdout([&] {
      const int count = static_cast<int>(samples.size());
      status = vorta_speech_offline_asr_process_sound_data(engine_, samples.data(), count, packet);
    });
    return status;
  }

  kvasr_test::TempFile model_{"model"};
  void* engine_ = nullptr;
  int context_ = 0;
};

TEST_F(CApiTest, NullHandlesAreRefusedWithoutTouchingMemory) {
  const int16_t s[1] = {0};
  EXPECT_EQ(vorta_speech_offline_asr_init(nullptr, "{}"), -1);
  EXPECT_EQ(vorta_speech_offline_asr_start(nullptr, "{}", Collect, &context_), -1);
  EXPECT_EQ(vorta_speech_offline_asr_stop(nullptr), -1);
  EXPECT_EQ(vorta_speech_offline_asr_get_context(nullptr), nullptr);
  EXPECT_EQ(vorta_speech_offline_asr_process_sound_data(nullptr, s, 1, 0), -1);
  vorta_speech_offline_asr_close(nullptr);
  vorta_speech_release_offline_asr_engine(nullptr);
  // Null parameter texts are refused too rather than thrown through C.
  EXPECT_EQ(vorta_speech_offline_asr_init(engine_, nullptr), -1);
  EXPECT_EQ(vorta_speech_offline_asr_start(engine_, nullptr, Collect, &context_), -1);
}

TEST_F(CApiTest, SamplesAndPacketSignReachTheDecoderAndResultsTheCallback) {
  InitAndStart(Collect);
  EXPECT_EQ(vorta_speech_offline_asr_get_context(engine_), &context_);
  for (int packet : {0, 1000, -1, -1000}) {
    SCOPED_TRACE(packet);
    g_received.clear();
    decoder_double::ClearCalls();
    ASSERT_EQ(ProcessWithResult({1, -1, 2, -2}, packet), 0);
    const decoder_double::Call& call = decoder_double::Calls()[0];
    EXPECT_EQ(call.samples, (std::vector<int16_t>{1, -1, 2, -2}));
    EXPECT_EQ(call.args, (std::vector<int64_t>{4, packet < 0 ? 1 : 0}));
    const std::string abc =
        R"({"message":"Success","result":{"isBreak":true,"text":"abc"},"status":0})";
    EXPECT_EQ(g_received, (std::vector<Received>{{engine_, abc, &context_}}));
  }
}

TEST_F(CApiTest, NullCallbackDropsResults) {
  InitAndStart(nullptr);
  EXPECT_EQ(ProcessWithResult({0}, 0), 0);
  EXPECT_TRUE(g_received.empty());
}

TEST_F(CApiTest, StopAlwaysSucceedsAndCloseForgetsTheContext) {
  EXPECT_EQ(vorta_speech_offline_asr_stop(engine_), 0);
  EXPECT_EQ(vorta_speech_offline_asr_get_context(engine_), nullptr);
  InitAndStart(Collect);
  decoder_double::QueueOnStop({decoder_double::Result("the end", 1)});
  Stdout([&] { EXPECT_EQ(vorta_speech_offline_asr_stop(engine_), 0); });
  ASSERT_EQ(g_received.size(), 1u);  // the final result arrives inside stop
  EXPECT_EQ(vorta_speech_offline_asr_stop(engine_), 0);
  vorta_speech_offline_asr_close(engine_);
  EXPECT_EQ(vorta_speech_offline_asr_get_context(engine_), nullptr);
  EXPECT_EQ(ProcessWithResult({0}, 0), -1);
}

TEST_F(CApiTest, VersionIsTheDecoderLibrarysAndStaysReadable) {
  const char* first = vorta_speech_get_offline_asr_version();
  ASSERT_NE(first, nullptr);
  std::vector<std::string> churn(100, std::string(64, 'x'));  // reuse freed heap, if any
  EXPECT_STREQ(first, "decoder-double 1.0");
  EXPECT_EQ(vorta_speech_get_offline_asr_version(), first);
}

TEST_F(CApiTest, ReleaseClosesAStartedEngine) {
  InitAndStart(Collect);
  Stdout([&] { vorta_speech_release_offline_asr_engine(engine_); });
  engine_ = nullptr;
  EXPECT_EQ(decoder_double::LiveDecoders(), 0);
  EXPECT_EQ(decoder_double::Count("mwStopDecode"), 1);
}

}  // namespace
