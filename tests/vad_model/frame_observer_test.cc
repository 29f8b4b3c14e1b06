// SPDX-License-Identifier: Apache-2.0
// The detector's frame observer: what it reports is what the detector used,
// and watching changes nothing.
#include <gtest/gtest.h>

#include <cmath>
#include <vector>

#include "model_files.h"
#include "pipeline_harness.h"
#include "quellan.h"
#include "temp_dir.h"

namespace {

using quellan_test::Emission;

constexpr int kFeatDim = 39;
constexpr int kC0Column = 12;
constexpr int kRateHz = 16000;
constexpr int kFrameShiftSamples = 160;
constexpr int kWindowSamples = 400;

// Keeps every report too; its row pointer is only good during the call, so
// the rows are read from the log's copies.
struct Recorder : quellan_test::RowLog {
  void on_frame(const VadFrameReport& r) override {
    RowLog::on_frame(r);
    reports.push_back(r);
  }
  std::vector<VadFrameReport> reports;
};

// Loud tone bursts of 0.6 s between 0.9 s pauses of faint noise.
std::vector<int16_t> Bursts(double seconds) {
  std::vector<int16_t> audio(static_cast<size_t>(seconds * kRateHz));
  unsigned noise = 1;
  for (size_t i = 0; i < audio.size(); ++i) {
    noise = noise * 1103515245u + 12345u;
    const double t = static_cast<double>(i) / kRateHz;
    const bool loud = std::fmod(t, 1.5) >= 0.9;
    const double tone = loud ? 8000.0 * std::sin(2 * M_PI * 440.0 * t) : 0.0;
    audio[i] = static_cast<int16_t>(tone + static_cast<int>((noise >> 16) % 41) - 20);
  }
  return audio;
}

struct Model {
  std::string dir;
  Model() : dir(kvasr_test::ProcessTempDir()) {
    quellan_test::WriteNetwork(dir + "/quellan_data_b",
                               quellan_test::SignNetwork(kFeatDim, 5, 5, kC0Column));
    quellan_test::WritePriors(dir + "/quellan_data_c", {1.0f, 1.0f});
    quellan_test::WriteMeanTable(dir + "/quellan_data_a", std::vector<float>(kFeatDim, 0.0f),
                                 std::vector<float>(kFeatDim, 1.0f));
  }
};

TEST(FrameObserver, ReportsEveryFrameOnceWithTheRowTheNetworkScored) {
  const Model model;
  const std::vector<int16_t> audio = Bursts(6.0);
  for (const size_t chunk : {160u, 1600u, 8000u}) {
    SCOPED_TRACE(chunk);
    Cquellan pipe(quellan_test::PipelineConf(model.dir, /*exact=*/true));
    Recorder recorder;
    pipe.set_frame_observer(&recorder);
    quellan_test::RunUtterance(&pipe, audio, chunk);
    const int expected = (static_cast<int>(audio.size()) - kWindowSamples) / kFrameShiftSamples + 1;
    ASSERT_EQ(static_cast<int>(recorder.reports.size()), expected);
    int speech_frames = 0;
    for (int f = 0; f < expected; ++f) {
      const VadFrameReport& r = recorder.reports[f];
      ASSERT_EQ(r.frame, f);
      // Every frame is evaluated: its score follows its own C0 column.
      const float c0 = recorder.rows[static_cast<size_t>(f) * kFeatDim + kC0Column];
      if (std::fabs(c0) > 0.05f) {
        EXPECT_EQ(r.score > 0.0f, c0 > 0.0f) << "frame " << f;
      }
      // Without smoothing the decision is the score and the energy gate.
      EXPECT_EQ(r.speech, r.smoothed > -1.0f && r.energy_speech == 1 ? 1 : 0);
      speech_frames += r.speech;
    }
    EXPECT_GT(speech_frames, expected / 10);
    EXPECT_LT(speech_frames, expected * 9 / 10);
  }
}

TEST(FrameObserver, WatchingChangesNoOutputAndUnsettingStopsReports) {
  const Model model;
  const std::vector<int16_t> audio = Bursts(5.0);
  Cquellan plain(quellan_test::PipelineConf(model.dir, false));
  Cquellan watched(quellan_test::PipelineConf(model.dir, false));
  Recorder recorder;
  watched.set_frame_observer(&recorder);
  const std::vector<Emission> a = quellan_test::RunUtterance(&plain, audio, 1600);
  const std::vector<Emission> b = quellan_test::RunUtterance(&watched, audio, 1600);
  ASSERT_EQ(a.size(), b.size());
  bool any_speech = false;
  for (size_t i = 0; i < a.size(); ++i) {
    EXPECT_EQ(a[i].intervals, b[i].intervals) << "call " << i;
    EXPECT_EQ(a[i].speech, b[i].speech);
    EXPECT_EQ(a[i].ended, b[i].ended);
    any_speech = any_speech || a[i].speech;
  }
  EXPECT_TRUE(any_speech);
  const size_t reported = recorder.reports.size();
  EXPECT_GT(reported, 0u);
  watched.set_frame_observer(nullptr);
  quellan_test::RunUtterance(&watched, audio, 1600);
  EXPECT_EQ(recorder.reports.size(), reported);
}

}  // namespace
