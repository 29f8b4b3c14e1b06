/*
 * Smallest complete use of the library: one listening period over a raw
 * 16 kHz 16-bit mono file, printing every result message.
 *
 *   minimal DECODER_MODEL VAD_MODEL_DIR AUDIO.raw
 */
#include <stdio.h>
#include <stdlib.h>

#include "kvasr_offline.h"

static void on_result(void* engine, const char* result_json, void* context) {
  (void)engine;
  (void)context;
  printf("%s\n", result_json);
}

int main(int argc, char** argv) {
  if (argc != 4) {
    fprintf(stderr, "usage: %s DECODER_MODEL VAD_MODEL_DIR AUDIO.raw\n", argv[0]);
    return 2;
  }
  char params[4096];
  snprintf(params, sizeof params,
           "{\"local_moxwing_model_file_path\":\"%s\",\"local_vad_model_dir_path\":\"%s\","
           "\"lang\":\"en\",\"vad_enabled\":false}",
           argv[1], argv[2]);

  void* engine = vorta_speech_create_offline_asr_engine();
  int status = 1;
  FILE* audio = NULL;
  if (vorta_speech_offline_asr_init(engine, params) != 0) goto done;
  if (vorta_speech_offline_asr_start(engine, "{\"asr\":{}}", on_result, NULL) != 0) goto done;
  audio = fopen(argv[3], "rb");
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
