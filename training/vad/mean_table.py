# SPDX-License-Identifier: Apache-2.0
"""The cepstral mean table, and the seed model used to compute it.

The table is the starting point of the detector's running mean and variance
normalisation. Its values are where those running statistics settle on the
training mixtures: a first pass runs the pipeline with a neutral seed table
(means 0, variances 1; the network does not influence the features) and
records, after every 100 ms call, the running mean and variance; the table is
their average over all calls of all training mixtures. The seed only shapes
the first second or so of each mixture of that pass, since the running
statistics forget at 1 % a frame.
"""
import argparse
import glob
import os

import numpy as np

import model_io

FEAT_DIM = 39
SPLICE_FRAMES = 11


def write_seed(out_dir):
    os.makedirs(out_dir, exist_ok=True)
    model_io.write_mean_table(os.path.join(out_dir, "quellan_data_a"),
                              np.zeros(FEAT_DIM), np.ones(FEAT_DIM))
    # Any network serves: the features do not depend on it.
    weights = [np.zeros((FEAT_DIM * SPLICE_FRAMES, 1)), np.zeros((1, 2))]
    biases = [np.zeros(1), np.zeros(2)]
    model_io.write_network(os.path.join(out_dir, "quellan_data_b"), weights, biases)
    model_io.write_priors(os.path.join(out_dir, "quellan_data_c"), [0.5, 0.5])


def table_from_stats(stats_dir):
    total, mean_sum, var_sum = 0, np.zeros(FEAT_DIM), np.zeros(FEAT_DIM)
    for path in sorted(glob.glob(os.path.join(stats_dir, "*.stats"))):
        with open(path) as f:
            calls = int(f.readline())
            mean = np.array(f.readline().split(), dtype=np.float64)
            var = np.array(f.readline().split(), dtype=np.float64)
        if calls == 0:
            continue
        total += calls
        mean_sum += calls * mean
        var_sum += calls * var
    if total == 0:
        raise SystemExit("no statistics in " + stats_dir)
    return mean_sum / total, var_sum / total


def main():
    ap = argparse.ArgumentParser(description=__doc__)
    sub = ap.add_subparsers(dest="command", required=True)
    s = sub.add_parser("seed", help="write the seed model folder")
    s.add_argument("out_dir")
    t = sub.add_parser("table", help="average the first pass's .stats files")
    t.add_argument("stats_dir")
    t.add_argument("out_file")
    args = ap.parse_args()
    if args.command == "seed":
        write_seed(args.out_dir)
    else:
        mean, var = table_from_stats(args.stats_dir)
        model_io.write_mean_table(args.out_file, mean, var)


if __name__ == "__main__":
    main()
