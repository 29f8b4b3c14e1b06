# SPDX-License-Identifier: Apache-2.0
"""Chooses the class priors written to quellan_data_c.

The detector calls a frame speech when its smoothed, prior-divided log
likelihood ratio exceeds a fixed -1, so the ratio of the two priors is what
sets the network's operating point: a frame counts as speech when
ln(p_speech / p_other) > ln(prior_speech / prior_other) - 1. The priors
train.py writes are only a starting point: the frame loss's, the label
frequencies of the training frames, lean far towards speech (a posterior
of 0.11 already passes). This script runs the whole detector (`kvasr vad
--dump`, 100 ms chunks, smoothing and energy gate included) over the val
mixtures for a range of effective thresholds and keeps the priors whose
decisions reach the highest F1 averaged over the speech conditions, among
the thresholds whose false alarms on the speech-free mixtures stay within
FALSE_ALARM_LIMITS (the strictest threshold when none does); of thresholds
within F1_TIE of that F1, the highest, which has the fewest false alarms.
The dev mixtures are never looked at.
"""
import argparse
import math
import os
import shutil
import subprocess

import numpy as np

import evaluate
import model_io

# Mean F1 differences this small on the val mixtures change with the BLAS
# library's rounding, while the false alarms between neighbouring thresholds
# differ by a third: a near tie goes to the stricter threshold.
F1_TIE = 0.001
# Share of speech-free frames that may be called speech. The segment stage
# stretches every false decision over about three times as many frames, so
# these sit well below what a recogniser can bear inside segments.
FALSE_ALARM_LIMITS = {"music": 0.015, "effects": 0.015, "noise": 0.005, "silence": 0.005}
# Quarter steps where the limits usually bind: between half steps the music
# false alarms change by half, too coarse a choice.
THRESHOLDS = [t / 4.0 for t in range(-8, 5)] + [1.5, 2.0, 3.0]


def priors_for(threshold_logit):
    """Priors making `threshold_logit` the posterior log-odds at which the
    detector's fixed -1 is crossed."""
    speech = 1.0 / (1.0 + math.exp(-(threshold_logit + 1.0)))
    return np.array([1.0 - speech, speech], dtype=np.float32)


def score(kvasr, model_dir, mix_dir, work, threshold_logit):
    trial = os.path.join(work, "t%+.2f" % threshold_logit)
    dump = os.path.join(trial, "dump")
    os.makedirs(dump, exist_ok=True)
    for name in ("quellan_data_a", "quellan_data_b"):
        shutil.copyfile(os.path.join(model_dir, name), os.path.join(trial, name))
    model_io.write_priors(os.path.join(trial, "quellan_data_c"), priors_for(threshold_logit))
    wavs = sorted(os.path.join(mix_dir, r["name"] + ".wav") for r in evaluate.read_index(mix_dir))
    subprocess.run([kvasr, "vad", "--vad-models", trial, "--dump", dump] + wavs,
                   check=True, stdout=subprocess.DEVNULL)
    result = evaluate.evaluate(mix_dir, dump, "ours")
    f1 = [result[c]["decision_prf"][2] for c in evaluate.SPEECH_CONDITIONS]
    return float(np.mean(f1)), result


def within_limits(result):
    return all(result[k]["false_alarm_decision"] <= limit
               for k, limit in FALSE_ALARM_LIMITS.items() if k in result)


def main():
    ap = argparse.ArgumentParser(description=__doc__,
                                 formatter_class=argparse.RawDescriptionHelpFormatter)
    ap.add_argument("--kvasr", required=True)
    ap.add_argument("--model", required=True,
                    help="folder with quellan_data_a and _b; its quellan_data_c is rewritten")
    ap.add_argument("--mix", required=True, help="val mixtures folder")
    ap.add_argument("--work", required=True)
    ap.add_argument("--thresholds", type=float, nargs="+", default=THRESHOLDS)
    args = ap.parse_args()
    kinds = [k for k in FALSE_ALARM_LIMITS]
    print("threshold log-odds\tmean decision F1\t" +
          "\t".join("%s false alarms" % k for k in kinds))
    mean_f1 = {}
    for t in args.thresholds:
        f1, result = score(args.kvasr, args.model, args.mix, args.work, t)
        if within_limits(result):
            mean_f1[t] = f1
        print("%+.2f\t%.4f\t" % (t, f1) + "\t".join(
            "%.3f" % result[k]["false_alarm_decision"] if k in result else "-" for k in kinds),
            flush=True)
    if mean_f1:
        best_f1 = max(mean_f1.values())
        kept = max(t for t, f1 in mean_f1.items() if f1 >= best_f1 - F1_TIE)
    else:
        kept = max(args.thresholds)
    priors = priors_for(kept)
    model_io.write_priors(os.path.join(args.model, "quellan_data_c"), priors)
    print("kept threshold log-odds %+.2f: priors %.4f %.4f" % (kept, priors[0], priors[1]))


if __name__ == "__main__":
    main()
