// SPDX-License-Identifier: Apache-2.0
// The one way a hot loop chooses between its vectorised build and its plain
// one: `if (kvasr_common::HasAvx()) return LoopAvx(...); return Loop(...);`.
#ifndef KVASR_COMMON_CPU_DISPATCH_H_
#define KVASR_COMMON_CPU_DISPATCH_H_

#include <atomic>

namespace kvasr_common {

inline std::atomic<bool>& BaselineForced() {
  static std::atomic<bool> forced{false};
  return forced;
}

// With on, every Has* below answers false from then on, so the loops built
// for processors without those features run (and can be checked) on any
// machine.
inline void ForceBaseline(bool on) { BaselineForced().store(on, std::memory_order_relaxed); }

// The processor's answers are taken once, at first use: resolvers run by the
// loader (ifunc) come before sanitizer runtimes are ready, and "arch=" clones
// dispatch on the CPU model rather than its features.
inline bool HasAvx() {
  static const bool has = __builtin_cpu_supports("avx");
  return has && !BaselineForced().load(std::memory_order_relaxed);
}

inline bool HasAvx2Fma() {
  static const bool has = __builtin_cpu_supports("avx2") && __builtin_cpu_supports("fma");
  return has && !BaselineForced().load(std::memory_order_relaxed);
}

}  // namespace kvasr_common

#endif  // KVASR_COMMON_CPU_DISPATCH_H_
