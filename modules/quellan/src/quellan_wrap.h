// SPDX-License-Identifier: Apache-2.0
/*
 * Voice activity module: the four entry points through which the engine's
 * speech segment buffer drives the detector. The handle is opaque.
 *
 * Audio is 16 kHz, 16-bit signed, mono. One handle is used by one thread at a
 * time; handles are independent.
 */
#ifndef QUELLAN_WRAP_H_
#define QUELLAN_WRAP_H_

#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

/* Loads the detector from the model directory `dir` (quellan_data_a, _b, _c;
 * null: the bare file names in the working directory). Returns null when the
 * configuration cannot be built. A model file that cannot be loaded prints its
 * reason and throws std::runtime_error("init vad failed") to C++ callers.
 * The caller owns the handle and frees it with quellan_destroy. */
void* quellan_create(const char* dir);

/* Processes one chunk of `len` samples. `index` counts the chunks of the
 * utterance from 1; it is negated on the last chunk (1 or -1 starts a new
 * utterance). Speech samples of the chunk are written to `out`, at most
 * `out_capacity` samples, their count to `*out_len`; `*speech` is 1 when the
 * output holds speech, `*continued` when it continues a segment begun in an
 * earlier call, `*ended` when the segment closes in this call. The caller
 * presets the four outputs to 0; a chunk that fails internally leaves them
 * so. Always returns 0. */
int quellan_process_wave(void* handle, int index, const int16_t* samples, int len, int16_t* out,
                         int out_capacity, int* out_len, int* speech, int* continued, int* ended);

/* Prepares the handle for a new utterance. */
void quellan_reset(void* handle);

/* Frees the handle. Null: no-op. */
void quellan_destroy(void* handle);

#ifdef __cplusplus
}
#endif

#endif /* QUELLAN_WRAP_H_ */
