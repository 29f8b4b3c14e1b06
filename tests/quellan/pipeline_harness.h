// SPDX-License-Identifier: Apache-2.0
// Feeds audio through the pipeline in chunks and checks what each call
// emits against the audio it was given.
#ifndef KVASR_TESTS_QUELLAN_PIPELINE_HARNESS_H_
#define KVASR_TESTS_QUELLAN_PIPELINE_HARNESS_H_

#include <gtest/gtest.h>

#include <cstdint>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "quellan.h"

namespace quellan_test {

struct Emission {
  int ret = 0;
  int out_len = 0;
  int speech = 0;
  int continued = 0;
  int ended = 0;
  std::vector<std::pair<int, int>> intervals;  // frames of every interval
};

// Records every row the detector sees, frame-major.
struct RowLog : VadFrameObserver {
  void on_frame(const VadFrameReport& r) override {
    frames.push_back(r.frame);
    rows.insert(rows.end(), r.features, r.features + r.feat_dim);
  }
  std::vector<int> frames;
  std::vector<float> rows;
};

// Settings with the given model directory; `exact` switches off score and
// energy smoothing and evaluates every frame, so that a frame is speech
// exactly when its energy window reaches loud audio.
inline QuellanConf PipelineConf(const std::string& dir, bool exact) {
  QuellanConf conf{};
  EXPECT_EQ(load_quellan_conf(dir.c_str(), &conf), 0);
  if (exact) {
    conf.vad.score_smooth = 0.0f;
    conf.vad.energy_smooth = 0.0f;
    conf.vad.skip = 0;
  }
  return conf;
}

// Runs `audio` through `pipe` in chunks of `chunk` samples as one utterance
// and checks every call: it succeeds, each interval holds the audio at its
// frames, and `out` holds the last interval. Returns one record per call.
inline std::vector<Emission> RunUtterance(Cquellan* pipe, const std::vector<int16_t>& audio,
                                          size_t chunk) {
  std::vector<Emission> calls;
  std::vector<int16_t> out(chunk + 64000);
  int index = 0;
  for (size_t pos = 0; pos < audio.size(); pos += chunk) {
    const size_t len = std::min(chunk, audio.size() - pos);
    ++index;
    const bool last = pos + len == audio.size();
    Emission e;
    e.ret = pipe->quellan_process(last ? -index : index, audio.data() + pos, static_cast<int>(len),
                                  out.data(), static_cast<int>(out.size()), &e.out_len, &e.speech,
                                  &e.continued, &e.ended);
    EXPECT_EQ(e.ret, 0) << "call " << index;
    for (int i = 0; i < pipe->emitted_count(); ++i) {
      const Cquellan::Interval iv = pipe->emitted(i);
      e.intervals.emplace_back(iv.begin_frame, iv.end_frame);
      EXPECT_LE(iv.begin_frame, iv.end_frame);
      EXPECT_GE(iv.begin_frame, 0);
      if (iv.begin_frame > iv.end_frame || iv.begin_frame < 0) continue;
      const size_t begin = static_cast<size_t>(iv.begin_frame) * 160;
      const size_t count = static_cast<size_t>(iv.end_frame - iv.begin_frame + 1) * 160;
      EXPECT_EQ(iv.sample_count, static_cast<int>(std::min<size_t>(count, 32000)));
      EXPECT_TRUE(std::equal(iv.samples, iv.samples + iv.sample_count, audio.begin() + begin))
          << "call " << index << " interval " << i;
      if (i + 1 == pipe->emitted_count() && e.speech) {
        EXPECT_EQ(e.out_len, static_cast<int>(count));
        EXPECT_TRUE(std::equal(out.begin(), out.begin() + e.out_len, audio.begin() + begin))
            << "call " << index;
      }
    }
    if (!e.speech) {
      EXPECT_EQ(e.out_len, 0);
    }
    calls.push_back(std::move(e));
  }
  return calls;
}

// Frames of the emitted intervals; `closed` counts the segments ended. A
// call that completes no frame repeats the previous call's report and is
// skipped.
inline std::set<int> EmittedFrames(const std::vector<Emission>& calls, int* closed) {
  std::set<int> frames;
  *closed = 0;
  const std::vector<std::pair<int, int>>* previous = nullptr;
  for (const Emission& e : calls) {
    if (previous != nullptr && e.intervals == *previous) continue;
    previous = &e.intervals;
    for (const auto& [begin, end] : e.intervals) {
      for (int f = begin; f <= end; ++f) frames.insert(f);
    }
    *closed += e.ended;
  }
  return frames;
}

}  // namespace quellan_test

#endif  // KVASR_TESTS_QUELLAN_PIPELINE_HARNESS_H_
