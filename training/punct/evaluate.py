# SPDX-License-Identifier: Apache-2.0
"""Scores the punctuation library, through its C functions, on the IWSLT 2011
test sets: precision, recall and F1 per mark and overall (micro over COMMA,
PERIOD, QUESTION, token level), and casing accuracy against the cased
reference text."""

import argparse
import ctypes
import difflib
import os
import sys
import time

import numpy as np

import corpus
from scoring import f1_scores

FILES = ["model.bin", "vocab.txt", "punc.txt", "num.txt", "case.txt",
         "xdb.txt", "bpe.txt"]
MARKS = {",": corpus.COMMA, ".": corpus.PERIOD, "?": corpus.QUESTION}
EDGE_PUNCT = "\"()[],.?!;:-"


class Library:
    def __init__(self, lib_path, model_dir, lang="en"):
        self.lib = ctypes.CDLL(lib_path)
        self.lib.punctuator_init.restype = ctypes.c_void_p
        self.lib.punctuator_init.argtypes = [ctypes.c_char_p] * 8
        self.lib.punctuator_do_it.argtypes = [
            ctypes.c_void_p, ctypes.c_char_p, ctypes.c_char_p,
            ctypes.POINTER(ctypes.c_int32)]
        self.lib.punctuator_relese.argtypes = [ctypes.c_void_p]
        paths = [os.path.join(model_dir, f).encode() for f in FILES]
        self.handle = self.lib.punctuator_init(*paths, lang.encode())
        if not self.handle:
            raise RuntimeError("punctuator_init failed")

    def punctuate(self, text):
        data = text.encode()
        size = ctypes.c_int32(0)
        r = self.lib.punctuator_do_it(self.handle, data, None,
                                      ctypes.byref(size))
        if r == 1:
            buf = ctypes.create_string_buffer(size.value)
            r = self.lib.punctuator_do_it(self.handle, data, buf,
                                          ctypes.byref(size))
            return buf.raw[:size.value].decode()
        if r == 0:
            return ""
        raise RuntimeError(f"punctuator_do_it returned {r}")

    def close(self):
        self.lib.punctuator_relese(self.handle)


def split_marks(token):
    label = corpus.O
    while token and token[-1] in MARKS:
        label = max(label, MARKS[token[-1]])
        token = token[:-1]
    return token, label


def align_labels(words, output):
    """Mark after each input word, read back from the output; a number
    written as one token lends its mark to the last word it stands for."""
    out_words, out_labels = [], []
    for tok in output.split():
        w, label = split_marks(tok)
        out_words.append(w.lower())
        out_labels.append(label)
    labels = [corpus.O] * len(words)
    sm = difflib.SequenceMatcher(None, words, out_words, autojunk=False)
    for op, i1, i2, j1, j2 in sm.get_opcodes():
        if op == "equal":
            labels[i1:i2] = out_labels[j1:j2]
        elif op == "replace":
            labels[i2 - 1] = out_labels[j2 - 1]
    return labels


def score_file(lib, path):
    words, gold, tokens_per_word = corpus.read_labelled(path)
    t0 = time.time()
    output = lib.punctuate(" ".join(words))
    elapsed = time.time() - t0
    pred = align_labels(words, output)
    # Back to the file's tokens: a word's earlier clitic parts carry no mark.
    gold_tokens, pred_tokens = [], []
    with open(path, encoding="utf-8") as f:
        names = {n: i for i, (n, _, _) in enumerate(corpus.PUNCT_LABELS)}
        file_labels = [names[line.rstrip("\n").partition("\t")[2]]
                       for line in f if line.partition("\t")[0]]
    k = 0
    for p, n in zip(pred, tokens_per_word):
        gold_tokens += file_labels[k:k + n]
        pred_tokens += [corpus.O] * (n - 1) + [p]
        k += n
    scores = f1_scores(np.array(gold_tokens), np.array(pred_tokens))
    return scores, output, elapsed, len(words)


def bare_cased(token):
    return token.strip(EDGE_PUNCT)


def casing_accuracy(reference_path, output):
    ref = [bare_cased(t) for t in open(reference_path, encoding="utf-8")
           .read().split()]
    ref = [t for t in ref if t]
    hyp = [bare_cased(t) for t in output.split()]
    hyp = [t for t in hyp if t]
    sm = difflib.SequenceMatcher(None, [t.lower() for t in ref],
                                 [t.lower() for t in hyp], autojunk=False)
    total = right = ref_upper = ref_upper_right = hyp_upper = 0
    for op, i1, i2, j1, j2 in sm.get_opcodes():
        if op != "equal":
            continue
        for r, h in zip(ref[i1:i2], hyp[j1:j2]):
            if not any(c.isalpha() for c in r):
                continue
            total += 1
            right += r == h
            if r != r.lower():
                ref_upper += 1
                ref_upper_right += r == h
            hyp_upper += h != h.lower()
    return {"words": total, "accuracy": right / total,
            "capitalised_in_reference": ref_upper,
            "recall_of_capitalised": ref_upper_right / max(1, ref_upper),
            "precision_of_capitalised": ref_upper_right / max(1, hyp_upper)}


def main():
    ap = argparse.ArgumentParser(description=__doc__)
    ap.add_argument("--lib", required=True, help="libkvasr_punctuator.so")
    ap.add_argument("--model", required=True, help="model folder")
    ap.add_argument("--data", required=True, help="the punct data folder")
    ap.add_argument("--sets", nargs="+", default=["test2011", "test2011asr"],
                    help="token/label files to score: names under iwslt2012/ or "
                    "paths (dev2012 to choose settings, the test files only "
                    "to report)")
    args = ap.parse_args()
    lib = Library(args.lib, args.model)
    print("| set | COMMA P / R / F1 | PERIOD P / R / F1 | QUESTION P / R / F1 "
          "| Overall P / R / F1 |")
    print("|---|---|---|---|---|")
    outputs = {}
    for name in args.sets:
        scores, output, elapsed, n = score_file(
            lib, name if os.path.isfile(name) else
            os.path.join(args.data, "iwslt2012", name))
        outputs[name] = output
        cells = [" / ".join(f"{100 * x:.1f}" for x in scores[k])
                 for k in ("COMMA", "PERIOD", "QUESTION", "OVERALL")]
        print(f"| {name} | " + " | ".join(cells) + " |")
        print(f"  ({n} words in one call, {elapsed:.2f} s)", file=sys.stderr)
    if "test2011" not in outputs:
        lib.close()
        return 0
    cas = casing_accuracy(
        os.path.join(args.data, "iwslt2012", "tst2011.cased.txt"),
        outputs["test2011"])
    print(f"casing on tst2011.cased.txt: {cas['words']} aligned words, "
          f"accuracy {100 * cas['accuracy']:.2f}%, capitalised in reference "
          f"{cas['capitalised_in_reference']}: recall "
          f"{100 * cas['recall_of_capitalised']:.1f}%, precision "
          f"{100 * cas['precision_of_capitalised']:.1f}%")
    lib.close()
    return 0


if __name__ == "__main__":
    sys.exit(main())
