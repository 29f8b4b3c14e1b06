// SPDX-License-Identifier: Apache-2.0
#include "Vortaf0Interface.h"

#include <algorithm>
#include <cfloat>
#include <cstring>

#include "quellan_log.h"

namespace {

// Stands in a raw pitch slot until the tracker writes a decision over it.
constexpr float kRawF0Marker = FLT_MAX;

}  // namespace

Vortaf0Interface::Vortaf0Interface(const PitchConf& conf, int /*wave_capacity*/)
    : m_tone_dim(conf.tone_dim), m_tone_scale(conf.tone_scale) {
  PitchTrackerInit(&m_tracker);
}

void Vortaf0Interface::SetToneFeatureOffset(int base) {
  m_tracker.feature_offset = base;
  m_tracker.feature_stride = m_tone_dim + base;
}

int Vortaf0Interface::ExtractToneFeature(const int16_t* samples, int count, float* features,
                                         int maxFrames, int* framesWritten, float* rawF0,
                                         int rawF0Capacity, int* rawF0Count) {
  PitchTracker* t = &m_tracker;
  int written = 0;
  int raw_count = 0;
  int available = count + t->pending_count;
  const int16_t* frame = samples;
  bool from_pending = false;
  if (t->pending_count > 0) {
    const int taken = std::min(kPitchFrameSamples, count);
    if (t->pending_count + taken >= kPitchFrameSamples) {
      std::memcpy(t->pending + t->pending_count, samples, sizeof(int16_t) * taken);
      frame = t->pending;
      from_pending = true;
    }
  }
  while (available >= kPitchFrameSamples) {
    if (rawF0 != nullptr) {
      if (raw_count >= rawF0Capacity) {
        QUELLAN_WARN("Too many frames for raw f0. [%d/%d].\n", raw_count, rawF0Capacity);
        return -1;
      }
      rawF0[raw_count] = kRawF0Marker;
      AnalyseFrame(t, frame, &rawF0[raw_count]);
      // Silent frames and the frames that only fill the analysis buffer
      // leave no raw value.
      if (rawF0[raw_count] != kRawF0Marker) ++raw_count;
    } else {
      AnalyseFrame(t, frame, nullptr);
    }
    // A full matrix drops the frame; the stream goes on regardless.
    GetToneFeature(&written, features, maxFrames);
    available -= kPitchFrameSamples;
    if (from_pending) {
      frame = samples + (kPitchFrameSamples - t->pending_count);
      t->pending_count = 0;
      from_pending = false;
    } else {
      frame += kPitchFrameSamples;
    }
  }
  if (t->pending_count > 0) available -= t->pending_count;
  if (available >= 1) {
    std::memcpy(t->pending + t->pending_count, samples + count - available,
                sizeof(int16_t) * available);
    t->pending_count += available;
  }
  *framesWritten = written;
  if (rawF0Count != nullptr) *rawF0Count = raw_count;
  return 0;
}

int Vortaf0Interface::GetToneFeature(int* frameCounter, float* features, int maxFrames) {
  // Every push is followed by a take, so at most one frame is waiting.
  float ready[kToneValuesPerFrame];
  if (ToneStateTake(&m_tracker.post, ready) == 0) return 0;
  if (*frameCounter >= maxFrames) {
    QUELLAN_WARN("Two many Frames for tone. [%d/%d].\n", *frameCounter, maxFrames);
    return -1;
  }
  float* row = features + static_cast<size_t>(*frameCounter) * m_tracker.feature_stride +
               m_tracker.feature_offset;
  for (int d = 0; d < m_tone_dim; ++d) row[d] = ready[d] * m_tone_scale;
  ++*frameCounter;
  return 0;
}

int Vortaf0Interface::EndToneFeature(float* features, int maxFrames, int* framesWritten) {
  const int held_back = ToneStatePending(&m_tracker.post);
  int counter = 0;
  for (int i = 0; i < held_back; ++i) {
    ToneStatePush(&m_tracker.post, 0.0f, kSilentLogEnergy);
    GetToneFeature(&counter, features, maxFrames);
  }
  *framesWritten = counter;
  return 0;
}

void Vortaf0Interface::ResetToneFeature() { PitchTrackerReset(&m_tracker); }
