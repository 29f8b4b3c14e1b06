// SPDX-License-Identifier: Apache-2.0
#include "quellan.h"

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <exception>
#include <new>

#include "alloc_zeroed.h"
#include "quellan_log.h"

namespace {

// Beyond the audio buffered for feature extraction, an interval can reach
// back over the detector's context, a carried closing silence and the head
// margin: well under a hundred frames with the built-in settings.
constexpr int kHistoryGuardFrames = 256;

}  // namespace

Cquellan::Cquellan(const QuellanConf& conf)
    : m_max_frames(conf.max_frames),
      m_wav_capacity(conf.max_frames * conf.frame_shift),
      m_feat_dim(conf.feat_dim),
      m_history_capacity(static_cast<int64_t>(conf.max_frames + kHistoryGuardFrames) *
                         conf.frame_shift),
      out_wav_len(conf.out_wav_len),
      out_wav_num(conf.out_wav_num) {
  if (conf.max_frames < 1 || conf.frame_shift < 1 || conf.feat_dim < 1 || conf.out_wav_len < 0 ||
      conf.out_wav_num < 1) {
    QUELLAN_INIT_FAIL("Invalid pipeline settings.\n");
  }
  m_wav_history = alloc_zeroed<int16_t>(static_cast<size_t>(m_history_capacity));
  wav_reserve = alloc_zeroed<int16_t>(static_cast<size_t>(m_wav_capacity));
  if (!m_wav_history || !wav_reserve) {
    // compat: established wording, though it names another object; hosts match the text.
    QUELLAN_INIT_FAIL("failed to new Vortaf0Interface.\n");
  }
  FILE* cmsfp = nullptr;
  if (conf.plp.cms_mode == 1) {
    cmsfp = std::fopen(conf.plp.cms_path, "rb");
    if (cmsfp == nullptr) QUELLAN_INIT_FAIL("error opening cms.bin to read\n");
  }
  try {
    m_plp = std::make_unique<PLP>(&conf.plp, cmsfp);
  } catch (const std::exception&) {
    if (cmsfp != nullptr) std::fclose(cmsfp);
    QUELLAN_WARN("failed to new PLP.\n");
    throw;
  }
  if (cmsfp != nullptr) std::fclose(cmsfp);
  m_plp_dim = m_plp->feat_dim();
  m_frame_shift = m_plp->frame_shift_samples();
  m_plp_delay = m_plp->delay_frames();
  if (m_plp_dim != m_feat_dim || m_frame_shift != conf.frame_shift) {
    QUELLAN_INIT_FAIL("PLP rows [%d x %d] do not match the feature matrix [%d x %d].\n", m_plp_dim,
                      m_frame_shift, m_feat_dim, conf.frame_shift);
  }
  m_use_tone = conf.use_pitch;
  if (m_use_tone != 0) {
    try {
      m_tone = std::make_unique<Vortaf0Interface>(conf.pitch, m_wav_capacity);
    } catch (const std::bad_alloc&) {
      QUELLAN_INIT_FAIL("failed to new Vortaf0Interface.\n");
    }
    // Tone columns follow the PLP columns of each row.
    m_tone->SetToneFeatureOffset(conf.plp.feat_dim);
    m_tone_dim = m_tone->GetToneFeatureDim();
    m_plp->set_out_pad(m_tone_dim);
    m_feat_dim += m_tone_dim;
  }
  // Allocated once the row width is known.
  m_feat = alloc_zeroed<float>(static_cast<size_t>(m_max_frames) * m_feat_dim);
  if (!m_feat) QUELLAN_INIT_FAIL("failed to alloc m_feat.\n");
  VadDnnConf vad_conf = conf.vad;
  // The network reads whole rows, tone columns included.
  vad_conf.feat_dim += m_tone_dim;
  m_vad = std::make_unique<Cdnnvad>(vad_conf);

  out_wav.resize(out_wav_num);
  for (int i = 0; i < out_wav_num; ++i) {
    out_wav[i] = alloc_zeroed<int16_t>(out_wav_len);
    if (!out_wav[i]) QUELLAN_INIT_FAIL("failed to alloc out_wav[%d]\n", i);
  }
  m_out_len = alloc_zeroed<int>(out_wav_num);
  m_seg_beg = alloc_zeroed<int>(out_wav_num);
  m_seg_end = alloc_zeroed<int>(out_wav_num);
  m_cut_frame = alloc_zeroed<int>(out_wav_num);
  if (!m_out_len || !m_seg_beg || !m_seg_end || !m_cut_frame) {
    QUELLAN_INIT_FAIL("failed to alloc the interval lists.\n");
  }
}

