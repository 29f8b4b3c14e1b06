# SPDX-License-Identifier: Apache-2.0
"""Frame data from the pipeline's dumps: the feature rows the detector saw,
spliced exactly as the network sees them, with the mixtures' labels."""
import os

import numpy as np

FEAT_DIM = 39
LEFT_CONTEXT_FRAMES = 5
RIGHT_CONTEXT_FRAMES = 5
# Mixture kinds as mix.py writes them: speech, or a speech-free stretch.
NOSPEECH_KINDS = ("music", "effects", "noise", "silence")
SPLICE_FRAMES = 1 + LEFT_CONTEXT_FRAMES + RIGHT_CONTEXT_FRAMES


def load_rows(dump_dir, name):
    return np.fromfile(os.path.join(dump_dir, name + ".f32"), dtype="<f4").reshape(-1, FEAT_DIM)


def load_labels(mix_dir, name):
    return np.fromfile(os.path.join(mix_dir, name + ".lab"), dtype=np.uint8)


def load_frame_table(dump_dir, name):
    """Per frame: score, smoothed score, energy gate, decision, emitted."""
    path = os.path.join(dump_dir, name + ".tsv")
    data = np.loadtxt(path, skiprows=1, ndmin=2)
    if data.size == 0:
        return np.zeros((0, 5))
    return data[:, 1:]


def splice_index(frames, offset=0):
    """Row numbers of the 11-frame window of every frame; the utterance's edge
    rows stand in for frames beyond it, as in the detector."""
    t = np.arange(frames)[:, None] + np.arange(-LEFT_CONTEXT_FRAMES, RIGHT_CONTEXT_FRAMES + 1)
    return (np.clip(t, 0, frames - 1) + offset).astype(np.int64)


class FrameSet:
    """All frames of a set of mixtures: rows, splice index, labels and the
    energy gate's flags; `spans` gives each mixture's (name, first frame,
    frame count)."""

    def __init__(self, mix_dir, dump_dir, names):
        rows, index, labels, gate = [], [], [], []
        self.spans = []
        offset = 0
        for name in names:
            x = load_rows(dump_dir, name)
            y = load_labels(mix_dir, name)
            g = load_frame_table(dump_dir, name)[:, 2]
            n = min(len(x), len(y), len(g))
            if n == 0:
                continue
            rows.append(x[:n])
            labels.append(y[:n])
            gate.append(g[:n].astype(np.uint8))
            index.append(splice_index(n, offset))
            self.spans.append((name, offset, n))
            offset += n
        self.rows = np.concatenate(rows)
        self.index = np.concatenate(index)
        self.labels = np.concatenate(labels).astype(np.int64)
        self.gate = np.concatenate(gate)

    def __len__(self):
        return len(self.labels)

    def inputs(self, which):
        """Spliced network inputs of frames `which` (indices or a slice)."""
        return self.rows[self.index[which]].reshape(-1, FEAT_DIM * SPLICE_FRAMES)


def mixture_names(mix_dir, kinds=None):
    names = []
    with open(os.path.join(mix_dir, "mixtures.tsv")) as f:
        next(f)
        for line in f:
            cols = line.rstrip("\n").split("\t")
            if kinds is None or cols[1] in kinds:
                names.append(cols[0])
    return names
