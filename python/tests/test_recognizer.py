# SPDX-License-Identifier: Apache-2.0
"""The Recognizer against the C library driven by the command-line tool, and
against bad input, careless callers and long use."""

import array
import gc
import json
import os
import subprocess

import pytest

import kvasr
from kvasr import recognizer as recognizer_module

from conftest import GO_FORWARD

try:
    import numpy as np
except ImportError:
    np = None


def tool_messages(tool, clip, *options):
    out = subprocess.run([tool, "transcribe", "--json", "--no-progress", *options, clip],
                         check=True, capture_output=True, text=True).stdout
    messages = [json.loads(line) for line in out.splitlines()]
    for m in messages:
        assert m.pop("input") == clip
    return messages


def final_texts(results):
    return [r.text for r in results if r.final]


@pytest.mark.parametrize("options, chunk", [((), 1600), (("--no-vad",), 1600),
                                            (("--chunk-ms", "37"), 592)])
def test_every_message_equals_the_c_apis(tool, clip, clip_samples, options, chunk):
    with kvasr.Recognizer(vad="--no-vad" not in options) as r:
        results = r.transcribe(clip_samples, chunk_samples=chunk)
    assert [json.loads(m.json) for m in results] == tool_messages(tool, clip, *options)
    assert "young man" in final_texts(results)[-1]


def test_odd_chunk_sizes_give_the_text_of_even_ones(clip_samples):
    with kvasr.Recognizer(vad=False) as r:
        expected = final_texts(r.transcribe(clip_samples))
    sizes = [1, 7, 333, 4099, 160, 1601, 2]
    results = []
    with kvasr.Recognizer(vad=False) as r:
        begin = 0
        for i in range(len(clip_samples)):
            if begin >= len(clip_samples):
                break
            end = begin + sizes[i % len(sizes)]
            results += r.accept(clip_samples[begin:end], last=end >= len(clip_samples))
            begin = end
        results += r.finish()
    assert final_texts(results) == expected
    assert all(not r.final for r in results[:-1]) and results[-1].final


def test_bytes_arrays_and_numpy_give_the_same_results(clip_samples):
    inputs = [clip_samples, clip_samples.tobytes(), memoryview(clip_samples.tobytes())]
    if np is not None:
        inputs += [np.frombuffer(clip_samples.tobytes(), dtype=np.int16),
                   # every other sample of an array twice as long: not contiguous
                   np.repeat(np.frombuffer(clip_samples.tobytes(), dtype=np.int16), 2)[::2]]
    outcomes = []
    for samples in inputs:
        with kvasr.Recognizer(vad=False) as r:
            outcomes.append([m.json for m in r.transcribe(samples)])
    assert all(o == outcomes[0] for o in outcomes)


def bad_samples():
    cases = [("text", TypeError, "not text"), ([1, 2, 3], TypeError, "not list"),
             (array.array("f", [0.0] * 10), TypeError, "format 'f'"),
             (array.array("i", [0] * 10), TypeError, "format 'i'"),
             (b"", ValueError, "no samples"), (array.array("h"), ValueError, "no samples"),
             (b"\x00\x01\x02", ValueError, "3 bytes")]
    if np is not None:
        cases += [(np.zeros(10, dtype=np.float32), TypeError, "format 'f'"),
                  (np.zeros(10, dtype=np.int32), TypeError, "format 'i'"),
                  (np.zeros(10, dtype=">i2"), TypeError, "format '>h'"),
                  (np.zeros((10, 2), dtype=np.int16), ValueError, "one-dimensional"),
                  (np.zeros(0, dtype=np.int16), ValueError, "no samples")]
    return cases


def test_bad_samples_are_refused_and_the_engine_goes_on(clip_samples):
    with kvasr.Recognizer(vad=False) as r:
        for samples, error, fragment in bad_samples():
            with pytest.raises(error, match=fragment):
                r.accept(samples)
        assert "young man" in final_texts(r.transcribe(clip_samples))[-1]


