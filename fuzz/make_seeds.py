#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Writes the starting corpus of every fuzz target into OUT/<target>/.

Small well-formed inputs (model files like the module's tests write, the
parameter examples of the README, the shipped decoder manifest) so that the
fuzzers start past the format checks; nothing here is committed as binary.
"""
import os
import random
import struct
import sys

ROOT = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))


def ints(*values):
    return struct.pack("<%di" % len(values), *values)


def floats(values):
    return struct.pack("<%df" % len(values), *values)


def network(input_length, output_length, hidden, flag=b"MYDNN1\0\0"):
    dims = [input_length] + hidden + [output_length]
    data = flag + ints(input_length, output_length, len(hidden), *hidden)
    rng = random.Random(input_length * 31 + output_length)
    for i in range(len(dims) - 1):
        data += floats([rng.uniform(-1, 1) for _ in range(dims[i + 1])])
        data += floats([rng.uniform(-1, 1) for _ in range(dims[i] * dims[i + 1])])
    return data


def write(out, target, name, data):
    os.makedirs(os.path.join(out, target), exist_ok=True)
    if isinstance(data, str):
        data = data.encode()
    with open(os.path.join(out, target, name), "wb") as f:
        f.write(data)


def main(out):
    write(out, "fuzz_vad_network", "no_hidden", network(4, 2, []))
    write(out, "fuzz_vad_network", "one_hidden", network(6, 2, [3]))
    write(out, "fuzz_vad_network", "three_classes", network(5, 3, [2, 2]))

    write(out, "fuzz_vad_priors", "equal", ints(3) + floats([1.0, 1.0, 1.0]))
    write(out, "fuzz_vad_priors", "skewed", ints(0) + floats([0.7, 0.2, 0.1]))

    write(out, "fuzz_mean_table", "unit", ints(39) + floats([0.0] * 39 + [1.0] * 39))
    write(out, "fuzz_mean_table", "trained",
          ints(39) + floats([0.5 * (i % 7) - 1.5 for i in range(39)] +
                            [0.2 + 0.1 * (i % 5) for i in range(39)]))

    with open(os.path.join(ROOT, "models/decoder/en-us.manifest"), "rb") as f:
        shipped = f.read()
    # First byte odd: read from a file, so relative entries resolve.
    write(out, "fuzz_decoder_manifest", "shipped_memory", b"\0" + shipped)
    write(out, "fuzz_decoder_manifest", "shipped_file", b"\1" + shipped)
    write(out, "fuzz_decoder_manifest", "relative",
          "\1kvasr-decoder-manifest 1\nacoustic_model = am\ndictionary = dict\n"
          "filler_dictionary = dict\ngrammar = gram\nlog = stderr\n"
          "option.beam = 1e-60\noption.pl_window = 5\n")

    init = ('{"local_moxwing_model_file_path":"m","local_vad_model_dir_path":"models/vad",'
            '"lang":"en-US","vad_enabled":true,"local_punc_settings":{"model_path":"a",'
            '"vocab_path":"b","punc_path":"c","num_path":"d","case_path":"e","xdb_path":"f",'
            '"bpe_path":"g","punc_all":false}}')
    start = '{"asr":{"max_mute_time_before_voice":5000,"max_mute_time_after_voice":1500.7}}'
    write(out, "fuzz_engine_json", "readme", init + "\0" + start)
    write(out, "fuzz_engine_json", "no_vad",
          '{"local_moxwing_model_file_path":"m","local_vad_model_dir_path":"",'
          '"lang":"th-TH","local_punc_settings":{}}\0{"asr":{}}')
    write(out, "fuzz_engine_json", "global", '{"moxwing_max_duration":60000}')

    rng = random.Random(8)
    for i in range(6):
        write(out, "fuzz_c_api", "random%d" % i,
              bytes(rng.randrange(256) for _ in range(rng.choice([64, 400, 2000]))))


if __name__ == "__main__":
    main(sys.argv[1])
