# SPDX-License-Identifier: Apache-2.0
"""transcribe_file and python3 -m kvasr over recordings of any rate and
channel count, and over files that are no recordings."""

import array
import os
import subprocess
import sys

import pytest

import kvasr
from kvasr import audio

from conftest import CLIP, write_wav


@pytest.fixture(params=["soundfile", "wave"])
def reader(request, monkeypatch):
    """Each test once through the soundfile module and once through the
    standard library's wave."""
    if request.param == "wave":
        monkeypatch.setattr(audio, "_soundfile", None)
    elif audio._soundfile is None:
        pytest.skip("the soundfile module (python3-soundfile) is not installed")
    return request.param


def test_a_16khz_mono_file_reads_as_its_samples(reader, clip, clip_samples):
    samples, rate = audio.read(clip)
    assert rate == 16000 and samples == clip_samples


def test_32khz_stereo_is_mixed_and_resampled(reader, tmp_path, clip_samples):
    # Each sample twice (32 kHz), left and right differing in sign of a
    # small offset that the mix cancels.
    doubled = array.array("h", (s for s in clip_samples for _ in range(2)))
    stereo = array.array("h")
    for s in doubled:
        stereo.extend((max(-32768, s - 64), min(32767, s + 64)))
    path = write_wav(tmp_path / "stereo32k.wav", stereo, 32000, channels=2)
    samples, rate = audio.read(path)
    assert rate == 32000
    assert abs(len(samples) - len(clip_samples)) <= 1
    texts = kvasr.transcribe_file(path, vad=False)
    assert "young man" in texts[-1]


def test_a_narrowband_file_warns_once_and_still_runs(reader, tmp_path, clip_samples):
    path = write_wav(tmp_path / "8k.wav", clip_samples[::2], 8000)
    with pytest.warns(UserWarning, match="8000 Hz is below 16000 Hz.*wideband") as warned:
        texts = kvasr.transcribe_file(path, vad=False)
    assert len(warned) == 1
    assert texts and all(isinstance(t, str) for t in texts)


def test_files_that_are_no_recordings_are_refused(reader, tmp_path):
    text = tmp_path / "text.wav"
    text.write_text("not sound\n")
    with pytest.raises(kvasr.KvasrError, match="text.wav"):
        kvasr.transcribe_file(text)
    with pytest.raises(OSError):
        kvasr.transcribe_file(tmp_path / "missing.wav")


def test_an_empty_recording_has_no_texts(reader, tmp_path):
    assert kvasr.transcribe_file(write_wav(tmp_path / "empty.wav", array.array("h"), 16000)) == []


def run_module(*args):
    env = dict(os.environ, PYTHONPATH=os.pathsep.join(p for p in sys.path if p))
    return subprocess.run([sys.executable, "-m", "kvasr", *args], capture_output=True,
                          text=True, env=env)


def test_the_module_prints_one_final_text_per_line(tmp_path, clip):
    bad = tmp_path / "bad.wav"
    bad.write_text("not sound\n")
    done = run_module("--no-vad", clip, str(bad), clip)
    assert done.returncode == 1
    lines = done.stdout.splitlines()
    assert len(lines) == 2 and all("young man" in line for line in lines)
    assert done.stderr.count("\n") == 1 and done.stderr.startswith(f"kvasr: {bad}")


def test_the_module_says_when_the_models_are_missing(clip):
    done = run_module("--grammar", "/nonexistent.gram", clip)
    assert done.returncode == 2
    assert done.stdout == "" and "grammar '/nonexistent.gram' not found" in done.stderr
