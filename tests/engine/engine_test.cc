#include "offline_asr_engine_impl.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "decoder_double.h"
#include "punctuator_double.h"
#include "quellan_double.h"
#include "test_support.h"

namespace vorta {
namespace speech {
namespace {

using kvasr_test::Stdout;
using kvasr_test::TempFile;

constexpr char kResultFinalAbc[] =
    R"({"message":"Success","result":{"isBreak":true,"text":"abc"},"status":0})";
constexpr char kTimeout[] =
    R"({"message":"vad mute timeout","result":{"isBreak":true,"text":""},"status":-100})";

class EngineTest : public testing::Test {
 protected:
  void SetUp() override {
    decoder_double::Reset();
    punctuator_double::Reset();
    quellan_double::Reset();
  }

  std::string InitParams(const std::string& extra = "") const {
    return R"({"local_vad_model_dir_path":"vadmodels","lang":"en-US",)"
           R"("local_moxwing_model_file_path":")" + model_.path() + "\"" + extra + "}";
  }

  ResultSink Collect() {
    return [this](std::string m) { messages_.push_back(std::move(m)); };
  }

  // An engine initialised with `extra` init keys and started with `asr`.
  void Started(const std::string& extra, const std::string& asr = "{}") {
    Stdout([&] {
      ASSERT_TRUE(engine_.Init(InitParams(extra)));
      ASSERT_TRUE(engine_.AsrStart(R"({"asr":)" + asr + "}", &context_, Collect()));
    });
    decoder_double::ClearCalls();
  }

  // Feeds one sample while the decoder reports `results`; returns the log.
  std::string Decode(std::vector<decoder_double::Event> results) {
    decoder_double::QueueOnSetData(std::move(results));
    const uint16_t sample = 0;
    return Stdout([&] { EXPECT_TRUE(engine_.ProcessSoundData(&sample, 1, 0)); });
  }

  std::vector<decoder_double::Call> SetDataCalls() const {
    std::vector<decoder_double::Call> out;
    for (const auto& c : decoder_double::Calls()) {
      if (c.name == "mwSetData") out.push_back(c);
    }
    return out;
  }

  TempFile model_{"decoder-model"};
  OfflineAsrEngineImpl engine_;
  std::vector<std::string> messages_;
  int context_ = 0;
};

// ---- Init ----------------------------------------------------------------

TEST_F(EngineTest, InitWithoutVadOrPunctuationCreatesTheDecoderOnly) {
  const std::string params = InitParams();
  const std::string log = Stdout([&] { EXPECT_TRUE(engine_.Init(params)); });
  EXPECT_EQ(log, "init params:" + params + "\n");
  EXPECT_EQ(engine_.state(), 1);
  EXPECT_TRUE(engine_.has_decoder());
  EXPECT_FALSE(engine_.has_vad());
  EXPECT_FALSE(engine_.has_punctuator());
  EXPECT_EQ(quellan_double::Count("quellan_create"), 0);

  EXPECT_EQ(Stdout([&] { EXPECT_FALSE(engine_.Init(params)); }),
            "init params:" + params + "\nOfflineAsrEngineImpl->asr state invalid\n");
}

TEST_F(EngineTest, InitRefusesBadParametersWithTheirLogLines) {
  struct Case {
    std::string params;
    std::string log_tail;  // what follows the "init params:" line
  };
  const std::string model = model_.path();
  const std::vector<Case> cases = {
      {R"({"lang":"en","local_moxwing_model_file_path":")" + model + "\"}",
       "OfflineAsrEngineImpl->asr init exception:not a string\n"},
      {R"({"local_vad_model_dir_path":7,"lang":"en"})",
       "OfflineAsrEngineImpl->asr init exception:not a string\n"},
      {R"({"local_vad_model_dir_path":"d","local_moxwing_model_file_path":")" + model + "\"}",
       "OfflineAsrEngineImpl->language can not empty\n"},
      {R"({"local_vad_model_dir_path":"d","lang":"","local_moxwing_model_file_path":"m"})",
       "OfflineAsrEngineImpl->language can not empty\n"},
      {R"({"local_vad_model_dir_path":"d","lang":12,"local_moxwing_model_file_path":"m"})",
       "OfflineAsrEngineImpl->language can not empty\n"},
      {R"({"local_vad_model_dir_path":"d","lang":"en"})",
       "OfflineAsrEngineImpl->asr init exception:not a string\n"},
      {R"({"local_vad_model_dir_path":"d","lang":"en","local_moxwing_model_file_path":"/no/such"})",
       "moxwing model file /no/such cannot open\n"
       "OfflineAsrEngineImpl->asr init exception:init local asr failed\n"},
  };
  for (const Case& c : cases) {
    OfflineAsrEngineImpl engine;
    decoder_double::Reset();
    const std::string log = Stdout([&] { EXPECT_FALSE(engine.Init(c.params)); });
    EXPECT_EQ(log, "init params:" + c.params + "\n" + c.log_tail);
    EXPECT_EQ(engine.state(), 0);
    EXPECT_FALSE(engine.has_punctuator());
    if (c.log_tail.find("language") != std::string::npos) {
      EXPECT_EQ(decoder_double::Count("mwDecoderInit"), 0);
    }
  }
}

