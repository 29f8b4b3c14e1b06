// SPDX-License-Identifier: Apache-2.0
// Cost of the voice activity path on the shipped model: PLP alone, the
// network alone, and the whole pipeline at several chunk lengths, each as CPU
// seconds per second of audio (the "rtf" counter); and the resident memory
// that one detector adds.
#include <benchmark/benchmark.h>
#include <sndfile.h>

#include <unistd.h>
#include <cmath>
#include <cstdio>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include "plp.h"
#include "quellan.h"
#include "quellan_conf.h"
#include "quellan_wrap.h"
#include "vad_dnn.h"

namespace {

constexpr int kRateHz = 16000;
constexpr int kFeatDim = 39;
constexpr int kMaxFrames = 13000;
constexpr int kContextFrames = 5;
constexpr int kSkipFrames = 2;
constexpr double kSyntheticSeconds = 15.0;

// The benchmark recording, or, without the corpus, noise bursts of similar
// level so the figures stay comparable in kind.
const std::vector<int16_t>& Audio() {
  static const std::vector<int16_t> audio = [] {
    std::vector<int16_t> samples;
    SF_INFO info{};
    if (SNDFILE* f = sf_open(KVASR_VAD_BENCH_AUDIO, SFM_READ, &info)) {
      if (info.channels == 1 && info.samplerate == kRateHz) {
        samples.resize(static_cast<size_t>(info.frames));
        samples.resize(static_cast<size_t>(sf_read_short(f, samples.data(), info.frames)));
      }
      sf_close(f);
    }
    if (samples.empty()) {
      std::mt19937 rng(7);
      std::normal_distribution<double> noise(0.0, 1.0);
      samples.resize(static_cast<size_t>(kSyntheticSeconds * kRateHz));
      for (size_t i = 0; i < samples.size(); ++i) {
        const bool loud = (i / kRateHz) % 2 == 0;
        samples[i] = static_cast<int16_t>(noise(rng) * (loud ? 3000.0 : 30.0));
      }
    }
    return samples;
  }();
  return audio;
}

double AudioSeconds() { return static_cast<double>(Audio().size()) / kRateHz; }

QuellanConf Conf() {
  QuellanConf conf{};
  if (load_quellan_conf(KVASR_VAD_MODEL_DIR, &conf) != 0) std::abort();
  return conf;
}

void SetRtf(benchmark::State& state, double audio_seconds_per_iteration) {
  state.counters["rtf"] = benchmark::Counter(
      audio_seconds_per_iteration,
      benchmark::Counter::kIsIterationInvariantRate | benchmark::Counter::kInvert);
}

long ResidentKiB() {
  long pages_total = 0, pages_resident = 0;
  if (FILE* f = std::fopen("/proc/self/statm", "r")) {
    if (std::fscanf(f, "%ld %ld", &pages_total, &pages_resident) != 2) pages_resident = 0;
    std::fclose(f);
  }
  return pages_resident * (sysconf(_SC_PAGESIZE) / 1024);
}

// Resident memory one detector adds once it has processed the recording
// (every buffer is sized up front; touching them is what makes them resident).
// Registered first: memory freed by later benchmarks would be reused and
// hide the growth.
void BM_DetectorMemory(benchmark::State& state) {
  for (auto _ : state) {
    const long before = ResidentKiB();
    void* handle = quellan_create(KVASR_VAD_MODEL_DIR);
    const std::vector<int16_t>& audio = Audio();
    std::vector<int16_t> out(1600 + 5 * 32000);
    int index = 0;
    for (size_t pos = 0; pos < audio.size(); pos += 1600) {
      const int len = static_cast<int>(std::min<size_t>(1600, audio.size() - pos));
      ++index;
      int out_len = 0, speech = 0, continued = 0, ended = 0;
      quellan_process_wave(handle, pos + len == audio.size() ? -index : index, audio.data() + pos,
                           len, out.data(), static_cast<int>(out.size()), &out_len, &speech,
                           &continued, &ended);
    }
    state.counters["resident_KiB"] = static_cast<double>(ResidentKiB() - before);
    quellan_destroy(handle);
  }
}
BENCHMARK(BM_DetectorMemory)->Iterations(1)->Unit(benchmark::kMillisecond);

// PLP over the whole recording as one block.
void BM_Plp(benchmark::State& state) {
  const QuellanConf conf = Conf();
  FILE* table = std::fopen(conf.plp.cms_path, "rb");
  PLP plp(&conf.plp, table);
  std::fclose(table);
  const std::vector<int16_t>& audio = Audio();
  std::vector<float> rows(static_cast<size_t>(kMaxFrames) * kFeatDim);
  for (auto _ : state) {
    plp.reset();
    int frames = 0;
    plp.extract_feature(audio.data(), static_cast<int>(audio.size()), rows.data(), kMaxFrames,
                        &frames, -2);
    benchmark::DoNotOptimize(rows.data());
  }
  SetRtf(state, AudioSeconds());
}
BENCHMARK(BM_Plp)->Unit(benchmark::kMillisecond);

// The network on every third frame of one second, as the detector runs it.
void BM_Network(benchmark::State& state) {
  const QuellanConf conf = Conf();
  VadDnn* dnn = load_vaddnn_file(conf.vad.dnn_file);
  if (dnn == nullptr || set_vaddnn_params(dnn, kMaxFrames, kContextFrames, kContextFrames) != 0 ||
      load_vaddnn_state_weights(dnn, conf.vad.state_weights_file) != 0) {
    state.SkipWithError("cannot load the shipped network");
    return;
  }
  constexpr int kFramesPerSecond = 100;
  std::mt19937 rng(3);
  std::normal_distribution<float> normal(0.0f, 1.0f);
  std::vector<float> rows(kFramesPerSecond * kFeatDim);
  for (float& v : rows) v = normal(rng);
  int spliced = 0;
  set_vaddnn_feature(dnn, rows.data(), kFeatDim, 0, 0, kFramesPerSecond - 1, kFramesPerSecond,
                     kSkipFrames, &spliced);
  std::vector<float> scores(spliced);
  for (auto _ : state) {
    benchmark::DoNotOptimize(calc_vaddnn_prob(dnn, spliced, scores.data()));
  }
  SetRtf(state, 1.0);
  free_vaddnn(dnn);
}
BENCHMARK(BM_Network)->Unit(benchmark::kMicrosecond);

// The whole pipeline over the recording as one utterance in chunks.
void BM_Pipeline(benchmark::State& state) {
  const int chunk = static_cast<int>(state.range(0)) * kRateHz / 1000;
  Cquellan pipe(Conf());
  const std::vector<int16_t>& audio = Audio();
  std::vector<int16_t> out(chunk + 5 * 32000);
  for (auto _ : state) {
    int index = 0;
    for (size_t pos = 0; pos < audio.size(); pos += chunk) {
      const int len = static_cast<int>(std::min<size_t>(chunk, audio.size() - pos));
      ++index;
      const bool last = pos + len == audio.size();
      int out_len = 0, speech = 0, continued = 0, ended = 0;
      pipe.quellan_process(last ? -index : index, audio.data() + pos, len, out.data(),
                           static_cast<int>(out.size()), &out_len, &speech, &continued, &ended);
      benchmark::DoNotOptimize(out_len);
    }
  }
  SetRtf(state, AudioSeconds());
}
BENCHMARK(BM_Pipeline)->Arg(20)->Arg(100)->Arg(500)->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
