// SPDX-License-Identifier: Apache-2.0
// Configuration of the voice activity module: built-in defaults, with the
// model directory locating the three data files.
#ifndef QUELLAN_QUELLAN_CONF_H_
#define QUELLAN_QUELLAN_CONF_H_

#include <cstdint>

#include "dnnvad.h"
#include "plp_config.h"

constexpr char kNetworkFile[] = "quellan_data_b";
constexpr char kPriorFile[] = "quellan_data_c";

// Tone feature settings; built in, no file is read.
struct PitchConf {
  int32_t tone_dim;  // values of each post-processed frame written out
  float tone_scale;  // factor applied to every value written out
};

struct QuellanConf {
  char data_dir[kVadPathBytes];
  int32_t max_frames;   // capacity of every per-utterance buffer
  int32_t feat_dim;     // row width of the feature matrix
  int32_t frame_shift;  // samples
  int32_t out_wav_len;  // samples per output slot
  int32_t out_wav_num;  // output slots and interval entries per call
  PlpConfig plp;
  int32_t use_pitch;  // tone features; 0 in this system
  PitchConf pitch;    // loaded only with use_pitch
  VadDnnConf vad;
};

// Fills the detector settings; `dir` (may be null) locates the network and
// prior files. Returns 0.
int load_vad_dnn_conf(const char* dir, int32_t max_frames, VadDnnConf* conf);

// Stores the built-in tone settings; `path` is not read. Returns 0.
int load_pitch_conf(const char* path, PitchConf* conf);

// Fills the whole record. Returns 0 or -1 (the reason is printed).
int load_quellan_conf(const char* dir, QuellanConf* conf);

#endif  // QUELLAN_QUELLAN_CONF_H_
