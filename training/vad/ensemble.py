# SPDX-License-Identifier: Apache-2.0
"""Merges networks trained alike into one whose logits are their mean.

  ensemble.py --out DIR MODEL_DIR [MODEL_DIR ...]

The networks must share their input length, depth and mean table (the same
recipe with different seeds). The detector's file format holds the mean of
their logits exactly: the hidden layers side by side, every later hidden
layer block-diagonal so that each network keeps to its own units, and the
output layer stacked and divided by the count. One training run's operating
point on unheard sound moves by as much as the differences between settings
we compare; the mean of a few runs moves much less, for the cost of wider
layers. DIR gets the first model's mean table and priors (tune_priors.py
chooses the priors afterwards).
"""
import argparse
import filecmp
import os
import shutil

import numpy as np

import model_io


def merge(networks):
    """(weights, biases) of the network whose logits are the mean of those of
    `networks`, each a (weights, biases) pair as model_io reads them."""
    depth = len(networks[0][0])
    if depth < 2:
        raise ValueError("only networks with hidden layers can be merged")
    if any(len(w) != depth or w[0].shape[0] != networks[0][0][0].shape[0]
           or w[-1].shape[1] != networks[0][0][-1].shape[1] for w, _ in networks):
        raise ValueError("the networks differ in inputs, depth or classes")
    count = len(networks)
    weights, biases = [], []
    for layer in range(depth):
        ws = [w[layer] for w, _ in networks]
        bs = [b[layer] for _, b in networks]
        if layer == depth - 1:
            weights.append(np.concatenate(ws, axis=0) / count)
            biases.append(np.mean(bs, axis=0))
            continue
        if layer == 0:
            weights.append(np.concatenate(ws, axis=1))
        else:
            block = np.zeros((sum(w.shape[0] for w in ws), sum(w.shape[1] for w in ws)))
            row = col = 0
            for w in ws:
                block[row:row + w.shape[0], col:col + w.shape[1]] = w
                row, col = row + w.shape[0], col + w.shape[1]
            weights.append(block)
        biases.append(np.concatenate(bs))
    return ([w.astype(np.float32) for w in weights], [b.astype(np.float32) for b in biases])


def main():
    ap = argparse.ArgumentParser(description=__doc__,
                                 formatter_class=argparse.RawDescriptionHelpFormatter)
    ap.add_argument("--out", required=True)
    ap.add_argument("models", nargs="+")
    args = ap.parse_args()
    table = os.path.join(args.models[0], "quellan_data_a")
    for m in args.models[1:]:
        if not filecmp.cmp(table, os.path.join(m, "quellan_data_a"), shallow=False):
            raise SystemExit("%s has another mean table than %s" % (m, args.models[0]))
    weights, biases = merge([model_io.read_network(os.path.join(m, "quellan_data_b"))
                             for m in args.models])
    os.makedirs(args.out, exist_ok=True)
    shutil.copyfile(table, os.path.join(args.out, "quellan_data_a"))
    shutil.copyfile(os.path.join(args.models[0], "quellan_data_c"),
                    os.path.join(args.out, "quellan_data_c"))
    model_io.write_network(os.path.join(args.out, "quellan_data_b"), weights, biases)
    print("merged %d networks: hidden layers %s" % (len(args.models),
                                                    [w.shape[1] for w in weights[:-1]]))


if __name__ == "__main__":
    main()
