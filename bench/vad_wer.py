#!/usr/bin/python3
# SPDX-License-Identifier: Apache-2.0
"""Word error rate of `kvasr transcribe` on Debian's LibriVox test clips with
the VAD on and off, and the peak resident memory of each run.

  bench/vad_wer.py build/tools/kvasr/kvasr [--vad-models DIR]
  bench/vad_wer.py build/tools/kvasr/kvasr --noisy PACKAGE_CORPUS [--snr-db 10]

Each clip is one recording; its final texts are joined and scored against
the reference transcription (words, case-folded) by edit distance.

With --noisy, all clips go into one recording, PAUSE_S of background before
each and after the last, over music and effects of the packages held out
for dev (training/vad/packages.py decodes them; the network never heard
them) at the given SNR; the words are scored against the joined references.
The same background with the speech left out is transcribed as well: every
word found there is one the recogniser heard in music or effects alone.
"""
import argparse
import glob
import os
import re
import random
import subprocess
import sys
import tempfile

import numpy as np
import soundfile

sys.path.insert(0, os.path.join(os.path.dirname(os.path.abspath(__file__)), "../training/vad"))
import corpus  # noqa: E402
import packages  # noqa: E402

DATA = "/usr/share/pocketsphinx/test/data/librivox"
RATE_HZ = 16000
PAUSE_S = 8.0
NOISY_SEED = 11


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


def dev_backgrounds(package_corpus):
    rows = [r for r in corpus.read_manifest(package_corpus)
            if r["kind"] != "speech" and packages.PACKAGES[r["source"]][1] == "dev"]
    return sorted(rows, key=lambda r: r["path"])


def background(rows, samples, rng):
    """Music and effects files of the held-out packages, one after another,
    each at the same RMS."""
    parts, total = [], 0
    while total < samples:
        x = soundfile.read(rng.choice(rows)["file"], dtype="float64")[0]
        parts.append(x / max(np.sqrt(np.mean(x ** 2)), 1e-9))
        total += len(x)
    return np.concatenate(parts)[:samples]


def noisy_recordings(clips, package_corpus, snr_db, out_dir):
    """The clips with pauses, over background at snr_db, and the same
    background alone."""
    rng = random.Random(NOISY_SEED)
    rows = dev_backgrounds(package_corpus)
    pause = int(PAUSE_S * RATE_HZ)
    speech = [np.zeros(pause)]
    for clip in clips:
        speech += [soundfile.read(clip, dtype="float64")[0], np.zeros(pause)]
    speech = np.concatenate(speech)
    level = np.sqrt(np.mean(np.concatenate([soundfile.read(c, dtype="float64")[0]
                                             for c in clips]) ** 2))
    noise = background(rows, len(speech), rng) * level / 10 ** (snr_db / 20)
    mixed, alone = speech + noise, noise
    peak = max(np.abs(mixed).max(), np.abs(alone).max())
    scale = min(1.0, 0.97 / peak)
    paths = []
    for name, x in (("noisy.wav", mixed), ("background.wav", alone)):
        paths.append(os.path.join(out_dir, name))
        soundfile.write(paths[-1], x * scale, RATE_HZ, subtype="PCM_16")
    return paths


def command(args, mode):
    cmd = [args.kvasr, "transcribe", "--no-progress"]
    if mode == "no-vad":
        cmd.append("--no-vad")
    elif args.vad_models:
        cmd += ["--vad-models", args.vad_models]
    return cmd


def main_noisy(args, refs, clips):
    ref = [w for clip in clips for w in refs[os.path.splitext(os.path.basename(clip))[0]]]
    with tempfile.TemporaryDirectory() as tmp:
        noisy, alone = noisy_recordings(clips, args.noisy, args.snr_db, tmp)
        for mode in ("no-vad", "vad"):
            cmd = command(args, mode)
            hyp = transcribe(cmd + [noisy])[0].lower().split()
            stray = transcribe(cmd + [alone])[0].lower().split()
            errors = edit_distance(ref, hyp)
            print("%s, %g dB: WER %.1f %% (%d / %d words); %d words in the background alone: %s"
                  % (mode, args.snr_db, 100.0 * errors / len(ref), errors, len(ref),
                     len(stray), " ".join(stray)))


def main():
    ap = argparse.ArgumentParser(description=__doc__,
                                 formatter_class=argparse.RawDescriptionHelpFormatter)
    ap.add_argument("kvasr")
    ap.add_argument("--vad-models", default=None)
    ap.add_argument("--noisy", metavar="PACKAGE_CORPUS",
                    help="the package corpus that training/vad/packages.py decodes")
    ap.add_argument("--snr-db", type=float, default=10.0)
    args = ap.parse_args()
    refs = references()
    clips = sorted(glob.glob(os.path.join(DATA, "*.wav")))
    if args.noisy:
        main_noisy(args, refs, clips)
        return
    for mode in ("no-vad", "vad"):
        errors = words = peak = 0
        for clip in clips:
            cmd = command(args, mode)
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
