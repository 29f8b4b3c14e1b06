// SPDX-License-Identifier: Apache-2.0
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

using decoder_double::Result;
using kvasr_test::Stdout;
using kvasr_test::TempFile;
using Messages = std::vector<std::string>;

constexpr char kResultFinalAbc[] =
    R"({"message":"Success","result":{"isBreak":true,"text":"abc"},"status":0})";
constexpr char kTimeout[] =
    R"({"message":"vad mute timeout","result":{"isBreak":true,"text":""},"status":-100})";
constexpr char kVad[] = R"(,"vad_enabled":true)";

std::string Success(const std::string& json_text, bool is_break) {
  return std::string(R"({"message":"Success","result":{"isBreak":)") +
         (is_break ? "true" : "false") + R"(,"text":")" + json_text + R"("},"status":0})";
}

class EngineTest : public testing::Test {
 protected:
  void SetUp() override {
    decoder_double::Reset();
    punctuator_double::Reset();
    quellan_double::Reset();
  }

  std::string InitParams(const std::string& extra = "", const std::string& lang = "en-US") const {
    return R"({"local_vad_model_dir_path":"vadmodels","lang":")" + lang +
           R"(","local_moxwing_model_file_path":")" + model_.path() + "\"" + extra + "}";
  }

  // Init of `engine` that must give `ok`; returns the log.
  static std::string Init(OfflineAsrEngineImpl& engine, const std::string& params, bool ok) {
    return Stdout([&] { EXPECT_EQ(engine.Init(params), ok); });
  }

  std::string Start(const std::string& params, bool ok, void* context = nullptr) {
    return Stdout([&] {
      EXPECT_EQ(engine_.AsrStart(params, context,
                                 [this](std::string m) { messages_.push_back(std::move(m)); }),
                ok);
    });
  }

  // An engine initialised with `extra` init keys and started with `asr`.
  void Started(const std::string& extra, const std::string& asr = "{}") {
    Init(engine_, InitParams(extra), true);
    Start(R"({"asr":)" + asr + "}", true, &context_);
    decoder_double::ClearCalls();
  }

  // Feeds one sample while the decoder reports `results`; returns the log.
  std::string Decode(std::vector<decoder_double::Event> results) {
    decoder_double::QueueOnSetData(std::move(results));
    const uint16_t sample = 0;
    return Stdout([&] { EXPECT_TRUE(engine_.ProcessSoundData(&sample, 1, 0)); });
  }

  // Feeds `chunks` chunks of `samples` zeros with the VAD on; each must be taken.
  void Feed(int chunks, int samples, int packet = 0) {
    const std::vector<uint16_t> chunk(samples, 0);
    for (int i = 0; i < chunks; ++i) {
      ASSERT_TRUE(engine_.ProcessSoundData(chunk.data(), samples, packet));
    }
  }

  TempFile model_{"decoder-model"};
  OfflineAsrEngineImpl engine_;
  Messages messages_;
  int context_ = 0;
};

// ---- Init ----------------------------------------------------------------

TEST_F(EngineTest, InitCreatesTheDecoderAndOnlyTheBackEndsAskedFor) {
  struct Case {
    std::string extra;
    const char* lang;
    bool vad;
    bool punctuator;
  };
  const std::string punctuation = R"(,"local_punc_settings":{})";
  const Case cases[] = {
      {"", "en-US", false, false},       {R"(,"vad_enabled":"yes")", "en-US", false, false},
      {kVad, "en-US", true, false},      {R"(,"local_punc_settings":"m")", "en", false, false},
      {punctuation, "th", false, false}, {punctuation, "th-TH", false, false},
      {punctuation, "t", false, true},  // a one-letter language is compared whole
  };
  for (const Case& c : cases) {
    const std::string params = InitParams(c.extra, c.lang);
    SCOPED_TRACE(params);
    OfflineAsrEngineImpl engine;
    EXPECT_EQ(Init(engine, params, true), "init params:" + params + "\n");
    EXPECT_EQ(engine.state(), 1);
    EXPECT_TRUE(engine.has_decoder());
    EXPECT_EQ(engine.has_vad(), c.vad);
    EXPECT_EQ(engine.has_punctuator(), c.punctuator);
  }
  Init(engine_, InitParams(), true);
  EXPECT_EQ(Init(engine_, InitParams(), false),
            "init params:" + InitParams() + "\nOfflineAsrEngineImpl->asr state invalid\n");
}

