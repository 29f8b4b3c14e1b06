#!/usr/bin/python3
# SPDX-License-Identifier: Apache-2.0
"""Pitch-tracking accuracy and cost against three established trackers.

  bench/pitch_eval.py [--kvasr build/tools/kvasr/kvasr] [--noisy]
                      [--data ../shared/data/vad] [--work /tmp/pitch-eval]
                      [--json results.json]

Material: 40 utterances of the VAD corpus, picked by sorted path with a
fixed stride: 24 LibriSpeech train-clean-100 readers (lossless, read English;
sex not in the metadata), 8 female and 8 male 0 A.D. acted phrases (sex from
the speaker label). With --noisy each is also mixed with broadband ambient or
household noise at 10 dB SNR (power over the whole clip); references always
come from the clean clip.

Trackers, all with a 75-500 Hz search range and a 10 ms step, each mapped to
one grid whose frame k is centred at k * 10 ms:
  praat  To Pitch (ac), standard settings (bench/pitch_praat.praat). Its
         frames are centred on their analysis windows and laid out
         symmetrically in the clip; the first frame's time is in its output.
  rapt   SPTK 3.9 `pitch -a 0`. Frame i correlates a 7.5 ms window starting
         at sample i * 160 with its copy one period later, so the estimate
         belongs to about i * 10 ms + (7.5 ms + period) / 2: 5.5 ms at 300 Hz,
         8.5 ms at 100 Hz on synthetic glides. We use i * 10 ms + 7 ms.
  swipe  SPTK 3.9 `pitch -a 1` (SWIPE'). Frame i is centred at i * 10 ms
         (within 2 ms on the same glides).
  kvasr  `kvasr pitch FILE`, frame times from its '#' header line.
On the clean clips the median f0 difference of rapt, swipe and kvasr to
Praat is smallest with exactly these centres (tried in 1 ms steps).
A track is read at a grid time by linear interpolation between the two
frames around it when both are voiced, else from the nearer frame; grid times
more than half a step outside the track count as unvoiced.

Scoring. A frame is scored only where the reference trackers agree: all of
them voiced with every f0 within 20 % of their median f0, or all of them
unvoiced. Each SPTK or Praat tracker is scored against the other two
(leave-one-out), kvasr against all three.
  GPE   frames voiced in the reference and in the tracker whose f0 is more
        than 20 % away from the reference median, as a share of all frames
        voiced in both.
  VDE   frames whose voiced/unvoiced decision differs from the reference, as
        a share of all scored frames; split into missed voicing (voiced in
        the reference only) and false voicing (voiced in the tracker only).
  fine  median of |1200 log2(f0 / reference median)| (cents) over the frames
        voiced in both without a gross error.
  cost  user + system CPU seconds of the tracker's processes per second of
        audio, as a percentage of one core in real time. Praat runs as one
        process for all clips of a condition, the others once per clip.
"""
import argparse
import json
import os
import re
import resource
import shutil
import subprocess
import sys

import numpy as np
import soundfile

SAMPLE_RATE_HZ = 16000
FRAME_STEP_S = 0.01
FRAME_STEP_SAMPLES = 160
FLOOR_HZ = 75
CEILING_HZ = 500
AGREEMENT_RATIO = 0.2
GROSS_ERROR_RATIO = 0.2
NOISE_SNR_DB = 10.0
RAPT_CENTRE_S = 0.007

LIBRISPEECH_CLIPS = 24
CLIPS_PER_SEX = 8
DEBIAN_TRACKERS = ("praat", "rapt", "swipe")

HERE = os.path.dirname(os.path.abspath(__file__))
PRAAT_SCRIPT = os.path.join(HERE, "pitch_praat.praat")
SPTK_BIN = "/usr/libexec/sptk/bin"


def read_manifest(data_dir):
    with open(os.path.join(data_dir, "MANIFEST.tsv"), encoding="utf-8") as f:
        header = f.readline().rstrip("\n").split("\t")
        return [dict(zip(header, line.rstrip("\n").split("\t"))) for line in f]


