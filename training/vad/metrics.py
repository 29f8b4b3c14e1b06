# SPDX-License-Identifier: Apache-2.0
"""Frame-level detection measures shared by training and evaluation."""
import numpy as np


def roc_auc(scores, labels):
    """Area under the ROC curve; ties count half (Mann-Whitney)."""
    labels = np.asarray(labels).astype(bool)
    pos, neg = labels.sum(), (~labels).sum()
    if pos == 0 or neg == 0:
        return float("nan")
    order = np.argsort(scores, kind="mergesort")
    s = np.asarray(scores)[order]
    ranks = np.empty(len(s))
    # Average ranks over runs of equal scores.
    edges = np.flatnonzero(np.diff(s)) + 1
    starts = np.concatenate(([0], edges))
    ends = np.concatenate((edges, [len(s)]))
    for a, b in zip(starts, ends):
        ranks[a:b] = (a + b + 1) / 2.0
    r = np.empty(len(s))
    r[order] = ranks
    return float((r[labels].sum() - pos * (pos + 1) / 2.0) / (pos * neg))


def precision_recall_f1(decisions, labels):
    d = np.asarray(decisions).astype(bool)
    y = np.asarray(labels).astype(bool)
    tp = np.sum(d & y)
    precision = tp / d.sum() if d.sum() else float("nan")
    recall = tp / y.sum() if y.sum() else float("nan")
    f1 = 2 * precision * recall / (precision + recall) if tp else 0.0
    return float(precision), float(recall), float(f1)