int Cquellan::reset() {
  m_wav_len = 0;
  m_wav_start = 0;
  m_plp_frames = 0;
  m_tone_frames = 0;
  m_history_len = 0;
  m_open_calls = 0;
  m_seg_num = 0;
  m_cut_num = 0;
  m_plp->reset();
  return 0;
}

Cquellan::Interval Cquellan::emitted(int i) const {
  const int* cuts = m_cut_frame.get();
  const bool closes = std::find(cuts, cuts + m_cut_num, m_seg_end[i]) != cuts + m_cut_num;
  return Interval{m_seg_beg[i], m_seg_end[i], out_wav[i].get(), m_out_len[i], closes};
}

void Cquellan::append_history(const int16_t* samples, int len) {
  int64_t pos = m_history_len % m_history_capacity;
  int done = 0;
  while (done < len) {
    const int64_t room = m_history_capacity - pos;
    const int piece = static_cast<int>(std::min<int64_t>(room, len - done));
    std::memcpy(m_wav_history.get() + pos, samples + done, sizeof(int16_t) * piece);
    done += piece;
    pos = 0;
  }
  m_history_len += len;
}

void Cquellan::clip_to_history(int64_t* begin, int64_t* end) const {
  const int64_t oldest = std::max<int64_t>(0, m_history_len - m_history_capacity);
  if (*begin >= oldest && *end <= m_history_len) return;
  // Only a call sequence that skips the reset after a last chunk gets here.
  QUELLAN_WARN("Interval [%lld, %lld) outside the audio held [%lld, %lld).\n",
               static_cast<long long>(*begin), static_cast<long long>(*end),
               static_cast<long long>(oldest), static_cast<long long>(m_history_len));
  *begin = std::max(*begin, oldest);
  *end = std::max(*begin, std::min(*end, m_history_len));
}

int Cquellan::copy_history(int64_t begin, int64_t end, int16_t* dst, int capacity) const {
  const int count = static_cast<int>(std::clamp<int64_t>(end - begin, 0, capacity));
  int done = 0;
  while (done < count) {
    const int64_t pos = (begin + done) % m_history_capacity;
    const int piece = static_cast<int>(std::min<int64_t>(m_history_capacity - pos, count - done));
    std::memcpy(dst + done, m_wav_history.get() + pos, sizeof(int16_t) * piece);
    done += piece;
  }
  return count;
}

int Cquellan::extract_features(int index, int len, int* new_frames) {
  const int buffered = m_wav_len + len;
  const int need = m_plp->window_samples() + 3 * m_plp_delay * m_frame_shift;
  *new_frames = 0;
  if (buffered < need && index >= 1) {
    m_wav_len = buffered;
    return 0;
  }
  const bool first = m_plp->first_call();
  int produced = 0;
  float* free_rows = m_feat.get() + static_cast<size_t>(m_plp_frames) * m_feat_dim;
  if (m_plp->extract_feature(wav_reserve.get(), buffered, free_rows, m_max_frames - m_plp_frames,
                             &produced, index, m_wav_start) < 0) {
    QUELLAN_WARN("failed to extract plp feature.\n");
    return -1;
  }
  int rows = produced;
  const int overlap_frames = 2 * m_plp_delay;
  if (index > 0) {
    // The last delay rows still lack right context; the next block starts
    // early enough to bring them, and the rows they depend on, again (PLP
    // takes their static cepstra over rather than analysing them twice).
    rows -= m_plp_delay;
    const int keep_from = (rows - overlap_frames) * m_frame_shift;
    m_wav_len = buffered - keep_from;
    m_wav_start += keep_from;
    std::memmove(wav_reserve.get(), wav_reserve.get() + keep_from, sizeof(int16_t) * m_wav_len);
  }
  if (!first) {
    // Drop the rows that repeat the overlap of the previous block.
    rows -= overlap_frames;
    for (int i = 0; i < rows; ++i) {
      std::memmove(free_rows + static_cast<size_t>(i) * m_feat_dim,
                   free_rows + static_cast<size_t>(i + overlap_frames) * m_feat_dim,
                   sizeof(float) * m_plp_dim);
    }
  }
  *new_frames = rows;
  return 0;
}

