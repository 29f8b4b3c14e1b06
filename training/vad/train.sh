#!/bin/bash
# Reproduces the shipped VAD model (models/vad/quellan_data_{a,b,c}) from the
# shared corpus, and evaluates it on the dev mixtures.
#
#   training/vad/train.sh [CORPUS_DIR] [WORK_DIR]
#
# CORPUS_DIR defaults to ../shared/data/vad next to the checkout, WORK_DIR to
# /tmp/kvasr-vad-train (mixtures and dumps, about 4 GB; never committed).
# Set KVASR to use an existing kvasr binary; otherwise one is built in
# build-vadtrain/. Set HIDDEN (e.g. "32 64,32") to compare sizes; the first
# is shipped. About 17 minutes on one core with OpenBLAS, plus the build.
# Needs python3-numpy and python3-soundfile: scripts/setup-deps.sh train.
set -euo pipefail
here=$(cd "$(dirname "$0")" && pwd)
repo=$(cd "$here/../.." && pwd)
corpus=${1:-$repo/../shared/data/vad}
work=${2:-/tmp/kvasr-vad-train}
python=/usr/bin/python3
hidden=(${HIDDEN:-64})
# One BLAS thread keeps training deterministic and the machine usable.
export OMP_NUM_THREADS=1 OPENBLAS_NUM_THREADS=1

if [ -z "${KVASR:-}" ]; then
  cmake -S "$repo" -B "$repo/build-vadtrain" -DCMAKE_BUILD_TYPE=Release -DKVASR_BUILD_TESTS=OFF > /dev/null
  cmake --build "$repo/build-vadtrain" --target kvasr -j2 > /dev/null
  KVASR=$repo/build-vadtrain/tools/kvasr/kvasr
fi

mkdir -p "$work"
cd "$work"
echo "== mixtures"
for counts in "train 200 240" "val 6 4" "dev 20 10"; do
  set -- $counts
  rm -rf "mix/$1"
  "$python" "$here/mix.py" --corpus "$corpus" --part "$1" --out "mix/$1" \
    --speech-mixtures "$2" --nospeech-mixtures "$3"
done

echo "== mean table (first pass over the training mixtures)"
rm -rf seed pass1 table dump frame-model model priors eval
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

echo "== training"
args=()
for h in "${hidden[@]}"; do args+=(--hidden "$h"); done
"$python" "$here/train.py" --mix mix --dump dump --table table/quellan_data_a \
  --out frame-model "${args[@]}" --epochs 40 --lr-decay 0.92 --nospeech-weight 3 \
  --report training.json
echo "== fine-tuning through the detector's smoothing and energy gate"
"$python" "$here/train.py" --mix mix --dump dump --table table/quellan_data_a \
  --out model --hidden "${hidden[0]}" --init frame-model --loss decision --batch 4 \
  --epochs 8 --lr 5e-4 --lr-decay 0.85 --nospeech-weight 10 --report fine-tuning.json

echo "== class priors (the detector's operating point, chosen on val)"
"$python" "$here/tune_priors.py" --kvasr "$KVASR" --model model --mix mix/val --work priors
cp model/quellan_data_a model/quellan_data_b model/quellan_data_c "$repo/models/vad/"

echo "== evaluation on dev"
mkdir -p eval
"$KVASR" vad --vad-models "$repo/models/vad" --dump eval mix/dev/*.wav > /dev/null
"$python" "$here/evaluate.py" --mix mix/dev --ours eval --json eval.json
