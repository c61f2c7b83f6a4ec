"""The three ways to make a call: one-way or with a callback, waiting, and awaited."""

import asyncio
import threading
from ctypes import byref
from typing import Any, Callable, Generic, Optional, Tuple

from . import _library as c
from ._lifetime import Handle, Owed, close_when_collected, is_in_callback_of
from .results import Answer, ReportingError, Result, Status, read_result, status_of

Callback = Callable[[Result[Answer]], object]

_GRACE = 0.1  # seconds: the session's thread knows best why there is no answer in time


class Call(Generic[Answer]):
    """`post` calls the library with (library, session, completion), `read` reads the answer of a result."""

    __slots__ = ("post", "read")

    def __init__(self, post: Callable[[Any, Optional[int], Any], int],
                 read: Callable[[Any, int], Answer]) -> None:
        self.post = post
        self.read = read


class Caller:
    """Makes calls of one session. Thread-safe."""

    def __init__(self, options: Optional[c.Options]) -> None:
        self._library = c.load()
        self._handle = Handle(options)
        close_when_collected(self, self._handle)

    def close(self) -> None:
        """Waits until the daemon has taken what is queued, for at most the drain time, and ends the session.

        Also waits for a running callback. May be called again. Later calls return CLOSED.
        """
        self._refuse_in_callback()
        self._handle.close()

    async def aclose(self) -> None:
        """The same without blocking the event loop."""
        self._refuse_in_callback()
        await asyncio.get_running_loop().run_in_executor(None, self._handle.close)

    def _post(self, call: Call[Answer], callback: Optional[Callback[Answer]] = None,
              timeout: float = 0) -> Status:
        if callback is None:
            return self._enter(call, None)
        if not callable(callback):
            raise TypeError("a callback must be callable")
        return self._ask(call, callback, timeout)

    def _ask(self, call: Call[Answer], receive: Callback[Answer], timeout: float) -> Status:
        """Has `receive` called on the session's thread, unless this does not return QUEUED."""
        owed = Owed(self._handle.address or 0, lambda result: receive(read_result(result, call.read)),
                    milliseconds(timeout))
        status = None
        try:
            status = self._enter(call, byref(owed.completion))
        finally:
            if status is not Status.QUEUED:
                owed.cancel()
        return status

    def _enter(self, call: Call[Answer], completion: Any) -> Status:
        handle = self._handle
        try:
            return status_of(call.post(self._library, handle.address, completion)) if handle.enter() else Status.CLOSED
        finally:
            handle.leave()

    def _wait(self, call: Call[Answer], timeout: float) -> Answer:
        self._refuse_in_callback()
        arrived, receive, results = _inbox()
        _check_queued(self._ask(call, receive, timeout))
        # Not one of the library's waiting functions, which would hold back Ctrl-C.
        if not arrived.wait(min(timeout + _GRACE, threading.TIMEOUT_MAX)):
            raise ReportingError(Status.TIMED_OUT)
        return results[0].get()

    async def _await(self, call: Call[Answer], timeout: float) -> Answer:
        loop = asyncio.get_running_loop()
        future: "asyncio.Future[Result[Answer]]" = loop.create_future()

        def settle(result: Result[Answer]) -> None:
            if not future.done():  # cancelled
                future.set_result(result)

        def receive(result: Result[Answer]) -> None:
            try:
                loop.call_soon_threadsafe(settle, result)
            except RuntimeError:
                pass  # the loop is closed

        _check_queued(self._ask(call, receive, timeout))
        try:
            return (await asyncio.wait_for(future, timeout + _GRACE)).get()
        except asyncio.TimeoutError:
            raise ReportingError(Status.TIMED_OUT) from None

    def _refuse_in_callback(self) -> None:
        if self._handle.address and is_in_callback_of(self._handle.address):
            raise ReportingError(Status.ON_SESSION_THREAD)


def _inbox() -> "Tuple[threading.Event, Callback[Any], list[Result[Any]]]":
    arrived = threading.Event()
    results: "list[Result[Any]]" = []

    def receive(result: Result[Any]) -> None:
        results.append(result)
        arrived.set()

    return arrived, receive, results


def _check_queued(status: Status) -> None:
    if status is not Status.QUEUED:
        raise ReportingError(status)


def milliseconds(seconds: float) -> int:
    return int(min(max(seconds, 0), 1e12) * 1000)
