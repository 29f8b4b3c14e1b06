// SPDX-License-Identifier: Apache-2.0
// Settings of the PLP front end. All values are built-in defaults; the model
// directory only locates the cepstral mean table.
#ifndef QUELLAN_PLP_CONFIG_H_
#define QUELLAN_PLP_CONFIG_H_

#include <cstdint>

constexpr int kPlpTargetKindBytes = 20;
constexpr int kPlpPathBytes = 256;
constexpr char kCmsTableFile[] = "quellan_data_a";

// Bits of PLP::tgt_kind parsed from targetkind.
constexpr int32_t kTargetKindPlp = 9;
constexpr int32_t kTargetKindC0 = 64;

struct PlpConfig {
  char targetkind[kPlpTargetKindBytes];
  char cms_path[kPlpPathBytes];
  int32_t src_period;    // sample period, 100 ns units
  int32_t frame_period;  // frame shift, 100 ns units
  int32_t max_frame_num;
  uint8_t zero_mean_src;
  int32_t num_chans;
  int32_t num_ceps;
  int32_t cep_lifter;
  int32_t window_size;  // analysis window, 100 ns units
  float lo_freq;        // Hz; negative: 0 Hz
  float hi_freq;        // Hz; negative: Nyquist
  int32_t unused[3];
  int32_t lpc_order;
  float compress_fact;
  // The aux_* settings belong to the record's layout; the extractor does not
  // read them.
  int32_t aux_flag;
  float aux_scale;
  float aux_floor;
  uint8_t aux_switch_a;
  uint8_t aux_switch_b;
  uint8_t aux_switch_c;
  int32_t aux_count;
  float aux_coef_a;
  float aux_coef_b;
  int32_t cms_mode;  // 0: per-block normalisation, 1: running, from the table
  int32_t online_max_samples;
  int32_t feat_dim;
  int32_t out_pad;  // extra floats after each output vector
};

// Clears the record and writes the defaults; `dir` (may be null) locates
// the cepstral mean table.
void plp_set_defaults(PlpConfig* conf, int32_t max_frame_num, const char* dir);

// Fills the record with its defaults. `file` names a settings file for a
// reader that this system does not have; it is accepted and ignored.
int plp_load_conf(PlpConfig* conf, int32_t max_frame_num, const char* dir, const char* file);

#endif  // QUELLAN_PLP_CONFIG_H_
