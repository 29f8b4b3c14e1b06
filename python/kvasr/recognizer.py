# SPDX-License-Identifier: Apache-2.0
"""One recognition engine of libkvasr_offline behind a Python object."""

import ctypes
import json
import os
import sys
import tempfile
import weakref
from dataclasses import dataclass, field

from . import _library
from .errors import KvasrError

RATE_HZ = 16000
TIMEOUT_STATUS = -100
MAX_CHUNK_SAMPLES = 2**31 - 1
LOG_CHOICES = ("off", "stderr", "stdout")
# Log lines quoted in an exception; the last ones say what went wrong.
QUOTED_LOG_LINES = 6

_PUNCT_PATH_KEYS = ("model_path", "vocab_path", "punc_path", "num_path", "case_path",
                    "xdb_path", "bpe_path")
_PCM_FORMATS = ("h", "@h", "=h", "<h")


@dataclass(frozen=True)
class Result:
    """One result message of the library."""

    text: str
    final: bool  # the message's isBreak: the last text of an utterance
    status: int  # 0, or TIMEOUT_STATUS when a silence limit ended listening
    message: str  # "Success" or what went wrong
    json: str = field(repr=False)  # the message as the library wrote it

    @property
    def timed_out(self):
        return self.status == TIMEOUT_STATUS

    @classmethod
    def parse(cls, text):
        message = json.loads(text)
        result = message["result"]
        return cls(text=result["text"], final=bool(result["isBreak"]),
                   status=int(message["status"]), message=message["message"], json=text)


def _pcm(samples):
    """The samples as a ctypes int16 array (copied: the library reads them
    only during the call)."""
    if isinstance(samples, str):
        raise TypeError("samples must be 16-bit PCM, not text")
    try:
        view = memoryview(samples)
    except TypeError:
        raise TypeError("samples must be bytes of 16-bit PCM, an array('h') or an int16 "
                        f"NumPy array, not {type(samples).__name__}") from None
    if view.ndim != 1:
        raise ValueError(f"samples must be one-dimensional (mono), not {view.ndim}-dimensional")
    if view.format == "B":
        if view.nbytes % 2:
            raise ValueError(f"{view.nbytes} bytes is not a whole number of 16-bit samples")
    elif view.format not in _PCM_FORMATS:
        raise TypeError(f"samples must be 16-bit signed integers in machine order; "
                        f"got items of format '{view.format}' ({view.itemsize} bytes)")
    count = view.nbytes // 2
    if count == 0:
        raise ValueError("no samples given")
    if count > MAX_CHUNK_SAMPLES:
        raise ValueError(f"{count} samples in one call; at most {MAX_CHUNK_SAMPLES}")
    return (ctypes.c_int16 * count).from_buffer_copy(view if view.c_contiguous else view.tobytes())


class _Inbox:
    """What the library's callback hands over. Kept apart from the
    recogniser so that the callback holds no reference to it, and an
    exception raised here never unwinds through the library."""

    def __init__(self):
        self.results = []
        self.error = None

    def on_result(self, _engine, text, _context):
        try:
            self.results.append(Result.parse(text.decode("utf-8")))
        except BaseException as e:  # noqa: B036 - nothing may cross back into C
            if self.error is None:
                self.error = e

    def take(self):
        results, error = self.results, self.error
        self.results, self.error = [], None
        if error is not None:
            raise KvasrError(f"unreadable result message from the library: {error!r}") from error
        return results


def _release(lib, handle, callback):
    # `callback` is only held here so that it outlives the engine that calls it.
    del callback
    _library.capture.call(lib.vorta_speech_release_offline_asr_engine, handle)


def _absolute(path):
    return os.path.abspath(os.fspath(path))


def _punct_settings(path):
    """The local_punc_settings object of a settings file, its paths made
    absolute against the file's folder."""
    try:
        with open(path, encoding="utf-8") as f:
            settings = json.load(f)
    except (OSError, ValueError) as e:
        raise KvasrError(f"punctuation settings '{path}' cannot be read: {e}") from e
    if not isinstance(settings, dict):
        raise KvasrError(f"punctuation settings '{path}' are not a JSON object")
    folder = os.path.dirname(_absolute(path))
    for key in _PUNCT_PATH_KEYS:
        if isinstance(settings.get(key), str):
            settings[key] = os.path.join(folder, settings[key])
    return settings


def _silence_limit(name, value):
    # The engine counts the limits in 32-bit samples: 16 per millisecond.
    limit = (2**32 - 1) // (RATE_HZ // 1000)
    if not isinstance(value, int) or isinstance(value, bool) or not 0 <= value <= limit:
        raise ValueError(f"{name} takes whole milliseconds from 0 to {limit}, not {value!r}")
    return value


