// SPDX-License-Identifier: Apache-2.0
#include "decoder_double.h"

#include <algorithm>
#include <deque>
#include <map>
#include <memory>

#include "double_state.h"
#include "kvasr_decoder_api.h"

namespace decoder_double {
namespace {

struct Decoder {
  void* out_handle = nullptr;
  mw_result_callback on_result = nullptr;
  mw_speech_end_callback on_speech_end = nullptr;
};

// Decoders are their own handles, so the inherited handle set stays empty.
struct World : doubles::DoubleState<Call> {
  std::map<void*, std::unique_ptr<Decoder>> decoders;
  bool init_fails = false;
  int start_result = 0;
  std::deque<int> set_data_results;
  std::deque<std::vector<Event>> on_set_data;
  std::deque<std::vector<Event>> on_stop;
};

World& world() { return doubles::Instance<World>(); }

Decoder* Find(void* handle) {
  auto it = world().decoders.find(handle);
  return it == world().decoders.end() ? nullptr : it->second.get();
}

Call& Record(const std::string& name, std::vector<int64_t> args = {}) {
  world().calls.push_back(Call{name, std::move(args), {}, {}});
  return world().calls.back();
}

// For the calls that only configure: recorded, and always accepted.
int Accept(const std::string& name, std::vector<int64_t> args = {}) {
  Record(name, std::move(args));
  return 0;
}

void Fire(void* handle, std::deque<std::vector<Event>>& queue) {
  if (queue.empty()) return;
  std::vector<Event> batch = std::move(queue.front());
  queue.pop_front();
  Decoder* d = Find(handle);
  if (!d) return;
  for (const Event& e : batch) {
    if (e.kind == Event::kResult && d->on_result) {
      d->on_result(e.null_text ? nullptr : e.text.c_str(), e.score, e.flag, d->out_handle);
    } else if (e.kind == Event::kSpeechEnd && d->on_speech_end) {
      d->on_speech_end(0, d->out_handle);
    }
  }
}

}  // namespace

void Reset() { world() = World(); }
void ClearCalls() { world().calls.clear(); }
const std::vector<Call>& Calls() { return world().calls; }

std::vector<std::string> CallNames() {
  std::vector<std::string> names;
  for (const Call& c : world().calls) names.push_back(c.name);
  return names;
}

int Count(const std::string& name) { return world().Count(name); }

int LiveDecoders() { return static_cast<int>(world().decoders.size()); }
void SetInitFails(bool fails) { world().init_fails = fails; }
void SetStartResult(int result) { world().start_result = result; }
void QueueSetDataResult(int result) { world().set_data_results.push_back(result); }
void QueueOnSetData(std::vector<Event> batch) { world().on_set_data.push_back(std::move(batch)); }
void QueueOnStop(std::vector<Event> batch) { world().on_stop.push_back(std::move(batch)); }

Event Result(const std::string& text, int flag, float score) {
  return Event{Event::kResult, text, false, score, flag};
}

Event SpeechEnd() { return Event{Event::kSpeechEnd, "", false, 0.0f, 0}; }

}  // namespace decoder_double

using namespace decoder_double;

extern "C" {

void* mwDecoderInit(FILE* model_file, int reserved, int lang_flag) {
  Call& call = Record("mwDecoderInit", {reserved, lang_flag});
  char buffer[256];
  size_t n;
  while (model_file && (n = fread(buffer, 1, sizeof buffer, model_file)) > 0) {
    call.model.append(buffer, n);
  }
  if (world().init_fails) return nullptr;
  auto decoder = std::make_unique<Decoder>();
  void* handle = decoder.get();
  world().decoders[handle] = std::move(decoder);
  return handle;
}

void mwDecoderDestroy(void* decoder) {
  Record("mwDecoderDestroy");
  world().decoders.erase(decoder);
}

int mwSetVadEnabled(void*, int enabled) { return Accept("mwSetVadEnabled", {enabled}); }
int mwSetAutoStopEnabled(void*, int enabled) { return Accept("mwSetAutoStopEnabled", {enabled}); }

int mwSetVadThreshold(void*, int32_t first, int32_t second) {
  return Accept("mwSetVadThreshold", {first, second});
}

int mwSetOutHandle(void* decoder, void* out_handle) {
  if (Decoder* d = Find(decoder)) d->out_handle = out_handle;
  return Accept("mwSetOutHandle");
}

int mwSetOnSpeechEnd(void* decoder, mw_speech_end_callback callback) {
  if (Decoder* d = Find(decoder)) d->on_speech_end = callback;
  return Accept("mwSetOnSpeechEnd");
}

int mwSetOnResult(void* decoder, mw_result_callback callback) {
  if (Decoder* d = Find(decoder)) d->on_result = callback;
  return Accept("mwSetOnResult");
}

int mwStartDecode(void*) {
  Record("mwStartDecode");
  return world().start_result;
}

int mwSetData(void* decoder, const int16_t* samples, int64_t count, int last) {
  Call& call = Record("mwSetData", {count, last});
  if (samples && count > 0) call.samples.assign(samples, samples + count);
  int result = 0;
  if (!world().set_data_results.empty()) {
    result = world().set_data_results.front();
    world().set_data_results.pop_front();
  }
  Fire(decoder, world().on_set_data);
  return result;
}

int mwStopDecode(void* decoder) {
  Record("mwStopDecode");
  Fire(decoder, world().on_stop);
  return 0;
}

const char* mwGetVersion(void) {
  Record("mwGetVersion");
  return "decoder-double 1.0";
}

}  // extern "C"
