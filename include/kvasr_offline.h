// SPDX-License-Identifier: Apache-2.0
/*
 * kvasr: offline speech recognition, public C interface.
 *
 * Audio is 16 kHz, 16-bit signed, mono. An engine handle is used by one
 * thread at a time; separate handles are independent. Functions that report
 * status return 0 on success and -1 on failure; the reason is written to
 * standard output. A null handle is never dereferenced.
 *
 * Calling order: create -> init -> start -> process_sound_data (repeatedly)
 * -> stop -> start again, or close -> release.
 */
#ifndef KVASR_OFFLINE_H_
#define KVASR_OFFLINE_H_

#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

#if defined(KVASR_BUILDING_LIBRARY)
#define KVASR_API __attribute__((visibility("default")))
#else
#define KVASR_API
#endif

/*
 * Receives every result message. `engine` is the handle given to start,
 * `result_json` a compact JSON text valid only during the call, `context` the
 * pointer given to start. Runs on the caller's thread, inside the
 * process_sound_data, stop or close call that produced the result.
 */
typedef void (*vorta_speech_result_callback)(void* engine, const char* result_json, void* context);

/* Version text of the decoder library. Needs no engine; the text stays valid
 * until the process ends. */
KVASR_API const char* vorta_speech_get_offline_asr_version(void);

/* New engine in the state "not initialised". Owned by the caller until
 * vorta_speech_release_offline_asr_engine. Null only when memory is
 * exhausted. */
KVASR_API void* vorta_speech_create_offline_asr_engine(void);

/* Closes and frees the engine. The handle is invalid afterwards. Null: no-op. */
KVASR_API void vorta_speech_release_offline_asr_engine(void* engine);

/* Loads the models named by the JSON text `params` (read during the call
 * only). Returns 0, or -1 on a null engine or text, bad parameters,
 * unloadable models, exhausted memory or an engine that is already
 * initialised. */
KVASR_API int vorta_speech_offline_asr_init(void* engine, const char* params);

/* Starts a listening period with the silence limits in the JSON text
 * `params`. `callback` may be null (results are then dropped); `context` is
 * handed back unchanged. Returns 0, or -1 on a null engine or text, bad
 * parameters or an engine that is not initialised. */
KVASR_API int vorta_speech_offline_asr_start(void* engine, const char* params,
                                             vorta_speech_result_callback callback, void* context);

/* Ends the listening period; a final result may reach the callback during the
 * call. Returns 0, or -1 on a null engine. */
KVASR_API int vorta_speech_offline_asr_stop(void* engine);

/* Context pointer of the last start call; null for a null engine, a new
 * engine and after close. */
KVASR_API void* vorta_speech_offline_asr_get_context(void* engine);

/* Stops and unloads the models; the engine can be initialised again. Null:
 * no-op. */
KVASR_API void vorta_speech_offline_asr_close(void* engine);

/* Feeds `count` samples (read during the call only). A negative `packet` marks
 * the last chunk of an utterance. Returns 0, or -1 on a null engine, null
 * samples, count <= 0, an engine that is not started, a decoder error, or a
 * silence time-out (which also ends the listening period). */
KVASR_API int vorta_speech_offline_asr_process_sound_data(void* engine, const int16_t* samples,
                                                          int count, int packet);

#ifdef __cplusplus
}
#endif

#endif /* KVASR_OFFLINE_H_ */
