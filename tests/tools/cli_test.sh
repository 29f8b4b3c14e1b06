#!/usr/bin/env bash
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
total=0

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
  local ok=1
  total=$((total + 1))
  [ "$got" -eq "$status" ] || ok=0
  matches "$out_re" "$work/out" || ok=0
  matches "$err_re" "$work/err" || ok=0
  if [ $ok -eq 1 ]; then
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

expect "a recording is transcribed" 0 "young man" - -- \
  "$kvasr" transcribe "${common[@]}" "$clip"

expect "with the shipped VAD model" 0 "young man" - -- \
  "$kvasr" transcribe --model "$manifest" "$clip"

expect "punctuated with the shipped model" 0 "^He was not .*young man[.?!]$" - -- \
  "$kvasr" transcribe "${common[@]}" --punct "$clip"

# 44.1 kHz stereo of the same recording: channel mixing and resampling.
python3 -W ignore - "$clip" "$work/stereo44k.wav" <<'PY'
import audioop, sys, wave
with wave.open(sys.argv[1]) as w:
    frames = w.readframes(w.getnframes())
up, _ = audioop.ratecv(frames, 2, 1, 16000, 44100, None)
with wave.open(sys.argv[2], "wb") as w:
    w.setnchannels(2); w.setsampwidth(2); w.setframerate(44100)
    w.writeframes(audioop.tostereo(up, 2, 1, 1))
PY
expect "another rate and channel count give the same words" 0 "young man" - -- \
  "$kvasr" transcribe "${common[@]}" "$work/stereo44k.wav"

expect "raw sound from standard input" 0 "forward" - -- \
  sh -c "\"$kvasr\" transcribe --model \"$manifest\" --no-vad - < $data/goforward.raw"

expect "json messages with a final one" 0 '"isBreak":true,"text":"[^"]+"\},"status":0\}$' - -- \
  "$kvasr" transcribe "${common[@]}" --json "$clip"

echo "not sound" >"$work/text.wav"
expect "a missing file and a text file fail alone" 1 "^$work/stereo44k.wav	.*young man" \
  "^kvasr: $work/missing.wav: .+" -- \
  "$kvasr" transcribe "${common[@]}" "$work/missing.wav" "$work/text.wav" "$work/stereo44k.wav"
total=$((total + 1))
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

expect "bad chunk size" 2 - "chunk-ms" -- "$kvasr" transcribe "${common[@]}" --chunk-ms 0 "$clip"
expect "no input" 2 - "no input given" -- "$kvasr" transcribe "${common[@]}"
expect "unknown command" 2 - "usage" -- "$kvasr" frobnicate

echo "$((total - failures)) passed, $failures failed"
[ "$failures" -eq 0 ]
