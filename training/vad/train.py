# SPDX-License-Identifier: Apache-2.0
"""Trains the detector's network on frames the pipeline itself produced.

Inputs are the dumps of `kvasr vad --dump` over the train and val mixtures
(the rows the network's inputs are spliced from) and the mixtures' labels.
Writes quellan_data_b (network) and quellan_data_c (class priors) to --out,
next to the given mean table, which it copies as quellan_data_a. With several
--hidden choices it trains each and prints accuracy against cost on val, then
keeps the one given by --keep.

Two losses: `frame`, the cross-entropy of single frames drawn at random
(priors: the label frequencies); and `decision`, the cross-entropy of the
detector's own smoothed, gated decisions over pieces of consecutive frames
(decision.py; priors equal), which train.sh uses to fine-tune a network the
frame loss trained (--init).
"""
import argparse
import json
import os
import shutil
import time

import numpy as np

import decision
import frames
import metrics
import model_io
import network
from evaluate import SPEECH_CONDITIONS, read_index

INPUT_SCALE_SAMPLE = 200000


def parse_hidden(text):
    return [int(h) for h in text.split(",") if h]


def validate(net, priors, data, conditions, batch=65536):
    """Val figures: accuracy and AUC of the single-frame scores, and the
    detector's decisions (smoothing and energy gate as deployed) as F1
    averaged over the speech conditions."""
    scores = np.concatenate([
        network.detector_scores(net.weights, net.biases, priors,
                                data.inputs(slice(i, i + batch)))
        for i in range(0, len(data), batch)])
    acc = float(np.mean((scores > decision.SCORE_THRESHOLD) == (data.labels == 1)))
    by_condition = {}
    for name, offset, count in data.spans:
        frames_of = slice(offset, offset + count)
        d = decision.decisions(scores[frames_of][::decision.EVAL_STRIDE_FRAMES],
                               data.gate[frames_of])
        by_condition.setdefault(conditions[name], []).append((d, data.labels[frames_of]))
    f1 = [metrics.precision_recall_f1(np.concatenate([d for d, _ in pairs]),
                                      np.concatenate([y for _, y in pairs]))[2]
          for c, pairs in by_condition.items() if c in SPEECH_CONDITIONS]
    return {"accuracy": acc, "auc": metrics.roc_auc(scores, data.labels),
            "decision_f1": float(np.mean(f1)) if f1 else float("nan")}


def frame_batches(train, weights, batch, rng):
    """(frames, gradient function) for random batches of single frames."""
    order = rng.permutation(len(train))
    for i in range(0, len(order), batch):
        which = np.sort(order[i:i + batch])
        yield which, lambda net, x, y=train.labels[which], w=weights[which]: \
            net.gradients(x, y, w)


def train_one(hidden, train, weights, val, conditions, priors, args, rng):
    sample = rng.choice(len(train), size=min(len(train), INPUT_SCALE_SAMPLE), replace=False)
    x_sample = train.inputs(np.sort(sample))
    mean = x_sample.mean(axis=0)
    scale = x_sample.std(axis=0) + 1e-3
    net = network.Network(x_sample.shape[1], hidden, rng)
    if args.init:
        net.weights, net.biases = model_io.read_network(os.path.join(args.init, "quellan_data_b"))
        if net.hidden != hidden:
            raise SystemExit("--init has hidden layers %s, not %s" % (net.hidden, hidden))
        net.unfold_input_scaling(mean, scale)
    opt = network.Adam(net.weights + net.biases, args.lr)
    pieces = decision.Pieces(train) if args.loss == "decision" else None
    # The frame loss keeps the epoch whose single-frame decisions are most
    # often right; the decision loss the one whose detector decisions are.
    criterion = "decision_f1" if pieces else "accuracy"
    best = None
    steps = 0
    started = time.time()
    for epoch in range(args.epochs):
        batches = pieces.batches(weights, args.batch, rng) if pieces \
            else frame_batches(train, weights, args.batch, rng)
        losses = []
        for which, gradients in batches:
            x = (train.inputs(which) - mean) / scale
            loss, gw, gb = gradients(net, x.astype(np.float32))
            opt.step(gw + gb)
            losses.append(loss)
            steps += 1
            if args.max_steps and steps >= args.max_steps:
                break
        opt.lr *= args.lr_decay
        exported = network.Network(1, [], rng)
        exported.weights = [w.copy() for w in net.weights]
        exported.biases = [b.copy() for b in net.biases]
        exported.fold_input_scaling(mean, scale)
        figures = validate(exported, priors, val, conditions)
        print("hidden %s epoch %d: train loss %.4f, val accuracy %.4f, AUC %.4f, "
              "decision F1 %.4f (%.0f s)"
              % (hidden, epoch + 1, np.mean(losses), figures["accuracy"], figures["auc"],
                 figures["decision_f1"], time.time() - started), flush=True)
        if best is None or figures[criterion] > best[0][criterion]:
            best = (figures, exported, epoch + 1)
        if args.max_steps and steps >= args.max_steps:
            break
    return best


def frame_weights(frame_set, mix_dir, nospeech_weight):
    """Loss weight of every frame: those of the speech-free mixtures count
    `nospeech_weight` times. The false alarms come from a few dozen music and
    noise files, which a plain mean over all frames lets the speech outvote."""
    free = set(frames.mixture_names(mix_dir, frames.NOSPEECH_KINDS))
    weights = np.ones(len(frame_set))
    for name, offset, count in frame_set.spans:
        if name in free:
            weights[offset:offset + count] = nospeech_weight
    return weights


