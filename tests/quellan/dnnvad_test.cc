#include "dnnvad.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <memory>
#include <string>
#include <vector>

#include "model_files.h"
#include "quellan_conf.h"

namespace {

constexpr int kShift = 160;

struct CallResult {
  int ret = 0;
  int consumed = 0;
  std::vector<int> cuts;
  std::vector<std::pair<int, int>> intervals;
};

// Drives a detector with one feature column whose sign is the network's
// decision (score +16 / -16, no smoothing, every frame evaluated), keeping
// the feature matrix as the pipeline does. `loud` marks the frames whose
// audio is loud; the rest is digital silence.
class DetectorHarness {
 public:
  DetectorHarness(std::vector<bool> speech, std::vector<bool> loud,
                  bool energy_gate)
      : speech_(std::move(speech)) {
    const std::string dir = quellan_test::MakeTempDir();
    quellan_test::WriteNetwork(dir + "/quellan_data_b",
                               quellan_test::SignNetwork(1, 5, 5, 0));
    quellan_test::WritePriors(dir + "/quellan_data_c", {1.0f, 1.0f});
    load_vad_dnn_conf(dir.c_str(), 1000, &conf_);
    conf_.feat_dim = 1;
    conf_.skip = 0;
    conf_.score_smooth = 0.0f;
    conf_.energy_gate = energy_gate ? 1 : 0;
    conf_.energy_smooth = 0.0f;
    // Audio runs 240 samples ahead of the frames: a 400-sample window
    // starts every 160 samples.
    for (bool l : loud) audio_.insert(audio_.end(), kShift, l ? 8000 : 0);
    audio_.insert(audio_.end(), 240, 0);
  }
  explicit DetectorHarness(std::vector<bool> speech)
      : DetectorHarness(speech, speech, false) {}

  VadDnnConf& conf() { return conf_; }
  void Build() { vad_ = std::make_unique<Cdnnvad>(conf_); }

  // Adds `frames` frames in one call, the last of the utterance when `last`.
  CallResult Feed(int frames, bool last) {
    if (!vad_) Build();
    for (int i = 0; i < frames; ++i, ++fed_) feat_.push_back(speech_[fed_] ? 1.0f : -1.0f);
    ++calls_;
    const size_t audio_end =
        last ? audio_.size() : static_cast<size_t>(fed_) * kShift + 240;
    const int16_t idle = 0;
    const int16_t* samples = audio_end > sent_ ? audio_.data() + sent_ : &idle;
    const int len = static_cast<int>(audio_end - sent_);
    sent_ = audio_end;
    CallResult r;
    const VadOutputLists lists{&cut_num_, cut_frame_, &seg_num_, seg_beg_, seg_end_, 5};
    r.ret = vad_->add_wave_data(last ? -calls_ : calls_, samples, len, feat_.data(), 1,
                                static_cast<int>(feat_.size()),
                                static_cast<int>(feat_.size()), &r.consumed, lists);
    if (r.ret >= 0) feat_.erase(feat_.begin(), feat_.begin() + r.consumed);
    for (int i = 0; i < cut_num_; ++i) r.cuts.push_back(cut_frame_[i]);
    for (int i = 0; i < seg_num_; ++i) r.intervals.emplace_back(seg_beg_[i], seg_end_[i]);
    return r;
  }

  // Every remaining frame in one last call.
  CallResult FeedAll() { return Feed(static_cast<int>(speech_.size()) - fed_, true); }

