// Counts the allocations of the test program through operator new.
#ifndef KVASR_TESTS_QUELLAN_ALLOCATION_COUNTER_H_
#define KVASR_TESTS_QUELLAN_ALLOCATION_COUNTER_H_

namespace quellan_test {

long AllocationCount();

}  // namespace quellan_test

#endif  // KVASR_TESTS_QUELLAN_ALLOCATION_COUNTER_H_
