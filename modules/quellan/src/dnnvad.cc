// SPDX-License-Identifier: Apache-2.0
#include "dnnvad.h"

#include <algorithm>
#include <cmath>
#include <cstring>

#include "alloc_zeroed.h"
#include "quellan_log.h"

Cdnnvad::Cdnnvad(const VadDnnConf& conf)
    : m_max_frames(conf.max_frames),
      m_head_margin(conf.head_margin),
      m_min_silence(conf.min_silence),
      m_feat_dim(conf.feat_dim),
      m_start_offset(conf.start_offset),
      m_end_offset(conf.end_offset),
      m_skip(conf.skip),
      m_score_smooth(conf.score_smooth),
      m_threshold(conf.score_threshold),
      m_energy_gate(conf.energy_gate),
      m_energy_threshold(static_cast<int>(conf.energy_threshold_db)),
      m_energy_smooth(conf.energy_smooth),
      m_win_size(conf.win_size),
      m_shift(conf.shift) {
  if (m_max_frames < 1 || m_shift < 1 || m_win_size < 1 || m_skip < 0 || m_feat_dim < 1 ||
      m_head_margin < 0 || m_min_silence < 1 || m_start_offset < 0 || m_end_offset < 0) {
    QUELLAN_INIT_FAIL("Invalid detector settings.\n");
  }
  const size_t frames = static_cast<size_t>(m_max_frames);
  if (m_energy_gate == 1) {
    m_wav = alloc_zeroed<int16_t>(frames * m_shift);
    if (!m_wav) QUELLAN_INIT_FAIL("Failed to alloc memory for m_wav.\n");
    m_client_vad_flag = alloc_zeroed<uint8_t>(frames);
    if (!m_client_vad_flag) QUELLAN_INIT_FAIL("Failed to alloc memory for m_client_vad_flag\n");
  }
  m_dnn.reset(load_vaddnn_file(conf.dnn_file));
  if (!m_dnn) QUELLAN_INIT_FAIL("Failed to load vad dnn file[%s].\n", conf.dnn_file);
  if (set_vaddnn_params(m_dnn.get(), m_max_frames, m_start_offset, m_end_offset) != 0) {
    QUELLAN_INIT_FAIL("Failed to set_dnn_params\n");
  }
  if (load_vaddnn_state_weights(m_dnn.get(), conf.state_weights_file) < 0) {
    QUELLAN_INIT_FAIL("Failed to load state-weights file[%s].\n", conf.state_weights_file);
  }
  if (!(m_skip_score = alloc_zeroed<float>(frames))) {
    QUELLAN_INIT_FAIL("Failed to alloc m_skip_score.\n");
  }
  if (!(m_out_score = alloc_zeroed<float>(frames))) {
    QUELLAN_INIT_FAIL("Failed to alloc m_out_score.\n");
  }
  if (!(m_vad_flag = alloc_zeroed<uint8_t>(frames))) {
    QUELLAN_INIT_FAIL("Failed to alloc m_vad_flag.\n");
  }
  if (!(m_interval_beg = alloc_zeroed<int>(frames))) {
    QUELLAN_INIT_FAIL("Failed to alloc m_interval_beg.\n");
  }
  if (!(m_interval_end = alloc_zeroed<int>(frames))) {
    QUELLAN_INIT_FAIL("Failed to alloc m_interval_end.\n");
  }
}

void Cdnnvad::reset() {
  m_avail_frames = 0;
  m_first = 0;
  m_last = 0;
  m_interval_num = 0;
  m_smoothed = m_threshold - 1.0f;
  const size_t frames = static_cast<size_t>(m_max_frames);
  std::fill_n(m_vad_flag.get(), frames, 0);
  std::fill_n(m_out_score.get(), frames, 0.0f);
  std::fill_n(m_skip_score.get(), frames, 0.0f);
  std::fill_n(m_interval_beg.get(), frames, 0);
  std::fill_n(m_interval_end.get(), frames, 0);
  m_next_eval = 0;
  m_frame_base = 0;
  m_in_speech = 0;
  m_silence = 0;
  m_energy = 0.0f;
  m_wav_len = 0;
  if (m_energy_gate == 1) {
    std::fill_n(m_wav.get(), frames * m_shift, 0);
    std::fill_n(m_client_vad_flag.get(), frames, 0);
  }
}

