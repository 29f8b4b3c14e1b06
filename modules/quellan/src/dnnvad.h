// SPDX-License-Identifier: Apache-2.0
// Frame-level speech detector: network scores smoothed over time, gated by
// frame energy, turned into segments with a head margin, a minimum closing
// silence and cut points in the middle of that silence.
#ifndef QUELLAN_DNNVAD_H_
#define QUELLAN_DNNVAD_H_

#include <cstdint>
#include <memory>

#include "vad_dnn.h"

constexpr int kVadPathBytes = 256;

struct VadDnnConf {
  int32_t max_frames;
  int32_t head_margin;  // frames put before the first speech frame
  int32_t min_silence;  // non-speech frames that close a segment
  int32_t energy_gate;  // 1: the energy decision must agree as well
  float energy_threshold_db;
  int32_t win_size;     // energy window, samples
  int32_t shift;        // energy frame shift, samples
  float energy_smooth;  // weight of the previous smoothed energy
  char dnn_file[kVadPathBytes];
  char state_weights_file[kVadPathBytes];
  int32_t feat_dim;
  int32_t start_offset;  // left context frames of a network input
  int32_t end_offset;    // right context frames
  int32_t skip;          // frames skipped between network evaluations
  float score_smooth;    // weight of the previous smoothed score
  float score_threshold;
};

// Where add_wave_data reports a call's cut frames and emitted intervals
// (absolute frames, both ends inclusive). Each array has `capacity` entries.
struct VadOutputLists {
  int* cut_num;
  int* cut_frame;
  int* seg_num;
  int* seg_beg;
  int* seg_end;
  int capacity;
};

// What the detector saw and decided for one frame.
struct VadFrameReport {
  int frame;              // absolute frame of the utterance
  const float* features;  // the frame's feature row (feat_dim floats)
  int feat_dim;
  float score;        // network score the frame carries
  float smoothed;     // smoothed score the decision compares
  int energy_speech;  // energy gate's decision, 1 without the gate
  int speech;         // the frame's decision
};

// Sees every frame once, in order, as the detector decides it. Used to
// record training features and to inspect decisions; the detector runs the
// same without one.
class VadFrameObserver {
 public:
  virtual ~VadFrameObserver() = default;
  virtual void on_frame(const VadFrameReport& report) = 0;
};

class Cdnnvad {
 public:
  // Throws std::runtime_error("init vad failed") after printing the reason.
  explicit Cdnnvad(const VadDnnConf& conf);

  // Takes a chunk of audio and the rows of the caller's feature matrix that
  // are ready; `index` 1 or -1 starts an utterance, below 1 ends it. Sets
  // `*consumed` to the rows the caller may drop and returns it, or -1.
  // A chunk that completes no frame leaves `lists` untouched.
  int add_wave_data(int index, const int16_t* samples, int len, const float* feat, int feat_dim,
                    int plp_frames, int tone_frames, int* consumed, const VadOutputLists& lists);

  // Null (the default) switches observation off; the caller keeps the
  // observer alive while it is set.
  void set_frame_observer(VadFrameObserver* observer) { m_observer = observer; }

 private:
  struct DnnDeleter {
    void operator()(VadDnn* dnn) const { free_vaddnn(dnn); }
  };

  void reset();
  int client_detect_speech(int index, const int16_t* samples, int len);
  int detect_speech(const float* feat);
  void fill_frame_scores();
  void find_intervals();
  void report_frame(const float* feat, int i, bool energy_speech, bool speech) const;
  void segment_before_first_interval(const VadOutputLists& lists);
  void segment_between_intervals(const VadOutputLists& lists);
  void segment_after_last_interval(const VadOutputLists& lists);
  void cut_at(int frame, const VadOutputLists& lists);
  void open_interval(int begin, const VadOutputLists& lists);
  void close_interval(int end, const VadOutputLists& lists);

  int m_max_frames;
  int m_head_margin;
  int m_min_silence;
  std::unique_ptr<VadDnn, DnnDeleter> m_dnn;
  int m_feat_dim;
  int m_start_offset;
  int m_end_offset;
  int m_skip;
  float m_score_smooth;
  float m_threshold;
  std::unique_ptr<float[]> m_skip_score;
  std::unique_ptr<float[]> m_out_score;
  float m_last_score = 0.0f;  // carried across utterances
  std::unique_ptr<uint8_t[]> m_vad_flag;
  int m_interval_num = 0;
  std::unique_ptr<int[]> m_interval_beg;
  std::unique_ptr<int[]> m_interval_end;
  int m_avail_frames = 0;
  int m_first = 0;
  int m_last = 0;
  int m_score_num = 0;
  float m_smoothed = 0.0f;
  int m_next_eval = 0;   // absolute frame
  int m_frame_base = 0;  // absolute frame of feature row 0
  int m_eval_rel = 0;
  int m_in_speech = 0;
  int m_silence = 0;
  int m_energy_gate;
  int m_energy_threshold;
  float m_energy_smooth;
  float m_energy = 0.0f;
  int m_win_size;
  int m_shift;
  std::unique_ptr<int16_t[]> m_wav;
  int m_wav_len = 0;
  std::unique_ptr<uint8_t[]> m_client_vad_flag;
  VadFrameObserver* m_observer = nullptr;
};

#endif  // QUELLAN_DNNVAD_H_
