// SPDX-License-Identifier: Apache-2.0
/*
 * Values that the kvasr decoder library (libkvasr_decoder.so) passes through
 * the generic decoder interface of kvasr_decoder_api.h. Hosts need them only
 * to tell the cases apart; the engine's adapter does not look at them.
 */
#ifndef KVASR_DECODER_CONSTANTS_H_
#define KVASR_DECODER_CONSTANTS_H_

/* First line of every model manifest this library reads. */
#define KVASR_DECODER_MANIFEST_TAG "kvasr-decoder-manifest"
#define KVASR_DECODER_MANIFEST_VERSION 1

/* `reason` of the speech-end callback. */
/* Speech was heard and then the trailing silence limit passed. */
#define KVASR_DECODER_SPEECH_END_SILENCE 1
/* No speech began within the leading silence limit of the utterance. */
#define KVASR_DECODER_SPEECH_END_NO_SPEECH 2

/* `score` of a partial result: no confidence is computed before the
 * utterance ends. A final result carries the mean posterior probability of
 * its words, in [0, 1], and 0 when it has no words. */
#define KVASR_DECODER_SCORE_UNAVAILABLE (-1.0f)

/* Negative results of the functions that return int. */
/* An argument is out of range: null handle, negative or oversized count,
 * null samples with a count, negative limit, nonzero reserved value. */
#define KVASR_DECODER_ERR_ARGUMENT (-1)
/* Called from inside one of this decoder's own callbacks. */
#define KVASR_DECODER_ERR_BUSY (-2)
/* The recogniser failed. */
#define KVASR_DECODER_ERR_RECOGNISER (-3)

#endif /* KVASR_DECODER_CONSTANTS_H_ */
