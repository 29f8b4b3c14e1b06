// SPDX-License-Identifier: Apache-2.0
// Taking over the PLP settings, and the running mean and variance
// normalisation seeded from the cepstral mean table.
#include <cmath>
#include <cstring>

#include "plp.h"
#include "quellan_log.h"

namespace {

constexpr uint32_t kMaxCmsDim = 1000;
constexpr float kRunningRate = 0.01f;
constexpr float kRunningKeep = 0.99f;
// 0.99 * 0.01: the weight of the squared deviation from the previous mean.
constexpr float kRunningVarRate = 0.0099f;

}  // namespace

int load_base_info_cmsfp(PLP* plp, const PlpConfig* conf, FILE* cmsfp) {
  if (plp == nullptr || conf == nullptr) {
    QUELLAN_WARN("Wrong param to %s. \n", __func__);
    return -1;
  }
  plp->conf_ = *conf;
  plp->tgt_kind_ = 0;
  if (std::strstr(plp->conf_.targetkind, "MFCCPLP") == nullptr) {
    QUELLAN_WARN("Error set targetkind[%s].\n", plp->conf_.targetkind);
    return -1;
  }
  plp->tgt_kind_ = kTargetKindPlp;
  if (std::strstr(plp->conf_.targetkind, "_C0") != nullptr) {
    plp->tgt_kind_ |= kTargetKindC0;
  }
  if (conf->num_ceps < 2 || conf->num_ceps > conf->lpc_order) {
    QUELLAN_WARN("ValidCodeParms: unlikely num cep coef %d\n", conf->num_ceps);
    return -1;
  }
  if (conf->cms_mode != 0 && conf->cms_mode != 1) {
    QUELLAN_WARN("CMS Mode invalid, should be 0 or 1, you set: %d\n", conf->cms_mode);
    return -1;
  }
  plp->static_dim_ = conf->num_ceps + ((plp->tgt_kind_ & kTargetKindC0) ? 1 : 0);
  // Frame geometry and vector widths that the analysis relies on.
  if (conf->src_period <= 0 || conf->frame_period < conf->src_period ||
      conf->window_size < 2 * conf->src_period || conf->num_chans < 1 || conf->max_frame_num < 1 ||
      conf->out_pad < 0 || conf->feat_dim < plp->static_dim_ ||
      conf->feat_dim % plp->static_dim_ != 0) {
    QUELLAN_WARN("Invalid frame or vector settings.\n");
    return -1;
  }
  plp->frame_shift_ = conf->frame_period / conf->src_period;
  plp->frame_size_ = conf->window_size / conf->src_period;
  plp->m_bInitialize_ = 1;
  if (conf->cms_mode == 0) return 0;
  if (cmsfp == nullptr) {
    QUELLAN_WARN("Wrong cmsfp.\n");
    return -1;
  }
  uint32_t dim = 0;
  if (std::fread(&dim, sizeof(dim), 1, cmsfp) != 1 || dim > kMaxCmsDim ||
      dim != static_cast<uint32_t>(conf->feat_dim)) {
    QUELLAN_WARN("read cms table error\n");
    return -1;
  }
  plp->cms_dim_ = static_cast<int>(dim);
  plp->cms_mean_.assign(dim, 0.0f);
  plp->cms_var_.assign(dim, 0.0f);
  plp->run_mean_.assign(dim, 0.0f);
  plp->run_var_.assign(dim, 0.0f);
  plp->saved_mean_.assign(dim, 0.0f);
  plp->saved_var_.assign(dim, 0.0f);
  // A short mean part shows up as a short variance part.
  const size_t means = std::fread(plp->cms_mean_.data(), sizeof(float), dim, cmsfp);
  (void)means;
  if (std::fread(plp->cms_var_.data(), sizeof(float), dim, cmsfp) != dim) {
    QUELLAN_WARN("read cms table error\n");
    return -1;
  }
  // A NaN, an infinity or a negative variance would make every normalised
  // feature NaN from the first frame on.
  for (uint32_t i = 0; i < dim; ++i) {
    if (!std::isfinite(plp->cms_mean_[i]) || !std::isfinite(plp->cms_var_[i]) ||
        plp->cms_var_[i] < 0.0f) {
      QUELLAN_WARN(
          "read cms table error: dimension %u is not a finite mean and "
          "variance\n",
          i);
      return -1;
    }
  }
  return 0;
}

void PLP::update_running(float* vector) {
  const float min_sd = static_cast<float>(kMinStdDev);
  for (int i = 0; i < cms_dim_; ++i) {
    const float x = vector[i];
    const float mean = run_mean_[i];
    const float deviation = x - mean;
    const float new_mean = kRunningRate * x + kRunningKeep * mean;
    const float new_var = kRunningKeep * run_var_[i] + kRunningVarRate * deviation * deviation;
    float sd = std::sqrt(new_var);
    if (sd < min_sd) sd = min_sd;
    vector[i] = (x - new_mean) / sd;
    run_mean_[i] = new_mean;
    run_var_[i] = new_var;
  }
}

void PLP::normalise_running(int frames, int flag) {
  const int delay = delay_frames();
  // While more audio follows, the last frames are normalised only
  // provisionally: the next block brings them again with full context.
  const int hold = flag >= 1 ? 2 * delay : 0;
  int t = delay;
  if (cms_first_call_) {
    cms_first_call_ = false;
    run_mean_ = cms_mean_;
    run_var_ = cms_var_;
    t = 0;
  }
  const int feat_dim = conf_.feat_dim;
  for (; t < frames - hold; ++t) {
    update_running(m_tgt_.get() + static_cast<size_t>(t) * feat_dim);
  }
  saved_mean_ = run_mean_;
  saved_var_ = run_var_;
  for (; t < frames - delay; ++t) {
    update_running(m_tgt_.get() + static_cast<size_t>(t) * feat_dim);
  }
  run_mean_ = saved_mean_;
  run_var_ = saved_var_;
}
