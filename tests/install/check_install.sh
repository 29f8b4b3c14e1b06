#!/usr/bin/env bash
# SPDX-License-Identifier: Apache-2.0
# kvasr the way a user gets it, each time transcribing a LibriVox clip:
#  - installed into a prefix that is then moved: the tool, the examples
#    built against it once through find_package(kvasr), once through
#    pkg-config, and the Python module;
#  - as the Debian packages cpack makes: their contents and dependencies;
#    unpacked into a temporary root, the tool, a find_package host and the
#    Python module; installed by apt-get, where a private mount namespace
#    allows, the same three.
#
#   tests/install/check_install.sh BUILD_DIR PACKAGE_BUILD_DIR
#
# BUILD_DIR is a built tree. PACKAGE_BUILD_DIR is configured here for the
# /usr prefix, without tests, then built and packaged.
set -euo pipefail
cd "$(dirname "$0")/../.."
build=$(realpath "$1")
package_build=$(realpath -m "$2")
jobs=$(nproc)
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT

fail() {
  echo "FAIL: $*" >&2
  exit 1
}

clips=/usr/share/pocketsphinx/test/data/librivox
clip_id=sense_and_sensibility_01_austen_64kb-0870
clip=$clips/$clip_id.wav
reference=$(sed -n "s|^<s> \(.*\) </s> ($clip_id)\$|\1|p" "$clips/transcription")
[ -n "$reference" ] || fail "no reference transcript for $clip_id"
# The examples read bare samples; the clip is 16 kHz 16-bit mono already.
python3 - "$clip" "$work/clip.raw" <<'PY'
import sys, wave
with wave.open(sys.argv[1]) as w, open(sys.argv[2], "wb") as out:
    assert (w.getframerate(), w.getsampwidth(), w.getnchannels()) == (16000, 2, 1)
    out.write(w.readframes(w.getnframes()))
PY

# Final texts of the result messages in a host's output (the library's log
# lines, which echo partial texts, are left out).
final_texts() {
  sed -n 's/.*"isBreak":true,"text":"\([^"]*\)".*/\1/p' "$1"
}

# The transcript must hold at least 60 % of the reference's words: the
# decoder gets about 75 % of this clip right, no output gets none.
expect_words() {
  local label=$1 transcript=$2 found=0 total=0 word
  for word in $reference; do
    total=$((total + 1))
    if grep -qw -- "$word" <<<"$transcript"; then found=$((found + 1)); fi
  done
  ((found * 10 >= total * 6)) ||
    fail "$label: $found of $total reference words in '$transcript'"
  echo "ok: $label ($found of $total reference words)"
}

python_transcribes() {
  local label=$1 site=$2
  expect_words "$label" "$(cd / && env -u KVASR_LIBRARY -u KVASR_MODELS_DIR -u LD_LIBRARY_PATH \
    PYTHONPATH="$site" PYTHONDONTWRITEBYTECODE=1 python3 -m kvasr "$clip")"
}
runpath() {
  readelf -d "$1" | sed -n 's/.*(RUNPATH).*\[\(.*\)\]/\1/p'
}

cache_value() {
  sed -n "s/^$2:[A-Z]*=//p" "$1/CMakeCache.txt"
}

echo "== installed prefix, moved after installing"
libdir=$(cache_value "$build" CMAKE_INSTALL_LIBDIR)
cmake --install "$build" --prefix "$work/staged" >/dev/null
mv "$work/staged" "$work/prefix"
prefix=$work/prefix
for f in bin/kvasr "$libdir/libkvasr_offline" "$libdir/libkvasr_offline.so" \
  "$libdir/cmake/kvasr/kvasrConfig.cmake" "$libdir/cmake/kvasr/kvasrConfigVersion.cmake" \
  "$libdir/pkgconfig/kvasr.pc" include/kvasr_offline.h include/kvasr_decoder_api.h \
  include/kvasr_punctuator_api.h share/kvasr/models/decoder/en-us.manifest; do
  [ -e "$prefix/$f" ] || fail "the prefix lacks $f"
done
[ "$(runpath "$prefix/bin/kvasr")" = "\$ORIGIN/../$libdir" ] ||
  fail "kvasr's run path is '$(runpath "$prefix/bin/kvasr")'"
