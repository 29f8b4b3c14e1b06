// SPDX-License-Identifier: Apache-2.0
// Engines on different threads share nothing: four engines listen at once,
// each to its own audio, and each must report exactly what it reports alone.
// Built with ThreadSanitizer by tsan.sh.
#include <gtest/gtest.h>

#include <array>
#include <exception>
#include <string>
#include <thread>
#include <vector>

#include "listening.h"
#include "model_files.h"

namespace kvasr_reliability {
namespace {

constexpr int kEngines = 4;

// Clips in an order and at a level of its own for each engine, between
// pauses of its own, cut to `seconds`.
std::vector<int16_t> EngineAudio(const std::vector<std::vector<int16_t>>& clips, int engine,
                                 int seconds) {
  const size_t total = static_cast<size_t>(seconds) * kSamplesPerSecond;
  std::vector<int16_t> audio = QuietNoise(kSamplesPerSecond, engine);
  const float gain = 1.0f - 0.15f * static_cast<float>(engine);
  for (int i = 0; audio.size() < total; ++i) {
    for (int16_t s : clips[(engine + i) % clips.size()]) {
      audio.push_back(static_cast<int16_t>(static_cast<float>(s) * gain));
    }
    const std::vector<int16_t> pause =
        QuietNoise(kSamplesPerSecond * (1 + (engine + i) % 4), engine * 100 + i);
    audio.insert(audio.end(), pause.begin(), pause.end());
  }
  audio.resize(total);
  return audio;
}

TEST(ConcurrencyTest, FourEnginesOnFourThreadsEachGetExactlyTheirOwnResults) {
  const auto clips = LoadClips({"speech/librispeech/103/103-1240-0000.flac",
                                "speech/librispeech/1034/1034-121119-0000.flac",
                                "speech/librispeech/1081/1081-125237-0000.flac",
                                "speech/librispeech/1183/1183-124566-0000.flac",
                                "speech/librispeech/1455/1455-134435-0000.flac"});
  if (clips.empty()) GTEST_SKIP() << "the shared voice activity corpus is not beside the checkout";
  // Scores far above the threshold: the energy gate alone decides.
  const std::string model_dir = quellan_test::MakeModelDir(16.0f);
  const std::array<int, kEngines> chunks = {480, 1600, 2000, 4096};

  // One listening period; every chunk must be taken.
  const auto listen = [&](const std::vector<int16_t>& audio, int chunk) {
    Listener listener(model_dir, R"({"asr":{}})");
    EXPECT_EQ(listener.Feed(audio, chunk), 0);
    return listener.Finish().messages;
  };
  std::array<std::vector<int16_t>, kEngines> audio;
  std::array<std::vector<std::string>, kEngines> alone;
  for (int k = 0; k < kEngines; ++k) {
    audio[k] = EngineAudio(clips, k, KVASR_CONCURRENCY_SECONDS);
    alone[k] = listen(audio[k], chunks[k]);
    // Every clip gives at least one final text; a clip cut off at the end may not.
    EXPECT_GE(alone[k].size(), KVASR_CONCURRENCY_SECONDS / 20) << "engine " << k;
  }
  for (int k = 1; k < kEngines; ++k) {
    ASSERT_NE(alone[k], alone[0]) << "the engines' results must tell them apart";
  }

  std::array<std::vector<std::string>, kEngines> together;
  std::array<std::string, kEngines> errors;
  std::vector<std::thread> threads;
  for (int k = 0; k < kEngines; ++k) {
    threads.emplace_back([&, k] {
      try {
        together[k] = listen(audio[k], chunks[k]);
      } catch (const std::exception& e) {
        errors[k] = e.what();
      }
    });
  }
  for (std::thread& t : threads) t.join();

  for (int k = 0; k < kEngines; ++k) {
    EXPECT_EQ(errors[k], "") << "engine " << k;
    EXPECT_EQ(together[k], alone[k]) << "engine " << k;
  }
}

}  // namespace
}  // namespace kvasr_reliability
