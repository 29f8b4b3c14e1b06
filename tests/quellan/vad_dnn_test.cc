#include "vad_dnn.h"

#include <gtest/gtest.h>

#include <cmath>
#include <string>
#include <vector>

#include "model_files.h"

namespace {

using quellan_test::Network;

std::string Bytes(const std::vector<int32_t>& ints) {
  return std::string(reinterpret_cast<const char*>(ints.data()),
                     ints.size() * sizeof(int32_t));
}

// Loads `path`, expecting a refusal whose output contains `message`.
void ExpectRefused(const std::string& path, const std::string& message) {
  testing::internal::CaptureStdout();
  VadDnn* dnn = load_vaddnn_file(path.c_str());
  const std::string out = testing::internal::GetCapturedStdout();
  EXPECT_EQ(dnn, nullptr) << path;
  free_vaddnn(dnn);
  EXPECT_NE(out.find(message), std::string::npos) << out;
  EXPECT_EQ(out.rfind("WARNING * [modules/quellan/src/vad_dnn.cc:", 0), 0u)
      << out;
}

class VadDnnFileTest : public testing::Test {
 protected:
  void SetUp() override { dir_ = quellan_test::MakeTempDir(); }
  std::string Path(const std::string& name) const { return dir_ + "/" + name; }
  std::string dir_;
};

TEST_F(VadDnnFileTest, RefusesBrokenNetworkFiles) {
  const std::string flag("MYDNN1\0\0", 8);
  const std::string path = Path("net");

  testing::internal::CaptureStdout();
  EXPECT_EQ(load_vaddnn_file(""), nullptr);
  EXPECT_NE(testing::internal::GetCapturedStdout().find(
                "<<load_vaddnn_file>>] dnnName is NULL in load_dnnfile\n\n"),
            std::string::npos);

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
  testing::internal::CaptureStdout();
  quellan_test::WriteBytes(path, head + std::string(4 * (3 + 12 + 2 + 6), '\0'));
  VadDnn* dnn = load_vaddnn_file(path.c_str());
  testing::internal::GetCapturedStdout();
  ASSERT_NE(dnn, nullptr);
  EXPECT_EQ(dnn->layers_num, 2);
  free_vaddnn(dnn);
}

TEST_F(VadDnnFileTest, SpliceWidthMustDivideTheInput) {
  quellan_test::WriteNetwork(Path("net"), quellan_test::ConstantNetwork(429, 0.0f));
  VadDnn* dnn = load_vaddnn_file(Path("net").c_str());
  ASSERT_NE(dnn, nullptr);
  EXPECT_EQ(set_vaddnn_params(dnn, 100, 5, 5), 0);
  EXPECT_EQ(dnn->feat_dim, 39);
  testing::internal::CaptureStdout();
  EXPECT_EQ(set_vaddnn_params(dnn, 100, 5, 4), -1);
  EXPECT_EQ(set_vaddnn_params(dnn, 100, -1, 5), -1);
  const std::string out = testing::internal::GetCapturedStdout();
  EXPECT_NE(out.find("<<set_vaddnn_params>>] input length is not compatible "
                     "with offset\n\n"),
            std::string::npos);
  EXPECT_NE(out.find("Illegal params in set_dnn_params.\n\n"), std::string::npos);
  free_vaddnn(dnn);
}

TEST_F(VadDnnFileTest, PriorFileNeedsHeaderAndOneValuePerClass) {
  quellan_test::WriteNetwork(Path("net"), quellan_test::ConstantNetwork(11, 0.0f));
  VadDnn* dnn = load_vaddnn_file(Path("net").c_str());
  ASSERT_NE(dnn, nullptr);
  testing::internal::CaptureStdout();
  EXPECT_EQ(load_vaddnn_state_weights(nullptr, Path("priors").c_str()), -1);
  EXPECT_EQ(load_vaddnn_state_weights(dnn, Path("missing").c_str()), -1);
  quellan_test::WriteBytes(Path("priors"), Bytes({2}) + std::string(4, '\0'));
  EXPECT_EQ(load_vaddnn_state_weights(dnn, Path("priors").c_str()), -1);
  const std::string out = testing::internal::GetCapturedStdout();
  EXPECT_NE(out.find("Illegal params in load_state_weights\n\n"), std::string::npos);
  EXPECT_NE(out.find("Failed to open file " + Path("missing") + " for reading\n"),
            std::string::npos);
  EXPECT_NE(out.find("Failed to load state_weights\n\n"), std::string::npos);
  quellan_test::WritePriors(Path("priors"), {0.5f, 0.5f});
  EXPECT_EQ(load_vaddnn_state_weights(dnn, Path("priors").c_str()), 0);
  free_vaddnn(dnn);
}

class VadDnnScoreTest : public VadDnnFileTest {
 protected:
  // One input, one hidden unit, and class logits (0, log 3): posteriors
  // (0.25, 0.75) whatever the input.
  VadDnn* QuarterNetwork(int output_length) {
    Network net = quellan_test::ConstantNetwork(1, std::log(3.0f));
    net.output_length = output_length;
    net.layers[1].bias.resize(output_length, -1000.0f);
    net.layers[1].weights.assign(output_length, 0.0f);
    quellan_test::WriteNetwork(Path("net"), net);
    quellan_test::WritePriors(Path("priors"),
                              std::vector<float>(output_length, 1.0f));
    VadDnn* dnn = load_vaddnn_file(Path("net").c_str());
    EXPECT_EQ(set_vaddnn_params(dnn, 8, 0, 0), 0);
    EXPECT_EQ(load_vaddnn_state_weights(dnn, Path("priors").c_str()), 0);
    return dnn;
  }
};

TEST_F(VadDnnScoreTest, ScoreIsLogPosteriorRatio) {
  VadDnn* dnn = QuarterNetwork(2);
  const float feat[3] = {0.1f, 0.2f, 0.3f};
  int rows = 0;
  ASSERT_EQ(set_vaddnn_feature(dnn, feat, 1, 0, 0, 2, 3, 0, &rows), 0);
  ASSERT_EQ(rows, 3);
  float score[3] = {};
  ASSERT_EQ(calc_vaddnn_prob(dnn, rows, score), 3);
  const double expected = std::log(0.75 + 1e-7) - std::log(0.25 + 1e-7);
  for (float s : score) EXPECT_NEAR(s, expected, 1e-5);
  free_vaddnn(dnn);
}

TEST_F(VadDnnScoreTest, RefusesEmptyBatchesAndSingleClassNetworks) {
  VadDnn* dnn = QuarterNetwork(2);
  float score[1];
  testing::internal::CaptureStdout();
  EXPECT_EQ(calc_vaddnn_prob(dnn, 0, score), -1);
  EXPECT_NE(testing::internal::GetCapturedStdout().find(
                "<<calc_vaddnn_prob>>] Invalide input arguments.\n"),
            std::string::npos);
  free_vaddnn(dnn);

  dnn = QuarterNetwork(1);
  const float feat[1] = {0.0f};
  int rows = 0;
  ASSERT_EQ(set_vaddnn_feature(dnn, feat, 1, 0, 0, 0, 1, 0, &rows), 0);
  testing::internal::CaptureStdout();
  EXPECT_EQ(calc_vaddnn_prob(dnn, rows, score), -1);
  EXPECT_NE(testing::internal::GetCapturedStdout().find(
                "DNN output length[1] is <= 1\n"),
            std::string::npos);
  free_vaddnn(dnn);
}

TEST_F(VadDnnFileTest, SplicingChecksTheWindowWidth) {
  Network net = quellan_test::ConstantNetwork(5, 0.0f);  // 1 x (2 + 1 + 2)
  quellan_test::WriteNetwork(Path("net"), net);
  VadDnn* dnn = load_vaddnn_file(Path("net").c_str());
  ASSERT_EQ(set_vaddnn_params(dnn, 8, 2, 2), 0);
  const float feat[4] = {10.0f, 11.0f, 12.0f, 13.0f};
  int rows = 0;
  ASSERT_EQ(set_vaddnn_feature(dnn, feat, 1, 4, 0, 3, 4, 2, &rows), 0);
  EXPECT_EQ(rows, 0) << "first centre past the batch";
  testing::internal::CaptureStdout();
  EXPECT_EQ(set_vaddnn_feature(dnn, feat, 2, 0, 0, 1, 2, 0, &rows), -1);
  EXPECT_NE(testing::internal::GetCapturedStdout().find(
                "feat_dim*(1+dnn->start_offset+dnn->end_offset)[10] not equal "
                "to dnn model [5]\n"),
            std::string::npos);
  free_vaddnn(dnn);
}

}  // namespace
