// SPDX-License-Identifier: Apache-2.0
#include "voicing_detector.h"

#include <algorithm>
#include <cmath>
#include <cstring>

namespace {

constexpr int kOpenFrames = 10;  // frames that always adapt the noise
constexpr int kPeakySkipBands = 4;
constexpr float kPeakyDb = 10.0f;
constexpr float kEnergyFloor = 5000.0f;
constexpr float kEnergyNew = 0.55f;
constexpr float kEnergyOld = 0.45f;
constexpr float kOpenNoiseNew = 0.3f;
constexpr float kOpenNoiseOld = 0.7f;
constexpr float kForcedNoiseNew = 0.1f;
constexpr float kForcedNoiseOld = 0.9f;
constexpr float kScoreOffsetDb = 0.1875f;
constexpr float kScoreStepDb = 0.375f;
constexpr int kScoreEntries = 90;
constexpr float kLevelSmoothLoud = 0.9f;
constexpr float kLevelSmoothQuiet = 0.7f;
// Makes an open frame's level land on the noisiest table row.
constexpr double kOpenSignal = 1e9;
constexpr float kFactorStep = 0.003f;
constexpr float kFactorMin = 0.95f;
constexpr float kFactorMax = 0.998f;
constexpr float kLevelStepDb = 1.5f;
constexpr int kLevelRows = 20;
constexpr double kStableChangeDb = 70.0;
constexpr int kStationaryFrames = 499;
constexpr int kRepeatLimit = 9;
constexpr int16_t kEarlyVoiceThreshold = 32;

constexpr int16_t kInitThrHigh = 217;
constexpr int16_t kInitThrVoice = 56;
constexpr int16_t kInitTriggerFrames = 6;
constexpr int16_t kInitHangoverFrames = 28;
constexpr float kInitLevelSmoothing = 0.95f;
constexpr float kInitBalance = 1.9f;
constexpr double kRestartBalance = 1.9;

constexpr int kLowBins = 13;  // bins 0 .. 12, up to about 400 Hz
constexpr float kRestartMinEnergyPerBin = 500.0f;
constexpr float kFftHalf = 128.0f;
constexpr float kNoHighRatio = 10.0f;
constexpr float kBalanceNew = 0.01f;
constexpr float kBalanceOld = 0.99f;

constexpr int kDecimation = 4;  // 8 kHz to 2 kHz
constexpr int kHopSamples = 80;
constexpr int kFirstRunSamples = kAnalysisSamples - kHopSamples;
constexpr int kMaxOrder = 7;

constexpr float kBandWeight[kMelBands] = {0.3333f, 0.3333f, 0.2857f, 0.2857f, 0.2857f, 0.25f,
                                          0.25f,   0.2222f, 0.2f,    0.2f,    0.2f,    0.1818f,
                                          0.1667f, 0.1538f, 0.1429f, 0.1429f, 0.1333f, 0.1176f,
                                          0.1111f, 0.1111f, 0.1f,    0.0909f, 0.087f};

constexpr int16_t kSnrScore[kScoreEntries] = {
    1,  1,  1,  1,  1,  1,  2,  2,  2,  2,  2,  3,  3,  3,  3,  3,  4,  4,  4,  5,  5,  5,  6,
    6,  7,  7,  7,  8,  8,  9,  9,  10, 10, 11, 12, 12, 13, 13, 14, 15, 15, 16, 17, 17, 18, 19,
    20, 20, 21, 22, 23, 24, 24, 25, 26, 27, 28, 28, 29, 30, 31, 32, 33, 34, 35, 36, 37, 37, 38,
    39, 40, 41, 42, 43, 44, 45, 46, 47, 48, 49, 50, 50, 50, 50, 50, 50, 50, 50, 50, 50};

struct LevelRow {
  int16_t forced_update;
  int16_t thr_high;
  int16_t thr_voice;
  int16_t trigger_frames;
  int16_t hangover_frames;
};

constexpr LevelRow kLevelTable[kLevelRows] = {
    {31, 36, 32, 2, 54},  {32, 43, 34, 2, 52},  {33, 52, 36, 3, 50},  {34, 62, 38, 3, 48},
    {35, 73, 40, 4, 46},  {36, 86, 42, 4, 44},  {37, 101, 44, 4, 42}, {37, 117, 46, 4, 40},
    {37, 134, 48, 5, 38}, {37, 153, 50, 5, 36}, {37, 173, 52, 5, 34}, {37, 194, 54, 5, 32},
    {37, 217, 55, 5, 30}, {37, 242, 56, 5, 28}, {37, 268, 57, 6, 26}, {38, 295, 57, 6, 24},
    {38, 295, 58, 6, 22}, {38, 295, 58, 6, 20}, {38, 295, 58, 6, 18}, {38, 295, 58, 6, 16}};

constexpr float kTilt[kPowerBins] = {
    0.0f,       0.00148429f, 0.00323681f, 0.00615651f, 0.0102416f, 0.0154897f, 0.0218976f,
    0.0294614f, 0.0381766f,  0.0480379f,  0.0590394f,  0.0711744f, 0.0844358f, 0.0988153f,
    0.114305f,  0.130894f,   0.148574f,   0.167333f,   0.187161f,  0.208045f,  0.229973f,
    0.252931f,  0.276906f,   0.301884f,   0.327849f,   0.354785f,  0.382677f,  0.411508f,
    0.44126f,   0.471915f,   0.503455f,   0.535861f,   0.569113f,  0.603191f,  0.638076f,
    0.673745f,  0.710177f,   0.747351f,   0.785243f,   0.823832f,  0.863094f,  0.903005f,
    0.943541f,  0.984677f,   1.02639f,    1.06865f,    1.11144f,   1.15473f,   1.19849f,
    1.2427f,    1.28733f,    1.33236f,    1.37775f,    1.42348f,   1.46952f,   1.51584f,
    1.56242f,   1.60923f,    1.65624f,    1.70342f,    1.75075f,   1.79818f,   1.84571f,
    1.89329f,   1.9409f,     1.98851f,    2.03609f,    2.08362f,   2.13105f,   2.17838f,
    2.22556f,   2.27257f,    2.31938f,    2.36596f,    2.41228f,   2.45832f,   2.50405f,
    2.54944f,   2.59447f,    2.6391f,     2.68331f,    2.72707f,   2.77036f,   2.81315f,
    2.85541f,   2.89712f,    2.93826f,    2.9788f,     3.01871f,   3.05797f,   3.09656f,
    3.13445f,   3.17162f,    3.20806f,    3.24372f,    3.27861f,   3.31269f,   3.34594f,
    3.37835f,   3.40989f,    3.44054f,    3.47029f,    3.49912f,   3.52701f,   3.55395f,
    3.57992f,   3.60489f,    3.62887f,    3.65183f,    3.67376f,   3.69464f,   3.71447f,
    3.73323f,   3.75091f,    3.7675f,     3.78298f,    3.79736f,   3.81063f,   3.82276f,
    3.83376f,   3.84362f,    3.85234f,    3.8599f,     3.86631f,   3.87156f,   3.87564f,
    3.87856f,   3.88032f,    3.8809f};

struct LowPass {
  int order;
  float a[kMaxOrder + 1];
  float b[kMaxOrder + 1];
};

// Cut-off near 800 Hz with a rising low-frequency boost (+12 dB at DC), so
// that weak fundamentals stand out in the 2 kHz signal.
constexpr LowPass kLowPass7 = {
    7,
    {1.0f, -4.47943497f, 8.88015842f, -10.0582161f, 6.99836874f, -2.98181963f, 0.718503177f,
     -0.075380832f},
    {0.000340537692f, 0.00183890329f, 0.00388212921f, 0.0037459142f, 0.00102161302f,
     -0.00102161302f, -0.000885397894f, -0.000204322598f}};

// Flat pass band up to about 700 Hz: low frequencies already dominate when
// the restart flag is set.
constexpr LowPass kLowPass6 = {
    6,
    {1.0f, -3.57943487f, 5.65866709f, -4.965415f, 2.529495f, -0.705274105f, 0.0837564766f, 0.0f},
    {0.000340539991f, 0.00204322999f, 0.00510805985f, 0.00681074988f, 0.00510805985f,
     0.00204322999f, 0.000340539991f, 0.0f}};

// Runs the filter over x[0 .. n), reading its input history from x[-order ..
// -1] and its output history from y[-order .. -1].
void RunLowPass(const LowPass& f, const float* x, int n, float* y) {
  for (int i = 0; i < n; ++i) {
    double acc = 0.0;
    for (int k = 0; k <= f.order; ++k) acc += f.b[k] * x[i - k];
    for (int k = 1; k <= f.order; ++k) acc -= f.a[k] * y[i - k];
    y[i] = static_cast<float>(acc);
  }
}

bool AdaptationOpen(const VoicingState* s) {
  return s->frame_count <= kOpenFrames || s->forced_update != 0;
}

float Db(float power_ratio) { return 10.0f * std::log10(power_ratio); }

}  // namespace

