// SPDX-License-Identifier: Apache-2.0
#include "tone_post.h"

#include <gtest/gtest.h>

#include <cmath>
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
    const std::vector<float> out = PushTrack(s.get(), std::vector<float>(pushed, 40.0f));
    const int held = std::min(pushed, kToneDelayFrames);
    EXPECT_EQ(static_cast<int>(out.size()) / kToneValuesPerFrame, pushed - held);
    EXPECT_EQ(ToneStatePending(s.get()), held);
    std::vector<float> tail(kToneOutFloats);
    EXPECT_EQ(ToneStateFlush(s.get(), tail.data()), held);
    EXPECT_EQ(ToneStatePending(s.get()), 0);
    EXPECT_EQ(s->pushed, 0);
  }
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

TEST(ToneStateTest, PushAndFlushNeverAllocate) {
  auto s = Fresh();
  std::vector<float> frame(kToneOutFloats);
  const long before = kvasr_test::AllocationCount();
  for (int i = 0; i < 300; ++i) {
    // Voiced runs with octave jumps and gaps exercise every selection path.
    const float pitch = i % 17 == 0 ? 0.0f : (i % 5 == 0 ? 80.0f : 40.0f + i % 3);
    ToneStatePush(s.get(), pitch, kVoicedLogEnergy);
    ToneStateTake(s.get(), frame.data());
  }
  ToneStateFlush(s.get(), frame.data());
  EXPECT_EQ(kvasr_test::AllocationCount() - before, 0);
}

TEST(ToneStateTest, WarnsWhenOutputIsNotTaken) {
  auto s = Fresh();
  constexpr int kFillingPushes = kToneDelayFrames + kToneOutFloats / kToneValuesPerFrame;
  testing::internal::CaptureStdout();
  for (int i = 0; i < kFillingPushes - 1; ++i) ToneStatePush(s.get(), 40.0f, 20.0f);
  EXPECT_EQ(testing::internal::GetCapturedStdout(), "");
  testing::internal::CaptureStdout();
  ToneStatePush(s.get(), 40.0f, 20.0f);
  ToneStatePush(s.get(), 40.0f, 20.0f);
  EXPECT_EQ(testing::internal::GetCapturedStdout(),
            "Post-processing feature buffer exceeded!"
            "Post-processing feature buffer exceeded!");
  EXPECT_EQ(ToneStateTake(s.get(), nullptr), kToneOutFloats / kToneValuesPerFrame);
}

}  // namespace
