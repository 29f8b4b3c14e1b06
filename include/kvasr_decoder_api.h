// SPDX-License-Identifier: Apache-2.0
/*
 * Decoder library interface: the functions the engine's decoder adapter calls.
 * Any shared library that defines these symbols can serve as the decoder;
 * libkvasr_offline.so leaves them undefined and takes them from whichever
 * library the host links or loads.
 *
 * Audio is 16 kHz, 16-bit signed, mono. One decoder handle is used by one
 * thread at a time. Callbacks run inside mwSetData or mwStopDecode, on the
 * caller's thread.
 */
#ifndef KVASR_DECODER_API_H_
#define KVASR_DECODER_API_H_

#include <stdint.h>
#include <stdio.h>

#ifdef __cplusplus
extern "C" {
#endif

/* Recognised text of the current utterance. `text` is valid during the call
 * only; `flag` > 0 marks the final text of the utterance, 0 a partial one.
 * `score` is the decoder's confidence (the library documents its unit).
 * `out_handle` is the value given to mwSetOutHandle. */
typedef void (*mw_result_callback)(const char* text, float score, int flag, void* out_handle);

/* The decoder's own detector saw speech end. `reason` is library-defined. */
typedef void (*mw_speech_end_callback)(int reason, void* out_handle);

/* Creates a decoder from an open model file (read during the call only; the
 * caller closes it). `reserved` is 0. `lang_flag` is 1 for the languages
 * en, fr, ru, de, es and 0 otherwise. Returns null on failure. */
void* mwDecoderInit(FILE* model_file, int reserved, int lang_flag);

/* Frees the decoder. No callback runs afterwards. */
void mwDecoderDestroy(void* decoder);

/* Switches the decoder's end-of-speech detection on (1) or off (0).
 * Returns 0, negative on failure. */
int mwSetVadEnabled(void* decoder, int enabled);

/* Switches automatic stop at end of speech on (1) or off (0).
 * Returns 0, negative on failure. */
int mwSetAutoStopEnabled(void* decoder, int enabled);

/* Tunes the end-of-speech detection; the library documents both values.
 * Returns 0, negative on failure. */
int mwSetVadThreshold(void* decoder, int32_t first, int32_t second);

/* Value handed back as `out_handle` in every callback. Returns 0. */
int mwSetOutHandle(void* decoder, void* out_handle);

/* Registers the speech-end callback (null: none). Returns 0. */
int mwSetOnSpeechEnd(void* decoder, mw_speech_end_callback callback);

/* Registers the result callback (null: none). Returns 0. */
int mwSetOnResult(void* decoder, mw_result_callback callback);

/* Begins an utterance. Returns 0 or more, negative on failure. */
int mwStartDecode(void* decoder);

/* Feeds `count` samples (may be 0 with a null pointer); `last` = 1 finishes
 * the utterance and delivers its final text. Returns 0 or more, negative on
 * failure. */
int mwSetData(void* decoder, const int16_t* samples, int64_t count, int last);

/* Finishes the current utterance, delivering its final text if one is
 * pending. Returns 0, negative on failure. */
int mwStopDecode(void* decoder);

/* Version text of the library, valid until the process ends. */
const char* mwGetVersion(void);

#ifdef __cplusplus
}
#endif

#endif /* KVASR_DECODER_API_H_ */
