// SPDX-License-Identifier: Apache-2.0
#include "tone_post.h"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <iterator>

namespace {

// Window position of the frame being selected; the newer ones are look-ahead.
constexpr int kSelectCentre = 10;
constexpr float kPitchNeighbourRatio = 1.28f;
constexpr float kRepairOuterRatio = 1.4f;
// An octave fold by two is undone when its error is not clearly below the
// plain ratio of the two pitches.
constexpr float kFoldBiasFactor = 1.4f;
constexpr float kReferenceHz = 185.0f;
constexpr int kInterpLookAhead = 6;
constexpr int kNormCurrent = 95;
constexpr int kDeltaOrders = 3;
constexpr int kDeltaCentre = 6;
// Output never carries an exact zero; this tiny value stands in for one.
constexpr float kZeroStandIn = 1e-8f;
constexpr float kLowestSum = -3.4028235e38f;

struct RunEntry {
  int index;
  float pitch;
  float energy;
};

template <int N>
void PushWindow(float (&window)[N], float value) {
  std::memmove(window, window + 1, (N - 1) * sizeof(float));
  window[N - 1] = value;
}

// Stable insertion sort by one field: at most 19 entries, and unlike
// std::stable_sort it never allocates.
template <typename Field>
void SortEntries(RunEntry* entries, int count, Field RunEntry::*key) {
  for (int i = 1; i < count; ++i) {
    const RunEntry moving = entries[i];
    int j = i;
    while (j > 0 && moving.*key < entries[j - 1].*key) {
      entries[j] = entries[j - 1];
      --j;
    }
    entries[j] = moving;
  }
}

// True when a and b are within the ratio r of each other.
bool Within(float r, float a, float b) { return r * a >= b && r * b >= a; }

// Keeps the run of neighbours (in the current order) that pass the pitch
// ratio test and carries the most energy; moves it to the front and returns
// its former position.
int ChainPick(RunEntry* entries, int* count) {
  float best_sum = kLowestSum;
  int best_first = 0;
  int best_size = 0;
  int first = 0;
  while (first < *count) {
    int last = first;
    float sum = entries[first].energy;
    while (last + 1 < *count &&
           Within(kPitchNeighbourRatio, entries[last].pitch, entries[last + 1].pitch)) {
      ++last;
      sum += entries[last].energy;
    }
    if (sum > best_sum) {
      best_sum = sum;
      best_first = first;
      best_size = last - first + 1;
    }
    first = last + 1;
  }
  std::memmove(entries, entries + best_first, best_size * sizeof(RunEntry));
  *count = best_size;
  return best_first;
}

// Moves pc by a whole factor towards the reference pitch h, so that a halved
// or doubled period does not break the contour.
float OctaveFold(float pc, float h) {
  if (h == pc) return pc;
  const bool up = h > pc;
  const float hi = up ? h : pc;
  const float lo = up ? pc : h;
  int n = static_cast<int>(hi / lo);
  const float e1 = up ? (h - n * pc) / (n * pc + h) : (pc - n * h) / (n * pc + h);
  const float e2 = ((n + 1) * lo - hi) / ((n + 1) * lo + hi);
  float e = e1;
  if (e1 > e2) {
    ++n;
    e = e2;
  }
  if (n == 2 && kFoldBiasFactor * e > (hi - lo) / (h + pc)) n = 1;
  return up ? n * pc : pc / n;
}

// Picks the pitch of the centre frame from the voiced run around it, or 0.
float SelectPitch(const ToneState* s) {
  const float* pitch = s->pitch_win;
  const float pc = pitch[kSelectCentre];
  if (pc == 0.0f) return 0.0f;
  int start = kSelectCentre;
  while (start > 0 && pitch[start - 1] != 0.0f) --start;
  int end = kSelectCentre;
  while (end < kToneSelectFrames - 1 && pitch[end + 1] != 0.0f) ++end;
  int count = end - start + 1;
  if (count == 1) return 0.0f;
  if (count == 2) {
    return Within(kPitchNeighbourRatio, pitch[start], pitch[end]) ? pc : 0.0f;
  }
  RunEntry entries[kToneSelectFrames];
  for (int i = 0; i < count; ++i) {
    entries[i] = {i, pitch[start + i], s->energy_win[start + i]};
  }
  SortEntries(entries, count, &RunEntry::pitch);
  ChainPick(entries, &count);
  SortEntries(entries, count, &RunEntry::index);
  const int shift = ChainPick(entries, &count);
  const int q = std::clamp((kSelectCentre - start) - shift, 0, count - 1);
  return OctaveFold(pc, entries[q].pitch);
}

// Repairs the middle of three selected pitches against its neighbours.
float RepairMiddle(const float* w) {
  const float a = w[0];
  const float m = w[1];
  const float b = w[2];
  if (a != 0.0f && m != 0.0f && b != 0.0f && Within(kRepairOuterRatio, a, b)) {
    const float mean = (a + b) / 2;
    return Within(kPitchNeighbourRatio, mean, m) ? m : mean;
  }
  if (a != 0.0f && b != 0.0f && m == 0.0f && Within(kPitchNeighbourRatio, a, b)) {
    return (a + b) / 2;
  }
  if (a == 0.0f && m != 0.0f && b != 0.0f && !Within(kPitchNeighbourRatio, m, b)) {
    return 0.0f;
  }
  if (a != 0.0f && m != 0.0f && b == 0.0f && !Within(kPitchNeighbourRatio, a, m)) {
    return 0.0f;
  }
  return m;
}

// Bridges unvoiced frames with a straight line in Hz towards the next voiced
// frame, or back to the reference when none is in sight. Returns ln Hz.
float InterpolateGap(ToneState* s) {
  float* w = s->interp7;
  const float x0 = w[0];
  if (x0 == 0.0f) {
    w[1] = kReferenceHz;
    return std::log(kReferenceHz);
  }
  int k = 2;
  while (k < kInterpLookAhead && w[k] == 0.0f) ++k;
  if (w[1] == 0.0f) {
    const float target = w[k] != 0.0f ? w[k] : kReferenceHz;
    if (std::fabs(x0 - kReferenceHz) > 0.1f && std::fabs(target - kReferenceHz) < 1e-6f &&
        k == kInterpLookAhead) {
      const float next = x0 + s->slope;
      const bool nearer = std::fabs(next - kReferenceHz) < std::fabs(x0 - kReferenceHz);
      w[1] = nearer ? next : x0;
    } else {
      s->slope = (target - x0) / k;
      w[1] = x0 + s->slope;
    }
  } else if (k == kInterpLookAhead && w[k] == 0.0f) {
    s->slope = (kReferenceHz - w[1]) / kInterpLookAhead;
  }
  return std::log(w[1]);
}

// Summed in double so that a window of equal values has exactly that mean:
// a steady contour then normalises to an exact zero.
template <int N>
float NonZeroMean(const float (&window)[N]) {
  double sum = 0.0;
  int count = 0;
  for (float v : window) {
    if (v != 0.0f) {
      sum += v;
      ++count;
    }
  }
  return count > 0 ? static_cast<float>(sum / count) : 0.0f;
}

// Writes the centre value of the window and its first three regression
// derivatives.
void Derivatives(const float (&window)[kToneDeltaFrames], float out[kToneValuesPerFrame]) {
  float rows[kDeltaOrders + 1][kToneDeltaFrames] = {};
  std::memcpy(rows[0], window, sizeof(window));
  for (int r = 1; r <= kDeltaOrders; ++r) {
    const float* prev = rows[r - 1];
    for (int j = 2 * r; j < kToneDeltaFrames - 2 * r; ++j) {
      rows[r][j] = (2 * (prev[j + 2] - prev[j - 2]) + (prev[j + 1] - prev[j - 1])) / 10.0f;
    }
  }
  for (int r = 0; r <= kDeltaOrders; ++r) out[r] = rows[r][kDeltaCentre];
}

}  // namespace

