#!/usr/bin/env bash
# SPDX-License-Identifier: Apache-2.0
# The main job on a fresh Debian machine: installs what building and
# running needs (no test or training packages), builds kvasr, and
# transcribes real recordings (LibriVox clips that Debian's
# pocketsphinx-testdata ships) with the default models: the voice activity
# detector lets only speech through to the decoder.
set -euo pipefail
cd "$(dirname "$0")/.."

bash scripts/setup-deps.sh run
cmake -S . -B build -DCMAKE_BUILD_TYPE=RelWithDebInfo -DKVASR_BUILD_TESTS=OFF >/dev/null
cmake --build build -j"$(nproc)" --target kvasr >/dev/null

clips=(/usr/share/pocketsphinx/test/data/librivox/*.wav)
echo "== transcribing ${#clips[@]} recordings with the default models"
build/tools/kvasr/kvasr transcribe "${clips[@]}"
echo "== reference transcripts"
sed -e 's/<s> //' -e 's/ <\/s>//' /usr/share/pocketsphinx/test/data/librivox/transcription
