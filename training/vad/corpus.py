# SPDX-License-Identifier: Apache-2.0
"""The VAD corpora: manifests, and the split into train, val and dev.

The shared corpus: speech is split by speaker label, non-speech by file,
within each source or category, with a fixed seed so that every run draws
the same split. The package corpus (`packages.py`) is split by whole
package, as `packages.PACKAGES` assigns them, so that dev and val hold sound
from sources the network never heard. `dev` is for the final figures only;
`val` chooses the network size, when training stops and the operating point.
"""
import os
import random

import packages

SPLIT_SEED = 20261121
DEV_SHARE = 0.2
VAL_SHARE = 0.1
PARTS = ("train", "val", "dev")

# Background categories: their folder under noise/.
NOISE_CATEGORIES = ("ambient", "babble", "household", "animals", "sfx",
                    "music/instrumental", "music/vocal", "music/rock")


def category(row):
    """Mixing draws a category first and then a file of it. A package's
    music and its effects are categories of their own, so that each package
    weighs alike whatever its file count."""
    parts = row["path"].split("/")
    if row["source"] in packages.PACKAGES:
        kind = {"speech": "speech", "music": "music", "noise": "effects"}[row["kind"]]
        return "%s/pkg/%s" % (kind, row["source"])
    if parts[0] == "speech":
        return "speech/" + parts[1]
    if parts[1] == "music":
        return "music/" + parts[2]
    return parts[1]


def read_manifest(corpus_dir):
    rows = packages.read_manifest(corpus_dir)
    for row in rows:
        row["category"] = category(row)
        row["duration_s"] = float(row["duration_s"])
        row["file"] = os.path.join(corpus_dir, row["path"])
    return rows


def _take_share(keys, share, rng):
    keys = sorted(keys)
    rng.shuffle(keys)
    count = max(1, round(share * len(keys)))
    return set(keys[:count])


def split_shared(rows):
    """Returns {'train': [...], 'val': [...], 'dev': [...]} of the shared
    corpus's manifest rows."""
    rng = random.Random(SPLIT_SEED)
    by_group = {}
    for row in rows:
        key = row["speaker"] if row["kind"] == "speech" else row["path"]
        by_group.setdefault(row["category"], set()).add(key)
    dev_keys, val_keys = set(), set()
    for cat in sorted(by_group):
        keys = by_group[cat]
        dev = _take_share(keys, DEV_SHARE, rng)
        rest = keys - dev
        val = _take_share(rest, VAL_SHARE, rng) if len(rest) > 2 else set()
        dev_keys |= {(cat, k) for k in dev}
        val_keys |= {(cat, k) for k in val}
    parts = {p: [] for p in PARTS}
    for row in rows:
        key = (row["category"],
               row["speaker"] if row["kind"] == "speech" else row["path"])
        part = "dev" if key in dev_keys else "val" if key in val_keys else "train"
        parts[part].append(row)
    return parts


def split_packages(rows):
    parts = {p: [] for p in PARTS}
    for row in rows:
        parts[packages.PACKAGES[row["source"]][1]].append(row)
    return parts


def load(shared_dir, packages_dir=None):
    """The split of the shared corpus, with the package corpus's added when
    its folder is given."""
    parts = split_shared(read_manifest(shared_dir))
    if packages_dir:
        for part, rows in split_packages(read_manifest(packages_dir)).items():
            parts[part] += rows
    return parts
