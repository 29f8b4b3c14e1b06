# SPDX-License-Identifier: Apache-2.0
"""The detector's network in numpy: logistic hidden layers and a two-class
softmax, trained with cross-entropy and Adam; and the forward pass as the
detector computes its frame score."""
import numpy as np

POSTERIOR_FLOOR = 1e-7
SCORE_FLOOR = -1000.0
SPEECH, NON_SPEECH = 1, 0


def sigmoid(x):
    # exp overflows to inf for very negative x, which gives the right 0.
    with np.errstate(over="ignore"):
        return 1.0 / (1.0 + np.exp(-x))


class Network:
    def __init__(self, inputs, hidden, rng, classes=2):
        dims = [inputs] + list(hidden) + [classes]
        self.weights = [(rng.standard_normal((a, b)) * np.sqrt(1.0 / a)).astype(np.float32)
                        for a, b in zip(dims[:-1], dims[1:])]
        self.biases = [np.zeros(b, dtype=np.float32) for b in dims[1:]]

    @property
    def hidden(self):
        return [w.shape[1] for w in self.weights[:-1]]

    def multiply_adds(self):
        return sum(w.size for w in self.weights)

    def logits(self, x, keep=None):
        h = x
        for w, b in zip(self.weights[:-1], self.biases[:-1]):
            h = sigmoid(h @ w + b)
            if keep is not None:
                keep.append(h)
        return h @ self.weights[-1] + self.biases[-1]

    def gradients(self, x, y, weight):
        """Cross-entropy of labels y, averaged with per-frame weights, and its
        gradients."""
        acts = [x]
        z = self.logits(x, acts)
        z = z - z.max(axis=1, keepdims=True)
        p = np.exp(z)
        p /= p.sum(axis=1, keepdims=True)
        share = weight / weight.sum()
        loss = -np.sum(share * np.log(p[np.arange(len(y)), y] + 1e-12))
        d = p
        d[np.arange(len(y)), y] -= 1.0
        d *= share[:, None]
        gw, gb = self.backward(acts, d)
        return loss, gw, gb

    def backward(self, acts, d):
        """Gradients of the weights and biases from those of the logits `d`,
        given the activations `logits(x, acts)` kept (acts starting as [x])."""
        gw, gb = [], []
        for i in range(len(self.weights) - 1, -1, -1):
            gw.append(acts[i].T @ d)
            gb.append(d.sum(axis=0))
            if i > 0:
                d = (d @ self.weights[i].T) * acts[i] * (1.0 - acts[i])
        return gw[::-1], gb[::-1]

    def unfold_input_scaling(self, mean, scale):
        """The inverse of fold_input_scaling: makes a network that takes
        unscaled inputs take (x - mean) / scale."""
        self.biases[0] = (self.biases[0] + mean @ self.weights[0]).astype(np.float32)
        self.weights[0] = (self.weights[0] * scale[:, None]).astype(np.float32)

    def fold_input_scaling(self, mean, scale):
        """Makes the first layer take unscaled inputs x where it was trained on
        (x - mean) / scale."""
        w = self.weights[0] / scale[:, None]
        self.biases[0] = (self.biases[0] - mean @ w).astype(np.float32)
        self.weights[0] = w.astype(np.float32)


class Adam:
    def __init__(self, params, lr, beta1=0.9, beta2=0.999, eps=1e-8):
        self.params, self.lr = params, lr
        self.b1, self.b2, self.eps, self.t = beta1, beta2, eps, 0
        self.m = [np.zeros_like(p) for p in params]
        self.v = [np.zeros_like(p) for p in params]

    def step(self, grads):
        self.t += 1
        c1 = 1.0 - self.b1 ** self.t
        c2 = 1.0 - self.b2 ** self.t
        for p, g, m, v in zip(self.params, grads, self.m, self.v):
            m *= self.b1
            m += (1 - self.b1) * g
            v *= self.b2
            v += (1 - self.b2) * g * g
            p -= (self.lr * (m / c1) / (np.sqrt(v / c2) + self.eps)).astype(p.dtype)


def detector_scores(weights, biases, priors, x):
    """Frame scores as the detector forms them, in single precision:
    ln(P(speech)/prior) - ln(P(non-speech)/prior), each floored."""
    h = np.asarray(x, dtype=np.float32)
    for w, b in zip(weights[:-1], biases[:-1]):
        h = (1.0 / (1.0 + np.exp((-(h @ w + b)).astype(np.float64)))).astype(np.float32)
    z = np.exp((h @ weights[-1] + biases[-1]).astype(np.float32))
    post = z / z.sum(axis=1, keepdims=True, dtype=np.float32) / np.asarray(priors, np.float32)
    logp = np.log(post.astype(np.float64) + POSTERIOR_FLOOR).astype(np.float32)
    logp = np.maximum(logp, np.float32(SCORE_FLOOR))
    return logp[:, SPEECH] - logp[:, NON_SPEECH]
