#!/usr/bin/env bash
# Installs every Debian package that building, testing and running kvasr needs.
# Run as root (or with sudo) on Debian 12.
set -euo pipefail

packages=(
  build-essential cmake pkg-config
  clang llvm libclang-rt-dev
  googletest libgtest-dev libgmock-dev libbenchmark-dev clang-format
  libcpprest-dev
  libsndfile1-dev libsamplerate0-dev
  libpocketsphinx-dev pocketsphinx-en-us pocketsphinx-testdata
  python3 python3-numpy python3-soundfile python3-torch gnuplot-nox
  # The Python module's tests, its pip install among them.
  python3-pytest python3-pip python3-setuptools python3-wheel
  # torch's products go through the system BLAS; the reference one that
  # comes with it trains the punctuation network thirteen times slower.
  libopenblas0-openmp
  binutils
)

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