[ "$(runpath "$prefix/$libdir/libkvasr_offline.so")" = "\$ORIGIN" ] ||
  fail "libkvasr_offline's run path is '$(runpath "$prefix/$libdir/libkvasr_offline.so")'"

expect_words "installed tool, run from /" \
  "$(cd / && env -u LD_LIBRARY_PATH "$prefix/bin/kvasr" transcribe "$clip" 2>"$work/tool.log")"

cmake -S examples -B "$work/cmake-host" -DCMAKE_PREFIX_PATH="$prefix" >/dev/null
cmake --build "$work/cmake-host" -j"$jobs" >/dev/null
env -u LD_LIBRARY_PATH "$work/cmake-host/minimal" "$work/clip.raw" >"$work/out"
expect_words "find_package host, minimal" "$(final_texts "$work/out")"
env -u LD_LIBRARY_PATH "$work/cmake-host/streaming" <"$work/clip.raw" >"$work/out" 2>/dev/null
expect_words "find_package host, streaming" "$(final_texts "$work/out")"

export PKG_CONFIG_PATH=$prefix/$libdir/pkgconfig
models=$(pkg-config --variable=modelsdir kvasr)
[ "$(realpath "$models")" = "$prefix/share/kvasr/models" ] || fail "modelsdir is $models"
for example in minimal streaming; do
  # shellcheck disable=SC2046  # pkg-config's flags are meant to split
  cc -std=c99 -Wall -Wextra -Werror -o "$work/pc-$example" "examples/$example.c" \
    $(pkg-config --cflags kvasr) -DKVASR_MODELS_DIR="\"$models\"" $(pkg-config --libs kvasr)
done
unset PKG_CONFIG_PATH
LD_LIBRARY_PATH=$prefix/$libdir "$work/pc-minimal" "$work/clip.raw" >"$work/out"
expect_words "pkg-config host, minimal" "$(final_texts "$work/out")"
LD_LIBRARY_PATH=$prefix/$libdir "$work/pc-streaming" <"$work/clip.raw" >"$work/out" 2>/dev/null
expect_words "pkg-config host, streaming" "$(final_texts "$work/out")"
python_transcribes "installed Python module" "$prefix/$(cache_value "$build" KVASR_INSTALL_PYTHONDIR)"

echo "== Debian packages"
cmake -S . -B "$package_build" -DCMAKE_BUILD_TYPE=RelWithDebInfo -DCMAKE_INSTALL_PREFIX=/usr \
  -DKVASR_BUILD_TESTS=OFF -DKVASR_WERROR=ON >/dev/null
cmake --build "$package_build" -j"$jobs" >/dev/null
rm -f "$package_build"/kvasr*.deb
(cd "$package_build" && cpack -G DEB >"$work/cpack.log" 2>&1) || {
  cat "$work/cpack.log"
  fail "cpack failed"
}
runtime_deb=$(echo "$package_build"/kvasr_*.deb)
dev_deb=$(echo "$package_build"/kvasr-dev_*.deb)
[[ -f $runtime_deb && -f $dev_deb ]] || fail "cpack made no kvasr and kvasr-dev packages"
libdir=$(cache_value "$package_build" CMAKE_INSTALL_LIBDIR)

contents() {
  dpkg-deb -c "$1" | awk '{print $6}' | sed 's|^\./|/|'
}
expect_in() {
  local deb=$1 path
  shift
  for path in "$@"; do
    contents "$deb" | grep -qx -- "$path" || fail "$(basename "$deb") lacks $path"
  done
}
expect_not_in() {
  local deb=$1 pattern=$2
  ! contents "$deb" | grep -q -- "$pattern" || fail "$(basename "$deb") holds $pattern"
}
expect_in "$runtime_deb" /usr/bin/kvasr "/usr/$libdir/libkvasr_offline" \
  "/usr/$libdir/libkvasr_offline.so" "/usr/$libdir/libkvasr_decoder.so.0" \
  "/usr/$libdir/libkvasr_punctuator.so.0" /usr/share/kvasr/models/decoder/en-us.manifest \
  /usr/share/kvasr/models/vad/quellan_data_b /usr/share/kvasr/models/punct/en/model.bin \
  /usr/share/kvasr/models/punct/en/settings.json /usr/lib/python3/dist-packages/kvasr/_paths.py
