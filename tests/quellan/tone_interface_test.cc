// SPDX-License-Identifier: Apache-2.0
#include "Vortaf0Interface.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <memory>
#include <string>
#include <vector>

#include "model_files.h"
#include "pipeline_harness.h"
#include "quellan.h"

namespace {

constexpr int kRate = 16000;
constexpr int kToneDim = 3;
constexpr float kSentinel = -777.0f;

// Faint noise with a rising harmonic complex from 0.3 s to 1.3 s.
std::vector<int16_t> GlideAudio(int seconds) {
  std::vector<int16_t> x(static_cast<size_t>(seconds) * kRate);
  unsigned seed = 99;
  double phase = 0.0;
  for (size_t i = 0; i < x.size(); ++i) {
    seed = seed * 1103515245u + 12345u;
    double v = static_cast<int>((seed >> 16) % 21) - 10;
    if (i >= 4800 && i < 20800) {
      const double f0 = 140.0 + 80.0 * (i - 4800) / 16000.0;
      phase += 2.0 * M_PI * f0 / kRate;
      for (int h = 1; h <= 12; ++h) v += 4000.0 / h * std::sin(h * phase);
    }
    x[i] = static_cast<int16_t>(std::lround(v));
  }
  return x;
}

struct ToneRun {
  std::vector<float> features;  // stride kToneDim
  std::vector<float> raw;
  int frames = 0;
};

// Feeds `audio` in chunks of the given sizes (cycled), then ends the stream.
ToneRun RunTone(const std::vector<int16_t>& audio, const std::vector<int>& chunks) {
  PitchConf conf{};
  EXPECT_EQ(load_pitch_conf(nullptr, &conf), 0);
  EXPECT_EQ(conf.tone_dim, kToneDim);
  auto tone = std::make_unique<Vortaf0Interface>(conf, 0);
  tone->SetToneFeatureOffset(0);
  ToneRun run;
  const int capacity = static_cast<int>(audio.size()) / 160 + 1;
  run.features.assign(static_cast<size_t>(capacity) * kToneDim, kSentinel);
  run.raw.resize(static_cast<size_t>(capacity));
  int raw_total = 0;
  for (size_t c = 0, pos = 0; pos < audio.size(); ++c) {
    const int len = std::min<int>(chunks[c % chunks.size()], static_cast<int>(audio.size() - pos));
    int written = -1;
    int raw_count = -1;
    EXPECT_EQ(tone->ExtractToneFeature(audio.data() + pos, len,
                                       run.features.data() + run.frames * kToneDim,
                                       capacity - run.frames, &written, run.raw.data() + raw_total,
                                       capacity - raw_total, &raw_count),
              0);
    run.frames += written;
    raw_total += raw_count;
    pos += static_cast<size_t>(len);
  }
  int flushed = -1;
  EXPECT_EQ(tone->EndToneFeature(run.features.data() + run.frames * kToneDim, capacity - run.frames,
                                 &flushed),
            0);
  run.frames += flushed;
  run.raw.resize(static_cast<size_t>(raw_total));
  return run;
}

// However the stream is cut into calls, the frames are the stream's
// consecutive 160-sample frames: 159 + 1 makes one frame, and 100 pending
// samples + 400 make frames pending + 0..59, 60..219 and 220..379 with 20
// samples left.
TEST(ToneInterfaceFraming, AnyChunkingMatchesWholeFrames) {
  const std::vector<int16_t> audio = GlideAudio(2);
  const ToneRun whole = RunTone(audio, {160});
  ASSERT_GT(whole.frames, 150);
  ASSERT_GT(whole.raw.size(), 150u);
  const std::vector<std::vector<int>> cuts = {{159, 1},    {100, 400}, {1},
                                              {0, 320, 7}, {4000},     {161, 159, 3}};
  for (const std::vector<int>& cut : cuts) {
    SCOPED_TRACE(cut[0]);
    const ToneRun run = RunTone(audio, cut);
    EXPECT_EQ(run.frames, whole.frames);
    EXPECT_EQ(run.features, whole.features);
    EXPECT_EQ(run.raw, whole.raw);
  }
}

TEST(ToneInterfacePipeline, ToneColumnsFollowThePlpColumns) {
  constexpr int kPlpDim = 39;
  constexpr int kRow = kPlpDim + kToneDim;
  const std::string tone_dir = quellan_test::MakeModelDir(10.0f, kRow);
  QuellanConf tone_conf = quellan_test::PipelineConf(tone_dir, false);
  tone_conf.use_pitch = 1;
  ASSERT_EQ(load_pitch_conf(tone_dir.c_str(), &tone_conf.pitch), 0);
  Cquellan with_tone(tone_conf);
  Cquellan plain(quellan_test::PipelineConf(quellan_test::MakeModelDir(10.0f), false));
  quellan_test::RowLog tone_rows, plain_rows;
  with_tone.set_frame_observer(&tone_rows);
  plain.set_frame_observer(&plain_rows);

  // 100 samples past the last full frame give PLP one row more than the
  // tone track, whose last frame is then repeated.
  std::vector<int16_t> audio = GlideAudio(3);
  audio.insert(audio.end(), 100, 3);
  testing::internal::CaptureStdout();
  quellan_test::RunUtterance(&with_tone, audio, 1600);
  quellan_test::RunUtterance(&plain, audio, 1600);
  EXPECT_EQ(testing::internal::GetCapturedStdout().find("WARNING"), std::string::npos);

  const ToneRun reference = RunTone(audio, {1600});
  ASSERT_EQ(tone_rows.frames, plain_rows.frames);
  ASSERT_EQ(static_cast<int>(tone_rows.frames.size()), reference.frames + 1);
  ASSERT_EQ(tone_rows.rows.size(), tone_rows.frames.size() * kRow);
  for (size_t i = 0; i < tone_rows.frames.size(); ++i) {
    SCOPED_TRACE(tone_rows.frames[i]);
    const float* row = tone_rows.rows.data() + i * kRow;
    EXPECT_TRUE(std::equal(row, row + kPlpDim, plain_rows.rows.begin() + i * kPlpDim));
    const size_t source = std::min<size_t>(i, reference.frames - 1);
    EXPECT_TRUE(
        std::equal(row + kPlpDim, row + kRow, reference.features.begin() + source * kToneDim));
  }
}

}  // namespace
