// SPDX-License-Identifier: Apache-2.0
#include "moxwing.h"

#include <gtest/gtest.h>

#include <string>
#include <utility>
#include <vector>

#include "decoder_double.h"
#include "test_support.h"

namespace vorta {
namespace speech {
namespace {

using decoder_double::CallNames;
using kvasr_test::Stdout;
using kvasr_test::TempFile;
using Names = std::vector<std::string>;

class MoxwingTest : public testing::Test {
 protected:
  void SetUp() override { decoder_double::Reset(); }

  // An adapter that is initialised and started, collecting (text, is-break).
  std::unique_ptr<Moxwing> Started() {
    auto m = std::make_unique<Moxwing>(model_.path(), "en-US");
    EXPECT_TRUE(m->Init());
    EXPECT_TRUE(m->Start([this](std::error_code s, std::string t, bool b) {
      EXPECT_EQ(s, std::error_code(0, std::system_category()));
      delivered_.emplace_back(std::move(t), b);
    }));
    decoder_double::ClearCalls();  // keep only what the test itself causes
    return m;
  }

  TempFile model_{"model-bytes"};
  std::vector<std::pair<std::string, bool>> delivered_;
};

TEST_F(MoxwingTest, InitConfiguresOneDecoderInOrder) {
  Moxwing m(model_.path(), "en");
  ASSERT_TRUE(m.Init());
  const auto& calls = decoder_double::Calls();
  ASSERT_EQ(CallNames(),
            (Names{"mwDecoderInit", "mwSetVadEnabled", "mwSetAutoStopEnabled", "mwSetVadThreshold",
                   "mwSetOutHandle", "mwSetOnSpeechEnd", "mwSetOnResult"}));
  EXPECT_EQ(calls[0].model, "model-bytes");
  EXPECT_EQ(calls[0].args, (std::vector<int64_t>{0, 1}));
  EXPECT_EQ(calls[1].args, (std::vector<int64_t>{1}));
  EXPECT_EQ(calls[2].args, (std::vector<int64_t>{0}));
  EXPECT_EQ(calls[3].args, (std::vector<int64_t>{5000, 1000}));
  EXPECT_EQ(Stdout([&] { EXPECT_FALSE(m.Init()); }), "");
  EXPECT_EQ(decoder_double::LiveDecoders(), 1);

  // The language flag covers five languages, case-sensitively.
  const std::pair<const char*, int64_t> languages[] = {
      {"fr-FR", 1}, {"ru", 1}, {"de", 1}, {"es_ES", 1}, {"e", 0}, {"EN", 0}, {"zh", 0}};
  for (const auto& l : languages) {
    decoder_double::ClearCalls();
    ASSERT_TRUE(Moxwing(model_.path(), l.first).Init());
    EXPECT_EQ(decoder_double::Calls()[0].args[1], l.second) << l.first;
  }
}

TEST_F(MoxwingTest, RestartsAfterALastChunkAndBeforeAChunkBeyondTheDurationLimit) {
  ASSERT_EQ(Moxwing::MaxDuration().count(), 30000);  // 480000 samples
  auto m = Started();
  std::vector<uint16_t> chunk(480000, 7);
  ASSERT_TRUE(m->SetData(chunk.data(), 1000, false));
  ASSERT_TRUE(m->SetData(chunk.data(), 3000, true));
  EXPECT_EQ(CallNames(), (Names{"mwSetData", "mwSetData", "mwStopDecode", "mwStartDecode"}));
  EXPECT_EQ(decoder_double::Calls()[1].args, (std::vector<int64_t>{3000, 1}));
  // The run after a last chunk counts that chunk: 477000 more reach the
  // limit exactly, one more goes beyond it and restarts first.
  decoder_double::ClearCalls();
  ASSERT_TRUE(m->SetData(chunk.data(), 477000, false));
  ASSERT_TRUE(m->SetData(chunk.data(), 1, false));
  EXPECT_EQ(CallNames(), (Names{"mwSetData", "mwStopDecode", "mwStartDecode", "mwSetData"}));
  // That run counts from the chunk that opened it.
  decoder_double::ClearCalls();
  ASSERT_TRUE(m->SetData(chunk.data(), 479999, false));
  EXPECT_EQ(decoder_double::Count("mwStopDecode"), 0);
  ASSERT_TRUE(m->SetData(chunk.data(), 1, false));
  EXPECT_EQ(decoder_double::Count("mwStopDecode"), 1);
}

TEST_F(MoxwingTest, SetDataPassesSamplesReportsFailuresAndEndsWithRelease) {
  auto m = Started();
  const std::vector<uint16_t> chunk = {1, 2, 0xFFFF};
  ASSERT_TRUE(m->SetData(chunk.data(), 3, false));
  EXPECT_EQ(decoder_double::Calls()[0].samples, (std::vector<int16_t>{1, 2, -1}));

  decoder_double::QueueSetDataResult(-7);
  EXPECT_EQ(Stdout([&] { EXPECT_FALSE(m->SetData(chunk.data(), 3, true)); }),
            "moxwing set data failed: -7\n");
  EXPECT_EQ(decoder_double::Count("mwStopDecode"), 0);  // a failed last chunk does not restart

  decoder_double::ClearCalls();
  m->Release();
  m->Release();
  m->Stop();
  EXPECT_FALSE(m->SetData(chunk.data(), 3, false));
  EXPECT_EQ(CallNames(), Names{"mwDecoderDestroy"});
  EXPECT_EQ(decoder_double::LiveDecoders(), 0);
}

TEST_F(MoxwingTest, ResultsSkipEmptyTextsAndFinalsFollowTheFlag) {
  auto m = Started();
  decoder_double::Event null_text = decoder_double::Result("", 0);
  null_text.null_text = true;
  decoder_double::QueueOnSetData({decoder_double::Result("hello", 0), decoder_double::Result("", 1),
                                  null_text, decoder_double::Result("hello world", 1),
                                  decoder_double::Result("x", -1), decoder_double::SpeechEnd()});
  // The restart after a last chunk delivers the decoder's final text too.
  decoder_double::QueueOnStop({decoder_double::Result("final words", 1)});
  const uint16_t sample = 0;
  EXPECT_EQ(Stdout([&] { ASSERT_TRUE(m->SetData(&sample, 1, true)); }),
            "asr result:hello\nasr result:\nasr result:\nasr result:hello world\n"
            "asr result:x\nmoxwing speech end\nasr result:final words\n");
  EXPECT_EQ(delivered_,
            (std::vector<std::pair<std::string, bool>>{
                {"hello", false}, {"hello world", true}, {"x", false}, {"final words", true}}));
}

TEST_F(MoxwingTest, GlobalInitSetsTheSharedLimitWithAOneSecondFloor) {
  const std::pair<const char*, int64_t> steps[] = {
      {R"({"moxwing_max_duration":60000})", 60000},
      {R"({"moxwing_max_duration":"5"})", 60000},    // not a number: unchanged
      {R"({"moxwing_max_duration":999.9})", 30000},  // below a second: the default
  };
  for (const auto& s : steps) {
    Stdout([&] { Moxwing::GlobalInit(s.first); });
    EXPECT_EQ(Moxwing::MaxDuration().count(), s.second) << s.first;
  }
  const std::string log = Stdout([] { Moxwing::GlobalInit("{broken"); });
  EXPECT_EQ(log.rfind("moxwing global init exception:", 0), 0u) << log;
  EXPECT_EQ(Moxwing::MaxDuration().count(), 30000);
}

}  // namespace
}  // namespace speech
}  // namespace vorta
