// SPDX-License-Identifier: Apache-2.0
#include "plp.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <limits>

#include "alloc_zeroed.h"
#include "quellan_log.h"

namespace {

constexpr double kPreEmphasis = 0.97;
constexpr float kStaticScale = 10.0f;
constexpr float kStaticClip = 50.0f;
constexpr int kDeltaWindowFrames = 2;
constexpr float kDeltaDivisor = 10.0f;  // 2 * (1^2 + 2^2)
constexpr float kFilterbankFloor = 1.0f;

// The mel scale, with frequencies also given as multiples of its corner.
constexpr double kMelScale = 1127.0;
constexpr double kMelCornerHz = 700.0;

double mel_of_corners(double corners) { return kMelScale * std::log(1.0 + corners); }
double mel(double hz) { return mel_of_corners(hz / kMelCornerHz); }
double hz_of_mel(double m) { return kMelCornerHz * (std::exp(m / kMelScale) - 1.0); }

float clip_static(float v) {
  return v > kStaticClip ? kStaticClip : (v < -kStaticClip ? -kStaticClip : v);
}

}  // namespace

PLP::PLP(const PlpConfig* conf, FILE* cmsfp) {
  if (load_base_info_cmsfp(this, conf, cmsfp) != 0) QUELLAN_INIT_FAIL("Failed to load base info\n");
  build_tables();
  const size_t tgt_floats = static_cast<size_t>(conf_.feat_dim) * conf_.max_frame_num;
  m_tgt_ = alloc_zeroed<float>(tgt_floats);
  if (!m_tgt_) {
    QUELLAN_INIT_FAIL("Failed to alloc memory for m_tgt, size[%lu]\n",
                      static_cast<unsigned long>(tgt_floats * sizeof(float)));
  }
  const size_t static_floats = static_cast<size_t>(static_dim_) * conf_.max_frame_num;
  static_buf_ = alloc_zeroed<float>(static_floats);
  if (!static_buf_) {
    // compat: names m_tgt, as this message always has; hosts match the text.
    QUELLAN_INIT_FAIL("Failed to alloc memory for m_tgt, size[%lu]\n",
                      static_cast<unsigned long>(static_floats * sizeof(float)));
  }
}

int PLP::delay_frames() const { return kDeltaWindowFrames * (conf_.feat_dim / static_dim_ - 1); }