TEST_F(EngineTest, MalformedJsonIsReportedNotThrown) {
  for (const std::string params : {"", "{", "[1,2]", "\"text\"", "{\"lang\":}"}) {
    OfflineAsrEngineImpl engine;
    const std::string log = Stdout([&] { EXPECT_FALSE(engine.Init(params)); });
    EXPECT_NE(log.find("OfflineAsrEngineImpl->asr init exception:"), std::string::npos) << params;
  }
}

TEST_F(EngineTest, DecoderRefusalKeepsTheFailedDecoderUntilAnotherInit) {
  decoder_double::SetInitFails(true);
  const std::string log = Stdout([&] { EXPECT_FALSE(engine_.Init(InitParams())); });
  EXPECT_NE(log.find("moxwing init failed\nOfflineAsrEngineImpl->asr init exception:init local asr failed\n"),
            std::string::npos);
  EXPECT_TRUE(engine_.has_decoder());
  Stdout([&] { engine_.Close(); });  // state 0: nothing happens
  EXPECT_TRUE(engine_.has_decoder());
  decoder_double::SetInitFails(false);
  Stdout([&] { EXPECT_TRUE(engine_.Init(InitParams())); });
}

TEST_F(EngineTest, VadIsCreatedOnlyWhenEnabledAndItsFailureFailsInit) {
  Stdout([&] { ASSERT_TRUE(engine_.Init(InitParams(R"(,"vad_enabled":"yes")"))); });
  EXPECT_FALSE(engine_.has_vad());

  quellan_double::SetCreateThrowsFor("vadmodels");
  decoder_double::ClearCalls();
  OfflineAsrEngineImpl engine;
  const std::string log = Stdout([&] { EXPECT_FALSE(engine.Init(InitParams(R"(,"vad_enabled":true)"))); });
  EXPECT_NE(log.find("vad init exception:init vad failed\n"
                     "OfflineAsrEngineImpl->asr init exception:init vad failed\n"),
            std::string::npos);
  EXPECT_EQ(decoder_double::Count("mwDecoderInit"), 0);
}

TEST_F(EngineTest, AnInitWithoutVadDropsTheBufferOfAFailedOne) {
  decoder_double::SetInitFails(true);
  Stdout([&] { EXPECT_FALSE(engine_.Init(InitParams(R"(,"vad_enabled":true)"))); });
  EXPECT_TRUE(engine_.has_vad());
  decoder_double::SetInitFails(false);
  Stdout([&] { ASSERT_TRUE(engine_.Init(InitParams())); });
  EXPECT_FALSE(engine_.has_vad());
}

TEST_F(EngineTest, PunctuationSettingsAreReadKeyByKey) {
  const std::string settings =
      R"(,"local_punc_settings":{"model_path":"m","vocab_path":5,"punc_path":"p",)"
      R"("case_path":"c","xdb_path":"x","bpe_path":"b","punc_all":"true"})";
  Stdout([&] { ASSERT_TRUE(engine_.Init(InitParams(settings))); });
  ASSERT_TRUE(engine_.has_punctuator());
  EXPECT_EQ(punctuator_double::Calls()[0].strings,
            (std::vector<std::string>{"m", "", "p", "", "c", "x", "b", "en"}));
}

