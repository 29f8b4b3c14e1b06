#!/bin/sh
# SPDX-License-Identifier: Apache-2.0
# Trains a tiny model through each of the trainer's starting points (from
# scratch without a recurrent layer, a recurrent layer on top of that
# encoder, then the whole network carried on as train.sh's second run does),
# one epoch each on a slice of the corpus, and checks that the library's
# forward pass agrees with the trainer's after every stage. The width of 12
# channels leaves the library's padded tiles partly empty.
# Usage: trainer_smoke.sh PYTHON TRAINING_DIR DATA_DIR FORWARD_CHECK
set -eu
python=$1 training=$2 data=$3 check=$4
out=$(mktemp -d /tmp/kvasr-punct-smoke-XXXXXX)
trap 'rm -rf "$out"' EXIT
common="--data $data --words 20000 --dev-words 3000 --epochs 1 --vocab 2000 --merges 200
  --dim 16 --channels 12 --convs 2 --threads 1"
"$python" "$training/train.py" $common --hidden 0 --out "$out/encoder" --forward-check "$out/encoder.tsv"
"$check" "$out/encoder" "$out/encoder.tsv"
"$python" "$training/train.py" $common --hidden 8 --init "$out/encoder" --out "$out/model" \
  --forward-check "$out/model.tsv"
"$check" "$out/model" "$out/model.tsv"
"$python" "$training/train.py" $common --hidden 8 --init "$out/model" --out "$out/more" \
  --forward-check "$out/more.tsv" | tee "$out/more.log"
grep -q "started from $out/model: all weights" "$out/more.log"
"$check" "$out/more" "$out/more.tsv"
