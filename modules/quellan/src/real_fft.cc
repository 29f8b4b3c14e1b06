#include "real_fft.h"

#include <emmintrin.h>

#include <cmath>

RealFft::RealFft(int fft_n)
    : fft_n_(fft_n),
      re_(fft_n),
      im_(fft_n),
      twiddle_re_(fft_n),
      twiddle_im_(fft_n),
      bit_reverse_(fft_n) {
  for (int len = 2; len <= fft_n_; len <<= 1) {
    const int half = len / 2;
    for (int k = 0; k < half; ++k) {
      const double angle = 2.0 * M_PI * (k * (fft_n_ / len)) / fft_n_;
      twiddle_re_[half + k] = std::cos(angle);
      twiddle_im_[half + k] = -std::sin(angle);
    }
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
  double* re = re_.data();
  double* im = im_.data();
  for (int len = 2; len <= fft_n_; len <<= 1) {
    const int half = len / 2;
    const double* tw_re = twiddle_re_.data() + half;
    const double* tw_im = twiddle_im_.data() + half;
    for (int start = 0; start < fft_n_; start += len) {
      double* re_a = re + start;
      double* im_a = im + start;
      double* re_b = re_a + half;
      double* im_b = im_a + half;
      int k = 0;
      // Two butterflies at a time; the same multiplications, additions and
      // subtractions as the scalar ones below, so the results are the same.
      for (; k + 2 <= half; k += 2) {
        const __m128d wr = _mm_loadu_pd(tw_re + k);
        const __m128d wi = _mm_loadu_pd(tw_im + k);
        const __m128d br = _mm_loadu_pd(re_b + k);
        const __m128d bi = _mm_loadu_pd(im_b + k);
        const __m128d tr = _mm_sub_pd(_mm_mul_pd(wr, br), _mm_mul_pd(wi, bi));
        const __m128d ti = _mm_add_pd(_mm_mul_pd(wr, bi), _mm_mul_pd(wi, br));
        const __m128d ar = _mm_loadu_pd(re_a + k);
        const __m128d ai = _mm_loadu_pd(im_a + k);
        _mm_storeu_pd(re_b + k, _mm_sub_pd(ar, tr));
        _mm_storeu_pd(im_b + k, _mm_sub_pd(ai, ti));
        _mm_storeu_pd(re_a + k, _mm_add_pd(ar, tr));
        _mm_storeu_pd(im_a + k, _mm_add_pd(ai, ti));
      }
      for (; k < half; ++k) {
        const double wr = tw_re[k];
        const double wi = tw_im[k];
        const double tr = wr * re_b[k] - wi * im_b[k];
        const double ti = wr * im_b[k] + wi * re_b[k];
        re_b[k] = re_a[k] - tr;
        im_b[k] = im_a[k] - ti;
        re_a[k] += tr;
        im_a[k] += ti;
      }
    }
  }
  for (int k = 0; k <= fft_n_ / 2; ++k) {
    const float re = static_cast<float>(re_[k]);
    const float im = static_cast<float>(im_[k]);
    magnitude[k] = std::sqrt(re * re + im * im);
  }
}