TEST_F(EngineTest, NoPunctuatorForThaiOrANonObject) {
  const std::string settings = R"(,"local_punc_settings":{"model_path":"m"})";
  for (const std::string lang : {"th", "th-TH"}) {
    OfflineAsrEngineImpl engine;
    std::string params = InitParams(settings);
    params.replace(params.find("en-US"), 5, lang);
    Stdout([&] { ASSERT_TRUE(engine.Init(params)); });
    EXPECT_FALSE(engine.has_punctuator()) << lang;
  }
  OfflineAsrEngineImpl t;  // a one-letter lang is compared whole
  std::string params = InitParams(settings);
  params.replace(params.find("en-US"), 5, "t");
  Stdout([&] { ASSERT_TRUE(t.Init(params)); });
  EXPECT_TRUE(t.has_punctuator());

  Stdout([&] { ASSERT_TRUE(engine_.Init(InitParams(R"(,"local_punc_settings":"m")"))); });
  EXPECT_FALSE(engine_.has_punctuator());
  EXPECT_EQ(punctuator_double::Count("punctuator_init"), 1);
}

TEST_F(EngineTest, PunctuatorFailureDropsBothBackEnds) {
  punctuator_double::SetInitFails(true);
  const std::string log = Stdout(
      [&] { EXPECT_FALSE(engine_.Init(InitParams(R"(,"local_punc_settings":{})"))); });
  EXPECT_NE(log.find("punctuator init failed\n"
                     "OfflineAsrEngineImpl->asr init exception:init local punc failed\n"),
            std::string::npos);
  EXPECT_EQ(engine_.state(), 0);
  EXPECT_FALSE(engine_.has_decoder());
  EXPECT_FALSE(engine_.has_punctuator());
  EXPECT_EQ(decoder_double::LiveDecoders(), 0);
}

// ---- AsrStart ------------------------------------------------------------

TEST_F(EngineTest, StartBeforeInitStoresNothing) {
  EXPECT_EQ(Stdout([&] { EXPECT_FALSE(engine_.AsrStart(R"({"asr":{}})", &context_, Collect())); }),
            "OfflineAsrEngineImpl->current state not initialized\n");
  EXPECT_EQ(engine_.GetContext(), nullptr);
}

TEST_F(EngineTest, MuteLimitsAreMillisecondsTimesSixteenInWrappingArithmetic) {
  struct Case {
    std::string asr;
    uint32_t before;
    uint32_t after;
  };
  const std::vector<Case> cases = {
      {"{}", 0xFFFFFFF0u, 0xFFFFFFF0u},
      {R"({"max_mute_time_before_voice":0,"max_mute_time_after_voice":1000})", 0xFFFFFFFFu, 16000},
      {R"({"max_mute_time_before_voice":1.9,"max_mute_time_after_voice":-1.5})", 16, 0xFFFFFFF0u},
      {R"({"max_mute_time_before_voice":"500","max_mute_time_after_voice":null})", 0xFFFFFFF0u,
       0xFFFFFFF0u},
      {R"({"max_mute_time_before_voice":268435456,"max_mute_time_after_voice":268435457})",
       0xFFFFFFFFu, 16},
      // Integers wrap to 32 bits; a fraction out of range becomes INT32_MIN,
      // whose product with 16 wraps to 0, which means no limit.
      {R"({"max_mute_time_before_voice":4294967297,"max_mute_time_after_voice":1e300})", 16,
       0xFFFFFFFFu},
  };
  for (const Case& c : cases) {
    OfflineAsrEngineImpl engine;
    Stdout([&] {
      ASSERT_TRUE(engine.Init(InitParams()));
      ASSERT_TRUE(engine.AsrStart(R"({"asr":)" + c.asr + "}", nullptr, nullptr));
    });
    EXPECT_EQ(engine.max_mute_before_voice(), c.before) << c.asr;
    EXPECT_EQ(engine.max_mute_after_voice(), c.after) << c.asr;
    EXPECT_EQ(engine.state(), 2);
  }
}

