# SPDX-License-Identifier: Apache-2.0
"""Loading libkvasr_offline, finding the default models, and keeping the
library's log off the process's standard output."""

import ctypes
import os
import sys
import tempfile
import threading

from .errors import KvasrError

LIBRARY_ENV = "KVASR_LIBRARY"
MODELS_ENV = "KVASR_MODELS_DIR"
# The soname has no suffix, so this is also the name the loader searches for.
SONAME = "libkvasr_offline"

RESULT_CALLBACK = ctypes.CFUNCTYPE(None, ctypes.c_void_p, ctypes.c_char_p, ctypes.c_void_p)

try:
    from . import _paths
except ImportError:
    _paths = None


def _declare(lib):
    lib.vorta_speech_get_offline_asr_version.restype = ctypes.c_char_p
    lib.vorta_speech_get_offline_asr_version.argtypes = []
    lib.vorta_speech_create_offline_asr_engine.restype = ctypes.c_void_p
    lib.vorta_speech_create_offline_asr_engine.argtypes = []
    lib.vorta_speech_release_offline_asr_engine.restype = None
    lib.vorta_speech_release_offline_asr_engine.argtypes = [ctypes.c_void_p]
    lib.vorta_speech_offline_asr_init.restype = ctypes.c_int
    lib.vorta_speech_offline_asr_init.argtypes = [ctypes.c_void_p, ctypes.c_char_p]
    lib.vorta_speech_offline_asr_start.restype = ctypes.c_int
    lib.vorta_speech_offline_asr_start.argtypes = [
        ctypes.c_void_p, ctypes.c_char_p, RESULT_CALLBACK, ctypes.c_void_p]
    lib.vorta_speech_offline_asr_stop.restype = ctypes.c_int
    lib.vorta_speech_offline_asr_stop.argtypes = [ctypes.c_void_p]
    lib.vorta_speech_offline_asr_close.restype = None
    lib.vorta_speech_offline_asr_close.argtypes = [ctypes.c_void_p]
    lib.vorta_speech_offline_asr_process_sound_data.restype = ctypes.c_int
    lib.vorta_speech_offline_asr_process_sound_data.argtypes = [
        ctypes.c_void_p, ctypes.POINTER(ctypes.c_int16), ctypes.c_int, ctypes.c_int]


def _candidates():
    """(where the name came from, what to hand to the loader), in order."""
    if _paths is not None:
        yield "the installed package", _paths.LIBRARY
    env = os.environ.get(LIBRARY_ENV)
    if env:
        yield "$" + LIBRARY_ENV, env
    else:
        yield "the system library path", SONAME


_lock = threading.Lock()
_loaded = None


def library():
    """The loaded library and the path it was loaded from (None when the
    loader found it by name)."""
    global _loaded
    with _lock:
        if _loaded is None:
            tried = []
            for origin, name in _candidates():
                try:
                    lib = ctypes.CDLL(name)
                except OSError as e:
                    tried.append(f"{name} ({origin}): {e}")
                    continue
                _declare(lib)
                _loaded = (lib, _loaded_path(lib, name))
                break
            else:
                raise KvasrError(
                    "libkvasr_offline not found; tried " + "; ".join(tried) +
                    f". Set {LIBRARY_ENV} to the library's path, or install the library "
                    "where the loader looks (ldconfig or LD_LIBRARY_PATH)")
        return _loaded


def _loaded_path(lib, name):
    """The file the loader chose, read back from the process's mappings."""
    if os.sep in name:
        return os.path.abspath(name)
    symbol = ctypes.cast(lib.vorta_speech_create_offline_asr_engine, ctypes.c_void_p).value
    try:
        with open("/proc/self/maps") as maps:
            for line in maps:
                fields = line.split(maxsplit=5)
                low, high = (int(x, 16) for x in fields[0].split("-"))
                if low <= symbol < high and len(fields) == 6:
                    return fields[5].strip()
    except OSError:
        pass
    return None


def version():
    """The decoder library's version text."""
    return library()[0].vorta_speech_get_offline_asr_version().decode("utf-8", "replace")


def _source_models_dir(library_dir):
    """The checkout's models/ when the library sits in one of its CMake
    build trees."""
    d = library_dir
    while d and d != os.path.dirname(d):
        cache = os.path.join(d, "CMakeCache.txt")
        if os.path.isfile(cache):
            with open(cache, encoding="utf-8", errors="replace") as f:
                for line in f:
                    if line.startswith("kvasr_SOURCE_DIR:"):
                        return os.path.join(line.split("=", 1)[1].strip(), "models")
            return None
        d = os.path.dirname(d)
    return None


def models_dir():
    """The folder holding decoder/, vad/ and punct/."""
    tried = []
    candidates = []
    if _paths is not None:
        candidates.append(_paths.MODELS_DIR)
    if os.environ.get(MODELS_ENV):
        candidates.append(os.environ[MODELS_ENV])
    path = library()[1]
    if path:
        lib_dir = os.path.dirname(path)
        candidates.append(os.path.join(lib_dir, os.pardir, "share", "kvasr", "models"))
        source = _source_models_dir(lib_dir)
        if source:
            candidates.append(source)
    for candidate in candidates:
        if os.path.isdir(os.path.join(candidate, "decoder")):
            return os.path.normpath(candidate)
        tried.append(candidate)
    raise KvasrError(
        "no default models found" + (" (tried " + ", ".join(tried) + ")" if tried else "") +
        f"; set {MODELS_ENV} or pass the model paths")


class _Capture:
    """Points descriptors 1 and 2 at a scratch file for the length of a
    library call: the library logs on standard output and its decoder
    reports faults on standard error, and both belong to the caller's
    program. What was written is handed back, to be shown or dropped as the
    recogniser's `log` setting says and quoted in exceptions."""

    def __init__(self):
        self._lock = threading.RLock()
        self._scratch = None
        self._libc = ctypes.CDLL(None)
        self._libc.fflush.argtypes = [ctypes.c_void_p]

    def call(self, function, *args):
        with self._lock:
            if self._scratch is None:
                # A bare descriptor: the file lives as long as the process.
                self._scratch, name = tempfile.mkstemp(prefix="kvasr-log-")
                os.unlink(name)
            scratch = self._scratch
            os.ftruncate(scratch, 0)
            os.lseek(scratch, 0, os.SEEK_SET)
            for stream in (sys.stdout, sys.stderr):
                if stream is not None:
                    stream.flush()
            saved = [os.dup(1), os.dup(2)]
            try:
                os.dup2(scratch, 1)
                os.dup2(scratch, 2)
                try:
                    result = function(*args)
                finally:
                    self._libc.fflush(None)
                    os.dup2(saved[0], 1)
                    os.dup2(saved[1], 2)
            finally:
                for fd in saved:
                    os.close(fd)
            os.lseek(scratch, 0, os.SEEK_SET)
            text = os.read(scratch, os.fstat(scratch).st_size)
            return result, text.decode("utf-8", "replace")


capture = _Capture()
