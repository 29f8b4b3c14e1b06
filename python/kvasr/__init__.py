# SPDX-License-Identifier: Apache-2.0
"""Offline speech recognition over libkvasr_offline.

    import kvasr
    print(kvasr.transcribe_file("recording.wav"))

    with kvasr.Recognizer(punct=True) as r:
        for chunk in chunks_of_16khz_mono_int16:
            for result in r.accept(chunk):
                print(result.final, result.text)
        print(r.finish())
"""

import warnings

from . import audio
from ._library import version
from .errors import KvasrError
from .recognizer import RATE_HZ, Recognizer, Result

__all__ = ["KvasrError", "RATE_HZ", "Recognizer", "Result", "transcribe_file", "version"]


def transcribe_file(path, recognizer=None, **recognizer_options):
    """The final texts of a recording (WAV; any format libsndfile reads when
    the soundfile module is installed), at any rate and channel count.
    Uses `recognizer` when given (one listening period of it), else a new
    Recognizer made with the keyword arguments."""
    samples, rate = audio.read(path)
    if rate < RATE_HZ:
        warnings.warn(f"{path}: {rate} Hz is below {RATE_HZ} Hz; the model is wideband and "
                      "accuracy will suffer", stacklevel=2)
    if not samples:
        return []
    if recognizer is None:
        with Recognizer(**recognizer_options) as own:
            return _final_texts(own, samples)
    return _final_texts(recognizer, samples)


def _final_texts(recognizer, samples):
    return [r.text for r in recognizer.transcribe(samples) if r.final and r.text]