def test_missing_or_broken_models_say_which(tmp_path):
    with pytest.raises(kvasr.KvasrError, match="decoder model '/nonexistent.manifest' not found"):
        kvasr.Recognizer(decoder_model="/nonexistent.manifest")
    with pytest.raises(kvasr.KvasrError, match="VAD model folder '/nonexistent' not found"):
        kvasr.Recognizer(vad_models="/nonexistent")
    with pytest.raises(kvasr.KvasrError, match="punctuation settings '/nonexistent.json'"):
        kvasr.Recognizer(punct_settings="/nonexistent.json")
    broken = tmp_path / "broken.manifest"
    broken.write_text("kvasr-decoder-manifest 1\nacoustic_model = /nonexistent\n")
    with pytest.raises(kvasr.KvasrError,
                       match=r"could not be loaded(.|\n)*kvasr_decoder: .*missing key \"dictionary\""):
        kvasr.Recognizer(decoder_model=broken)
    with pytest.raises(ValueError, match="max_silence_after_ms"):
        kvasr.Recognizer(max_silence_after_ms=-1)


def test_a_failing_callback_raises_here_not_in_the_library(monkeypatch, clip_samples):
    with kvasr.Recognizer(vad=False) as r:
        def broken(_text):
            raise ZeroDivisionError("planted")
        monkeypatch.setattr(recognizer_module.Result, "parse", staticmethod(broken))
        with pytest.raises(kvasr.KvasrError, match="unreadable result message.*planted"):
            r.transcribe(clip_samples)
        monkeypatch.undo()
        assert "young man" in final_texts(r.transcribe(clip_samples))[-1]


def test_a_silence_limit_ends_listening_and_the_next_accept_starts_again(clip_samples):
    silence = array.array("h", bytes(2 * 16000))
    with kvasr.Recognizer(max_silence_before_ms=500) as r:
        results = r.transcribe(silence)
        assert [(m.status, m.message, m.timed_out) for m in results] == [
            (kvasr.recognizer.TIMEOUT_STATUS, "vad mute timeout", True)]
        assert "young man" in final_texts(r.transcribe(clip_samples))[-1]


@pytest.mark.parametrize("log", ["off", "stderr", "stdout"])
def test_the_library_log_goes_where_asked_and_ours_stays(capfd, clip_samples, log):
    print("before")
    with kvasr.Recognizer(vad=False, log=log) as r:
        texts = final_texts(r.transcribe(clip_samples))
        print("after", texts[-1])
    out, err = capfd.readouterr()
    ours = f"before\nafter {texts[-1]}\n"
    library_lines = "init params:"
    if log == "stdout":
        assert out.startswith("before\ninit params:") and out.endswith(ours[len("before\n"):])
    else:
        assert out == ours
    assert (library_lines in err) == (log == "stderr")


def test_a_closed_recognizer_refuses_calls(clip_samples):
    r = kvasr.Recognizer(vad=False)
    with r:
        pass
    r.close()
    with pytest.raises(kvasr.KvasrError, match="closed"):
        r.accept(clip_samples)
    with pytest.raises(kvasr.KvasrError, match="closed"):
        r.finish()


def rss_kib():
    with open("/proc/self/status") as status:
        for line in status:
            if line.startswith("VmRSS:"):
                return int(line.split()[1])
    raise AssertionError("no VmRSS in /proc/self/status")


def test_many_recognizers_come_and_go_without_growing_memory(clip_samples):
    def round_trip(n):
        for i in range(n):
            # Every other one is only dropped, for the garbage collector.
            r = kvasr.Recognizer()
            r.transcribe(clip_samples[:16000])
            if i % 2:
                r.close()
            del r
        gc.collect()

    round_trip(4)
    before = rss_kib()
    round_trip(24)
    growth = rss_kib() - before
    print(f"RSS growth over 24 recognisers: {growth} KiB")
    # One engine with its models holds tens of MiB; a leak of any of them shows.
    assert growth < 8 * 1024


def grammar_path():
    return os.path.join(kvasr._library.models_dir(), "decoder", "commands.gram")


def test_a_grammar_allows_only_its_sentences(tmp_path):
    with open(GO_FORWARD, "rb") as f:
        samples = f.read()
    with kvasr.Recognizer(vad=False, grammar=grammar_path()) as r:
        assert final_texts(r.transcribe(samples)) == ["go forward ten meters"]
    unknown = tmp_path / "unknown.gram"
    unknown.write_text("#JSGF V1.0;\ngrammar g;\npublic <c> = go forward\n  | go zorblax;\n")
    with pytest.raises(kvasr.KvasrError,
                       match=f'grammar "{unknown}" line 4: word "zorblax" is not in the dictionary'):
        kvasr.Recognizer(vad=False, grammar=unknown)