TEST_F(EngineTest, InitRefusesBadParametersWithTheirLogLines) {
  struct Case {
    std::string params;
    std::string log_tail;  // what follows the "init params:" line
  };
  const std::string model = model_.path();
  const std::string not_a_string = "OfflineAsrEngineImpl->asr init exception:not a string\n";
  const std::string no_language = "OfflineAsrEngineImpl->language can not empty\n";
  const Case cases[] = {
      {R"({"lang":"en","local_moxwing_model_file_path":")" + model + "\"}", not_a_string},
      {R"({"local_vad_model_dir_path":"d","local_moxwing_model_file_path":")" + model + "\"}",
       no_language},
      {R"({"local_vad_model_dir_path":"d","lang":"","local_moxwing_model_file_path":"m"})",
       no_language},
      {R"({"local_vad_model_dir_path":"d","lang":12,"local_moxwing_model_file_path":"m"})",
       no_language},
      {R"({"local_vad_model_dir_path":"d","lang":"en"})", not_a_string},
      {R"({"local_vad_model_dir_path":"d","lang":"en","local_moxwing_model_file_path":"/no/such"})",
       "moxwing model file /no/such cannot open\n"
       "OfflineAsrEngineImpl->asr init exception:init local asr failed\n"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.params);
    OfflineAsrEngineImpl engine;
    decoder_double::Reset();
    EXPECT_EQ(Init(engine, c.params, false), "init params:" + c.params + "\n" + c.log_tail);
    EXPECT_EQ(engine.state(), 0);
    EXPECT_FALSE(engine.has_punctuator());
    if (c.log_tail == no_language) {
      EXPECT_EQ(decoder_double::Count("mwDecoderInit"), 0);
    }
  }
  // Malformed JSON and JSON that is not an object are reported like any
  // other refusal, never thrown.
  for (const char* params : {"", "{", "[1,2]", "\"text\"", "{\"lang\":}"}) {
    OfflineAsrEngineImpl engine;
    EXPECT_NE(Init(engine, params, false).find("OfflineAsrEngineImpl->asr init exception:"),
              std::string::npos)
        << params;
  }
}

// Kept as it always was: a refused decoder, and the segment buffer made
// before it, stay until the next Init, which drops a buffer not asked for.
TEST_F(EngineTest, DecoderRefusalKeepsTheFailedBackEndsUntilAnotherInit) {
  decoder_double::SetInitFails(true);
  EXPECT_NE(Init(engine_, InitParams(kVad), false)
                .find("moxwing init failed\n"
                      "OfflineAsrEngineImpl->asr init exception:init local asr failed\n"),
            std::string::npos);
  EXPECT_EQ(decoder_double::Count("mwSetOnResult"), 0);  // nothing configured on no decoder
  Stdout([&] { engine_.Close(); });                      // state 0: nothing happens
  EXPECT_TRUE(engine_.has_decoder() && engine_.has_vad());
  decoder_double::SetInitFails(false);
  Init(engine_, InitParams(), true);
  EXPECT_FALSE(engine_.has_vad());
}

TEST_F(EngineTest, PunctuationSettingsAreReadKeyByKey) {
  Init(engine_,
       InitParams(R"(,"local_punc_settings":{"model_path":"m","vocab_path":5,)"
                  R"("punc_path":"p","case_path":"c","xdb_path":"x","bpe_path":"b"})"),
       true);
  ASSERT_TRUE(engine_.has_punctuator());
  EXPECT_EQ(punctuator_double::Calls()[0].strings,
            (std::vector<std::string>{"m", "", "p", "", "c", "x", "b", "en"}));
}

TEST_F(EngineTest, PunctuatorFailureDropsBothBackEnds) {
  punctuator_double::SetInitFails(true);
  EXPECT_NE(Init(engine_, InitParams(R"(,"local_punc_settings":{})"), false)
                .find("punctuator init failed\n"
                      "OfflineAsrEngineImpl->asr init exception:init local punc failed\n"),
            std::string::npos);
  EXPECT_EQ(engine_.state(), 0);
  EXPECT_FALSE(engine_.has_decoder() || engine_.has_punctuator());
  EXPECT_EQ(decoder_double::LiveDecoders(), 0);
}

// ---- AsrStart ------------------------------------------------------------

TEST_F(EngineTest, MuteLimitsAreMillisecondsTimesSixteenInWrappingArithmetic) {
  struct Case {
    std::string asr;
    uint32_t before;
    uint32_t after;
  };
  const Case cases[] = {
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
    SCOPED_TRACE(c.asr);
    OfflineAsrEngineImpl engine;
    Stdout([&] {
      ASSERT_TRUE(engine.Init(InitParams()));
      ASSERT_TRUE(engine.AsrStart(R"({"asr":)" + c.asr + "}", nullptr, nullptr));
    });
    EXPECT_EQ(engine.max_mute_before_voice(), c.before);
    EXPECT_EQ(engine.max_mute_after_voice(), c.after);
    EXPECT_EQ(engine.state(), 2);
  }
}

