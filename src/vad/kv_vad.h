// SPDX-License-Identifier: Apache-2.0
// Speech segment buffer: passes audio through the voice activity module and
// queues the speech it returns as segments for the decoder.
#ifndef KVASR_SRC_VAD_KV_VAD_H_
#define KVASR_SRC_VAD_KV_VAD_H_

#include <cstddef>
#include <cstdint>
#include <deque>
#include <string>
#include <vector>

namespace vorta {
namespace speech {

class Vad {
 public:
  explicit Vad(const std::string& model_dir);
  ~Vad();
  Vad(const Vad&) = delete;
  Vad& operator=(const Vad&) = delete;

  // Creates the module. False only when the module throws; a module that
  // cannot be configured leaves no handle, and Start reports it.
  bool Init();
  // Prepares a listening period: one empty open segment, module reset.
  bool Start();
  // Drops all segments; Start must run before the next ProcessIn.
  void Reset();
  void Release();

  // Runs one chunk through the module; `end` marks the utterance's last chunk.
  // Must follow Start (aborts otherwise).
  void ProcessIn(const uint16_t* data, size_t len, bool end);
  // Hands out the oldest segment's samples. A finished segment is removed and
  // sets *finished; otherwise the open segment's samples so far are returned
  // and it goes on filling from empty.
  std::vector<uint16_t> TakeSegment(bool* finished);

 private:
  void OpenSegment();

  std::string m_model_dir;
  void* m_vad_ptr = nullptr;
  std::deque<std::vector<uint16_t>> m_data;
  uint32_t m_call_index = 0;
  bool m_in_speech = false;
};

}  // namespace speech
}  // namespace vorta

#endif  // KVASR_SRC_VAD_KV_VAD_H_
