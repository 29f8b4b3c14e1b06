#!/bin/sh
# Rebuilds the English punctuation model in models/punct/en/ and the
# reference logits the library's forward pass is checked against.
# Usage: training/punct/train.sh [DATA_DIR [TRAINER_OPTIONS...]]
# (DATA_DIR defaults to ../shared/data/punct beside the checkout)
# Needs Debian's python3-torch and python3-numpy. Eight epochs over 4.7M words:
# from 3 minutes to a quarter of an hour each on two cores, depending on what else
# runs.
set -eu
here=$(cd "$(dirname "$0")" && pwd)
root=$(cd "$here/../.." && pwd)
data=${1:-$root/../shared/data/punct}
[ $# -gt 0 ] && shift
exec /usr/bin/python3 "$here/train.py" --data "$data" \
  --out "$root/models/punct/en" \
  --forward-check "$root/tests/punctuator/data/en_forward_check.tsv" \
  --words 5000000 --epochs 8 --batch 32 --lr 3e-3 \
  --vocab 20000 --merges 2000 --dim 96 --channels 128 --convs 4 --hidden 0 \
  --threads 2 --seed 1 "$@"
