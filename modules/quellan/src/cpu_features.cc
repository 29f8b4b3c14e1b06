#include "cpu_features.h"

#include <atomic>

namespace {
std::atomic<bool> g_force_baseline{false};
}  // namespace

bool cpu_has_avx() {
  static const bool has_avx = __builtin_cpu_supports("avx");
  return has_avx && !g_force_baseline.load(std::memory_order_relaxed);
}

void cpu_force_baseline(bool on) { g_force_baseline.store(on, std::memory_order_relaxed); }
