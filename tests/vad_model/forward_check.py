# SPDX-License-Identifier: Apache-2.0
"""Checks that the module's network code scores frames as the trainer does.

  forward_check.py trained TOOL MODEL_DIR ROWS.f32 TRAINER_SCORES.f32
      The trainer scored ROWS with the network it held in memory; the module
      reads the files the trainer wrote and scores the same rows.
  forward_check.py shipped TOOL MODEL_DIR WORK_DIR
      The trainer's forward pass, on the network read from MODEL_DIR, against
      the module, on rows drawn like normalised features.
  forward_check.py deployed MODEL_DIR DUMP.f32 DUMP.tsv
      The rows `kvasr vad --dump` recorded are those the running detector
      scored: the trainer's forward pass on them, spliced as in training,
      gives the scores the detector reported for the frames it evaluated
      (every third from the first).

The module sums each output over its inputs in order, numpy in blocks, so
single-precision rounding differs slightly; decisions may differ only where
a score sits within that rounding of the threshold.
"""
import os
import subprocess
import sys

import numpy as np

sys.path.insert(0, os.path.join(os.path.dirname(os.path.abspath(__file__)),
                                "..", "..", "training", "vad"))
import frames  # noqa: E402
import model_io  # noqa: E402
import network  # noqa: E402

SCORE_TOLERANCE = 1e-4
THRESHOLD = -1.0
RANDOM_FRAMES = 3000


def trainer_scores(model_dir, rows):
    """The trainer's forward pass on `rows`, each spliced as in training."""
    weights, biases = model_io.read_network(os.path.join(model_dir, "quellan_data_b"))
    priors = model_io.read_priors(os.path.join(model_dir, "quellan_data_c"))
    x = rows[frames.splice_index(len(rows))].reshape(len(rows), -1)
    return network.detector_scores(weights, biases, priors, x).astype(np.float64)


def module_scores(tool, model_dir, rows_path, work_dir):
    out = os.path.join(work_dir, "module_scores.f32")
    subprocess.run([tool, model_dir, rows_path, out], check=True)
    return np.fromfile(out, dtype="<f4")


def compare(module, trainer):
    if module.shape != trainer.shape:
        sys.exit("score counts differ: module %d, trainer %d" % (len(module), len(trainer)))
    diff = np.abs(module.astype(np.float64) - trainer)
    worst = int(np.argmax(diff))
    print("%d frames, score range [%.2f, %.2f], largest difference %.2e at frame %d"
          % (len(module), trainer.min(), trainer.max(), diff[worst], worst))
    if diff[worst] > SCORE_TOLERANCE:
        sys.exit("the module's scores differ from the trainer's by more than %g" % SCORE_TOLERANCE)
    flipped = (module > THRESHOLD) != (trainer > THRESHOLD)
    near = np.abs(trainer - THRESHOLD) <= SCORE_TOLERANCE
    if np.any(flipped & ~near):
        sys.exit("decisions differ away from the threshold")
    if trainer.std() < 1e-3:
        sys.exit("the scores do not vary: the check would not see a wrong layer")


EVALUATION_STRIDE_FRAMES = 3
PRINTED_SCORE_TOLERANCE = 1e-4  # the frame table prints six digits


def check_deployed(model_dir, rows_path, table_path):
    rows = frames.load_rows(os.path.dirname(rows_path),
                            os.path.basename(rows_path)[:-len(".f32")])
    reported = frames.load_frame_table(os.path.dirname(table_path),
                                       os.path.basename(table_path)[:-len(".tsv")])[:, 0]
    if len(rows) != len(reported) or len(rows) < 50:
        sys.exit("%d rows against %d frame records" % (len(rows), len(reported)))
    trainer = trainer_scores(model_dir, rows)
    evaluated = np.arange(0, len(rows), EVALUATION_STRIDE_FRAMES)
    diff = np.abs(trainer[evaluated] - reported[evaluated])
    print("%d evaluated frames, largest difference %.2e" % (len(evaluated), diff.max()))
    if diff.max() > PRINTED_SCORE_TOLERANCE * max(1.0, np.abs(reported).max()):
        sys.exit("the dumped rows do not give the scores the detector reported")


def main():
    if sys.argv[1] == "deployed":
        check_deployed(*sys.argv[2:5])
        return
    mode, tool, model_dir = sys.argv[1:4]
    if mode == "trained":
        rows_path, trainer_path = sys.argv[4:6]
        work_dir = os.path.dirname(os.path.abspath(trainer_path))
        compare(module_scores(tool, model_dir, rows_path, work_dir),
                np.fromfile(trainer_path, dtype="<f4").astype(np.float64))
        return
    work_dir = sys.argv[4]
    os.makedirs(work_dir, exist_ok=True)
    rng = np.random.default_rng(5)
    # Slowly varying rows with bursts, so that frames span both classes.
    base = rng.standard_normal((RANDOM_FRAMES // 50, frames.FEAT_DIM))
    rows = (np.repeat(base, 50, axis=0) * 1.5
            + 0.5 * rng.standard_normal((RANDOM_FRAMES, frames.FEAT_DIM))).astype("<f4")
    rows_path = os.path.join(work_dir, "rows.f32")
    rows.tofile(rows_path)
    compare(module_scores(tool, model_dir, rows_path, work_dir), trainer_scores(model_dir, rows))


if __name__ == "__main__":
    main()
