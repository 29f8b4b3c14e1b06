// SPDX-License-Identifier: Apache-2.0
// Replaces the global allocation functions of the test program. Kept in its
// own file so that no caller sees (and inlines) the malloc/free pairing.
#include "allocation_counter.h"

#include <atomic>
#include <cstdlib>
#include <new>

namespace {

std::atomic<long> g_allocations{0};

}  // namespace

void* operator new(std::size_t size) {
  ++g_allocations;
  if (void* p = std::malloc(size == 0 ? 1 : size)) return p;
  throw std::bad_alloc();
}

void operator delete(void* p) noexcept { std::free(p); }
void operator delete(void* p, std::size_t) noexcept { std::free(p); }

namespace kvasr_test {

long AllocationCount() { return g_allocations; }

}  // namespace kvasr_test
