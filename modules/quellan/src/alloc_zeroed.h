// SPDX-License-Identifier: Apache-2.0
// The module's buffers: zeroed, and null rather than an exception when memory
// runs out, so that each constructor names the buffer in its warning line
// (with its own file, line and function) before it gives up.
#ifndef QUELLAN_ALLOC_ZEROED_H_
#define QUELLAN_ALLOC_ZEROED_H_

#include <cstddef>
#include <memory>
#include <new>

template <typename T>
std::unique_ptr<T[]> alloc_zeroed(size_t count) {
  return std::unique_ptr<T[]>(new (std::nothrow) T[count]());
}

#endif  // QUELLAN_ALLOC_ZEROED_H_
