#include "real_fft.h"

#include <cmath>

RealFft::RealFft(int fft_n)
    : fft_n_(fft_n),
      re_(fft_n),
      im_(fft_n),
      cos_table_(fft_n / 2),
      sin_table_(fft_n / 2),
      bit_reverse_(fft_n) {
  for (int m = 0; m < fft_n_ / 2; ++m) {
    const double angle = 2.0 * M_PI * m / fft_n_;
    cos_table_[m] = std::cos(angle);
    sin_table_[m] = std::sin(angle);
  }
  int bits = 0;
  while ((1 << bits) < fft_n_) ++bits;
  for (int i = 0; i < fft_n_; ++i) {
    int reversed = 0;
    for (int b = 0; b < bits; ++b) {
      if (i & (1 << b)) reversed |= 1 << (bits - 1 - b);
    }
    bit_reverse_[i] = reversed;
  }
}

void RealFft::magnitude(const float* frame, float* magnitude) {
  for (int i = 0; i < fft_n_; ++i) {
    re_[bit_reverse_[i]] = frame[i];
    im_[bit_reverse_[i]] = 0.0;
  }
  for (int len = 2; len <= fft_n_; len <<= 1) {
    const int half = len / 2;
    const int table_step = fft_n_ / len;
    for (int start = 0; start < fft_n_; start += len) {
      for (int k = 0; k < half; ++k) {
        // Twiddle exp(-2 pi i k / len).
        const double wr = cos_table_[k * table_step];
        const double wi = -sin_table_[k * table_step];
        const int a = start + k;
        const int b = a + half;
        const double tr = wr * re_[b] - wi * im_[b];
        const double ti = wr * im_[b] + wi * re_[b];
        re_[b] = re_[a] - tr;
        im_[b] = im_[a] - ti;
        re_[a] += tr;
        im_[a] += ti;
      }
    }
  }
  for (int k = 0; k <= fft_n_ / 2; ++k) {
    const float re = static_cast<float>(re_[k]);
    const float im = static_cast<float>(im_[k]);
    magnitude[k] = std::sqrt(re * re + im * im);
  }
}
