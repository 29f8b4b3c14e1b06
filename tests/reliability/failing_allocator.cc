// SPDX-License-Identifier: Apache-2.0
// Kept in its own file so that no caller sees (and inlines) the pairing of
// malloc and free behind new and delete. The nothrow and array forms of the
// standard library come here too.
#include "failing_allocator.h"

#include <atomic>
#include <cstdlib>
#include <new>

namespace {

std::atomic<long> g_countdown{0};
std::atomic<bool> g_failed{false};

}  // namespace

void* operator new(std::size_t size) {
  if (g_countdown.load() > 0 && g_countdown.fetch_sub(1) == 1) {
    g_failed = true;
    throw std::bad_alloc();
  }
  if (void* p = std::malloc(size == 0 ? 1 : size)) return p;
  throw std::bad_alloc();
}

void operator delete(void* p) noexcept { std::free(p); }
void operator delete(void* p, std::size_t) noexcept { std::free(p); }

namespace kvasr_reliability {

void FailAllocation(long n) {
  g_failed = false;
  g_countdown = n;
}

bool AllocationFailed() { return g_failed; }

}  // namespace kvasr_reliability
