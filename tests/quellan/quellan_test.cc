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
  EXPECT_EQ(calls[0].speech, 1);
  EXPECT_EQ(calls[0].continued, 1);
  EXPECT_EQ(calls[0].ended, 0);
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
    if (open_begin < 0) {
      EXPECT_EQ(e.continued, 0) << c;
      open_begin = begin;
      starts.push_back(begin);
    } else {
      EXPECT_EQ(e.continued, 1) << c;
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
    std::set<int> frames;
    int closed = 0;
    const Intervals* previous = nullptr;
    for (const Emission& e : calls) {
      // A call that completes no frame repeats the previous call's report.
      if (previous != nullptr && e.intervals == *previous) continue;
      previous = &e.intervals;
      for (const auto& [begin, end] : e.intervals) {
        for (int f = begin; f <= end; ++f) frames.insert(f);
      }
      closed += e.ended;
    }
    EXPECT_GE(closed, 1);
    for (int f = 198; f <= 299; ++f) ASSERT_TRUE(frames.count(f)) << f;
    for (int f = 598; f <= 649; ++f) ASSERT_TRUE(frames.count(f)) << f;
    EXPECT_EQ(*frames.begin(), 183);
    EXPECT_LE(*frames.rbegin(), 649 + 200);
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
  // Right after the start a short chunk yields nothing.
  quellan_process_wave(handle, 1, audio.data(), 100, out.data(), 40000, &out_len,
                       &speech, &continued, &ended);
  EXPECT_EQ(out_len + speech + continued + ended, 0);
  // Into the first burst, then one more sample.
  int index = 2;
  size_t pos = 100;
  for (; pos + 1600 <= 40000; pos += 1600, ++index) {
    out_len = speech = continued = ended = 0;
    quellan_process_wave(handle, index, audio.data() + pos, 1600, out.data(), 40000,
                         &out_len, &speech, &continued, &ended);
  }
  ASSERT_EQ(speech, 1);
  const std::vector<int16_t> before(out.begin(), out.begin() + out_len);
  const int flags = continued * 2 + ended;
  std::fill(out.begin(), out.end(), 0);
  out_len = speech = continued = ended = 0;
  quellan_process_wave(handle, index, audio.data() + pos, 1, out.data(), 40000,
                       &out_len, &speech, &continued, &ended);
  EXPECT_EQ(speech, 1);
  EXPECT_EQ(continued * 2 + ended, flags);
  EXPECT_EQ(std::vector<int16_t>(out.begin(), out.begin() + out_len), before);
  quellan_destroy(handle);
}

TEST_F(PipelineTest, RefusesWhatDoesNotFit) {
  auto pipe = Make(true);
  const std::vector<int16_t> audio = TwoBursts();
  std::vector<int16_t> out(1000);
  int out_len = 0, speech = 0, continued = 0, ended = 0;

  testing::internal::CaptureStdout();
  EXPECT_EQ(pipe->quellan_process(-1, audio.data(), static_cast<int>(audio.size()),
                                  out.data(), 1000, &out_len, &speech, &continued,
                                  &ended),
            0);
  std::string log = testing::internal::GetCapturedStdout();
  EXPECT_EQ(out_len, 1000);
  EXPECT_TRUE(std::equal(out.begin(), out.end(), audio.begin() + 449 * 160));
  EXPECT_NE(log.find("<<quellan_process>>] Output of [60000] samples cut to "
                     "out_capacity[1000].\n"),
            std::string::npos)
      << log;

  std::vector<int16_t> too_long(13000 * 160 + 1);
  out_len = speech = continued = ended = 0;
  testing::internal::CaptureStdout();
  EXPECT_EQ(pipe->quellan_process(1, too_long.data(), static_cast<int>(too_long.size()),
                                  out.data(), 1000, &out_len, &speech, &continued,
                                  &ended),
            -1);
  EXPECT_EQ(pipe->quellan_process(1, nullptr, 10, out.data(), 1000, &out_len, &speech,
                                  &continued, &ended),
            0);
  log = testing::internal::GetCapturedStdout();
  EXPECT_EQ(out_len + speech + continued + ended, 0);
  EXPECT_NE(log.find("WARNING * [modules/quellan/src/quellan.cc:"), std::string::npos);
  EXPECT_NE(log.find("<<quellan_process>>] wav_reserve overflow.\n"), std::string::npos);
  EXPECT_NE(log.find("<<quellan_process>>] Invalide input arguments.\n"),
            std::string::npos);
}

TEST_F(PipelineTest, CreateFindsFilesByDirectoryOrWorkingDirectory) {
  testing::internal::CaptureStdout();
  EXPECT_THROW(
      {
        try {
          quellan_create("/nonexistent/models");
        } catch (const std::runtime_error& e) {
          EXPECT_STREQ(e.what(), "init vad failed");
          throw;
        }
      },
      std::runtime_error);
  EXPECT_NE(testing::internal::GetCapturedStdout().find(
                "WARNING * [modules/quellan/src/quellan.cc:"),
            std::string::npos);

  char cwd[4096];
  ASSERT_NE(getcwd(cwd, sizeof(cwd)), nullptr);
  ASSERT_EQ(chdir(dir_.c_str()), 0);
  void* handle = quellan_create(nullptr);
  ASSERT_EQ(chdir(cwd), 0);
  EXPECT_NE(handle, nullptr);
  quellan_destroy(handle);
}

TEST_F(PipelineTest, RealSpeechWithBuiltInSettings) {
  std::vector<int16_t> speech;
  const std::string path = quellan_test::CorpusPath("speech/librispeech/1034/1034-121119-0000.flac");
  if (!quellan_test::ReadFlac(path, &speech)) GTEST_SKIP() << "corpus missing: " << path;
  std::vector<int16_t> audio(2 * kRate, 0);
  audio.insert(audio.end(), speech.begin(), speech.end());
  audio.insert(audio.end(), 3 * kRate, 0);
  auto pipe = Make(false);
  testing::internal::CaptureStdout();
  const std::vector<Emission> calls = quellan_test::RunUtterance(pipe.get(), audio, 640);
  EXPECT_EQ(testing::internal::GetCapturedStdout().find("WARNING"), std::string::npos);
  int first = -1, last = -1, closed = 0;
  for (const Emission& e : calls) {
    for (const auto& [begin, end] : e.intervals) {
      if (first < 0) first = begin;
      last = std::max(last, end);
    }
    closed += e.ended;
  }
  // Speech starts after the two seconds of silence and is closed within
  // the trailing silence.
  EXPECT_GE(first, 200 - 15);
  EXPECT_LE(first, 200 + 100);
  const int speech_end = static_cast<int>((2 * kRate + speech.size()) / 160);
  EXPECT_GE(last, speech_end - 100);
  EXPECT_LE(last, speech_end + 150);
  EXPECT_GE(closed, 1);
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
    const int len = next(10) == 0 ? static_cast<int>(next(200000))
                                  : static_cast<int>(next(3000));
    const size_t start = next(static_cast<unsigned>(audio.size() - 200000));
    const int capacity = static_cast<int>(next(50001));
    int out_len = 0, speech = 0, continued = 0, ended = 0;
    const int ret = pipe->quellan_process(index, audio.data() + start, len, out.data(),
                                          capacity, &out_len, &speech, &continued,
                                          &ended);
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
