#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
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
# A tiny package corpus standing in for the downloaded one: a voice package,
# a music package and an effects package of the training part, one effects
# package of dev.
PYTHONPATH=$training "$python" - "$corpus" packages <<'EOF_FIXTURE'
import os, sys
import numpy as np, soundfile
import corpus, packages
shared, out = sys.argv[1], sys.argv[2]
rng = np.random.default_rng(7)
speech = [r for r in corpus.read_manifest(shared) if r["kind"] == "speech"][:2]
rows = []
def add(pkg, kind, name, x, speaker=""):
    path = "%s/%s.wav" % (pkg, name)
    os.makedirs(os.path.join(out, pkg), exist_ok=True)
    soundfile.write(os.path.join(out, path), x.astype(np.float32), 16000, subtype="PCM_16")
    rows.append({"path": path, "kind": kind, "source": pkg, "speaker": speaker,
                 "duration_s": "%.3f" % (len(x) / 16000)})
for i, r in enumerate(speech):
    add("fillets-ng-data-cs", "speech", "line%d" % i, soundfile.read(r["file"])[0], "fillets-ng-data-cs")
t = np.arange(48000) / 16000
add("wesnoth-1.16-music", "music", "tune", 0.2 * np.sin(2 * np.pi * 220 * t) * (1 + np.sin(3 * t)))
for pkg in ("lmms-common", "oxygen-sounds"):
    add(pkg, "noise", "hit", rng.standard_normal(8000) * np.exp(-np.arange(8000) / 800) * 0.3)
packages.write_manifest(out, rows)
parts = corpus.load(shared, out)
got = {p: sorted({r["category"] for r in parts[p] if r["source"] in packages.PACKAGES}) for p in parts}
assert got["train"] == ["effects/pkg/lmms-common", "music/pkg/wesnoth-1.16-music",
                        "speech/pkg/fillets-ng-data-cs"], got
assert got["dev"] == ["effects/pkg/oxygen-sounds"] and got["val"] == [], got
# Voices in non-speech packages never enter as non-speech.
cases = {
    ("freedroidrpg-data", "usr/share/freedroidrpg/data/sound/effects/bot_sounds/voice_samples/1.ogg"): None,
    ("freedroidrpg-data", "usr/share/freedroidrpg/data/sound/effects/bullets/Single_Laser.ogg"): "noise",
    ("boswars-data", "usr/share/games/boswars/units/medic/medic_select.wav"): None,
    ("megaglest-data", "usr/share/games/megaglest/techs/megapack/factions/magic/units/initiate/sounds/initiate_attack1.wav"): None,
    ("fillets-ng-data", "usr/share/games/fillets-ng/sound/elk/en/elk-m-1.ogg"): None,
    ("supertux-data", "usr/share/games/supertux2/music/forest/forest.ogg"): "music",
    ("warzone2100-music", "usr/share/games/warzone2100/music/albums/legacy_soundtrack/track1.ogg"): "music",
    ("hyperrogue-music", "usr/share/hyperrogue/sounds/bounce.ogg"): "noise",
    ("qabcs-data", "usr/share/qabcs/abcs/all/noises/cat.ogg"): "noise",
    ("qabcs-data", "usr/share/qabcs/abcs/en/sounds/words/cat.ogg"): "speech",
    ("kajongg", "usr/share/kajongg/voices/de/male1/pung.ogg"): "speech",
}
for (pkg, rel), kind in cases.items():
    assert packages.classify(pkg, rel)[0] == kind, (pkg, rel, packages.classify(pkg, rel))
EOF_FIXTURE
"$python" "$training/mix.py" --corpus "$corpus" --packages packages --part train \
  --out mix/train --speech-mixtures 1 --nospeech-mixtures 1 --seconds 6 --augment
"$python" "$training/mix.py" --corpus "$corpus" --packages packages --part val \
  --out mix/val --speech-mixtures 1 --nospeech-mixtures 1 --seconds 6
# Augmentation moves a tone by the speed factor, and a speed-up drops what
# would pass the Nyquist frequency instead of folding it back.
PYTHONPATH=$training "$python" -c "
import random, numpy as np, mix
rng = random.Random(11)
t = np.arange(32000) / 16000
def peak_hz(y):
    return np.fft.rfftfreq(len(y), 1 / 16000)[np.abs(np.fft.rfft(y)).argmax()]
dropped = 0
for _ in range(40):
    low, high = np.sin(2 * np.pi * 500 * t), np.sin(2 * np.pi * 7000 * t)
    state = rng.getstate()
    y = mix.augment(low, rng)
    factor = len(low) / len(y)
    assert 0.79 <= factor <= 1.26 and abs(peak_hz(y) - 500 * factor) < 2, (factor, peak_hz(y))
    rng.setstate(state)
    z = mix.augment(high, rng)
    if 7000 * factor > 8000:
        assert np.sqrt(np.mean(z ** 2)) < 1e-3, (factor, peak_hz(z))
        dropped += 1
    else:
        assert abs(peak_hz(z) - 7000 * factor) < 2, (factor, peak_hz(z))
assert dropped > 0
"
grep -q "^train_effects_000	effects	" mix/train/mixtures.tsv || { cat mix/train/mixtures.tsv; exit 1; }
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
# Two networks merged into one score the mean of their scores, in the trainer
# and in the module.
"$python" "$training/ensemble.py" --out merged model tuned > /dev/null
PYTHONPATH=$training "$python" - "$rows" <<'EOF_MERGED'
import sys
import numpy as np, frames, model_io, network
rows = np.fromfile(sys.argv[1], dtype="<f4").reshape(-1, frames.FEAT_DIM)
x = rows[frames.splice_index(len(rows))].reshape(len(rows), -1)
def scores(model, priors=(0.5, 0.5)):
    return network.detector_scores(*model_io.read_network(model + "/quellan_data_b"), priors, x)
mean = (scores("model") + scores("tuned")) / 2
assert np.abs(scores("merged") - mean).max() < 1e-4, np.abs(scores("merged") - mean).max()
scores("merged", model_io.read_priors("merged/quellan_data_c")).astype("<f4").tofile("merged.f32")
EOF_MERGED
"$python" "$here/forward_check.py" trained "$forward_tool" merged "$rows" merged.f32
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
