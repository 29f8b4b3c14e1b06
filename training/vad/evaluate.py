# SPDX-License-Identifier: Apache-2.0
"""Detection quality on the dev mixtures, per condition.

For each speech condition (clean, 20, 10, 5, 0 dB SNR): frame precision,
recall and F1 of the per-frame decisions and of the emitted segments, ROC-AUC
of the smoothed score, and the share of speech onsets that the decisions or
the segments reach more than 100 ms late (or never). For the speech-free
mixtures (music, noise, near silence): false alarms as the share of their
frames marked speech.

Our detector is read from `kvasr vad --dump` records (<name>.tsv). Another
detector can be scored from per-frame probabilities (<name>.prob, float32 per
10 ms frame); a probability of at least 0.5 is speech and it has no segments.
"""
import argparse
import json
import os

import numpy as np

import frames
import metrics

ONSET_GAP_FRAMES = 10   # non-speech before a labelled onset
ONSET_LATE_FRAMES = 10  # 100 ms
PROB_THRESHOLD = 0.5
SPEECH_CONDITIONS = ("clean", "20dB", "10dB", "5dB", "0dB")


def read_index(mix_dir):
    with open(os.path.join(mix_dir, "mixtures.tsv")) as f:
        header = next(f).rstrip("\n").split("\t")
        return [dict(zip(header, line.rstrip("\n").split("\t"))) for line in f]


def onsets(labels):
    starts = np.flatnonzero(np.diff(np.concatenate(([0], labels))) == 1)
    keep = []
    for s in starts:
        before = labels[max(0, s - ONSET_GAP_FRAMES):s]
        if s >= ONSET_GAP_FRAMES and not before.any():
            keep.append(s)
    return keep


def late_onsets(labels, detected):
    """Onsets whose first detection within the speech run comes more than
    100 ms after the onset, or not at all, and the onsets counted."""
    late = total = 0
    for s in onsets(labels):
        end = s
        while end < len(labels) and labels[end]:
            end += 1
        hits = np.flatnonzero(detected[s:end])
        total += 1
        if len(hits) == 0 or hits[0] > ONSET_LATE_FRAMES:
            late += 1
    return late, total


def load_detector(source_dir, name, kind):
    """Decisions, scores, emitted-segment flags and energy-gate flags (the
    last two only for our detector)."""
    if kind == "ours":
        t = frames.load_frame_table(source_dir, name)
        return t[:, 3], t[:, 1], t[:, 4], t[:, 2]
    p = np.fromfile(os.path.join(source_dir, name + ".prob"), dtype="<f4")
    return (p >= PROB_THRESHOLD).astype(float), p, None, None


def evaluate(mix_dir, source_dir, kind):
    groups = {}
    for row in read_index(mix_dir):
        labels = frames.load_labels(mix_dir, row["name"])
        decision, score, emitted, gate = load_detector(source_dir, row["name"], kind)
        n = min(len(labels), len(decision))
        g = groups.setdefault(row["condition"], {"y": [], "d": [], "s": [], "e": [], "g": [],
                                                 "late_d": 0, "late_e": 0, "onsets": 0})
        g["y"].append(labels[:n])
        g["d"].append(decision[:n])
        g["s"].append(score[:n])
        if emitted is not None:
            g["e"].append(emitted[:n])
            g["g"].append(gate[:n])
        late, total = late_onsets(labels[:n], decision[:n])
        g["late_d"] += late
        g["onsets"] += total
        if emitted is not None:
            g["late_e"] += late_onsets(labels[:n], emitted[:n])[0]
    result = {}
    for cond, g in groups.items():
        y = np.concatenate(g["y"])
        d = np.concatenate(g["d"])
        e = np.concatenate(g["e"]) if g["e"] else None
        r = {"frames": int(len(y))}
        if cond in SPEECH_CONDITIONS:
            r["decision_prf"] = metrics.precision_recall_f1(d, y)
            r["auc"] = metrics.roc_auc(np.concatenate(g["s"]), y)
            r["onsets"] = g["onsets"]
            r["late_onsets_decision"] = g["late_d"] / max(g["onsets"], 1)
            if e is not None:
                r["segment_prf"] = metrics.precision_recall_f1(e, y)
                r["late_onsets_segment"] = g["late_e"] / max(g["onsets"], 1)
                # Speech too quiet for the fixed energy gate: no network can
                # pass it, only the segment margins can cover it.
                speech, closed = y > 0, np.concatenate(g["g"]) == 0
                missed = speech & (e == 0)
                r["speech_under_gate"] = float(np.mean(closed[speech]))
                r["segment_misses_under_gate"] = float(np.mean(closed[missed])) \
                    if missed.any() else 0.0
        else:
            r["false_alarm_decision"] = float(np.mean(d))
            if e is not None:
                r["false_alarm_segment"] = float(np.mean(e))
        result[cond] = r
    return result


def fmt(v):
    return "—" if v is None or (isinstance(v, float) and np.isnan(v)) else "%.3f" % v


def print_table(title, columns, rows):
    print("\n%s\n" % title)
    print("| " + " | ".join(columns) + " |")
    print("|---|" + "---:|" * (len(columns) - 1))
    for row in rows:
        print("| " + " | ".join(row) + " |")


def print_tables(name, result):
    speech = [(c, result[c]) for c in SPEECH_CONDITIONS if c in result]
    print_table("%s: speech mixtures" % name, [
        "SNR", "frames", "decision P", "decision R", "decision F1", "segment P", "segment R",
        "segment F1", "AUC", "onsets", "late onsets, decisions", "late onsets, segments"], [
        [c, str(r["frames"]), *map(fmt, r["decision_prf"]),
         *map(fmt, r.get("segment_prf", (None, None, None))), fmt(r["auc"]), str(r["onsets"]),
         fmt(r["late_onsets_decision"]), fmt(r.get("late_onsets_segment"))] for c, r in speech])
    if any("speech_under_gate" in r for _, r in speech):
        print_table("%s: labelled speech under the energy gate" % name, [
            "SNR", "share of speech frames", "share of the segments' missed speech frames"], [
            [c, fmt(r["speech_under_gate"]), fmt(r["segment_misses_under_gate"])]
            for c, r in speech])
    print_table("%s: speech-free mixtures (share of frames marked speech)" % name,
                ["kind", "frames", "decisions", "segments"], [
                    [k, str(result[k]["frames"]), fmt(result[k]["false_alarm_decision"]),
                     fmt(result[k].get("false_alarm_segment"))]
                    for k in frames.NOSPEECH_KINDS if k in result])


def main():
    ap = argparse.ArgumentParser(description=__doc__,
                                 formatter_class=argparse.RawDescriptionHelpFormatter)
    ap.add_argument("--mix", required=True, help="dev mixtures folder")
    ap.add_argument("--ours", help="folder of kvasr vad --dump records")
    ap.add_argument("--probs", help="folder of another detector's <name>.prob files")
    ap.add_argument("--probs-name", default="other")
    ap.add_argument("--json", help="write all figures here")
    args = ap.parse_args()
    out = {}
    if args.ours:
        out["kvasr"] = evaluate(args.mix, args.ours, "ours")
        print_tables("kvasr", out["kvasr"])
    if args.probs:
        out[args.probs_name] = evaluate(args.mix, args.probs, "probs")
        print_tables(args.probs_name, out[args.probs_name])
    if args.json:
        with open(args.json, "w") as f:
            json.dump(out, f, indent=1)


if __name__ == "__main__":
    main()
