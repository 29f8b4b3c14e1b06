#!/usr/bin/env bash
# SPDX-License-Identifier: Apache-2.0
# Sets up the machine and runs every check: the formatting of every tracked
# C and C++ file, the test suite in a plain build (warnings as errors), the
# installed prefix and the Debian packages as a user gets them, each fuzz
# target for a bounded time, the four-engine test under ThreadSanitizer, and
# the test suite again under AddressSanitizer + UndefinedBehaviorSanitizer.
set -euo pipefail
cd "$(dirname "$0")/.."

bash scripts/setup-deps.sh test

jobs=$(nproc)

echo "== formatting (.clang-format)"
git ls-files -z '*.c' '*.cc' '*.cpp' '*.h' '*.hpp' | xargs -0 clang-format --dry-run --Werror

echo "== plain build"
cmake -S . -B build -DCMAKE_BUILD_TYPE=RelWithDebInfo -DKVASR_WERROR=ON -DKVASR_BUILD_TESTS=ON
cmake --build build -j"$jobs"
ctest --test-dir build --output-on-failure -j"$jobs"

echo "== installed prefix and Debian packages, each transcribing a clip"
bash tests/install/check_install.sh build build-deb

echo "== fuzzing (libFuzzer, ASan + UBSan), ${FUZZ_SECONDS:=50} s per target"
FUZZ_SECONDS=$FUZZ_SECONDS bash fuzz/run.sh

echo "== ThreadSanitizer: four engines on four threads"
bash tests/reliability/tsan.sh

echo "== AddressSanitizer + UndefinedBehaviorSanitizer build"
cmake -S . -B build-asan -DCMAKE_BUILD_TYPE=Debug -DKVASR_SANITIZE=ON -DKVASR_WERROR=ON
cmake --build build-asan -j"$jobs"
# Accuracy measurements run the same code as the other tests; the plain
# build covers them.
ASAN_OPTIONS=detect_leaks=1:abort_on_error=1 UBSAN_OPTIONS=print_stacktrace=1:halt_on_error=1 \
  ctest --test-dir build-asan --output-on-failure -j"$jobs" -LE accuracy
