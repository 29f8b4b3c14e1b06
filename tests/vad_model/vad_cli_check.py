# SPDX-License-Identifier: Apache-2.0
"""`kvasr vad` on a synthetic recording: the segment list, the per-frame
listing and the plot describe the same detection.

  vad_cli_check.py KVASR MODEL_DIR WORK_DIR
"""
import os
import shutil
import subprocess
import sys
import wave

import numpy as np

RATE_HZ = 16000
FRAME_SHIFT_SAMPLES = 160
WINDOW_SAMPLES = 400


def write_recording(path):
    """Three loud vowel-like bursts of 1 s between 2 s of faint noise."""
    rng = np.random.default_rng(2)
    t = np.arange(9 * RATE_HZ) / RATE_HZ
    voiced = sum(np.sin(2 * np.pi * f * t) / k for k, f in enumerate((140, 280, 700, 1200), 1))
    on = ((t % 3.0) >= 2.0).astype(float)
    x = 6000 * voiced * on + 20 * rng.standard_normal(len(t))
    with wave.open(path, "wb") as w:
        w.setnchannels(1)
        w.setsampwidth(2)
        w.setframerate(RATE_HZ)
        w.writeframes(np.clip(x, -32767, 32767).astype("<i2").tobytes())
    return len(t)


def run(cmd):
    return subprocess.run(cmd, check=True, stdout=subprocess.PIPE, text=True).stdout


def fail(message):
    sys.exit("FAIL: " + message)


def main():
    kvasr, model, work = sys.argv[1:4]
    os.makedirs(work, exist_ok=True)
    audio = os.path.join(work, "bursts.wav")
    samples = write_recording(audio)
    base = [kvasr, "vad", "--vad-models", model]

    segments = [tuple(float(v) for v in line.split("\t")) for line in run(base + [audio]).split("\n") if line]
    rows = [line.split("\t") for line in run(base + ["--frames", audio]).split("\n") if line]
    expected = (samples - WINDOW_SAMPLES) // FRAME_SHIFT_SAMPLES + 1
    if len(rows) != expected:
        fail("%d frame lines, expected %d" % (len(rows), expected))
    if any(len(r) != 4 for r in rows):
        fail("frame lines need 4 tab-separated fields")
    if [int(r[0]) for r in rows] != list(range(expected)):
        fail("frame indices are not 0, 1, 2, ...")
    decision = np.array([int(r[1]) for r in rows])
    emitted = np.array([int(r[3]) for r in rows])
    if not set(decision) <= {0, 1} or not set(emitted) <= {0, 1}:
        fail("flags must be 0 or 1")
    # The listed segments cover exactly the frames flagged as emitted.
    covered = np.zeros(expected, dtype=int)
    for start, end in segments:
        if not 0 <= start < end:
            fail("bad segment %s" % ((start, end),))
        covered[int(round(start * 100)):int(round(end * 100))] = 1
    if not np.array_equal(covered, emitted):
        fail("segments and emitted flags disagree")
    # Every decided speech frame lies in a segment, and the loud bursts are found.
    if np.any(decision > emitted):
        fail("a speech frame lies outside every segment")
    if len(segments) < 1:
        fail("no segment found in loud bursts")
    print("%d frames, %d segments, %d speech frames" % (expected, len(segments), decision.sum()))

    if shutil.which("gnuplot"):
        png = os.path.join(work, "bursts.png")
        run(base + ["--plot", png, audio])
        with open(png, "rb") as f:
            if f.read(8) != b"\x89PNG\r\n\x1a\n":
                fail("--plot wrote no PNG")


if __name__ == "__main__":
    main()