 private:
  std::vector<bool> speech_;
  VadDnnConf conf_;
  std::unique_ptr<Cdnnvad> vad_;
  std::vector<float> feat_;
  std::vector<int16_t> audio_;
  size_t sent_ = 0;
  int fed_ = 0;
  int calls_ = 0;
  int cut_num_ = 0;
  int cut_frame_[5] = {};
  int seg_num_ = 0;
  int seg_beg_[5] = {};
  int seg_end_[5] = {};
};

std::vector<bool> Pattern(int frames, const std::vector<std::pair<int, int>>& speech) {
  std::vector<bool> v(frames, false);
  for (const auto& [begin, end] : speech) {
    for (int f = begin; f < end; ++f) v[f] = true;
  }
  return v;
}

using Intervals = std::vector<std::pair<int, int>>;

TEST(DetectorTest, SegmentRunsFromMarginToMiddleOfClosingSilence) {
  DetectorHarness h(Pattern(300, {{100, 200}}));
  const CallResult r = h.FeedAll();
  ASSERT_EQ(r.ret, 295);
  EXPECT_EQ(r.consumed, 295) << "the last five frames stay as left context";
  // Interval ends at its first non-speech frame, 200; 99 trailing frames.
  EXPECT_EQ(r.intervals, (Intervals{{85, 200 + 99 / 2}}));
  EXPECT_EQ(r.cuts, (std::vector<int>{249}));
}

TEST(DetectorTest, HeadMarginStopsAtFrameZero) {
  DetectorHarness h(Pattern(100, {{5, 40}}));
  const CallResult r = h.FeedAll();
  ASSERT_EQ(r.intervals.size(), 1u);
  EXPECT_EQ(r.intervals[0].first, 0);
}

TEST(DetectorTest, GapInsideOneBatchClosesAtTwentyNineFrames) {
  for (int gap : {28, 29}) {
    DetectorHarness h(Pattern(300, {{50, 100}, {100 + gap, 180}}));
    const CallResult r = h.FeedAll();
    if (gap == 29) {
      // Cut in the middle of the gap; the next segment starts a margin
      // before its speech.
      EXPECT_EQ(r.intervals, (Intervals{{35, 114}, {114, 180 + 119 / 2}}));
      EXPECT_EQ(r.cuts, (std::vector<int>{114, 239}));
    } else {
      EXPECT_EQ(r.intervals, (Intervals{{35, 180 + 119 / 2}})) << gap;
      EXPECT_EQ(r.cuts, (std::vector<int>{239}));
    }
  }
}

TEST(DetectorTest, GapAcrossCallsNeedsThirtyOneFrames) {
  for (int gap : {29, 30, 31}) {
    DetectorHarness h(Pattern(200, {{20, 60}, {60 + gap, 120}}));
    // Batch 0..69: speech 20..59, then ten silent frames.
    CallResult first = h.Feed(75, false);
    ASSERT_EQ(first.consumed, 65);
    EXPECT_EQ(first.intervals, (Intervals{{5, 60}}));
    EXPECT_TRUE(first.cuts.empty());
    CallResult second = h.Feed(125, true);
    if (gap < 31) {
      EXPECT_EQ(second.intervals, (Intervals{{61, 120 + 79 / 2}})) << gap;
      EXPECT_EQ(second.cuts, (std::vector<int>{159})) << gap;
    } else {
      // Carried 9 + lead 21 = 30 frames close the segment at 70 + (22 - 9) / 2.
      EXPECT_EQ(second.intervals, (Intervals{{61, 76}, {76, 159}}));
      EXPECT_EQ(second.cuts, (std::vector<int>{76, 159}));
    }
  }
}

TEST(DetectorTest, CallWithoutNewFrameLeavesListsAlone) {
  DetectorHarness h(Pattern(200, {{20, 150}}));
  const CallResult first = h.Feed(40, false);
  ASSERT_EQ(first.intervals, (Intervals{{5, 34}}));
  const CallResult idle = h.Feed(0, false);
  EXPECT_EQ(idle.ret, 0);
  EXPECT_EQ(idle.consumed, 0);
  EXPECT_EQ(idle.intervals, first.intervals);
}

TEST(DetectorTest, ShortBatchesWithoutDueEvaluationCarryTheScore) {
  DetectorHarness h(Pattern(100, {{0, 100}}));
  h.conf().skip = 2;
  // One new frame per call: two of every three batches have no frame due
  // for the network.
  CallResult r = h.Feed(12, false);
  ASSERT_GE(r.ret, 0);
  int end = r.intervals.back().second;
  for (int i = 0; i < 30; ++i) {
    r = h.Feed(1, false);
    ASSERT_EQ(r.ret, 1) << i;
    ASSERT_EQ(r.intervals.size(), 1u);
    EXPECT_EQ(r.intervals[0], std::make_pair(end + 1, end + 1));
    end = r.intervals[0].second;
  }
}

TEST(DetectorTest, MoreIntervalsThanSlotsKeepsTheLatest) {
  std::vector<std::pair<int, int>> bursts;
  for (int i = 0; i < 8; ++i) bursts.emplace_back(50 + 60 * i, 70 + 60 * i);
  DetectorHarness h(Pattern(600, bursts));
  testing::internal::CaptureStdout();
  const CallResult r = h.FeedAll();
  const std::string out = testing::internal::GetCapturedStdout();
  // Eight segments: the first five cuts and the last five intervals stay.
  EXPECT_EQ(r.cuts, (std::vector<int>{89, 149, 209, 269, 329}));
  EXPECT_EQ(r.intervals, (Intervals{{215, 269}, {275, 329}, {335, 389},
                                    {395, 449}, {455, 544}}));
  EXPECT_NE(out.find("Too many intervals in one call"), std::string::npos);
  EXPECT_NE(out.find("Too many cut frames in one call"), std::string::npos);
}

TEST(DetectorTest, EnergyGateVetoesQuietFrames) {
  // The network calls every frame speech; loud audio in frames 100..199
  // reaches the windows of frames 98..199.
  DetectorHarness h(std::vector<bool>(300, true), Pattern(300, {{100, 200}}), true);
  const CallResult r = h.FeedAll();
  EXPECT_EQ(r.intervals, (Intervals{{83, 200 + 99 / 2}}));
}

TEST(DetectorTest, RefusalsAndOverflow) {
  DetectorHarness big(Pattern(50, {}), Pattern(50, {}), true);
  big.conf().max_frames = 20;
  testing::internal::CaptureStdout();
  EXPECT_EQ(big.Feed(21, false).ret, -1);
  EXPECT_NE(testing::internal::GetCapturedStdout().find(
                "<<add_wave_data>>] Invalide input arguments to "
                "Cdnnvad::AddWaveData\n"),
            std::string::npos);

  DetectorHarness full(Pattern(50, {}), Pattern(50, {}), true);
  full.conf().max_frames = 20;
  testing::internal::CaptureStdout();
  EXPECT_EQ(full.Feed(19, false).ret, -1);
  EXPECT_NE(testing::internal::GetCapturedStdout().find(
                "Wav overflows [3280] >= [3200]\n"),
            std::string::npos);
}

TEST(DetectorTest, LastChunkStopsEnergyPassAtMissingAudio) {
  // Features for 20 frames but audio for fewer: the pass ends early with a
  // message and the call still succeeds.
  DetectorHarness h(Pattern(20, {{0, 20}}), Pattern(10, {{0, 10}}), true);
  testing::internal::CaptureStdout();
  const CallResult r = h.FeedAll();
  const std::string out = testing::internal::GetCapturedStdout();
  EXPECT_EQ(r.ret, 15);
  EXPECT_NE(out.find("<<client_detect_speech>>] Overflows. sta[1600]+m_win_size[400] "
                     "m_wav_len[1840]\n"),
            std::string::npos)
      << out;
}

TEST(DetectorTest, ConstructionFailuresThrow) {
  DetectorHarness h(Pattern(10, {}));
  std::snprintf(h.conf().dnn_file, kVadPathBytes, "/nonexistent/net");
  testing::internal::CaptureStdout();
  EXPECT_THROW(h.Build(), std::runtime_error);
  EXPECT_NE(testing::internal::GetCapturedStdout().find(
                "<<Cdnnvad>>] Failed to load vad dnn file[/nonexistent/net].\n"),
            std::string::npos);

  DetectorHarness wrong(Pattern(10, {}));
  wrong.conf().end_offset = 4;
  testing::internal::CaptureStdout();
  EXPECT_THROW(wrong.Build(), std::runtime_error);
  EXPECT_NE(testing::internal::GetCapturedStdout().find("Failed to set_dnn_params\n"),
            std::string::npos);

  DetectorHarness priors(Pattern(10, {}));
  std::snprintf(priors.conf().state_weights_file, kVadPathBytes, "/nonexistent/p");
  testing::internal::CaptureStdout();
  EXPECT_THROW(priors.Build(), std::runtime_error);
  EXPECT_NE(testing::internal::GetCapturedStdout().find(
                "Failed to load state-weights file[/nonexistent/p].\n"),
            std::string::npos);
}

}  // namespace
