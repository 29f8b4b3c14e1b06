// SPDX-License-Identifier: Apache-2.0
// Speech/noise decision, low/high balance and 2 kHz low-pass signal for the
// pitch tracker, one call each per analysed frame.
#ifndef QUELLAN_VOICING_DETECTOR_H_
#define QUELLAN_VOICING_DETECTOR_H_

#include <cstdint>

constexpr int kMelBands = 23;
constexpr int kPowerBins = 129;
constexpr int kLastBin = kPowerBins - 1;
constexpr int kAnalysisSamples = 200;
constexpr int kPitchSamples2kHz = 80;
constexpr int kFilteredHistorySamples = 320;

// Plain record, cleared by VoicingReset.
struct VoicingState {
  uint8_t forced_update;  // set by the noise update control for the next frame
  int16_t thr_high;       // score above which the level tracks the signal
  int16_t thr_voice;      // score above which a frame is voiced
  int16_t stationary_frames;
  int16_t repeat_count;
  int16_t trigger_frames;  // voiced run that arms the hangover
  int16_t voiced_run;
  int16_t hangover_frames;
  int16_t hangover_left;
  int32_t frame_count;
  float noise_level_db;
  float level_smoothing;
  float balance;  // smoothed low/high frequency ratio
  float band_energy[kMelBands];
  float noise_energy[kMelBands];
  float band_db[kMelBands];
  float prev_band_db[kMelBands];
  float filtered[kFilteredHistorySamples];  // low-pass output at 8 kHz
};

// Same as VoicingReset; kept apart so that initialisation reads as such.
void VoicingInit(VoicingState* s);

// Clears the noise tracking and filter history and restores the thresholds.
void VoicingReset(VoicingState* s);

// Scores the mel energies of one analysed frame against the noise estimate.
// Returns 1 for voiced, 0 otherwise.
int DetectVoicing(VoicingState* s, const float mel_energies[kMelBands]);

// Updates the low/high balance from an unvoiced frame's power spectrum and
// frame energy. Returns 1 when low frequencies dominate, else 0.
int DetectRestart(VoicingState* s, int voiced, const float power[kPowerBins], float energy);

// Low-pass filters the newest 80 of the 200 decimated samples (all 200 on the
// first frame) and writes the last 40 ms at 2 kHz to `out_2khz`. Call after
// DetectVoicing of the same frame.
void FilterForPitch(VoicingState* s, int restart, const float analysis[kAnalysisSamples],
                    float out_2khz[kPitchSamples2kHz]);

#endif  // QUELLAN_VOICING_DETECTOR_H_
