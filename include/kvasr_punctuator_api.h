// SPDX-License-Identifier: Apache-2.0
/*
 * Punctuation library interface: the functions the engine's punctuation
 * adapter calls. Any shared library that defines these symbols can serve;
 * libkvasr_offline.so leaves them undefined.
 *
 * One handle is used by one thread at a time.
 */
#ifndef KVASR_PUNCTUATOR_API_H_
#define KVASR_PUNCTUATOR_API_H_

#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

/* Loads a model from seven files (an empty string stands for a file the model
 * does not use) for a two-letter language code. All strings are read during
 * the call only. Returns null on failure, with a line on standard error. */
void* punctuator_init(const char* model_path, const char* vocab_path, const char* punc_path,
                      const char* num_path, const char* case_path, const char* xdb_path,
                      const char* bpe_path, const char* lang);

/* Punctuates the NUL-terminated `text` into `out`, whose capacity in bytes is
 * `*size` on entry. Returns 0 with `*size` set to the output length (the
 * output need not be NUL-terminated); 1 with `*size` set to the length needed
 * when the capacity is too small (nothing else changes); any other value on
 * failure. */
int punctuator_do_it(void* handle, const char* text, char* out, int32_t* size);

/* Frees the handle. Null: no-op. */
/* compat: the established spelling of an exported name; renaming it breaks every host. */
void punctuator_relese(void* handle);

#ifdef __cplusplus
}
#endif

#endif /* KVASR_PUNCTUATOR_API_H_ */
