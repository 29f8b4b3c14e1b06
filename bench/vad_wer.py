#!/usr/bin/python3
"""Word error rate of `kvasr transcribe` on Debian's LibriVox test clips with
the VAD on and off, and the peak resident memory of each run.

  bench/vad_wer.py build/tools/kvasr/kvasr [--vad-models DIR]

Each clip is one recording; its final texts are joined and scored against
the reference transcription (words, case-folded) by edit distance.
"""
import argparse
import glob
import os
import re
import subprocess

DATA = "/usr/share/pocketsphinx/test/data/librivox"


def references():
    refs = {}
    with open(os.path.join(DATA, "transcription")) as f:
        for line in f:
            m = re.match(r"<s>(.*)</s> \((.*)\)", line.strip())
            if m:
                refs[m.group(2)] = m.group(1).split()
    return refs


def edit_distance(a, b):
    row = list(range(len(b) + 1))
    for i, x in enumerate(a, 1):
        prev, row[0] = row[0], i
        for j, y in enumerate(b, 1):
            prev, row[j] = row[j], min(row[j] + 1, row[j - 1] + 1, prev + (x != y))
    return row[-1]


def transcribe(cmd):
    """Output text and peak resident memory (KiB) of one run."""
    proc = subprocess.Popen(cmd, stdout=subprocess.PIPE, text=True)
    out = proc.stdout.read()
    _, status, usage = os.wait4(proc.pid, 0)
    if status != 0:
        raise SystemExit("failed: " + " ".join(cmd))
    return out, usage.ru_maxrss


def main():
    ap = argparse.ArgumentParser(description=__doc__)
    ap.add_argument("kvasr")
    ap.add_argument("--vad-models", default=None)
    args = ap.parse_args()
    refs = references()
    clips = sorted(glob.glob(os.path.join(DATA, "*.wav")))
    for mode in ("no-vad", "vad"):
        errors = words = peak = 0
        for clip in clips:
            cmd = [args.kvasr, "transcribe", "--no-progress"]
            if mode == "no-vad":
                cmd.append("--no-vad")
            elif args.vad_models:
                cmd += ["--vad-models", args.vad_models]
            text, rss = transcribe(cmd + [clip])
            ref = refs[os.path.splitext(os.path.basename(clip))[0]]
            hyp = text.lower().split()
            e = edit_distance(ref, hyp)
            errors += e
            words += len(ref)
            peak = max(peak, rss)
            print("%s %s: %d / %d: %s" % (mode, os.path.basename(clip), e, len(ref), " ".join(hyp)))
        print("%s: WER %.1f %% (%d / %d words), peak resident memory %.1f MiB"
              % (mode, 100.0 * errors / words, errors, words, peak / 1024.0))


if __name__ == "__main__":
    main()
