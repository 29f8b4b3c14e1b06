#!/usr/bin/env bash
# SPDX-License-Identifier: Apache-2.0
# Builds the four-thread engine test with ThreadSanitizer (clang) in
# build-tsan and runs it: four engines, each with the real voice activity
# module, listen to a minute of audio at once. Fails on any reported race.
#
#   TSAN_SECONDS   seconds of audio per engine (default 60)
#   TSAN_BUILD     build folder (default build-tsan)
set -euo pipefail
cd "$(dirname "$0")/../.."

build=${TSAN_BUILD:-build-tsan}
CC=clang CXX=clang++ cmake -S . -B "$build" -DCMAKE_BUILD_TYPE=RelWithDebInfo -DKVASR_TSAN=ON \
  -DKVASR_CONCURRENCY_SECONDS="${TSAN_SECONDS:-60}" \
  -DKVASR_DECODER_LIBRARY=kvasr_decoder_double -DKVASR_PUNCTUATOR_LIBRARY=kvasr_punctuator_double \
  >/dev/null
cmake --build "$build" --target concurrency_tests -j"$(nproc)"
TSAN_OPTIONS="halt_on_error=1 abort_on_error=1 second_deadlock_stack=1" \
  "$build/tests/reliability/concurrency_tests"