int Cdnnvad::add_wave_data(int index, const int16_t* samples, int len, const float* feat,
                           int feat_dim, int plp_frames, int tone_frames, int* consumed,
                           const VadOutputLists& lists) {
  if (index == 1 || index == -1) reset();
  if (samples == nullptr || len < 0 || feat == nullptr || feat_dim < 1 || plp_frames < 0 ||
      tone_frames < 0 || plp_frames > m_max_frames || tone_frames > m_max_frames ||
      consumed == nullptr) {
    // compat: "Invalide" is the established spelling of this message; hosts match the text.
    QUELLAN_WARN("Invalide input arguments to Cdnnvad::AddWaveData\n");
    return -1;
  }
  if (m_energy_gate == 1) {
    const int64_t capacity = static_cast<int64_t>(m_shift) * m_max_frames;
    const int64_t total = static_cast<int64_t>(m_wav_len) + len;
    if (total >= capacity) {
      QUELLAN_WARN("Wav overflows [%lld] >= [%lld]\n", static_cast<long long>(total),
                   static_cast<long long>(capacity));
      return -1;
    }
    std::memcpy(m_wav.get() + m_wav_len, samples, sizeof(int16_t) * len);
    m_wav_len += len;
  }
  const int available = std::min(plp_frames, tone_frames);
  // Only the last chunk may use frames whose right context never comes.
  m_last = index < 0 ? available - 1 : available - 1 - m_end_offset;
  if (m_first > m_last) {
    *consumed = 0;
    return 0;
  }
  m_avail_frames = available;
  if (m_energy_gate == 1 && client_detect_speech(index, samples, len) < 0) {
    QUELLAN_WARN("Failed to do client_detect_speech.\n");
    return -1;
  }
  if (detect_speech(feat) < 0) {
    QUELLAN_WARN("failed to detect speech.\n");
    return -1;
  }
  *lists.cut_num = 0;
  *lists.seg_num = 0;
  segment_before_first_interval(lists);
  segment_between_intervals(lists);
  segment_after_last_interval(lists);
  if (m_last + 1 < m_start_offset) {
    *consumed = 0;
    m_first = m_last + 1;
  } else {
    // The last start_offset frames stay as left context of the next batch.
    *consumed = m_last + 1 - m_start_offset;
    m_first = m_start_offset;
  }
  m_frame_base += *consumed;
  return *consumed;
}

int Cdnnvad::client_detect_speech(int index, const int16_t* samples, int len) {
  if (samples == nullptr || len < 1) {
    // compat: "Invalide" is the established spelling of this message; hosts match the text.
    QUELLAN_WARN("Invalide input arguments for client_detect_speech\n");
    return -1;
  }
  const int frames = m_last - m_first + 1;
  // Each frame's sum starts from the previous frame's level in dB.
  // compat: the sum is not cleared between frames; clearing it moves every energy-gate decision.
  float acc = 0.0f;
  for (int j = 0; j < frames; ++j) {
    const int sta = j * m_shift;
    // Audio that never arrived ends the pass; the frames left keep their
    // earlier decisions and the buffer is not advanced.
    if (sta + m_win_size > m_wav_len) {
      QUELLAN_WARN("Overflows. sta[%d]+m_win_size[%d] m_wav_len[%d]\n", sta, m_win_size, m_wav_len);
      return 0;
    }
    const int16_t* window = m_wav.get() + sta;
    for (int i = 0; i < m_win_size; ++i) {
      acc += static_cast<float>(window[i] * window[i]);
    }
    const float mean = acc / m_win_size;
    if ((index == 1 || index == -1) && j == 0) m_energy = mean;
    m_energy = (1.0f - m_energy_smooth) * mean + m_energy_smooth * m_energy;
    const float db = static_cast<float>(10.0 * std::log10(static_cast<double>(m_energy) + 1.0));
    acc = db;
    m_client_vad_flag[j] = db >= static_cast<float>(m_energy_threshold) ? 1 : 0;
  }
  const int used = frames * m_shift;
  std::memmove(m_wav.get(), m_wav.get() + used, sizeof(int16_t) * (m_wav_len - used));
  m_wav_len -= used;
  return 0;
}

