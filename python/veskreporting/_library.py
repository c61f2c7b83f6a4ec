"""The C API of libVeskReporting, as veskreporting.h declares it."""

import ctypes
import functools
import os
from ctypes import (CFUNCTYPE, POINTER, Structure, Union, c_char_p, c_double, c_int, c_int32, c_int64, c_size_t,
                    c_uint16, c_uint32, c_uint64, c_void_p)

NAME = "libVeskReporting.so.7"


class TextView(Structure):
    _fields_ = [("data", c_void_p), ("length", c_size_t)]


class ListView(Structure):
    _fields_ = [("values", c_void_p), ("count", c_size_t)]


class DictionaryView(Structure):
    _fields_ = [("entries", c_void_p), ("count", c_size_t)]


class Content(Union):
    _fields_ = [("boolean", c_int), ("signed", c_int64), ("unsigned", c_uint64), ("real", c_double),
                ("text", TextView), ("list", ListView), ("dictionary", DictionaryView)]


class ValueView(Structure):
    _fields_ = [("kind", c_uint32), ("content", Content)]


class EntryView(Structure):
    _fields_ = [("key", TextView), ("value", ValueView)]


# The kinds of values.
NONE, BOOLEAN, SIGNED, UNSIGNED, DOUBLE, TEXT, BYTES, DATE, LIST, DICTIONARY = range(10)

ResultCallback = CFUNCTYPE(None, c_void_p, c_void_p)  # context, vesk_result*
ContextCallback = CFUNCTYPE(None, c_void_p)  # context
LogSink = CFUNCTYPE(None, c_void_p, c_int32, c_void_p, c_size_t)  # context, priority, line, length


class Completion(Structure):
    _fields_ = [("callback", ResultCallback), ("context", c_void_p), ("timeout_ms", c_int64)]


class Options(Structure):
    _fields_ = [("size", c_size_t), ("socket_path", c_char_p), ("maximum_queued_messages", c_uint64),
                ("maximum_queued_bytes", c_uint64), ("drain_ms", c_int64), ("first_reconnect_ms", c_int64),
                ("last_reconnect_ms", c_int64), ("refresh_ms", c_int64)]


class Aggregated(Structure):
    _fields_ = [("size", c_size_t), ("session_info", c_void_p), ("timestamp", c_double), ("category", c_uint16),
                ("type", c_uint16), ("payload", c_void_p)]


AggregatedCallback = CFUNCTYPE(None, c_void_p, POINTER(Aggregated))  # context, message


class Aggregation(Structure):
    _fields_ = [("handle", AggregatedCallback), ("release", ContextCallback), ("context", c_void_p)]


class Recorded(Structure):
    _fields_ = [("size", c_size_t), ("call", c_int32), ("category", c_uint16), ("type", c_uint16),
                ("flag", c_int32), ("payload", c_void_p), ("session_info", c_void_p), ("user_info", c_void_p),
                ("log_data", c_void_p), ("path", c_char_p)]


# Views and handles are passed as addresses. `_completion` stands for a pointer to a Completion, or null.
_view = _handle = _completion = c_void_p

_FUNCTIONS = {
    "vesk_status_text": (c_char_p, c_int32),
    "vesk_result_status": (c_int32, _handle),
    "vesk_result_detail": (c_char_p, _handle),
    "vesk_result_text": (c_char_p, _handle),
    "vesk_result_accepted": (c_int, _handle),
    "vesk_result_backend_count": (c_size_t, _handle),
    "vesk_result_backend": (c_char_p, _handle, c_size_t),
    "vesk_options_init": (None, POINTER(Options), c_size_t),
    "vesk_session_new": (_handle, POINTER(Options)),
    "vesk_session_free": (None, _handle),
    "vesk_session_is_connected": (c_int, _handle),
    "vesk_session_drops": (c_uint64, _handle, c_int32),
    "vesk_session_configure": (c_int32, _handle, _view, _view, c_void_p, c_size_t, POINTER(Aggregation)),
    "vesk_session_start": (c_int32, _handle, _completion),
    "vesk_session_fetch_states": (c_int32, _handle, _view, _completion),
    "vesk_session_fetch_display_url": (c_int32, _handle, _completion),
    "vesk_session_send": (c_int32, _handle, c_uint16, c_uint16, _view, _completion),
    "vesk_session_send_parameters": (c_int32, _handle, _view, _completion),
    "vesk_session_flush": (c_int32, _handle, _completion),
    "vesk_session_upload_file": (c_int32, _handle, c_char_p, _completion),
    "vesk_session_upload_log_data": (c_int32, _handle, _view, _completion),
    "vesk_session_send_once": (c_int32, _handle, _view, _view, c_uint16, c_uint16, _view, _completion),
    "vesk_persistent_identifier": (c_size_t, c_int, c_void_p, c_size_t),
    "vesk_version": (c_size_t, c_void_p, c_size_t),
    "vesk_public_key": (c_size_t, c_void_p, c_size_t),
    "vesk_log_set_level": (None, c_int32),
    "vesk_log_set_sink": (None, LogSink, ContextCallback, c_void_p),
    "vesk_recorder_new": (_handle,),
    "vesk_recorder_free": (None, _handle),
    "vesk_recorder_count": (c_size_t, _handle, c_int32),
    "vesk_recorder_at": (POINTER(Recorded), _handle, c_int32, c_size_t),
    "vesk_recorder_clear": (None, _handle),
    "vesk_recorder_set_backends": (None, _handle, POINTER(c_char_p), c_size_t),
}


@functools.lru_cache(maxsize=None)
def load() -> ctypes.CDLL:
    """The library, loaded when it is first used. VESKREPORTING_LIBRARY names another file, for build trees."""
    name = os.environ.get("VESKREPORTING_LIBRARY") or NAME
    try:
        # Calls release Python's lock, so that callbacks can run while a session is freed.
        library = ctypes.CDLL(name)
        for function, (result, *arguments) in _FUNCTIONS.items():
            declared = getattr(library, function)
            declared.restype = result
            declared.argtypes = arguments
    except (OSError, AttributeError) as error:
        raise ImportError(f"the library of veskreportingd can't be used: {error}") from None
    return library