TEST_F(EngineTest, StartFailuresKeepTheSinkAndContext) {
  Stdout([&] { ASSERT_TRUE(engine_.Init(InitParams())); });
  EXPECT_EQ(Stdout([&] { EXPECT_FALSE(engine_.AsrStart(R"({"other":{}})", &context_, Collect())); }),
            "OfflineAsrEngineImpl->asr start exception:not an object\n");
  EXPECT_EQ(engine_.GetContext(), &context_);
  EXPECT_EQ(engine_.state(), 1);

  decoder_double::SetStartResult(-1);
  EXPECT_EQ(Stdout([&] { EXPECT_FALSE(engine_.AsrStart(R"({"asr":{}})", nullptr, Collect())); }),
            "OfflineAsrEngineImpl->asr start exception:start local asr failed\n");
  EXPECT_EQ(engine_.GetContext(), nullptr);
  decoder_double::SetStartResult(0);
  Stdout([&] { EXPECT_TRUE(engine_.AsrStart(R"({"asr":{}})", &context_, Collect())); });
  EXPECT_EQ(engine_.state(), 2);
}

TEST_F(EngineTest, VadWithoutModuleFailsAtStart) {
  quellan_double::SetCreateReturnsNullFor("vadmodels");
  Stdout([&] { ASSERT_TRUE(engine_.Init(InitParams(R"(,"vad_enabled":true)"))); });
  EXPECT_EQ(Stdout([&] { EXPECT_FALSE(engine_.AsrStart(R"({"asr":{}})", nullptr, nullptr)); }),
            "OfflineAsrEngineImpl->asr start exception:vad start fail\n");
}

// ---- Stop and Close -------------------------------------------------------

TEST_F(EngineTest, StopAndCloseFollowTheStates) {
  Stdout([&] { ASSERT_TRUE(engine_.Init(InitParams())); });
  Stdout([&] { engine_.Stop(); });
  EXPECT_EQ(decoder_double::Count("mwStopDecode"), 0);  // state 1: nothing

  Stdout([&] { ASSERT_TRUE(engine_.AsrStart(R"({"asr":{}})", &context_, Collect())); });
  decoder_double::ClearCalls();
  engine_.Close();
  EXPECT_EQ(decoder_double::CallNames(),
            (std::vector<std::string>{"mwStopDecode", "mwDecoderDestroy"}));
  EXPECT_EQ(engine_.state(), 0);
  EXPECT_EQ(engine_.GetContext(), nullptr);
  EXPECT_FALSE(engine_.has_decoder());
  Stdout([&] { EXPECT_TRUE(engine_.Init(InitParams())); });  // usable again
}

TEST_F(EngineTest, ClosingReleasesEveryBackEnd) {
  Started(R"(,"vad_enabled":true,"local_punc_settings":{})");
  engine_.Close();
  EXPECT_EQ(quellan_double::LiveHandles(), 0);
  EXPECT_EQ(punctuator_double::LiveHandles(), 0);
  EXPECT_EQ(decoder_double::LiveDecoders(), 0);
  EXPECT_FALSE(engine_.has_vad());
}

// ---- Audio path without VAD ----------------------------------------------

TEST_F(EngineTest, SoundIsRefusedOutsideTheStartedState) {
  const uint16_t s[2] = {1, 2};
  EXPECT_EQ(Stdout([&] { EXPECT_FALSE(engine_.ProcessSoundData(s, 2, 0)); }),
            "OfflineAsrEngineImpl->not started yet\n");
  Started("");
  EXPECT_EQ(Stdout([&] {
              EXPECT_FALSE(engine_.ProcessSoundData(nullptr, 2, 0));
              EXPECT_FALSE(engine_.ProcessSoundData(s, 0, 0));
              EXPECT_FALSE(engine_.ProcessSoundData(s, -5, 0));
            }),
            "");
  EXPECT_TRUE(decoder_double::Calls().empty());
}

// ---- Results --------------------------------------------------------------

