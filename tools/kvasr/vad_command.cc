// SPDX-License-Identifier: Apache-2.0
#include "vad_command.h"

#include <cstring>
#include <exception>
#include <fstream>
#include <memory>

#include "audio_source.h"
#include "file_kind.h"
#include "model_paths.h"
#include "quellan_conf.h"
#include "vad_plot.h"
#include "vad_run.h"

namespace kvasr_cli {
namespace {

constexpr double kFrameSeconds = 0.01;
constexpr int kSamplesPerMs = kEngineRateHz / 1000;

std::string Stem(const std::string& path) {
  const size_t slash = path.find_last_of('/');
  std::string name = slash == std::string::npos ? path : path.substr(slash + 1);
  const size_t dot = name.find_last_of('.');
  return dot == std::string::npos || dot == 0 ? name : name.substr(0, dot);
}

void PrintSegments(const VadRunResult& run, const std::string& prefix, FILE* out) {
  for (const VadSegment& s : run.segments) {
    std::fprintf(out, "%s%.2f\t%.2f\n", prefix.c_str(), s.begin_frame * kFrameSeconds,
                 (s.end_frame + 1) * kFrameSeconds);
  }
}

void PrintFrames(const VadRunResult& run, const std::string& prefix, FILE* out) {
  for (size_t f = 0; f < run.frames.size(); ++f) {
    const VadFrame& v = run.frames[f];
    std::fprintf(out, "%s%zu\t%d\t%.4f\t%d\n", prefix.c_str(), f, v.speech, v.smoothed, v.emitted);
  }
}

// <stem>.f32: feat_dim floats per frame, the rows the network's inputs are
// spliced from. <stem>.tsv: per frame the raw and smoothed scores, the energy
// gate, the decision and the emitted flag. <stem>.stats: calls, then the
// running normalisation's mean and variance averaged over the calls.
bool Dump(const VadRunResult& run, const std::string& dir, const std::string& stem) {
  const std::string base = dir + "/" + stem;
  std::ofstream feat(base + ".f32", std::ios::binary | std::ios::trunc);
  feat.write(reinterpret_cast<const char*>(run.features.data()),
             static_cast<std::streamsize>(run.features.size() * sizeof(float)));
  std::ofstream frames(base + ".tsv", std::ios::trunc);
  frames << "frame\tscore\tsmoothed\tenergy\tspeech\temitted\n";
  for (size_t f = 0; f < run.frames.size(); ++f) {
    const VadFrame& v = run.frames[f];
    frames << f << '\t' << v.score << '\t' << v.smoothed << '\t' << int{v.energy_speech} << '\t'
           << int{v.speech} << '\t' << int{v.emitted} << '\n';
  }
  std::ofstream stats(base + ".stats", std::ios::trunc);
  stats.precision(9);
  stats << run.stat_calls << '\n';
  for (const std::vector<double>* sums : {&run.running_mean_sum, &run.running_var_sum}) {
    for (size_t i = 0; i < sums->size(); ++i) {
      stats << (i ? "\t" : "") << (*sums)[i] / std::max(run.stat_calls, 1);
    }
    stats << '\n';
  }
  return feat.good() && frames.good() && stats.good();
}

}  // namespace

int RunVadCommand(VadOptions o, FILE* out) {
  if (o.vad_dir.empty()) {
    const std::string models = DefaultModelsDir();
    o.vad_dir = models.empty() ? std::string(KVASR_SOURCE_MODELS_DIR) + "/vad" : models + "/vad";
  }
  if (!o.plot_path.empty() && o.inputs.size() != 1) {
    std::fputs("kvasr: --plot takes exactly one input\n", stderr);
    return 2;
  }
  if (!o.dump_dir.empty() && !kvasr_common::IsDirectory(o.dump_dir)) {
    std::fprintf(stderr, "kvasr: '%s' is not a folder\n", o.dump_dir.c_str());
    return 2;
  }
  QuellanConf conf{};
  // The module joins folder and file names into fixed 256-byte fields.
  if (o.vad_dir.size() + sizeof kNetworkFile + 1 > sizeof conf.data_dir ||
      !kvasr_common::IsDirectory(o.vad_dir) || load_quellan_conf(o.vad_dir.c_str(), &conf) != 0) {
    std::fprintf(stderr, "kvasr: no usable VAD model folder '%s'\n", o.vad_dir.c_str());
    return 1;
  }
  std::unique_ptr<Cquellan> pipe;
  try {
    pipe = std::make_unique<Cquellan>(conf);
  } catch (const std::exception&) {
    std::fprintf(stderr, "kvasr: cannot load the VAD model in '%s'\n", o.vad_dir.c_str());
    return 1;
  }
  VadRunOptions run_options;
  run_options.chunk_samples = o.chunk_ms * kSamplesPerMs;
  run_options.keep_features = !o.dump_dir.empty();
  run_options.keep_samples = !o.plot_path.empty();
  int status = 0;
  for (const std::string& input : o.inputs) {
    std::string error;
    std::unique_ptr<AudioSource> source = OpenAudio(input, &error);
    VadRunResult run;
    if (!source || !RunVad(pipe.get(), source.get(), run_options, &run, &error)) {
      std::fprintf(stderr, "kvasr: %s: %s\n", input.c_str(), error.c_str());
      status = 1;
      continue;
    }
    const std::string prefix = o.inputs.size() > 1 ? input + "\t" : "";
    if (o.frames) {
      PrintFrames(run, prefix, out);
    } else {
      PrintSegments(run, prefix, out);
    }
    if (!o.dump_dir.empty() && !Dump(run, o.dump_dir, Stem(input))) {
      std::fprintf(stderr, "kvasr: cannot write the dump of '%s'\n", input.c_str());
      status = 1;
    }
    if (!o.plot_path.empty() &&
        !PlotVad(run, conf.vad.score_threshold, input, o.plot_path, &error)) {
      std::fprintf(stderr, "kvasr: plot: %s\n", error.c_str());
      status = 1;
    }
  }
  std::fflush(out);
  return status;
}

}  // namespace kvasr_cli
