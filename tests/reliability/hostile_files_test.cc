// SPDX-License-Identifier: Apache-2.0
// Broken and hostile voice activity model files, through the engine: each
// must fail init with the module's reason on standard output, keep the
// engine uninitialised, and leave it usable once the files are mended.
#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <limits>
#include <string>
#include <vector>

#include "model_files.h"
#include "offline_asr_engine_impl.h"
#include "temp_dir.h"

namespace vorta {
namespace speech {
namespace {

using quellan_test::Network;

constexpr int kWidth = 39;
constexpr float kNaN = std::numeric_limits<float>::quiet_NaN();
constexpr float kInf = std::numeric_limits<float>::infinity();

std::string Ints(const std::vector<uint32_t>& ints) {
  return std::string(reinterpret_cast<const char*>(ints.data()), ints.size() * sizeof(uint32_t));
}

std::string Floats(const std::vector<float>& v) {
  return std::string(reinterpret_cast<const char*>(v.data()), v.size() * sizeof(float));
}

Network GoodNetwork() { return quellan_test::ConstantNetwork(kWidth * 11, 16.0f); }

std::string NetworkBytes(const Network& net) {
  const std::string path = kvasr_test::ProcessTempDir() + "/net";
  quellan_test::WriteNetwork(path, net);
  return quellan_test::ReadBytes(path);
}

std::string MeanTable(uint32_t n, const std::vector<float>& values) {
  return Ints({n}) + Floats(values);
}

struct Case {
  const char* what;
  const char* file;  // quellan_data_a (means), _b (network) or _c (priors)
  std::string bytes;
  std::string message;
};

std::vector<Case> Cases() {
  Network nan_weight = GoodNetwork();
  nan_weight.layers[0].weights[7] = kNaN;
  Network inf_bias = GoodNetwork();
  inf_bias.layers[1].bias[1] = kInf;
  std::vector<float> unit(kWidth, 0.0f);
  unit.insert(unit.end(), kWidth, 1.0f);
  std::vector<float> nan_mean = unit;
  nan_mean[3] = kNaN;
  std::vector<float> negative_variance = unit;
  negative_variance[kWidth] = -1.0f;
  const std::string flag("MYDNN1\0\0", 8);
  // Sixteen hidden layers of 65536 units: within every bound, yet the
  // weights alone would need 16 GiB per layer.
  const std::string huge_head =
      flag + Ints({65536, 2, 16}) + Ints(std::vector<uint32_t>(16, 65536));
  return {
      {"empty priors", "quellan_data_c", "", "Failed to load state_weights"},
      {"empty mean table", "quellan_data_a", "", "read cms table error"},
      {"huge layers, header only", "quellan_data_b", huge_head,
       "Failed to load layers[0].bias in load_all_dnn_layers"},
      {"huge layers, first bias", "quellan_data_b",
       huge_head + Floats(std::vector<float>(65536, 0.0f)),
       "Failed to load layers[0].weights in load_all_dnn_layers"},
      {"NaN weight", "quellan_data_b", NetworkBytes(nan_weight),
       "layers[0] holds a value that is not a finite number"},
      {"infinite bias", "quellan_data_b", NetworkBytes(inf_bias),
       "layers[1] holds a value that is not a finite number"},
      {"zero prior", "quellan_data_c", Ints({2}) + Floats({1.0f, 0.0f}),
       "state_weights[1] is not a positive finite number"},
      {"NaN prior", "quellan_data_c", Ints({2}) + Floats({kNaN, 1.0f}),
       "state_weights[0] is not a positive finite number"},
      {"mean table N = 0", "quellan_data_a", MeanTable(0, unit), "read cms table error"},
      {"mean table N = 1001", "quellan_data_a", MeanTable(1001, std::vector<float>(2002, 1.0f)),
       "read cms table error"},
      {"mean table N = 2^32 - 1", "quellan_data_a", MeanTable(0xFFFFFFFFu, unit),
       "read cms table error"},
      {"NaN mean", "quellan_data_a", MeanTable(kWidth, nan_mean),
       "dimension 3 is not a finite mean and variance"},
      {"negative variance", "quellan_data_a", MeanTable(kWidth, negative_variance),
       "dimension 0 is not a finite mean and variance"},
  };
}

TEST(HostileModelFilesTest, EachFailsInitWithItsReasonAndLeavesTheEngineReusable) {
  const std::string dir = quellan_test::MakeModelDir(16.0f);
  const std::string params = R"({"local_moxwing_model_file_path":"/dev/null",)"
                             R"("local_vad_model_dir_path":")" +
                             dir + R"(","lang":"en-US","vad_enabled":true})";
  OfflineAsrEngineImpl engine;
  for (const Case& c : Cases()) {
    SCOPED_TRACE(c.what);
    const std::string path = dir + "/" + c.file;
    const std::string good = quellan_test::ReadBytes(path);
    quellan_test::WriteBytes(path, c.bytes);
    testing::internal::CaptureStdout();
    const bool initialised = engine.Init(params);
    const std::string out = testing::internal::GetCapturedStdout();
    EXPECT_FALSE(initialised);
    EXPECT_NE(out.find(c.message), std::string::npos) << out;
    EXPECT_NE(out.find("vad init exception:init vad failed\n"
                       "OfflineAsrEngineImpl->asr init exception:init vad failed\n"),
              std::string::npos)
        << out;
    EXPECT_EQ(engine.state(), OfflineAsrEngineImpl::kNotInitialized);
    EXPECT_FALSE(engine.has_decoder()) << "the module fails before the decoder is made";

    quellan_test::WriteBytes(path, good);
    testing::internal::CaptureStdout();
    EXPECT_TRUE(engine.Init(params));
    testing::internal::GetCapturedStdout();
    engine.Close();
  }
}

}  // namespace
}  // namespace speech
}  // namespace vorta
