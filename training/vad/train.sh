#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# Reproduces the shipped VAD model (models/vad/quellan_data_{a,b,c}) from the
# shared corpus and the Debian packages of training/vad/packages.py, and
# evaluates it on the dev mixtures: the new ones (held-out packages and
# speakers) and the shared corpus's alone, as earlier models were measured.
#
#   training/vad/train.sh [CORPUS_DIR] [WORK_DIR]
#
# CORPUS_DIR defaults to ../shared/data/vad next to the checkout, WORK_DIR to
# /tmp/kvasr-vad-train (mixtures and dumps, about 8 GB; never committed).
# PACKAGE_CACHE (default ~/.cache/kvasr-vad-packages, about 9 GB) holds the
# downloaded packages, their decoded excerpts and Silero VAD (from npm) that
# audits them; nothing there needs root. Set KVASR to use an existing kvasr
# binary; otherwise one is built in build-vadtrain/. The shipped network
# is the mean of networks of HIDDEN (default 64) logistic units trained
# alike from SEEDS (default "1 2"), merged into one by ensemble.py.
# About 30 minutes on two cores, plus the first download and decoding
# (15 minutes). Needs the training packages: `bash scripts/setup-deps.sh
# train` (Debian's python3-numpy, python3-soundfile, ffmpeg, nodejs and npm).
set -euo pipefail
here=$(cd "$(dirname "$0")" && pwd)
repo=$(cd "$here/../.." && pwd)
corpus=${1:-$repo/../shared/data/vad}
work=${2:-/tmp/kvasr-vad-train}
cache=${PACKAGE_CACHE:-$HOME/.cache/kvasr-vad-packages}
python=/usr/bin/python3
hidden=${HIDDEN:-64}
seeds=(${SEEDS:-1 2})
# One BLAS thread keeps training deterministic and the machine usable.
export OMP_NUM_THREADS=1 OPENBLAS_NUM_THREADS=1

if [ -z "${KVASR:-}" ]; then
  cmake -S "$repo" -B "$repo/build-vadtrain" -DCMAKE_BUILD_TYPE=Release -DKVASR_BUILD_TESTS=OFF > /dev/null
  cmake --build "$repo/build-vadtrain" --target kvasr -j2 > /dev/null
  KVASR=$repo/build-vadtrain/tools/kvasr/kvasr
fi

echo "== packages: download, decode, audit with Silero VAD"
silero=$cache/silero
if [ ! -f "$silero/node_modules/@ricky0123/vad-web/dist/silero_vad_v5.onnx" ]; then
  mkdir -p "$silero"
  # The runtime's install script fetches optional GPU parts; the CPU library
  # ships in the npm package itself.
  (cd "$silero" && npm install --ignore-scripts --no-save @ricky0123/vad-web@0.0.31 \
    onnxruntime-node@1.30.0 > /dev/null)
fi
"$python" "$here/packages.py" fetch "$cache"
if [ ! -f "$cache/corpus/MANIFEST.tsv" ]; then
  "$python" "$here/packages.py" decode "$cache"
  NODE_PATH=$silero/node_modules "$python" "$here/packages.py" audit "$cache" \
    "$silero/node_modules/@ricky0123/vad-web/dist/silero_vad_v5.onnx"
fi

mkdir -p "$work"
cd "$work"
echo "== mixtures"
# Only the training mixtures are augmented: val and dev stay as recorded.
for counts in "train 200 240 --augment" "val 10 10" "dev 20 20"; do
  set -- $counts
  rm -rf "mix/$1"
  "$python" "$here/mix.py" --corpus "$corpus" --packages "$cache/corpus" --part "$1" \
    --out "mix/$1" --speech-mixtures "$2" --nospeech-mixtures "$3" ${4:-}
done
rm -rf mix/dev-shared
"$python" "$here/mix.py" --corpus "$corpus" --part dev --out mix/dev-shared \
  --speech-mixtures 20 --nospeech-mixtures 10

echo "== mean table (first pass over the training mixtures)"
rm -rf seed pass1 table dump run* model priors eval eval-shared
"$python" "$here/mean_table.py" seed seed
mkdir -p pass1 table
"$KVASR" vad --vad-models seed --dump pass1 mix/train/*.wav > /dev/null
"$python" "$here/mean_table.py" table pass1 table/quellan_data_a
cp seed/quellan_data_b seed/quellan_data_c table/

echo "== feature dump (the pipeline's own rows, 100 ms chunks)"
for part in train val; do
  mkdir -p "dump/$part"
  "$KVASR" vad --vad-models table --dump "dump/$part" "mix/$part"/*.wav > /dev/null
done

echo "== training: one network per seed, ${#seeds[@]} seeds, two at a time"
train_seed() {
  "$python" "$here/train.py" --mix mix --dump dump --table table/quellan_data_a \
    --out "run$1/frame-model" --hidden "$hidden" --seed "$1" --epochs 20 --lr-decay 0.88 \
    --nospeech-weight 3 --report "run$1/training.json"
  # Then through the detector's smoothing and energy gate.
  "$python" "$here/train.py" --mix mix --dump dump --table table/quellan_data_a \
    --out "run$1/model" --hidden "$hidden" --seed "$1" --init "run$1/frame-model" \
    --loss decision --batch 4 --epochs 6 --lr 5e-4 --lr-decay 0.85 --nospeech-weight 10 \
    --report "run$1/fine-tuning.json"
}
pids=() models=()
# A seed that fails stops the recipe, and the seed training beside it too.
stop_seeds() {
  for p in "${pids[@]}"; do
    pkill -P "$p" 2> /dev/null || true
    kill "$p" 2> /dev/null || true
  done
}
trap stop_seeds EXIT
for s in "${seeds[@]}"; do
  mkdir -p "run$s"
  models+=("run$s/model")
  train_seed "$s" > "run$s/log.txt" 2>&1 &
  pids+=($!)
  if [ ${#pids[@]} -ge 2 ]; then wait "${pids[0]}"; pids=("${pids[@]:1}"); fi
done
for p in "${pids[@]}"; do wait "$p"; done
trap - EXIT
for s in "${seeds[@]}"; do
  grep -A1 '^hidden' "run$s/log.txt" | tail -n 1 |
    awk -v s="$s" '{print "seed " s ": val accuracy " $2 ", AUC " $3 ", decision F1 " $4}'
done
"$python" "$here/ensemble.py" --out model "${models[@]}"

echo "== class priors (the detector's operating point, chosen on val)"
"$python" "$here/tune_priors.py" --kvasr "$KVASR" --model model --mix mix/val --work priors
cp model/quellan_data_a model/quellan_data_b model/quellan_data_c "$repo/models/vad/"

echo "== evaluation on dev: held-out packages and speakers"
mkdir -p eval eval-shared
"$KVASR" vad --vad-models "$repo/models/vad" --dump eval mix/dev/*.wav > /dev/null
"$python" "$here/evaluate.py" --mix mix/dev --ours eval --json eval.json
echo "== evaluation on dev: the shared corpus alone"
"$KVASR" vad --vad-models "$repo/models/vad" --dump eval-shared mix/dev-shared/*.wav > /dev/null
"$python" "$here/evaluate.py" --mix mix/dev-shared --ours eval-shared --json eval-shared.json
