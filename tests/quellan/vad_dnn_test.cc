// SPDX-License-Identifier: Apache-2.0
#include "vad_dnn.h"

#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <vector>

#include "model_files.h"
#include "temp_dir.h"

namespace {

std::string Bytes(const std::vector<int32_t>& ints) {
  return std::string(reinterpret_cast<const char*>(ints.data()), ints.size() * sizeof(int32_t));
}

class VadDnnTest : public testing::Test {
 protected:
  void SetUp() override { dir_ = kvasr_test::ProcessTempDir(); }
  std::string Path(const std::string& name) const { return dir_ + "/" + name; }

  // A network over 1 x (2 + 1 + 2) inputs with `classes` outputs, its
  // splice set and its priors loaded.
  VadDnn* Ready(int classes) {
    quellan_test::Network net = quellan_test::ConstantNetwork(5, 0.0f);
    net.output_length = classes;
    net.layers[1].bias.resize(classes);
    net.layers[1].weights.resize(classes);
    quellan_test::WriteNetwork(Path("net"), net);
    quellan_test::WritePriors(Path("priors"), std::vector<float>(classes, 1.0f));
    VadDnn* dnn = load_vaddnn_file(Path("net").c_str());
    EXPECT_EQ(set_vaddnn_params(dnn, 8, 2, 2), 0);
    EXPECT_EQ(load_vaddnn_state_weights(dnn, Path("priors").c_str()), 0);
    return dnn;
  }

  std::string dir_;
};

// Loads `path`, expecting a refusal whose output contains `message`.
void ExpectRefused(const std::string& path, const std::string& message) {
  testing::internal::CaptureStdout();
  VadDnn* dnn = load_vaddnn_file(path.c_str());
  const std::string out = testing::internal::GetCapturedStdout();
  EXPECT_EQ(dnn, nullptr) << path;
  free_vaddnn(dnn);
  EXPECT_NE(out.find(message), std::string::npos) << out;
  EXPECT_EQ(out.rfind("WARNING * [modules/quellan/src/vad_dnn.cc:", 0), 0u) << out;
}

TEST_F(VadDnnTest, RefusesBrokenNetworkFiles) {
  const std::string flag("MYDNN1\0\0", 8);
  const std::string path = Path("net");
  ExpectRefused("", "<<load_vaddnn_file>>] dnnName is NULL in load_dnnfile\n\n");
  ExpectRefused(Path("missing"), "Failed to open file:" + Path("missing"));

  // Layer 0 of a 4-3-2 network: 3 biases, then 12 weights.
  const std::string head = flag + Bytes({4, 2, 1, 3});
  const struct {
    std::string bytes;
    std::string message;
  } cases[] = {
      {std::string("MYDNN2\0\0", 8) + Bytes({1, 2, 0}),
       "Failed to load DNN_FLAG from file[" + path + "], flag[MYDNN2]\n\n"},
      {"MYDNN", "Failed to load DNN_FLAG"},
      {flag, "Failed to load input_length from file[" + path + "]"},
      {flag + Bytes({4}), "Failed to load output_length from file[" + path + "]"},
      {flag + Bytes({4, 2}), "Failed to load layers_num from file[" + path + "]"},
      {flag + Bytes({4, 2, 17}) + Bytes(std::vector<int32_t>(17, 3)),
       "Failed to load layers_num from file[" + path + "]"},
      {flag + Bytes({4, 2, 2, 3}), "Failed to load hidden_node_array from file[" + path + "]"},
      {head + std::string(8, '\0'), "Failed to load layers[0].bias in load_all_dnn_layers"},
      {head + std::string(4 * (3 + 11), '\0'),
       "Failed to load layers[0].weights in load_all_dnn_layers"},
      {head + std::string(4 * (3 + 12 + 2 + 5), '\0'),
       "Failed to load layers[1].weights in load_all_dnn_layers"},
  };
  for (const auto& c : cases) {
    quellan_test::WriteBytes(path, c.bytes);
    ExpectRefused(path, c.message);
  }
  // One float more than the last refusal is the whole file.
  quellan_test::WriteBytes(path, head + std::string(4 * (3 + 12 + 2 + 6), '\0'));
  VadDnn* dnn = load_vaddnn_file(path.c_str());
  ASSERT_NE(dnn, nullptr);
  EXPECT_EQ(dnn->layers_num, 2);
  free_vaddnn(dnn);
}

TEST_F(VadDnnTest, RefusesInconsistentCalls) {
  quellan_test::WriteBytes(Path("short_priors"), Bytes({2}) + std::string(4, '\0'));
  const std::string short_priors = Path("short_priors");
  const float feat[2] = {};
  float score[1];
  int rows = 0;
  const struct {
    int classes;
    std::function<int(VadDnn*)> call;
    std::string message;
  } cases[] = {
      {2, [](VadDnn* d) { return set_vaddnn_params(d, 8, 2, 1); },
       "<<set_vaddnn_params>>] input length is not compatible with offset\n\n"},
      {2, [](VadDnn* d) { return set_vaddnn_params(d, 8, -1, 2); },
       "Illegal params in set_dnn_params.\n\n"},
      {2, [&](VadDnn*) { return load_vaddnn_state_weights(nullptr, short_priors.c_str()); },
       "Illegal params in load_state_weights\n\n"},
      {2, [](VadDnn* d) { return load_vaddnn_state_weights(d, "/nonexistent/p"); },
       "Failed to open file /nonexistent/p for reading\n"},
      {2, [&](VadDnn* d) { return load_vaddnn_state_weights(d, short_priors.c_str()); },
       "Failed to load state_weights\n\n"},
      {2, [&](VadDnn* d) { return set_vaddnn_feature(d, feat, 2, 0, 0, 1, 2, 0, &rows); },
       "feat_dim*(1+dnn->start_offset+dnn->end_offset)[10] not equal to dnn model [5]\n"},
      {2, [&](VadDnn* d) { return calc_vaddnn_prob(d, 0, score); },
       "<<calc_vaddnn_prob>>] Invalide input arguments.\n"},
      {1, [&](VadDnn* d) { return calc_vaddnn_prob(d, 1, score); },
       "DNN output length[1] is <= 1\n"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.message);
    VadDnn* dnn = Ready(c.classes);
    testing::internal::CaptureStdout();
    EXPECT_EQ(c.call(dnn), -1);
    EXPECT_NE(testing::internal::GetCapturedStdout().find(c.message), std::string::npos);
    free_vaddnn(dnn);
  }
}

}  // namespace
