# SPDX-License-Identifier: Apache-2.0
"""Extra training and dev sound from Debian packages, as a second corpus.

    packages.py fetch CACHE              apt-get download + dpkg -x, no root needed
    packages.py decode CACHE             16 kHz mono WAV excerpts and CACHE/corpus/MANIFEST.tsv
    packages.py audit CACHE SILERO.onnx  drops non-speech files Silero hears speech in
    packages.py summary CACHE            what each package gave, with its licence

The corpus written to CACHE/corpus has the shared corpus's manifest columns
(path, kind, source, speaker, ..., licence, notes), so mix.py reads both
alike. `source` is the package; `corpus.py` splits this material by whole
package, so dev measures sound from packages the network never heard.

Game and application packages also hold voices (unit acknowledgements,
announcers, dialogue, sung parts). Such files are speech and never enter as
non-speech: they are left out by folder and file name first (SPEECH_NAME,
localised folders), then by what Silero VAD hears (`audit`). Every file left
out is listed with its reason in CACHE/corpus/excluded.tsv.
"""
import argparse
import csv
import hashlib
import os
import re
import subprocess
import sys
from concurrent.futures import ThreadPoolExecutor

import numpy as np
import soundfile

RATE_HZ = 16000
AUDIO_EXTENSIONS = (".ogg", ".wav", ".flac", ".mp3", ".opus", ".aiff")
MUSIC_EXCERPT_S = 60.0     # many tracks beat many minutes of few tracks
MUSIC_SKIP_S = 10.0        # past the fade-in
EFFECT_MAX_S = 30.0
MIN_DURATION_S = 0.25
SILENT_RMS_DBFS = -60.0
FILES_PER_FOLDER = 40      # caps folders of near-identical one-shots
SPEECH_FILES_PER_PACKAGE = 900
# Silero audit: a non-speech file with a run of windows at or above 0.5 this
# long is dropped (its probabilities come in 32 ms windows).
AUDIT_PROB = 0.5
AUDIT_RUN_MS = 300

# Package: (role, split). Roles: "nonspeech" (music and effects) or "speech".
# Dev holds out whole packages: about a quarter of the music-bearing ones and
# of the effects-only ones, and one speech package; val holds out a few more
# whole packages for early stopping and the operating point.
PACKAGES = {
    "wesnoth-1.16-music": ("nonspeech", "train"),
    "wesnoth-1.16-data": ("nonspeech", "train"),
    "warzone2100-music": ("nonspeech", "dev"),
    "widelands-data": ("nonspeech", "train"),
    "supertux-data": ("nonspeech", "train"),
    "supertuxkart-data": ("nonspeech", "dev"),
    "lincity-ng-data": ("nonspeech", "val"),
    "megaglest-data": ("nonspeech", "train"),
    "naev-data": ("nonspeech", "dev"),
    "endless-sky-data": ("nonspeech", "dev"),
    "hyperrogue-music": ("nonspeech", "dev"),
    "flare-game": ("nonspeech", "dev"),
    "boswars-data": ("nonspeech", "train"),
    "scorched3d-data": ("nonspeech", "train"),
    "freedroidrpg-data": ("nonspeech", "train"),
    "planetblupi-common": ("nonspeech", "train"),
    "colobot-common-sounds": ("nonspeech", "train"),
    "drascula-music": ("nonspeech", "val"),
    "fillets-ng-data": ("nonspeech", "train"),
    "minetest-data": ("nonspeech", "val"),
    "btanks-data": ("nonspeech", "train"),
    "triplea": ("nonspeech", "train"),
    "berusky2-data": ("nonspeech", "train"),
    "bucklespring-data": ("nonspeech", "train"),
    "oxygen-sounds": ("nonspeech", "dev"),
    "hydrogen-drumkits": ("nonspeech", "train"),
    "hydrogen-drumkits-effects": ("nonspeech", "val"),
    "lmms-common": ("nonspeech", "train"),
    "sonic-pi-samples": ("nonspeech", "dev"),
    "fillets-ng-data-cs": ("speech", "train"),
    "fillets-ng-data-nl": ("speech", "dev"),
    "kajongg": ("speech", "val"),
    "gcin-voice": ("speech", "train"),
    "qabcs-data": ("speech", "train"),
}

