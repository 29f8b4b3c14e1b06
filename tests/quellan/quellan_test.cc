// SPDX-License-Identifier: Apache-2.0
#include "quellan.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <set>
#include <stdexcept>
#include <string>
#include <vector>

#include "model_files.h"
#include "pipeline_harness.h"
#include "quellan_wrap.h"

namespace {

using quellan_test::Emission;
using Intervals = std::vector<std::pair<int, int>>;

constexpr int kRate = 16000;

// Ten seconds of faint noise with two bursts of full-scale-sign noise:
// frames 200..299 and 600..649. With exact settings the speech frames are
// 198..299 and 598..649 (windows reaching the bursts).
std::vector<int16_t> TwoBursts(size_t seconds = 10) {
  std::vector<int16_t> audio(seconds * kRate);
  unsigned seed = 12345;
  for (size_t i = 0; i < audio.size(); ++i) {
    seed = seed * 1103515245u + 12345u;
    const int r = static_cast<int>((seed >> 16) & 0x7fff);
    const bool loud = (i >= 32000 && i < 48000) || (i >= 96000 && i < 104000);
    audio[i] = static_cast<int16_t>(loud ? (r & 1 ? 8000 : -8000) : r % 7 - 3);
  }
  return audio;
}

class PipelineTest : public testing::Test {
 protected:
  void SetUp() override { dir_ = quellan_test::MakeModelDir(10.0f); }
  std::unique_ptr<Cquellan> Make(bool exact) {
    return std::make_unique<Cquellan>(quellan_test::PipelineConf(dir_, exact));
  }
  std::string dir_;
};

TEST_F(PipelineTest, WholeUtteranceInOneCall) {
  auto pipe = Make(true);
  const std::vector<int16_t> audio = TwoBursts();
  const std::vector<Emission> calls = quellan_test::RunUtterance(pipe.get(), audio, audio.size());
  ASSERT_EQ(calls.size(), 1u);
  // Two segments; the second starts right after the first one's cut. Only
  // the last interval reaches `out`, and since it does not end at the
  // call's first cut the call does not report an end.
  EXPECT_EQ(calls[0].intervals, (Intervals{{183, 448}, {449, 823}}));
  EXPECT_EQ(std::vector<int>({calls[0].speech, calls[0].continued, calls[0].ended}),
            std::vector<int>({1, 1, 0}));
}

TEST_F(PipelineTest, SegmentFlagsAcrossCalls) {
  auto pipe = Make(true);
  const std::vector<Emission> calls = quellan_test::RunUtterance(pipe.get(), TwoBursts(), 1600);
  std::vector<int> starts;
  int open_begin = -1;
  int next_frame = -1;
  for (size_t c = 0; c < calls.size(); ++c) {
    const Emission& e = calls[c];
    // While a closing silence is still being counted, calls emit nothing.
    if (!e.speech) continue;
    ASSERT_EQ(e.intervals.size(), 1u) << c;
    const auto [begin, end] = e.intervals[0];
    EXPECT_EQ(e.continued, open_begin < 0 ? 0 : 1) << c;
    if (open_begin < 0) {
      open_begin = begin;
      starts.push_back(begin);
    } else {
      EXPECT_EQ(begin, next_frame) << "pieces of a segment are contiguous";
    }
    next_frame = end + 1;
    if (e.ended) open_begin = -1;
  }
  EXPECT_EQ(starts, (std::vector<int>{183, 583}));
  EXPECT_EQ(open_begin, -1) << "the last segment was closed";
}

TEST_F(PipelineTest, EveryChunkSizeEmitsExactCopiesOfTheSpeech) {
  const std::vector<int16_t> audio = TwoBursts();
  for (size_t chunk : {1, 7, 160, 333, 1600, 4000, 16000, 48000}) {
    SCOPED_TRACE(chunk);
    auto pipe = Make(true);
    testing::internal::CaptureStdout();
    const std::vector<Emission> calls = quellan_test::RunUtterance(pipe.get(), audio, chunk);
    const std::string out = testing::internal::GetCapturedStdout();
    EXPECT_EQ(out.find("WARNING"), std::string::npos) << out.substr(0, 500);
    int closed = 0;
    const std::set<int> frames = quellan_test::EmittedFrames(calls, &closed);
    EXPECT_GE(closed, 1);
    for (const auto& [first, last] : Intervals{{198, 299}, {598, 649}}) {
      for (int f = first; f <= last; ++f) ASSERT_TRUE(frames.count(f)) << f;
    }
    EXPECT_EQ(*frames.begin(), 183);
    for (int f : frames) {
      EXPECT_TRUE((f >= 183 && f <= 299 + 160) || (f >= 449 && f <= 649 + 200)) << f;
    }
  }
}

TEST_F(PipelineTest, CallWithoutNewFrameRepeatsThePreviousReport) {
  void* handle = quellan_create(dir_.c_str());
  ASSERT_NE(handle, nullptr);
  const std::vector<int16_t> audio = TwoBursts();
  std::vector<int16_t> out(40000);
  int out_len = 0, speech = 0, continued = 0, ended = 0;
  const auto call = [&](int index, size_t pos, int len) {
    out_len = speech = continued = ended = 0;
    quellan_process_wave(handle, index, audio.data() + pos, len, out.data(), 40000, &out_len,
                         &speech, &continued, &ended);
    return std::vector<int>({speech, continued, ended});
  };
  // Right after the start a short chunk yields nothing.
  call(1, 0, 100);
  EXPECT_EQ(out_len + speech + continued + ended, 0);
  // Into the first burst, then one more sample.
  int index = 2;
  size_t pos = 100;
  std::vector<int> flags;
  for (; pos + 1600 <= 40000; pos += 1600, ++index) flags = call(index, pos, 1600);
  ASSERT_EQ(speech, 1);
  const std::vector<int16_t> before(out.begin(), out.begin() + out_len);
  std::fill(out.begin(), out.end(), 0);
  EXPECT_EQ(call(index, pos, 1), flags);
  EXPECT_EQ(std::vector<int16_t>(out.begin(), out.begin() + out_len), before);
  quellan_destroy(handle);
}

TEST_F(PipelineTest, RefusesWhatDoesNotFit) {
  auto pipe = Make(true);
  const std::vector<int16_t> audio = TwoBursts();
  std::vector<int16_t> out(1000);
  int out_len = 0, speech = 0, continued = 0, ended = 0;
  testing::internal::CaptureStdout();
  EXPECT_EQ(pipe->quellan_process(-1, audio.data(), static_cast<int>(audio.size()), out.data(),
                                  1000, &out_len, &speech, &continued, &ended),
            0);
  EXPECT_EQ(out_len, 1000);
  EXPECT_TRUE(std::equal(out.begin(), out.end(), audio.begin() + 449 * 160));

  const std::vector<int16_t> too_long(13000 * 160 + 1);
  out_len = speech = continued = ended = 0;
  EXPECT_EQ(pipe->quellan_process(1, too_long.data(), static_cast<int>(too_long.size()), out.data(),
                                  1000, &out_len, &speech, &continued, &ended),
            -1);
  EXPECT_EQ(pipe->quellan_process(1, nullptr, 10, out.data(), 1000, &out_len, &speech, &continued,
                                  &ended),
            0);
  EXPECT_EQ(out_len + speech + continued + ended, 0);
  const std::string log = testing::internal::GetCapturedStdout();
  for (const char* message :
       {"<<quellan_process>>] Output of [60000] samples cut to out_capacity[1000].\n",
        "WARNING * [modules/quellan/src/quellan.cc:",
        "<<quellan_process>>] wav_reserve overflow.\n",
        "<<quellan_process>>] Invalide input arguments.\n"}) {
    EXPECT_NE(log.find(message), std::string::npos) << message;
  }
}

TEST_F(PipelineTest, CreateFindsFilesByDirectoryOrWorkingDirectory) {
  testing::internal::CaptureStdout();
  try {
    quellan_create("/nonexistent/models");
    ADD_FAILURE() << "no exception";
  } catch (const std::runtime_error& e) {
    EXPECT_STREQ(e.what(), "init vad failed");
  }
  EXPECT_NE(
      testing::internal::GetCapturedStdout().find("WARNING * [modules/quellan/src/quellan.cc:"),
      std::string::npos);

  char cwd[4096];
  ASSERT_NE(getcwd(cwd, sizeof(cwd)), nullptr);
  ASSERT_EQ(chdir(dir_.c_str()), 0);
  void* handle = quellan_create(nullptr);
  ASSERT_EQ(chdir(cwd), 0);
  EXPECT_NE(handle, nullptr);
  quellan_destroy(handle);
}

// Three readers between stretches of quiet street noise, with the built-in
// settings: the segments cover the readers and leave most of the noise out.
// The chunk size changes them only slightly, as the energy accumulator
// restarts with each call and silence counts a little differently inside
// one call and across calls.
TEST_F(PipelineTest, ReadersInStreetNoiseWithBuiltInSettings) {
  std::vector<int16_t> noise;
  const std::string city = quellan_test::CorpusPath("noise/ambient/blanket/city.flac");
  if (!quellan_test::ReadFlac(city, &noise)) {
    GTEST_SKIP() << "the shared voice activity corpus is not beside the checkout";
  }
  std::vector<int16_t> audio;
  const auto add_noise = [&](size_t samples) {
    for (size_t i = 0; i < samples; ++i) audio.push_back(noise[i % noise.size()] / 16);
  };
  add_noise(2 * kRate);
  const int first_speech = static_cast<int>(audio.size()) / 160;
  for (const char* clip : {"speech/librispeech/1040/1040-133433-0000.flac",
                           "speech/librispeech/1069/1069-133699-0000.flac",
                           "speech/librispeech/1081/1081-125237-0000.flac"}) {
    std::vector<int16_t> speech;
    ASSERT_TRUE(quellan_test::ReadFlac(quellan_test::CorpusPath(clip), &speech)) << clip;
    audio.insert(audio.end(), speech.begin(), speech.end());
    add_noise(3 * kRate);
  }
  const int last_speech = static_cast<int>(audio.size()) / 160 - 300;  // 3 s of noise follow

  std::set<int> frames[2];
  const size_t chunks[2] = {kRate / 50, kRate / 2};
  for (int i = 0; i < 2; ++i) {
    SCOPED_TRACE(chunks[i]);
    auto pipe = Make(false);
    testing::internal::CaptureStdout();
    const std::vector<Emission> calls = quellan_test::RunUtterance(pipe.get(), audio, chunks[i]);
    EXPECT_EQ(testing::internal::GetCapturedStdout().find("WARNING"), std::string::npos);
    int closed = 0;
    frames[i] = quellan_test::EmittedFrames(calls, &closed);
    ASSERT_FALSE(frames[i].empty());
    EXPECT_GE(*frames[i].begin(), first_speech - 15);
    EXPECT_LE(*frames[i].begin(), first_speech + 100);
    EXPECT_GE(*frames[i].rbegin(), last_speech - 100);
    EXPECT_LE(*frames[i].rbegin(), last_speech + 150);
    EXPECT_GE(closed, 3);
    EXPECT_LT(frames[i].size(), audio.size() / 160 * 3 / 4) << "most of the noise is left out";
  }
  size_t both = 0;
  for (int f : frames[0]) both += frames[1].count(f);
  const double overlap = static_cast<double>(both) / (frames[0].size() + frames[1].size() - both);
  EXPECT_GT(overlap, 0.95);
}

TEST_F(PipelineTest, SurvivesArbitraryCallSequences) {
  // Indices out of order, zero-length and oversized chunks, last chunks in
  // the middle, tiny output buffers: every call stays within its buffers
  // (checked by the sanitizer build) and reports consistently.
  auto pipe = Make(false);
  const std::vector<int16_t> audio = TwoBursts(20);
  std::vector<int16_t> out(50000);
  unsigned seed = 99;
  auto next = [&seed](unsigned range) {
    seed = seed * 1103515245u + 12345u;
    return (seed >> 8) % range;
  };
  testing::internal::CaptureStdout();
  for (int call = 0; call < 3000; ++call) {
    const int index = static_cast<int>(next(60)) - 8;
    const int len = next(10) == 0 ? static_cast<int>(next(200000)) : static_cast<int>(next(3000));
    const size_t start = next(static_cast<unsigned>(audio.size() - 200000));
    const int capacity = static_cast<int>(next(50001));
    int out_len = 0, speech = 0, continued = 0, ended = 0;
    const int ret = pipe->quellan_process(index, audio.data() + start, len, out.data(), capacity,
                                          &out_len, &speech, &continued, &ended);
    ASSERT_TRUE(ret == 0 || ret == -1);
    ASSERT_GE(out_len, 0);
    ASSERT_LE(out_len, capacity);
    if (ret == -1) {
      ASSERT_EQ(out_len + speech + continued + ended, 0);
    }
    if (out_len > 0) {
      ASSERT_EQ(speech, 1);
    }
  }
  testing::internal::GetCapturedStdout();
}

}  // namespace
