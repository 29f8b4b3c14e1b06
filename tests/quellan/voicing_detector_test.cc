// SPDX-License-Identifier: Apache-2.0
#include "voicing_detector.h"

#include <gtest/gtest.h>

#include <cmath>

namespace {

constexpr float kBandWeight[kMelBands] = {0.3333f, 0.3333f, 0.2857f, 0.2857f, 0.2857f, 0.25f,
                                          0.25f,   0.2222f, 0.2f,    0.2f,    0.2f,    0.1818f,
                                          0.1667f, 0.1538f, 0.1429f, 0.1429f, 0.1333f, 0.1176f,
                                          0.1111f, 0.1111f, 0.1f,    0.0909f, 0.087f};
constexpr float kNoise = 1e5f;

// One frame whose weighted band energies are kNoise, raised by `low_db` in
// the four lowest bands (which the peakiness test ignores). The smoothed
// energies are set first so that the frame takes effect at once.
int Frame(VoicingState* s, const float (&low_db)[4]) {
  float mel[kMelBands];
  for (int b = 0; b < kMelBands; ++b) {
    const float e = b < 4 ? kNoise * std::pow(10.0f, low_db[b] / 10) : kNoise;
    mel[b] = e / kBandWeight[b];
    if (s->frame_count > 0) s->band_energy[b] = e;
  }
  return DetectVoicing(s, mel);
}

int Frame(VoicingState* s, float low_db = 0.0f) {
  const float low[4] = {low_db, low_db, low_db, low_db};
  return Frame(s, low);
}

// Past the ten adapting frames, with the noise estimate settled on kNoise.
VoicingState Settled() {
  VoicingState s;
  VoicingInit(&s);
  for (int i = 0; i < 12; ++i) EXPECT_EQ(Frame(&s), 0);
  return s;
}

TEST(VoicingDetectorTest, ScoreMustExceedThreshold) {
  // 19 bands at 0 dB score 1 each; the four low bands add 10 per 11.6 dB and
  // 9 per 10.9 dB: totals 58 (the threshold) and 59.
  struct Case {
    float low_db[4];
    int voiced;
  };
  const Case cases[] = {{{11.6f, 11.6f, 11.6f, 10.9f}, 0}, {{11.6f, 11.6f, 11.6f, 11.6f}, 1}};
  for (const Case& c : cases) {
    VoicingState s = Settled();
    ASSERT_EQ(s.thr_voice, 58);
    EXPECT_EQ(Frame(&s, c.low_db), c.voiced);
  }
}

TEST(VoicingDetectorTest, HangoverNeedsTriggerRun) {
  // Row 17: trigger after 6 voiced frames, then 20 frames of hangover
  // counted from the triggering frame on.
  struct Case {
    int voiced_frames;
    int reported_frames;
  };
  const Case cases[] = {{1, 1}, {5, 5}, {6, 25}, {10, 29}};
  for (const Case& c : cases) {
    VoicingState s = Settled();
    int reported = 0;
    for (int i = 0; i < c.voiced_frames; ++i) reported += Frame(&s, 40.0f);
    for (int i = 0; i < 40; ++i) reported += Frame(&s);
    EXPECT_EQ(reported, c.reported_frames) << c.voiced_frames;
  }
}

}  // namespace
