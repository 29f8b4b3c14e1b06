// SPDX-License-Identifier: Apache-2.0
/*
 * Live transcription from a pipe: 16 kHz 16-bit mono samples arrive on
 * standard input and go to the engine in 100 ms chunks as they come. Final
 * result messages go to standard output, partial ones to standard error.
 *
 *   arecord -f S16_LE -r 16000 -c 1 -t raw | streaming
 *
 * The library logs plain lines on standard output too; hosts that parse
 * their output separate the two (the kvasr tool moves the log lines to
 * standard error).
 */
#include <stdio.h>
#include <string.h>

#include "kvasr_offline.h"

#ifndef KVASR_MODELS_DIR
#define KVASR_MODELS_DIR "/usr/share/kvasr/models"
#endif

enum { kChunkSamples = 1600 }; /* 100 ms at 16 kHz */

static void on_result(void* engine, const char* result_json, void* context) {
  (void)engine;
  (void)context;
  FILE* out = strstr(result_json, "\"isBreak\":true") ? stdout : stderr;
  fprintf(out, "%s\n", result_json);
  fflush(out);
}

/* Blocks until a whole chunk has arrived or the input ends. */
static size_t read_chunk(int16_t* chunk) {
  return fread(chunk, sizeof chunk[0], kChunkSamples, stdin);
}

int main(void) {
  const char* params = "{\"local_moxwing_model_file_path\":\"" KVASR_MODELS_DIR
                       "/decoder/en-us.manifest\","
                       "\"local_vad_model_dir_path\":\"" KVASR_MODELS_DIR
                       "/vad\","
                       "\"lang\":\"en-US\",\"vad_enabled\":true}";
  void* engine = vorta_speech_create_offline_asr_engine();
  int status = 1;
  if (vorta_speech_offline_asr_init(engine, params) != 0) goto done;
  if (vorta_speech_offline_asr_start(engine, "{\"asr\":{}}", on_result, NULL) != 0) goto done;

  /* One chunk is read ahead: the engine must be told which chunk is the last
   * so that it finishes the utterance, and only the next read can tell. */
  int16_t chunks[2][kChunkSamples];
  int current = 0;
  size_t n = read_chunk(chunks[current]);
  while (n > 0) {
    const size_t next_n = read_chunk(chunks[1 - current]);
    const int last = next_n == 0 ? -1 : 0;
    if (vorta_speech_offline_asr_process_sound_data(engine, chunks[current], (int)n, last) != 0)
      goto done;
    current = 1 - current;
    n = next_n;
  }
  status = 0;

done:
  vorta_speech_offline_asr_stop(engine);
  vorta_speech_offline_asr_close(engine);
  vorta_speech_release_offline_asr_engine(engine);
  return status;
}
