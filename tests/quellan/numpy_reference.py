# SPDX-License-Identifier: Apache-2.0
"""Independent numpy model of the detector's PLP features and network.

Runs the C++ reference_tool on audio and random networks and compares its
output with the model below. Prints the largest differences; exits non-zero
when one exceeds its tolerance.

    numpy_reference.py plp TOOL CORPUS_DIR WORK_DIR
    numpy_reference.py dnn TOOL WORK_DIR
"""
import os
import struct
import subprocess
import sys

import numpy as np

SAMPLE_PERIOD = 625          # 100 ns units: 16 kHz
SHIFT = 160                  # samples per frame
WINDOW = 400                 # samples per analysis window
FFT_SIZE = 512
BANDS = 24
CEPS = 12
LIFTER = 22
ORDER = 12
COMPRESSION = 0.33
STATIC = CEPS + 1            # cepstra with C0 last
WIDTH = 3 * STATIC           # statics, deltas, accelerations
DELAY = 4                    # frames the two derivative passes look ahead
ONLINE_MAX = 16000           # a final block this short is normalised alone

FEATURE_TOLERANCE = 5e-4
SCORE_TOLERANCE = 1e-5


def frames_in(n):
    """Frame count of an n-sample block, with C's truncating division."""
    return int((n - WINDOW) / SHIFT) + 1


def mel(hz):
    return 1127.0 * np.log(1.0 + hz / 700.0)


