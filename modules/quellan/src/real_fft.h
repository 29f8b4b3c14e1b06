// SPDX-License-Identifier: Apache-2.0
// Spectrum of a real frame by an iterative radix-2 FFT.
#ifndef QUELLAN_REAL_FFT_H_
#define QUELLAN_REAL_FFT_H_

#include <vector>

class RealFft {
 public:
  // `fft_n` must be a power of two.
  explicit RealFft(int fft_n);

  // Reads `fft_n` samples and writes |X[k]| for k = 0 .. fft_n / 2.
  void magnitude(const float* frame, float* magnitude);

  // Reads `fft_n` samples and writes X[k] = sum_n x[n] exp(-2 pi i k n /
  // fft_n), k = 0 .. fft_n - 1, to `re` and `im` (fft_n values each, owned
  // by the caller). Uses no state of the object, so one object can serve
  // several threads.
  void transform(const double* frame, double* re, double* im) const;

 private:
  // Loads the frame in bit-reversed order and runs the butterfly stages of
  // length 2 and 4, which see only real values.
  template <typename Sample>
  void first_stages(const Sample* frame, double* re, double* im) const;
  void later_stages(double* re, double* im) const;

  int fft_n_;
  // Work space of magnitude().
  std::vector<double> re_;
  std::vector<double> im_;
  // The stage of butterflies of length len keeps its twiddles
  // exp(-2 pi i k / len), k < len / 2, at [len / 2, len).
  std::vector<double> twiddle_re_;
  std::vector<double> twiddle_im_;
  std::vector<int> bit_reverse_;
};

#endif  // QUELLAN_REAL_FFT_H_
