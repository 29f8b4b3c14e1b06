# SPDX-License-Identifier: Apache-2.0
"""Sound files as the engine wants them: 16 kHz, mono, 16-bit."""

import array
import ctypes
import ctypes.util
import wave

from .errors import KvasrError

RATE_HZ = 16000
# libsamplerate's SRC_SINC_MEDIUM_QUALITY, the converter the command-line
# tool uses.
_SRC_SINC_MEDIUM_QUALITY = 1

try:
    import soundfile as _soundfile
except ImportError:  # optional: without it only WAV is read
    _soundfile = None


class _SrcData(ctypes.Structure):
    _fields_ = [("data_in", ctypes.POINTER(ctypes.c_float)),
                ("data_out", ctypes.POINTER(ctypes.c_float)),
                ("input_frames", ctypes.c_long), ("output_frames", ctypes.c_long),
                ("input_frames_used", ctypes.c_long), ("output_frames_gen", ctypes.c_long),
                ("end_of_input", ctypes.c_int), ("src_ratio", ctypes.c_double)]


_samplerate = None


def _libsamplerate():
    global _samplerate
    if _samplerate is None:
        name = ctypes.util.find_library("samplerate")
        if name is None:
            raise KvasrError("resampling needs libsamplerate (Debian package libsamplerate0)")
        lib = ctypes.CDLL(name)
        lib.src_simple.argtypes = [ctypes.POINTER(_SrcData), ctypes.c_int, ctypes.c_int]
        lib.src_strerror.restype = ctypes.c_char_p
        for convert, source, target in (("src_short_to_float_array", ctypes.c_short,
                                         ctypes.c_float),
                                        ("src_float_to_short_array", ctypes.c_float,
                                         ctypes.c_short)):
            getattr(lib, convert).argtypes = [ctypes.POINTER(source), ctypes.POINTER(target),
                                              ctypes.c_int]
        _samplerate = lib
    return _samplerate


def resample(samples, rate):
    """Mono int16 samples (an array('h')) at `rate` Hz brought to 16 kHz."""
    if rate == RATE_HZ or not samples:
        return samples
    lib = _libsamplerate()
    count = len(samples)
    ratio = RATE_HZ / rate
    source = (ctypes.c_float * count)()
    lib.src_short_to_float_array((ctypes.c_short * count).from_buffer(samples), source, count)
    capacity = int(count * ratio) + 1
    target = (ctypes.c_float * capacity)()
    data = _SrcData(source, target, count, capacity, 0, 0, 1, ratio)
    error = lib.src_simple(ctypes.byref(data), _SRC_SINC_MEDIUM_QUALITY, 1)
    if error:
        raise KvasrError(f"resampling from {rate} Hz failed: {lib.src_strerror(error).decode()}")
    out = array.array("h", bytes(2 * data.output_frames_gen))
    lib.src_float_to_short_array(target, (ctypes.c_short * len(out)).from_buffer(out), len(out))
    return out


def mix_down(samples, channels):
    """Interleaved int16 frames averaged into one channel."""
    if channels == 1:
        return samples
    return array.array("h", (sum(frame) // channels
                             for frame in zip(*(samples[c::channels] for c in range(channels)))))


def _read_wav(path, file):
    try:
        with wave.open(file, "rb") as w:
            if w.getsampwidth() != 2:
                raise KvasrError(f"{path}: {8 * w.getsampwidth()}-bit WAV; without the soundfile "
                                 "module only 16-bit WAV is read")
            frames = w.readframes(w.getnframes())
            return array.array("h", frames), w.getnchannels(), w.getframerate()
    except (wave.Error, EOFError) as e:
        raise KvasrError(f"{path}: not a WAV file this module reads ({e}); install the "
                         "soundfile module (python3-soundfile) for other formats") from e


def _read_any(path, file):
    try:
        data, rate = _soundfile.read(file, dtype="int16", always_2d=True)
    except _soundfile.LibsndfileError as e:
        raise KvasrError(f"{path}: {e}") from e
    return array.array("h", data.tobytes()), data.shape[1], rate


def read(path):
    """The recording at `path` as 16 kHz mono int16 samples, and its
    original rate."""
    with open(path, "rb") as file:
        samples, channels, rate = (_read_any if _soundfile else _read_wav)(path, file)
    if channels < 1 or rate < 1:
        raise KvasrError(f"{path}: no audio channels")
    return resample(mix_down(samples, channels), rate), rate
