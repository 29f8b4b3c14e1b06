// SPDX-License-Identifier: Apache-2.0
#include "quellan_wrap.h"

#include "quellan.h"
#include "quellan_conf.h"

void* quellan_create(const char* dir) {
  QuellanConf conf{};
  if (load_quellan_conf(dir, &conf) != 0) return nullptr;
  return new Cquellan(conf);
}

int quellan_process_wave(void* handle, int index, const int16_t* samples, int len, int16_t* out,
                         int out_capacity, int* out_len, int* speech, int* continued, int* ended) {
  if (handle == nullptr) return 0;
  static_cast<Cquellan*>(handle)->quellan_process(index, samples, len, out, out_capacity, out_len,
                                                  speech, continued, ended);
  return 0;
}

void quellan_reset(void* handle) {
  if (handle != nullptr) static_cast<Cquellan*>(handle)->reset();
}

void quellan_destroy(void* handle) { delete static_cast<Cquellan*>(handle); }
