#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Real-time factor of `kvasr transcribe` on Debian's LibriVox test clips.

Runs the tool several times per mode and prints the median CPU seconds
(user + system, from the kernel's child accounting) per second of audio,
both for the whole command and with the model loading cost (a run on empty
input) taken out.

  bench/transcribe_rtf.py build/tools/kvasr/kvasr [--runs 5] [--mode no-vad] [--mode vad]
"""
import argparse
import glob
import os
import resource
import statistics
import subprocess
import wave

CLIPS = sorted(glob.glob("/usr/share/pocketsphinx/test/data/librivox/*.wav"))


def cpu_seconds(cmd, stdin=None):
    before = resource.getrusage(resource.RUSAGE_CHILDREN)
    subprocess.run(cmd, check=True, stdout=subprocess.DEVNULL, stdin=stdin)
    after = resource.getrusage(resource.RUSAGE_CHILDREN)
    return (after.ru_utime - before.ru_utime) + (after.ru_stime - before.ru_stime)


def main():
    parser = argparse.ArgumentParser()
    parser.add_argument("kvasr")
    parser.add_argument("--runs", type=int, default=5)
    parser.add_argument("--mode", action="append", choices=["no-vad", "vad"])
    args = parser.parse_args()
    modes = args.mode or ["no-vad"]
    audio_s = 0.0
    for clip in CLIPS:
        with wave.open(clip) as w:
            audio_s += w.getnframes() / w.getframerate()
    print(f"{len(CLIPS)} clips, {audio_s:.1f} s of audio, {args.runs} runs per mode")
    for mode in modes:
        flags = ["--no-vad"] if mode == "no-vad" else []
        base = [args.kvasr, "transcribe", "--no-progress"] + flags
        whole = [cpu_seconds(base + CLIPS) for _ in range(args.runs)]
        with open(os.devnull, "rb") as empty:
            load = [cpu_seconds(base + ["-"], stdin=empty) for _ in range(args.runs)]
        w, l = statistics.median(whole), statistics.median(load)
        print(f"{mode}: whole command {w:.2f} CPU s (RTF {w / audio_s:.3f}), "
              f"loading {l:.2f} CPU s, decoding only RTF {(w - l) / audio_s:.3f}")


if __name__ == "__main__":
    main()
