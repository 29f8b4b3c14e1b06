#include "plp.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <stdexcept>
#include <string>
#include <vector>

#include "model_files.h"
#include "plp_config.h"

namespace {

constexpr int kWidth = 39;
constexpr int kStatic = 13;

PlpConfig Defaults(const char* dir = nullptr) {
  PlpConfig conf;
  EXPECT_EQ(plp_load_conf(&conf, 13000, dir, nullptr), 0);
  return conf;
}

std::vector<int16_t> Noise(int n, int amplitude, unsigned seed) {
  std::vector<int16_t> v(n);
  for (int i = 0; i < n; ++i) {
    seed = seed * 1103515245u + 12345u;
    v[i] = static_cast<int16_t>(static_cast<int>((seed >> 16) % (2 * amplitude + 1)) -
                                amplitude);
  }
  return v;
}

TEST(PlpConfigTest, TablePathAndReloading) {
  PlpConfig conf = Defaults();
  EXPECT_STREQ(conf.cms_path, "quellan_data_a");

  PlpConfig again;
  std::memset(&again, 0x5a, sizeof(again));
  ASSERT_EQ(plp_load_conf(&again, 13000, nullptr, nullptr), 0);
  EXPECT_EQ(std::memcmp(&conf, &again, sizeof(conf)), 0)
      << "nothing of an earlier record may survive";

  EXPECT_STREQ(Defaults("/models/vad").cms_path, "/models/vad/quellan_data_a");

  testing::internal::CaptureStdout();
  EXPECT_EQ(plp_load_conf(nullptr, 13000, nullptr, nullptr), -1);
  EXPECT_NE(testing::internal::GetCapturedStdout().find(
                "<<plp_load_conf>>] Wrong param to plp_load_conf. (nil)\n"),
            std::string::npos);
}

class PlpTableTest : public testing::Test {
 protected:
  void SetUp() override { path_ = quellan_test::MakeTempDir() + "/table"; }

  // Constructs a PLP from `conf` and the table bytes; returns the output
  // and whether construction threw "init vad failed".
  std::string Construct(const PlpConfig& conf, const std::string& table,
                        bool* threw) {
    quellan_test::WriteBytes(path_, table);
    FILE* f = std::fopen(path_.c_str(), "rb");
    testing::internal::CaptureStdout();
    *threw = false;
    try {
      PLP plp(&conf, conf.cms_mode == 1 ? f : nullptr);
    } catch (const std::runtime_error& e) {
      *threw = std::string(e.what()) == "init vad failed";
    }
    std::fclose(f);
    return testing::internal::GetCapturedStdout();
  }

  static std::string Table(uint32_t n, size_t floats) {
    std::string bytes(reinterpret_cast<const char*>(&n), sizeof(n));
    std::vector<float> values(floats, 1.0f);
    bytes.append(reinterpret_cast<const char*>(values.data()), floats * sizeof(float));
    return bytes;
  }

  std::string path_;
};

TEST_F(PlpTableTest, RefusesBadSettingsAndTables) {
  struct Case {
    const char* what;
    void (*change)(PlpConfig*);
    std::string table;
    const char* message;
  };
  const std::string good = Table(kWidth, 2 * kWidth);
  const Case cases[] = {
      {"kind", [](PlpConfig* c) { std::strcpy(c->targetkind, "MFCC_C0"); }, good,
       "Error set targetkind[MFCC_C0].\n"},
      {"ceps", [](PlpConfig* c) { c->num_ceps = 13; }, good,
       "ValidCodeParms: unlikely num cep coef 13\n"},
      {"ceps", [](PlpConfig* c) { c->num_ceps = 1; }, good,
       "ValidCodeParms: unlikely num cep coef 1\n"},
      {"mode", [](PlpConfig* c) { c->cms_mode = 2; }, good,
       "CMS Mode invalid, should be 0 or 1, you set: 2\n"},
      {"short variances", [](PlpConfig*) {}, Table(kWidth, 2 * kWidth - 1),
       "read cms table error\n"},
      {"width", [](PlpConfig*) {}, Table(13, 26), "read cms table error\n"},
  };
  for (const Case& c : cases) {
    PlpConfig conf = Defaults();
    c.change(&conf);
    bool threw = false;
    const std::string out = Construct(conf, c.table, &threw);
    EXPECT_TRUE(threw) << c.what;
    EXPECT_NE(out.find(c.message), std::string::npos) << c.what << ": " << out;
    EXPECT_NE(out.find("<<PLP>>] Failed to load base info\n"), std::string::npos)
        << c.what;
  }

  PlpConfig conf = Defaults();
  testing::internal::CaptureStdout();
  EXPECT_THROW(PLP(&conf, nullptr), std::runtime_error);
  EXPECT_NE(testing::internal::GetCapturedStdout().find("Wrong cmsfp.\n"),
            std::string::npos);

  bool threw = true;
  Construct(Defaults(), good, &threw);
  EXPECT_FALSE(threw);
}

class PlpBlockTest : public testing::Test {
 protected:
  void SetUp() override {
    const std::string path = quellan_test::MakeTempDir() + "/table";
    quellan_test::WriteMeanTable(path, std::vector<float>(kWidth, 0.0f),
                                 std::vector<float>(kWidth, 1.0f));
    conf_ = Defaults();
    conf_.max_frame_num = 50;
    FILE* f = std::fopen(path.c_str(), "rb");
    plp_ = std::make_unique<PLP>(&conf_, f);
    std::fclose(f);
    plp_->reset();
  }

  PlpConfig conf_;
  std::unique_ptr<PLP> plp_;
  std::vector<float> out_ = std::vector<float>(60 * kWidth, -7.0f);
};

TEST_F(PlpBlockTest, RefusesEmptyAndOversizedBlocks) {
  const std::vector<int16_t> wave = Noise(400 + 60 * 160, 3000, 3);
  int frames = -5;
  testing::internal::CaptureStdout();
  EXPECT_EQ(plp_->extract_feature(wave.data(), 0, out_.data(), 60, &frames, 1), -1);
  // 50 frames reach max_frame_num.
  EXPECT_EQ(plp_->extract_feature(wave.data(), 400 + 49 * 160, out_.data(), 60,
                                  &frames, 1),
            -1);
  // 10 frames do not fit 10 free rows.
  EXPECT_EQ(plp_->extract_feature(wave.data(), 400 + 9 * 160, out_.data(), 10,
                                  &frames, 1),
            -1);
  const std::string out = testing::internal::GetCapturedStdout();
  EXPECT_EQ(frames, -5);
  EXPECT_NE(out.find("<<AddWaveData>>] Null m_bInitialize[1] or waveData["),
            std::string::npos);
  EXPECT_NE(out.find("or smpNum[0]\n"), std::string::npos);
  EXPECT_NE(out.find("<<extract_feature>>] Failed to add wave data.\n"),
            std::string::npos);
  EXPECT_NE(out.find("Too many frames[50] >= max_frame_num[50]\n"), std::string::npos);
  EXPECT_NE(out.find("<<extract_feature>>] Too many frames.\n"), std::string::npos);
  EXPECT_EQ(out_[0], -7.0f) << "a refused block writes nothing";
}

}  // namespace
