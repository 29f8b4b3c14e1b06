// SPDX-License-Identifier: Apache-2.0
// The rows the detector sees must not depend on how the caller cuts an
// utterance: PLP takes over the frames it analysed for the previous chunk
// instead of analysing them again, and that must give exactly what one call
// over the whole utterance gives.
#include <gtest/gtest.h>

#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "model_files.h"
#include "pipeline_harness.h"

namespace {

// Rows of `audio` in chunks of `chunk` samples, on a pipeline that first
// heard three seconds of another utterance and dropped it unfinished: the
// utterance that starts over must not take over its frames.
quellan_test::RowLog Rows(const std::string& dir, const std::vector<int16_t>& audio, size_t chunk) {
  Cquellan pipe(quellan_test::PipelineConf(dir, false));
  const std::vector<int16_t> dropped(audio.rbegin(), audio.rbegin() + 48000);
  std::vector<int16_t> out(dropped.size() + 64000);
  int out_len = 0, speech = 0, continued = 0, ended = 0;
  testing::internal::CaptureStdout();
  EXPECT_EQ(
      pipe.quellan_process(1, dropped.data(), static_cast<int>(dropped.size()), out.data(),
                           static_cast<int>(out.size()), &out_len, &speech, &continued, &ended),
      0);
  quellan_test::RowLog log;
  pipe.set_frame_observer(&log);
  quellan_test::RunUtterance(&pipe, audio, chunk);
  testing::internal::GetCapturedStdout();
  return log;
}

TEST(ChunkFeaturesTest, EveryChunkSizeGivesTheRowsOfOneCall) {
  std::vector<int16_t> audio;
  const std::string path =
      quellan_test::CorpusPath("speech/librispeech/1034/1034-121119-0000.flac");
  if (!quellan_test::ReadFlac(path, &audio)) GTEST_SKIP() << "corpus missing: " << path;
  const std::string dir = quellan_test::MakeModelDir(10.0f);
  // Longer than one second, so the single call normalises as a stream does.
  const quellan_test::RowLog whole = Rows(dir, audio, audio.size());
  ASSERT_GT(whole.frames.size(), 700u);
  // One sample, a frame shift, 20 ms, an odd length and three seconds.
  for (size_t chunk : {1, 160, 320, 1601, 48000}) {
    SCOPED_TRACE(chunk);
    const quellan_test::RowLog part = Rows(dir, audio, chunk);
    ASSERT_EQ(part.frames, whole.frames);
    EXPECT_EQ(std::memcmp(part.rows.data(), whole.rows.data(), sizeof(float) * whole.rows.size()),
              0);
  }
}

}  // namespace
