#!/bin/sh
# SPDX-License-Identifier: Apache-2.0
# Rebuilds the English punctuation model in models/punct/en/ and the
# reference logits the library's forward pass is checked against.
# Usage: training/punct/train.sh [DATA_DIR [WORK_DIR]]
# (DATA_DIR defaults to ../shared/data/punct beside the checkout, WORK_DIR,
# which keeps the first run's model, to /tmp/kvasr-punct-train)
# Needs Debian's python3-torch and python3-numpy, and OpenBLAS as the system
# BLAS (scripts/setup-deps.sh train installs them; with the reference BLAS
# torch's recurrent layer trains thirteen times slower). Two runs over the 4.7M words:
# the whole network from scratch, ten epochs (about 85 minutes on two
# cores), then three more epochs at a lower rate (about 30 minutes).
set -eu
here=$(cd "$(dirname "$0")" && pwd)
root=$(cd "$here/../.." && pwd)
data=${1:-$root/../shared/data/punct}
work=${2:-/tmp/kvasr-punct-train}
common="--data $data --words 5000000 --batch 32 --vocab 30000 --merges 2000
  --dim 128 --channels 192 --convs 4 --hidden 256 --threads 2 --seed 1"
/usr/bin/python3 "$here/train.py" $common --out "$work/first" \
  --epochs 10 --lr 2e-3
exec /usr/bin/python3 "$here/train.py" $common --out "$root/models/punct/en" \
  --forward-check "$root/tests/punctuator/data/en_forward_check.tsv" \
  --init "$work/first" --epochs 3 --lr 5e-4