int Cquellan::extract_tone(int index, const int16_t* samples, int len, int plp_frames) {
  if (index == 1 || index == -1) m_tone->ResetToneFeature();
  float* free_rows = m_feat.get() + static_cast<size_t>(m_tone_frames) * m_feat_dim;
  const int free_count = m_max_frames - m_tone_frames;
  int added = 0;
  if (m_tone->ExtractToneFeature(samples, len, free_rows, free_count, &added, nullptr, 0, nullptr) <
      0) {
    QUELLAN_WARN("Failed to ExtractToneFeature.\n");
    return -1;
  }
  int flushed = 0;
  if (index < 0 && m_tone->EndToneFeature(free_rows + static_cast<size_t>(added) * m_feat_dim,
                                          free_count - added, &flushed) < 0) {
    QUELLAN_WARN("Failed to EndToneFeature.\n");
    return -1;
  }
  if (plp_frames < m_tone_frames + added + flushed) {
    QUELLAN_WARN("plp_len[%d] < tone_flen[%d].\n", plp_frames, m_tone_frames + added + flushed);
    return -1;
  }
  m_tone_frames += added + flushed;
  // Mid-stream the tone rows lag behind by the post-processing delay and the
  // detector waits for them; at the end the track is padded to the PLP
  // length by repeating its last frame.
  if (index < 0) {
    for (; m_tone_frames < plp_frames; ++m_tone_frames) {
      float* dst = m_feat.get() + static_cast<size_t>(m_tone_frames) * m_feat_dim + m_plp_dim;
      if (m_tone_frames == 0) {
        std::fill_n(dst, m_tone_dim, 0.0f);
      } else {
        std::memcpy(dst, dst - m_feat_dim, sizeof(float) * m_tone_dim);
      }
    }
  }
  return 0;
}

int Cquellan::quellan_process(int index, const int16_t* samples, int len, int16_t* out,
                              int out_capacity, int* out_len, int* speech, int* continued,
                              int* ended) {
  if (samples == nullptr || out == nullptr || len < 0 || out_capacity < 0 || out_len == nullptr ||
      speech == nullptr || continued == nullptr || ended == nullptr) {
    // compat: "Invalide" is the established spelling of this message; hosts match the text.
    QUELLAN_WARN("Invalide input arguments.\n");
    return 0;
  }
  if (index == 1 || index == -1) reset();
  if (static_cast<int64_t>(m_wav_len) + len > m_wav_capacity) {
    QUELLAN_WARN("wav_reserve overflow.\n");
    return -1;
  }
  std::memcpy(wav_reserve.get() + m_wav_len, samples, sizeof(int16_t) * len);
  append_history(samples, len);

  int new_frames = 0;
  if (extract_features(index, len, &new_frames) < 0) return -1;
  // A last block shorter than half a window yields a negative count, which
  // the detector refuses; the stored count must stay a valid row number.
  const int plp_frames = m_plp_frames + new_frames;
  m_plp_frames = std::max(plp_frames, 0);
  if (m_use_tone != 0) {
    if (extract_tone(index, samples, len, plp_frames) < 0) return -1;
  } else {
    m_tone_frames = m_plp_frames;
  }

  int consumed = 0;
  const VadOutputLists lists{&m_cut_num,      m_cut_frame.get(), &m_seg_num,
                             m_seg_beg.get(), m_seg_end.get(),   out_wav_num};
  if (m_vad->add_wave_data(index, samples, len, m_feat.get(), m_feat_dim, plp_frames, m_tone_frames,
                           &consumed, lists) < 0 ||
      consumed < 0) {
    QUELLAN_WARN("failed to add wave data.\n");
    return -1;
  }
  const int filled_rows = std::max(m_plp_frames, m_tone_frames);
  std::memmove(m_feat.get(), m_feat.get() + static_cast<size_t>(consumed) * m_feat_dim,
               sizeof(float) * static_cast<size_t>(filled_rows - consumed) * m_feat_dim);
  m_plp_frames -= consumed;
  m_tone_frames -= consumed;

  for (int i = 1; i < m_seg_num; ++i) m_seg_beg[i] = m_seg_end[i - 1] + 1;

  // compat: a call that completes no frame reports the previous call's intervals once more.
  *out_len = 0;
  *speech = 0;
  *continued = 0;
  *ended = 0;
  int k = 0;
  for (int i = 0; i < m_seg_num; ++i) {
    const bool closes = k < m_cut_num && i == m_seg_num - 1 && m_seg_end[i] == m_cut_frame[k];
    *speech = 1;
    *continued = closes || m_open_calls != 0 ? 1 : 0;
    *ended = closes ? 1 : 0;
    int64_t begin = static_cast<int64_t>(m_seg_beg[i]) * m_frame_shift;
    int64_t end = (static_cast<int64_t>(m_seg_end[i]) + 1) * m_frame_shift;
    clip_to_history(&begin, &end);
    m_out_len[i] = copy_history(begin, end, out_wav[i].get(), out_wav_len);
    // Every interval starts again at out[0]: the caller keeps the last one.
    *out_len = copy_history(begin, end, out, out_capacity);
    if (*out_len < end - begin) {
      QUELLAN_WARN("Output of [%lld] samples cut to out_capacity[%d].\n",
                   static_cast<long long>(end - begin), out_capacity);
    }
    if (closes) {
      ++k;
      m_open_calls = 0;
    } else {
      ++m_open_calls;
    }
  }
  return 0;
}
