// SPDX-License-Identifier: Apache-2.0
// Real recordings through the public C API with the shipped decoder model.
#include "kvasr_offline.h"

#include <gtest/gtest.h>

#include <cpprest/json.h>

#include <string>
#include <vector>

#include "librivox.h"

namespace {

constexpr int kChunkSamples = 1600;  // 100 ms

// Appends each final text to the std::string behind `context`.
void CollectFinals(void*, const char* json, void* context) {
  const web::json::value result = web::json::value::parse(json).at("result");
  if (result.at("isBreak").as_bool()) {
    *static_cast<std::string*>(context) += result.at("text").as_string() + " ";
  }
}

class EndToEnd : public testing::Test {
 protected:
  void SetUp() override {
    KVASR_REQUIRE_LIBRIVOX();
    engine_ = vorta_speech_create_offline_asr_engine();
    testing::internal::CaptureStdout();  // the engine's log
  }

  void TearDown() override {
    if (!engine_) return;
    vorta_speech_release_offline_asr_engine(engine_);
    testing::internal::GetCapturedStdout();
  }

  // Word error rate over the five recordings with the shipped models, one
  // listening period each.
  double WordErrorRate(bool vad) {
    const std::string params =
        std::string("{\"local_moxwing_model_file_path\":\"") + KVASR_DECODER_MANIFEST +
        "\",\"local_vad_model_dir_path\":\"" + KVASR_VAD_MODEL_DIR +
        "\",\"lang\":\"en-US\",\"vad_enabled\":" + (vad ? "true" : "false") + "}";
    EXPECT_EQ(vorta_speech_offline_asr_init(engine_, params.c_str()), 0);
    const char* label = vad ? "with VAD" : "without VAD";
    size_t errors = 0;
    size_t reference_words = 0;
    const auto references = kvasr_test::LibrivoxReferences();
    EXPECT_EQ(references.size(), 5u);
    for (const kvasr_test::LibrivoxReference& reference : references) {
      const std::vector<int16_t> samples = kvasr_test::LibrivoxClip(reference.id);
      std::string hypothesis;
      EXPECT_EQ(vorta_speech_offline_asr_start(engine_, "{\"asr\":{}}", CollectFinals, &hypothesis),
                0);
      for (size_t at = 0; at < samples.size(); at += kChunkSamples) {
        const size_t n = std::min<size_t>(kChunkSamples, samples.size() - at);
        const int packet = at + n == samples.size() ? -1 : 0;
        if (vorta_speech_offline_asr_process_sound_data(engine_, samples.data() + at,
                                                        static_cast<int>(n), packet) != 0) {
          break;
        }
      }
      vorta_speech_offline_asr_stop(engine_);
      const size_t e = kvasr_test::EditDistance(reference.words, kvasr_test::Words(hypothesis));
      std::fprintf(stderr, "%s, clip %s: %zu errors / %zu words: %s\n", label, reference.id.c_str(),
                   e, reference.words.size(), hypothesis.c_str());
      errors += e;
      reference_words += reference.words.size();
    }
    std::fprintf(stderr, "librivox WER %s: %.1f %% (%zu / %zu)\n", label,
                 100.0 * errors / reference_words, errors, reference_words);
    return static_cast<double>(errors) / reference_words;
  }

  void* engine_ = nullptr;
};

TEST_F(EndToEnd, LibrivoxWordErrorRateWithoutVad) {
  EXPECT_LE(WordErrorRate(false), KVASR_WER_BOUND_NO_VAD);
}

TEST_F(EndToEnd, LibrivoxWordErrorRateWithVad) {
  EXPECT_LE(WordErrorRate(true), KVASR_WER_BOUND_VAD);
}

}  // namespace