TEST_F(EngineTest, ResultsBecomeCompactSortedJson) {
  Started("");
  Decode({decoder_double::Result("ab", 0), decoder_double::Result("abc", 1),
          decoder_double::Result("say \"hi\" \\ ok", 0), decoder_double::Result("na\xc3\xafve", 0)});
  ASSERT_EQ(messages_.size(), 4u);
  EXPECT_EQ(messages_[0], R"({"message":"Success","result":{"isBreak":false,"text":"ab"},"status":0})");
  EXPECT_EQ(messages_[1], kResultFinalAbc);
  EXPECT_EQ(messages_[2],
            R"({"message":"Success","result":{"isBreak":false,"text":"say \"hi\" \\ ok"},"status":0})");
  EXPECT_EQ(messages_[3],
            "{\"message\":\"Success\",\"result\":{\"isBreak\":false,\"text\":\"na\xc3\xafve\"},\"status\":0}");
}

TEST_F(EngineTest, TextsThatAreNotUtf8StillGiveValidJson) {
  Started("");
  const std::vector<std::pair<std::string, std::string>> cases = {
      {"a\xff b", "a\xEF\xBF\xBD b"},                               // stray byte
      {"\xC0\xAF", "\xEF\xBF\xBD\xEF\xBF\xBD"},                    // overlong slash
      {"\xED\xA0\x80", "\xEF\xBF\xBD\xEF\xBF\xBD\xEF\xBF\xBD"},  // surrogate
      {"end\xE2\x82", "end\xEF\xBF\xBD\xEF\xBF\xBD"},               // cut short
      {"\xF0\x9F\x98\x80 ok", "\xF0\x9F\x98\x80 ok"},               // valid 4-byte form
  };
  for (const auto& c : cases) {
    messages_.clear();
    Decode({decoder_double::Result(c.first, 1)});
    ASSERT_EQ(messages_.size(), 1u);
    EXPECT_EQ(messages_[0], R"({"message":"Success","result":{"isBreak":true,"text":")" + c.second +
                                R"("},"status":0})");
  }
}

TEST_F(EngineTest, FinalTextsArePunctuatedAndPartialTextsLoggedAsSkipped) {
  Started(R"(,"local_punc_settings":{"model_path":"m"})");
  const std::string log =
      Decode({decoder_double::Result("hello", 0), decoder_double::Result("hello there", 1)});
  EXPECT_EQ(log, "asr result:hello\nOfflineAsrEngineImpl->punc failed: hello\nasr result:hello there\n");
  ASSERT_EQ(messages_.size(), 2u);
  EXPECT_EQ(messages_[0], R"({"message":"Success","result":{"isBreak":false,"text":"hello"},"status":0})");
  EXPECT_EQ(messages_[1],
            R"({"message":"Success","result":{"isBreak":true,"text":"hello there."},"status":0})");
}

TEST_F(EngineTest, PuncAllPunctuatesPartialsAndFailuresKeepTheText) {
  Started(R"(,"local_punc_settings":{"punc_all":true})");
  punctuator_double::QueueReply({0, 5, "Ab, c"});
  punctuator_double::QueueReply({2, 0, ""});
  const std::string log =
      Decode({decoder_double::Result("ab c", 0), decoder_double::Result("abc", 1)});
  EXPECT_NE(log.find("OfflineAsrEngineImpl->punc failed: abc\n"), std::string::npos);
  ASSERT_EQ(messages_.size(), 2u);
  EXPECT_EQ(messages_[0], R"({"message":"Success","result":{"isBreak":false,"text":"Ab, c"},"status":0})");
  EXPECT_EQ(messages_[1], kResultFinalAbc);
}

// ---- Audio path with VAD ---------------------------------------------------

TEST_F(EngineTest, SpeechSegmentsReachTheDecoderAndCompletedOnesAreMarkedLast) {
  Started(R"(,"vad_enabled":true)");
  quellan_double::QueueOutput({{}, 0, 0, 0});
  quellan_double::QueueOutput({{10, 11}, 1, 0, 0});
  quellan_double::QueueOutput({{12}, 1, 1, 1});
  std::vector<uint16_t> chunk(160, 5);
  for (int i = 0; i < 3; ++i) ASSERT_TRUE(engine_.ProcessSoundData(chunk.data(), 160, 0));
  const auto calls = SetDataCalls();
  ASSERT_EQ(calls.size(), 3u);
  EXPECT_EQ(calls[0].args, (std::vector<int64_t>{0, 0}));
  EXPECT_EQ(calls[1].samples, (std::vector<int16_t>{10, 11}));
  EXPECT_EQ(calls[1].args, (std::vector<int64_t>{2, 0}));
  EXPECT_EQ(calls[2].samples, (std::vector<int16_t>{12}));
  EXPECT_EQ(calls[2].args, (std::vector<int64_t>{1, 1}));  // segment completed: last
  EXPECT_EQ(decoder_double::Count("mwStopDecode"), 1);       // and the decoder restarted
}