void VoicingInit(VoicingState* s) { VoicingReset(s); }

void VoicingReset(VoicingState* s) {
  std::memset(s, 0, sizeof(*s));
  s->thr_high = kInitThrHigh;
  s->thr_voice = kInitThrVoice;
  s->trigger_frames = kInitTriggerFrames;
  s->hangover_frames = kInitHangoverFrames;
  s->level_smoothing = kInitLevelSmoothing;
  s->balance = kInitBalance;
}

int DetectVoicing(VoicingState* s, const float mel_energies[kMelBands]) {
  ++s->frame_count;
  float* energy = s->band_energy;
  float* noise = s->noise_energy;
  for (int b = 0; b < kMelBands; ++b) {
    const float e = kBandWeight[b] * mel_energies[b];
    if (s->frame_count == 1) {
      energy[b] = std::max(kEnergyFloor, e);
      noise[b] = energy[b];
    } else {
      energy[b] = std::max(kEnergyFloor, kEnergyNew * e + kEnergyOld * energy[b]);
    }
    s->band_db[b] = Db(energy[b]);
  }

  float peak = 0.0f;
  float total = 0.0f;
  for (int b = 0; b < kMelBands; ++b) {
    if (b >= kPeakySkipBands) peak = std::max(peak, energy[b]);
    total += energy[b];
  }
  const float peakiness = Db(kMelBands * peak / total);
  const bool peaky = peakiness >= kPeakyDb;

  const bool open = AdaptationOpen(s);
  if (open) {
    for (int b = 0; b < kMelBands; ++b) {
      if (peaky) {
        noise[b] = kEnergyFloor;
      } else if (s->frame_count > 1) {
        noise[b] = kOpenNoiseNew * energy[b] + kOpenNoiseOld * noise[b];
      }
    }
    std::memcpy(s->prev_band_db, s->band_db, sizeof(s->band_db));
  }

  double change = 0.0;
  int16_t score = 0;
  for (int b = 0; b < kMelBands; ++b) {
    change += std::fabs(s->prev_band_db[b] - s->band_db[b]);
    const float snr_db = std::max(0.0f, Db(energy[b] / noise[b]));
    const int q = static_cast<int>((kScoreOffsetDb + snr_db) / kScoreStepDb);
    score = static_cast<int16_t>(score + kSnrScore[std::min(kScoreEntries - 1, q)]);
  }

  const bool loud = s->thr_high < score;
  const float alpha = loud ? kLevelSmoothLoud : kLevelSmoothQuiet;
  for (int b = 0; b < kMelBands; ++b) {
    s->prev_band_db[b] = (1 - alpha) * s->band_db[b] + alpha * s->prev_band_db[b];
  }

  double noise_total = 0.0;
  double signal_total = 0.0;
  for (int b = 0; b < kMelBands; ++b) {
    noise_total += noise[b];
    signal_total += std::max(energy[b], noise[b]);
  }
  if (open) {
    signal_total = kOpenSignal;
  } else if (!loud) {
    signal_total = noise_total;
  }
  const float level_db = signal_total > noise_total
                             ? static_cast<float>(10.0 * std::log10(signal_total / noise_total))
                             : 0.0f;
  if (open) {
    s->noise_level_db = level_db;
  } else if (loud) {
    s->noise_level_db =
        s->level_smoothing * s->noise_level_db + (1 - s->level_smoothing) * level_db;
    s->level_smoothing = std::min(s->level_smoothing + kFactorStep, kFactorMax);
  } else {
    s->level_smoothing = std::max(s->level_smoothing - kFactorStep, kFactorMin);
  }
  const int row = std::max(0, static_cast<int>(std::min(static_cast<float>(kLevelRows - 1),
                                                        s->noise_level_db / kLevelStepDb)));
  const LevelRow& level = kLevelTable[row];

  s->forced_update = 0;
  bool force = false;
  if (score < level.forced_update && !peaky && s->frame_count > kOpenFrames) {
    force = true;
    s->stationary_frames = 0;
  } else if (!peaky && change < kStableChangeDb) {
    ++s->stationary_frames;
    if (s->stationary_frames > kStationaryFrames) {
      s->forced_update = 1;
      force = true;
    }
  }
  if (s->stationary_frames == s->repeat_count) {
    ++s->repeat_count;
  } else {
    s->repeat_count = 0;
  }
  if (s->repeat_count > kRepeatLimit) s->repeat_count = 0;
  if (force) {
    for (int b = 0; b < kMelBands; ++b) {
      noise[b] = std::max(kEnergyFloor, kForcedNoiseOld * noise[b] + kForcedNoiseNew * energy[b]);
    }
  }

  int voiced =
      s->frame_count > kOpenFrames ? s->thr_voice < score : s->thr_voice < kEarlyVoiceThreshold;
  s->voiced_run = voiced ? s->voiced_run + 1 : 0;
  if (s->voiced_run >= s->trigger_frames) {
    s->voiced_run = s->trigger_frames;
    s->hangover_left = s->hangover_frames;
  }
  if (!voiced && s->hangover_left > 0) voiced = 1;
  if (s->hangover_left > 0) --s->hangover_left;

  s->thr_high = level.thr_high;
  s->thr_voice = level.thr_voice;
  s->trigger_frames = level.trigger_frames;
  s->hangover_frames = level.hangover_frames;
  return voiced;
}