def write_model(out_dir, table, net, priors):
    os.makedirs(out_dir, exist_ok=True)
    if os.path.abspath(table) != os.path.abspath(os.path.join(out_dir, "quellan_data_a")):
        shutil.copyfile(table, os.path.join(out_dir, "quellan_data_a"))
    model_io.write_network(os.path.join(out_dir, "quellan_data_b"), net.weights, net.biases)
    model_io.write_priors(os.path.join(out_dir, "quellan_data_c"), priors)


def main():
    ap = argparse.ArgumentParser(description=__doc__,
                                 formatter_class=argparse.RawDescriptionHelpFormatter)
    ap.add_argument("--mix", required=True, help="folder with train/ and val/ mixtures")
    ap.add_argument("--dump", required=True, help="folder with train/ and val/ dumps")
    ap.add_argument("--table", required=True, help="the mean table the dumps were made with")
    ap.add_argument("--out", required=True)
    ap.add_argument("--hidden", action="append", default=None,
                    help="hidden sizes, comma-separated; repeat to compare several")
    ap.add_argument("--keep", default=None, help="which --hidden to write (default: the first)")
    ap.add_argument("--epochs", type=int, default=4)
    ap.add_argument("--loss", choices=("frame", "decision"), default="frame",
                    help="cross-entropy of single frames, or of the detector's smoothed "
                    "decisions on pieces of 3.45 s")
    ap.add_argument("--batch", type=int, default=256,
                    help="frames (frame loss) or pieces (decision loss) per step")
    ap.add_argument("--init", help="model folder whose network training starts from")
    ap.add_argument("--lr", type=float, default=2e-3)
    ap.add_argument("--lr-decay", type=float, default=0.6)
    ap.add_argument("--max-steps", type=int, default=0, help="stop after this many steps (smoke runs)")
    ap.add_argument("--max-mixtures", type=int, default=0, help="use only this many mixtures per part")
    ap.add_argument("--nospeech-weight", type=float, default=1.0,
                    help="loss weight of the frames of speech-free mixtures")
    ap.add_argument("--seed", type=int, default=1)
    ap.add_argument("--report", help="write the comparison of sizes here (JSON)")
    ap.add_argument("--check-rows", help="feature rows (float32, 39 a frame) of one utterance")
    ap.add_argument("--check-scores", help="write the kept network's scores of --check-rows here")
    args = ap.parse_args()
    hidden_choices = args.hidden or ["32"]
    keep = args.keep or hidden_choices[0]

    rng = np.random.default_rng(args.seed)
    sets = {}
    for part in ("train", "val"):
        names = frames.mixture_names(os.path.join(args.mix, part))
        if args.max_mixtures:
            names = names[:args.max_mixtures]
        sets[part] = frames.FrameSet(os.path.join(args.mix, part),
                                     os.path.join(args.dump, part), names)
    train, val = sets["train"], sets["val"]
    weights = frame_weights(train, os.path.join(args.mix, "train"), args.nospeech_weight)
    speech_share = float(np.mean(train.labels))
    # The decision loss trains the scores with equal priors; the frame loss
    # leaves posteriors at the label frequencies. tune_priors.py moves either.
    priors = np.array([0.5, 0.5] if args.loss == "decision" else
                      [1.0 - speech_share, speech_share], dtype=np.float32)
    conditions = {r["name"]: r["condition"] for r in read_index(os.path.join(args.mix, "val"))}
    print("train frames %d (speech %.3f), val frames %d" % (len(train), speech_share, len(val)))

    results = []
    kept = None
    for text in hidden_choices:
        hidden = parse_hidden(text)
        figures, net, epoch = train_one(hidden, train, weights, val, conditions, priors,
                                        args, rng)
        cost = net.multiply_adds()
        results.append({"hidden": text, "val_accuracy": figures["accuracy"],
                        "val_auc": figures["auc"], "val_decision_f1": figures["decision_f1"],
                        "epoch": epoch, "multiply_adds_per_evaluation": cost})
        if text == keep:
            kept = net
        if len(hidden_choices) > 1:
            write_model(os.path.join(args.out, "hidden_" + text.replace(",", "x")),
                        args.table, net, priors)
    print("\nhidden\tval accuracy\tval AUC\tval decision F1\tmultiply-adds per evaluation")
    for r in results:
        print("%s\t%.4f\t%.4f\t%.4f\t%d" % (r["hidden"], r["val_accuracy"], r["val_auc"],
                                            r["val_decision_f1"],
                                            r["multiply_adds_per_evaluation"]))
    if kept is None:
        raise SystemExit("--keep %s is not among --hidden" % keep)
    write_model(args.out, args.table, kept, priors)
    if args.report:
        with open(args.report, "w") as f:
            json.dump({"kept": keep, "priors": priors.tolist(), "train_frames": len(train),
                       "val_frames": len(val), "results": results}, f, indent=1)
    if args.check_rows:
        # The network as held in memory, not as read back from the file.
        rows = np.fromfile(args.check_rows, dtype="<f4").reshape(-1, frames.FEAT_DIM)
        x = rows[frames.splice_index(len(rows))].reshape(len(rows), -1)
        network.detector_scores(kept.weights, kept.biases, priors, x).astype("<f4").tofile(
            args.check_scores)


if __name__ == "__main__":
    main()