void PLP::build_tables() {
  fft_n_ = 2;
  while (fft_n_ < frame_size_) fft_n_ *= 2;
  const int half_n = fft_n_ / 2;
  const int num_chans = conf_.num_chans;

  // One bin's width, in multiples of the mel scale's corner frequency.
  const double bin_corners = 1e7 / (conf_.src_period * fft_n_ * kMelCornerHz);
  double mlo = 0.0;
  first_bin_ = 2;
  if (conf_.lo_freq >= 0.0f) {
    mlo = mel(conf_.lo_freq);
    first_bin_ = static_cast<int>(conf_.lo_freq * conf_.src_period * 1e-7 * fft_n_ + 0.5);
    if (first_bin_ < 2) first_bin_ = 2;
  }
  double mhi = mel(0.5e7 / conf_.src_period);
  last_bin_ = half_n;
  if (conf_.hi_freq >= 0.0f) {
    mhi = mel(conf_.hi_freq);
    last_bin_ = static_cast<int>(conf_.hi_freq * conf_.src_period * 1e-7 * fft_n_ + 0.5);
    if (last_bin_ > half_n) last_bin_ = half_n;
  }

  std::vector<double> centre(num_chans + 2);
  centre[0] = mlo;
  for (int i = 1; i <= num_chans + 1; ++i) {
    centre[i] = static_cast<double>(i) / (num_chans + 1) * (mhi - mlo) + mlo;
  }
  std::vector<int> bin_chan(half_n + 1, 0);
  bin_weight_.assign(half_n + 1, 0.0f);
  for (int k = first_bin_; k <= last_bin_; ++k) {
    const double m = mel_of_corners((k - 1) * bin_corners);
    int ch = 0;
    while (ch + 1 <= num_chans + 1 && centre[ch + 1] < m) ++ch;
    bin_chan[k] = ch;
    bin_weight_[k] = static_cast<float>((centre[ch + 1] - m) / (centre[ch + 1] - centre[ch]));
  }
  // Channels rise with the bin, so each one's bins form a range; walking
  // down leaves the first bin at or above every channel.
  chan_first_bin_.assign(num_chans + 2, last_bin_ + 1);
  for (int k = last_bin_; k >= first_bin_; --k) {
    for (int c = 0; c <= bin_chan[k]; ++c) chan_first_bin_[c] = k;
  }

  loudness_.assign(num_chans + 1, 0.0f);
  for (int j = 1; j <= num_chans; ++j) {
    const double f = hz_of_mel(centre[j]);
    const double s = f * f;
    const double ratio = s / (s + 1.6e5);
    loudness_[j] = static_cast<float>(ratio * ratio * (s + 1.44e6) / (s + 9.61e6));
  }

  const int n_freq = num_chans + 2;
  const int lags = conf_.lpc_order + 1;
  idft_cos_.assign(static_cast<size_t>(n_freq) * lags, 0.0);
  for (int k = 0; k < lags; ++k) {
    const double step = k * M_PI / (n_freq - 1);
    idft_cos_[k] = 1.0;
    for (int j = 1; j <= n_freq - 2; ++j) {
      idft_cos_[static_cast<size_t>(j) * lags + k] = 2.0 * std::cos(j * step);
    }
    idft_cos_[static_cast<size_t>(n_freq - 1) * lags + k] = std::cos((n_freq - 1) * step);
  }
  lag_sums_.assign(lags, 0.0);

  lifter_.assign(conf_.num_ceps + 1, 1.0f);
  if (conf_.cep_lifter > 0) {
    const double len = conf_.cep_lifter;
    for (int i = 1; i <= conf_.num_ceps; ++i) {
      lifter_[i] = static_cast<float>(1.0 + len / 2.0 * std::sin(M_PI * i / len));
    }
  }
  hamming_.assign(frame_size_ + 1, 0.0f);
  for (int i = 1; i <= frame_size_; ++i) {
    hamming_[i] =
        static_cast<float>(0.54 - 0.46 * std::cos(2.0 * M_PI * (i - 1) / (frame_size_ - 1)));
  }

  fft_ = std::make_unique<RealFft>(fft_n_);
  frame_.assign(fft_n_ + 1, 0.0f);
  spectrum_.assign(half_n + 1, 0.0f);
  fbank_.assign(num_chans + 1, 0.0f);
  aud_spec_.assign(n_freq + 1, 0.0f);
  ac_.assign(conf_.lpc_order + 2, 0.0f);
  lp_.assign(conf_.lpc_order + 2, 0.0f);
  durbin_scratch_.assign(conf_.lpc_order + 2, 0.0f);
  cep_.assign(static_dim_ + 1, 0.0f);
}

int PLP::AddWaveData(const int16_t* waveData, int smpNum, int64_t first_sample) {
  if (m_bInitialize_ != 1 || waveData == nullptr || smpNum <= 0) {
    QUELLAN_WARN("Null m_bInitialize[%lx] or waveData[%p] or smpNum[%d]\n",
                 static_cast<unsigned long>(m_bInitialize_), static_cast<const void*>(waveData),
                 smpNum);
    return -1;
  }
  frame_num_ = (smpNum - frame_size_) / frame_shift_ + 1;
  if (frame_num_ >= conf_.max_frame_num) {
    QUELLAN_WARN("Too many frames[%d] >= max_frame_num[%d]\n", frame_num_, conf_.max_frame_num);
    return -1;
  }
  const int kept = take_over_kept_frames(first_sample, smpNum);
  kept_start_ = kNoPosition;
  // The mean is removed from the copy of each frame, not from the caller's
  // block, which the pipeline keeps as overlap for the next block.
  double mean = 0.0;
  if (conf_.zero_mean_src) {
    for (int i = 0; i < smpNum; ++i) mean += waveData[i];
    mean /= smpNum;
  }
  for (int t = kept; t < frame_num_; ++t) {
    const int16_t* samples = waveData + static_cast<size_t>(t) * frame_shift_;
    // A block shorter than one window still counts one frame (the frame
    // count truncates toward zero); its missing samples read as zeros.
    const int available = std::min(frame_size_, smpNum - t * frame_shift_);
    for (int i = available; i < frame_size_; ++i) frame_[i + 1] = 0.0f;
    for (int i = 0; i < available; ++i) {
      if (conf_.zero_mean_src) {
        const double centred = std::round(samples[i] - mean);
        frame_[i + 1] = static_cast<float>(std::clamp(centred, -32767.0, 32767.0));
      } else {
        frame_[i + 1] = samples[i];
      }
    }
    analyse_frame(static_buf_.get() + static_cast<size_t>(t) * static_dim_);
  }
  return 0;
}

