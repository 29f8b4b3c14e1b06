# SPDX-License-Identifier: Apache-2.0
"""python3 -m kvasr FILE...: one final text per line."""

import argparse
import sys

from . import KvasrError, Recognizer, transcribe_file


def main(argv=None):
    parser = argparse.ArgumentParser(prog="python3 -m kvasr",
                                     description="Prints the final texts of each recording, "
                                     "one per line.")
    parser.add_argument("files", nargs="+", metavar="FILE")
    parser.add_argument("--no-vad", action="store_true", help="feed all sound to the decoder")
    parser.add_argument("--punct", action="store_true", help="punctuate the final texts")
    parser.add_argument("--grammar", metavar="FILE.gram",
                        help="JSGF grammar in place of the language model")
    args = parser.parse_args(argv)
    failures = 0
    try:
        recognizer = Recognizer(vad=not args.no_vad, punct=args.punct, grammar=args.grammar)
    except (KvasrError, OSError) as e:
        print(f"kvasr: {e}", file=sys.stderr)
        return 2
    with recognizer:
        for path in args.files:
            try:
                texts = transcribe_file(path, recognizer)
            except (KvasrError, OSError) as e:
                print(f"kvasr: {e}", file=sys.stderr)
                failures += 1
                continue
            for text in texts:
                print(text, flush=True)
    return 1 if failures else 0


if __name__ == "__main__":
    sys.exit(main())
