// SPDX-License-Identifier: Apache-2.0
#include "punctuator_double.h"

#include <algorithm>
#include <cstring>
#include <deque>

#include "double_state.h"
#include "kvasr_punctuator_api.h"

namespace punctuator_double {
namespace {

struct World : doubles::DoubleState<Call> {
  bool init_fails = false;
  std::deque<Reply> replies;
};

World& world() { return doubles::Instance<World>(); }

}  // namespace

void Reset() { world() = World(); }
const std::vector<Call>& Calls() { return world().calls; }

int Count(const std::string& name) { return world().Count(name); }

int LiveHandles() { return static_cast<int>(world().handles.size()); }
void SetInitFails(bool fails) { world().init_fails = fails; }
void QueueReply(Reply reply) { world().replies.push_back(std::move(reply)); }

}  // namespace punctuator_double

using namespace punctuator_double;

extern "C" void* punctuator_init(const char* model_path, const char* vocab_path,
                                 const char* punc_path, const char* num_path, const char* case_path,
                                 const char* xdb_path, const char* bpe_path, const char* lang) {
  world().calls.push_back(
      {"punctuator_init",
       {model_path, vocab_path, punc_path, num_path, case_path, xdb_path, bpe_path, lang},
       0});
  if (world().init_fails) return nullptr;
  return world().OpenHandle();
}

extern "C" int punctuator_do_it(void* handle, const char* text, char* out, int32_t* size) {
  world().calls.push_back({"punctuator_do_it", {}, *size});
  if (!world().IsOpen(handle)) return 3;
  Reply reply;
  if (!world().replies.empty()) {
    reply = world().replies.front();
    world().replies.pop_front();
  } else {
    reply.output = std::string(text) + ".";
    reply.size = static_cast<int32_t>(reply.output.size());
    reply.result = reply.size > *size ? 1 : 0;
  }
  std::memcpy(out, reply.output.data(), std::min<size_t>(reply.output.size(), *size));
  *size = reply.size;
  return reply.result;
}

extern "C" void punctuator_relese(void* handle) {
  world().calls.push_back({"punctuator_relese", {}, 0});
  world().handles.erase(handle);
}
