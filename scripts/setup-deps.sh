#!/usr/bin/env bash
# SPDX-License-Identifier: Apache-2.0
# Installs the Debian packages kvasr needs for one purpose. Run as root (or
# with sudo) on Debian 12.
#
#   scripts/setup-deps.sh [run|test|train]
#
#   run    (default) build the library and the tool and transcribe:
#          scripts/demo.sh
#   test   run + what the test suite adds: scripts/test.sh
#   train  run + what training the models adds: training/*/train.sh
set -euo pipefail

group=${1:-run}

run=(
  build-essential cmake pkg-config
  libcpprest-dev
  libsndfile1-dev libsamplerate0-dev
  libpocketsphinx-dev pocketsphinx-en-us
  # The LibriVox clips that the demo transcribes and the tests measure.
  pocketsphinx-testdata
)
test=(
  googletest libgtest-dev libgmock-dev libbenchmark-dev
  # Sanitizers, fuzzers and the formatting check.
  clang llvm libclang-rt-dev clang-format
  binutils
  python3 python3-numpy python3-soundfile
  # The Python module's tests, its pip install among them.
  python3-pytest python3-pip python3-setuptools python3-wheel
  # cpack's dependency scan of the Debian packages.
  file
)
train=(
  python3 python3-numpy python3-soundfile python3-torch
  # torch's products go through the system BLAS; the reference one that
  # comes with it trains the punctuation network thirteen times slower.
  libopenblas0-openmp
  # The VAD recipe decodes the Debian packages' sound and audits it with
  # Silero VAD, which npm installs.
  ffmpeg nodejs npm
)

case "$group" in
  run) packages=("${run[@]}") ;;
  test) packages=("${run[@]}" "${test[@]}") ;;
  train) packages=("${run[@]}" "${train[@]}") ;;
  *)
    echo "usage: $0 [run|test|train]" >&2
    exit 2
    ;;
esac

SUDO=""
if [ "$(id -u)" -ne 0 ]; then SUDO="sudo"; fi

missing=()
for p in "${packages[@]}"; do
  dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q "install ok installed" || missing+=("$p")
done
if [ "${#missing[@]}" -gt 0 ]; then
  export DEBIAN_FRONTEND=noninteractive
  $SUDO apt-get update -q
  $SUDO apt-get install -y -q --no-install-recommends "${missing[@]}"
fi