TEST_F(EngineTest, StartFailuresKeepTheNewSinkAndContext) {
  EXPECT_EQ(Start(R"({"asr":{}})", false, &context_),
            "OfflineAsrEngineImpl->current state not initialized\n");
  EXPECT_EQ(engine_.GetContext(), nullptr);  // before Init nothing is stored

  Init(engine_, InitParams(), true);
  EXPECT_EQ(Start(R"({"other":{}})", false, &context_),
            "OfflineAsrEngineImpl->asr start exception:not an object\n");
  EXPECT_EQ(engine_.GetContext(), &context_);
  EXPECT_EQ(engine_.state(), 1);

  decoder_double::SetStartResult(-1);
  EXPECT_EQ(Start(R"({"asr":{}})", false),
            "OfflineAsrEngineImpl->asr start exception:start local asr failed\n");
  EXPECT_EQ(engine_.GetContext(), nullptr);
  decoder_double::SetStartResult(3);  // only a negative result is a failure
  Start(R"({"asr":{}})", true);
  EXPECT_EQ(engine_.state(), 2);

  quellan_double::SetCreateReturnsNullFor("vadmodels");
  OfflineAsrEngineImpl engine;
  Init(engine, InitParams(kVad), true);
  EXPECT_EQ(Stdout([&] { EXPECT_FALSE(engine.AsrStart(R"({"asr":{}})", nullptr, nullptr)); }),
            "OfflineAsrEngineImpl->asr start exception:vad start fail\n");
}

// ---- Stop and Close -------------------------------------------------------

TEST_F(EngineTest, StopActsOnlyWhenStartedAndCloseReleasesEveryBackEnd) {
  Init(engine_, InitParams(R"(,"vad_enabled":true,"local_punc_settings":{})"), true);
  Stdout([&] { engine_.Stop(); });
  EXPECT_EQ(decoder_double::Count("mwStopDecode"), 0);

  Start(R"({"asr":{}})", true, &context_);
  decoder_double::ClearCalls();
  engine_.Close();
  EXPECT_EQ(decoder_double::CallNames(),
            (std::vector<std::string>{"mwStopDecode", "mwDecoderDestroy"}));
  EXPECT_EQ(engine_.state(), 0);
  EXPECT_EQ(engine_.GetContext(), nullptr);
  EXPECT_FALSE(engine_.has_decoder() || engine_.has_vad() || engine_.has_punctuator());
  EXPECT_EQ(quellan_double::LiveHandles() + punctuator_double::LiveHandles() +
                decoder_double::LiveDecoders(),
            0);
  Init(engine_, InitParams(), true);  // usable again
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

TEST_F(EngineTest, ResultsBecomeCompactSortedJsonWithValidUtf8) {
  Started("");
  Decode({Result("abc", 1)});
  EXPECT_EQ(messages_, Messages{kResultFinalAbc});
  const std::pair<std::string, std::string> cases[] = {
      // text, as it appears in the JSON
      {"say \"hi\" \\ ok", R"(say \"hi\" \\ ok)"},
      {"na\xc3\xafve", "na\xc3\xafve"},
      {"\xF0\x9F\x98\x80 ok", "\xF0\x9F\x98\x80 ok"},
      {"a\xff b", "a\xEF\xBF\xBD b"},                            // stray byte
      {"\xC0\xAF", "\xEF\xBF\xBD\xEF\xBF\xBD"},                  // overlong slash
      {"\xED\xA0\x80", "\xEF\xBF\xBD\xEF\xBF\xBD\xEF\xBF\xBD"},  // surrogate
      {"end\xE2\x82", "end\xEF\xBF\xBD\xEF\xBF\xBD"},            // cut short
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.first);
    messages_.clear();
    Decode({Result(c.first, 0)});
    EXPECT_EQ(messages_, Messages{Success(c.second, false)});
  }
}

TEST_F(EngineTest, FinalTextsArePunctuatedAndPartialTextsLoggedAsSkipped) {
  Started(R"(,"local_punc_settings":{"model_path":"m"})");
  EXPECT_EQ(Decode({Result("hello", 0), Result("hello there", 1)}),
            "asr result:hello\nOfflineAsrEngineImpl->punc failed: hello\nasr result:hello there\n");
  EXPECT_EQ(messages_, (Messages{Success("hello", false), Success("hello there.", true)}));
}

