#include "quellan_double.h"

#include <algorithm>
#include <deque>
#include <set>
#include <stdexcept>

#include "quellan_wrap.h"

namespace quellan_double {
namespace {

struct World {
  std::vector<Call> calls;
  std::set<void*> handles;
  std::string null_dir = "\x01";
  std::string throw_dir = "\x01";
  std::deque<Output> outputs;
  int next_handle = 1;
};

World& world() {
  static World w;
  return w;
}

}  // namespace

void Reset() { world() = World(); }
const std::vector<Call>& Calls() { return world().calls; }

int Count(const std::string& name) {
  return static_cast<int>(std::count_if(world().calls.begin(), world().calls.end(),
                                        [&](const Call& c) { return c.name == name; }));
}

int LiveHandles() { return static_cast<int>(world().handles.size()); }
void SetCreateReturnsNullFor(const std::string& dir) { world().null_dir = dir; }
void SetCreateThrowsFor(const std::string& dir) { world().throw_dir = dir; }
void QueueOutput(Output output) { world().outputs.push_back(std::move(output)); }

}  // namespace quellan_double

using namespace quellan_double;

extern "C" void* quellan_create(const char* dir) {
  Call call;
  call.name = "quellan_create";
  call.dir = dir ? dir : "";
  world().calls.push_back(call);
  if (call.dir == world().throw_dir) throw std::runtime_error("init vad failed");
  if (call.dir == world().null_dir) return nullptr;
  void* handle = reinterpret_cast<void*>(static_cast<uintptr_t>(world().next_handle++) << 4);
  world().handles.insert(handle);
  return handle;
}

extern "C" int quellan_process_wave(void* handle, int index, const int16_t*, int len,
                                    int16_t* out, int out_capacity, int* out_len, int* speech,
                                    int* continued, int* ended) {
  Call call;
  call.name = "quellan_process_wave";
  call.index = index;
  call.len = len;
  call.out_capacity = out_capacity;
  world().calls.push_back(call);
  if (!world().handles.count(handle) || world().outputs.empty()) return 0;
  Output o = world().outputs.front();
  world().outputs.pop_front();
  const int n = std::min(static_cast<int>(o.samples.size()), out_capacity);
  std::copy(o.samples.begin(), o.samples.begin() + n, out);
  *out_len = n;
  *speech = o.speech;
  *continued = o.continued;
  *ended = o.ended;
  return 0;
}

extern "C" void quellan_reset(void* handle) {
  Call call;
  call.name = "quellan_reset";
  world().calls.push_back(call);
  (void)handle;
}

extern "C" void quellan_destroy(void* handle) {
  Call call;
  call.name = "quellan_destroy";
  world().calls.push_back(call);
  world().handles.erase(handle);
}