void ToneStateInit(ToneState* s) {
  s->out_base = 0;
  ToneStateReset(s);
}

void ToneStateReset(ToneState* s) {
  const int32_t out_base = s->out_base;
  std::memset(s, 0, sizeof(*s));
  s->out_base = out_base;
  s->delay = kToneDelayFrames;
  std::fill(std::begin(s->energy_win), std::end(s->energy_win), kSilentLogEnergy);
}

void ToneStatePush(ToneState* s, float pitch_period, float log_energy) {
  ++s->pushed;
  PushWindow(s->pitch_win, pitch_period);
  PushWindow(s->energy_win, log_energy);
  PushWindow(s->smooth3, SelectPitch(s));
  const float period = RepairMiddle(s->smooth3);
  PushWindow(s->interp7, period == 0.0f ? 0.0f : kPitchSampleRateHz / period);
  PushWindow(s->norm101, InterpolateGap(s));
  PushWindow(s->avg5, s->norm101[kNormCurrent] - NonZeroMean(s->norm101));
  PushWindow(s->delta13, NonZeroMean(s->avg5));
  if (s->pushed > s->delay) {
    float values[kToneValuesPerFrame];
    Derivatives(s->delta13, values);
    // Past a full buffer frames are lost rather than written out of bounds.
    for (float v : values) {
      if (s->out_count < kToneOutFloats) {
        s->out_buf[s->out_count++] = v == 0.0f ? kZeroStandIn : v;
      }
    }
  }
  if (s->out_count > kToneOutFloats - 1) {
    std::printf("Post-processing feature buffer exceeded!");
  }
}

int ToneStateTake(ToneState* s, float* dst) {
  if (dst != nullptr) {
    std::memcpy(dst, s->out_buf, s->out_count * sizeof(float));
  }
  const int frames = s->out_count / kToneValuesPerFrame;
  s->out_count = 0;
  return frames;
}

int ToneStatePending(const ToneState* s) { return std::min(s->pushed, s->delay); }

int ToneStateFlush(ToneState* s, float* dst) {
  if (s->pushed < s->delay) s->delay = s->pushed;
  int taken = 0;
  for (int i = 0; i < s->delay; ++i) {
    ToneStatePush(s, 0.0f, kSilentLogEnergy);
    float* at =
        dst != nullptr ? dst + s->out_base + (s->out_base + kToneValuesPerFrame) * i : nullptr;
    taken += ToneStateTake(s, at);
  }
  ToneStateReset(s);
  return taken;
}
