#include "tone_post.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <memory>
#include <utility>
#include <vector>

#include "allocation_counter.h"

namespace {

constexpr float kVoicedLogEnergy = 20.0f;

std::unique_ptr<ToneState> Fresh() {
  auto s = std::make_unique<ToneState>();
  ToneStateInit(s.get());
  return s;
}

// Pushes the pitch track and returns every output frame, four floats each.
std::vector<float> PushTrack(ToneState* s, const std::vector<float>& pitch) {
  std::vector<float> out;
  float frame[kToneOutFloats];
  for (float p : pitch) {
    ToneStatePush(s, p, p == 0.0f ? -50.0f : kVoicedLogEnergy);
    const int frames = ToneStateTake(s, frame);
    out.insert(out.end(), frame, frame + frames * kToneValuesPerFrame);
  }
  return out;
}

TEST(ToneStateTest, DelayPendingAndFlushCounts) {
  for (int pushed : {0, 1, 26, 27, 28, 100}) {
    SCOPED_TRACE(pushed);
    auto s = Fresh();
    const std::vector<float> out =
        PushTrack(s.get(), std::vector<float>(pushed, 40.0f));
    const int held = std::min(pushed, kToneDelayFrames);
    EXPECT_EQ(static_cast<int>(out.size()) / kToneValuesPerFrame,
              pushed - held);
    EXPECT_EQ(ToneStatePending(s.get()), held);
    std::vector<float> tail(kToneOutFloats);
    EXPECT_EQ(ToneStateFlush(s.get(), tail.data()), held);
    EXPECT_EQ(ToneStatePending(s.get()), 0);
    EXPECT_EQ(s->pushed, 0);
  }
}

TEST(ToneStateTest, FlushSpacesFramesByOutBase) {
  auto s = Fresh();
  s->out_base = 2;
  PushTrack(s.get(), std::vector<float>(5, 40.0f));
  std::vector<float> dst(2 + 6 * 5, std::numeric_limits<float>::quiet_NaN());
  EXPECT_EQ(ToneStateFlush(s.get(), dst.data()), 5);
  // Frame i at 2 + 6 i; the two floats after each frame stay untouched.
  for (size_t k = 0; k < dst.size(); ++k) {
    EXPECT_EQ(std::isnan(dst[k]), k < 2 || (k - 2) % 6 >= 4) << k;
  }
  EXPECT_EQ(s->out_base, 2);
}

TEST(ToneStateTest, StreamStartsAtReferenceWhateverThePitch) {
  for (float pitch : {0.0f, 40.0f, 90.0f}) {
    auto s = Fresh();
    ToneStatePush(s.get(), pitch, kVoicedLogEnergy);
    EXPECT_EQ(s->norm101[kToneNormFrames - 1], std::log(185.0f)) << pitch;
  }
}

TEST(ToneStateTest, SelectionOfCentreFrame) {
  struct Case {
    const char* name;
    std::vector<std::pair<int, float>> voiced;  // window position, period
    bool whole_run;                             // every other position 40
    float selected;
  };
  const Case cases[] = {
      {"single voiced frame", {{10, 40.0f}}, false, 0.0f},
      {"pair within ratio", {{10, 40.0f}, {11, 50.0f}}, false, 40.0f},
      {"pair too far apart", {{10, 40.0f}, {11, 60.0f}}, false, 0.0f},
      {"steady run", {}, true, 40.0f},
      {"doubled period folded", {{10, 80.0f}}, true, 40.0f},
      {"halved period folded", {{10, 20.0f}}, true, 40.0f},
  };
  for (const Case& c : cases) {
    std::vector<float> pitch(kToneSelectFrames, c.whole_run ? 40.0f : 0.0f);
    for (const auto& [at, period] : c.voiced) pitch[at] = period;
    auto s = Fresh();
    PushTrack(s.get(), pitch);
    EXPECT_EQ(s->smooth3[kToneRepairFrames - 1], c.selected) << c.name;
  }
}

TEST(ToneStateTest, OneFrameGapIsRepaired) {
  constexpr int kGap = 30;
  std::vector<float> pitch(kGap + 10, 40.0f);
  pitch[kGap] = 0.0f;
  auto s = Fresh();
  // Nine frames after its push the gap is the middle of the repair window.
  PushTrack(s.get(), pitch);
  EXPECT_EQ(s->smooth3[1], 0.0f);
  EXPECT_EQ(s->interp7[kToneInterpFrames - 1], 200.0f);
}

TEST(ToneStateTest, GapsAreBridgedLinearlyInHz) {
  std::vector<float> pitch(40, 40.0f);  // 200 Hz
  pitch.insert(pitch.end(), 3, 0.0f);
  pitch.insert(pitch.end(), 40, 80.0f);  // 100 Hz
  pitch.insert(pitch.end(), 40, 0.0f);
  auto s = Fresh();
  std::vector<float> hz;  // interpolated frequency of input frame n at n + 14
  for (float p : pitch) {
    PushTrack(s.get(), {p});
    hz.push_back(std::exp(s->norm101[kToneNormFrames - 1]));
  }
  const float bridge[] = {200.0f, 175.0f, 150.0f, 125.0f, 100.0f};
  for (int k = 0; k < 5; ++k) EXPECT_NEAR(hz[39 + 14 + k], bridge[k], 1e-3f);
  // After the last voiced frame the contour climbs back to the reference.
  for (size_t i = hz.size() - 30; i < hz.size(); ++i) {
    EXPECT_GE(hz[i], hz[i - 1] - 1e-3f);
    EXPECT_LE(hz[i], 185.1f);
  }
  EXPECT_NEAR(hz.back(), 185.0f, 0.01f);
}

TEST(ToneStateTest, OnsetReachesContourTwelveFramesEarly) {
  // Output frame i belongs to input frame i. The contour looks ahead 2 frames
  // (averaging), 5 (normalisation) and 5 (gap interpolation), so a voiced
  // onset at frame T first shows in output frame T - 12; a derivative of
  // order r 2r frames earlier. Before that all values are exact zeros, which
  // come out as 1e-8.
  constexpr int kOnset = 40;
  std::vector<float> pitch(kOnset, 0.0f);
  pitch.insert(pitch.end(), 60, 80.0f);
  auto s = Fresh();
  std::vector<float> out = PushTrack(s.get(), pitch);
  std::vector<float> tail(kToneOutFloats);
  const int flushed = ToneStateFlush(s.get(), tail.data());
  out.insert(out.end(), tail.begin(),
             tail.begin() + flushed * kToneValuesPerFrame);
  ASSERT_EQ(out.size(), pitch.size() * kToneValuesPerFrame);
  for (int i = 0; i < kOnset - 12; ++i) {
    for (int r = 0; r < kToneValuesPerFrame && i < kOnset - 12 - 2 * r; ++r) {
      EXPECT_EQ(out[i * kToneValuesPerFrame + r], 1e-8f) << i << " " << r;
    }
  }
  EXPECT_GT(out[(kOnset - 12) * kToneValuesPerFrame], 1e-6f);
}

TEST(ToneStateTest, DerivativesFollowFromNeighbouringFrames) {
  std::vector<float> pitch;
  for (int i = 0; i < 200; ++i)
    pitch.push_back(30.0f + 10.0f * std::sin(i / 7.0f));
  auto s = Fresh();
  const std::vector<float> out = PushTrack(s.get(), pitch);
  const int frames = static_cast<int>(out.size()) / kToneValuesPerFrame;
  ASSERT_GT(frames, 100);
  auto at = [&](int t, int r) { return out[t * kToneValuesPerFrame + r]; };
  for (int r = 1; r < kToneValuesPerFrame; ++r) {
    for (int t = 2; t + 2 < frames; ++t) {
      const float expected = (2 * (at(t + 2, r - 1) - at(t - 2, r - 1)) +
                              (at(t + 1, r - 1) - at(t - 1, r - 1))) /
                             10.0f;
      ASSERT_NEAR(at(t, r), expected, 1e-6f) << "order " << r << " frame " << t;
    }
  }
}

TEST(ToneStateTest, PushAndFlushNeverAllocate) {
  auto s = Fresh();
  std::vector<float> frame(kToneOutFloats);
  const long before = quellan_test::AllocationCount();
  for (int i = 0; i < 300; ++i) {
    // Voiced runs with octave jumps and gaps exercise every selection path.
    const float pitch =
        i % 17 == 0 ? 0.0f : (i % 5 == 0 ? 80.0f : 40.0f + i % 3);
    ToneStatePush(s.get(), pitch, kVoicedLogEnergy);
    ToneStateTake(s.get(), frame.data());
  }
  ToneStateFlush(s.get(), frame.data());
  EXPECT_EQ(quellan_test::AllocationCount() - before, 0);
}

TEST(ToneStateTest, WarnsWhenOutputIsNotTaken) {
  auto s = Fresh();
  constexpr int kFillingPushes =
      kToneDelayFrames + kToneOutFloats / kToneValuesPerFrame;
  testing::internal::CaptureStdout();
  for (int i = 0; i < kFillingPushes - 1; ++i)
    ToneStatePush(s.get(), 40.0f, 20.0f);
  EXPECT_EQ(testing::internal::GetCapturedStdout(), "");
  testing::internal::CaptureStdout();
  ToneStatePush(s.get(), 40.0f, 20.0f);
  ToneStatePush(s.get(), 40.0f, 20.0f);
  EXPECT_EQ(testing::internal::GetCapturedStdout(),
            "Post-processing feature buffer exceeded!"
            "Post-processing feature buffer exceeded!");
  EXPECT_EQ(ToneStateTake(s.get(), nullptr),
            kToneOutFloats / kToneValuesPerFrame);
}

}  // namespace