class Recognizer:
    """A recognition engine with its models loaded.

    Feed 16 kHz mono 16-bit samples with accept() in chunks of any size; each
    call returns the result messages it produced. finish() ends the
    listening period and returns its last results; the next accept() starts
    a new one. A silence limit that ends listening shows as a result whose
    `timed_out` is true, and the next accept() starts again as well.

    Models default to the installed (or build tree's) ones. `grammar` names
    a JSGF file that replaces the decoder model's language model. `log`
    says where the library's log lines go: "off" (dropped), "stderr" or
    "stdout"; they never reach standard output otherwise. While a library
    call runs, the process's descriptors 1 and 2 point at a scratch file, so
    recognisers on several threads take turns.

    One thread at a time per recogniser. Use it as a context manager, or
    call close(); dropping the last reference releases the engine as well.
    """

    def __init__(self, *, decoder_model=None, vad_models=None, vad=True, punct=False,
                 punct_settings=None, grammar=None, lang="en-US", max_silence_before_ms=0,
                 max_silence_after_ms=0, log="off"):
        if log not in LOG_CHOICES:
            raise ValueError(f"log must be one of {', '.join(LOG_CHOICES)}, not {log!r}")
        self._log = log
        self._start_params = json.dumps({"asr": {
            "max_mute_time_before_voice":
                _silence_limit("max_silence_before_ms", max_silence_before_ms),
            "max_mute_time_after_voice":
                _silence_limit("max_silence_after_ms", max_silence_after_ms)}}).encode()
        self._lib = _library.library()[0]
        self._handle = None
        self._listening = False
        self._packet = 0

        punct = punct or punct_settings is not None
        if decoder_model is None or (vad and vad_models is None) or (
                punct and punct_settings is None):
            models = _library.models_dir()
            decoder_model = decoder_model or os.path.join(models, "decoder", "en-us.manifest")
            vad_models = vad_models or os.path.join(models, "vad")
            punct_settings = punct_settings or os.path.join(models, "punct", "en",
                                                            "settings.json")
        self.decoder_model = _absolute(decoder_model)
        if not os.path.isfile(self.decoder_model):
            raise KvasrError(f"decoder model '{self.decoder_model}' not found")
        # The engine wants the key even with the detector off.
        self.vad_models = _absolute(vad_models) if vad_models is not None else ""
        if vad and not os.path.isdir(self.vad_models):
            raise KvasrError(f"VAD model folder '{self.vad_models}' not found")
        params = {"local_moxwing_model_file_path": self.decoder_model,
                  "local_vad_model_dir_path": self.vad_models,
                  "lang": lang, "vad_enabled": bool(vad)}
        if punct:
            params["local_punc_settings"] = _punct_settings(punct_settings)

        self._inbox = _Inbox()
        self._callback = _library.RESULT_CALLBACK(self._inbox.on_result)
        handle, _ = _library.capture.call(self._lib.vorta_speech_create_offline_asr_engine)
        if not handle:
            raise KvasrError("the library could not create an engine (out of memory)")
        self._handle = handle
        self._finalizer = weakref.finalize(self, _release, self._lib, handle, self._callback)
        if grammar is None:
            self._init(params)
        else:
            self._init_with_grammar(params, _absolute(grammar))

    def _init_with_grammar(self, params, grammar):
        if not os.path.isfile(grammar):
            self.close()
            raise KvasrError(f"grammar '{grammar}' not found")
        # A manifest that takes everything from the chosen one but the grammar.
        with tempfile.NamedTemporaryFile("w", suffix=".manifest", encoding="utf-8") as manifest:
            manifest.write(f"kvasr-decoder-manifest 1\nbase = {self.decoder_model}\n"
                           f"grammar = {grammar}\n")
            manifest.flush()
            self._init(dict(params, local_moxwing_model_file_path=manifest.name))

    def _init(self, params):
        status, log = self._call(self._lib.vorta_speech_offline_asr_init,
                                 json.dumps(params).encode())
        if status != 0:
            self.close()
            raise KvasrError(self._failure(
                f"the models could not be loaded (decoder model '{self.decoder_model}'"
                + (f", VAD models '{self.vad_models}'" if params["vad_enabled"] else "") + ")",
                log))

    def _call(self, function, *args):
        result, log = _library.capture.call(function, self._handle, *args)
        if log and self._log != "off":
            stream = sys.stderr if self._log == "stderr" else sys.stdout
            stream.write(log)
            stream.flush()
        return result, log

    @staticmethod
    def _failure(what, log):
        lines = [line for line in log.splitlines() if line.strip()][-QUOTED_LOG_LINES:]
        return what + ("; the library said:\n  " + "\n  ".join(lines) if lines else "")

    def _engine(self):
        if self._handle is None:
            raise KvasrError("the recogniser is closed")
        return self._handle

    def accept(self, samples, last=False):
        """Feeds samples; `last` marks the end of an utterance. Returns the
        results the call produced."""
        data = _pcm(samples)
        self._engine()
        if not self._listening:
            status, log = self._call(self._lib.vorta_speech_offline_asr_start, self._start_params,
                                     self._callback, None)
            if status != 0:
                raise KvasrError(self._failure("the engine did not start listening", log))
            self._listening = True
            self._packet = 0
        packet = -1 if last else self._packet
        self._packet += 0 if last else 1
        status, log = self._call(self._lib.vorta_speech_offline_asr_process_sound_data, data,
                                 len(data), packet)
        results = self._inbox.take()
        if status != 0:
            self._listening = False
            if not any(r.timed_out for r in results):
                self._call(self._lib.vorta_speech_offline_asr_stop)
                self._inbox.take()
                raise KvasrError(self._failure(f"the engine refused {len(data)} samples", log))
        return results

    def finish(self):
        """Ends the listening period; returns its last results."""
        self._engine()
        if self._listening:
            self._call(self._lib.vorta_speech_offline_asr_stop)
            self._listening = False
        return self._inbox.take()

    def transcribe(self, samples, chunk_samples=RATE_HZ // 10):
        """All results of one listening period over `samples`, fed in chunks
        with the last one marked, as the command-line tool feeds a file."""
        view = memoryview(_pcm(samples)).cast("B").cast("h")
        results = []
        for begin in range(0, len(view), chunk_samples):
            chunk = view[begin:begin + chunk_samples]
            results += self.accept(chunk, last=begin + chunk_samples >= len(view))
            if any(r.timed_out for r in results):
                break
        return results + self.finish()

    def close(self):
        """Unloads the models and releases the engine; further calls raise."""
        if self._handle is not None:
            self._listening = False
            self._finalizer()
            self._handle = None

    def __enter__(self):
        return self

    def __exit__(self, *exc):
        self.close()
