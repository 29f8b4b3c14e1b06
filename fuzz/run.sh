#!/usr/bin/env bash
# SPDX-License-Identifier: Apache-2.0
# Builds the fuzz targets (clang, libFuzzer, ASan + UBSan) in build-fuzz and
# runs each for a bounded time. Exits non-zero on the first finding, whose
# reproducer is left in build-fuzz/artifacts/<target>/.
#
#   FUZZ_SECONDS   seconds per target (default 60)
#   FUZZ_TARGETS   space-separated subset (default: all)
#   FUZZ_BUILD     build folder (default build-fuzz)
set -euo pipefail
cd "$(dirname "$0")/.."

seconds=${FUZZ_SECONDS:-60}
build=${FUZZ_BUILD:-build-fuzz}
targets=${FUZZ_TARGETS:-"fuzz_engine_json fuzz_c_api fuzz_vad_network fuzz_vad_priors fuzz_mean_table fuzz_decoder_manifest"}

# The test doubles stand in for the platform libraries: the fuzzers never
# load a recogniser, and clang leaves the sanitizer runtime out of shared
# objects, which the decoder library's --no-undefined link would refuse.
CC=clang CXX=clang++ cmake -S . -B "$build" -DCMAKE_BUILD_TYPE=RelWithDebInfo -DKVASR_FUZZ=ON \
  -DKVASR_DECODER_LIBRARY=kvasr_decoder_double -DKVASR_PUNCTUATOR_LIBRARY=kvasr_punctuator_double \
  >/dev/null
cmake --build "$build" --target fuzz_all -j"$(nproc)"
# Absolute: a target may change its working directory.
build=$(realpath "$build")

python3 fuzz/make_seeds.py "$build/seeds"

export ASAN_OPTIONS=detect_leaks=1:abort_on_error=1:allocator_may_return_null=1
export UBSAN_OPTIONS=print_stacktrace=1:halt_on_error=1
summary=()
for target in $targets; do
  corpus="$build/corpus/$target"
  artifacts="$build/artifacts/$target"
  mkdir -p "$corpus" "$artifacts"
  log="$build/$target.log"
  echo "== $target (${seconds} s)"
  # Standard output carries the library's own log lines; only libFuzzer's
  # report on standard error is kept.
  # Earlier findings (kept as regression inputs) join the seeds.
  inputs=("$corpus" "$build/seeds/$target")
  if [ -d "tests/reliability/findings/$target" ]; then
    inputs+=("$(realpath "tests/reliability/findings/$target")")
  fi
  if ! "$build/fuzz/$target" -max_total_time="$seconds" -timeout=30 -rss_limit_mb=2048 \
      -malloc_limit_mb=1024 -close_fd_mask=1 -print_final_stats=1 \
      -artifact_prefix="$artifacts/" "${inputs[@]}" >"$log" 2>&1; then
    tail -n 60 "$log"
    echo "FINDING in $target: reproducer in $artifacts/" >&2
    exit 1
  fi
  runs=$(sed -n 's/^stat::number_of_executed_units: *//p' "$log")
  cov=$(grep -o 'cov: [0-9]*' "$log" | tail -n 1 || true)
  summary+=("$target: $runs executions in $seconds s, $cov, corpus $(ls "$corpus" | wc -l) inputs")
done
echo "== nothing found"
printf '%s\n' "${summary[@]}"
