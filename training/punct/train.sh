#!/bin/sh
# Rebuilds the English punctuation model in models/punct/en/ and the
# reference logits the library's forward pass is checked against.
# Usage: training/punct/train.sh [DATA_DIR [WORK_DIR]]
# (DATA_DIR defaults to ../shared/data/punct beside the checkout, WORK_DIR,
# which keeps the earlier stages' models, to /tmp/kvasr-punct-train)
# Needs Debian's python3-torch and python3-numpy. Three stages over the 4.7M
# words: the convolutional encoder, eight epochs (25 to 45 minutes on two
# cores, depending on what else runs); a bidirectional GRU trained on top of
# it, two epochs (about an hour); then the whole network three more epochs
# at a lower rate (about an hour and a half).
set -eu
here=$(cd "$(dirname "$0")" && pwd)
root=$(cd "$here/../.." && pwd)
data=${1:-$root/../shared/data/punct}
work=${2:-/tmp/kvasr-punct-train}
common="--data $data --words 5000000 --batch 32 --vocab 20000 --merges 2000
  --dim 96 --channels 128 --convs 4 --threads 2 --seed 1"
/usr/bin/python3 "$here/train.py" $common --out "$work/encoder" \
  --epochs 8 --lr 3e-3 --hidden 0
/usr/bin/python3 "$here/train.py" $common --out "$work/gru" \
  --init "$work/encoder" --epochs 2 --lr 1e-3 --hidden 128
exec /usr/bin/python3 "$here/train.py" $common --out "$root/models/punct/en" \
  --forward-check "$root/tests/punctuator/data/en_forward_check.tsv" \
  --init "$work/gru" --epochs 3 --lr 5e-4 --hidden 128
