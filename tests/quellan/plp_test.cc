// SPDX-License-Identifier: Apache-2.0
#include "plp.h"

#include <gtest/gtest.h>

#include <cstring>
#include <stdexcept>
#include <string>
#include <vector>

#include "model_files.h"
#include "plp_config.h"
#include "temp_dir.h"

namespace {

constexpr int kWidth = 39;

PlpConfig Defaults(const char* dir = nullptr) {
  PlpConfig conf;
  EXPECT_EQ(plp_load_conf(&conf, 13000, dir, nullptr), 0);
  return conf;
}

TEST(PlpConfigTest, TablePathAndReloading) {
  const PlpConfig conf = Defaults();
  EXPECT_STREQ(conf.cms_path, "quellan_data_a");
  EXPECT_STREQ(Defaults("/models/vad").cms_path, "/models/vad/quellan_data_a");

  PlpConfig again;
  std::memset(&again, 0x5a, sizeof(again));
  ASSERT_EQ(plp_load_conf(&again, 13000, nullptr, nullptr), 0);
  EXPECT_EQ(std::memcmp(&conf, &again, sizeof(conf)), 0)
      << "nothing of an earlier record may survive";

  testing::internal::CaptureStdout();
  EXPECT_EQ(plp_load_conf(nullptr, 13000, nullptr, nullptr), -1);
  EXPECT_NE(testing::internal::GetCapturedStdout().find(
                "<<plp_load_conf>>] Wrong param to plp_load_conf. (nil)\n"),
            std::string::npos);
}

// Mean table of `n` columns followed by `floats` values.
std::string Table(uint32_t n, size_t floats) {
  std::string bytes(reinterpret_cast<const char*>(&n), sizeof(n));
  const std::vector<float> values(floats, 1.0f);
  return bytes.append(reinterpret_cast<const char*>(values.data()), floats * sizeof(float));
}

TEST(PlpTableTest, RefusesBadSettingsAndTables) {
  const std::string path = kvasr_test::ProcessTempDir() + "/table";
  const std::string good = Table(kWidth, 2 * kWidth);
  const struct {
    void (*change)(PlpConfig*);
    std::string table;  // empty: no table file at all
    const char* message;
  } cases[] = {
      {[](PlpConfig* c) { std::strcpy(c->targetkind, "MFCC_C0"); }, good,
       "Error set targetkind[MFCC_C0].\n"},
      {[](PlpConfig* c) { c->num_ceps = 13; }, good, "ValidCodeParms: unlikely num cep coef 13\n"},
      {[](PlpConfig* c) { c->num_ceps = 1; }, good, "ValidCodeParms: unlikely num cep coef 1\n"},
      {[](PlpConfig* c) { c->cms_mode = 2; }, good,
       "CMS Mode invalid, should be 0 or 1, you set: 2\n"},
      {[](PlpConfig*) {}, Table(kWidth, 2 * kWidth - 1), "read cms table error\n"},
      {[](PlpConfig*) {}, Table(13, 26), "read cms table error\n"},
      {[](PlpConfig*) {}, "", "Wrong cmsfp.\n"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.message);
    PlpConfig conf = Defaults();
    c.change(&conf);
    quellan_test::WriteBytes(path, c.table);
    FILE* f = c.table.empty() ? nullptr : std::fopen(path.c_str(), "rb");
    testing::internal::CaptureStdout();
    EXPECT_THROW(PLP(&conf, f), std::runtime_error);
    const std::string out = testing::internal::GetCapturedStdout();
    if (f != nullptr) std::fclose(f);
    EXPECT_NE(out.find(c.message), std::string::npos) << out;
    EXPECT_NE(out.find("<<PLP>>] Failed to load base info\n"), std::string::npos);
  }
}

TEST(PlpBlockTest, RefusesEmptyAndOversizedBlocks) {
  const std::string path = kvasr_test::ProcessTempDir() + "/table";
  quellan_test::WriteMeanTable(path, std::vector<float>(kWidth, 0.0f),
                               std::vector<float>(kWidth, 1.0f));
  PlpConfig conf = Defaults();
  conf.max_frame_num = 50;
  FILE* f = std::fopen(path.c_str(), "rb");
  PLP plp(&conf, f);
  std::fclose(f);
  plp.reset();
  std::vector<float> rows(60 * kWidth, -7.0f);
  const std::vector<int16_t> wave(400 + 60 * 160, 3000);
  int frames = -5;
  testing::internal::CaptureStdout();
  EXPECT_EQ(plp.extract_feature(wave.data(), 0, rows.data(), 60, &frames, 1), -1);
  // 50 frames reach max_frame_num.
  EXPECT_EQ(plp.extract_feature(wave.data(), 400 + 49 * 160, rows.data(), 60, &frames, 1), -1);
  // 10 frames do not fit 10 free rows.
  EXPECT_EQ(plp.extract_feature(wave.data(), 400 + 9 * 160, rows.data(), 10, &frames, 1), -1);
  const std::string out = testing::internal::GetCapturedStdout();
  EXPECT_EQ(frames, -5);
  for (const char* message :
       {"<<AddWaveData>>] Null m_bInitialize[1] or waveData[", "or smpNum[0]\n",
        "<<extract_feature>>] Failed to add wave data.\n",
        "Too many frames[50] >= max_frame_num[50]\n", "<<extract_feature>>] Too many frames.\n"}) {
    EXPECT_NE(out.find(message), std::string::npos) << message;
  }
  EXPECT_EQ(rows[0], -7.0f) << "a refused block writes nothing";
}

}  // namespace