int PLP::take_over_kept_frames(int64_t first_sample, int smpNum) {
  // The block mean ties every frame to the whole block.
  if (first_sample < 0 || kept_start_ < 0 || conf_.zero_mean_src) return 0;
  const int64_t offset_samples = first_sample - kept_start_;
  if (offset_samples < 0 || offset_samples % frame_shift_ != 0) return 0;
  const int64_t offset_frames = offset_samples / frame_shift_;
  // Only whole frames repeat: a block shorter than a window pads its frame.
  const int whole_frames = smpNum >= frame_size_ ? frame_num_ : 0;
  const int count =
      static_cast<int>(std::clamp<int64_t>(kept_frames_ - offset_frames, 0, whole_frames));
  if (count == 0) return 0;
  std::memmove(static_buf_.get(), static_buf_.get() + offset_frames * static_dim_,
               sizeof(float) * static_cast<size_t>(count) * static_dim_);
  return count;
}

void PLP::analyse_frame(float* cepstrum) {
  float* x = frame_.data();
  // Pre-emphasis and window in one pass, backwards so that x[i - 1] is
  // still the sample when x[i] needs it.
  for (int i = frame_size_; i >= 2; --i) {
    x[i] = static_cast<float>(x[i] - kPreEmphasis * x[i - 1]) * hamming_[i];
  }
  x[1] = static_cast<float>(x[1] * (1.0 - kPreEmphasis)) * hamming_[1];
  // spectrum_[k - 1] is the magnitude of filterbank bin k.
  fft_->magnitude(x + 1, spectrum_.data());

  const int num_chans = conf_.num_chans;
  // Channel j rises over the bins of range j - 1 and falls over those of
  // range j, summed in bin order; a register sum per channel keeps the adds
  // out of memory.
  for (int j = 1; j <= num_chans; ++j) {
    float sum = 0.0f;
    for (int k = chan_first_bin_[j - 1]; k < chan_first_bin_[j]; ++k) {
      const float e = spectrum_[k - 1];
      sum += e - bin_weight_[k] * e;
    }
    for (int k = chan_first_bin_[j]; k < chan_first_bin_[j + 1]; ++k) {
      sum += bin_weight_[k] * spectrum_[k - 1];
    }
    fbank_[j] = sum;
  }

  const int n_freq = num_chans + 2;
  for (int j = 1; j <= num_chans; ++j) {
    const float band = std::max(fbank_[j], kFilterbankFloor);
    aud_spec_[j + 1] =
        static_cast<float>(std::pow(static_cast<double>(band * loudness_[j]), conf_.compress_fact));
  }
  aud_spec_[1] = aud_spec_[2];
  aud_spec_[n_freq] = aud_spec_[n_freq - 1];

  const int lags = conf_.lpc_order + 1;
  std::fill(lag_sums_.begin(), lag_sums_.end(), 0.0);
  for (int i = 1; i <= n_freq; ++i) {
    const double a = aud_spec_[i];
    const double* cosines = idft_cos_.data() + static_cast<size_t>(i - 1) * lags;
    for (int k = 0; k < lags; ++k) lag_sums_[k] += a * cosines[k];
  }
  const double scale = 2.0 * (n_freq - 1);
  const float energy = static_cast<float>(lag_sums_[0] / scale);
  for (int k = 1; k < lags; ++k) ac_[k] = static_cast<float>(lag_sums_[k] / scale);
  lp_[conf_.lpc_order + 1] = 0.0f;
  const float err = durbin(energy);

  float* c = cep_.data();
  for (int n = 1; n <= static_dim_; ++n) {
    float sum = 0.0f;
    for (int i = 1; i < n; ++i) sum += (n - i) * lp_[i] * c[n - i];
    c[n] = -(lp_[n] + sum / n);
  }
  if (tgt_kind_ & kTargetKindC0) {
    // A vanishing prediction error drives C0 to the clip floor rather than
    // to a NaN that would poison the running statistics.
    c[static_dim_] = err > 0.0f ? static_cast<float>(-std::log(1.0 / err))
                                : -std::numeric_limits<float>::infinity();
  }
  if (conf_.cep_lifter > 0) {
    for (int i = 1; i <= conf_.num_ceps; ++i) c[i] *= lifter_[i];
  }
  std::memcpy(cepstrum, c + 1, sizeof(float) * static_dim_);
}