int DetectRestart(VoicingState* s, int voiced, const float power[kPowerBins], float energy) {
  if (voiced != 1 && energy / kFftHalf >= kRestartMinEnergyPerBin) {
    float low = 0.0f;
    float high = 0.0f;
    for (int k = 0; k < kPowerBins; ++k) {
      const float w = power[k] * kTilt[k];
      float& side = k < kLowBins ? low : high;
      side = std::max(side, w);
    }
    const float ratio = high == 0.0f ? kNoHighRatio : low / high;
    s->balance = kBalanceNew * ratio + kBalanceOld * s->balance;
  }
  return static_cast<double>(s->balance) > kRestartBalance ? 1 : 0;
}

void FilterForPitch(VoicingState* s, int restart, const float analysis[kAnalysisSamples],
                    float out_2khz[kPitchSamples2kHz]) {
  const LowPass& filter = restart ? kLowPass6 : kLowPass7;
  float* h = s->filtered;
  if (s->frame_count == 1) {
    // The stream starts from silence: zero input history ahead of sample 0.
    float input[kHopSamples + kFirstRunSamples] = {};
    std::memcpy(input + kHopSamples, analysis, kFirstRunSamples * sizeof(float));
    RunLowPass(filter, input + kHopSamples, kFirstRunSamples,
               h + kFilteredHistorySamples - kFirstRunSamples);
  }
  std::memmove(h, h + kHopSamples, (kFilteredHistorySamples - kHopSamples) * sizeof(float));
  RunLowPass(filter, analysis + kFirstRunSamples, kHopSamples,
             h + kFilteredHistorySamples - kHopSamples);
  for (int j = 0; j < kPitchSamples2kHz; ++j) out_2khz[j] = h[kDecimation * j];
}
