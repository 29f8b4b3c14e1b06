#include "quellan_wrap.h"

void* quellan_create(const char*) { return nullptr; }

int quellan_process_wave(void*, int, const int16_t*, int, int16_t*, int, int*,
                         int*, int*, int*) {
  return 0;
}

void quellan_reset(void*) {}

void quellan_destroy(void*) {}
