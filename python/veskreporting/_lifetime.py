"""Who is called when, and what has to end before the interpreter does.

Sessions' threads call into Python, which must not happen once the interpreter shuts down. So all sessions are freed
before that. No locks are held here while the library is called, nor any that a forked process might find held.
"""

import _thread
import atexit
import itertools
import os
import threading
import time
import weakref
from typing import Any, Callable, Dict, List, Optional, Tuple

from . import _library as c

_numbers = itertools.count(1)  # contexts; 0 would be null

# Results that are owed: context -> (session's handle, receiver).
_owed: Dict[int, Tuple[int, Callable[[int], object]]] = {}
# Aggregation handlers: context -> (session's handle, receiver).
_handlers: Dict[int, Tuple[int, Callable[[Any], None]]] = {}

_running = threading.local()  # .handle: the session whose callback this thread runs


def is_in_callback_of(handle: int) -> bool:
    return getattr(_running, "handle", None) == handle


# The functions that the library calls exist as long as the process. ctypes gives their exceptions to
# sys.unraisablehook.

@c.ResultCallback
def _on_result(context: int, result: int) -> None:
    owed = _owed.pop(context, None)
    if owed:
        _running.handle, receive = owed
        receive(result)


@c.AggregatedCallback
def _on_aggregated(context: int, message: Any) -> None:
    _running.handle, receive = _handlers[context]
    receive(message.contents)


@c.ContextCallback
def _on_released(context: int) -> None:
    _handlers.pop(context, None)


class Owed:
    """A result that a call asks for."""

    def __init__(self, handle: int, receive: Callable[[int], object], timeout_ms: int) -> None:
        self._number = next(_numbers)
        _owed[self._number] = (handle, receive)
        self.completion = c.Completion(_on_result, self._number, timeout_ms)

    def cancel(self) -> None:
        """To be called if the library has not taken the call."""
        _owed.pop(self._number, None)


def aggregation(handle: int, receive: Callable[[Any], None]) -> c.Aggregation:
    """To be passed to the library, which releases it."""
    number = next(_numbers)
    _handlers[number] = (handle, receive)
    return c.Aggregation(_on_aggregated, _on_released, number)


class Handle:
    """A session of the library, which is freed once while no call uses it."""

    def __init__(self, options: Optional[c.Options] = None) -> None:
        self._process = os.getpid()
        # Null if resources run out. The library refuses calls with it.
        self.address: Optional[int] = None if _has_ended else c.load().vesk_session_new(options)
        self.is_closed = _has_ended
        self._inside: List[None] = []  # one for each call in progress; lists are atomic
        if self.address:
            _open[self] = True

    def enter(self) -> bool:
        """Returns whether the library may be called; `leave` must follow in any case."""
        self._inside.append(None)
        return not self.is_closed

    def leave(self) -> None:
        self._inside.pop()

    def close(self) -> None:
        self.is_closed = True
        if not self.address or os.getpid() != self._process:
            return
        while self._inside:  # calls take microseconds
            time.sleep(0.0005)
        if _open.pop(self, False):
            c.load().vesk_session_free(self.address)


_open: Dict[Handle, bool] = {}
_freeing: List[Any] = []  # locks, each held while a thread frees a session
_has_ended = False
at_end: List[Callable[[], None]] = []  # what else must end, after all sessions


def close_when_collected(owner: object, handle: Handle) -> None:
    """The collector runs anywhere, also in a callback or while locks are held, so a thread frees the session."""
    weakref.finalize(owner, _close_in_thread, handle).atexit = False


def _close_in_thread(handle: Handle) -> None:
    if handle.is_closed or _has_ended:
        return
    done = _thread.allocate_lock()
    done.acquire()
    _freeing.append(done)

    def close() -> None:
        try:
            handle.close()
        finally:
            _freeing.remove(done)
            done.release()

    try:
        _thread.start_new_thread(close, ())  # unlike threading.Thread, needs no lock
    except RuntimeError:
        _freeing.remove(done)  # closed at the end


@atexit.register
def _end() -> None:
    global _has_ended
    _has_ended = True
    for handle in [*_open]:
        handle.close()
    for done in [*_freeing]:
        done.acquire()
    for end in at_end:
        end()


def open_handles() -> List[Handle]:
    return [*_open]
