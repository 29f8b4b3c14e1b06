#!/usr/bin/env bash
# SPDX-License-Identifier: Apache-2.0
# The kvasr tool against real recordings and against every kind of bad input:
# exit status, the one error line, and that the other inputs still go through.
set -uo pipefail
kvasr=$1
manifest=$2
data=/usr/share/pocketsphinx/test/data
clip=$data/librivox/sense_and_sensibility_01_austen_64kb-0880.wav
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
failures=0

# A regex, or "-" for an empty stream.
matches() {
  if [ "$1" = "-" ]; then [ ! -s "$2" ]; else grep -Eq "$1" "$2"; fi
}

# expect NAME STATUS STDOUT_REGEX STDERR_REGEX -- COMMAND...
expect() {
  local name=$1 status=$2 out_re=$3 err_re=$4
  shift 5
  "$@" >"$work/out" 2>"$work/err"
  local got=$?
  if [ "$got" -eq "$status" ] && matches "$out_re" "$work/out" && matches "$err_re" "$work/err"; then
    echo "ok   $name"
  else
    echo "FAIL $name: status $got (want $status)"
    sed 's/^/     out: /' "$work/out"
    sed 's/^/     err: /' "$work/err"
    failures=$((failures + 1))
  fi
}

if [ ! -f "$clip" ]; then
  echo "recordings missing: install the Debian package pocketsphinx-testdata"
  exit 1
fi

common=(--model "$manifest" --no-vad)

expect "punctuated with the shipped model" 0 "^He was not .*young man[.?!]$" - -- \
  "$kvasr" transcribe "${common[@]}" --punct "$clip"

# 44.1 kHz stereo of the same recording (channel mixing and resampling),
# transcribed below among bad inputs.
python3 -W ignore - "$clip" "$work/stereo44k.wav" <<'PY'
import audioop, sys, wave
with wave.open(sys.argv[1]) as w:
    frames = w.readframes(w.getnframes())
up, _ = audioop.ratecv(frames, 2, 1, 16000, 44100, None)
with wave.open(sys.argv[2], "wb") as w:
    w.setnchannels(2); w.setsampwidth(2); w.setframerate(44100)
    w.writeframes(audioop.tostereo(up, 2, 1, 1))
PY
expect "raw sound from standard input" 0 "forward" - -- \
  sh -c "\"$kvasr\" transcribe --model \"$manifest\" --no-vad - < $data/goforward.raw"

expect "version of the project and of the decoder library" 0 "^kvasr [0-9]+\.[0-9]+\.[0-9]+$" - -- \
  "$kvasr" --version
if ! grep -q "^decoder: kvasr_decoder .*PocketSphinx" "$work/out"; then
  echo "FAIL --version names the decoder library"
  failures=$((failures + 1))
fi

# JSON Lines: every line one object naming its input, each input's last
# message a final text.
expect "json lines over two inputs" 0 '"isBreak":true' - -- \
  "$kvasr" transcribe "${common[@]}" --json "$clip" "$work/stereo44k.wav"
if ! python3 - "$work/out" "$clip" "$work/stereo44k.wav" <<'PY'; then
import json, sys
lines = open(sys.argv[1]).read().splitlines()
messages = [json.loads(line) for line in lines]
assert all(isinstance(m, dict) and "\n" not in line for m, line in zip(messages, lines))
by_input = {}
for m in messages:
    by_input.setdefault(m["input"], []).append(m)
assert list(by_input) == sys.argv[2:], list(by_input)
for ms in by_input.values():
    assert ms[-1]["result"]["isBreak"] and "young man" in ms[-1]["result"]["text"], ms[-1]
PY
  echo "FAIL json lines: not one object per line naming its input"
  failures=$((failures + 1))
fi

expect "a WAV file on standard input is read by its header" 0 "^He was not .*young man[.?!]$" - -- \
  sh -c "\"$kvasr\" transcribe --model \"$manifest\" --no-vad --punct - < $work/stereo44k.wav"

# Every other sample: 8 kHz.
python3 - "$clip" "$work/8k.wav" <<'PY'
import array, sys, wave
with wave.open(sys.argv[1]) as w:
    samples = array.array("h", w.readframes(w.getnframes()))[::2]
with wave.open(sys.argv[2], "wb") as w:
    w.setnchannels(1); w.setsampwidth(2); w.setframerate(8000)
    w.writeframes(samples.tobytes())
PY
expect "one warning for narrowband sound, which is still transcribed" 0 "[a-z]" \
  "^kvasr: $work/8k.wav: warning: 8000 Hz is below 16000 Hz; the model is wideband" -- \
  "$kvasr" transcribe "${common[@]}" "$work/8k.wav"
