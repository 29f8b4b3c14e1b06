// SPDX-License-Identifier: Apache-2.0
#include "real_fft.h"

#include <emmintrin.h>

#include <cmath>

#include "cpu_dispatch.h"

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

template <typename Sample>
void RealFft::first_stages(const Sample* frame, double* re, double* im) const {
  if (fft_n_ == 2) {
    re[0] = static_cast<double>(frame[0]) + frame[1];
    re[1] = static_cast<double>(frame[0]) - frame[1];
    im[0] = 0.0;
    im[1] = 0.0;
    return;
  }
  const int quarter = fft_n_ / 4;
  const double w_re = twiddle_re_[3];
  const double w_im = twiddle_im_[3];
  for (int i = 0; i < fft_n_; i += 4) {
    // Bit reversal puts samples r, r + n/2, r + n/4 and r + 3n/4 at i .. i + 3.
    const int r = bit_reverse_[i];
    const double x0 = frame[r];
    const double x1 = frame[r + 2 * quarter];
    const double x2 = frame[r + quarter];
    const double x3 = frame[r + 3 * quarter];
    // Length 2: the twiddle is 1, so the complex product is b itself.
    const double a0 = x0 + x1;
    const double a1 = x0 - x1;
    const double b0 = x2 + x3;
    const double b1 = x2 - x3;
    // Length 4 on real values: w * b is (w_re * b, w_im * b), and the first
    // twiddle is 1.
    const double tr = w_re * b1;
    const double ti = w_im * b1;
    re[i] = a0 + b0;
    im[i] = 0.0;
    re[i + 1] = a1 + tr;
    im[i + 1] = ti;
    re[i + 2] = a0 - b0;
    im[i + 2] = 0.0;
    re[i + 3] = a1 - tr;
    im[i + 3] = -ti;
  }
}

namespace {

// Four doubles at any double-aligned address; the AVX build of
// butterflies() keeps them in one register, the default build in two.
typedef double Lanes
    __attribute__((vector_size(4 * sizeof(double)), aligned(sizeof(double)), may_alias));

// One stage's butterflies on a group of 2 * half values, half a multiple
// of four. Built twice, for AVX and for the baseline: the lanes do the same
// multiplications, additions and subtractions as scalar butterflies, so
// both builds give the same results.
__attribute__((always_inline)) inline void butterflies(double* re_a, double* im_a, int half,
                                                       const double* tw_re, const double* tw_im) {
  double* re_b = re_a + half;
  double* im_b = im_a + half;
  for (int k = 0; k < half; k += 4) {
    const Lanes wr = *reinterpret_cast<const Lanes*>(tw_re + k);
    const Lanes wi = *reinterpret_cast<const Lanes*>(tw_im + k);
    const Lanes br = *reinterpret_cast<const Lanes*>(re_b + k);
    const Lanes bi = *reinterpret_cast<const Lanes*>(im_b + k);
    const Lanes tr = wr * br - wi * bi;
    const Lanes ti = wr * bi + wi * br;
    const Lanes ar = *reinterpret_cast<const Lanes*>(re_a + k);
    const Lanes ai = *reinterpret_cast<const Lanes*>(im_a + k);
    *reinterpret_cast<Lanes*>(re_b + k) = ar - tr;
    *reinterpret_cast<Lanes*>(im_b + k) = ai - ti;
    *reinterpret_cast<Lanes*>(re_a + k) = ar + tr;
    *reinterpret_cast<Lanes*>(im_a + k) = ai + ti;
  }
}

// All stages after the first two, over n values.
__attribute__((always_inline)) inline void butterfly_stages(int n, double* re, double* im,
                                                            const double* tw_re,
                                                            const double* tw_im) {
  for (int len = 8; len <= n; len <<= 1) {
    const int half = len / 2;
    for (int start = 0; start < n; start += len) {
      butterflies(re + start, im + start, half, tw_re + half, tw_im + half);
    }
  }
}

__attribute__((target("avx"))) void later_stages_avx(int n, double* re, double* im,
                                                     const double* tw_re, const double* tw_im) {
  butterfly_stages(n, re, im, tw_re, tw_im);
}

void later_stages_baseline(int n, double* re, double* im, const double* tw_re,
                           const double* tw_im) {
  butterfly_stages(n, re, im, tw_re, tw_im);
}

}  // namespace

void RealFft::later_stages(double* re, double* im) const {
  if (kvasr_common::HasAvx()) {
    return later_stages_avx(fft_n_, re, im, twiddle_re_.data(), twiddle_im_.data());
  }
  later_stages_baseline(fft_n_, re, im, twiddle_re_.data(), twiddle_im_.data());
}

// The trimmed arithmetic of the first stages only drops additions of zero
// and products with zero or one, which leave every non-zero value as the
// full butterflies compute it; only the sign of a zero can differ.
void RealFft::transform(const double* frame, double* re, double* im) const {
  first_stages(frame, re, im);
  later_stages(re, im);
}

void RealFft::magnitude(const float* frame, float* magnitude) {
  double* re = re_.data();
  double* im = im_.data();
  first_stages(frame, re, im);
  later_stages(re, im);
  const int bins = fft_n_ / 2 + 1;
  int k = 0;
  // Four bins at a time: the conversions, products, sum and square root
  // round exactly as the scalar ones below.
  for (; k + 4 <= bins; k += 4) {
    const __m128 re4 =
        _mm_movelh_ps(_mm_cvtpd_ps(_mm_loadu_pd(re + k)), _mm_cvtpd_ps(_mm_loadu_pd(re + k + 2)));
    const __m128 im4 =
        _mm_movelh_ps(_mm_cvtpd_ps(_mm_loadu_pd(im + k)), _mm_cvtpd_ps(_mm_loadu_pd(im + k + 2)));
    const __m128 power = _mm_add_ps(_mm_mul_ps(re4, re4), _mm_mul_ps(im4, im4));
    _mm_storeu_ps(magnitude + k, _mm_sqrt_ps(power));
  }
  for (; k < bins; ++k) {
    const float re1 = static_cast<float>(re[k]);
    const float im1 = static_cast<float>(im[k]);
    magnitude[k] = std::sqrt(re1 * re1 + im1 * im1);
  }
}
