// SPDX-License-Identifier: Apache-2.0
// Pitch tracker frame driver: per 10 ms frame of 16 kHz PCM, a silence test,
// 2:1 decimation into a sliding 8 kHz analysis buffer, the windowed spectrum,
// frame energy and mel energies, the voicing decision and the pitch estimate,
// and one (pitch period, log energy) push into the tone post-processing.
#ifndef QUELLAN_PITCH_TRACKER_H_
#define QUELLAN_PITCH_TRACKER_H_

#include <cstdint>

#include "pitch_tracking.h"
#include "tone_post.h"
#include "voicing_detector.h"

constexpr int kPitchFrameSamples = 160;      // 10 ms at 16 kHz
constexpr int kPendingSamples = 320;         // room for two frames
constexpr int kAnalysisBufferSamples = 280;  // decimated, 8 kHz
constexpr int kMelEdges = kMelBands + 2;

// One flat block of plain memory: copying or clearing it is safe.
struct PitchTracker {
  uint32_t frame_counter;  // frames handed to AnalyseFrame since reset
  int32_t feature_offset;  // first tone value within an output frame vector
  int32_t feature_stride;  // floats per output frame vector
  int32_t pending_count;   // samples waiting in `pending` for a full frame
  int32_t fill;            // valid samples in `analysis`
  int16_t pending[kPendingSamples];
  float analysis[kAnalysisBufferSamples];
  float window[kAnalysisSamples];
  float mel_weights[kMelBands][kPowerBins];
  VoicingState voicing;
  PitchTrackingState tracking;
  ToneState post;
};

// Writes the 25 mel band edges, as bins of the 256-point spectrum.
void PitchMelEdges(int edges[kMelEdges]);

// Builds the window and the mel weights and initialises every stage.
void PitchTrackerInit(PitchTracker* t);

// Starts a new stream; keeps offset, stride, window and mel weights.
void PitchTrackerReset(PitchTracker* t);

// Analyses one frame of kPitchFrameSamples samples and pushes its pair into
// `t->post`. Writes the raw pitch period (8 kHz samples, 0 for unvoiced) to
// `raw_f0` only when a pitch decision is made; `raw_f0` may be null.
void AnalyseFrame(PitchTracker* t, const int16_t* frame, float* raw_f0);

#endif  // QUELLAN_PITCH_TRACKER_H_
