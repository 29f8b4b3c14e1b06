# SPDX-License-Identifier: Apache-2.0
"""Mixtures for training and evaluating the detector, with 10 ms frame labels.

A speech mixture is a row of utterances of one split, separated by pauses of
0.1-5 s, over one background (noise or music) at a chosen SNR, or over a
faint dither floor when clean. A speech-free mixture is music, noise or near
silence alone. Each mixture is a 16-bit WAV plus <name>.lab (one byte per
frame, 1 = speech) and a line in mixtures.tsv.

Label rule: frame f covers samples [160 f, 160 f + 400), the window the
detector analyses. It is speech when the clean, level-scaled utterance has a
mean square in that window within 35 dB of the utterance's loudest frame;
non-speech runs shorter than 100 ms inside an utterance are filled. Labels
come from the speech before mixing and never see the background.
`--label-range-db` relabels the same audio with another range, to see how
the figures depend on the rule.

Augmentation (`--augment`, training mixtures only): most drawings of a
background or speech-free file are played at another speed (pitch and tempo
together) and through a random spectral tilt and peak, so that the network
meets timbres that no recording gave it. Speech is never altered: its labels
come from it.

Levels: the active level of an utterance is the RMS over its speech frames.
A mixture draws one speech level in dBFS (quiet speakers near the detector's
50 dB energy gate up to loud ones), each utterance varies around it by up to
3 dB, and the background is scaled so that the mixture's speech level minus
the background RMS is the SNR.
"""
import argparse
import math
import os
import random

import numpy as np
import soundfile

import corpus

RATE_HZ = 16000
FRAME_SHIFT_SAMPLES = 160
WINDOW_SAMPLES = 400
LABEL_RANGE_DB = 35.0
FILL_GAP_FRAMES = 10
PAUSE_MIN_S, PAUSE_MAX_S = 0.1, 5.0
SPEECH_LEVEL_DBFS = (-38.0, -12.0)
UTTERANCE_JITTER_DB = 3.0
NOSPEECH_LEVEL_DBFS = (-45.0, -15.0)
DITHER_RMS = (2.0, 12.0)  # 16-bit steps: a microphone floor, not digital zero
SNRS_DB = (None, 20.0, 10.0, 5.0, 0.0)  # None: clean
FULL_SCALE = 32768.0
PEAK_LIMIT = 32000.0
AUGMENT_SHARE = 2.0 / 3.0  # the rest stays as recorded, the timbres users meet
AUGMENT_RATE_FACTOR = (0.8, 1.25)  # about a major third down or up
AUGMENT_TILT_DB_PER_OCTAVE = 3.0
AUGMENT_PEAK_DB = 10.0
AUGMENT_PEAK_OCTAVES = (-3.0, 3.0)  # centre, relative to 1 kHz
AUGMENT_PEAK_WIDTH_OCTAVES = (0.3, 1.0)
AUGMENT_TILT_FLOOR_HZ = 50.0  # below this the tilt stays flat


