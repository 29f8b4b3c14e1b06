// The public C functions, linked through libkvasr_offline.so with the test
// doubles standing in for the platform libraries.
#include "kvasr_offline.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "decoder_double.h"
#include "punctuator_double.h"
#include "test_support.h"

namespace {

using kvasr_test::Stdout;
using kvasr_test::TempFile;

struct Received {
  void* engine;
  std::string json;
  void* context;
};

std::vector<Received> g_received;

void Collect(void* engine, const char* json, void* context) {
  g_received.push_back({engine, json, context});
}

class CApiTest : public testing::Test {
 protected:
  void SetUp() override {
    decoder_double::Reset();
    punctuator_double::Reset();
    g_received.clear();
    engine_ = vorta_speech_create_offline_asr_engine();
  }
  void TearDown() override { Stdout([&] { vorta_speech_release_offline_asr_engine(engine_); }); }

  std::string InitParams() const {
    return R"({"local_vad_model_dir_path":"unused","lang":"en","local_moxwing_model_file_path":")" +
           model_.path() + "\"}";
  }

  void InitAndStart(vorta_speech_result_callback callback, void* context) {
    Stdout([&] {
      ASSERT_EQ(vorta_speech_offline_asr_init(engine_, InitParams().c_str()), 0);
      ASSERT_EQ(vorta_speech_offline_asr_start(engine_, R"({"asr":{}})", callback, context), 0);
    });
  }

  TempFile model_{"model"};
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

TEST_F(CApiTest, ResultsReachTheCallbackWithEngineAndContext) {
  InitAndStart(Collect, &context_);
  EXPECT_EQ(vorta_speech_offline_asr_get_context(engine_), &context_);
  decoder_double::QueueOnSetData({decoder_double::Result("abc", 1)});
  const int16_t s[4] = {1, -1, 2, -2};
  Stdout([&] { EXPECT_EQ(vorta_speech_offline_asr_process_sound_data(engine_, s, 4, -1), 0); });
  ASSERT_EQ(g_received.size(), 1u);
  EXPECT_EQ(g_received[0].engine, engine_);
  EXPECT_EQ(g_received[0].context, &context_);
  EXPECT_EQ(g_received[0].json,
            R"({"message":"Success","result":{"isBreak":true,"text":"abc"},"status":0})");
  const auto& call = decoder_double::Calls()[decoder_double::Calls().size() - 3];
  EXPECT_EQ(call.name, "mwSetData");
  EXPECT_EQ(call.samples, (std::vector<int16_t>{1, -1, 2, -2}));
  EXPECT_EQ(call.args, (std::vector<int64_t>{4, 1}));
}

TEST_F(CApiTest, PacketSignDecidesTheLastChunk) {
  InitAndStart(Collect, &context_);
  const int16_t s[2] = {0, 0};
  for (int packet : {0, 1, 1000, -1, -1000}) {
    decoder_double::ClearCalls();
    EXPECT_EQ(vorta_speech_offline_asr_process_sound_data(engine_, s, 2, packet), 0);
    EXPECT_EQ(decoder_double::Calls()[0].args[1], packet < 0 ? 1 : 0) << packet;
  }
}

TEST_F(CApiTest, NullCallbackDropsResults) {
  InitAndStart(nullptr, &context_);
  decoder_double::QueueOnSetData({decoder_double::Result("abc", 1)});
  const int16_t s[1] = {0};
  Stdout([&] { EXPECT_EQ(vorta_speech_offline_asr_process_sound_data(engine_, s, 1, 0), 0); });
  EXPECT_TRUE(g_received.empty());
}

TEST_F(CApiTest, StopAlwaysSucceedsAndCloseForgetsTheContext) {
  EXPECT_EQ(vorta_speech_offline_asr_stop(engine_), 0);
  EXPECT_EQ(vorta_speech_offline_asr_get_context(engine_), nullptr);
  InitAndStart(Collect, &context_);
  decoder_double::QueueOnStop({decoder_double::Result("the end", 1)});
  Stdout([&] { EXPECT_EQ(vorta_speech_offline_asr_stop(engine_), 0); });
  ASSERT_EQ(g_received.size(), 1u);  // the final result arrives inside stop
  EXPECT_EQ(vorta_speech_offline_asr_stop(engine_), 0);
  vorta_speech_offline_asr_close(engine_);
  EXPECT_EQ(vorta_speech_offline_asr_get_context(engine_), nullptr);
  const int16_t s[1] = {0};
  Stdout([&] { EXPECT_EQ(vorta_speech_offline_asr_process_sound_data(engine_, s, 1, 0), -1); });
}

TEST_F(CApiTest, AFailedStartStillRecordsTheNewContext) {
  InitAndStart(Collect, &context_);
  vorta_speech_offline_asr_stop(engine_);
  int other = 0;
  Stdout([&] { EXPECT_EQ(vorta_speech_offline_asr_start(engine_, "{}", Collect, &other), -1); });
  EXPECT_EQ(vorta_speech_offline_asr_get_context(engine_), &other);
}

TEST_F(CApiTest, VersionIsTheDecoderLibrarysAndStaysReadable) {
  const char* first = vorta_speech_get_offline_asr_version();
  ASSERT_NE(first, nullptr);
  EXPECT_STREQ(first, "decoder-double 1.0");
  std::vector<std::string> churn(100, std::string(64, 'x'));  // reuse freed heap, if any
  EXPECT_STREQ(first, "decoder-double 1.0");
  EXPECT_EQ(vorta_speech_get_offline_asr_version(), first);
}

TEST_F(CApiTest, ReleaseClosesAStartedEngine) {
  InitAndStart(Collect, &context_);
  Stdout([&] { vorta_speech_release_offline_asr_engine(engine_); });
  engine_ = nullptr;
  EXPECT_EQ(decoder_double::LiveDecoders(), 0);
  EXPECT_EQ(decoder_double::Count("mwStopDecode"), 1);
}

}  // namespace