# Folder or file names that mark recorded voices in non-speech packages.
SPEECH_NAME = re.compile(
    r"(voice|speech|(^|[/_.-])vo([/_.-]|$)|announc|taunt|sing(ing|er)|(^|[/_.-])sing([/_.-]|$)|vocal|choir|vox|comment|talk|"
    r"(^|[/_.-])ack\d*([/_.-]|$)|_ack|select|ready|underattack|hello|greet|laugh|scream|"
    r"shout|yell|(^|[/_.-])(yes|no|ok)\d*([/_.-]|$)|cutscene|tutorial|campaign)")
# Localised folders hold spoken lines (fillets-ng-data's English dialogue,
# planetblupi's voice in six languages).
LANGUAGE_FOLDER = re.compile(r"/(en|en_us|de|fr|it|he|cs|nl|pl|ru|es|sv|sk)/")
MUSIC_FOLDER = re.compile(r"/(music|tunes|albums)/")


def run(cmd, **kw):
    return subprocess.run(cmd, check=True, **kw)


def fetch(cache):
    debs = os.path.join(cache, "debs")
    os.makedirs(debs, exist_ok=True)
    have = {f.split("_")[0] for f in os.listdir(debs) if f.endswith(".deb")}
    missing = sorted(set(PACKAGES) - have)
    if missing:
        run(["apt-get", "download", *missing], cwd=debs)
    for deb in sorted(os.listdir(debs)):
        pkg = deb.split("_")[0]
        root = os.path.join(cache, "root", pkg)
        if pkg in PACKAGES and not os.path.isdir(root):
            os.makedirs(root)
            run(["dpkg", "-x", os.path.join(debs, deb), root])


def package_version(cache, pkg):
    for deb in os.listdir(os.path.join(cache, "debs")):
        if deb.split("_")[0] == pkg:
            return deb.split("_")[1].replace("%3a", ":")
    return ""


def classify(pkg, rel):
    """(kind, speaker) for one audio file of a package, or (None, reason)."""
    path = "/" + rel.lower()
    role = PACKAGES[pkg][0]
    if role == "speech":
        if pkg == "qabcs-data" and "/noises/" in path:
            return "noise", ""
        if pkg == "kajongg" and "/voices/" in path:
            return "speech", pkg + ":" + rel.split("/voices/")[1].rsplit("/", 1)[0]
        if pkg.startswith("fillets-ng-data-") and "/sound/" in path:
            return "speech", pkg
        if pkg == "gcin-voice":
            return "speech", pkg
        if pkg == "qabcs-data" and "/sounds/" in path:
            return "speech", pkg + ":" + rel.split("/abcs/")[1].split("/")[0]
        return None, "not a voice folder of a speech package"
    if SPEECH_NAME.search(path):
        return None, "name marks a voice"
    if pkg == "planetblupi-common" and "/sound/en/" in path:
        # The full set of its sounds; the other languages' folders hold only
        # their own voice lines. Voices among these go in the audit.
        pass
    elif LANGUAGE_FOLDER.search(path):
        return None, "localised folder (spoken lines or their copies)"
    if pkg == "megaglest-data" and "/units/" in path:
        return None, "unit folder (voice acknowledgements beside action sounds)"
    if MUSIC_FOLDER.search(path) or (pkg.endswith("-music") and "/sounds/" not in path):
        return "music", ""
    return "noise", ""


def stable_order(names, salt):
    return sorted(names, key=lambda n: hashlib.sha1((salt + n).encode()).hexdigest())


def candidates(cache):
    """(package, relative path, kind, speaker) of every file to decode, and the
    files left out by name with their reasons."""
    keep, excluded = [], []
    for pkg in sorted(PACKAGES):
        root = os.path.join(cache, "root", pkg)
        by_folder, speech = {}, []
        for dirpath, _, files in os.walk(root):
            for f in files:
                if not f.lower().endswith(AUDIO_EXTENSIONS):
                    continue
                rel = os.path.relpath(os.path.join(dirpath, f), root)
                kind, extra = classify(pkg, rel)
                if kind is None:
                    excluded.append((pkg, rel, extra))
                elif kind == "speech":
                    speech.append((pkg, rel, kind, extra))
                else:
                    by_folder.setdefault(os.path.dirname(rel), []).append((pkg, rel, kind, extra))
        for folder in sorted(by_folder):
            rows = sorted(by_folder[folder])
            if rows[0][2] == "noise":
                chosen = set(stable_order([r[1] for r in rows], folder)[:FILES_PER_FOLDER])
                rows = [r for r in rows if r[1] in chosen]
            keep += rows
        chosen = set(stable_order([r[1] for r in speech], pkg)[:SPEECH_FILES_PER_PACKAGE])
        keep += [r for r in sorted(speech) if r[1] in chosen]
    return keep, excluded


