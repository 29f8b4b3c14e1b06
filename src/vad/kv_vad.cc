// SPDX-License-Identifier: Apache-2.0
#include "vad/kv_vad.h"

#include <algorithm>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <iostream>

#include "quellan_wrap.h"

namespace vorta {
namespace speech {
namespace {

constexpr size_t kSegmentReserveSamples = 64000;  // 4 s
// Room for what the module may emit beyond the chunk itself (the head margin
// and frames held back from earlier calls).
constexpr size_t kOutputHeadroomSamples = 32000;

// Misuse by the engine is a programming error: stop at once, also in release
// builds, rather than write through a missing handle.
void Require(bool condition, const char* text) {
  if (condition) return;
  std::fprintf(stderr, "Assertion failed: %s\n", text);
  std::abort();
}

}  // namespace

Vad::Vad(const std::string& model_dir) : m_model_dir(model_dir) {}

Vad::~Vad() { Release(); }

bool Vad::Init() {
  try {
    m_vad_ptr = quellan_create(m_model_dir.c_str());
  } catch (const std::exception& e) {
    std::cout << "vad init exception:" << e.what() << std::endl;
    return false;
  }
  return true;
}

void Vad::OpenSegment() {
  m_data.emplace_back();
  m_data.back().reserve(kSegmentReserveSamples);
}

bool Vad::Start() {
  if (!m_vad_ptr) return false;
  m_data.clear();
  OpenSegment();
  m_call_index = 0;
  m_in_speech = false;
  quellan_reset(m_vad_ptr);
  return true;
}

void Vad::Reset() {
  m_data.clear();
  m_data.shrink_to_fit();
  m_call_index = 0;
  m_in_speech = false;
}

void Vad::Release() {
  if (!m_vad_ptr) return;
  quellan_destroy(m_vad_ptr);
  m_vad_ptr = nullptr;
  Reset();
}

void Vad::ProcessIn(const uint16_t* data, size_t len, bool end) {
  Require(m_vad_ptr != nullptr, "m_vad_ptr");
  Require(!m_data.empty(), "!m_data.empty()");
  if (len == 0) return;

  std::vector<uint16_t>& seg = m_data.back();
  const size_t old = seg.size();
  const size_t capacity = std::min<size_t>(len + kOutputHeadroomSamples, INT_MAX);
  seg.resize(old + capacity);

  ++m_call_index;
  const int32_t index = static_cast<int32_t>(m_call_index);
  int out_len = 0;
  int speech = 0;
  int continued = 0;
  int ended = 0;
  quellan_process_wave(m_vad_ptr, end ? -index : index, reinterpret_cast<const int16_t*>(data),
                       static_cast<int>(len), reinterpret_cast<int16_t*>(seg.data() + old),
                       static_cast<int>(capacity), &out_len, &speech, &continued, &ended);
  // A module that reports more than it was given room for is not trusted.
  const size_t emitted =
      (out_len > 0 && static_cast<size_t>(out_len) <= capacity) ? static_cast<size_t>(out_len) : 0;
  seg.resize(old + emitted);

  // The order of these tests decides when a segment closes.
  // compat: a segment that opens and ends in one call stays open until a later call ends it.
  if (m_in_speech) {
    if (ended == 0 && !end) return;
    OpenSegment();
    m_in_speech = false;
  } else if (speech != 0) {
    m_in_speech = true;
  }
}

std::vector<uint16_t> Vad::TakeSegment(bool* finished) {
  std::vector<uint16_t> result(std::move(m_data.front()));
  if (m_data.size() > 1) {
    *finished = true;
    m_data.pop_front();
    result.shrink_to_fit();
  } else {
    // A moved-from vector is valid but unspecified; make the open segment empty.
    m_data.front().clear();
  }
  return result;
}

}  // namespace speech
}  // namespace vorta