def band_matrix():
    """Triangular critical-band weights over the FFT magnitude bins."""
    hz_per_bin = 1e7 / (SAMPLE_PERIOD * FFT_SIZE)
    edges = np.arange(BANDS + 2) / (BANDS + 1) * mel(8000.0)
    weights = np.zeros((BANDS, FFT_SIZE // 2 + 1))
    for b in range(1, FFT_SIZE // 2):  # DC and Nyquist stay out
        m = mel(b * hz_per_bin)
        lower = int(np.sum(edges[1:] < m))
        share = (edges[lower + 1] - m) / (edges[lower + 1] - edges[lower])
        if lower >= 1:
            weights[lower - 1, b] += share
        if lower < BANDS:
            weights[lower, b] += 1.0 - share
    centre_hz = 700.0 * (np.exp(edges[1:BANDS + 1] / 1127.0) - 1.0)
    s = centre_hz ** 2
    loudness = (s / (s + 1.6e5)) ** 2 * (s + 1.44e6) / (s + 9.61e6)
    return weights, loudness


BANDS_W, LOUDNESS = band_matrix()


def static_features(block):
    """Scaled, clipped static cepstra of every frame of an int16 block."""
    count = frames_in(len(block))
    if count <= 0:
        return np.zeros((0, STATIC))
    padded = np.zeros(SHIFT * (count - 1) + WINDOW)
    usable = min(len(block), len(padded))
    padded[:usable] = block[:usable]
    idx = np.arange(WINDOW)[None, :] + SHIFT * np.arange(count)[:, None]
    x = padded[idx]
    emphasised = np.empty_like(x)
    emphasised[:, 1:] = x[:, 1:] - 0.97 * x[:, :-1]
    emphasised[:, 0] = 0.03 * x[:, 0]
    emphasised *= np.hamming(WINDOW)
    spectrum = np.abs(np.fft.rfft(emphasised, FFT_SIZE))
    bands = np.maximum(spectrum @ BANDS_W.T, 1.0)
    auditory = (bands * LOUDNESS) ** COMPRESSION
    auditory = np.concatenate([auditory[:, :1], auditory, auditory[:, -1:]], 1)
    # Autocorrelation: inverse cosine transform of the symmetric spectrum.
    n_points = BANDS + 2
    lags = np.arange(ORDER + 1)[:, None]
    points = np.arange(n_points)[None, :]
    basis = np.cos(lags * points * np.pi / (n_points - 1))
    basis[:, 1:-1] *= 2.0
    r = auditory @ basis.T / (2.0 * (n_points - 1))
    # Levinson-Durbin, A(z) = 1 + sum a_i z^-i, all frames at once.
    a = np.zeros((count, ORDER + 1))
    a[:, 0] = 1.0
    error = r[:, 0].copy()
    for i in range(1, ORDER + 1):
        k = -(r[:, i] + np.sum(a[:, 1:i] * r[:, i - 1:0:-1], axis=1)) / error
        previous = a.copy()
        a[:, i] = k
        a[:, 1:i] = previous[:, 1:i] + k[:, None] * previous[:, i - 1:0:-1]
        error *= 1.0 - k * k
    # Cepstrum of the all-pole model.
    c = np.zeros((count, CEPS + 1))
    for n in range(1, CEPS + 1):
        acc = np.zeros(count)
        for i in range(1, n):
            acc += (n - i) * a[:, i] * c[:, n - i]
        c[:, n] = -a[:, n] - acc / n
    lifter = 1.0 + LIFTER / 2.0 * np.sin(np.pi * np.arange(1, CEPS + 1) / LIFTER)
    statics = np.concatenate([c[:, 1:] * lifter, np.log(error)[:, None]], 1)
    return np.clip(statics * 10.0, -50.0, 50.0)


def derivative(x):
    padded = np.pad(x, ((2, 2), (0, 0)), mode="edge")
    n = len(x)
    return ((padded[3:3 + n] - padded[1:1 + n]) +
            2.0 * (padded[4:4 + n] - padded[0:n])) / 10.0


class RunningStats:
    def __init__(self, means, variances):
        self.table = (means.astype(np.float64), variances.astype(np.float64))
        self.mean = None
        self.var = None
        self.fresh = True

    def step(self, x):
        new_mean = 0.01 * x + 0.99 * self.mean
        new_var = 0.99 * self.var + 0.0099 * (x - self.mean) ** 2
        self.mean, self.var = new_mean, new_var
        return (x - new_mean) / np.maximum(np.sqrt(new_var), 0.01)

    def normalise(self, feats, flag):
        count = len(feats)
        hold = 2 * DELAY if flag >= 1 else 0
        start = DELAY
        if self.fresh:
            self.fresh = False
            self.mean, self.var = (t.copy() for t in self.table)
            start = 0
        out = feats.copy()
        committed_end = max(start, count - hold)
        for t in range(start, count - hold):
            out[t] = self.step(feats[t])
        kept = (self.mean.copy(), self.var.copy())
        for t in range(committed_end, count - DELAY):
            out[t] = self.step(feats[t])
        self.mean, self.var = kept
        return out


def block_normalise(feats):
    if len(feats) == 0:
        return feats
    divisor = len(feats) - 1 if len(feats) >= 2 else 1
    mean = feats.mean(axis=0)
    sd = np.sqrt(((feats - mean) ** 2).sum(axis=0) / divisor)
    return (feats - mean) / np.maximum(sd, 0.01)


def model_blocks(samples, blocks, stats):
    """Expected (frame count, features) of each (start, end, flag) block."""
    result = []
    for start, end, flag in blocks:
        block = samples[start:end].astype(np.float64)
        statics = static_features(block)
        deltas = derivative(statics) if len(statics) else statics
        accels = derivative(deltas) if len(statics) else statics
        feats = np.concatenate([statics, deltas, accels], 1)
        if stats is None or (flag == -1 and end - start <= ONLINE_MAX):
            feats = block_normalise(feats)
        else:
            feats = stats.normalise(feats, flag)
        result.append((frames_in(end - start), feats))
    return result


def run_tool(tool, *args):
    subprocess.run([tool, *map(str, args)], check=True)


def read_blocks(path):
    data = open(path, "rb").read()
    pos, blocks = 0, []
    while pos < len(data):
        (count,) = struct.unpack_from("<i", data, pos)
        pos += 4
        rows = max(count, 0)
        values = np.frombuffer(data, np.float32, rows * WIDTH, pos)
        pos += rows * WIDTH * 4
        blocks.append((count, values.reshape(rows, WIDTH).astype(np.float64)))
    return blocks


def stream_blocks(n, rng):
    """Blocks overlapping by 12 frames as the pipeline cuts them."""
    blocks, start, index = [], 0, 1
    while True:
        length = int(rng.integers(2320, 24000))
        if start + length >= n:
            blocks.append((start, n, -index))
            return blocks
        blocks.append((start, start + length, index))
        start += (frames_in(length) - 3 * DELAY) * SHIFT
        index += 1


def check_plp(tool, corpus, work):
    rng = np.random.default_rng(7)
    means = rng.normal(0.0, 2.0, WIDTH).astype(np.float32)
    variances = rng.uniform(0.5, 30.0, WIDTH).astype(np.float32)
    table = os.path.join(work, "mean_table")
    with open(table, "wb") as f:
        f.write(struct.pack("<I", WIDTH) + means.tobytes() + variances.tobytes())

    cases = []
    for name in ("speech/librispeech/103/103-1240-0000.flac",
                 "noise/ambient/0ad/dayscape__day_temperate_11.flac"):
        raw = os.path.join(work, os.path.basename(name) + ".raw")
        run_tool(tool, "decode", os.path.join(corpus, name), raw)
        samples = np.fromfile(raw, np.int16)
        n = len(samples)
        tag = os.path.basename(name)
        cases += [
            (tag + " stream", raw, samples, table, stream_blocks(n, rng)),
            (tag + " whole, last", raw, samples, table, [(0, n, -1)]),
            (tag + " per-block", raw, samples, "-",
             [(0, 30000, 1), (30000, n, -2)]),
        ]
    raw = cases[0][1]
    samples = cases[0][2]
    cases += [
        ("short last block alone", raw, samples, table, [(0, 16000, -1)]),
        ("just over short", raw, samples, table, [(0, 16001, -1)]),
        ("short last, flag -2", raw, samples, table, [(0, 8000, -2)]),
        ("lone frame, last", raw, samples, table, [(5000, 5400, -1)]),
        ("lone frame, more follows", raw, samples, table,
         [(5000, 5400, 1), (5000, 9000, 2), (5000, 9000, -3)]),
        ("blocks under one window", raw, samples, table,
         [(8000, 8399, -1), (8000, 8240, -1), (8000, 8100, -1),
          (8000, 8050, -1), (8000, 8079, 1), (8000, 8399, 2)]),
        ("hold-back", raw, samples, table,
         [(0, 2320, 1), (160, 4000, 2), (1200, 3000, 3), (1200, 12000, -4)]),
    ]

    worst_all = 0.0
    failed = False
    for label, raw, samples, table_arg, blocks in cases:
        out = os.path.join(work, "plp.bin")
        run_tool(tool, "plp", raw, out, table_arg,
                 *("%d:%d:%d" % b for b in blocks))
        got = read_blocks(out)
        stats = None
        if table_arg != "-":
            stats = RunningStats(means, variances)
        want = model_blocks(samples, blocks, stats)
        worst = 0.0
        frames = 0
        for (count, feats), (want_count, want_feats) in zip(got, want):
            if count != want_count or feats.shape != want_feats.shape:
                print("FAIL %s: %d frames, expected %d" % (label, count, want_count))
                failed = True
                continue
            if len(feats):
                worst = max(worst, float(np.max(np.abs(feats - want_feats))))
            frames += len(feats)
        if len(got) != len(want):
            print("FAIL %s: %d blocks, expected %d" % (label, len(got), len(want)))
            failed = True
        print("%-48s %6d frames  max |diff| %.3g" % (label, frames, worst))
        worst_all = max(worst_all, worst)
    print("PLP features: max |diff| %.3g (tolerance %g)" %
          (worst_all, FEATURE_TOLERANCE))
    return failed or worst_all > FEATURE_TOLERANCE


def network_scores(layers, priors, inputs):
    h = inputs
    for bias, weights in layers[:-1]:
        h = 1.0 / (1.0 + np.exp(-(h @ weights + bias)))
    bias, weights = layers[-1]
    z = h @ weights + bias
    p = np.exp(z - z.max(axis=1, keepdims=True))
    p /= p.sum(axis=1, keepdims=True)
    logs = np.log(p / priors + 1e-7)
    return np.maximum(logs[:, 1], -1000.0) - np.maximum(logs[:, 0], -1000.0)


def check_dnn(tool, work):
    rng = np.random.default_rng(11)
    failed = False
    worst_all = 0.0
    for hidden, classes, (start_off, end_off), skip in (
            ([32, 16], 3, (5, 5), 2),
            ([8], 2, (2, 3), 0),
            ([], 2, (0, 0), 1)):
        feat_dim, total = 39, 60
        span = 1 + start_off + end_off
        sizes = [feat_dim * span] + hidden + [classes]
        layers = [(rng.normal(0, 0.5, b).astype(np.float32),
                   rng.normal(0, 0.3, (a, b)).astype(np.float32))
                  for a, b in zip(sizes[:-1], sizes[1:])]
        priors = rng.uniform(0.2, 0.8, classes).astype(np.float32)
        net = os.path.join(work, "net")
        with open(net, "wb") as f:
            f.write(b"MYDNN1\0\x7f")
            f.write(struct.pack("<3i", sizes[0], classes, len(hidden)))
            f.write(struct.pack("<%di" % len(hidden), *hidden))
            for bias, weights in layers:
                f.write(bias.tobytes() + weights.tobytes())
        prior_file = os.path.join(work, "priors")
        with open(prior_file, "wb") as f:
            f.write(struct.pack("<i", classes) + priors.tobytes())
        feat = rng.normal(0, 1, (total, feat_dim)).astype(np.float32)
        feat_file = os.path.join(work, "feat.f32")
        feat.tofile(feat_file)
        t0, first, last = 2, 1, total - 2
        out = os.path.join(work, "scores.f32")
        run_tool(tool, "dnn", net, prior_file, feat_file, feat_dim, total, t0,
                 first, last, skip, start_off, end_off, out)
        got = np.fromfile(out, np.float32).astype(np.float64)
        centres = np.arange(t0, last + 1, skip + 1)
        rows = np.clip(centres[:, None] + np.arange(-start_off, end_off + 1)[None, :],
                       0, total - 1)
        inputs = feat.astype(np.float64)[rows].reshape(len(centres), -1)
        want = network_scores([(b.astype(np.float64), w.astype(np.float64))
                               for b, w in layers], priors.astype(np.float64),
                              inputs)
        if got.shape != want.shape:
            print("FAIL hidden %s: %d scores, expected %d" % (hidden, len(got), len(want)))
            failed = True
            continue
        worst = float(np.max(np.abs(got - want)))
        print("hidden %-8s classes %d offsets %d/%d skip %d: %d rows, max |diff| %.3g"
              % (hidden, classes, start_off, end_off, skip, len(got), worst))
        worst_all = max(worst_all, worst)
    print("network scores: max |diff| %.3g (tolerance %g)" % (worst_all, SCORE_TOLERANCE))
    return failed or worst_all > SCORE_TOLERANCE


def main():
    os.makedirs(sys.argv[-1], exist_ok=True)
    if sys.argv[1] == "plp":
        failed = check_plp(sys.argv[2], sys.argv[3], sys.argv[4])
    else:
        failed = check_dnn(sys.argv[2], sys.argv[3])
    sys.exit(1 if failed else 0)


if __name__ == "__main__":
    main()
