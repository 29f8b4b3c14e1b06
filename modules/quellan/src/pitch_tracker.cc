// SPDX-License-Identifier: Apache-2.0
#include "pitch_tracker.h"

#include <cmath>
#include <cstdlib>
#include <cstring>

#include "real_fft.h"

namespace {

constexpr int kInitialFill = 20;  // every stream starts 2.5 ms late
constexpr int kDecimatedSamples = kPitchFrameSamples / 2;
constexpr int kResetAnalysisSamples = 140;
constexpr int kFftSize = 256;
// The window's 2 pi is the single-precision constant, widened.
constexpr double kTwoPi = 6.2831854820251465;
constexpr double kMinEnergy = 0.00019284;
constexpr double kMinPitchLogEnergy = 13.6;

// Mel scale of the bands: 24 steps from 98.59779 to 2146.0646 mel.
constexpr float kMelLow = 98.59779f;
constexpr float kMelSpan = 2047.4668f;
constexpr float kMelDivisor = 2595.0f;
// The mel scale's 700 Hz corner in bins of the 8 kHz spectrum.
constexpr double kMelCornerBins = 700.0 * kFftSize / 8000.0;

const RealFft& transform_fft() {
  static const RealFft fft(kFftSize);
  return fft;
}

// 256-point DFT of the windowed 200 samples (the other 56 are zero) by an
// iterative radix-2 FFT, bins 1 .. 128 in the transform layout;
// X[k] = sum x[n] exp(-2 pi i k n / 256).
void Transform(const float* analysis, const float* window, float transform[kTransformFloats]) {
  double x[kFftSize] = {};
  for (int n = 0; n < kAnalysisSamples; ++n) {
    x[n] = static_cast<double>(analysis[n]) * window[n];
  }
  double re[kFftSize];
  double im[kFftSize];
  transform_fft().transform(x, re, im);
  for (int k = 1; k < kLastBin; ++k) {
    transform[2 * (k - 1)] = static_cast<float>(re[k]);
    transform[2 * (k - 1) + 1] = static_cast<float>(im[k]);
  }
  transform[kTransformFloats - 1] = static_cast<float>(re[kLastBin]);
}

// 200 times the variance of the unwindowed samples.
float FrameEnergy(const float* a) {
  double sum = 0.0;
  double sum_sq = 0.0;
  for (int i = 0; i < kAnalysisSamples; ++i) {
    sum += a[i];
    sum_sq += static_cast<double>(a[i]) * a[i];
  }
  return static_cast<float>(sum_sq - sum * sum / kAnalysisSamples);
}

// Mean of the real parts of bins 1 .. 128.
float SpectralLevel(const float* transform) {
  double sum = transform[kTransformFloats - 1];
  for (int i = 0; i < kTransformFloats - 1; i += 2) sum += transform[i];
  return static_cast<float>(sum / 128.0);
}

void PowerSpectrum(const float* transform, float power[kPowerBins]) {
  power[0] = 0.0f;
  for (int k = 1; k < kLastBin; ++k) {
    const float re = transform[2 * (k - 1)];
    const float im = transform[2 * (k - 1) + 1];
    power[k] = re * re + im * im;
  }
  const float last = transform[kTransformFloats - 1];
  power[kLastBin] = last * last;
}

void FrameDecision(PitchTracker* t, float* raw_f0) {
  const float* a = t->analysis;
  float transform[kTransformFloats];
  Transform(a, t->window, transform);
  const float energy = FrameEnergy(a);
  const float spectral_level = SpectralLevel(transform);
  float power[kPowerBins];
  PowerSpectrum(transform, power);
  float mel[kMelBands];
  for (int j = 0; j < kMelBands; ++j) {
    float sum = 0.0f;
    for (int k = 0; k < kPowerBins; ++k) sum += t->mel_weights[j][k] * power[k];
    mel[j] = sum;
  }

  const int voiced = DetectVoicing(&t->voicing, mel);
  const int restart = DetectRestart(&t->voicing, voiced, power, energy);
  float filtered[kPitchSamples2kHz];
  FilterForPitch(&t->voicing, restart, a, filtered);
  PitchTrackingUpdate(&t->tracking, transform, spectral_level);

  const float log_energy = energy < kMinEnergy ? kSilentLogEnergy : std::log(energy);
  float f0 = 0.0f;
  if (voiced == 1 && log_energy >= kMinPitchLogEnergy) {
    if (restart != 0) t->tracking.distrust_frames = kRestartDistrustFrames;
    f0 = PitchTrackingEstimate(&t->tracking, power, filtered);
  } else {
    PitchTrackingBreak(&t->tracking);
  }
  if (raw_f0 != nullptr) *raw_f0 = f0;
  ToneStatePush(&t->post, f0, log_energy);
}

}  // namespace

