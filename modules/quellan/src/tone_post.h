// SPDX-License-Identifier: Apache-2.0
// Turns the per-frame pitch track into delayed, speaker-normalised log-pitch
// contours with three derivatives (four floats per 10 ms frame).
#ifndef QUELLAN_TONE_POST_H_
#define QUELLAN_TONE_POST_H_

#include <cstdint>

// A silent or unanalysed frame enters the post-processing as pitch 0 with
// this log energy.
constexpr float kSilentLogEnergy = -50.0f;
// Pitch values are periods in samples of the tracker's 8 kHz signal.
constexpr float kPitchSampleRateHz = 8000.0f;

constexpr int kToneValuesPerFrame = 4;
constexpr int kToneDelayFrames = 27;
constexpr int kToneOutFloats = 2000;
constexpr int kToneSelectFrames = 19;
constexpr int kToneRepairFrames = 3;
constexpr int kToneInterpFrames = 7;
constexpr int kToneNormFrames = 101;
constexpr int kToneAverageFrames = 5;
constexpr int kToneDeltaFrames = 13;

// Plain record, one per tracker; every window is a delay line, oldest first.
struct ToneState {
  int32_t out_base;  // float offset of the frames written by the flush
  int32_t pushed;
  int32_t delay;
  int32_t out_count;  // floats waiting in out_buf
  float slope;        // per-frame step of the gap interpolation
  float out_buf[kToneOutFloats];
  float pitch_win[kToneSelectFrames];
  float energy_win[kToneSelectFrames];
  float smooth3[kToneRepairFrames];
  float interp7[kToneInterpFrames];
  float norm101[kToneNormFrames];
  float avg5[kToneAverageFrames];
  float delta13[kToneDeltaFrames];
};

// Sets out_base to 0, then resets.
void ToneStateInit(ToneState* s);

// Empties all windows and the output, restores the delay; keeps out_base.
void ToneStateReset(ToneState* s);

// Pushes one frame: pitch period in 8 kHz samples (0 for unvoiced) and log
// energy. May append one output frame. Prints a warning while the output
// buffer is full; frames that no longer fit are dropped.
void ToneStatePush(ToneState* s, float pitch_period, float log_energy);

// Moves the waiting output to `dst` (ignored when null; room for all waiting
// floats is the caller's). Returns the number of frames taken.
int ToneStateTake(ToneState* s, float* dst);

// Frames pushed but still held back by the delay.
int ToneStatePending(const ToneState* s);

// Pushes silent frames until the held-back frames are out, writes them to
// `dst` (frame i at float out_base + (out_base + 4) * i), then resets.
// Returns the number of frames written.
int ToneStateFlush(ToneState* s, float* dst);

#endif  // QUELLAN_TONE_POST_H_
