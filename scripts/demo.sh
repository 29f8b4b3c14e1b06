#!/usr/bin/env bash
# The main job on a fresh Debian machine: installs what is needed, builds
# kvasr, and transcribes real recordings (LibriVox clips that Debian's
# pocketsphinx-testdata ships) with the default models: the voice activity
# detector lets only speech through to the decoder.
set -euo pipefail
cd "$(dirname "$0")/.."

bash scripts/setup-deps.sh
cmake -S . -B build -DCMAKE_BUILD_TYPE=RelWithDebInfo >/dev/null
cmake --build build -j"$(nproc)" --target kvasr >/dev/null

clips=(/usr/share/pocketsphinx/test/data/librivox/*.wav)
echo "== transcribing ${#clips[@]} recordings with the default models"
build/tools/kvasr/kvasr transcribe "${clips[@]}"
echo "== reference transcripts"
sed -e 's/<s> //' -e 's/ <\/s>//' /usr/share/pocketsphinx/test/data/librivox/transcription
