# SPDX-License-Identifier: Apache-2.0
"""Readers and writers of the detector's three model files.

quellan_data_a: uint32 N, then N float32 means and N float32 variances: the
  starting point of the running feature normalisation.
quellan_data_b: 8 flag bytes "MYDNN1\\0\\0", int32 input length, int32 class
  count, int32 hidden layer count H, H int32 sizes, then per layer its
  float32 biases and its float32 weights, input-major (weight k -> j at
  k * outputs + j). Hidden layers are logistic, the output a softmax whose
  class 1 is speech.
quellan_data_c: int32 class count (not read by the detector), then one
  float32 prior per class; the detector divides the posteriors by them.
All little-endian.
"""
import struct

import numpy as np

NETWORK_FLAG = b"MYDNN1\0\0"


def write_mean_table(path, means, variances):
    means = np.asarray(means, dtype="<f4")
    variances = np.asarray(variances, dtype="<f4")
    with open(path, "wb") as f:
        f.write(struct.pack("<I", len(means)))
        f.write(means.tobytes())
        f.write(variances.tobytes())


def read_mean_table(path):
    with open(path, "rb") as f:
        (n,) = struct.unpack("<I", f.read(4))
        data = np.frombuffer(f.read(8 * n), dtype="<f4")
    return data[:n].copy(), data[n:].copy()


def write_network(path, weights, biases):
    """weights[i]: (inputs, outputs) float32, biases[i]: (outputs,)."""
    hidden = [w.shape[1] for w in weights[:-1]]
    with open(path, "wb") as f:
        f.write(NETWORK_FLAG)
        f.write(struct.pack("<iii", weights[0].shape[0], weights[-1].shape[1], len(hidden)))
        for h in hidden:
            f.write(struct.pack("<i", h))
        for w, b in zip(weights, biases):
            f.write(np.asarray(b, dtype="<f4").tobytes())
            f.write(np.ascontiguousarray(w, dtype="<f4").tobytes())


def read_network(path):
    with open(path, "rb") as f:
        data = f.read()
    if data[:6] != NETWORK_FLAG[:6]:
        raise ValueError("not a network file: " + path)
    inputs, outputs, layers = struct.unpack_from("<iii", data, 8)
    hidden = list(struct.unpack_from("<%di" % layers, data, 20))
    pos = 20 + 4 * layers
    dims = [inputs] + hidden + [outputs]
    weights, biases = [], []
    for a, b in zip(dims[:-1], dims[1:]):
        biases.append(np.frombuffer(data, "<f4", b, pos).copy())
        pos += 4 * b
        weights.append(np.frombuffer(data, "<f4", a * b, pos).reshape(a, b).copy())
        pos += 4 * a * b
    return weights, biases


def write_priors(path, priors):
    with open(path, "wb") as f:
        f.write(struct.pack("<i", len(priors)))
        f.write(np.asarray(priors, dtype="<f4").tobytes())


def read_priors(path):
    with open(path, "rb") as f:
        (n,) = struct.unpack("<i", f.read(4))
        return np.frombuffer(f.read(4 * n), dtype="<f4").copy()
