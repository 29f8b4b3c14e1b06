#include "moxwing.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "decoder_double.h"
#include "test_support.h"

namespace vorta {
namespace speech {
namespace {

using kvasr_test::Stdout;
using kvasr_test::TempFile;

struct Delivered {
  std::error_code status;
  std::string text;
  bool is_break;
};

class MoxwingTest : public testing::Test {
 protected:
  void SetUp() override { decoder_double::Reset(); }

  // An adapter that is initialised and started, collecting what it delivers.
  std::unique_ptr<Moxwing> Started(const std::string& lang = "en-US") {
    auto m = std::make_unique<Moxwing>(model_.path(), lang);
    EXPECT_TRUE(m->Init());
    EXPECT_TRUE(m->Start([this](std::error_code s, std::string t, bool b) {
      delivered_.push_back({s, std::move(t), b});
    }));
    decoder_double::ClearCalls();  // keep only what the test itself causes
    return m;
  }

  TempFile model_{"model-bytes"};
  std::vector<Delivered> delivered_;
};

TEST_F(MoxwingTest, InitConfiguresTheDecoderInOrder) {
  Moxwing m(model_.path(), "en");
  ASSERT_TRUE(m.Init());
  const auto& calls = decoder_double::Calls();
  ASSERT_EQ(decoder_double::CallNames(),
            (std::vector<std::string>{"mwDecoderInit", "mwSetVadEnabled", "mwSetAutoStopEnabled",
                                      "mwSetVadThreshold", "mwSetOutHandle", "mwSetOnSpeechEnd",
                                      "mwSetOnResult"}));
  EXPECT_EQ(calls[0].model, "model-bytes");
  EXPECT_EQ(calls[0].args, (std::vector<int64_t>{0, 1}));
  EXPECT_EQ(calls[1].args, (std::vector<int64_t>{1}));
  EXPECT_EQ(calls[2].args, (std::vector<int64_t>{0}));
  EXPECT_EQ(calls[3].args, (std::vector<int64_t>{5000, 1000}));
}

TEST_F(MoxwingTest, LanguageFlagCoversFiveLanguagesCaseSensitively) {
  const std::vector<std::pair<std::string, int64_t>> cases = {
      {"en", 1}, {"fr-FR", 1}, {"ru", 1}, {"de", 1}, {"es_ES", 1}, {"e", 0},
      {"", 0},   {"EN", 0},    {"zh", 0}, {"th", 0}, {"it", 0}};
  for (const auto& c : cases) {
    decoder_double::Reset();
    Moxwing m(model_.path(), c.first);
    ASSERT_TRUE(m.Init()) << c.first;
    EXPECT_EQ(decoder_double::Calls()[0].args[1], c.second) << "lang '" << c.first << "'";
  }
}

TEST_F(MoxwingTest, InitRefusals) {
  Moxwing missing("/nonexistent/model.bin", "en");
  EXPECT_EQ(Stdout([&] { EXPECT_FALSE(missing.Init()); }),
            "moxwing model file /nonexistent/model.bin cannot open\n");
  EXPECT_EQ(decoder_double::Count("mwDecoderInit"), 0);

  decoder_double::SetInitFails(true);
  Moxwing refused(model_.path(), "en");
  EXPECT_EQ(Stdout([&] { EXPECT_FALSE(refused.Init()); }), "moxwing init failed\n");
  EXPECT_EQ(decoder_double::Count("mwSetOnResult"), 0);

  decoder_double::SetInitFails(false);
  Moxwing twice(model_.path(), "en");
  ASSERT_TRUE(twice.Init());
  EXPECT_EQ(Stdout([&] { EXPECT_FALSE(twice.Init()); }), "");
  EXPECT_EQ(decoder_double::Count("mwDecoderInit"), 2);  // the failed one and the first of twice
}

TEST_F(MoxwingTest, StartReportsNegativeResultsOnly) {
  Moxwing m(model_.path(), "en");
  ASSERT_TRUE(m.Init());
  decoder_double::SetStartResult(3);
  EXPECT_TRUE(m.Start(nullptr));
  decoder_double::SetStartResult(-1);
  EXPECT_FALSE(m.Start(nullptr));
}

TEST_F(MoxwingTest, DurationGuardRestartsBeforeTheChunkThatWouldExceedTheLimit) {
  ASSERT_EQ(Moxwing::MaxDuration().count(), 30000);
  auto m = Started();
  std::vector<uint16_t> chunk(480000, 7);
  ASSERT_TRUE(m->SetData(chunk.data(), 479999, false));
  ASSERT_TRUE(m->SetData(chunk.data(), 1, false));  // exactly 480000: no restart
  EXPECT_EQ(decoder_double::CallNames(), (std::vector<std::string>{"mwSetData", "mwSetData"}));

  ASSERT_TRUE(m->SetData(chunk.data(), 1, false));  // 480001: restart first
  EXPECT_EQ(decoder_double::CallNames(),
            (std::vector<std::string>{"mwSetData", "mwSetData", "mwStopDecode", "mwStartDecode",
                                      "mwSetData"}));
  // The new run counts from the chunk that opened it.
  decoder_double::ClearCalls();
  ASSERT_TRUE(m->SetData(chunk.data(), 479999, false));
  EXPECT_EQ(decoder_double::Count("mwStopDecode"), 0);
  ASSERT_TRUE(m->SetData(chunk.data(), 1, false));
  EXPECT_EQ(decoder_double::Count("mwStopDecode"), 1);
}

TEST_F(MoxwingTest, LastChunkRestartsOnceAndCountsOnlyThatChunk) {
  auto m = Started();
  std::vector<uint16_t> chunk(480000, 1);
  ASSERT_TRUE(m->SetData(chunk.data(), 1000, false));
  ASSERT_TRUE(m->SetData(chunk.data(), 3000, true));
  EXPECT_EQ(decoder_double::CallNames(),
            (std::vector<std::string>{"mwSetData", "mwSetData", "mwStopDecode", "mwStartDecode"}));
  EXPECT_EQ(decoder_double::Calls()[1].args, (std::vector<int64_t>{3000, 1}));
  // fed samples is now 3000: 477000 more fit, one more does not.
  decoder_double::ClearCalls();
  ASSERT_TRUE(m->SetData(chunk.data(), 477000, false));
  EXPECT_EQ(decoder_double::Count("mwStopDecode"), 0);
  ASSERT_TRUE(m->SetData(chunk.data(), 1, false));
  EXPECT_EQ(decoder_double::Count("mwStopDecode"), 1);
}

TEST_F(MoxwingTest, SetDataPassesSamplesAndReportsFailures) {
  auto m = Started();
  const std::vector<uint16_t> chunk = {1, 2, 0xFFFF};
  ASSERT_TRUE(m->SetData(chunk.data(), 3, false));
  EXPECT_EQ(decoder_double::Calls()[0].samples, (std::vector<int16_t>{1, 2, -1}));

  decoder_double::QueueSetDataResult(-7);
  EXPECT_EQ(Stdout([&] { EXPECT_FALSE(m->SetData(chunk.data(), 3, true)); }),
            "moxwing set data failed: -7\n");
  EXPECT_EQ(decoder_double::Count("mwStopDecode"), 0);  // a failed last chunk does not restart

  m->Release();
  decoder_double::ClearCalls();
  EXPECT_FALSE(m->SetData(chunk.data(), 3, false));
  EXPECT_TRUE(decoder_double::Calls().empty());
}

TEST_F(MoxwingTest, ResultCallbackFiltersEmptyTextsAndMapsTheFlag) {
  auto m = Started();
  decoder_double::Event null_text = decoder_double::Result("", 0);
  null_text.null_text = true;
  decoder_double::QueueOnSetData({decoder_double::Result("hello", 0), decoder_double::Result("", 1),
                                  null_text, decoder_double::Result("hello world", 1),
                                  decoder_double::Result("x", -1), decoder_double::SpeechEnd()});
  const uint16_t sample = 0;
  const std::string out = Stdout([&] { ASSERT_TRUE(m->SetData(&sample, 1, false)); });
  EXPECT_EQ(out,
            "asr result:hello\nasr result:\nasr result:\nasr result:hello world\n"
            "asr result:x\nmoxwing speech end\n");
  ASSERT_EQ(delivered_.size(), 3u);
  EXPECT_EQ(delivered_[0].text, "hello");
  EXPECT_FALSE(delivered_[0].is_break);
  EXPECT_EQ(delivered_[1].text, "hello world");
  EXPECT_TRUE(delivered_[1].is_break);
  EXPECT_FALSE(delivered_[2].is_break);
  EXPECT_EQ(delivered_[0].status.value(), 0);
  EXPECT_EQ(delivered_[0].status.category(), std::system_category());
}

TEST_F(MoxwingTest, FinalResultOfARestartReachesTheHandler) {
  auto m = Started();
  decoder_double::QueueOnStop({decoder_double::Result("final words", 1)});
  const uint16_t sample = 0;
  Stdout([&] { ASSERT_TRUE(m->SetData(&sample, 1, true)); });
  ASSERT_EQ(delivered_.size(), 1u);
  EXPECT_EQ(delivered_[0].text, "final words");
  EXPECT_TRUE(delivered_[0].is_break);
}

TEST_F(MoxwingTest, ReleaseDestroysOnceAndStopNeedsAHandle) {
  auto m = Started();
  m->Release();
  m->Release();
  m->Stop();
  EXPECT_EQ(decoder_double::CallNames(), (std::vector<std::string>{"mwDecoderDestroy"}));
  EXPECT_EQ(decoder_double::LiveDecoders(), 0);
}

TEST_F(MoxwingTest, GlobalInitSetsTheSharedLimitWithAOneSecondFloor) {
  Stdout([] { Moxwing::GlobalInit(R"({"moxwing_max_duration":60000})"); });
  EXPECT_EQ(Moxwing::MaxDuration().count(), 60000);
  Stdout([] { Moxwing::GlobalInit(R"({"moxwing_max_duration":"5"})"); });
  EXPECT_EQ(Moxwing::MaxDuration().count(), 60000);  // not a number: unchanged
  Stdout([] { Moxwing::GlobalInit(R"({"moxwing_max_duration":999.9})"); });
  EXPECT_EQ(Moxwing::MaxDuration().count(), 30000);  // below a second: the default
  const std::string log = Stdout([] { Moxwing::GlobalInit("{broken"); });
  EXPECT_EQ(log.rfind("moxwing global init exception:", 0), 0u) << log;
  EXPECT_EQ(Moxwing::MaxDuration().count(), 30000);
}

}  // namespace
}  // namespace speech
}  // namespace vorta