TEST_F(EngineTest, LastChunkWithoutSpeechStillReachesTheDecoder) {
  Started(R"(,"vad_enabled":true)");
  std::vector<uint16_t> chunk(160, 0);
  ASSERT_TRUE(engine_.ProcessSoundData(chunk.data(), 160, -1));
  const auto calls = SetDataCalls();
  ASSERT_EQ(calls.size(), 1u);
  EXPECT_EQ(calls[0].args, (std::vector<int64_t>{0, 1}));
  EXPECT_EQ(quellan_double::Calls().back().index, -1);
}

TEST_F(EngineTest, SilenceBeforeVoiceTimesOutAfterTheFinalResult) {
  Started(R"(,"vad_enabled":true)", R"({"max_mute_time_before_voice":100})");  // 1600 samples
  decoder_double::QueueOnStop({decoder_double::Result("last words", 1)});
  std::vector<uint16_t> chunk(400, 0);
  for (int i = 0; i < 3; ++i) ASSERT_TRUE(engine_.ProcessSoundData(chunk.data(), 400, 0));
  std::string log;
  log = Stdout([&] { EXPECT_FALSE(engine_.ProcessSoundData(chunk.data(), 400, 0)); });
  EXPECT_EQ(log, "OfflineAsrEngineImpl->vad mute timeout\nasr result:last words\n");
  ASSERT_EQ(messages_.size(), 2u);
  EXPECT_EQ(messages_[0],
            R"({"message":"Success","result":{"isBreak":true,"text":"last words"},"status":0})");
  EXPECT_EQ(messages_[1], kTimeout);
  EXPECT_EQ(engine_.state(), 1);
  EXPECT_EQ(SetDataCalls().size(), 3u);  // the timed-out chunk never reaches the decoder
  EXPECT_EQ(Stdout([&] { EXPECT_FALSE(engine_.ProcessSoundData(chunk.data(), 400, 0)); }),
            "OfflineAsrEngineImpl->not started yet\n");
  EXPECT_EQ(messages_.size(), 2u);  // nothing after the time-out
}

TEST_F(EngineTest, FirstSpeechSwitchesToTheAfterVoiceLimit) {
  Started(R"(,"vad_enabled":true)",
          R"({"max_mute_time_before_voice":100,"max_mute_time_after_voice":50})");
  std::vector<uint16_t> chunk(400, 0);
  ASSERT_TRUE(engine_.ProcessSoundData(chunk.data(), 400, 0));  // 400 of 1600
  quellan_double::QueueOutput({{1, 2, 3}, 1, 0, 0});
  ASSERT_TRUE(engine_.ProcessSoundData(chunk.data(), 400, 0));  // speech: counter to 0
  ASSERT_TRUE(engine_.ProcessSoundData(chunk.data(), 400, 0));  // 400 of 800
  Stdout([&] { EXPECT_FALSE(engine_.ProcessSoundData(chunk.data(), 400, 0)); });
  ASSERT_EQ(messages_.size(), 1u);
  EXPECT_EQ(messages_[0], kTimeout);
}

TEST_F(EngineTest, StopClearsTheSilenceCount) {
  Started(R"(,"vad_enabled":true)", R"({"max_mute_time_before_voice":20})");  // 320 samples
  std::vector<uint16_t> chunk(300, 0);
  ASSERT_TRUE(engine_.ProcessSoundData(chunk.data(), 300, 0));
  Stdout([&] {
    engine_.Stop();
    ASSERT_TRUE(engine_.AsrStart(R"({"asr":{"max_mute_time_before_voice":20}})", &context_, Collect()));
  });
  EXPECT_TRUE(engine_.ProcessSoundData(chunk.data(), 300, 0));
  EXPECT_TRUE(messages_.empty());
}

}  // namespace
}  // namespace speech
}  // namespace vorta
