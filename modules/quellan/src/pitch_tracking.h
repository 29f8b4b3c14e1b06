// SPDX-License-Identifier: Apache-2.0
// Pitch estimate of one analysed frame: harmonic salience on the spectrum for
// candidates, normalised cross-correlation of the 2 kHz low-pass signal to
// weigh them, frame-to-frame continuity, then a refinement from the
// interpolated harmonic peaks. See PITCH_TRACKING.md.
#ifndef QUELLAN_PITCH_TRACKING_H_
#define QUELLAN_PITCH_TRACKING_H_

#include <cstdint>

#include "voicing_detector.h"

// Transform output of an analysed frame: Re/Im of bins 1 .. 127 interleaved,
// then the real bin 128.
constexpr int kTransformFloats = 255;
// Frames during which the track is not trusted after a restart.
constexpr int32_t kRestartDistrustFrames = 19;

// Plain record, part of the tracker block.
struct PitchTrackingState {
  int32_t distrust_frames;      // analysed frames left before the track counts
  int32_t track_frames;         // consecutive frames with an estimate
  float tracked_period;         // last estimate in 8 kHz samples, 0 without
  float amplitude[kPowerBins];  // |X[k]| of the latest analysed frame
};

// Clears the track and the spectrum.
void PitchTrackingReset(PitchTrackingState* s);

// Takes in every analysed frame's transform output. `spectral_level` is
// accepted as the frame driver computes it; this method does not need it.
void PitchTrackingUpdate(PitchTrackingState* s, const float transform[kTransformFloats],
                         float spectral_level);

// Ends the track: the next estimate starts without continuity.
void PitchTrackingBreak(PitchTrackingState* s);

// Estimates the pitch of the frame last given to PitchTrackingUpdate from its
// power spectrum and the 80 low-pass samples at 2 kHz. Returns the period in
// samples of the 8 kHz signal, or 0 when no candidate is periodic enough.
float PitchTrackingEstimate(PitchTrackingState* s, const float power[kPowerBins],
                            const float filtered_2khz[kPitchSamples2kHz]);

#endif  // QUELLAN_PITCH_TRACKING_H_
