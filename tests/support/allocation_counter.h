// SPDX-License-Identifier: Apache-2.0
// Counts the allocations of the test program through operator new.
#ifndef KVASR_TESTS_SUPPORT_ALLOCATION_COUNTER_H_
#define KVASR_TESTS_SUPPORT_ALLOCATION_COUNTER_H_

namespace kvasr_test {

long AllocationCount();

}  // namespace kvasr_test

#endif  // KVASR_TESTS_SUPPORT_ALLOCATION_COUNTER_H_