TEST_F(EngineTest, PuncAllPunctuatesPartialsAndFailuresKeepTheText) {
  Started(R"(,"local_punc_settings":{"punc_all":true})");
  punctuator_double::QueueReply({0, 5, "Ab, c"});
  punctuator_double::QueueReply({2, 0, ""});
  EXPECT_NE(Decode({Result("ab c", 0), Result("abc", 1)})
                .find("OfflineAsrEngineImpl->punc failed: abc\n"),
            std::string::npos);
  EXPECT_EQ(messages_, (Messages{Success("Ab, c", false), kResultFinalAbc}));
}

// ---- Audio path with VAD ---------------------------------------------------

TEST_F(EngineTest, SpeechSegmentsReachTheDecoderAndCompletedOnesAreMarkedLast) {
  Started(kVad);
  quellan_double::QueueOutput({{}, 0, 0, 0});
  quellan_double::QueueOutput({{10, 11}, 1, 0, 0});
  quellan_double::QueueOutput({{12}, 1, 1, 1});
  Feed(3, 160);
  Feed(1, 160, -1);  // without speech, yet the decoder must see the end
  EXPECT_EQ(quellan_double::Calls().back().index, -4);
  // Each completed segment restarts the decoder.
  ASSERT_EQ(
      decoder_double::CallNames(),
      (std::vector<std::string>{"mwSetData", "mwSetData", "mwSetData", "mwStopDecode",
                                "mwStartDecode", "mwSetData", "mwStopDecode", "mwStartDecode"}));
  const auto& calls = decoder_double::Calls();
  EXPECT_EQ(calls[0].args, (std::vector<int64_t>{0, 0}));
  EXPECT_EQ(calls[1].samples, (std::vector<int16_t>{10, 11}));
  EXPECT_EQ(calls[1].args, (std::vector<int64_t>{2, 0}));
  EXPECT_EQ(calls[2].samples, (std::vector<int16_t>{12}));
  EXPECT_EQ(calls[2].args, (std::vector<int64_t>{1, 1}));
  EXPECT_EQ(calls[5].args, (std::vector<int64_t>{0, 1}));
}

TEST_F(EngineTest, SilenceBeforeVoiceTimesOutAfterTheFinalResult) {
  Started(kVad, R"({"max_mute_time_before_voice":100})");  // 1600 samples
  decoder_double::QueueOnStop({Result("last words", 1)});
  Feed(3, 400);
  const std::vector<uint16_t> chunk(400, 0);
  EXPECT_EQ(Stdout([&] { EXPECT_FALSE(engine_.ProcessSoundData(chunk.data(), 400, 0)); }),
            "OfflineAsrEngineImpl->vad mute timeout\nasr result:last words\n");
  EXPECT_EQ(messages_, (Messages{Success("last words", true), kTimeout}));
  EXPECT_EQ(engine_.state(), 1);
  EXPECT_EQ(decoder_double::Count("mwSetData"), 3);  // the timed-out chunk never reaches it
  EXPECT_EQ(Stdout([&] { EXPECT_FALSE(engine_.ProcessSoundData(chunk.data(), 400, 0)); }),
            "OfflineAsrEngineImpl->not started yet\n");
  EXPECT_EQ(messages_.size(), 2u);  // nothing after the time-out
}

TEST_F(EngineTest, FirstSpeechSwitchesToTheAfterVoiceLimit) {
  Started(kVad, R"({"max_mute_time_before_voice":100,"max_mute_time_after_voice":50})");
  Feed(1, 400);  // 400 of 1600
  quellan_double::QueueOutput({{1, 2, 3}, 1, 0, 0});
  Feed(2, 400);  // speech sets the count to 0, then 400 of 800
  const std::vector<uint16_t> chunk(400, 0);
  Stdout([&] { EXPECT_FALSE(engine_.ProcessSoundData(chunk.data(), 400, 0)); });
  EXPECT_EQ(messages_, Messages{kTimeout});
}

TEST_F(EngineTest, StopClearsTheSilenceCount) {
  Started(kVad, R"({"max_mute_time_before_voice":20})");  // 320 samples
  Feed(1, 300);
  Stdout([&] { engine_.Stop(); });
  Start(R"({"asr":{"max_mute_time_before_voice":20}})", true);
  Feed(1, 300);
  EXPECT_TRUE(messages_.empty());
}

}  // namespace
}  // namespace speech
}  // namespace vorta