float PLP::durbin(float energy) {
  const int order = conf_.lpc_order;
  float* a = lp_.data();
  float* next = durbin_scratch_.data();
  float err = energy;
  for (int i = 1; i <= order; ++i) {
    float k = ac_[i];
    for (int j = 1; j < i; ++j) k += a[j] * ac_[i - j];
    k /= err;
    err *= 1.0f - k * k;
    next[i] = -k;
    for (int j = 1; j < i; ++j) next[j] = a[j] - k * a[i - j];
    for (int j = 1; j <= i; ++j) a[j] = next[j];
  }
  return err;
}

int PLP::extract_feature(const int16_t* wave, int smpNum, float* out, int max_out_frames,
                         int* out_frames, int flag, int64_t first_sample) {
  if (AddWaveData(wave, smpNum, first_sample) != 0) {
    QUELLAN_WARN("Failed to add wave data.\n");
    return -1;
  }
  const int frames = frame_num_;
  const int feat_dim = conf_.feat_dim;
  for (int t = 0; t < frames; ++t) {
    const float* src = static_buf_.get() + static_cast<size_t>(t) * static_dim_;
    float* dst = m_tgt_.get() + static_cast<size_t>(t) * feat_dim;
    for (int i = 0; i < static_dim_; ++i) dst[i] = clip_static(src[i] * kStaticScale);
  }
  add_derivatives(frames);
  if (feat_dim / static_dim_ >= 2) {
    if ((flag == -1 && smpNum <= conf_.online_max_samples) || conf_.cms_mode == 0) {
      normalise_block(frames);
    } else {
      normalise_running(frames, flag);
    }
  }
  if (frames >= max_out_frames) {
    QUELLAN_WARN("Too many frames.\n");
    return -1;
  }
  const int stride = feat_dim + conf_.out_pad;
  for (int t = 0; t < frames; ++t) {
    std::memcpy(out + static_cast<size_t>(t) * stride,
                m_tgt_.get() + static_cast<size_t>(t) * feat_dim, sizeof(float) * feat_dim);
  }
  *out_frames = frames;
  // After the last block the caller may start over at the same positions.
  if (first_sample >= 0 && flag >= 1 && smpNum >= frame_size_) {
    kept_start_ = first_sample;
    kept_frames_ = frames;
  }
  return 0;
}

void PLP::add_derivatives(int frames) {
  const int feat_dim = conf_.feat_dim;
  const int blocks = feat_dim / static_dim_;
  for (int d = 0; d + 1 < blocks; ++d) {
    const int src_col = d * static_dim_;
    const int dst_col = (d + 1) * static_dim_;
    for (int t = 0; t < frames; ++t) {
      float* dst = m_tgt_.get() + static_cast<size_t>(t) * feat_dim + dst_col;
      for (int i = 0; i < static_dim_; ++i) {
        float sum = 0.0f;
        for (int k = 1; k <= kDeltaWindowFrames; ++k) {
          // Frames beyond the block edges repeat the edge frame.
          const int ahead = std::min(t + k, frames - 1);
          const int behind = std::max(t - k, 0);
          sum += k * (m_tgt_[static_cast<size_t>(ahead) * feat_dim + src_col + i] -
                      m_tgt_[static_cast<size_t>(behind) * feat_dim + src_col + i]);
        }
        dst[i] = sum / kDeltaDivisor;
      }
    }
  }
}

void PLP::normalise_block(int frames) {
  if (frames <= 0) return;
  const int feat_dim = conf_.feat_dim;
  const double divisor = frames < 2 ? 1.0 : frames - 1.0;
  for (int i = 0; i < feat_dim; ++i) {
    double sum = 0.0;
    for (int t = 0; t < frames; ++t) sum += m_tgt_[static_cast<size_t>(t) * feat_dim + i];
    const double mean = sum / frames;
    double squares = 0.0;
    for (int t = 0; t < frames; ++t) {
      const double d = m_tgt_[static_cast<size_t>(t) * feat_dim + i] - mean;
      squares += d * d;
    }
    const double sd = std::max(std::sqrt(squares / divisor), kMinStdDev);
    for (int t = 0; t < frames; ++t) {
      float& v = m_tgt_[static_cast<size_t>(t) * feat_dim + i];
      v = static_cast<float>((v - mean) / sd);
    }
  }
}
