// SPDX-License-Identifier: Apache-2.0
// Perceptual linear prediction front end: 16 kHz samples to cepstra with C0,
// two derivative blocks and mean/variance normalisation.
#ifndef QUELLAN_PLP_H_
#define QUELLAN_PLP_H_

#include <cstdint>
#include <cstdio>
#include <memory>
#include <vector>

#include "plp_config.h"
#include "real_fft.h"

class PLP;

// Takes the settings over into `plp` and, with running normalisation, reads
// the cepstral mean table from `cmsfp`. Returns 0 or -1.
int load_base_info_cmsfp(PLP* plp, const PlpConfig* conf, FILE* cmsfp);

class PLP {
 public:
  // A block that is not placed in an utterance.
  static constexpr int64_t kNoPosition = -1;

  // `cmsfp` is the open mean table, or null when cms_mode is 0. Throws
  // std::runtime_error("init vad failed") after printing the reason.
  PLP(const PlpConfig* conf, FILE* cmsfp);

  // Frames and analyses one block into the static cepstra, taking over the
  // frames that extract_feature kept at the same positions (see there).
  int AddWaveData(const int16_t* waveData, int smpNum, int64_t first_sample = kNoPosition);

  // Writes one normalised feature vector per frame of the block to `out`
  // (stride feat_dim + out_pad). `flag` >= 1 while more audio follows, below
  // 1 on the last block; -1 alone enables the short-utterance rule.
  // `first_sample`, when given, is where the block starts in the utterance
  // begun by reset(): the static cepstra of a block that more audio follows
  // are kept, and the next block takes over the frames at the same positions
  // instead of analysing them again. The caller must not change the samples
  // at a position within an utterance. Returns 0 or -1.
  int extract_feature(const int16_t* wave, int smpNum, float* out, int max_out_frames,
                      int* out_frames, int flag, int64_t first_sample = kNoPosition);

  int frame_shift_samples() const { return frame_shift_; }
  int window_samples() const { return frame_size_; }
  int feat_dim() const { return conf_.feat_dim; }
  // Frames at the end of a block whose derivatives still lack right context.
  int delay_frames() const;
  void set_out_pad(int out_pad) { conf_.out_pad = out_pad; }
  // Marks the next block as the first of an utterance for the running
  // normalisation; frames kept from the last one are no longer taken over.
  void reset() {
    cms_first_call_ = true;
    kept_start_ = kNoPosition;
  }
  bool first_call() const { return cms_first_call_; }
  // Running statistics of the normalisation as the last block left them.
  const std::vector<float>& running_mean() const { return run_mean_; }
  const std::vector<float>& running_variance() const { return run_var_; }

 private:
  // Floor of a standard deviation that divides a normalised feature: both
  // normalisations use it, the running one at single precision.
  static constexpr double kMinStdDev = 0.01;

  friend int load_base_info_cmsfp(PLP* plp, const PlpConfig* conf, FILE* cmsfp);

  void build_tables();
  // Moves the kept frames that the block starting at `first_sample` repeats
  // to the front of static_buf_; returns how many.
  int take_over_kept_frames(int64_t first_sample, int smpNum);
  // Turns the samples in frame_[1 .. frame_size] into one static vector.
  void analyse_frame(float* cepstrum);
  // Levinson-Durbin recursion on ac_; returns the prediction error.
  float durbin(float energy);
  void add_derivatives(int frames);
  void normalise_block(int frames);
  void normalise_running(int frames, int flag);
  void update_running(float* vector);

  uint8_t m_bInitialize_ = 0;
  PlpConfig conf_{};
  int32_t tgt_kind_ = 0;
  int static_dim_ = 0;
  int fft_n_ = 0;
  int frame_shift_ = 0;
  int frame_num_ = 0;
  int frame_size_ = 0;

  // Filterbank and analysis tables; vectors are indexed from 1 where the
  // formulas count from 1.
  std::vector<float> bin_weight_;
  int first_bin_ = 0;
  int last_bin_ = 0;
  // Bins [chan_first_bin_[c], chan_first_bin_[c + 1]) lie between the
  // centres of channels c and c + 1.
  std::vector<int> chan_first_bin_;
  std::vector<float> loudness_;
  // idft_cos_[(i - 1) * (lpc_order + 1) + k]: weight of frequency i at lag
  // k, so the lags of one frequency sit side by side.
  std::vector<double> idft_cos_;
  std::vector<double> lag_sums_;
  std::vector<float> lifter_;
  std::vector<float> hamming_;
  std::unique_ptr<RealFft> fft_;

  std::vector<float> frame_;
  std::vector<float> spectrum_;
  std::vector<float> fbank_;
  std::vector<float> aud_spec_;
  std::vector<float> ac_;
  std::vector<float> lp_;
  std::vector<float> durbin_scratch_;
  std::vector<float> cep_;

  std::unique_ptr<float[]> static_buf_;  // static_dim x max_frame_num
  // Utterance position of the first frame kept in static_buf_, and how many
  // whole frames follow it there.
  int64_t kept_start_ = kNoPosition;
  int kept_frames_ = 0;
  std::unique_ptr<float[]> m_tgt_;  // feat_dim x max_frame_num

  // Cepstral mean table and the running statistics seeded from it.
  int cms_dim_ = 0;
  std::vector<float> cms_mean_;
  std::vector<float> cms_var_;
  std::vector<float> run_mean_;
  std::vector<float> run_var_;
  std::vector<float> saved_mean_;
  std::vector<float> saved_var_;
  bool cms_first_call_ = false;
};

#endif  // QUELLAN_PLP_H_