void PitchMelEdges(int edges[kMelEdges]) {
  for (int j = 0; j < kMelEdges; ++j) {
    const float mel = (static_cast<float>(j) / (kMelEdges - 1) * kMelSpan + kMelLow) / kMelDivisor;
    edges[j] = static_cast<int>(
        std::floor((std::pow(10.0, static_cast<double>(mel)) - 1.0) * kMelCornerBins + 0.5));
  }
}

void PitchTrackerInit(PitchTracker* t) {
  std::memset(t, 0, sizeof(*t));
  t->feature_stride = 4;
  t->fill = kInitialFill;
  for (int i = 0; i < kAnalysisSamples; ++i) {
    // The half-sample offset keeps both ends of the window above zero.
    t->window[i] =
        static_cast<float>(0.5 * (1.0 - std::cos((i + 0.5) * kTwoPi / kAnalysisSamples)));
  }
  int b[kMelEdges];
  PitchMelEdges(b);
  for (int j = 0; j < kMelBands; ++j) {
    // The rising side starts above zero at b[j] and the falling side ends
    // above zero at b[j + 2]; the two are deliberately unequal.
    const int rise = b[j + 1] - b[j] + 1;
    const int fall = b[j + 2] - b[j + 1] + 1;
    for (int i = 1; i <= rise; ++i) {
      t->mel_weights[j][b[j] + i - 1] = static_cast<float>(i) / static_cast<float>(rise);
    }
    for (int i = 0; i <= fall - 2; ++i) {
      t->mel_weights[j][b[j + 1] + i + 1] =
          static_cast<float>(fall - 1 - i) / static_cast<float>(fall);
    }
  }
  VoicingInit(&t->voicing);
  PitchTrackingReset(&t->tracking);
  ToneStateInit(&t->post);
}

void PitchTrackerReset(PitchTracker* t) {
  t->frame_counter = 0;
  t->pending_count = 0;
  t->fill = kInitialFill;
  std::memset(t->pending, 0, sizeof(t->pending));
  std::memset(t->analysis, 0, sizeof(float) * kResetAnalysisSamples);
  VoicingReset(&t->voicing);
  PitchTrackingReset(&t->tracking);
  ToneStateReset(&t->post);
}

void AnalyseFrame(PitchTracker* t, const int16_t* frame, float* raw_f0) {
  ++t->frame_counter;
  int32_t magnitude = 0;
  for (int i = 0; i < kPitchFrameSamples; ++i) magnitude += std::abs(frame[i]);
  if (magnitude == 0) {
    ToneStatePush(&t->post, 0.0f, kSilentLogEnergy);
    return;
  }
  for (int i = 0; i < kPitchFrameSamples; i += 2) {
    const int32_t pair = static_cast<int32_t>(frame[i]) + frame[i + 1];
    t->analysis[t->fill + i / 2] = static_cast<float>(pair) * 0.5f;
  }
  t->fill += kDecimatedSamples;
  if (t->fill < kAnalysisSamples) return;

  FrameDecision(t, raw_f0);
  // Analysis windows overlap by 120 samples: drop the oldest 80.
  t->fill -= kDecimatedSamples;
  std::memmove(t->analysis, t->analysis + kDecimatedSamples, sizeof(float) * t->fill);
}
