// SPDX-License-Identifier: Apache-2.0
#include "listening.h"

#include <algorithm>
#include <stdexcept>

#include <cpprest/json.h>

#include "model_files.h"

namespace kvasr_reliability {

std::vector<std::vector<int16_t>> LoadClips(const std::vector<std::string>& relative_paths) {
  std::vector<std::vector<int16_t>> clips;
  for (const std::string& path : relative_paths) {
    std::vector<int16_t> samples;
    if (!quellan_test::ReadFlac(quellan_test::CorpusPath(path), &samples)) return {};
    clips.push_back(std::move(samples));
  }
  return clips;
}

std::vector<int16_t> QuietNoise(size_t samples, uint32_t seed) {
  std::vector<int16_t> noise(samples);
  for (int16_t& s : noise) {
    seed = seed * 1664525u + 1013904223u;
    s = static_cast<int16_t>(static_cast<int>(seed >> 29) - 4);
  }
  return noise;
}

Listener::Listener(const std::string& model_dir, const std::string& start_params) {
  if (!engine_.Init(R"({"local_moxwing_model_file_path":"/dev/null","local_vad_model_dir_path":")" +
                    model_dir + R"(","lang":"en-US","vad_enabled":true})")) {
    throw std::runtime_error("init failed");
  }
  const bool started = engine_.AsrStart(start_params, nullptr, [this](std::string message) {
    const web::json::value root = web::json::value::parse(message);
    int64_t samples = 0;
    if (summing_decoder::ParseSamples(root.at(U("result")).at(U("text")).as_string(), &samples)) {
      transcript_.segment_samples.push_back(samples);
    }
    transcript_.messages.push_back(std::move(message));
  });
  if (!started) throw std::runtime_error("start failed");
}

int Listener::Feed(const std::vector<int16_t>& audio, int chunk) {
  const auto* data = reinterpret_cast<const uint16_t*>(audio.data());
  int refused = 0;
  for (size_t at = 0; at < audio.size(); at += chunk) {
    const int n = static_cast<int>(std::min<size_t>(chunk, audio.size() - at));
    refused += engine_.ProcessSoundData(data + at, n, 0) ? 0 : 1;
  }
  return refused;
}

Transcript Listener::Finish() {
  engine_.Stop();
  engine_.Close();
  return transcript_;
}

}  // namespace kvasr_reliability
