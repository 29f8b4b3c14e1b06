# SPDX-License-Identifier: Apache-2.0
"""Precision, recall and F1 of predicted marks."""

import numpy as np

import corpus


def f1_scores(gold, pred):
    """Per-class and overall (micro over the marks) precision, recall, F1."""
    out = {}
    tp_all = fp_all = fn_all = 0
    for k, (name, _, _) in enumerate(corpus.PUNCT_LABELS):
        if k == corpus.O:
            continue
        tp = int(np.sum((pred == k) & (gold == k)))
        fp = int(np.sum((pred == k) & (gold != k)))
        fn = int(np.sum((pred != k) & (gold == k)))
        tp_all, fp_all, fn_all = tp_all + tp, fp_all + fp, fn_all + fn
        out[name] = _prf(tp, fp, fn)
    out["OVERALL"] = _prf(tp_all, fp_all, fn_all)
    return out


def _prf(tp, fp, fn):
    p = tp / (tp + fp) if tp + fp else 0.0
    r = tp / (tp + fn) if tp + fn else 0.0
    return p, r, (2 * p * r / (p + r) if p + r else 0.0)
