# SPDX-License-Identifier: Apache-2.0
"""Shared recordings and paths. The test run names the library under test
with KVASR_LIBRARY and the command-line tool with KVASR_TOOL."""

import array
import os
import wave

import pytest

LIBRIVOX = "/usr/share/pocketsphinx/test/data/librivox"
CLIP = os.path.join(LIBRIVOX, "sense_and_sensibility_01_austen_64kb-0880.wav")
GO_FORWARD = "/usr/share/pocketsphinx/test/data/goforward.raw"


@pytest.fixture(scope="session")
def clip():
    if not os.path.isfile(CLIP):
        pytest.fail("recordings missing: install the Debian package pocketsphinx-testdata")
    return CLIP


@pytest.fixture(scope="session")
def clip_samples(clip):
    with wave.open(clip) as w:
        assert (w.getframerate(), w.getnchannels(), w.getsampwidth()) == (16000, 1, 2)
        return array.array("h", w.readframes(w.getnframes()))


@pytest.fixture(scope="session")
def tool():
    path = os.environ.get("KVASR_TOOL")
    if not path:
        pytest.fail("KVASR_TOOL must name the kvasr tool built with the library under test")
    return path


def write_wav(path, samples, rate, channels=1):
    with wave.open(str(path), "wb") as w:
        w.setnchannels(channels)
        w.setsampwidth(2)
        w.setframerate(rate)
        w.writeframes(samples.tobytes())
    return path
