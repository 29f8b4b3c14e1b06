# SPDX-License-Identifier: Apache-2.0
"""Byte-level subword merges. Symbols 0-255 are bytes; merge number r makes
symbol 256 + r. Only ASCII is merged, so a merge never splits a character."""

from collections import Counter, defaultdict


def learn(type_counts, merges_wanted):
    words = [[bytes([b]) for b in w.encode()] for w in type_counts
             if w.isascii()]
    counts = [c for w, c in type_counts.items() if w.isascii()]
    pairs = Counter()
    where = defaultdict(set)
    for i, syms in enumerate(words):
        for a, b in zip(syms, syms[1:]):
            pairs[a, b] += counts[i]
            where[a, b].add(i)
    merges = []
    while len(merges) < merges_wanted and pairs:
        best, n = max(pairs.items(), key=lambda kv: (kv[1], kv[0]))
        if n < 2:
            break
        merges.append(best)
        joined = best[0] + best[1]
        for i in list(where[best]):
            syms = words[i]
            for a, b in zip(syms, syms[1:]):
                pairs[a, b] -= counts[i]
                if pairs[a, b] <= 0:
                    del pairs[a, b]
            out, j = [], 0
            while j < len(syms):
                if j + 1 < len(syms) and (syms[j], syms[j + 1]) == best:
                    out.append(joined)
                    j += 2
                else:
                    out.append(syms[j])
                    j += 1
            words[i] = out
            for a, b in zip(out, out[1:]):
                pairs[a, b] += counts[i]
                where[a, b].add(i)
        pairs.pop(best, None)
        where.pop(best, None)
    return merges


class Bpe:
    def __init__(self, merges):
        self.merges = merges
        self.ids = {bytes([b]): b for b in range(256)}
        self.rank = {}
        for r, (a, b) in enumerate(merges):
            # A piece reachable by two merges keeps the id of the first.
            self.ids.setdefault(a + b, 256 + r)
            self.rank[a, b] = r

    @property
    def size(self):
        return 256 + len(self.merges)

    def encode(self, word, max_bytes):
        syms = [bytes([b]) for b in word.encode()[:max_bytes]]
        while len(syms) > 1:
            best, at = None, -1
            for j in range(len(syms) - 1):
                r = self.rank.get((syms[j], syms[j + 1]))
                if r is not None and (best is None or r < best):
                    best, at = r, j
            if best is None:
                break
            syms[at:at + 2] = [syms[at] + syms[at + 1]]
        return [self.ids[s] for s in syms]

    def write(self, path):
        with open(path, "w", encoding="ascii") as f:
            f.write("#kvasr-punct-bpe 1\n")
            for a, b in self.merges:
                f.write(f"{a.decode()} {b.decode()}\n")
