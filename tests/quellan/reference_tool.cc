// SPDX-License-Identifier: Apache-2.0
// Command-line driver that runs the module's feature extractor and network on
// files, so that an independent numpy implementation can check the results.
//
//   reference_tool decode IN.flac OUT.raw
//   reference_tool plp IN.raw OUT.bin TABLE|- START:END:FLAG...
//       Runs PLP over each block [START, END) of the samples with its flag;
//       TABLE is a mean table for running normalisation, - for per-block
//       normalisation. OUT holds, per block, an int32 frame count (as
//       returned, possibly negative) and that many rows of floats.
//   reference_tool dnn NET PRIORS FEAT.f32 FEAT_DIM TOTAL T0 FIRST LAST SKIP
//       START_OFFSET END_OFFSET OUT.f32
//
// With QUELLAN_BASELINE_LOOPS=1 in the environment the loops built for
// processors without AVX run instead of the AVX ones.
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <string>
#include <vector>

#include "cpu_dispatch.h"
#include "model_files.h"
#include "plp.h"
#include "vad_dnn.h"

namespace {

template <typename T>
std::vector<T> ReadArray(const std::string& path) {
  const std::string bytes = quellan_test::ReadBytes(path);
  std::vector<T> v(bytes.size() / sizeof(T));
  std::copy(bytes.data(), bytes.data() + v.size() * sizeof(T), reinterpret_cast<char*>(v.data()));
  return v;
}

int Decode(const std::string& in, const std::string& out) {
  std::vector<int16_t> samples;
  if (!quellan_test::ReadFlac(in, &samples)) return 1;
  quellan_test::WriteBytes(out, std::string(reinterpret_cast<const char*>(samples.data()),
                                            samples.size() * sizeof(int16_t)));
  return 0;
}

int RunPlp(int argc, char** argv) {
  const std::vector<int16_t> samples = ReadArray<int16_t>(argv[2]);
  const std::string table = argv[4];
  PlpConfig conf;
  plp_load_conf(&conf, 13000, nullptr, nullptr);
  FILE* cmsfp = nullptr;
  if (table == "-") {
    conf.cms_mode = 0;
  } else {
    cmsfp = std::fopen(table.c_str(), "rb");
    if (cmsfp == nullptr) return 1;
  }
  PLP plp(&conf, cmsfp);
  if (cmsfp != nullptr) std::fclose(cmsfp);
  plp.reset();
  std::string out;
  std::vector<float> rows(static_cast<size_t>(13000) * conf.feat_dim);
  for (int i = 5; i < argc; ++i) {
    int start = 0, end = 0, flag = 0;
    if (std::sscanf(argv[i], "%d:%d:%d", &start, &end, &flag) != 3) return 1;
    int frames = 0;
    if (plp.extract_feature(samples.data() + start, end - start, rows.data(), 13000, &frames,
                            flag) != 0) {
      return 1;
    }
    const int32_t count = frames;
    out.append(reinterpret_cast<const char*>(&count), sizeof(count));
    if (frames > 0) {
      out.append(reinterpret_cast<const char*>(rows.data()),
                 sizeof(float) * frames * conf.feat_dim);
    }
  }
  quellan_test::WriteBytes(argv[3], out);
  return 0;
}

int RunDnn(char** argv) {
  VadDnn* dnn = load_vaddnn_file(argv[2]);
  if (dnn == nullptr) return 1;
  const std::vector<float> feat = ReadArray<float>(argv[4]);
  const int feat_dim = std::atoi(argv[5]);
  const int total = std::atoi(argv[6]);
  const int t0 = std::atoi(argv[7]);
  const int first = std::atoi(argv[8]);
  const int last = std::atoi(argv[9]);
  const int skip = std::atoi(argv[10]);
  int rows = 0;
  std::vector<float> score(total);
  const bool ok =
      set_vaddnn_params(dnn, total, std::atoi(argv[11]), std::atoi(argv[12])) == 0 &&
      load_vaddnn_state_weights(dnn, argv[3]) == 0 &&
      set_vaddnn_feature(dnn, feat.data(), feat_dim, t0, first, last, total, skip, &rows) == 0 &&
      calc_vaddnn_prob(dnn, rows, score.data()) == rows;
  free_vaddnn(dnn);
  if (!ok) return 1;
  quellan_test::WriteBytes(
      argv[13], std::string(reinterpret_cast<const char*>(score.data()), sizeof(float) * rows));
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  const char* baseline = std::getenv("QUELLAN_BASELINE_LOOPS");
  if (baseline != nullptr && std::string(baseline) == "1") kvasr_common::ForceBaseline(true);
  const std::string command = argc > 1 ? argv[1] : "";
  if (command == "decode" && argc == 4) return Decode(argv[2], argv[3]);
  if (command == "plp" && argc >= 6) return RunPlp(argc, argv);
  if (command == "dnn" && argc == 14) return RunDnn(argv);
  std::fprintf(stderr, "usage: see the head of reference_tool.cc\n");
  return 2;
}
