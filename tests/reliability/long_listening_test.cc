// SPDX-License-Identifier: Apache-2.0
// One listening period fed hours of real speech between long pauses, at full
// speed: memory stays flat, every segment reaches the decoder, and after the
// final time-out no message follows. The length comes from
// KVASR_LISTENING_MINUTES in the environment, else the build's default.
#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <string>
#include <vector>

#include "listening.h"
#include "model_files.h"

namespace kvasr_reliability {
namespace {

constexpr int kChunk = 1600;
constexpr int kMaxMuteMs = 90000;

double ListeningMinutes() {
  const char* env = std::getenv("KVASR_LISTENING_MINUTES");
  return env != nullptr ? std::atof(env) : KVASR_LISTENING_MINUTES;
}

TEST(LongListeningTest, HoursOfSpeechAndPausesInOnePeriod) {
  const auto clips = LoadClips({"speech/librispeech/1040/1040-133433-0000.flac",
                                "speech/librispeech/118/118-121721-0000.flac",
                                "speech/librispeech/1235/1235-135883-0000.flac",
                                "speech/librispeech/1363/1363-135842-0000.flac",
                                "speech/librispeech/125/125-121124-0000.flac"});
  if (clips.empty()) GTEST_SKIP() << "the shared voice activity corpus is not beside the checkout";
  // One cycle: each clip followed by a pause of its own, up to 80 s (below
  // the 90 s limit); a whole number of chunks, so every cycle is fed alike.
  const int pauses_s[] = {5, 80, 20, 45, 10};
  std::vector<int16_t> cycle;
  size_t speech_samples = 0;
  for (size_t i = 0; i < clips.size(); ++i) {
    cycle.insert(cycle.end(), clips[i].begin(), clips[i].end());
    speech_samples += clips[i].size();
    const auto pause = QuietNoise(static_cast<size_t>(pauses_s[i]) * kSamplesPerSecond, i);
    cycle.insert(cycle.end(), pause.begin(), pause.end());
  }
  cycle.resize((cycle.size() + kChunk - 1) / kChunk * kChunk, 0);
  const double cycle_minutes = cycle.size() / (60.0 * kSamplesPerSecond);
  const int cycles = std::max(2, static_cast<int>(ListeningMinutes() / cycle_minutes));

  const std::string limit = std::to_string(kMaxMuteMs);
  Listener listener(quellan_test::MakeModelDir(16.0f),
                    R"({"asr":{"max_mute_time_before_voice":)" + limit +
                        R"(,"max_mute_time_after_voice":)" + limit + "}}");
  const std::vector<int64_t>& segments = listener.transcript().segment_samples;
  long rss_start = 0;
  std::vector<size_t> segments_per_cycle;
  std::vector<int64_t> samples_per_cycle;
  for (int c = 0; c < cycles; ++c) {
    const size_t before = segments.size();
    ASSERT_EQ(listener.Feed(cycle, kChunk), 0) << "cycle " << c;
    int64_t samples = 0;
    for (size_t i = before; i < segments.size(); ++i) samples += segments[i];
    segments_per_cycle.push_back(segments.size() - before);
    samples_per_cycle.push_back(samples);
    if (c == 0) rss_start = quellan_test::ResidentKiB();
  }
  const long rss_end = quellan_test::ResidentKiB();

  // The pauses before the limit never end the period; one longer does.
  const std::vector<int16_t> silence(kChunk, 0);
  int fed = 0;
  while (listener.Feed(silence, kChunk) == 0) ++fed;
  const std::vector<std::string> messages = listener.transcript().messages;
  EXPECT_EQ(listener.Feed(silence, kChunk), 1);
  EXPECT_EQ(listener.Finish().messages, messages);

  const double hours = cycles * cycle_minutes / 60.0;
  std::fprintf(stderr,
               "%.2f h fed in %d cycles: %zu segments, RSS %ld KiB after the first cycle, %ld KiB "
               "at the end\n",
               hours, cycles, segments.size(), rss_start, rss_end);
#if !defined(__SANITIZE_ADDRESS__) && !defined(__SANITIZE_THREAD__)
  // Sanitizer runtimes hold freed memory back for a while, so only a plain
  // build shows what the engine itself keeps.
  EXPECT_LE(rss_end - rss_start, 1024) << "KiB grown";
#endif
  // Every clip's speech reaches the decoder in every cycle, as in the first.
  for (int c = 1; c < cycles; ++c) {
    EXPECT_EQ(segments_per_cycle[c], segments_per_cycle[1]) << "cycle " << c;
    EXPECT_NEAR(samples_per_cycle[c], samples_per_cycle[1], kSamplesPerSecond) << "cycle " << c;
  }
  EXPECT_GE(segments_per_cycle[1], clips.size());
  // The clips' own quiet starts and ends stay below the energy gate.
  EXPECT_GE(samples_per_cycle[1], static_cast<int64_t>(speech_samples * 8 / 10));
  const size_t margins_samples = clips.size() * kSamplesPerSecond * 2;
  EXPECT_LE(samples_per_cycle[1], static_cast<int64_t>(speech_samples + margins_samples));
  // The time-out comes once the silence since the last speech, the cycle's
  // closing pause included, reaches the limit; it is the last message.
  const int closing_pause = pauses_s[clips.size() - 1] * kSamplesPerSecond;
  EXPECT_NEAR(fed * kChunk + closing_pause, kMaxMuteMs * 16, 2 * kSamplesPerSecond);
  ASSERT_FALSE(messages.empty());
  EXPECT_NE(messages.back().find(R"("status":-100)"), std::string::npos) << messages.back();
}

}  // namespace
}  // namespace kvasr_reliability
