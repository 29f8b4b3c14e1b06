# SPDX-License-Identifier: Apache-2.0
"""Trains the punctuation and casing model and writes the files the
punctuation library loads (formats: platform/punctuator/README.md)."""

import argparse
import hashlib
import os
import random
import shutil
import struct
import sys
import time
from collections import Counter, defaultdict

import numpy as np
import torch
from torch import nn

import bpe as bpe_mod
import corpus
from scoring import f1_scores

MODEL_MAGIC = b"KVPUNCT\0"
MODEL_VERSION = 1
# After the magic: version, language, then the 13 shape fields.
MODEL_HEADER = "<I4s13I"
# Subword bag of one word: bytes looked at, pieces kept.
MAX_WORD_BYTES = 48
MAX_PIECES = 16
# Long texts run in windows: each predicts STEP words and sees CONTEXT more
# on either side.
WINDOW_STEP = 48
WINDOW_CONTEXT = 16
TRAIN_LENGTH = 64
CONV_KERNEL = 5
UNK = 0
# Which casing forms become lexicon entries.
MIN_MIXED_COUNT = 2
MIN_ALWAYS_COUNT = 5
ALWAYS_SHARE = 0.95
BIAS_GRID = [x / 10 for x in range(-15, 16)]
HERE = os.path.dirname(os.path.abspath(__file__))


