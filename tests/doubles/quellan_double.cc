// SPDX-License-Identifier: Apache-2.0
#include "quellan_double.h"

#include <algorithm>
#include <deque>

#include "double_state.h"
#include "quellan_wrap.h"

namespace quellan_double {
namespace {

struct World : doubles::DoubleState<Call> {
  std::string null_dir = "\x01";
  std::deque<Output> outputs;
};

World& world() { return doubles::Instance<World>(); }

}  // namespace

void Reset() { world() = World(); }
const std::vector<Call>& Calls() { return world().calls; }

int LiveHandles() { return static_cast<int>(world().handles.size()); }
void SetCreateReturnsNullFor(const std::string& dir) { world().null_dir = dir; }
void QueueOutput(Output output) { world().outputs.push_back(std::move(output)); }

}  // namespace quellan_double

using namespace quellan_double;

extern "C" void* quellan_create(const char* dir) {
  world().calls.push_back({"quellan_create", 0, 0, 0});
  if (dir != nullptr && dir == world().null_dir) return nullptr;
  return world().OpenHandle();
}

extern "C" int quellan_process_wave(void* handle, int index, const int16_t*, int len, int16_t* out,
                                    int out_capacity, int* out_len, int* speech, int* continued,
                                    int* ended) {
  world().calls.push_back({"quellan_process_wave", index, len, out_capacity});
  if (!world().IsOpen(handle) || world().outputs.empty()) return 0;
  const Output o = std::move(world().outputs.front());
  world().outputs.pop_front();
  const int n = std::min(static_cast<int>(o.samples.size()), out_capacity);
  std::copy(o.samples.begin(), o.samples.begin() + n, out);
  *out_len = n;
  *speech = o.speech;
  *continued = o.continued;
  *ended = o.ended;
  return 0;
}

extern "C" void quellan_reset(void*) { world().calls.push_back({"quellan_reset", 0, 0, 0}); }

extern "C" void quellan_destroy(void* handle) {
  world().calls.push_back({"quellan_destroy", 0, 0, 0});
  world().handles.erase(handle);
}
