// SPDX-License-Identifier: Apache-2.0
#include "pitch_tracker.h"

#include <gtest/gtest.h>

#include <cfloat>
#include <cmath>
#include <cstring>
#include <memory>
#include <vector>

namespace {

constexpr int kRate = 16000;

std::unique_ptr<PitchTracker> MakeTracker() {
  auto t = std::make_unique<PitchTracker>();
  PitchTrackerInit(t.get());
  return t;
}

// Faint noise, then a harmonic complex of `f0_hz` whose harmonic h has
// amplitude 1 / h^tilt up to 7.5 kHz (tilt 0: pulse-like flat spectrum).
std::vector<int16_t> NoiseThenTone(double f0_hz, double tilt, int lead_samples, int tone_samples) {
  std::vector<int16_t> x(static_cast<size_t>(lead_samples + tone_samples));
  unsigned seed = 7;
  for (int i = 0; i < lead_samples; ++i) {
    seed = seed * 1103515245u + 12345u;
    x[i] = static_cast<int16_t>(static_cast<int>((seed >> 16) % 11) - 5);
  }
  double norm = 0.0;
  for (int h = 1; h * f0_hz < 7500.0; ++h) norm += std::pow(h, -tilt);
  for (int i = 0; i < tone_samples; ++i) {
    double v = 0.0;
    for (int h = 1; h * f0_hz < 7500.0; ++h) {
      v += std::pow(h, -tilt) * std::cos(2.0 * M_PI * h * f0_hz * i / kRate);
    }
    x[lead_samples + i] = static_cast<int16_t>(std::lround(12000.0 * v / norm));
  }
  return x;
}

TEST(PitchTrackerTables, MelEdgesAndWindowSymmetry) {
  std::vector<int> edges(kMelEdges);
  PitchMelEdges(edges.data());
  EXPECT_EQ(edges, (std::vector<int>{2,  4,  6,  8,  11, 13, 16, 19, 22, 26,  30,  34, 38,
                                     43, 48, 54, 60, 66, 73, 81, 89, 97, 107, 117, 128}));
  // Symmetric about sample 99.5 up to the rounding of the single-precision
  // 2 pi, and above zero at both ends.
  auto t = MakeTracker();
  for (int i = 0; i < kAnalysisSamples / 2; ++i) {
    EXPECT_NEAR(t->window[i], t->window[kAnalysisSamples - 1 - i], 1e-6) << i;
  }
  EXPECT_GT(t->window[0], 0.0f);
  EXPECT_GT(t->window[99], 0.9999f);
}

// Silent frames push (0, -50) and leave the analysis alone; the first
// analysis comes with the third non-silent frame, on a buffer that starts
// with 20 zeros.
TEST(PitchTrackerFrames, SilenceAndFirstAnalysis) {
  auto t = MakeTracker();
  const std::vector<int16_t> silent(kPitchFrameSamples, 0);
  std::vector<int16_t> tiny(kPitchFrameSamples, 0);
  tiny[5] = 1;
  const struct {
    bool silent;
    int fill_after;
    bool raw_written;
  } steps[] = {{true, 20, false},   {false, 100, false}, {true, 100, false},
               {false, 180, false}, {false, 180, true},  {false, 180, true}};
  int pushed = 0;
  for (const auto& step : steps) {
    const std::vector<float> before(t->analysis, t->analysis + kAnalysisBufferSamples);
    float raw = FLT_MAX;
    AnalyseFrame(t.get(), (step.silent ? silent : tiny).data(), &raw);
    EXPECT_EQ(t->fill, step.fill_after);
    EXPECT_EQ(raw != FLT_MAX, step.raw_written);
    if (step.silent || step.raw_written) ++pushed;
    EXPECT_EQ(t->post.pushed, pushed);
    if (step.silent) {
      EXPECT_EQ(std::memcmp(before.data(), t->analysis, sizeof(t->analysis)), 0);
      EXPECT_EQ(t->post.energy_win[kToneSelectFrames - 1], -50.0f);
      EXPECT_EQ(t->post.pitch_win[kToneSelectFrames - 1], 0.0f);
    }
  }
  EXPECT_EQ(t->frame_counter, 6u);
}

// Every loud voiced frame of a steady harmonic complex after the tracker has
// settled is within 2 % of the true pitch.
TEST(PitchTrackerAccuracy, SyntheticHarmonicComplexes) {
  const double pitches_hz[] = {100.0, 137.0, 180.0, 220.0, 263.0, 310.0, 355.0, 400.0};
  const double tilts[] = {0.0, 1.0, 2.0};
  const int lead = kRate / 4;
  const int settle = kRate / 10;
  auto t = MakeTracker();
  for (double f0 : pitches_hz) {
    for (double tilt : tilts) {
      PitchTrackerReset(t.get());
      const std::vector<int16_t> x = NoiseThenTone(f0, tilt, lead, kRate);
      int estimates = 0;
      double worst = 0.0;
      for (size_t pos = 0; pos + kPitchFrameSamples <= x.size(); pos += kPitchFrameSamples) {
        float raw = FLT_MAX;
        AnalyseFrame(t.get(), x.data() + pos, &raw);
        ToneStateTake(&t->post, nullptr);
        if (pos < static_cast<size_t>(lead + settle) || raw == FLT_MAX) continue;
        ASSERT_GT(raw, 0.0f) << f0 << " Hz, tilt " << tilt << ", sample " << pos;
        worst = std::max(worst, std::fabs(8000.0 / raw / f0 - 1.0));
        ++estimates;
      }
      EXPECT_GE(estimates, 80) << f0 << " Hz, tilt " << tilt;
      EXPECT_LT(worst, 0.02) << f0 << " Hz, tilt " << tilt;
    }
  }
}

}  // namespace
