// SPDX-License-Identifier: Apache-2.0
/*
 * Smallest complete use of the library: one listening period over a raw
 * 16 kHz 16-bit mono file with the default models, printing every result
 * message. KVASR_MODELS_DIR comes from the build: the CMake package's
 * variable of that name or `pkg-config --variable=modelsdir kvasr`.
 *
 *   minimal AUDIO.raw
 */
#include <stdio.h>
#include <stdlib.h>

#include "kvasr_offline.h"

#ifndef KVASR_MODELS_DIR
#define KVASR_MODELS_DIR "/usr/share/kvasr/models"
#endif

static void on_result(void* engine, const char* result_json, void* context) {
  (void)engine;
  (void)context;
  printf("%s\n", result_json);
}

int main(int argc, char** argv) {
  if (argc != 2) {
    fprintf(stderr, "usage: %s AUDIO.raw\n", argv[0]);
    return 2;
  }
  const char* params = "{\"local_moxwing_model_file_path\":\"" KVASR_MODELS_DIR
                       "/decoder/en-us.manifest\","
                       "\"local_vad_model_dir_path\":\"" KVASR_MODELS_DIR
                       "/vad\","
                       "\"lang\":\"en-US\",\"vad_enabled\":true}";

  void* engine = vorta_speech_create_offline_asr_engine();
  int status = 1;
  FILE* audio = NULL;
  if (vorta_speech_offline_asr_init(engine, params) != 0) goto done;
  if (vorta_speech_offline_asr_start(engine, "{\"asr\":{}}", on_result, NULL) != 0) goto done;
  audio = fopen(argv[1], "rb");
  if (!audio) goto done;

  int16_t chunk[1600]; /* 100 ms */
  size_t n;
  while ((n = fread(chunk, sizeof chunk[0], 1600, audio)) > 0) {
    const int last = feof(audio) ? -1 : 0;
    if (vorta_speech_offline_asr_process_sound_data(engine, chunk, (int)n, last) != 0) goto done;
  }
  status = 0;

done:
  if (audio) fclose(audio);
  vorta_speech_offline_asr_stop(engine);
  vorta_speech_offline_asr_close(engine);
  vorta_speech_release_offline_asr_engine(engine);
  return status;
}
