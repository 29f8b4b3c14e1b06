#include "decoder_test_support.h"

#include <cstdio>
#include <cstring>
#include <fstream>
#include <iterator>

#include "kvasr_decoder_api.h"

namespace kvasr_decoder_test {

std::string TestDataPath(const std::string& relative) {
  return std::string(KVASR_DECODER_TEST_DATA) + "/" + relative;
}

std::vector<int16_t> LibrivoxClip(const std::string& id) {
  const std::string path =
      TestDataPath("librivox/sense_and_sensibility_01_austen_64kb-" + id + ".wav");
  std::ifstream in(path, std::ios::binary);
  const std::string bytes((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
  // These recordings have the plain 44-byte header: PCM, mono, 16 kHz, 16 bit.
  constexpr size_t kHeaderBytes = 44;
  const char kFormat[] = "WAVEfmt \x10\0\0\0\x01\0\x01\0\x80\x3e\0\0";
  if (bytes.size() < kHeaderBytes || bytes.compare(0, 4, "RIFF") != 0 ||
      bytes.compare(8, sizeof kFormat - 1, kFormat, sizeof kFormat - 1) != 0 ||
      bytes.compare(34, 2, "\x10\0", 2) != 0 || bytes.compare(36, 4, "data") != 0) {
    ADD_FAILURE() << path << " is not 16 kHz mono PCM with a plain header";
    return {};
  }
  std::vector<int16_t> samples((bytes.size() - kHeaderBytes) / 2);
  memcpy(samples.data(), bytes.data() + kHeaderBytes, samples.size() * 2);
  return samples;
}

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
    case Reentry::kNone:
      break;
    case Reentry::kFeed:
      event.reentry_result = mwSetData(session->handle_, silence, kChunkSamples, 0);
      break;
    case Reentry::kStop:
      event.reentry_result = mwStopDecode(session->handle_);
      break;
    case Reentry::kStart:
      event.reentry_result = mwStartDecode(session->handle_);
      break;
    case Reentry::kDestroy:
      mwDecoderDestroy(session->handle_);
      session->handle_ = nullptr;
      break;
  }
  session->events_.push_back(event);
}

}  // namespace kvasr_decoder_test
