#!/usr/bin/env bash
# The shared object exports exactly the nine public functions and takes the
# platform libraries' functions, and nothing else of ours, from outside.
set -euo pipefail
lib=$1
expected="vorta_speech_create_offline_asr_engine
vorta_speech_get_offline_asr_version
vorta_speech_offline_asr_close
vorta_speech_offline_asr_get_context
vorta_speech_offline_asr_init
vorta_speech_offline_asr_process_sound_data
vorta_speech_offline_asr_start
vorta_speech_offline_asr_stop
vorta_speech_release_offline_asr_engine"
defined=$(nm -D --defined-only "$lib" | awk '{print $3}' | sort)
if [ "$defined" != "$expected" ]; then
  echo "exported symbols differ from the nine public functions:"
  diff <(echo "$expected") <(echo "$defined") || true
  exit 1
fi
undefined=$(nm -D --undefined-only "$lib" | awk '{print $2}')
for fn in mwDecoderInit mwDecoderDestroy mwSetVadEnabled mwSetAutoStopEnabled mwSetVadThreshold \
          mwSetOutHandle mwSetOnSpeechEnd mwSetOnResult mwStartDecode mwSetData mwStopDecode \
          mwGetVersion punctuator_init punctuator_do_it punctuator_relese; do
  if ! grep -qx "$fn" <<<"$undefined"; then
    echo "$fn is not an undefined dynamic symbol: the platform library must stay replaceable"
    exit 1
  fi
done
if grep -q quellan <<<"$undefined"; then
  echo "the voice activity module must be linked in, not left undefined"
  exit 1
fi
soname=$(readelf -d "$lib" | sed -n 's/.*(SONAME).*\[\(.*\)\]/\1/p')
if [ "$soname" != "libkvasr_offline" ]; then
  echo "soname is '$soname', expected libkvasr_offline"
  exit 1
fi
echo "exports ok"