def every_nth(rows, count):
    """`count` rows spread evenly over the sorted `rows`."""
    rows = sorted(rows, key=lambda r: r["path"])
    stride = max(1, len(rows) // count)
    return rows[::stride][:count]


def pick_clips(manifest):
    libri = [r for r in manifest if r["source"].endswith("(LibriSpeech train-clean-100)")]
    game = [r for r in manifest if r["path"].startswith("speech/0ad-voices/")]
    female = [r for r in game if r["speaker"].endswith("-female")]
    male = [r for r in game if r["speaker"].endswith("-male")]
    return (every_nth(libri, LIBRISPEECH_CLIPS) + every_nth(female, CLIPS_PER_SEX)
            + every_nth(male, CLIPS_PER_SEX))


def pick_noises(manifest):
    # Broadband sounds only: a pitched noise (the miaowing cat) would make
    # the trackers disagree about whose pitch they follow.
    return sorted(r["path"] for r in manifest
                  if r["path"].startswith(("noise/ambient/", "noise/household/"))
                  and "miaow" not in r["path"])


def mix_noise(speech, noise, seed):
    """`speech` plus a random excerpt of `noise` (looped if short) at
    NOISE_SNR_DB, scaled down together if the sum would clip."""
    rng = np.random.default_rng(seed)
    reps = -(-len(speech) // len(noise)) + 1
    looped = np.tile(noise, reps)
    start = rng.integers(0, len(looped) - len(speech) + 1)
    excerpt = looped[start:start + len(speech)]
    gain = np.sqrt(np.mean(speech ** 2) / np.mean(excerpt ** 2) / 10 ** (NOISE_SNR_DB / 10))
    mixed = speech + gain * excerpt
    return mixed / max(1.0, np.abs(mixed).max() / 0.99)


def prepare_audio(data_dir, work_dir, clips, noises, noisy):
    """Writes each clip (clean, or mixed with noise) as WAV and as raw floats
    in 16-bit scale for SPTK; returns the WAV paths and durations."""
    cond_dir = os.path.join(work_dir, "noisy" if noisy else "clean")
    os.makedirs(cond_dir, exist_ok=True)
    wavs, durations = [], []
    for i, clip in enumerate(clips):
        audio, rate = soundfile.read(os.path.join(data_dir, clip["path"]), dtype="float64")
        if rate != SAMPLE_RATE_HZ or audio.ndim != 1:
            sys.exit(f"{clip['path']}: expected 16 kHz mono")
        if noisy:
            noise, _ = soundfile.read(os.path.join(data_dir, noises[i % len(noises)]),
                                      dtype="float64")
            audio = mix_noise(audio, noise, i)
        # SPTK gets the very samples the WAV holds, not the unrounded mix.
        pcm = np.clip(np.rint(audio * 32768), -32768, 32767).astype(np.int16)
        base = os.path.join(cond_dir, f"{i:02d}")
        soundfile.write(base + ".wav", pcm, SAMPLE_RATE_HZ, subtype="PCM_16")
        pcm.astype("<f4").tofile(base + ".f32")
        wavs.append(base + ".wav")
        durations.append(len(audio) / SAMPLE_RATE_HZ)
    return wavs, durations


class CpuMeter:
    """Accumulates user + system seconds of the child processes it runs."""

    def __init__(self):
        self.seconds = 0.0

    def run(self, cmd):
        before = resource.getrusage(resource.RUSAGE_CHILDREN)
        proc = subprocess.run(cmd, capture_output=True)
        after = resource.getrusage(resource.RUSAGE_CHILDREN)
        self.seconds += (after.ru_utime - before.ru_utime) + (after.ru_stime - before.ru_stime)
        if proc.returncode != 0:
            sys.exit(f"failed ({proc.returncode}): {' '.join(cmd)}\n"
                     + proc.stderr.decode(errors="replace"))
        return proc.stdout


def run_praat(wavs, meter):
    """(frame times, f0) per clip."""
    list_path = os.path.join(os.path.dirname(wavs[0]), "praat_list.txt")
    with open(list_path, "w") as f:
        f.write("\n".join(wavs) + "\n")
    meter.run(["praat", "--run", PRAAT_SCRIPT, list_path, str(FRAME_STEP_S),
               str(FLOOR_HZ), str(CEILING_HZ)])
    tracks = []
    for wav in wavs:
        with open(wav[:-len(".wav")] + ".praat.txt") as f:
            first_s = float(f.readline())
            f0 = np.array(f.readline().split(), dtype=float)
        tracks.append((first_s + FRAME_STEP_S * np.arange(len(f0)), f0))
    return tracks


def run_sptk(wavs, meter, algorithm, centre_s):
    """(frame times, f0) per clip from SPTK's `pitch -a algorithm`, frame i
    centred at centre_s + i * 10 ms."""
    tracks = []
    for wav in wavs:
        out = meter.run([os.path.join(SPTK_BIN, "pitch"), "-a", str(algorithm),
                         "-s", str(SAMPLE_RATE_HZ / 1000), "-p", str(FRAME_STEP_SAMPLES),
                         "-L", str(FLOOR_HZ), "-H", str(CEILING_HZ), "-o", "1",
                         wav[:-len(".wav")] + ".f32"])
        f0 = np.frombuffer(out, dtype="<f4").astype(float)
        tracks.append((centre_s + FRAME_STEP_S * np.arange(len(f0)), f0))
    return tracks


# The header states the centre of frame i's analysis window as
# "t = STEP*i - OFFSET s" (or "+ OFFSET").
KVASR_FRAME_TIME = re.compile(r"t = ([0-9.eE+-]+)\*i ([+-]) ([0-9.eE+-]+) s")


def parse_kvasr(text):
    """(frame times, f0) from `kvasr pitch` output."""
    timing = None
    index, f0 = [], []
    for line in text.splitlines():
        if line.startswith("#"):
            timing = KVASR_FRAME_TIME.search(line) or timing
        elif line.strip():
            i, hz = line.split("\t")
            index.append(int(i))
            f0.append(float(hz))
    if timing is None:
        sys.exit("kvasr pitch: no '#' header line giving the frame times")
    step_s = float(timing.group(1))
    first_s = float(timing.group(2) + timing.group(3))
    return first_s + step_s * np.array(index, dtype=float), np.array(f0)


def run_kvasr(kvasr, wavs, meter):
    return [parse_kvasr(meter.run([kvasr, "pitch", wav]).decode()) for wav in wavs]


def on_grid(track, frames):
    """f0 of a (times, f0) track at the grid frames 0 .. frames-1."""
    times, f0 = track
    if len(times) == 0:
        return np.zeros(frames)
    grid_s = FRAME_STEP_S * np.arange(frames)
    step_s = times[1] - times[0] if len(times) > 1 else FRAME_STEP_S
    pos = (grid_s - times[0]) / step_s
    inside = (pos >= -0.5) & (pos <= len(times) - 0.5)
    nearest = np.clip(np.rint(pos), 0, len(times) - 1).astype(int)
    lo = np.clip(np.floor(pos), 0, len(times) - 1).astype(int)
    hi = np.minimum(lo + 1, len(times) - 1)
    frac = np.clip(pos - lo, 0.0, 1.0)
    both = (f0[lo] > 0) & (f0[hi] > 0)
    out = np.where(both, f0[lo] + frac * (f0[hi] - f0[lo]), f0[nearest])
    return np.where(inside, out, 0.0)


def reference(tracks):
    """(scored mask, voiced mask, median f0) of the agreement of `tracks`."""
    stack = np.vstack(tracks)
    voiced = stack > 0
    median = np.median(stack, axis=0)
    all_voiced = voiced.all(axis=0)
    close = np.all(np.abs(stack - median) <= AGREEMENT_RATIO * median, axis=0)
    scored = (all_voiced & close) | ~voiced.any(axis=0)
    return scored, all_voiced & scored, median


def score(test, refs):
    """Error counts of the `test` grid track against the agreement of
    `refs`, all tracks concatenated over clips."""
    scored, ref_voiced, ref_hz = reference(refs)
    test_voiced = test > 0
    both = scored & ref_voiced & test_voiced
    ratio = test[both] / ref_hz[both]
    gross = np.abs(ratio - 1) > GROSS_ERROR_RATIO
    cents = np.abs(1200 * np.log2(ratio[~gross]))
    return {
        "frames": int(scored.sum()),
        "reference_voiced_frames": int(ref_voiced.sum()),
        "voiced_in_both_frames": int(both.sum()),
        "gpe_percent": 100.0 * gross.sum() / max(1, both.sum()),
        "vde_percent": 100.0 * (test_voiced != ref_voiced)[scored].sum() / max(1, scored.sum()),
        "missed_voicing_percent": 100.0 * (ref_voiced & ~test_voiced).sum() / max(1, scored.sum()),
        "false_voicing_percent":
            100.0 * (scored & ~ref_voiced & test_voiced).sum() / max(1, scored.sum()),
        "fine_cents": float(np.median(cents)) if len(cents) else float("nan"),
    }


def track_all(wavs, kvasr):
    """Grid tracks and CPU seconds of every tracker on `wavs`."""
    runs = {"praat": lambda m: run_praat(wavs, m),
            "rapt": lambda m: run_sptk(wavs, m, 0, RAPT_CENTRE_S),
            "swipe": lambda m: run_sptk(wavs, m, 1, 0.0)}
    if kvasr:
        runs["kvasr"] = lambda m: run_kvasr(kvasr, wavs, m)
    grids, cpu = {}, {}
    for name, run in runs.items():
        meter = CpuMeter()
        tracks = run(meter)
        grids[name] = [on_grid(t, frame_count(w)) for t, w in zip(tracks, wavs)]
        cpu[name] = meter.seconds
    return {n: np.concatenate(g) for n, g in grids.items()}, cpu


def frame_count(wav):
    return soundfile.info(wav).frames // FRAME_STEP_SAMPLES


def check_tools(kvasr):
    missing = []
    if shutil.which("praat") is None:
        missing.append("praat (apt-get install praat)")
    if not os.access(os.path.join(SPTK_BIN, "pitch"), os.X_OK):
        missing.append(f"{SPTK_BIN}/pitch (apt-get install sptk)")
    if kvasr and not os.access(kvasr, os.X_OK):
        missing.append(f"{kvasr} (build the kvasr target)")
    if missing:
        sys.exit("missing: " + "; ".join(missing))


def main():
    ap = argparse.ArgumentParser(description=__doc__,
                                 formatter_class=argparse.RawDescriptionHelpFormatter)
    ap.add_argument("--kvasr", help="kvasr executable to score")
    ap.add_argument("--noisy", action="store_true", help="also score noisy copies")
    ap.add_argument("--data", default=os.path.join(HERE, "..", "..", "shared", "data", "vad"))
    ap.add_argument("--work", default="/tmp/pitch-eval")
    ap.add_argument("--json", help="write the results here as well")
    args = ap.parse_args()
    check_tools(args.kvasr)
    work = os.path.abspath(args.work)
    manifest = read_manifest(args.data)
    clips, noises = pick_clips(manifest), pick_noises(manifest)

    wavs, durations = prepare_audio(args.data, work, clips, noises, noisy=False)
    audio_s = sum(durations)
    clean, clean_cpu = track_all(wavs, args.kvasr)
    conditions = [("clean", clean, clean_cpu)]
    if args.noisy:
        noisy_wavs, _ = prepare_audio(args.data, work, clips, noises, noisy=True)
        conditions.append(("noisy 10 dB", *track_all(noisy_wavs, args.kvasr)))

    results = {"clips": [c["path"] for c in clips], "audio_s": audio_s,
               "grid_frames": int(len(clean["praat"])), "conditions": {}}
    print(f"{len(clips)} clips, {audio_s:.1f} s, {len(clean['praat'])} frames of 10 ms\n")
    print("| condition | tracker | reference | frames scored | GPE % | VDE % "
          "| missed + false voicing % | fine error (cents) | cost % core |")
    print("|---|---|---|---:|---:|---:|---:|---:|---:|")
    for cond, grids, cpu in conditions:
        rows = {}
        for name, test in grids.items():
            ref_names = [n for n in DEBIAN_TRACKERS if n != name]
            row = score(test, [clean[n] for n in ref_names])
            row["cost_percent_core"] = 100.0 * cpu[name] / audio_s
            row["reference"] = "+".join(ref_names)
            rows[name] = row
            print(f"| {cond} | {name} | {row['reference']} | {row['frames']} "
                  f"| {row['gpe_percent']:.2f} | {row['vde_percent']:.2f} "
                  f"| {row['missed_voicing_percent']:.2f} + {row['false_voicing_percent']:.2f} "
                  f"| {row['fine_cents']:.1f} | {row['cost_percent_core']:.2f} |")
        results["conditions"][cond] = rows
    if args.json:
        with open(args.json, "w") as f:
            json.dump(results, f, indent=1)


if __name__ == "__main__":
    main()
