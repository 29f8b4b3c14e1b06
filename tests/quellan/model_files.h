// SPDX-License-Identifier: Apache-2.0
// Writers of small detector model files, and the audio and directories the
// tests share.
#ifndef KVASR_TESTS_QUELLAN_MODEL_FILES_H_
#define KVASR_TESTS_QUELLAN_MODEL_FILES_H_

#include <cstdint>
#include <string>
#include <vector>

namespace quellan_test {

struct Layer {
  std::vector<float> bias;     // output_dim
  std::vector<float> weights;  // input_dim x output_dim, input-major
};

struct Network {
  int input_length = 0;
  int output_length = 0;
  std::vector<int> hidden;  // sizes of the hidden layers
  std::vector<Layer> layers;
};

// Writes the flagged network file; `flag` is written as its first 8 bytes.
void WriteNetwork(const std::string& path, const Network& net,
                  const std::string& flag = std::string("MYDNN1\0\0", 8));
void WritePriors(const std::string& path, const std::vector<float>& priors);
void WriteMeanTable(const std::string& path, const std::vector<float>& means,
                    const std::vector<float>& variances);
void WriteBytes(const std::string& path, const std::string& bytes);
std::string ReadBytes(const std::string& path);

// A network over `feat_dim` x (1 + start + end) inputs whose speech score is
// about +16 when input column `column` of the centre frame is positive and
// about -16 when it is negative.
Network SignNetwork(int feat_dim, int start_offset, int end_offset, int column);
// A network that scores every frame alike, about `score`.
Network ConstantNetwork(int input_length, float score);

// A model directory, removed at exit, holding a constant-score network over
// eleven rows of `row_width` values, priors of 1 and a mean table of zero
// means and unit variances.
std::string MakeModelDir(float score, int row_width = 39);

// Audio of the shared corpus; tests skip when it is absent.
std::string CorpusPath(const std::string& relative);
bool ReadFlac(const std::string& path, std::vector<int16_t>* samples);

// Resident set size of the process in KiB; -1 when it cannot be read.
long ResidentKiB();

}  // namespace quellan_test

#endif  // KVASR_TESTS_QUELLAN_MODEL_FILES_H_