int Cdnnvad::detect_speech(const float* feat) {
  m_eval_rel = m_next_eval - m_frame_base;
  if (set_vaddnn_feature(m_dnn.get(), feat, m_feat_dim, m_eval_rel, m_first, m_last, m_avail_frames,
                         m_skip, &m_score_num) < 0) {
    QUELLAN_WARN("Failed to set vad dnn feature data.\n");
    return -1;
  }
  // A short batch may hold no frame due for evaluation; its frames then
  // carry the last score like the frames before the first evaluation.
  if (m_score_num > 0 && calc_vaddnn_prob(m_dnn.get(), m_score_num, m_skip_score.get()) < 0) {
    QUELLAN_WARN("Failed to calculate vad dnn score.\n");
    return -1;
  }
  fill_frame_scores();
  const int frames = m_last - m_first + 1;
  for (int i = 0; i < frames; ++i) {
    m_smoothed = (1.0f - m_score_smooth) * m_out_score[i] + m_score_smooth * m_smoothed;
    const bool loud = m_energy_gate != 1 || m_client_vad_flag[i] == 1;
    const bool speech = m_smoothed > m_threshold && loud;
    m_vad_flag[i] = speech ? 1 : 0;
    if (m_observer != nullptr) report_frame(feat, i, loud, speech);
  }
  find_intervals();
  m_next_eval += (m_skip + 1) * m_score_num;
  return 0;
}

void Cdnnvad::fill_frame_scores() {
  float* out = m_out_score.get() - m_first;  // indexed by batch frame
  const int eval_start = std::max(m_first, m_eval_rel);
  int f = m_first;
  for (; f < eval_start && f <= m_last; ++f) out[f] = m_last_score;
  // Each evaluation scores its own frame and the skipped ones after it.
  for (int n = 0; n < m_score_num && f + m_skip <= m_last; ++n) {
    for (int s = 0; s <= m_skip; ++s) out[f + s] = m_skip_score[n];
    f += m_skip + 1;
  }
  // compat: reset() keeps m_last_score; clearing it changes each later utterance's first scores.
  if (m_score_num > 0) m_last_score = m_skip_score[m_score_num - 1];
  for (; f <= m_last; ++f) out[f] = m_last_score;
}

void Cdnnvad::report_frame(const float* feat, int i, bool energy_speech, bool speech) const {
  const int row = m_first + i;
  m_observer->on_frame(
      VadFrameReport{m_frame_base + row, feat + static_cast<size_t>(row) * m_feat_dim, m_feat_dim,
                     m_out_score[i], m_smoothed, energy_speech ? 1 : 0, speech ? 1 : 0});
}

void Cdnnvad::find_intervals() {
  const int frames = m_last - m_first + 1;
  m_interval_num = 0;
  bool open = false;
  for (int i = 0; i < frames; ++i) {
    if (m_vad_flag[i] && !open) {
      m_interval_beg[m_interval_num] = i;
      open = true;
    } else if (!m_vad_flag[i] && open) {
      // A closed interval ends at its first non-speech frame.
      m_interval_end[m_interval_num++] = i;
      open = false;
    }
  }
  if (open) m_interval_end[m_interval_num++] = frames - 1;
}