class PunctNet(nn.Module):
    """Word plus mean subword embedding, a stack of dilated convolutions
    (the first maps to the channel width, the others are residual), an
    optional bidirectional GRU, and one linear head per task."""

    def __init__(self, vocab, pieces, dim, channels, convs, hidden, dropout):
        super().__init__()
        self.wemb = nn.Embedding(vocab, dim)
        self.pemb = nn.Embedding(pieces + 1, dim, padding_idx=pieces)
        self.convs = nn.ModuleList(
            nn.Conv1d(dim if i == 0 else channels, channels, CONV_KERNEL,
                      dilation=2 ** i, padding=2 ** i * (CONV_KERNEL // 2))
            for i in range(convs))
        width = channels if convs else dim
        self.gru = nn.GRU(width, hidden, batch_first=True,
                          bidirectional=True) if hidden else None
        width = 2 * hidden if hidden else width
        self.punct = nn.Linear(width, len(corpus.PUNCT_LABELS))
        self.case = nn.Linear(width, 4)
        self.drop = nn.Dropout(dropout)

    def forward(self, wid, pieces, npieces):
        bag = self.pemb(pieces).sum(2) / npieces.clamp(min=1).unsqueeze(-1)
        h = self.drop(self.wemb(wid) + bag).transpose(1, 2)
        for i, conv in enumerate(self.convs):
            y = torch.relu(conv(h))
            h = y if i == 0 else h + y
        h = h.transpose(1, 2)
        if self.gru is not None:
            h, _ = self.gru(h)
        h = self.drop(h)
        return self.punct(h), self.case(h)


class Lexicon:
    """Word ids and subword bags of every word type met."""

    def __init__(self, vocab_words, bpe):
        self.vocab = {w: i for i, w in enumerate(vocab_words)}
        self.bpe = bpe
        self.type_ids = {}
        self.type_pieces = []

    def type_of(self, word):
        t = self.type_ids.get(word)
        if t is None:
            t = len(self.type_pieces)
            self.type_ids[word] = t
            self.type_pieces.append(
                self.bpe.encode(word, MAX_WORD_BYTES)[:MAX_PIECES])
        return t

    def arrays(self, words):
        wid = np.array([self.vocab.get(w, UNK) for w in words], np.int64)
        tid = np.array([self.type_of(w) for w in words], np.int64)
        return wid, tid

    def piece_table(self):
        table = np.full((len(self.type_pieces), MAX_PIECES), self.bpe.size,
                        np.int64)
        counts = np.zeros(len(self.type_pieces), np.float32)
        for t, p in enumerate(self.type_pieces):
            table[t, :len(p)] = p
            counts[t] = len(p)
        return torch.from_numpy(table), torch.from_numpy(counts)


def windows(n):
    """(first, last) input range and (first, last) predicted range."""
    for s in range(0, n, WINDOW_STEP):
        e = min(n, s + WINDOW_STEP)
        yield max(0, s - WINDOW_CONTEXT), min(n, e + WINDOW_CONTEXT), s, e


def predict(model, lex, words):
    """Punctuation and casing logits of a word stream, windowed as the
    library does it."""
    wid, tid = lex.arrays(words)
    table, counts = lex.piece_table()
    punct = np.zeros((len(words), len(corpus.PUNCT_LABELS)), np.float32)
    case = np.zeros((len(words), 4), np.float32)
    model.eval()
    with torch.no_grad():
        for a, b, s, e in windows(len(words)):
            t = torch.from_numpy(tid[a:b])[None]
            p, c = model(torch.from_numpy(wid[a:b])[None], table[t],
                         counts[t])
            punct[s:e] = p[0, s - a:e - a].numpy()
            case[s:e] = c[0, s - a:e - a].numpy()
    return punct, case


def casing_labels(surfaces, starts):
    labels = []
    for s, st in zip(surfaces, starts):
        c = corpus.casing_class(s)
        # Sentence capitals follow from the predicted marks, not the word.
        labels.append(corpus.IGNORE if st and c == corpus.CAPITAL else c)
    return np.array(labels, np.int64)


def build_case_lexicon(words, surfaces, starts):
    forms = defaultdict(Counter)
    for w, s, st in zip(words, surfaces, starts):
        if not st and s.lower() == w:
            forms[w][s] += 1
    entries = []
    for w, counter in sorted(forms.items()):
        total = sum(counter.values())
        form, n = counter.most_common(1)[0]
        cls = corpus.casing_class(form)
        if cls == corpus.LOWER:
            continue
        if total >= MIN_ALWAYS_COUNT and n >= ALWAYS_SHARE * total:
            entries.append((w, form, "always"))
        elif cls == corpus.MIXED and n >= MIN_MIXED_COUNT:
            entries.append((w, form, "model"))
    return entries


def train(args):
    torch.manual_seed(args.seed)
    random.seed(args.seed)
    torch.set_num_threads(args.threads)
    data = args.data
    words, surfaces, plabels, starts = corpus.read_corpus(
        os.path.join(data, "extra/ted/ted_talks.txt"), args.words,
        args.spell_prob, args.seed)
    print(f"training words: {len(words)}", flush=True)
    counts = Counter(words)
    vocab_words = ["<unk>"] + [w for w, c in counts.most_common(args.vocab - 1)
                               if c >= args.min_count]
    merges = bpe_mod.learn(counts, args.merges)
    bpe = bpe_mod.Bpe(merges)
    lex = Lexicon(vocab_words, bpe)
    wid, tid = lex.arrays(words)
    pl = np.array(plabels, np.int64)
    cl = casing_labels(surfaces, starts)
    dev_words, dev_labels, _ = corpus.read_labelled(
        os.path.join(data, "iwslt2012/dev2012"))
    dev_words, dev_labels = dev_words[:args.dev_words], np.array(
        dev_labels[:args.dev_words])
    for w in dev_words:
        lex.type_of(w)
    table, pcounts = lex.piece_table()
    print(f"vocab {len(vocab_words)}, pieces {bpe.size}, types "
          f"{len(lex.type_pieces)}", flush=True)

    model = PunctNet(len(vocab_words), bpe.size, args.dim, args.channels,
                     args.convs, args.hidden, args.dropout)
    if args.init:
        load_weights(model, args.init, vocab_words, args.lang)
    opt = torch.optim.Adam(model.parameters(), lr=args.lr)
    loss_fn = nn.CrossEntropyLoss(ignore_index=corpus.IGNORE)
    best_f1, best_state = -1.0, None
    rows = (len(words) - TRAIN_LENGTH) // TRAIN_LENGTH
    steps_total = args.epochs * ((rows + args.batch - 1) // args.batch)
    sched = torch.optim.lr_scheduler.OneCycleLR(
        opt, max_lr=args.lr, total_steps=max(1, steps_total))
    deadline = time.time() + 60 * args.max_minutes
    for epoch in range(args.epochs):
        if time.time() > deadline:
            break
        model.train()
        off = random.randrange(TRAIN_LENGTH)
        idx = off + np.arange(rows * TRAIN_LENGTH).reshape(rows, TRAIN_LENGTH)
        order = np.random.default_rng(args.seed + epoch).permutation(rows)
        t0, seen, total = time.time(), 0, 0.0
        for bstart in range(0, rows, args.batch):
            if time.time() > deadline:
                print("time budget spent, stopping", flush=True)
                break
            sel = idx[order[bstart:bstart + args.batch]]
            w = torch.from_numpy(wid[sel])
            drop = torch.rand(w.shape) < args.word_dropout
            w = w.masked_fill(drop, UNK)
            t = torch.from_numpy(tid[sel])
            p, c = model(w, table[t], pcounts[t])
            loss = loss_fn(p.reshape(-1, p.shape[-1]),
                           torch.from_numpy(pl[sel]).reshape(-1)) + \
                args.case_weight * loss_fn(c.reshape(-1, 4),
                                           torch.from_numpy(cl[sel]).reshape(-1))
            opt.zero_grad()
            loss.backward()
            nn.utils.clip_grad_norm_(model.parameters(), 5.0)
            opt.step()
            sched.step()
            seen += sel.size
            total += loss.item()
            if (bstart // args.batch) % 200 == 0:
                print(f"epoch {epoch} rows {bstart}/{rows} loss "
                      f"{loss.item():.4f} {seen / (time.time() - t0):.0f} "
                      "words/s", flush=True)
        logits, _ = predict(model, lex, dev_words)
        f1 = f1_scores(dev_labels, logits.argmax(1))["OVERALL"][2]
        print(f"epoch {epoch} dev2012 overall F1 {100 * f1:.2f} "
              f"({time.time() - t0:.0f} s)", flush=True)
        if f1 > best_f1:
            best_f1 = f1
            best_state = {k: v.clone() for k, v in model.state_dict().items()}
    model.load_state_dict(best_state)
    round_to_half(model)
    tune_mark_biases(model, lex, dev_words, dev_labels)
    return model, lex, vocab_words, bpe, build_case_lexicon(words, surfaces,
                                                              starts)


def round_to_half(model):
    """The library stores weights as float16; train-side checks and the
    bias tuning see the same values."""
    with torch.no_grad():
        for p in model.parameters():
            p.copy_(p.half().float())


def tune_mark_biases(model, lex, dev_words, dev_labels):
    """Shifts the no-mark logit, then each mark's (twice round), to the
    values that maximise overall F1 on the dev text: the marks trade
    precision against recall differently, and the shift is cheaper than
    reweighting the loss and retraining."""
    logits, _ = predict(model, lex, dev_words)
    shift = np.zeros(len(corpus.PUNCT_LABELS), np.float32)

    def overall(label, d):
        trial = shift.copy()
        trial[label] = d
        return f1_scores(dev_labels, (logits + trial).argmax(1))["OVERALL"][2]

    marks = [i for i in range(len(shift)) if i != corpus.O]
    for label in [corpus.O] + marks + marks:
        shift[label] = max(BIAS_GRID, key=lambda d: overall(label, d))
    with torch.no_grad():
        model.punct.bias += torch.from_numpy(shift)
    round_to_half(model)
    logits, _ = predict(model, lex, dev_words)
    scores = f1_scores(dev_labels, logits.argmax(1))
    print("bias shifts " + " ".join(f"{corpus.PUNCT_LABELS[i][0]} {d:+.1f}"
                                    for i, d in enumerate(shift)) +
          ": dev2012 " + ", ".join(f"{k} {100 * v[2]:.1f}"
                                   for k, v in scores.items()), flush=True)


def fnv1a(data):
    h = 0x811C9DC5
    for b in data:
        h = ((h ^ b) * 0x01000193) & 0xFFFFFFFF
    return h


def encoder_tensors(model):
    """The embeddings and convolutions, in file order (they open the
    weights; the padding row of the piece embedding is not stored)."""
    tensors = [model.wemb.weight, model.pemb.weight[:-1]]
    for conv in model.convs:
        tensors += [conv.weight, conv.bias]
    return tensors


def model_tensors(model):
    """Every stored tensor in file order: the encoder, the GRU if any (each
    direction's input, recurrent and bias tensors), then the two heads."""
    tensors = encoder_tensors(model)
    gru = model.gru
    if gru is not None:
        for sfx in ("", "_reverse"):
            tensors += [getattr(gru, f"weight_ih_l0{sfx}"),
                        getattr(gru, f"weight_hh_l0{sfx}"),
                        getattr(gru, f"bias_ih_l0{sfx}"),
                        getattr(gru, f"bias_hh_l0{sfx}")]
    return tensors + [model.punct.weight, model.punct.bias, model.case.weight,
                      model.case.bias]


# Of the header's shape fields, the first six fix the encoder and the
# seventh is the GRU width.
ENCODER_FIELDS = 6


def shape_fields(model):
    """The header's 13 shape fields, in file order."""
    gru = model.gru
    return (model.wemb.num_embeddings, model.pemb.num_embeddings - 1,
            model.wemb.embedding_dim, len(model.convs),
            model.convs[0].out_channels if len(model.convs) else 0, CONV_KERNEL,
            gru.hidden_size if gru is not None else 0,
            len(corpus.PUNCT_LABELS), 4, MAX_WORD_BYTES, MAX_PIECES, WINDOW_STEP,
            WINDOW_CONTEXT)


def write_model(path, model, lang):
    header = MODEL_MAGIC + struct.pack(MODEL_HEADER, MODEL_VERSION,
                                       lang.encode(), *shape_fields(model))
    body = b"".join(t.detach().numpy().astype("<f2").tobytes()
                    for t in model_tensors(model))
    payload = header + body
    with open(path, "wb") as f:
        f.write(payload)
        f.write(struct.pack("<I", fnv1a(payload)))


def load_weights(model, folder, vocab_words, lang):
    """Starts the network from a model written earlier with the same
    vocabulary and encoder shape. With the same GRU width every tensor is
    taken, so training goes on where that run stopped; otherwise only the
    embeddings and convolutions are, so a recurrent layer can be trained on
    top of an encoder that has already seen the whole text many times, and
    the GRU and heads start afresh."""
    with open(os.path.join(folder, "vocab.txt"), encoding="utf-8") as f:
        if [w.rstrip("\n") for w in f][1:] != shipped_vocab(vocab_words, lang):
            sys.exit(f"{folder}: vocabulary differs from this run's")
    with open(os.path.join(folder, "model.bin"), "rb") as f:
        blob = f.read()
    if blob[:len(MODEL_MAGIC)] != MODEL_MAGIC:
        sys.exit(f"{folder}/model.bin is not a punctuation model")
    have = struct.unpack_from(MODEL_HEADER, blob, len(MODEL_MAGIC))[2:]
    want = shape_fields(model)
    if have[:ENCODER_FIELDS] != want[:ENCODER_FIELDS]:
        sys.exit(f"{folder}/model.bin: encoder shape differs from this run's")
    whole = have[ENCODER_FIELDS] == want[ENCODER_FIELDS]
    values = np.frombuffer(blob, "<f2",
                           offset=len(MODEL_MAGIC) + struct.calcsize(MODEL_HEADER))
    pos = 0
    with torch.no_grad():
        for t in model_tensors(model) if whole else encoder_tensors(model):
            n = t.numel()
            t.copy_(torch.from_numpy(values[pos:pos + n].astype(np.float32))
                    .reshape(t.shape))
            pos += n
    print(f"started from {folder}: "
          f"{'all weights' if whole else 'embeddings and convolutions'}",
          flush=True)


def shipped_vocab(vocab_words, lang):
    """The vocabulary as vocab.txt holds it: the words listed by hash in
    <lang>/withheld.sha256 become placeholders holding a space, which no
    token can match; ids, and with them the network, stay as trained."""
    with open(os.path.join(HERE, lang, "withheld.sha256"), encoding="utf-8") as f:
        withheld = {line.strip() for line in f if line.strip() and not line.startswith("#")}
    return [f"<withheld {i}>" if hashlib.sha256(w.encode()).hexdigest() in withheld else w
            for i, w in enumerate(vocab_words)]


def write_files(out, model, lex, vocab_words, bpe, case_entries, lang):
    os.makedirs(out, exist_ok=True)
    write_model(os.path.join(out, "model.bin"), model, lang)
    with open(os.path.join(out, "vocab.txt"), "w", encoding="utf-8") as f:
        f.write("#kvasr-punct-vocab 1\n")
        f.writelines(w + "\n" for w in shipped_vocab(vocab_words, lang))
    with open(os.path.join(out, "punc.txt"), "w", encoding="utf-8") as f:
        f.write("#kvasr-punct-labels 1\n")
        f.writelines(f"{n}\t{m}\t{k}\n" for n, m, k in corpus.PUNCT_LABELS)
    with open(os.path.join(out, "case.txt"), "w", encoding="utf-8") as f:
        f.write("#kvasr-punct-case 1\n")
        f.writelines(f"{w}\t{form}\t{kind}\n" for w, form, kind in case_entries)
    bpe.write(os.path.join(out, "bpe.txt"))
    for name in ("num.txt", "xdb.txt"):
        shutil.copyfile(os.path.join(HERE, lang, name),
                        os.path.join(out, name))


CHECK_TEXTS = [
    "hello how are you today i am fine thank you",
    "so the question is what do we do now",
    "zorblaxian quantumflux overdrive hmm",
    "i'm a savant or more precisely a high-functioning autistic savant "
    "it's a rare condition",
]


def write_forward_check(path, model, lex):
    """Logits of the trained network on a few texts, one of them longer than
    a window, for the library's forward pass to be compared against."""
    rng = random.Random(7)
    long_text = " ".join(rng.choice(list(lex.vocab)[1:200])
                         for _ in range(WINDOW_STEP * 3 + 5))
    with open(path, "w", encoding="utf-8") as f:
        f.write("#kvasr-punct-forward-check 1\n")
        for text in CHECK_TEXTS + [long_text]:
            words = text.split()
            punct, case = predict(model, lex, words)
            f.write(f"text\t{text}\n")
            for w, p, c in zip(words, punct, case):
                f.write(w + "\t" + " ".join(f"{x:.6g}" for x in p) + "\t" +
                        " ".join(f"{x:.6g}" for x in c) + "\n")


def main():
    ap = argparse.ArgumentParser(description=__doc__)
    ap.add_argument("--data", required=True, help="the punct data folder")
    ap.add_argument("--out", required=True, help="folder for the model files")
    ap.add_argument("--forward-check", help="file for reference logits")
    ap.add_argument("--lang", default="en")
    ap.add_argument("--words", type=int, default=5_000_000)
    ap.add_argument("--dev-words", type=int, default=10**9)
    ap.add_argument("--epochs", type=int, default=3)
    ap.add_argument("--vocab", type=int, default=20000)
    ap.add_argument("--min-count", type=int, default=3)
    ap.add_argument("--merges", type=int, default=2000)
    ap.add_argument("--dim", type=int, default=64)
    ap.add_argument("--channels", type=int, default=256)
    ap.add_argument("--convs", type=int, default=3)
    ap.add_argument("--hidden", type=int, default=0,
                    help="GRU width per direction, 0 for none")
    ap.add_argument("--dropout", type=float, default=0.2)
    ap.add_argument("--word-dropout", type=float, default=0.1)
    ap.add_argument("--spell-prob", type=float, default=0.6)
    ap.add_argument("--case-weight", type=float, default=0.5)
    ap.add_argument("--batch", type=int, default=64)
    ap.add_argument("--lr", type=float, default=3e-3)
    ap.add_argument("--threads", type=int, default=2)
    ap.add_argument("--max-minutes", type=float, default=float("inf"),
                    help="stop training after this long and keep the best "
                    "model so far")
    ap.add_argument("--seed", type=int, default=1)
    ap.add_argument("--init", help="model folder to start from (same "
                    "vocabulary and encoder shape; the GRU and heads too if "
                    "its GRU has the width asked for)")
    args = ap.parse_args()
    model, lex, vocab_words, bpe, case_entries = train(args)
    write_files(args.out, model, lex, vocab_words, bpe, case_entries,
                args.lang)
    if args.forward_check:
        write_forward_check(args.forward_check, model, lex)
    print(f"wrote {args.out}", flush=True)
    return 0


if __name__ == "__main__":
    sys.exit(main())
