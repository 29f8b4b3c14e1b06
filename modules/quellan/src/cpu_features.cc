#include "cpu_features.h"

bool cpu_has_avx() {
  static const bool has_avx = __builtin_cpu_supports("avx");
  return has_avx;
}
