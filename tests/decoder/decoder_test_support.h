// SPDX-License-Identifier: Apache-2.0
// Helpers shared by the decoder library's tests: recordings, and a decoder
// session that records every callback.
#ifndef KVASR_TESTS_DECODER_DECODER_TEST_SUPPORT_H_
#define KVASR_TESTS_DECODER_DECODER_TEST_SUPPORT_H_

#include <gtest/gtest.h>

#include <cstdint>
#include <string>
#include <vector>

#include "librivox.h"

namespace kvasr_decoder_test {

constexpr int64_t kSamplesPerMs = 16;
constexpr int64_t kChunkSamples = 100 * kSamplesPerMs;

using kvasr_test::LibrivoxClip;

struct Event {
  bool is_result;  // else speech end
  std::string text;
  float score;
  int flag_or_reason;
  int64_t at_samples;  // samples fed to the session when it came
  int reentry_result;  // what a call made from inside the callback got
};

// A decoder over the shipped model that records its callbacks in order.
class Session {
 public:
  // A call each callback makes on its own decoder.
  enum class Reentry { kNone, kFeed, kStop, kStart, kDestroy };

  Session();
  ~Session();
  Session(const Session&) = delete;
  Session& operator=(const Session&) = delete;

  void* handle() const { return handle_; }
  const std::vector<Event>& events() const { return events_; }
  std::vector<Event> Finals() const;
  std::vector<Event> SpeechEnds() const;
  void set_reentry(Reentry reentry) { reentry_ = reentry; }

  // Feeds `samples` in chunks, the final chunk marked last if `last`.
  void Feed(const std::vector<int16_t>& samples, int64_t chunk_samples = kChunkSamples,
            bool last = false);
  int Stop();

 private:
  static void Record(Session* session, Event event);

  void* handle_ = nullptr;
  std::vector<Event> events_;
  int64_t fed_samples_ = 0;
  Reentry reentry_ = Reentry::kNone;
};

}  // namespace kvasr_decoder_test

#endif  // KVASR_TESTS_DECODER_DECODER_TEST_SUPPORT_H_
