#include "voicing_detector.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <vector>

namespace {

constexpr float kBandWeight[kMelBands] = {
    0.3333f, 0.3333f, 0.2857f, 0.2857f, 0.2857f, 0.25f,   0.25f,   0.2222f,
    0.2f,    0.2f,    0.2f,    0.1818f, 0.1667f, 0.1538f, 0.1429f, 0.1429f,
    0.1333f, 0.1176f, 0.1111f, 0.1111f, 0.1f,    0.0909f, 0.087f};
constexpr float kNoise = 1e5f;
constexpr double kTwoPi = 6.283185307179586;

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

TEST(VoicingDetectorTest, OpeningFramesSetLevelRowAndAreNeverVoiced) {
  // Flat noise: 10 log10(1e9 / (23 * 1e5)) = 26.4 dB selects row 17. With
  // loud low bands the noise sum exceeds 1e9 and the level is 0 dB, row 0.
  struct Case {
    float snr_db_low;
    int thr_high, thr_voice, trigger, hangover;
  };
  const Case cases[] = {{0.0f, 295, 58, 6, 20}, {40.0f, 36, 32, 2, 54}};
  for (const Case& c : cases) {
    VoicingState s;
    VoicingInit(&s);
    for (int i = 0; i < 10; ++i) EXPECT_EQ(Frame(&s, c.snr_db_low), 0) << i;
    EXPECT_EQ(s.thr_high, c.thr_high);
    EXPECT_EQ(s.thr_voice, c.thr_voice);
    EXPECT_EQ(s.trigger_frames, c.trigger);
    EXPECT_EQ(s.hangover_frames, c.hangover);
  }
}

TEST(VoicingDetectorTest, NoiseAdaptation) {
  VoicingState s;
  VoicingInit(&s);
  // A peaky opening frame drops the noise estimate to the floor; silent
  // bands stay at the floor too.
  float mel[kMelBands] = {};
  mel[10] = 1e8f;
  DetectVoicing(&s, mel);
  for (float n : s.noise_energy) EXPECT_EQ(n, 5000.0f);
  EXPECT_EQ(s.band_energy[0], 5000.0f);

  // Closed: a quiet frame pulls the estimate by 10 %, a voiced one leaves it.
  VoicingState quiet = Settled();
  Frame(&quiet, 3.0f);
  EXPECT_NEAR(quiet.noise_energy[0], 0.9f * kNoise + 0.1f * kNoise * 1.9953f,
              2.0f);
  VoicingState voiced = Settled();
  EXPECT_EQ(Frame(&voiced, 40.0f), 1);
  EXPECT_NEAR(voiced.noise_energy[0], kNoise, 1.0f);
}

TEST(VoicingDetectorTest, LongStationarityForcesAnUpdate) {
  VoicingState s = Settled();
  // The jump into the steady state changes the band levels by 160 dB, which
  // the level smoothing brings under 70 dB only after three frames.
  constexpr int kCountedFromFrame = 4;
  for (int i = 1; i < kCountedFromFrame + 499; ++i) {
    Frame(&s, 40.0f);
    ASSERT_EQ(s.forced_update, 0) << i;
  }
  Frame(&s, 40.0f);
  EXPECT_EQ(s.forced_update, 1);
}

TEST(VoicingDetectorTest, ScoreMustExceedThreshold) {
  // 19 bands at 0 dB score 1 each; the four low bands add 10 per 11.6 dB and
  // 9 per 10.9 dB: totals 58 (the threshold) and 59.
  struct Case {
    float low_db[4];
    int voiced;
  };
  const Case cases[] = {{{11.6f, 11.6f, 11.6f, 10.9f}, 0},
                        {{11.6f, 11.6f, 11.6f, 11.6f}, 1}};
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

TEST(VoicingDetectorTest, RestartBalance) {
  // Bins 0 .. 12 are low, the rest high. Tilt weights: bin 5 is 0.0154897,
  // bin 50 is 1.28733.
  struct Case {
    int voiced;
    float energy;
    int low_bin, high_bin;
    float low, high;  // power in the two bins
    float balance;
    int restart;
  };
  const Case cases[] = {
      {1, 1e6f, 12, 13, 1.0f, 0.0f, 1.9f, 0},
      {0, 63999.0f, 12, 13, 1.0f, 0.0f, 1.9f, 0},
      {0, 64000.0f, 12, 13, 1.0f, 0.0f, 0.1f + 0.99f * 1.9f, 1},
      {0, 1e6f, 12, 13, 0.0f, 1.0f, 0.99f * 1.9f, 0},
      {0, 1e6f, 5, 50, 1.28733f * 3.0f, 0.0154897f, 0.01f * 3.0f + 0.99f * 1.9f,
       1},
  };
  for (const Case& c : cases) {
    VoicingState s;
    VoicingInit(&s);
    float power[kPowerBins] = {};
    power[c.low_bin] = c.low;
    power[c.high_bin] = c.high;
    EXPECT_EQ(DetectRestart(&s, c.voiced, power, c.energy), c.restart);
    EXPECT_NEAR(s.balance, c.balance, 1e-5f);
  }
}

// Feeds `frames` analysis buffers that slide by 80 samples over x.
std::vector<float> FilterFrames(const std::vector<float>& x, int frames,
                                int restart, VoicingState* s) {
  std::vector<float> out;
  const float silence[kMelBands] = {};
  for (int k = 0; k < frames; ++k) {
    DetectVoicing(s, silence);
    float low[kPitchSamples2kHz];
    FilterForPitch(s, restart, &x[80 * k], low);
    out.insert(out.end(), low, low + kPitchSamples2kHz);
  }
  return out;
}

TEST(VoicingFilterTest, ToneGains) {
  struct Case {
    int restart;
    float hz;
    float min_gain;
    float max_gain;
  };
  const Case cases[] = {
      {1, 100.0f, 0.95f, 1.05f},  {0, 100.0f, 3.0f, 3.4f},
      {1, 2000.0f, 0.0f, 0.003f}, {0, 2000.0f, 0.0f, 0.003f},
      {1, 1500.0f, 0.0f, 0.02f},
  };
  constexpr int kFrames = 30;
  std::vector<float> x(80 * kFrames + 120);
  for (const Case& c : cases) {
    for (size_t n = 0; n < x.size(); ++n) {
      x[n] = std::sin(kTwoPi * c.hz * n / 8000.0);
    }
    VoicingState s;
    VoicingInit(&s);
    const std::vector<float> out = FilterFrames(x, kFrames, c.restart, &s);
    float peak = 0.0f;
    for (size_t i = out.size() - kPitchSamples2kHz; i < out.size(); ++i) {
      peak = std::max(peak, std::fabs(out[i]));
    }
    EXPECT_GE(peak, c.min_gain) << c.hz << " Hz, restart " << c.restart;
    EXPECT_LE(peak, c.max_gain) << c.hz << " Hz, restart " << c.restart;
  }
}

TEST(VoicingFilterTest, OutputIsLast40MsAtEveryFourthSample) {
  for (int restart : {0, 1}) {
    std::vector<float> x(kAnalysisSamples + 80, 0.0f);
    x[0] = 1.0f;
    VoicingState s;
    VoicingInit(&s);
    const std::vector<float> out = FilterFrames(x, 2, restart, &s);
    // After the first frame sample 0 sits 200 samples before the newest,
    // i.e. at output 30; earlier outputs precede the stream.
    for (int j = 0; j < 30; ++j) EXPECT_EQ(out[j], 0.0f) << j;
    EXPECT_FLOAT_EQ(out[30], restart ? 0.000340539991f : 0.000340537692f);
    // The next frame moves everything 80 samples, 20 outputs, to the front.
    for (int j = 0; j < 60; ++j) {
      EXPECT_EQ(out[kPitchSamples2kHz + j], out[j + 20]) << restart << " " << j;
    }
  }
}

}  // namespace