expect_not_in "$runtime_deb" /usr/include
expect_not_in "$runtime_deb" /cmake/
expect_in "$dev_deb" /usr/include/kvasr_offline.h /usr/include/kvasr_decoder_api.h \
  /usr/include/kvasr_punctuator_api.h "/usr/$libdir/cmake/kvasr/kvasrConfig.cmake" \
  "/usr/$libdir/pkgconfig/kvasr.pc"
expect_not_in "$dev_deb" /usr/bin
expect_not_in "$dev_deb" /models/
depends=$(dpkg-deb -f "$runtime_deb" Depends)
for package in pocketsphinx-en-us libpocketsphinx3 libcpprest2.10 libsndfile1 libsamplerate0; do
  grep -q "\b$package\b" <<<"$depends" || fail "kvasr does not depend on $package: $depends"
done
grep -q "^kvasr (= " <<<"$(dpkg-deb -f "$dev_deb" Depends)" ||
  fail "kvasr-dev does not depend on its kvasr: $(dpkg-deb -f "$dev_deb" Depends)"
echo "ok: package contents and dependencies"

root=$work/root
dpkg-deb -x "$runtime_deb" "$root"
expect_words "packaged tool, unpacked" \
  "$(cd / && env -u LD_LIBRARY_PATH "$root/usr/bin/kvasr" transcribe "$clip" 2>"$work/tool.log")"
dpkg-deb -x "$dev_deb" "$root"
cmake -S examples -B "$work/package-host" -DCMAKE_PREFIX_PATH="$root/usr" >/dev/null
cmake --build "$work/package-host" -j"$jobs" --target minimal >/dev/null
env -u LD_LIBRARY_PATH "$work/package-host/minimal" "$work/clip.raw" >"$work/out"
expect_words "find_package host of the unpacked packages" "$(final_texts "$work/out")"

python_transcribes "packaged Python module, unpacked" "$root/usr/lib/python3/dist-packages"

# apt-get itself, where a private mount namespace can lay throwaway overlays
# over /usr, /etc and /var: the installation is seen by this check only.
echo "== the packages installed by apt-get"
overlay=$work/overlay
mkdir -p "$overlay/probe/lower" "$overlay/probe/upper" "$overlay/probe/work" "$overlay/probe/mnt"
if [ "$(id -u)" -ne 0 ] || ! unshare -m mount -t overlay overlay -o "lowerdir=$overlay/probe/lower,\
upperdir=$overlay/probe/upper,workdir=$overlay/probe/work" "$overlay/probe/mnt" 2>/dev/null; then
  echo "skipped: needs root and overlay mounts in a private mount namespace"
  exit 0
fi
cp "$runtime_deb" "$dev_deb" "$overlay/"
unshare -m bash -s -- "$overlay" "$clip" "$work" "$PWD/examples" <<'SH' || fail "the apt-get install check failed (logs in $work)"
set -euo pipefail
overlay=$1 clip=$2 work=$3 examples=$4
for d in usr etc var; do
  mkdir -p "$overlay/$d/upper" "$overlay/$d/work"
  mount -t overlay overlay -o "lowerdir=/$d,upperdir=$overlay/$d/upper,workdir=$overlay/$d/work" "/$d"
done
cd "$overlay"
DEBIAN_FRONTEND=noninteractive apt-get install -y -q --no-install-recommends \
  ./kvasr_*.deb ./kvasr-dev_*.deb >"$work/apt.log" 2>&1
cd /
env -u LD_LIBRARY_PATH /usr/bin/kvasr transcribe "$clip" >"$work/apt-tool.out" 2>/dev/null
cmake -S "$examples" -B "$work/apt-host" >/dev/null
cmake --build "$work/apt-host" --target minimal >/dev/null
env -u LD_LIBRARY_PATH "$work/apt-host/minimal" "$work/clip.raw" >"$work/apt-host.out"
env -u PYTHONPATH -u KVASR_LIBRARY /usr/bin/python3 -m kvasr "$clip" >"$work/apt-python.out"
SH
expect_words "apt-get installed tool" "$(cat "$work/apt-tool.out")"
expect_words "find_package host of the apt-get installed packages" \
  "$(final_texts "$work/apt-host.out")"
expect_words "apt-get installed Python module" "$(cat "$work/apt-python.out")"
