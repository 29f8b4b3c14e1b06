// SPDX-License-Identifier: Apache-2.0
#include "decoder_test_support.h"

#include <algorithm>
#include <cstdio>

#include "kvasr_decoder_api.h"

namespace kvasr_decoder_test {

Session::Session() {
  FILE* file = fopen(KVASR_DECODER_MANIFEST, "rb");
  if (file == nullptr) {
    ADD_FAILURE() << "cannot open " << KVASR_DECODER_MANIFEST;
    return;
  }
  handle_ = mwDecoderInit(file, 0, 1);
  fclose(file);
  if (handle_ == nullptr) {
    ADD_FAILURE() << "mwDecoderInit failed";
    return;
  }
  mwSetOutHandle(handle_, this);
  mwSetOnResult(handle_, [](const char* text, float score, int flag, void* out_handle) {
    auto* session = static_cast<Session*>(out_handle);
    Record(session, {true, text, score, flag, session->fed_samples_, 0});
  });
  mwSetOnSpeechEnd(handle_, [](int reason, void* out_handle) {
    auto* session = static_cast<Session*>(out_handle);
    Record(session, {false, "", 0, reason, session->fed_samples_, 0});
  });
}

Session::~Session() { mwDecoderDestroy(handle_); }

std::vector<Event> Session::Finals() const {
  std::vector<Event> found;
  for (const Event& e : events_) {
    if (e.is_result && e.flag_or_reason == 1) found.push_back(e);
  }
  return found;
}

std::vector<Event> Session::SpeechEnds() const {
  std::vector<Event> found;
  for (const Event& e : events_) {
    if (!e.is_result) found.push_back(e);
  }
  return found;
}

void Session::Feed(const std::vector<int16_t>& samples, int64_t chunk_samples, bool last) {
  const int64_t total = static_cast<int64_t>(samples.size());
  for (int64_t at = 0; at < total && handle_ != nullptr; at += chunk_samples) {
    const int64_t count = std::min(chunk_samples, total - at);
    fed_samples_ += count;
    ASSERT_EQ(mwSetData(handle_, samples.data() + at, count, last && at + count == total), 0);
  }
}

int Session::Stop() { return mwStopDecode(handle_); }

void Session::Record(Session* session, Event event) {
  const int16_t silence[kChunkSamples] = {};
  switch (session->reentry_) {
    case Reentry::kNone: break;
    case Reentry::kFeed:
      event.reentry_result = mwSetData(session->handle_, silence, kChunkSamples, 0);
      break;
    case Reentry::kStop: event.reentry_result = mwStopDecode(session->handle_); break;
    case Reentry::kStart: event.reentry_result = mwStartDecode(session->handle_); break;
    case Reentry::kDestroy:
      mwDecoderDestroy(session->handle_);
      session->handle_ = nullptr;
      break;
  }
  session->events_.push_back(event);
}

}  // namespace kvasr_decoder_test
