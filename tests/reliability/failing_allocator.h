// SPDX-License-Identifier: Apache-2.0
// Replaces the global allocation functions of the program so that a test can
// make one chosen allocation fail.
#ifndef KVASR_TESTS_RELIABILITY_FAILING_ALLOCATOR_H_
#define KVASR_TESTS_RELIABILITY_FAILING_ALLOCATOR_H_

namespace kvasr_reliability {

// The n-th allocation from now throws std::bad_alloc, once; 0 disarms.
void FailAllocation(long n);
// True once the armed allocation has failed (until the next FailAllocation).
bool AllocationFailed();

}  // namespace kvasr_reliability

#endif  // KVASR_TESTS_RELIABILITY_FAILING_ALLOCATOR_H_
