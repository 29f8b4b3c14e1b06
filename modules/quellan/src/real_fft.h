// Magnitude spectrum of a real frame by an iterative radix-2 FFT.
#ifndef QUELLAN_REAL_FFT_H_
#define QUELLAN_REAL_FFT_H_

#include <vector>

class RealFft {
 public:
  // `fft_n` must be a power of two.
  explicit RealFft(int fft_n);

  // Reads `fft_n` samples and writes |X[k]| for k = 0 .. fft_n / 2.
  void magnitude(const float* frame, float* magnitude);

 private:
  // Loads the frame in bit-reversed order and runs the butterfly stages of
  // length 2 and 4, which see only real values.
  void first_stages(const float* frame);

  int fft_n_;
  std::vector<double> re_;
  std::vector<double> im_;
  // The stage of butterflies of length len keeps its twiddles
  // exp(-2 pi i k / len), k < len / 2, at [len / 2, len).
  std::vector<double> twiddle_re_;
  std::vector<double> twiddle_im_;
  std::vector<int> bit_reverse_;
};

#endif  // QUELLAN_REAL_FFT_H_
