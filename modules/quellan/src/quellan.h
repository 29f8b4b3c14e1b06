// SPDX-License-Identifier: Apache-2.0
// Voice activity pipeline: buffers a stream of 16 kHz chunks, turns them into
// PLP rows, lets the detector find speech intervals and copies the matching
// audio out.
#ifndef QUELLAN_QUELLAN_H_
#define QUELLAN_QUELLAN_H_

#include <cstdint>
#include <memory>
#include <vector>

#include "Vortaf0Interface.h"
#include "dnnvad.h"
#include "plp.h"
#include "quellan_conf.h"

class Cquellan {
 public:
  struct Interval {
    int begin_frame;  // absolute frames of the utterance, inclusive
    int end_frame;
    const int16_t* samples;
    int sample_count;
    bool closes;  // the segment ends with this interval
  };

  // Throws std::runtime_error("init vad failed") after printing the reason.
  explicit Cquellan(const QuellanConf& conf);

  // Processes one chunk. `index` counts the chunks of the utterance from 1,
  // 1 or -1 starts one, a negative value ends it. Writes the samples of the
  // last interval of the call to `out` (at most `out_capacity`) and its
  // flags; returns 0, or -1 when the chunk fails (outputs stay 0).
  int quellan_process(int index, const int16_t* samples, int len, int16_t* out, int out_capacity,
                      int* out_len, int* speech, int* continued, int* ended);

  // Prepares the next utterance; the detector resets itself on index 1/-1.
  int reset();

  // Intervals emitted by the last call, in order.
  int emitted_count() const { return m_seg_num; }
  Interval emitted(int i) const;

  // See Cdnnvad::set_frame_observer.
  void set_frame_observer(VadFrameObserver* observer) { m_vad->set_frame_observer(observer); }
  const PLP& feature_extractor() const { return *m_plp; }

 private:
  int extract_features(int index, int len, int* new_frames);
  // Writes the chunk's tone rows after the PLP columns; `plp_frames` is the
  // PLP row count after this chunk. Returns 0 or -1.
  int extract_tone(int index, const int16_t* samples, int len, int plp_frames);
  void append_history(const int16_t* samples, int len);
  // Limits samples [begin, end) of the utterance to those the ring holds.
  void clip_to_history(int64_t* begin, int64_t* end) const;
  // Copies samples [begin, end), at most `capacity`; returns the count.
  int copy_history(int64_t begin, int64_t end, int16_t* dst, int capacity) const;

  int m_max_frames;
  std::unique_ptr<int16_t[]> wav_reserve;  // audio not yet turned into rows
  int m_wav_len = 0;
  int64_t m_wav_start = 0;  // position of wav_reserve[0] in the utterance
  int m_wav_capacity;
  int m_frame_shift = 0;
  std::unique_ptr<float[]> m_feat;  // rows not yet consumed by the detector
  int m_feat_dim;
  std::unique_ptr<PLP> m_plp;
  int m_plp_dim = 0;
  int m_plp_frames = 0;
  int m_plp_delay = 0;
  int m_use_tone = 0;
  std::unique_ptr<Vortaf0Interface> m_tone;  // null without tone features
  int m_tone_dim = 0;                        // tone columns per row
  int m_tone_frames = 0;                     // rows that hold tone values
  std::unique_ptr<Cdnnvad> m_vad;
  // Ring of the latest audio at its position in the utterance; long enough
  // for every interval the detector can still report.
  std::unique_ptr<int16_t[]> m_wav_history;
  int64_t m_history_capacity;
  int64_t m_history_len = 0;  // samples of the utterance so far
  int m_open_calls = 0;       // calls that emitted parts of the open segment
  int out_wav_len;
  int out_wav_num;
  std::vector<std::unique_ptr<int16_t[]>> out_wav;
  std::unique_ptr<int[]> m_out_len;
  int m_cut_num = 0;
  std::unique_ptr<int[]> m_cut_frame;
  int m_seg_num = 0;
  std::unique_ptr<int[]> m_seg_beg;
  std::unique_ptr<int[]> m_seg_end;
};

#endif  // QUELLAN_QUELLAN_H_
