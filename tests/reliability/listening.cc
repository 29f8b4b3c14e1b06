#include "listening.h"

#include <algorithm>
#include <stdexcept>

#include <cpprest/json.h>

#include "model_files.h"
#include "offline_asr_engine_impl.h"

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

Transcript Listen(const std::string& model_dir, const std::string& start_params,
                  const std::vector<int16_t>& audio, int chunk) {
  Transcript t;
  const std::string init = R"({"local_moxwing_model_file_path":"/dev/null",)"
                           R"("local_vad_model_dir_path":")" + model_dir +
                           R"(","lang":"en-US","vad_enabled":true})";
  vorta::speech::OfflineAsrEngineImpl engine;
  if (!engine.Init(init)) throw std::runtime_error("init failed");
  const bool started = engine.AsrStart(start_params, nullptr, [&t](std::string message) {
    const web::json::value root = web::json::value::parse(message);
    summing_decoder::Segment segment;
    if (summing_decoder::ParseText(root.at(U("result")).at(U("text")).as_string(), &segment)) {
      t.segments.push_back(segment);
    }
    t.messages.push_back(std::move(message));
  });
  if (!started) throw std::runtime_error("start failed");
  const auto* data = reinterpret_cast<const uint16_t*>(audio.data());
  for (size_t at = 0; at < audio.size(); at += chunk) {
    const int n = static_cast<int>(std::min<size_t>(chunk, audio.size() - at));
    if (!engine.ProcessSoundData(data + at, n, 0)) ++t.failed_calls;
  }
  engine.Stop();
  engine.Close();
  return t;
}

}  // namespace kvasr_reliability
