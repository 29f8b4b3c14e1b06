// SPDX-License-Identifier: Apache-2.0
// Tone features for the voice activity pipeline: frames a 16 kHz stream into
// 10 ms frames, runs the pitch tracker on them and writes the delayed,
// scaled tone values into the caller's frame-major feature matrix.
#ifndef QUELLAN_VORTAF0INTERFACE_H_
#define QUELLAN_VORTAF0INTERFACE_H_

#include <cstdint>

#include "pitch_tracker.h"
#include "quellan_conf.h"

// One flat block (no further allocations); the owner creates it with new.
class Vortaf0Interface {
 public:
  // Copies the tone dimension count and scale; the wave capacity is not
  // needed, all storage is inside the object.
  Vortaf0Interface(const PitchConf& conf, int wave_capacity);

  // Places the tone values at `base` within each output frame vector, which
  // then holds `base` + dimension count floats.
  void SetToneFeatureOffset(int base);

  // Tone values written per frame.
  int GetToneFeatureDim() const { return m_tone_dim; }

  // Runs `count` samples (0 allowed) through the tracker; samples short of a
  // frame wait for the next call. Writes ready frames to `features` (at most
  // `maxFrames`, frame k at k * stride + offset; a full matrix drops frames
  // with a message) and their count to `framesWritten`. With `rawF0`
  // non-null stores the raw pitch period of every analysed frame (at most
  // `rawF0Capacity`) and their count to `rawF0Count` when that is non-null.
  // Returns 0, or -1 when `rawF0` is full.
  int ExtractToneFeature(const int16_t* samples, int count, float* features, int maxFrames,
                         int* framesWritten, float* rawF0, int rawF0Capacity, int* rawF0Count);

  // Moves at most one ready frame to row `*frameCounter` of `features` and
  // advances the counter. Returns 0, or -1 when the row is beyond
  // `maxFrames` (the frame is dropped).
  int GetToneFeature(int* frameCounter, float* features, int maxFrames);

  // Writes the frames the post-processing still holds back; `framesWritten`
  // gets their count. Returns 0.
  int EndToneFeature(float* features, int maxFrames, int* framesWritten);

  // Starts a new stream; offset, stride, dimension count and scale stay.
  void ResetToneFeature();

 private:
  PitchTracker m_tracker;
  int32_t m_tone_dim;
  float m_tone_scale;
};

#endif  // QUELLAN_VORTAF0INTERFACE_H_