def ffmpeg(src, out, skip_s, max_s):
    """Decodes at most max_s seconds of src, from skip_s on, to 16 kHz mono
    16-bit WAV; whether a file came out."""
    cmd = ["ffmpeg", "-nostdin", "-v", "error", "-y"]
    if skip_s:
        cmd += ["-ss", str(skip_s)]
    cmd += ["-i", src, "-ac", "1", "-ar", str(RATE_HZ), "-sample_fmt", "s16", "-t", str(max_s), out]
    return subprocess.run(cmd, capture_output=True).returncode == 0 and os.path.exists(out)


def decode_one(cache, pkg, rel, kind):
    src = os.path.join(cache, "root", pkg, rel)
    # Names are made plain ASCII; the hash keeps apart those that were not.
    plain = re.sub(r"[^A-Za-z0-9._-]", "_", os.path.basename(rel))
    out_rel = "%s/%s-%s.wav" % (pkg, hashlib.sha1(rel.encode()).hexdigest()[:8], plain)
    out = os.path.join(cache, "corpus", out_rel)
    os.makedirs(os.path.dirname(out), exist_ok=True)
    max_s = MUSIC_EXCERPT_S if kind == "music" else EFFECT_MAX_S
    if not ffmpeg(src, out, MUSIC_SKIP_S if kind == "music" else 0, max_s):
        return None, "not decodable"
    x, _ = soundfile.read(out, dtype="float64")
    if kind == "music" and len(x) < MIN_DURATION_S * RATE_HZ:
        # A short track: take it from the start.
        ffmpeg(src, out, 0, max_s)
        x, _ = soundfile.read(out, dtype="float64")
    if x.ndim != 1 or len(x) < MIN_DURATION_S * RATE_HZ:
        os.remove(out)
        return None, "shorter than %.2f s" % MIN_DURATION_S
    rms = np.sqrt(np.mean(x ** 2))
    if rms <= 0 or 20 * np.log10(rms) < SILENT_RMS_DBFS:
        os.remove(out)
        return None, "silent"
    return out_rel, len(x) / RATE_HZ


# Packages whose copyright file is not machine-readable: the licence its
# text states.
LICENCE_STATED = {
    "fillets-ng-data": "GPL-2+", "fillets-ng-data-cs": "GPL-2+", "fillets-ng-data-nl": "GPL-2+",
    "wesnoth-1.16-data": "GPL-2+", "wesnoth-1.16-music": "GPL-2+",
}


def licence_of(cache, pkg):
    if pkg in LICENCE_STATED:
        return LICENCE_STATED[pkg]
    path = os.path.join(cache, "root", pkg, "usr/share/doc", pkg, "copyright")
    if not os.path.exists(path):
        return "see the package's copyright file"
    with open(path, encoding="utf-8", errors="replace") as f:
        text = f.read()
    found = []
    for m in re.finditer(r"^License:\s*(\S.*)$", text, re.M):
        lic = m.group(1).strip()
        if lic not in found:
            found.append(lic)
    return "; ".join(found[:4]) or "see the package's copyright file"


MANIFEST_COLUMNS = ("path", "kind", "source", "speaker", "language", "duration_s",
                    "orig_sample_rate", "licence", "transcript", "notes")


def decode(cache):
    keep, excluded = candidates(cache)
    corpus_dir = os.path.join(cache, "corpus")
    os.makedirs(corpus_dir, exist_ok=True)
    licences = {p: licence_of(cache, p) for p in PACKAGES}
    with ThreadPoolExecutor(max_workers=os.cpu_count() or 2) as pool:
        results = list(pool.map(lambda r: decode_one(cache, r[0], r[1], r[2]), keep))
    rows = []
    for (pkg, rel, kind, speaker), (out_rel, info) in zip(keep, results):
        if out_rel is None:
            excluded.append((pkg, rel, info))
            continue
        rows.append({"path": out_rel, "kind": kind, "source": pkg, "speaker": speaker,
                     "language": "und", "duration_s": "%.3f" % info,
                     "orig_sample_rate": "", "licence": licences[pkg], "transcript": "",
                     "notes": "%s %s: %s" % (pkg, package_version(cache, pkg), rel)})
    write_manifest(corpus_dir, rows)
    write_excluded(corpus_dir, excluded, "w")
    print("%d files decoded, %d left out" % (len(rows), len(excluded)))


def read_manifest(corpus_dir):
    with open(os.path.join(corpus_dir, "MANIFEST.tsv"), encoding="utf-8") as f:
        return list(csv.DictReader(f, delimiter="\t"))