def frame_count(samples):
    return max(0, (samples - WINDOW_SAMPLES) // FRAME_SHIFT_SAMPLES + 1)


def frame_power(x):
    """Mean square of every detector window of x."""
    n = frame_count(len(x))
    if n == 0:
        return np.zeros(0)
    c = np.concatenate(([0.0], np.cumsum(x.astype(np.float64) ** 2)))
    starts = np.arange(n) * FRAME_SHIFT_SAMPLES
    return (c[starts + WINDOW_SAMPLES] - c[starts]) / WINDOW_SAMPLES


def fill_short_gaps(labels, max_gap):
    idx = np.flatnonzero(labels)
    if len(idx) < 2:
        return labels
    out = labels.copy()
    gaps = np.flatnonzero(np.diff(idx) > 1)
    for g in gaps:
        a, b = idx[g], idx[g + 1]
        if b - a - 1 < max_gap:
            out[a + 1:b] = 1
    return out


def db_to_amp(db):
    return 10.0 ** (db / 20.0)


def augment(x, rng):
    """x resampled by a random factor and coloured by a random tilt and peak,
    both in one spectrum: truncating it band-limits a speed-up, and a
    slow-down leaves the top band empty as a duller recording would."""
    factor = math.exp(rng.uniform(*np.log(AUGMENT_RATE_FACTOR)))
    n = max(WINDOW_SAMPLES, int(round(len(x) / factor)))
    spectrum = np.fft.rfft(x)
    out = np.zeros(n // 2 + 1, dtype=complex)
    kept = min(len(out), len(spectrum))
    out[:kept] = spectrum[:kept]
    octaves = np.log2(np.maximum(np.fft.rfftfreq(n, 1.0 / RATE_HZ),
                                 AUGMENT_TILT_FLOOR_HZ) / 1000.0)
    centre = rng.uniform(*AUGMENT_PEAK_OCTAVES)
    width = rng.uniform(*AUGMENT_PEAK_WIDTH_OCTAVES)
    gain_db = (rng.uniform(-1, 1) * AUGMENT_TILT_DB_PER_OCTAVE * octaves
               + rng.uniform(-1, 1) * AUGMENT_PEAK_DB
               * np.exp(-0.5 * ((octaves - centre) / width) ** 2))
    out *= db_to_amp(gain_db)
    return np.fft.irfft(out, n) * (n / len(x))


class Audio:
    def __init__(self, augmented=False):
        self.cache = {}
        self.augmented = augmented

    def load(self, row):
        path = row["file"]
        if path not in self.cache:
            x, rate = soundfile.read(path, dtype="float64")
            assert rate == RATE_HZ and x.ndim == 1, path
            self.cache[path] = x * FULL_SCALE
        return self.cache[path]

    def load_nonspeech(self, row, rng):
        """A background or speech-free file, augmented when asked for."""
        x = self.load(row)
        if self.augmented and rng.random() < AUGMENT_SHARE:
            return augment(x, rng)
        return x


def active_rms(x):
    p = frame_power(x)
    if len(p) == 0 or p.max() <= 0:
        return math.sqrt(max(np.mean(x ** 2), 1e-9)), p
    speech = p >= p.max() * 10 ** (-LABEL_RANGE_DB / 10)
    return math.sqrt(np.mean(p[speech])), p


def pick(rows, rng):
    """A file of a category drawn uniformly, so that sources with many short
    files (digits, sound effects) do not crowd out the others."""
    cats = sorted({r["category"] for r in rows})
    cat = rng.choice(cats)
    return rng.choice([r for r in rows if r["category"] == cat])


def background(audio, rows, length, rng):
    """`length` samples of one background file, looped from a random start."""
    row = pick(rows, rng)
    x = audio.load_nonspeech(row, rng)
    start = rng.randrange(len(x))
    reps = (start + length) // len(x) + 1
    return np.tile(x, reps)[start:start + length], row


def utterance_labels(speech, pieces, range_db):
    labels = np.zeros(frame_count(len(speech)), dtype=np.uint8)
    for start, clip in pieces:
        # Frames whose window lies on the utterance, judged on the utterance
        # alone (the pauses around it are at least 0.1 s).
        first = -(-start // FRAME_SHIFT_SAMPLES)
        last = (start + len(clip) - WINDOW_SAMPLES) // FRAME_SHIFT_SAMPLES
        if last < first:
            continue
        p = frame_power(speech[first * FRAME_SHIFT_SAMPLES:
                               last * FRAME_SHIFT_SAMPLES + WINDOW_SAMPLES])
        lab = (p >= p.max() * 10 ** (-range_db / 10)).astype(np.uint8)
        labels[first:last + 1] = fill_short_gaps(lab, FILL_GAP_FRAMES)
    return labels


def speech_mixture(audio, speech_rows, noise_rows, target_s, snr_db, rng,
                   label_range_db=LABEL_RANGE_DB):
    level_db = rng.uniform(*SPEECH_LEVEL_DBFS)
    pieces = []
    pos = int(rng.uniform(PAUSE_MIN_S, PAUSE_MAX_S) * RATE_HZ)
    target = int(target_s * RATE_HZ)
    while pos < target:
        row = pick(speech_rows, rng)
        clip = audio.load(row)
        rms, _ = active_rms(clip)
        gain = db_to_amp(level_db + rng.uniform(-UTTERANCE_JITTER_DB,
                                                UTTERANCE_JITTER_DB)) * FULL_SCALE / rms
        pieces.append((pos, clip * gain))
        pos += len(clip) + int(rng.uniform(PAUSE_MIN_S, PAUSE_MAX_S) * RATE_HZ)
    length = pos
    speech = np.zeros(length)
    for start, clip in pieces:
        speech[start:start + len(clip)] = clip
    labels = utterance_labels(speech, pieces, label_range_db)
    # The SNR is set against the level the default rule measures, so that a
    # different label rule relabels the same audio.
    level_labels = labels if label_range_db == LABEL_RANGE_DB else \
        utterance_labels(speech, pieces, LABEL_RANGE_DB)
    p_all = frame_power(speech)
    speech_level = math.sqrt(np.mean(p_all[level_labels == 1])) if level_labels.any() else 1.0
    if snr_db is None:
        noise = rng_normal(rng, length) * rng.uniform(*DITHER_RMS)
        bg = "dither"
    else:
        noise, row = background(audio, noise_rows, length, rng)
        noise_rms = math.sqrt(max(np.mean(noise ** 2), 1e-9))
        noise = noise * speech_level / db_to_amp(snr_db) / noise_rms
        noise += rng_normal(rng, length) * DITHER_RMS[0]
        bg = row["path"]
    mix = speech + noise
    return mix, labels, {"level_dbfs": level_db, "background": bg}


def rng_normal(rng, n):
    return np.random.default_rng(rng.randrange(2 ** 31)).standard_normal(n)


def nospeech_mixture(audio, rows, target_s, kind, rng):
    length = int(target_s * RATE_HZ)
    level_db = rng.uniform(*NOSPEECH_LEVEL_DBFS)
    if kind == "silence":
        x = rng_normal(rng, length) * rng.uniform(*DITHER_RMS)
        bg = "dither"
    else:
        parts, names, total = [], [], 0
        while total < length:
            row = pick(rows, rng)
            clip = audio.load_nonspeech(row, rng)
            rms = math.sqrt(max(np.mean(clip ** 2), 1e-9))
            parts.append(clip * db_to_amp(level_db) * FULL_SCALE / rms)
            names.append(row["path"])
            total += len(clip)
        x = np.concatenate(parts)[:length] + rng_normal(rng, length) * DITHER_RMS[0]
        bg = ",".join(names)
    return x, np.zeros(frame_count(length), dtype=np.uint8), {
        "level_dbfs": level_db, "background": bg}


def write(out_dir, name, mix, labels, meta, index_file):
    peak = np.abs(mix).max()
    if peak > PEAK_LIMIT:  # keep the mixture unclipped: scale it down whole
        mix = mix * PEAK_LIMIT / peak
    soundfile.write(os.path.join(out_dir, name + ".wav"),
                    np.round(mix).astype(np.int16), RATE_HZ, subtype="PCM_16")
    labels.tofile(os.path.join(out_dir, name + ".lab"))
    index_file.write("\t".join([name, meta["kind"], meta["condition"],
                                "%.1f" % meta["level_dbfs"],
                                "%.2f" % (len(mix) / RATE_HZ),
                                meta["background"]]) + "\n")


def main():
    ap = argparse.ArgumentParser(description=__doc__,
                                 formatter_class=argparse.RawDescriptionHelpFormatter)
    ap.add_argument("--corpus", required=True, help="the shared corpus")
    ap.add_argument("--packages", help="the package corpus that packages.py decodes")
    ap.add_argument("--part", choices=("train", "val", "dev"), required=True)
    ap.add_argument("--out", required=True)
    ap.add_argument("--speech-mixtures", type=int, required=True,
                    help="speech mixtures per SNR condition")
    ap.add_argument("--nospeech-mixtures", type=int, required=True,
                    help="speech-free mixtures of each kind (music, noise, silence, and "
                         "effects with --packages)")
    ap.add_argument("--seconds", type=float, default=30.0)
    ap.add_argument("--seed", type=int, default=1)
    ap.add_argument("--label-range-db", type=float, default=LABEL_RANGE_DB,
                    help="label rule's range below the utterance's loudest frame; only the "
                         "labels change, the audio and its levels do not")
    ap.add_argument("--augment", action="store_true",
                    help="resample and colour the backgrounds and speech-free files")
    args = ap.parse_args()

    rows = corpus.load(args.corpus, args.packages)[args.part]
    speech = [r for r in rows if r["kind"] == "speech"]
    noise = [r for r in rows if r["kind"] != "speech"]
    music = [r for r in noise if r["category"].startswith("music/")]
    effects = [r for r in noise if r["category"].startswith("effects/")]
    # Babble holds unintelligible voices: a background under speech, never a
    # speech-free stretch whose every frame must be rejected.
    plain_noise = [r for r in noise if r["kind"] == "noise" and r["category"] != "babble"
                   and not r["category"].startswith("effects/")]
    nospeech_kinds = [("music", music), ("noise", plain_noise)]
    if effects:
        nospeech_kinds.append(("effects", effects))
    nospeech_kinds.append(("silence", None))
    rng = random.Random(args.seed * 7919 + ("train", "val", "dev").index(args.part))
    audio = Audio(args.augment)
    os.makedirs(args.out, exist_ok=True)
    with open(os.path.join(args.out, "mixtures.tsv"), "w") as index:
        index.write("name\tkind\tcondition\tlevel_dbfs\tseconds\tbackground\n")
        for snr in SNRS_DB:
            cond = "clean" if snr is None else "%gdB" % snr
            for i in range(args.speech_mixtures):
                mix, lab, meta = speech_mixture(audio, speech, noise, args.seconds, snr, rng,
                                                args.label_range_db)
                meta.update(kind="speech", condition=cond)
                write(args.out, "%s_speech_%s_%03d" % (args.part, cond, i), mix, lab, meta, index)
        for kind, pool in nospeech_kinds:
            for i in range(args.nospeech_mixtures):
                mix, lab, meta = nospeech_mixture(audio, pool, args.seconds, kind, rng)
                meta.update(kind=kind, condition=kind)
                write(args.out, "%s_%s_%03d" % (args.part, kind, i), mix, lab, meta, index)


if __name__ == "__main__":
    main()
