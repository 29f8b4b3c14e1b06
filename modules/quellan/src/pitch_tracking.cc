// SPDX-License-Identifier: Apache-2.0
#include "pitch_tracking.h"

#include <algorithm>
#include <cmath>
#include <cstring>

#include "tone_post.h"

namespace {

constexpr float kBinHz = kPitchSampleRateHz / 256.0f;  // 256-point transform
constexpr float kFilteredRateHz = 2000.0f;

// Candidate grid, log-spaced so that every octave is resolved alike.
constexpr float kMinF0Hz = 60.0f;
constexpr float kMaxF0Hz = 450.0f;
constexpr int kGridStepsPerOctave = 96;
// ceil(96 * log2(450 / 60)) + 1
constexpr int kGridPoints = 281;

// Harmonics above this carry little periodicity in speech but much noise.
constexpr float kMaxHarmonicHz = 2500.0f;
constexpr int kMaxHarmonics = 20;
// Later harmonics count less, so that half the true pitch, whose harmonics
// include every true one, still scores below it.
constexpr float kHarmonicDecay = 0.84f;

constexpr int kMaxCandidates = 4;
// Peaks below this share of the best salience are not worth weighing.
constexpr float kMinRelativeSalience = 0.25f;

// Correlation: the newest 20 ms against the same span one lag earlier.
constexpr int kCorrelationSamples = 40;
constexpr int kMinLag = 4;   // 500 Hz
constexpr int kMaxLag = 40;  // 50 Hz, the oldest lagged sample is out[0]
constexpr float kCorrelationWeight = 1.0f;
// Frames less periodic than this at the chosen period are called unvoiced:
// the voicing decision upstream holds on through short pauses.
constexpr float kMinCorrelation = 0.6f;
// From this lag on (125 Hz and below) the harmonics of the 25 ms spectrum
// overlap and the correlation places the period better.
constexpr float kLongLag = 16.0f;

// A trusted track adds up to this to candidates near it; the bonus falls to
// zero at a ratio of 1.25.
constexpr float kContinuityBonus = 0.3f;
constexpr float kContinuityRatio = 1.25f;
constexpr int kTrackFramesForTrust = 2;

// A harmonic peak further than this share of the pitch from its expected
// place belongs to something else.
constexpr float kHarmonicTolerance = 0.1f;
constexpr float kPowerFloor = 1e-20f;

float GridFrequency(int i) {
  return kMinF0Hz * std::exp2(static_cast<float>(i) / kGridStepsPerOctave);
}

// Amplitude at a fractional bin, linearly interpolated; zero beyond the
// spectrum.
float AmplitudeAt(const float* amplitude, float bin) {
  if (bin < 0.0f || bin >= kLastBin) return 0.0f;
  const int k = static_cast<int>(bin);
  const float frac = bin - k;
  return amplitude[k] + frac * (amplitude[k + 1] - amplitude[k]);
}

// Weighted harmonic amplitudes minus the amplitudes half way between them:
// the subtraction makes twice the true pitch, whose midpoints fall on the
// odd harmonics, score near zero.
float Salience(const float* amplitude, float f0_hz) {
  float sum = 0.0f;
  float weight = 1.0f;
  for (int h = 1; h <= kMaxHarmonics && h * f0_hz <= kMaxHarmonicHz; ++h) {
    sum += weight * (AmplitudeAt(amplitude, h * f0_hz / kBinHz) -
                     AmplitudeAt(amplitude, (h - 0.5f) * f0_hz / kBinHz));
    weight *= kHarmonicDecay;
  }
  return sum;
}

// Normalised cross-correlation for every integer lag; out[lag - kMinLag].
void Correlations(const float* x, float* out) {
  const int start = kPitchSamples2kHz - kCorrelationSamples;
  double ref_energy = 0.0;
  for (int n = start; n < kPitchSamples2kHz; ++n) ref_energy += x[n] * x[n];
  for (int lag = kMinLag; lag <= kMaxLag; ++lag) {
    double cross = 0.0;
    double lag_energy = 0.0;
    for (int n = start; n < kPitchSamples2kHz; ++n) {
      cross += x[n] * x[n - lag];
      lag_energy += x[n - lag] * x[n - lag];
    }
    const double norm = std::sqrt(ref_energy * lag_energy);
    out[lag - kMinLag] = norm > 0.0 ? static_cast<float>(cross / norm) : 0.0f;
  }
}

float CorrelationAt(const float* correlations, float f0_hz) {
  const float lag =
      std::clamp(kFilteredRateHz / f0_hz, static_cast<float>(kMinLag), static_cast<float>(kMaxLag));
  const int i = std::min(static_cast<int>(lag), kMaxLag - 1) - kMinLag;
  const float frac = lag - (i + kMinLag);
  return correlations[i] + frac * (correlations[i + 1] - correlations[i]);
}

// Least-squares pitch through the interpolated peaks of the harmonics of
// `f0_hz`; each peak weighs by its amplitude. Returns `f0_hz` when no
// harmonic peak is found.
float RefineFromHarmonics(const float* power, float f0_hz) {
  double num = 0.0;
  double den = 0.0;
  for (int h = 1; h <= kMaxHarmonics && h * f0_hz <= kMaxHarmonicHz; ++h) {
    const int expected = static_cast<int>(std::lround(h * f0_hz / kBinHz));
    int k = std::clamp(expected, 1, kLastBin - 1);
    if (power[k - 1] > power[k] && k > 1) --k;
    if (power[k + 1] > power[k] && k < kLastBin - 1) ++k;
    if (power[k] < power[k - 1] || power[k] < power[k + 1]) continue;
    // A parabola through the log powers finds the peak of the window's
    // main lobe to a small fraction of a bin.
    const float left = std::log(std::max(power[k - 1], kPowerFloor));
    const float centre = std::log(std::max(power[k], kPowerFloor));
    const float right = std::log(std::max(power[k + 1], kPowerFloor));
    const float curvature = left - 2.0f * centre + right;
    const float offset = curvature < 0.0f ? 0.5f * (left - right) / curvature : 0.0f;
    const float peak_hz = (k + offset) * kBinHz;
    if (std::fabs(peak_hz / h - f0_hz) > kHarmonicTolerance * f0_hz) continue;
    const double weight = std::sqrt(power[k]);
    num += weight * h * peak_hz;
    den += weight * h * h;
  }
  return den > 0.0 ? static_cast<float>(num / den) : f0_hz;
}

// Peak of the correlation near the lag of `f0_hz`, placed between lags by a
// parabola. Returns `f0_hz` when there is no peak there.
float RefineFromCorrelation(const float* correlations, float f0_hz) {
  int lag = static_cast<int>(std::lround(kFilteredRateHz / f0_hz));
  lag = std::clamp(lag, kMinLag + 1, kMaxLag - 1);
  if (correlations[lag - 1 - kMinLag] > correlations[lag - kMinLag]) --lag;
  if (correlations[lag + 1 - kMinLag] > correlations[lag - kMinLag]) ++lag;
  if (lag <= kMinLag || lag >= kMaxLag) return f0_hz;
  const float left = correlations[lag - 1 - kMinLag];
  const float centre = correlations[lag - kMinLag];
  const float right = correlations[lag + 1 - kMinLag];
  const float curvature = left - 2.0f * centre + right;
  if (centre < left || centre < right || curvature >= 0.0f) return f0_hz;
  return kFilteredRateHz / (lag + 0.5f * (left - right) / curvature);
}

}  // namespace

