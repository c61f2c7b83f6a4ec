"""Python's logging: records as messages, and the library's own log as records."""

import ctypes
import logging
import os
import queue
import threading
from typing import Callable, Dict, Mapping, Optional, Tuple

from . import _library as c
from . import _lifetime
from ._values import Value
from .session import Session

_MAXIMUM_TEXT = 16 * 1024  # characters of a record's message or exception
_OWN = "veskreporting_own"  # marks the records of the library's own log

_DEFAULT_LEVEL = 6
_LEVELS = {3: logging.ERROR, 4: logging.WARNING, 6: logging.INFO, 7: logging.DEBUG}


class VeskReportingHandler(logging.Handler):
    """Sends records as messages with the keys "level", "logger", "message" and, if there is one, "exception".

    Never raises and never waits. Log messages may name people: filters of the storebag apply to the keys. `fields`
    returns further keys for a record. Records of the library's own log are not sent.
    """

    def __init__(self, session: Session, category: int, type: int, level: int = logging.NOTSET, *,
                 fields: Optional[Callable[[logging.LogRecord], Mapping[str, Value]]] = None) -> None:
        super().__init__(level)
        self._session = session
        self._category = category
        self._type = type
        self._fields = fields

    def emit(self, record: logging.LogRecord) -> None:
        if hasattr(record, _OWN):
            return  # what went wrong with messages must not cause more of them
        try:
            payload: Dict[str, Value] = {**(self._fields(record) if self._fields else {}), "level": record.levelname,
                       "logger": record.name, "message": _text(record.getMessage())}
            if record.exc_info and record.exc_info[0] is not None:
                payload["exception"] = _text(_FORMATTER.formatException(record.exc_info))
            elif record.exc_text:
                payload["exception"] = _text(record.exc_text)
            self._session.send(self._category, self._type, payload)
        except Exception:
            self.handleError(record)


_FORMATTER = logging.Formatter()


def _text(text: str) -> str:
    """Text that can be sent, since a record may hold anything."""
    return text[:_MAXIMUM_TEXT].encode("utf-8", "backslashreplace").decode().replace("\0", "\\0")


def log_to(logger: Optional[logging.Logger]) -> None:
    """Sends the library's own log to a logger, from a thread of its own; None restores the default.

    Without it, lines go to the journal or to standard error. The logger's level at the time of the call decides which
    lines are made.
    """
    global _logger
    if logger is None:
        _stop()
        return
    _logger = logger
    level = logger.getEffectiveLevel()
    c.load().vesk_log_set_level(max([number for number, name in _LEVELS.items() if name >= level], default=3))
    _start()
    c.load().vesk_log_set_sink(_sink, c.ContextCallback(0), None)


_logger: Optional[logging.Logger] = None
_lines: "queue.SimpleQueue[Optional[Tuple[int, str]]]" = queue.SimpleQueue()
_thread: Optional[threading.Thread] = None


@c.LogSink
def _sink(context: Optional[int], priority: int, line: int, length: int) -> None:
    # The library may hold locks here. A handler of the logger may use the library, so a thread runs it.
    _lines.put((priority, ctypes.string_at(line, length).decode("utf-8", "replace") if length else ""))


def _start() -> None:
    global _thread
    if _thread is None:
        _thread = threading.Thread(target=_log_lines, args=(_lines,), name="veskreporting-log", daemon=True)
        _thread.start()


def _log_lines(lines: "queue.SimpleQueue[Optional[Tuple[int, str]]]") -> None:
    for priority, line in iter(lines.get, None):
        if _logger is not None:
            _logger.log(_LEVELS.get(priority, logging.DEBUG), "%s", line, extra={_OWN: True})


def _stop() -> None:
    """Waits until the lines that there are have been logged."""
    global _thread
    if _thread is None:
        return
    c.load().vesk_log_set_sink(c.LogSink(0), c.ContextCallback(0), None)
    c.load().vesk_log_set_level(_DEFAULT_LEVEL)
    _lines.put(None)
    if _thread is not threading.current_thread():
        _thread.join()
    _thread = None


def _in_forked_process() -> None:
    global _lines, _thread
    if _thread is not None:  # it is not here
        _lines, _thread = queue.SimpleQueue(), None
        _start()


_lifetime.at_end.append(_stop)
os.register_at_fork(after_in_child=_in_forked_process)