if [ "$(wc -l <"$work/err")" -ne 1 ]; then
  echo "FAIL narrowband: one warning line expected"
  failures=$((failures + 1))
fi

echo "not sound" >"$work/text.wav"
expect "a missing file and a text file fail alone" 1 "^$work/stereo44k.wav	.*young man" \
  "^kvasr: $work/missing.wav: .+" -- \
  "$kvasr" transcribe "${common[@]}" "$work/missing.wav" "$work/text.wav" "$work/stereo44k.wav"
if ! grep -q "^kvasr: $work/text.wav: " "$work/err" || [ "$(wc -l <"$work/err")" -ne 2 ]; then
  echo "FAIL one error line for each of the two bad inputs expected"
  failures=$((failures + 1))
fi

expect "a missing decoder model" 2 - "^kvasr: decoder model '/nonexistent.manifest' not found" -- \
  "$kvasr" transcribe --model /nonexistent.manifest --no-vad "$clip"

echo "garbage" >"$work/bad.manifest"
expect "a corrupt decoder model" 2 - "^kvasr: the models could not be loaded" -- \
  "$kvasr" transcribe --model "$work/bad.manifest" --no-vad "$clip"

expect "a missing VAD model folder" 2 - "^kvasr: VAD model folder '/nonexistent' not found" -- \
  "$kvasr" transcribe --model "$manifest" --vad-models /nonexistent "$clip"

expect "missing punctuation settings" 2 - "^kvasr: punctuation settings '/nonexistent.json' cannot be read" -- \
  "$kvasr" transcribe "${common[@]}" --punct-settings /nonexistent.json "$clip"

# The shipped command grammar, beside the default manifest: once through
# --grammar, once through its own manifest.
models=$(dirname "$manifest")
expect "a command grammar through --grammar" 0 "^go forward ten meters$" - -- \
  sh -c "\"$kvasr\" transcribe --model \"$manifest\" --grammar $models/commands.gram - < $data/goforward.raw"
expect "a command grammar through its manifest" 0 "^go forward ten meters$" - -- \
  sh -c "\"$kvasr\" transcribe --model $models/commands.manifest - < $data/goforward.raw"
printf '#JSGF V1.0;\ngrammar g;\npublic <c> = go forward\n  | go zorblax;\n' >"$work/unknown.gram"
expect "a grammar word missing from the dictionary" 2 - \
  "^kvasr_decoder: grammar \"$work/unknown.gram\" line 4: word \"zorblax\" is not in the dictionary" -- \
  "$kvasr" transcribe "${common[@]}" --grammar "$work/unknown.gram" "$clip"
expect "a missing grammar" 2 - "^kvasr: grammar '/nonexistent.gram' not found" -- \
  "$kvasr" transcribe "${common[@]}" --grammar /nonexistent.gram "$clip"

expect "bad chunk size" 2 - "chunk-ms" -- "$kvasr" transcribe "${common[@]}" --chunk-ms 0 "$clip"
expect "no input" 2 - "no input given" -- "$kvasr" transcribe "${common[@]}"
expect "unknown command" 2 - "usage" -- "$kvasr" frobnicate

# Half a second of faint noise, then a second of a 200 Hz harmonic complex.
python3 - "$work/tone200.wav" <<'PY'
import math, random, struct, sys, wave
random.seed(1)
x = [random.randint(-5, 5) for _ in range(8000)]
x += [int(12000 * sum(math.cos(2 * math.pi * h * 200 * i / 16000) / h for h in range(1, 20)) / 3.5)
      for i in range(16000)]
with wave.open(sys.argv[1], "wb") as w:
    w.setnchannels(1); w.setsampwidth(2); w.setframerate(16000)
    w.writeframes(struct.pack("<%dh" % len(x), *x))
PY
expect "pitch of a synthetic 200 Hz tone" 0 "^100	(19[6-9]|20[0-4])\.[0-9]+$" - -- \
  "$kvasr" pitch "$work/tone200.wav"
expect "pitch track of a recording" 0 "^# frame	f0_hz; .*t = 0.01\*i - 0.01003125 s" - -- \
  "$kvasr" pitch "$clip"
frames=$(grep -vc '^#' "$work/out")
voiced=$(grep -v '^#' "$work/out" | awk '$2 >= 60 && $2 <= 450' | wc -l)
if [ "$frames" -lt 100 ] || [ "$voiced" -lt $((frames / 10)) ]; then
  echo "FAIL pitch track of a recording: $frames frames, $voiced voiced"
  failures=$((failures + 1))
fi
expect "pitch takes one file" 2 - "one input file" -- "$kvasr" pitch "$clip" "$clip"

echo "$failures failed"
[ "$failures" -eq 0 ]
