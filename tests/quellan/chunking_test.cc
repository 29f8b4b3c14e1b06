// The chunk size of the caller changes segments only slightly: the energy
// accumulator restarts with each call and silence gaps count a little
// differently inside one call and across calls, nothing more.
#include <gtest/gtest.h>

#include <memory>
#include <set>
#include <string>
#include <vector>

#include "model_files.h"
#include "pipeline_harness.h"

namespace {

constexpr size_t kRate = 16000;

// Frames covered by the intervals the pipeline emitted.
std::set<int> EmittedFrames(const std::vector<quellan_test::Emission>& calls) {
  std::set<int> frames;
  for (const quellan_test::Emission& e : calls) {
    for (const auto& [begin, end] : e.intervals) {
      for (int f = begin; f <= end; ++f) frames.insert(f);
    }
  }
  return frames;
}

TEST(ChunkingTest, SegmentsOfTwentyAndFiveHundredMillisecondChunksAgree) {
  std::vector<int16_t> noise;
  if (!quellan_test::ReadFlac(quellan_test::CorpusPath("noise/ambient/blanket/city.flac"), &noise)) {
    GTEST_SKIP() << "the shared voice activity corpus is not beside the checkout";
  }
  // Three readers between stretches of quiet street noise.
  std::vector<int16_t> audio;
  size_t noise_at = 0;
  const auto add_noise = [&](size_t samples) {
    for (size_t i = 0; i < samples; ++i) audio.push_back(noise[noise_at++ % noise.size()] / 16);
  };
  add_noise(2 * kRate);
  for (const char* clip : {"speech/librispeech/1040/1040-133433-0000.flac",
                           "speech/librispeech/1069/1069-133699-0000.flac",
                           "speech/librispeech/1081/1081-125237-0000.flac"}) {
    std::vector<int16_t> speech;
    ASSERT_TRUE(quellan_test::ReadFlac(quellan_test::CorpusPath(clip), &speech)) << clip;
    audio.insert(audio.end(), speech.begin(), speech.end());
    add_noise(3 * kRate);
  }

  // Every frame above the energy gate scores as speech.
  const std::string dir = quellan_test::MakeModelDir(10.0f);
  std::set<int> frames[2];
  const size_t chunks[2] = {kRate / 50, kRate / 2};
  for (int i = 0; i < 2; ++i) {
    auto pipe = std::make_unique<Cquellan>(quellan_test::PipelineConf(dir, false));
    testing::internal::CaptureStdout();
    frames[i] = EmittedFrames(quellan_test::RunUtterance(pipe.get(), audio, chunks[i]));
    testing::internal::GetCapturedStdout();
  }
  ASSERT_FALSE(frames[0].empty());
  size_t both = 0;
  for (int f : frames[0]) both += frames[1].count(f);
  const size_t either = frames[0].size() + frames[1].size() - both;
  const double overlap = static_cast<double>(both) / static_cast<double>(either);
  std::fprintf(stderr, "20 ms: %zu frames, 500 ms: %zu frames, shared %zu, overlap %.3f\n",
               frames[0].size(), frames[1].size(), both, overlap);
  EXPECT_GT(overlap, 0.95);
  // And the noise between the readers is mostly left out.
  EXPECT_LT(frames[0].size(), audio.size() / 160 * 3 / 4);
}

}  // namespace
