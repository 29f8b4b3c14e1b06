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
  // `cmsfp` is the open mean table, or null when cms_mode is 0. Throws
  // std::runtime_error("init vad failed") after printing the reason.
  PLP(const PlpConfig* conf, FILE* cmsfp);

  // Frames and analyses one block into the static cepstra.
  int AddWaveData(const int16_t* waveData, int smpNum);

  // Writes one normalised feature vector per frame of the block to `out`
  // (stride feat_dim + out_pad). `flag` >= 1 while more audio follows, below
  // 1 on the last block; -1 alone enables the short-utterance rule.
  int extract_feature(const int16_t* wave, int smpNum, float* out,
                      int max_out_frames, int* out_frames, int flag);

  int frame_shift_samples() const { return frame_shift_; }
  int window_samples() const { return frame_size_; }
  int feat_dim() const { return conf_.feat_dim; }
  // Frames at the end of a block whose derivatives still lack right context.
  int delay_frames() const;
  void set_out_pad(int out_pad) { conf_.out_pad = out_pad; }
  // Marks the next block as the first of an utterance for the running
  // normalisation.
  void reset() { cms_first_call_ = true; }
  bool first_call() const { return cms_first_call_; }
  // Running statistics of the normalisation as the last block left them.
  const std::vector<float>& running_mean() const { return run_mean_; }
  const std::vector<float>& running_variance() const { return run_var_; }

 private:
  friend int load_base_info_cmsfp(PLP* plp, const PlpConfig* conf, FILE* cmsfp);

  void build_tables();
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
  std::vector<uint16_t> bin_chan_;
  std::vector<float> bin_weight_;
  int first_bin_ = 0;
  int last_bin_ = 0;
  std::vector<float> loudness_;
  std::vector<std::vector<double>> idft_cos_;
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
  std::unique_ptr<float[]> m_tgt_;       // feat_dim x max_frame_num

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
