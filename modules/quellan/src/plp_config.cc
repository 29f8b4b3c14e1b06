// SPDX-License-Identifier: Apache-2.0
#include "plp_config.h"

#include <cstdio>
#include <cstring>

#include "quellan_log.h"

void plp_set_defaults(PlpConfig* conf, int32_t max_frame_num, const char* dir) {
  std::memset(conf, 0, sizeof(*conf));
  conf->max_frame_num = max_frame_num;
  std::snprintf(conf->targetkind, sizeof(conf->targetkind), "%s", "MFCCPLP_C0");
  if (dir != nullptr) {
    std::snprintf(conf->cms_path, sizeof(conf->cms_path), "%s/%s", dir, kCmsTableFile);
  } else {
    std::snprintf(conf->cms_path, sizeof(conf->cms_path), "%s", kCmsTableFile);
  }
  conf->src_period = 625;
  conf->frame_period = 100000;
  conf->zero_mean_src = 0;
  conf->num_chans = 24;
  conf->num_ceps = 12;
  conf->cep_lifter = 22;
  conf->window_size = 250000;
  conf->lo_freq = -1.0f;
  conf->hi_freq = -1.0f;
  conf->lpc_order = 12;
  conf->compress_fact = 0.33f;
  conf->aux_flag = 1;
  conf->aux_scale = 1.0f;
  conf->aux_floor = 50.0f;
  conf->aux_switch_a = 0;
  conf->aux_switch_b = 1;
  conf->aux_switch_c = 1;
  conf->aux_count = 10;
  conf->aux_coef_a = 0.94f;
  conf->aux_coef_b = 0.6f;
  conf->cms_mode = 1;
  conf->online_max_samples = 16000;
  conf->feat_dim = 39;
  conf->out_pad = 0;
}

int plp_load_conf(PlpConfig* conf, int32_t max_frame_num, const char* dir, const char* file) {
  (void)file;
  if (conf == nullptr) {
    QUELLAN_WARN("Wrong param to %s. %p\n", __func__, static_cast<void*>(conf));
    return -1;
  }
  plp_set_defaults(conf, max_frame_num, dir);
  return 0;
}
