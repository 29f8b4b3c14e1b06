# SPDX-License-Identifier: Apache-2.0
"""Turns cased, punctuated text into what the recogniser gives the punctuator
(lower-case words, numbers often spelled out, no marks) plus the labels the
model learns: the mark after each word and each word's casing class."""

import random
import re

# Label order is the model's output order; punc.txt is written from it.
PUNCT_LABELS = [("O", "", "none"), ("COMMA", ",", "pause"),
                ("PERIOD", ".", "end"), ("QUESTION", "?", "end")]
O, COMMA, PERIOD, QUESTION = range(4)
# Casing classes: as given, first letter up, all up, the lexicon's mixed form.
LOWER, CAPITAL, UPPER, MIXED = range(4)
IGNORE = -1

_KEEP_CHARS = re.compile(r"[^0-9a-z'\-\u0080-\U0010ffff]")
_NUMBER = re.compile(r"^\$?(\d{1,3}(,\d{3})+|\d+)(\.\d+)?%?$")
_ORDINAL = re.compile(r"^(\d+)(st|nd|rd|th)$")
_DECADE = re.compile(r"^(1[0-9]|20)([1-9]0)'?s$")

UNITS = ["zero", "one", "two", "three", "four", "five", "six", "seven", "eight",
         "nine", "ten", "eleven", "twelve", "thirteen", "fourteen", "fifteen",
         "sixteen", "seventeen", "eighteen", "nineteen"]
TENS = ["", "", "twenty", "thirty", "forty", "fifty", "sixty", "seventy",
        "eighty", "ninety"]
SCALES = [(10**12, "trillion"), (10**9, "billion"), (10**6, "million"),
          (1000, "thousand")]
ORDINAL_WORDS = {"one": "first", "two": "second", "three": "third",
                 "five": "fifth", "eight": "eighth", "nine": "ninth",
                 "twelve": "twelfth"}


def _below_thousand(n, rng):
    words = []
    if n >= 100:
        words += [UNITS[n // 100], "hundred"]
        n %= 100
        if n and rng.random() < 0.3:
            words.append("and")
    if n >= 20:
        words.append(TENS[n // 10])
        if n % 10:
            words.append(UNITS[n % 10])
    elif n or not words:
        words.append(UNITS[n])
    return words


def spell_cardinal(n, rng):
    if n == 0:
        return ["zero"]
    words = []
    for value, name in SCALES:
        if n >= value:
            words += _below_thousand(n // value, rng) + [name]
            n %= value
    if n:
        words += _below_thousand(n, rng)
    return words


def spell_year(n, rng):
    if 2000 <= n <= 2009:
        return ["two", "thousand"] + (["and"] if rng.random() < 0.5 else []) + \
            ([UNITS[n % 10]] if n % 10 else [])
    high, low = divmod(n, 100)
    if low == 0:
        return _below_thousand(high, rng) + ["hundred"]
    if low < 10:
        return _below_thousand(high, rng) + ["oh", UNITS[low]]
    return _below_thousand(high, rng) + _below_thousand(low, rng)


def spell_ordinal(n, rng):
    words = spell_cardinal(n, rng)
    last = words[-1]
    if last in ORDINAL_WORDS:
        words[-1] = ORDINAL_WORDS[last]
    elif last.endswith("y"):
        words[-1] = last[:-1] + "ieth"
    else:
        words[-1] = last + "th"
    return words


def spell_number(token, rng):
    """Spoken words for a written number, or None if it is not one."""
    m = _ORDINAL.match(token)
    if m:
        return spell_ordinal(int(m.group(1)), rng)
    m = _DECADE.match(token)
    if m:
        words = spell_year(int(m.group(1)) * 100 + int(m.group(2)), rng)
        words[-1] = words[-1][:-1] + "ies"
        return words
    m = _NUMBER.match(token)
    if not m:
        return None
    digits = m.group(1).replace(",", "")
    if len(digits) > 13:
        return None
    n = int(digits)
    if m.group(3) is None and 1100 <= n <= 2099 and "," not in m.group(1):
        words = spell_year(n, rng)
    else:
        words = spell_cardinal(n, rng)
    if m.group(3):
        words += ["point"] + [UNITS[int(d)] for d in m.group(3)[1:]]
    if token.endswith("%"):
        words.append("percent")
    if token.startswith("$"):
        words.append("dollars")
    return words


def casing_class(surface):
    letters = [c for c in surface if c.isalpha()]
    if not letters or all(c.islower() for c in letters):
        return LOWER
    if len(letters) > 1 and all(c.isupper() for c in letters):
        return UPPER
    if letters[0].isupper() and all(c.islower() for c in letters[1:]):
        return CAPITAL
    return MIXED


def _trailing_label(marks):
    if "?" in marks:
        return QUESTION
    if any(c in marks for c in ".!;"):
        return PERIOD
    if any(c in marks for c in ",:-"):
        return COMMA
    return O


def _is_word_char(c):
    return c.isalnum() or c == "$" or c == "%"


def paragraph_tokens(line, spell_prob, rng):
    """Yields [word, surface, punct label, sentence start] lists for one
    paragraph; `surface` keeps the written casing, `word` is what the
    recogniser would say."""
    tokens = []
    for raw in line.replace("--", " -- ").split():
        start, end = 0, len(raw)
        while start < end and not _is_word_char(raw[start]):
            start += 1
        while end > start and not _is_word_char(raw[end - 1]):
            end -= 1
        label = _trailing_label(raw[end:])
        core = raw[start:end]
        if not core:
            if tokens and label > tokens[-1][2]:
                tokens[-1][2] = label
            continue
        spoken = spell_number(core, rng) if rng.random() < spell_prob else None
        if spoken:
            for w in spoken:
                tokens.append([w, w, O])
            tokens[-1][2] = label
            continue
        # Dots inside acronyms and abbreviations are not spoken.
        surface = core.replace(".", "") if not _NUMBER.match(core) else core
        word = _KEEP_CHARS.sub("", surface.lower())
        if not word:
            continue
        tokens.append([word, surface, label])
    for i, t in enumerate(tokens):
        t.append(i == 0 or tokens[i - 1][2] in (PERIOD, QUESTION))
    return tokens


def read_corpus(path, max_words, spell_prob, seed):
    """Word stream of a file with one paragraph per line: lists of words,
    surfaces, punctuation labels and sentence-start flags."""
    rng = random.Random(seed)
    words, surfaces, labels, starts = [], [], [], []
    with open(path, encoding="utf-8") as f:
        for line in f:
            for w, s, p, st in paragraph_tokens(line, spell_prob, rng):
                words.append(w)
                surfaces.append(s)
                labels.append(p)
                starts.append(st)
            if len(words) >= max_words:
                break
    return words, surfaces, labels, starts


def read_labelled(path):
    """A token/label benchmark file as the recogniser would say it: clitics
    rejoined to their word; the label of a group is that of its last token."""
    names = {name: i for i, (name, _, _) in enumerate(PUNCT_LABELS)}
    words, labels, tokens_per_word = [], [], []
    with open(path, encoding="utf-8") as f:
        for line in f:
            token, _, name = line.rstrip("\n").partition("\t")
            if not token:
                continue
            if words and (token.startswith("'") or token == "n't"):
                words[-1] += token
                labels[-1] = names[name]
                tokens_per_word[-1] += 1
                continue
            words.append(token)
            labels.append(names[name])
            tokens_per_word.append(1)
    return words, labels, tokens_per_word
