#!/usr/bin/env bash
# SPDX-License-Identifier: Apache-2.0
# The shared object exports exactly the nine public functions and takes the
# platform libraries' functions, and nothing else of ours, from outside.
set -euo pipefail
lib=$1
fail() { echo "$*"; exit 1; }
expected="vorta_speech_create_offline_asr_engine vorta_speech_get_offline_asr_version
vorta_speech_offline_asr_close vorta_speech_offline_asr_get_context vorta_speech_offline_asr_init
vorta_speech_offline_asr_process_sound_data vorta_speech_offline_asr_start
vorta_speech_offline_asr_stop vorta_speech_release_offline_asr_engine"
defined=$(nm -D --defined-only "$lib" | awk '{print $3}' | sort)
[ "$defined" = "$(tr ' ' '\n' <<<"$expected")" ] ||
  fail "exported symbols differ from the nine public functions:" $'\n'"$defined"
undefined=$(nm -D --undefined-only "$lib" | awk '{print $2}')
for fn in mwDecoderInit mwDecoderDestroy mwSetVadEnabled mwSetAutoStopEnabled mwSetVadThreshold \
          mwSetOutHandle mwSetOnSpeechEnd mwSetOnResult mwStartDecode mwSetData mwStopDecode \
          mwGetVersion punctuator_init punctuator_do_it punctuator_relese; do
  grep -qx "$fn" <<<"$undefined" ||
    fail "$fn is not an undefined dynamic symbol: the platform library must stay replaceable"
done
! grep -q quellan <<<"$undefined" ||
  fail "the voice activity module must be linked in, not left undefined"
soname=$(readelf -d "$lib" | sed -n 's/.*(SONAME).*\[\(.*\)\]/\1/p')
[ "$soname" = "libkvasr_offline" ] || fail "soname is '$soname', expected libkvasr_offline"
echo "exports ok"