void Cdnnvad::cut_at(int frame, const VadOutputLists& lists) {
  // Only the first cut of a call decides whether the call ends a segment.
  if (*lists.cut_num >= lists.capacity) {
    QUELLAN_WARN("Too many cut frames in one call, [%d] dropped.\n", frame);
    return;
  }
  lists.cut_frame[(*lists.cut_num)++] = frame;
}

void Cdnnvad::open_interval(int begin, const VadOutputLists& lists) {
  // The caller emits the latest interval; when the lists are full the
  // oldest one makes room.
  if (*lists.seg_num >= lists.capacity) {
    QUELLAN_WARN("Too many intervals in one call, [%d, %d] dropped.\n", lists.seg_beg[0],
                 lists.seg_end[0]);
    std::memmove(lists.seg_beg, lists.seg_beg + 1, sizeof(int) * (lists.capacity - 1));
    std::memmove(lists.seg_end, lists.seg_end + 1, sizeof(int) * (lists.capacity - 1));
    *lists.seg_num = lists.capacity - 1;
  }
  lists.seg_beg[*lists.seg_num] = begin;
}

void Cdnnvad::close_interval(int end, const VadOutputLists& lists) {
  lists.seg_end[(*lists.seg_num)++] = end;
}

void Cdnnvad::segment_before_first_interval(const VadOutputLists& lists) {
  const int base = m_frame_base + m_first;
  const int frames = m_last - m_first + 1;
  if (!m_in_speech) {
    if (m_interval_num == 0) {
      m_silence = 0;
    } else {
      m_in_speech = 1;
      open_interval(std::max(0, base + m_interval_beg[0] - m_head_margin), lists);
    }
    return;
  }
  const int first_speech = m_interval_num == 0 ? frames : m_interval_beg[0];
  if (m_interval_num == 0 && m_silence + frames < m_min_silence) {
    m_silence += frames;
    return;
  }
  if (m_interval_num > 0 && m_silence + first_speech < m_min_silence) {
    open_interval(base - m_silence, lists);
    return;
  }
  // The silence carried over plus this batch's lead closes the segment.
  const int seg_end = base - m_silence;
  const int cut = m_interval_num == 0 ? base + (frames - m_silence) / 2
                                      : base + (first_speech + 1 - m_silence) / 2;
  cut_at(cut, lists);
  open_interval(seg_end, lists);
  close_interval(cut, lists);
  if (m_interval_num == 0) {
    m_in_speech = 0;
    m_silence = 0;
  } else {
    open_interval(std::max(seg_end + 1, base + first_speech - m_head_margin), lists);
  }
}

void Cdnnvad::segment_between_intervals(const VadOutputLists& lists) {
  const int base = m_frame_base + m_first;
  for (int i = 1; i < m_interval_num; ++i) {
    const int prev_end = m_interval_end[i - 1];
    const int next_beg = m_interval_beg[i];
    // The gap holds next_beg - prev_end non-speech frames.
    // compat: + 1 closes an in-batch gap a frame sooner than across calls; dropping it moves ends.
    if (next_beg - prev_end + 1 < m_min_silence) continue;
    const int cut = base + prev_end + (next_beg - prev_end - 1) / 2;
    cut_at(cut, lists);
    close_interval(cut, lists);
    open_interval(base + next_beg - m_head_margin, lists);
  }
}

void Cdnnvad::segment_after_last_interval(const VadOutputLists& lists) {
  if (m_interval_num == 0) return;
  const int base = m_frame_base + m_first;
  const int frames = m_last - m_first + 1;
  const int last_end = m_interval_end[m_interval_num - 1];
  const int trailing = frames - 1 - last_end;
  if (trailing < m_min_silence) {
    m_silence = trailing;
    m_in_speech = 1;
    close_interval(base + last_end, lists);
    return;
  }
  const int cut = base + last_end + (frames - last_end - 1) / 2;
  cut_at(cut, lists);
  close_interval(cut, lists);
  m_in_speech = 0;
  m_silence = 0;
}