def write_manifest(corpus_dir, rows):
    with open(os.path.join(corpus_dir, "MANIFEST.tsv"), "w", encoding="utf-8") as f:
        w = csv.DictWriter(f, MANIFEST_COLUMNS, delimiter="\t", lineterminator="\n")
        w.writeheader()
        w.writerows(rows)


def write_excluded(corpus_dir, excluded, mode):
    with open(os.path.join(corpus_dir, "excluded.tsv"), mode, encoding="utf-8") as f:
        if mode == "w":
            f.write("package\tfile\treason\n")
        for pkg, rel, reason in excluded:
            f.write("%s\t%s\t%s\n" % (pkg, rel, reason))


def longest_run(flags):
    best = run_len = 0
    for v in flags:
        run_len = run_len + 1 if v else 0
        best = max(best, run_len)
    return best


def audit(cache, silero_model):
    """Drops the non-speech files in which Silero VAD hears a voice (run by
    bench/silero_probs.js; NODE_PATH must name its node_modules)."""
    corpus_dir = os.path.join(cache, "corpus")
    rows = read_manifest(corpus_dir)
    links, probs_dir = os.path.join(cache, "audit", "links"), os.path.join(cache, "audit", "probs")
    os.makedirs(links, exist_ok=True)
    os.makedirs(probs_dir, exist_ok=True)
    # The probability files are named by base name alone: one flat folder.
    names = {}
    for row in rows:
        if row["kind"] != "speech":
            name = row["path"].replace("/", "__")
            names[row["path"]] = name[:-len(".wav")]
            link = os.path.join(links, name)
            if not os.path.lexists(link):
                os.symlink(os.path.join(corpus_dir, row["path"]), link)
    todo = [os.path.join(links, n + ".wav") for n in names.values()
            if not os.path.exists(os.path.join(probs_dir, n + ".prob"))]
    script = os.path.join(os.path.dirname(os.path.abspath(__file__)), "../../bench/silero_probs.js")
    # Batches of 50: one run over 500 files ended in a segmentation fault
    # within a second here, while the same files in 50s went through.
    for i in range(0, len(todo), 50):
        run(["node", script, silero_model, probs_dir, *todo[i:i + 50]])
    kept, dropped = [], []
    for row in rows:
        if row["kind"] == "speech":
            kept.append(row)
            continue
        p = np.fromfile(os.path.join(probs_dir, names[row["path"]] + ".prob"), dtype="<f4")
        run_ms = longest_run(p >= AUDIT_PROB) * 10
        if run_ms > AUDIT_RUN_MS:
            dropped.append((row["source"], row["notes"].split(": ", 1)[1],
                            "Silero hears speech for %d ms" % run_ms))
        else:
            kept.append(row)
    write_manifest(corpus_dir, kept)
    write_excluded(corpus_dir, dropped, "a")
    print("audit: %d non-speech files dropped, %d files kept" % (len(dropped), len(kept)))


def summary(cache):
    """A Markdown table of what each package gave: split, files and minutes
    by kind, version and licence."""
    corpus_dir = os.path.join(cache, "corpus")
    rows = read_manifest(corpus_dir)
    print("| package | version | part | music | effects | speech | licence |")
    print("|---|---|---|---:|---:|---:|---|")
    for pkg in sorted(PACKAGES, key=lambda p: (PACKAGES[p][1], p)):
        cells = []
        for kind in ("music", "noise", "speech"):
            mine = [float(r["duration_s"]) for r in rows if r["source"] == pkg and r["kind"] == kind]
            cells.append("%d / %.1f min" % (len(mine), sum(mine) / 60) if mine else "")
        print("| %s | %s | %s | %s | %s | %s | %s |" % (
            pkg, package_version(cache, pkg), PACKAGES[pkg][1], *cells, licence_of(cache, pkg)))


def main():
    ap = argparse.ArgumentParser(description=__doc__,
                                 formatter_class=argparse.RawDescriptionHelpFormatter)
    ap.add_argument("step", choices=("fetch", "decode", "audit", "summary"))
    ap.add_argument("cache")
    ap.add_argument("silero_model", nargs="?", help="for audit: Silero VAD's ONNX file")
    args = ap.parse_args()
    if args.step == "fetch":
        fetch(args.cache)
    elif args.step == "decode":
        decode(args.cache)
    elif args.step == "summary":
        summary(args.cache)
    else:
        if not args.silero_model:
            sys.exit("audit needs Silero VAD's ONNX file")
        audit(args.cache, args.silero_model)


if __name__ == "__main__":
    main()
