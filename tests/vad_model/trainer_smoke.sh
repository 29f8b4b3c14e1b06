#!/bin/bash
# A few training steps on a tiny sample of the corpus, through every stage of
# training/vad/train.sh, ending with the module scoring frames exactly as the
# trainer does with the network it wrote.
#
#   trainer_smoke.sh PYTHON KVASR FORWARD_TOOL CORPUS_DIR WORK_DIR
set -euo pipefail
python=$1 kvasr=$2 forward_tool=$3 corpus=$4 work=$5
here=$(cd "$(dirname "$0")" && pwd)
training=$here/../../training/vad
skip=77

if [ ! -f "$corpus/MANIFEST.tsv" ]; then
  echo "corpus not found at $corpus: skipped"; exit $skip
fi
if ! "$python" -c "import numpy, soundfile" 2>/dev/null; then
  echo "$python lacks numpy or soundfile: skipped"; exit $skip
fi
rm -rf "$work"
mkdir -p "$work"
cd "$work"
for part in train val; do
  "$python" "$training/mix.py" --corpus "$corpus" --part $part --out mix/$part \
    --speech-mixtures 1 --nospeech-mixtures 1 --seconds 6
done
"$python" "$training/mean_table.py" seed seed
mkdir -p pass1
"$kvasr" vad --vad-models seed --dump pass1 mix/train/*.wav > /dev/null
mkdir -p table
"$python" "$training/mean_table.py" table pass1 table/quellan_data_a
cp seed/quellan_data_b seed/quellan_data_c table/
for part in train val; do
  mkdir -p dump/$part
  "$kvasr" vad --vad-models table --dump dump/$part mix/$part/*.wav > /dev/null
done
# A frame of weight 2 must pull as hard as the same frame given twice.
PYTHONPATH=$training "$python" -c "
import numpy as np, network
rng = np.random.default_rng(3)
net = network.Network(5, [4], rng)
x = rng.standard_normal((3, 5)).astype(np.float32)
y = np.array([1, 0, 1])
twice = [0, 0, 1, 2]
a = net.gradients(x, y, np.array([2.0, 1.0, 1.0]))
b = net.gradients(x[twice], y[twice], np.ones(4))
assert np.isclose(a[0], b[0]), (a[0], b[0])
for ga, gb in zip(a[1] + a[2], b[1] + b[2]):
    assert np.allclose(ga, gb, atol=1e-6), np.abs(ga - gb).max()
"
# The decision loss's gradients against finite differences of the loss.
PYTHONPATH=$training "$python" -c "
import numpy as np, network, decision
rng = np.random.default_rng(5)
net = network.Network(6, [5], rng)
x = (rng.standard_normal((8, 6)) * 2).astype(np.float32)
y = rng.integers(0, 2, (2, 12)).astype(float)
w = rng.integers(0, 2, (2, 12)).astype(float)
_, gw, gb = decision.gradients(net, x, y, w)
for p, g in zip(net.weights + net.biases, gw + gb):
    for i in np.ndindex(p.shape):
        old = p[i]
        p[i] = old + 1e-2
        up = decision.gradients(net, x, y, w)[0]
        p[i] = old - 1e-2
        down = decision.gradients(net, x, y, w)[0]
        p[i] = old
        numeric = (up - down) / 2e-2
        assert abs(numeric - g[i]) <= 1e-3 * (abs(numeric) + 1e-3), (i, numeric, g[i])
"
rows=$(ls dump/val/*.f32 | head -n 1)
"$python" "$training/train.py" --mix mix --dump dump --table table/quellan_data_a \
  --out model --hidden 8,4 --max-steps 60 --batch 64 --nospeech-weight 3 \
  --check-rows "$rows" --check-scores trainer_scores.f32
"$python" "$here/forward_check.py" trained "$forward_tool" model "$rows" trainer_scores.f32
# The second training step: from that network, through the decision stage.
"$python" "$training/train.py" --mix mix --dump dump --table table/quellan_data_a \
  --out tuned --hidden 8,4 --init model --loss decision --max-steps 3 --batch 2 > tuned.txt
cmp -s model/quellan_data_b tuned/quellan_data_b && { echo "fine-tuning changed nothing"; exit 1; }
before=$(od -An -tx1 model/quellan_data_c)
"$python" "$training/tune_priors.py" --kvasr "$kvasr" --model model --mix mix/val \
  --work priors --thresholds -1 1 > priors.txt
grep -q "^kept threshold log-odds" priors.txt || { cat priors.txt; exit 1; }
[ "$(od -An -tx1 model/quellan_data_c)" != "$before" ] || { echo "priors not rewritten"; exit 1; }
# The trained model runs in the whole pipeline, and what the dump records is
# what that pipeline scored.
mkdir -p deployed
"$kvasr" vad --vad-models model --dump deployed mix/val/*.wav > /dev/null
"$python" "$here/forward_check.py" deployed model deployed/val_speech_clean_000.f32 \
  deployed/val_speech_clean_000.tsv
# The decision stage the decision loss is taken through is the detector's.
PYTHONPATH=$training "$python" -c "
import numpy as np, decision, frames
for name in frames.mixture_names('mix/val'):
    score, _, gate, speech, _ = frames.load_frame_table('deployed', name).T
    d = decision.decisions(score[::decision.EVAL_STRIDE_FRAMES], gate)
    assert np.array_equal(d, speech > 0), (name, np.flatnonzero(d != (speech > 0))[:10])
"
# The evaluation train.sh ends with reads those records.
"$python" "$training/evaluate.py" --mix mix/val --ours deployed --json eval.json > eval.txt
"$python" -c "import json, sys; r = json.load(open('eval.json'))['kvasr']
sys.exit(not (0 <= r['clean']['speech_under_gate'] <= 1 and 'false_alarm_segment' in r['music']))" \
  || { cat eval.txt; exit 1; }
