// SPDX-License-Identifier: Apache-2.0
#include "model_files.h"

#include <sndfile.h>
#include <unistd.h>

#include <cstdio>
#include <fstream>
#include <iterator>
#include <stdexcept>

#include "temp_dir.h"

namespace quellan_test {

namespace {

template <typename T>
void Append(std::string* bytes, const std::vector<T>& v) {
  bytes->append(reinterpret_cast<const char*>(v.data()), v.size() * sizeof(T));
}

}  // namespace

void WriteBytes(const std::string& path, const std::string& bytes) {
  std::ofstream f(path, std::ios::binary | std::ios::trunc);
  f.write(bytes.data(), static_cast<std::streamsize>(bytes.size()));
  if (!f) throw std::runtime_error("cannot write " + path);
}

std::string ReadBytes(const std::string& path) {
  std::ifstream f(path, std::ios::binary);
  return std::string(std::istreambuf_iterator<char>(f), {});
}

void WriteNetwork(const std::string& path, const Network& net, const std::string& flag) {
  std::string bytes = flag;
  Append<int32_t>(&bytes,
                  {net.input_length, net.output_length, static_cast<int32_t>(net.hidden.size())});
  Append<int32_t>(&bytes, {net.hidden.begin(), net.hidden.end()});
  for (const Layer& layer : net.layers) {
    Append(&bytes, layer.bias);
    Append(&bytes, layer.weights);
  }
  WriteBytes(path, bytes);
}

void WritePriors(const std::string& path, const std::vector<float>& priors) {
  std::string bytes;
  Append<int32_t>(&bytes, {static_cast<int32_t>(priors.size())});
  Append(&bytes, priors);
  WriteBytes(path, bytes);
}

void WriteMeanTable(const std::string& path, const std::vector<float>& means,
                    const std::vector<float>& variances) {
  std::string bytes;
  Append<int32_t>(&bytes, {static_cast<int32_t>(means.size())});
  Append(&bytes, means);
  Append(&bytes, variances);
  WriteBytes(path, bytes);
}

Network ConstantNetwork(int input_length, float score) {
  Network net;
  net.input_length = input_length;
  net.output_length = 2;
  net.hidden = {1};
  net.layers = {{{0.0f}, std::vector<float>(input_length, 0.0f)}, {{0.0f, score}, {0.0f, 0.0f}}};
  return net;
}

Network SignNetwork(int feat_dim, int start_offset, int end_offset, int column) {
  Network net = ConstantNetwork(feat_dim * (1 + start_offset + end_offset), -20.0f);
  net.layers[0].weights[start_offset * feat_dim + column] = 20.0f;
  // Non-speech logit 0, speech logit 40 h - 20: a saturated +/-20 margin.
  net.layers[1].weights = {0.0f, 40.0f};
  return net;
}

std::string MakeModelDir(float score, int row_width) {
  const std::string dir = kvasr_test::ProcessTempDir();
  WriteNetwork(dir + "/quellan_data_b", ConstantNetwork(row_width * 11, score));
  WritePriors(dir + "/quellan_data_c", {1.0f, 1.0f});
  WriteMeanTable(dir + "/quellan_data_a", std::vector<float>(39, 0.0f),
                 std::vector<float>(39, 1.0f));
  return dir;
}

std::string CorpusPath(const std::string& relative) {
  return std::string(QUELLAN_TEST_CORPUS_DIR) + "/" + relative;
}

long ResidentKiB() {
  long pages = 0, resident = 0;
  FILE* f = std::fopen("/proc/self/statm", "r");
  if (f == nullptr) return -1;
  const int got = std::fscanf(f, "%ld %ld", &pages, &resident);
  std::fclose(f);
  return got == 2 ? resident * (sysconf(_SC_PAGESIZE) / 1024) : -1;
}

bool ReadFlac(const std::string& path, std::vector<int16_t>* samples) {
  SF_INFO info{};
  SNDFILE* f = sf_open(path.c_str(), SFM_READ, &info);
  if (f == nullptr) return false;
  if (info.channels != 1 || info.samplerate != 16000) {
    sf_close(f);
    return false;
  }
  samples->resize(static_cast<size_t>(info.frames));
  const sf_count_t got = sf_read_short(f, samples->data(), info.frames);
  sf_close(f);
  samples->resize(static_cast<size_t>(got));
  return got > 0;
}

}  // namespace quellan_test
