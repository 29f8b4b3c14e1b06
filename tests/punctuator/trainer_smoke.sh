#!/bin/sh
# Trains a tiny model for one epoch on a slice of the corpus into a temporary
# folder and checks that the library's forward pass agrees with the trainer's.
# Usage: trainer_smoke.sh PYTHON TRAINING_DIR DATA_DIR FORWARD_CHECK
set -eu
python=$1 training=$2 data=$3 check=$4
out=$(mktemp -d /tmp/kvasr-punct-smoke-XXXXXX)
trap 'rm -rf "$out"' EXIT
"$python" "$training/train.py" --data "$data" --out "$out" --forward-check "$out/forward.tsv" \
  --words 20000 --dev-words 3000 --epochs 1 --vocab 2000 --merges 200 \
  --dim 16 --channels 16 --convs 2 --hidden 8 --threads 1
for f in model.bin vocab.txt punc.txt num.txt case.txt xdb.txt bpe.txt; do
  test -s "$out/$f"
done
"$check" "$out" "$out/forward.tsv"
