# SPDX-License-Identifier: Apache-2.0
"""The detector's decision stage in numpy, and a loss taken through it.

The detector does not decide on single network scores. It scores every third
frame, holds each score for three frames, smooths the held scores
(s = 0.2 x + 0.8 s_prev, starting from -2 with each utterance) and calls a
frame speech when s > -1 and the energy gate is open. A network trained on
single frames learns nothing of the lag that smoothing adds at every onset,
and spends its capacity on frames the gate decides by itself. The loss here
is the cross-entropy of the decision's own log-odds, s + 1, against the
labels, on the frames whose gate is open; it is differentiated through the
smoothing back to the network's two outputs.
"""
import numpy as np

import network

EVAL_STRIDE_FRAMES = 3        # the network runs on every third frame
SCORE_SMOOTH = 0.8            # weight of the previous smoothed score
SCORE_THRESHOLD = -1.0        # speech when the smoothed score is above this
SMOOTHED_START = SCORE_THRESHOLD - 1.0
# Training pieces: frames with a loss, after a warm-up that only feeds the
# smoother (0.8^45 leaves 4e-5 of the arbitrary start value).
PIECE_LOSS_FRAMES = 300
WARMUP_FRAMES = 45
PIECE_FRAMES = PIECE_LOSS_FRAMES + WARMUP_FRAMES


def scores_from_logits(z):
    """The detector's frame score from the two output logits (equal priors),
    floored as in the module, and its derivative by the logit difference."""
    diff = (z[:, 1] - z[:, 0]).astype(np.float64)
    # The tanh form of the logistic cannot overflow for confident outputs.
    p_speech = 0.5 * (1.0 + np.tanh(0.5 * diff))
    p_other = 0.5 * (1.0 - np.tanh(0.5 * diff))
    floor = network.POSTERIOR_FLOOR
    score = np.log(p_speech + floor) - np.log(p_other + floor)
    slope = p_speech * p_other * (1.0 / (p_speech + floor) + 1.0 / (p_other + floor))
    return score, slope


def smooth(held):
    """Smoothed scores of held frame scores (pieces x frames)."""
    out = np.empty_like(held)
    s = np.full(held.shape[0], SMOOTHED_START)
    for f in range(held.shape[1]):
        s = (1.0 - SCORE_SMOOTH) * held[:, f] + SCORE_SMOOTH * s
        out[:, f] = s
    return out


def smooth_backward(grad):
    """Gradient by the held scores from the gradient by the smoothed ones."""
    out = np.empty_like(grad)
    acc = np.zeros(grad.shape[0])
    for f in range(grad.shape[1] - 1, -1, -1):
        acc = grad[:, f] + SCORE_SMOOTH * acc
        out[:, f] = (1.0 - SCORE_SMOOTH) * acc
    return out


def decisions(scores, gate):
    """Per-frame decisions of one utterance from the scores of its evaluated
    frames (0, 3, 6, ...) and its energy gate flags."""
    held = np.repeat(scores, EVAL_STRIDE_FRAMES)[:len(gate)]
    return (smooth(held[None, :])[0] > SCORE_THRESHOLD) & (gate > 0)


def gradients(net, x, labels, weights):
    """Loss and gradients for pieces of consecutive frames. `x` holds the
    network inputs of every third frame of every piece, piece by piece;
    `labels` and `weights` (zero where no loss is taken) are per frame,
    pieces x frames."""
    pieces, frames = labels.shape
    acts = [x]
    z = net.logits(x, acts)
    score, slope = scores_from_logits(z)
    held = np.repeat(score.reshape(pieces, -1), EVAL_STRIDE_FRAMES, axis=1)
    margin = smooth(held) - SCORE_THRESHOLD
    total = weights.sum()
    share = weights / total if total > 0 else weights
    loss = np.sum(share * (np.logaddexp(0.0, margin) - labels * margin))
    grad_held = smooth_backward(share * (network.sigmoid(margin) - labels))
    grad_score = grad_held.reshape(pieces, -1, EVAL_STRIDE_FRAMES).sum(axis=2).ravel()
    grad_diff = (grad_score * slope).astype(np.float32)
    gw, gb = net.backward(acts, np.stack([-grad_diff, grad_diff], axis=1))
    return loss, gw, gb


class Pieces:
    """A frame set cut into pieces of PIECE_FRAMES consecutive frames, each
    starting on an evaluated frame; the loss frames of the pieces of one
    utterance follow each other without gap or overlap."""

    def __init__(self, frame_set):
        self.frame_set = frame_set
        starts, first_loss = [], []
        for _, offset, count in frame_set.spans:
            for begin in range(0, count - PIECE_FRAMES + 1, PIECE_LOSS_FRAMES):
                starts.append(offset + begin)
                first_loss.append(0 if begin == 0 else WARMUP_FRAMES)
        self.starts = np.array(starts, dtype=np.int64)
        self.first_loss = np.array(first_loss)

    def __len__(self):
        return len(self.starts)

    def batches(self, frame_weight, batch, rng):
        """(frames to score, gradient function) for each batch of pieces, in
        random order."""
        frame_set = self.frame_set
        order = rng.permutation(len(self))
        offsets = np.arange(PIECE_FRAMES)
        for i in range(0, len(order), batch):
            chosen = order[i:i + batch]
            index = self.starts[chosen][:, None] + offsets
            weights = frame_weight[index] * (frame_set.gate[index] > 0) \
                * (offsets >= self.first_loss[chosen][:, None])
            labels = frame_set.labels[index].astype(np.float64)
            yield (index[:, ::EVAL_STRIDE_FRAMES].ravel(),
                   lambda net, x, y=labels, w=weights: gradients(net, x, y, w))
