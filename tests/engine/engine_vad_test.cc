// The engine with the real voice activity module in the audio path: a
// detector that takes every frame above the energy gate for speech, fed
// real speech between stretches of digital silence.
#include "offline_asr_engine_impl.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <string>
#include <vector>

#include "decoder_double.h"
#include "model_files.h"
#include "test_support.h"

namespace vorta {
namespace speech {
namespace {

using kvasr_test::Stdout;
using kvasr_test::TempFile;

constexpr int kChunkSamples = 1600;  // 100 ms
constexpr int kSamplesPerSecond = 16000;

std::vector<uint16_t> Silence(double seconds) {
  return std::vector<uint16_t>(static_cast<size_t>(seconds * kSamplesPerSecond), 0);
}

class EngineVadTest : public testing::Test {
 protected:
  void SetUp() override {
    decoder_double::Reset();
    std::vector<int16_t> speech;
    if (!quellan_test::ReadFlac(
            quellan_test::CorpusPath("speech/librispeech/103/103-1240-0000.flac"), &speech)) {
      GTEST_SKIP() << "the shared voice activity corpus is not beside the checkout";
    }
    speech_.assign(speech.begin(), speech.begin() + std::min<size_t>(speech.size(), 3 * kSamplesPerSecond));
    // Scores far above the threshold: the energy gate alone decides.
    model_dir_ = quellan_test::MakeModelDir(16.0f);
  }

  void Start(const std::string& asr) {
    const std::string params = R"({"local_vad_model_dir_path":")" + model_dir_ +
                               R"(","lang":"en","vad_enabled":true,"local_moxwing_model_file_path":")" +
                               decoder_model_.path() + "\"}";
    Stdout([&] {
      ASSERT_TRUE(engine_.Init(params));
      ASSERT_TRUE(engine_.AsrStart(R"({"asr":)" + asr + "}", nullptr,
                                   [this](std::string m) { messages_.push_back(std::move(m)); }));
    });
    decoder_double::ClearCalls();
  }

  // Feeds `audio` in 100 ms chunks; false as soon as a call fails.
  bool Feed(const std::vector<uint16_t>& audio) {
    for (size_t at = 0; at < audio.size(); at += kChunkSamples) {
      const int n = static_cast<int>(std::min<size_t>(kChunkSamples, audio.size() - at));
      if (!engine_.ProcessSoundData(audio.data() + at, n, 0)) return false;
    }
    return true;
  }

  std::vector<uint16_t> speech_;
  std::string model_dir_;
  TempFile decoder_model_{"model"};
  OfflineAsrEngineImpl engine_;
  std::vector<std::string> messages_;
};

TEST_F(EngineVadTest, OnlySpeechReachesTheDecoderInCompletedSegments) {
  Start("{}");
  std::vector<uint16_t> input = Silence(1.0);
  const size_t first_speech = input.size();
  input.insert(input.end(), speech_.begin(), speech_.end());
  input.insert(input.end(), 32000 + 48000, 0);  // 5 s of silence
  const size_t second_speech = input.size();
  input.insert(input.end(), speech_.begin(), speech_.end());
  input.insert(input.end(), 48000, 0);
  ASSERT_TRUE(Feed(input));

  std::vector<int16_t> decoded;
  int completed = 0;
  for (const auto& call : decoder_double::Calls()) {
    if (call.name != "mwSetData") continue;
    decoded.insert(decoded.end(), call.samples.begin(), call.samples.end());
    if (call.args[1] == 1) ++completed;
  }
  EXPECT_EQ(completed, 2);
  // Both utterances went through, head margins and closing silence
  // included (the clip's own quiet start may stay below the energy gate),
  // but not the seconds of silence around them.
  EXPECT_GE(decoded.size(), 2 * (speech_.size() - 8000));
  EXPECT_LT(decoded.size(), 2 * speech_.size() + 2 * 16000);
  EXPECT_LT(decoded.size(), input.size() / 2);
  const auto contains = [&](size_t from) {
    const std::vector<int16_t> needle(input.begin() + from, input.begin() + from + 8000);
    return std::search(decoded.begin(), decoded.end(), needle.begin(), needle.end()) != decoded.end();
  };
  EXPECT_TRUE(contains(first_speech + 8000));
  EXPECT_TRUE(contains(second_speech + 8000));
  EXPECT_TRUE(messages_.empty());
}

}  // namespace
}  // namespace speech
}  // namespace vorta
