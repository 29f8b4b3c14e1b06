// SPDX-License-Identifier: Apache-2.0
#include "quellan_conf.h"

#include <cstdio>
#include <cstring>

#include "quellan_log.h"

namespace {

void data_file_path(char* path, const char* dir, const char* file) {
  if (dir != nullptr) {
    std::snprintf(path, kVadPathBytes, "%s/%s", dir, file);
  } else {
    std::snprintf(path, kVadPathBytes, "%s", file);
  }
}

}  // namespace

int load_vad_dnn_conf(const char* dir, int32_t max_frames, VadDnnConf* conf) {
  std::memset(conf, 0, sizeof(*conf));
  conf->max_frames = max_frames;
  conf->head_margin = 15;
  conf->min_silence = 30;
  conf->energy_gate = 1;
  conf->energy_threshold_db = 50.0f;
  conf->win_size = 400;
  conf->shift = 160;
  conf->energy_smooth = 0.9f;
  data_file_path(conf->dnn_file, dir, kNetworkFile);
  data_file_path(conf->state_weights_file, dir, kPriorFile);
  conf->feat_dim = 39;
  conf->start_offset = 5;
  conf->end_offset = 5;
  conf->skip = 2;
  conf->score_smooth = 0.8f;
  conf->score_threshold = -1.0f;
  return 0;
}

int load_pitch_conf(const char* /*path*/, PitchConf* conf) {
  conf->tone_dim = 3;
  conf->tone_scale = 10.0f;
  return 0;
}

int load_quellan_conf(const char* dir, QuellanConf* conf) {
  conf->max_frames = 13000;
  conf->feat_dim = 39;
  conf->frame_shift = 160;
  conf->use_pitch = 0;
  conf->out_wav_len = 32000;
  conf->out_wav_num = 5;
  std::snprintf(conf->data_dir, sizeof(conf->data_dir), "%s", dir != nullptr ? dir : "./data");
  if (plp_load_conf(&conf->plp, conf->max_frames, dir, nullptr) < 0) {
    QUELLAN_WARN("Failed to load plp conf.\n");
    return -1;
  }
  if (conf->use_pitch != 0 && load_pitch_conf(dir, &conf->pitch) < 0) {
    QUELLAN_WARN("Failed to load pitch conf.\n");
    return -1;
  }
  if (load_vad_dnn_conf(dir, conf->max_frames, &conf->vad) < 0) {
    QUELLAN_WARN("failed to load vad config.\n");
    return -1;
  }
  return 0;
}
