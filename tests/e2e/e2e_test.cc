// Real recordings through the public C API with the shipped decoder model.
#include "kvasr_offline.h"

#include <gtest/gtest.h>

#include <cpprest/json.h>

#include <string>
#include <vector>

#include "librivox.h"

namespace {

constexpr int kChunkSamples = 1600;  // 100 ms

struct Message {
  std::string text;
  bool is_break;
  int status;
};

void Collect(void*, const char* json, void* context) {
  const web::json::value v = web::json::value::parse(json);
  static_cast<std::vector<Message>*>(context)->push_back(
      {v.at("result").at("text").as_string(), v.at("result").at("isBreak").as_bool(),
       v.at("status").as_integer()});
}

class EndToEnd : public testing::Test {
 protected:
  void SetUp() override {
    KVASR_REQUIRE_LIBRIVOX();
    engine_ = vorta_speech_create_offline_asr_engine();
    const std::string params = std::string("{\"local_moxwing_model_file_path\":\"") +
                               KVASR_DECODER_MANIFEST +
                               "\",\"local_vad_model_dir_path\":\"unused\",\"lang\":\"en-US\"}";
    testing::internal::CaptureStdout();  // the engine's log
    init_ok_ = vorta_speech_offline_asr_init(engine_, params.c_str()) == 0;
  }
  void TearDown() override {
    if (!engine_) return;
    vorta_speech_release_offline_asr_engine(engine_);
    testing::internal::GetCapturedStdout();
  }

  // One listening period over a clip; returns every message in order.
  std::vector<Message> Listen(const std::vector<int16_t>& samples) {
    std::vector<Message> messages;
    EXPECT_EQ(vorta_speech_offline_asr_start(engine_, "{\"asr\":{}}", Collect, &messages), 0);
    for (size_t at = 0; at < samples.size(); at += kChunkSamples) {
      const size_t n = std::min<size_t>(kChunkSamples, samples.size() - at);
      const bool last = at + n == samples.size();
      EXPECT_EQ(vorta_speech_offline_asr_process_sound_data(engine_, samples.data() + at,
                                                            static_cast<int>(n), last ? -1 : 0),
                0);
    }
    vorta_speech_offline_asr_stop(engine_);
    return messages;
  }

  void* engine_ = nullptr;
  bool init_ok_ = false;
};

TEST_F(EndToEnd, PartialTextsThenOneFinalPerUtterance) {
  ASSERT_TRUE(init_ok_);
  const std::vector<Message> messages = Listen(kvasr_test::LibrivoxClip("0880"));
  ASSERT_FALSE(messages.empty());
  int finals = 0;
  for (size_t i = 0; i < messages.size(); ++i) {
    EXPECT_EQ(messages[i].status, 0);
    EXPECT_FALSE(messages[i].text.empty());
    if (messages[i].is_break) ++finals;
    if (i > 0) {
      EXPECT_NE(messages[i].text, messages[i - 1].text) << "repeated partial";
    }
  }
  EXPECT_EQ(finals, 1);
  EXPECT_TRUE(messages.back().is_break);
}

TEST_F(EndToEnd, LibrivoxWordErrorRateWithoutVad) {
  ASSERT_TRUE(init_ok_);
  size_t errors = 0;
  size_t reference_words = 0;
  const auto references = kvasr_test::LibrivoxReferences();
  ASSERT_EQ(references.size(), 5u);
  for (const kvasr_test::LibrivoxReference& reference : references) {
    std::string hypothesis;
    for (const Message& m : Listen(kvasr_test::LibrivoxClip(reference.id))) {
      if (m.is_break) hypothesis += m.text + " ";
    }
    const size_t e = kvasr_test::EditDistance(reference.words, kvasr_test::Words(hypothesis));
    std::fprintf(stderr, "clip %s: %zu errors / %zu words: %s\n", reference.id.c_str(), e,
                 reference.words.size(), hypothesis.c_str());
    errors += e;
    reference_words += reference.words.size();
  }
  const double wer = static_cast<double>(errors) / reference_words;
  RecordProperty("wer_percent", std::to_string(100 * wer));
  std::fprintf(stderr, "librivox WER without VAD: %.1f %% (%zu / %zu)\n", 100 * wer, errors,
               reference_words);
  EXPECT_LE(wer, KVASR_WER_BOUND_NO_VAD);
}

}  // namespace
