"""The shared VAD corpus: manifest, and the split into train, val and dev.

Speech is split by speaker label, non-speech by file, within each source or
category, with a fixed seed so that every run draws the same split. `dev` is
for the final figures only; `val` (held-out train speakers and noise files)
chooses the network size and when training stops.
"""
import csv
import os
import random

SPLIT_SEED = 20261121
DEV_SHARE = 0.2
VAL_SHARE = 0.1

# Background categories: their folder under noise/.
NOISE_CATEGORIES = ("ambient", "babble", "household", "animals", "sfx",
                    "music/instrumental", "music/vocal", "music/rock")


def category(path):
    parts = path.split("/")
    if parts[0] == "speech":
        return "speech/" + parts[1]
    if parts[1] == "music":
        return "music/" + parts[2]
    return parts[1]


def read_manifest(corpus_dir):
    with open(os.path.join(corpus_dir, "MANIFEST.tsv"), encoding="utf-8") as f:
        rows = list(csv.DictReader(f, delimiter="\t"))
    for row in rows:
        row["category"] = category(row["path"])
        row["duration_s"] = float(row["duration_s"])
    return rows


def _take_share(keys, share, rng):
    keys = sorted(keys)
    rng.shuffle(keys)
    count = max(1, round(share * len(keys)))
    return set(keys[:count])


def split(rows):
    """Returns {'train': [...], 'val': [...], 'dev': [...]} of manifest rows."""
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
    parts = {"train": [], "val": [], "dev": []}
    for row in rows:
        key = (row["category"],
               row["speaker"] if row["kind"] == "speech" else row["path"])
        part = "dev" if key in dev_keys else "val" if key in val_keys else "train"
        parts[part].append(row)
    return parts
