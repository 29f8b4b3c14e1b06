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
    testing::internal::CaptureStdout();  // the engine's log
  }

  // The shipped decoder and VAD models.
  bool Init(bool vad) {
    const std::string params = std::string("{\"local_moxwing_model_file_path\":\"") +
                               KVASR_DECODER_MANIFEST + "\",\"local_vad_model_dir_path\":\"" +
                               KVASR_VAD_MODEL_DIR + "\",\"lang\":\"en-US\",\"vad_enabled\":" +
                               (vad ? "true" : "false") + "}";
    return vorta_speech_offline_asr_init(engine_, params.c_str()) == 0;
  }
  void TearDown() override {
    if (!engine_) return;
    vorta_speech_release_offline_asr_engine(engine_);
    testing::internal::GetCapturedStdout();
  }

  // One listening period over a clip; returns every message in order.
  // Feeding stops at the first refused chunk, as after a time-out.
  std::vector<Message> Listen(const std::vector<int16_t>& samples,
                              const char* start_params = "{\"asr\":{}}") {
    std::vector<Message> messages;
    EXPECT_EQ(vorta_speech_offline_asr_start(engine_, start_params, Collect, &messages), 0);
    for (size_t at = 0; at < samples.size(); at += kChunkSamples) {
      const size_t n = std::min<size_t>(kChunkSamples, samples.size() - at);
      const bool last = at + n == samples.size();
      if (vorta_speech_offline_asr_process_sound_data(engine_, samples.data() + at,
                                                      static_cast<int>(n), last ? -1 : 0) != 0) {
        break;
      }
    }
    vorta_speech_offline_asr_stop(engine_);
    return messages;
  }

  // Errors and reference words over the five recordings, one listening
  // period each.
  std::pair<size_t, size_t> Errors(const char* label) {
    size_t errors = 0;
    size_t reference_words = 0;
    const auto references = kvasr_test::LibrivoxReferences();
    EXPECT_EQ(references.size(), 5u);
    for (const kvasr_test::LibrivoxReference& reference : references) {
      std::string hypothesis;
      for (const Message& m : Listen(kvasr_test::LibrivoxClip(reference.id))) {
        if (m.is_break) hypothesis += m.text + " ";
      }
      const size_t e = kvasr_test::EditDistance(reference.words, kvasr_test::Words(hypothesis));
      std::fprintf(stderr, "%s, clip %s: %zu errors / %zu words: %s\n", label,
                   reference.id.c_str(), e, reference.words.size(), hypothesis.c_str());
      errors += e;
      reference_words += reference.words.size();
    }
    std::fprintf(stderr, "librivox WER %s: %.1f %% (%zu / %zu)\n", label,
                 100.0 * errors / reference_words, errors, reference_words);
    return {errors, reference_words};
  }

  void* engine_ = nullptr;
};

TEST_F(EndToEnd, LibrivoxWordErrorRateWithoutVad) {
  ASSERT_TRUE(Init(false));
  const auto [errors, words] = Errors("without VAD");
  EXPECT_LE(static_cast<double>(errors) / words, KVASR_WER_BOUND_NO_VAD);
}

TEST_F(EndToEnd, LibrivoxWordErrorRateWithVad) {
  ASSERT_TRUE(Init(true));
  const auto [errors, words] = Errors("with VAD");
  EXPECT_LE(static_cast<double>(errors) / words, KVASR_WER_BOUND_VAD);
}

// A recording followed by a long silence: the period ends itself, and its
// last message is the time-out, after any final text.
TEST_F(EndToEnd, NothingFollowsTheTimeOut) {
  ASSERT_TRUE(Init(true));
  std::vector<int16_t> audio = kvasr_test::LibrivoxClip("0880");
  audio.insert(audio.end(), 16000 * 20, 0);
  const std::vector<Message> messages = Listen(
      audio, "{\"asr\":{\"max_mute_time_before_voice\":5000,\"max_mute_time_after_voice\":3000}}");
  ASSERT_GE(messages.size(), 2u);
  EXPECT_EQ(messages.back().status, -100);
  for (size_t i = 0; i + 1 < messages.size(); ++i) EXPECT_EQ(messages[i].status, 0);
  EXPECT_TRUE(messages[messages.size() - 2].is_break);
}

}  // namespace
