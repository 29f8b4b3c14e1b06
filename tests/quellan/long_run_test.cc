// SPDX-License-Identifier: Apache-2.0
// Hours-long listening periods must run in fixed memory: twelve minutes
// between two resets, five times the per-utterance buffers.
#include <gtest/gtest.h>

#include <set>
#include <string>
#include <vector>

#include "allocation_counter.h"
#include "model_files.h"
#include "pipeline_harness.h"
#include "quellan.h"

namespace {

constexpr int kRate = 16000;

TEST(LongRunTest, TwelveMinutesWithoutResetStayInFixedMemory) {
  std::vector<int16_t> speech;
  const std::string path = quellan_test::CorpusPath("speech/librispeech/103/103-1240-0000.flac");
  if (!quellan_test::ReadFlac(path, &speech)) GTEST_SKIP() << "corpus missing: " << path;

  // Speech then six seconds of quiet, repeated past twelve minutes.
  const size_t period = speech.size() + 6 * kRate;
  const size_t periods = (12 * 60 * kRate) / period + 1;
  std::vector<int16_t> audio;
  audio.reserve(periods * period);
  for (size_t p = 0; p < periods; ++p) {
    audio.insert(audio.end(), speech.begin(), speech.end());
    for (int i = 0; i < 6 * kRate; ++i) audio.push_back(static_cast<int16_t>(i % 5 - 2));
  }

  Cquellan pipe(quellan_test::PipelineConf(quellan_test::MakeModelDir(10.0f), false));
  testing::internal::CaptureStdout();
  const std::vector<quellan_test::Emission> calls = quellan_test::RunUtterance(&pipe, audio, 1600);
  const std::string log = testing::internal::GetCapturedStdout();
  EXPECT_EQ(log.find("WARNING"), std::string::npos) << log.substr(0, 500);
  int closed = 0;
  const std::set<int> frames = quellan_test::EmittedFrames(calls, &closed);
  ASSERT_FALSE(frames.empty());
  EXPECT_GE(closed, static_cast<int>(periods) - 1);
  EXPECT_GT(*frames.rbegin(), static_cast<int>(audio.size() / 160) - 800)
      << "speech near the end, far beyond 130 s, is still emitted";
}

TEST(LongRunTest, MemoryDoesNotGrowWithListeningTime) {
  Cquellan pipe(quellan_test::PipelineConf(quellan_test::MakeModelDir(10.0f), false));
  std::vector<int16_t> chunk(1600);
  std::vector<int16_t> out(chunk.size() + 64000);
  int out_len = 0, speech = 0, continued = 0, ended = 0;
  unsigned seed = 1;
  int index = 0;
  long after_warm_up = 0;
  const long allocations_before = kvasr_test::AllocationCount();
  ASSERT_GT(allocations_before, 0) << "the counter sees the pipeline being built";
  // Alternating loud and quiet seconds for fifteen minutes.
  for (int second = 0; second < 15 * 60; ++second) {
    for (int c = 0; c < 10; ++c) {
      for (int16_t& s : chunk) {
        seed = seed * 1103515245u + 12345u;
        const int r = static_cast<int>((seed >> 16) % 2001) - 1000;
        s = static_cast<int16_t>(second % 4 < 2 ? r * 5 : r / 200);
      }
      ASSERT_EQ(
          pipe.quellan_process(++index, chunk.data(), 1600, out.data(),
                               static_cast<int>(out.size()), &out_len, &speech, &continued, &ended),
          0)
          << "second " << second;
    }
    if (second == 180) after_warm_up = quellan_test::ResidentKiB();
  }
  EXPECT_EQ(kvasr_test::AllocationCount() - allocations_before, 0)
      << "allocations while processing";
  ASSERT_GT(after_warm_up, 0);
  EXPECT_LE(quellan_test::ResidentKiB() - after_warm_up, 256)
      << "KiB grown after the first three minutes";
}

}  // namespace