void PitchTrackingReset(PitchTrackingState* s) { std::memset(s, 0, sizeof(*s)); }

void PitchTrackingUpdate(PitchTrackingState* s, const float transform[kTransformFloats],
                         float /*spectral_level*/) {
  s->amplitude[0] = 0.0f;
  for (int k = 1; k < kLastBin; ++k) {
    const float re = transform[2 * (k - 1)];
    const float im = transform[2 * (k - 1) + 1];
    s->amplitude[k] = std::sqrt(re * re + im * im);
  }
  s->amplitude[kLastBin] = std::fabs(transform[kTransformFloats - 1]);
  if (s->distrust_frames > 0) --s->distrust_frames;
}

void PitchTrackingBreak(PitchTrackingState* s) {
  s->tracked_period = 0.0f;
  s->track_frames = 0;
}

float PitchTrackingEstimate(PitchTrackingState* s, const float power[kPowerBins],
                            const float filtered_2khz[kPitchSamples2kHz]) {
  float salience[kGridPoints];
  float best_salience = 0.0f;
  for (int i = 0; i < kGridPoints; ++i) {
    salience[i] = Salience(s->amplitude, GridFrequency(i));
    best_salience = std::max(best_salience, salience[i]);
  }
  if (best_salience <= 0.0f) {
    PitchTrackingBreak(s);
    return 0.0f;
  }

  // The strongest local maxima of the salience, best first.
  int peaks[kMaxCandidates];
  int peak_count = 0;
  for (int i = 1; i + 1 < kGridPoints; ++i) {
    if (salience[i] < kMinRelativeSalience * best_salience || salience[i] < salience[i - 1] ||
        salience[i] < salience[i + 1]) {
      continue;
    }
    int pos = std::min(peak_count, kMaxCandidates - 1);
    if (peak_count == kMaxCandidates && salience[peaks[pos]] >= salience[i]) {
      continue;
    }
    while (pos > 0 && salience[peaks[pos - 1]] < salience[i]) {
      peaks[pos] = peaks[pos - 1];
      --pos;
    }
    peaks[pos] = i;
    peak_count = std::min(peak_count + 1, kMaxCandidates);
  }

  float candidate_hz[kMaxCandidates + 1];
  float candidate_salience[kMaxCandidates + 1];
  int candidate_count = 0;
  for (int c = 0; c < peak_count; ++c) {
    const int i = peaks[c];
    // A parabola through the neighbouring grid points places the peak
    // between them.
    const float left = salience[i - 1];
    const float right = salience[i + 1];
    const float curvature = left - 2.0f * salience[i] + right;
    const float offset = curvature < 0.0f ? 0.5f * (left - right) / curvature : 0.0f;
    candidate_hz[candidate_count] = GridFrequency(i) * std::exp2(offset / kGridStepsPerOctave);
    candidate_salience[candidate_count++] = salience[i];
  }

  float correlations[kMaxLag - kMinLag + 1];
  Correlations(filtered_2khz, correlations);
  // Low voices have harmonics too close for the 25 ms spectrum to separate
  // at every phase; the correlation peak competes with the spectral ones.
  int best_lag = 0;
  for (int lag = kMinLag + 1; lag < kMaxLag; ++lag) {
    const float r = correlations[lag - kMinLag];
    if (r >= correlations[lag - 1 - kMinLag] && r >= correlations[lag + 1 - kMinLag] &&
        (best_lag == 0 || r > correlations[best_lag - kMinLag])) {
      best_lag = lag;
    }
  }
  if (best_lag != 0) {
    const float f0_hz =
        RefineFromCorrelation(correlations, kFilteredRateHz / static_cast<float>(best_lag));
    if (f0_hz >= kMinF0Hz && f0_hz <= kMaxF0Hz) {
      candidate_hz[candidate_count] = f0_hz;
      candidate_salience[candidate_count++] = Salience(s->amplitude, f0_hz);
    }
  }

  if (candidate_count == 0) {
    PitchTrackingBreak(s);
    return 0.0f;
  }

  const bool trusted = s->distrust_frames == 0 && s->track_frames >= kTrackFramesForTrust &&
                       s->tracked_period > 0.0f;
  const float tracked_hz = trusted ? kPitchSampleRateHz / s->tracked_period : 0.0f;
  float best_hz = 0.0f;
  float best_score = 0.0f;
  for (int c = 0; c < candidate_count; ++c) {
    const float f0_hz = candidate_hz[c];
    float score = candidate_salience[c] / best_salience +
                  kCorrelationWeight * CorrelationAt(correlations, f0_hz);
    if (trusted) {
      const float distance = std::fabs(std::log(f0_hz / tracked_hz)) / std::log(kContinuityRatio);
      score += kContinuityBonus * std::max(0.0f, 1.0f - distance);
    }
    if (best_hz == 0.0f || score > best_score) {
      best_score = score;
      best_hz = f0_hz;
    }
  }

  const float refined_hz = kFilteredRateHz / best_hz >= kLongLag
                               ? RefineFromCorrelation(correlations, best_hz)
                               : RefineFromHarmonics(power, best_hz);
  const float f0_hz = std::clamp(refined_hz, kMinF0Hz, kMaxF0Hz);
  if (CorrelationAt(correlations, f0_hz) < kMinCorrelation) {
    PitchTrackingBreak(s);
    return 0.0f;
  }
  s->tracked_period = kPitchSampleRateHz / f0_hz;
  ++s->track_frames;
  return s->tracked_period;
}
