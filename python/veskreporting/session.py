"""Sessions with veskreportingd."""

import ctypes
import dataclasses
import os
from typing import Any, Callable, Dict, List, Mapping, Optional, Sequence

from . import _library as c
from . import _lifetime
from . import _operations as operations
from ._calls import Callback, Caller, milliseconds
from ._operations import Path, Payload, checked
from ._values import Value, Views, read_dictionary
from .results import Status, status_of

DEFAULT_TIMEOUT = 30.0  # seconds

Backends = Optional[List[str]]  # None: there is no storebag for the client type


@dataclasses.dataclass(frozen=True)
class Options:
    """How a session behaves. None: the library's default. Times are in seconds."""

    socket_path: Optional[str] = None
    maximum_queued_messages: Optional[int] = None
    maximum_queued_bytes: Optional[int] = None
    drain_time: Optional[float] = None  # how long `close` may take to send what is queued
    first_reconnect_wait: Optional[float] = None
    last_reconnect_wait: Optional[float] = None
    refresh_interval: Optional[float] = None  # how often to start anew, for a new storebag or consent; 0: never


@dataclasses.dataclass(frozen=True)
class Drops:
    """Calls that were not sent, since the session was made."""

    queue_full: int
    invalid: int
    unsent: int  # still queued when their time or the session ended

    @property
    def total(self) -> int:
        return self.queue_full + self.invalid + self.unsent


@dataclasses.dataclass(frozen=True)
class AggregatedMessage:
    """A message of a session that this client aggregates."""

    session_info: Optional[Dict[str, Any]]  # of the session that sent the message
    timestamp: float  # seconds since 1970
    category: int
    type: int
    payload: Optional[Dict[str, Any]]

    @property
    def is_closing(self) -> bool:
        """The last message of an aggregation, which says that no more will come."""
        return self.session_info is None and self.timestamp == 0


class Session(Caller):
    """One session: who reports, and what it sends. Keep it as long as the program reports.

    Making a session configures and starts it without waiting. What is sent before the daemon is ready waits in a
    queue. Calls reach the daemon in their order. All methods are thread-safe.

    Calls have three forms. `send` and alike return a Status at once; with `callback`, that gets a Result later, on
    the session's thread. `send_and_wait` and alike return the answer, `asend` and alike are awaited for it; both raise
    ReportingError if there is none. No other call raises on account of the daemon.
    """

    def __init__(self, client_type: int, client_name: str, *, service_name: str = "", session_id: int = 0,
                 client_version: int = 0, batch_events: bool = False, require_user_info: bool = True,
                 user_info: Payload = None, on_aggregated: Optional[Callable[[AggregatedMessage], object]] = None,
                 start: bool = True, timeout: float = DEFAULT_TIMEOUT, options: Optional[Options] = None) -> None:
        """Says who reports, and starts the session.

        client_type selects the storebag, client_name (with service_name) finds the client's entry in it.
        batch_events collects events into few posts. Without require_user_info the daemon asks for neither consent,
        entry, region, sampling nor filters. user_info has further keys, which become part of every event.
        on_aggregated receives the messages of the sessions below this one, on the session's thread. timeout is that
        of callbacks. With start=False, `start` has to be called.
        """
        if require_user_info and not client_name:
            raise ValueError("a session that requires user info needs a client_name")
        session_info = {
            "sessionID": checked("session_id", session_id, 0, 2**32 - 1),
            "clientType": checked("client_type", client_type, -(2**31), 2**31 - 1),
            "clientVersion": checked("client_version", client_version, 0, 2**16 - 1),
            "requireUserInfo": bool(require_user_info),
            "batchEvent": bool(batch_events),
        }
        self._names = {key: name for key, name in (("clientName", client_name), ("serviceName", service_name)) if name}
        self._user_info = {**(user_info or {}), **self._names}
        self._timeout = timeout
        super().__init__(_options(options or Options()))
        try:
            status = self._configure(session_info, on_aggregated)
            if status is Status.INVALID_ARGUMENT:
                raise ValueError(f"the user info can't be sent: {status.text}")
            if start:
                self.start()
        except BaseException:
            self.close()
            raise

    def __enter__(self) -> "Session":
        return self

    def __exit__(self, *_: object) -> None:
        self.close()

    async def __aenter__(self) -> "Session":
        return self

    async def __aexit__(self, *_: object) -> None:
        await self.aclose()

    @property
    def is_connected(self) -> bool:
        return self._ask_library(lambda library, session: library.vesk_session_is_connected(session)) == 1

    @property
    def drops(self) -> Drops:
        """All zero once the session is closed."""
        return Drops(*(self._ask_library(lambda library, session: library.vesk_session_drops(session, reason))
                       for reason in range(3)))

    def start(self, *, callback: Optional[Callback[Backends]] = None) -> Status:
        """Starts the session: the daemon fetches the storebag and creates its backends.

        Answer: those that are enabled.
        """
        return self._post(operations.START, callback, self._timeout)

    def start_and_wait(self, timeout: float = DEFAULT_TIMEOUT) -> Backends:
        return self._wait(operations.START, timeout)

    async def astart(self, timeout: float = DEFAULT_TIMEOUT) -> Backends:
        return await self._await(operations.START, timeout)

    def send(self, category: int, type: int, payload: Payload = None, /, *,
             callback: Optional[Callback[Optional[str]]] = None, realtime: bool = False,
             override_sampling: bool = False, **fields: Value) -> Status:
        """Sends a message.

        The payload is a mapping, keyword arguments, or both. `realtime` does not wait for a batch. Answer: the
        backends', if one gave any.
        """
        return self._post(operations.message(category, type, payload, fields, realtime, override_sampling), callback,
                          self._timeout)

    def send_and_wait(self, category: int, type: int, payload: Payload = None, /, *,
                      timeout: float = DEFAULT_TIMEOUT, realtime: bool = False, override_sampling: bool = False,
                      **fields: Value) -> Optional[str]:
        return self._wait(operations.message(category, type, payload, fields, realtime, override_sampling), timeout)

    async def asend(self, category: int, type: int, payload: Payload = None, /, *,
                    timeout: float = DEFAULT_TIMEOUT, realtime: bool = False, override_sampling: bool = False,
                    **fields: Value) -> Optional[str]:
        return await self._await(operations.message(category, type, payload, fields, realtime, override_sampling),
                                 timeout)

    def flush(self, *, callback: Optional[Callback[Optional[str]]] = None) -> Status:
        """Makes the backends send what they hold back."""
        return self._post(operations.FLUSH, callback, self._timeout)

    def flush_and_wait(self, timeout: float = DEFAULT_TIMEOUT) -> Optional[str]:
        return self._wait(operations.FLUSH, timeout)

    async def aflush(self, timeout: float = DEFAULT_TIMEOUT) -> Optional[str]:
        return await self._await(operations.FLUSH, timeout)

    def set_user_info(self, user_info: Payload, *, callback: Optional[Callback[Backends]] = None) -> Status:
        """Replaces the further keys of the user info."""
        replaced = {**(user_info or {}), **self._names}
        status = self._post(operations.states(replaced), callback, self._timeout)
        self._user_info = replaced
        return status

    def states_and_wait(self, timeout: float = DEFAULT_TIMEOUT) -> Backends:
        """Asks which backends are enabled."""
        return self._wait(operations.states(self._user_info), timeout)

    async def astates(self, timeout: float = DEFAULT_TIMEOUT) -> Backends:
        return await self._await(operations.states(self._user_info), timeout)

    def display_url_and_wait(self, timeout: float = DEFAULT_TIMEOUT) -> Optional[str]:
        """Asks where the session's messages can be viewed; "URL not available" if nowhere."""
        return self._wait(operations.DISPLAY_URL, timeout)

    async def adisplay_url(self, timeout: float = DEFAULT_TIMEOUT) -> Optional[str]:
        return await self._await(operations.DISPLAY_URL, timeout)

    def upload_file(self, path: Path, *,
                    callback: Optional[Callback[bool]] = None) -> Status:
        """Uploads a file, which the calling thread opens. Answer: whether a backend accepted it."""
        return self._post(operations.file(path), callback, self._timeout)

    def upload_file_and_wait(self, path: Path, timeout: float = DEFAULT_TIMEOUT) -> bool:
        return self._wait(operations.file(path), timeout)

    async def aupload_file(self, path: Path, timeout: float = DEFAULT_TIMEOUT) -> bool:
        return await self._await(operations.file(path), timeout)

    def upload_log_data(self, log_data: Sequence[Value], *, callback: Optional[Callback[bool]] = None) -> Status:
        """Uploads log data. Answer: whether a backend accepted it."""
        return self._post(operations.log_data(log_data), callback, self._timeout)

    def upload_log_data_and_wait(self, log_data: Sequence[Value], timeout: float = DEFAULT_TIMEOUT) -> bool:
        return self._wait(operations.log_data(log_data), timeout)

    async def aupload_log_data(self, log_data: Sequence[Value], timeout: float = DEFAULT_TIMEOUT) -> bool:
        return await self._await(operations.log_data(log_data), timeout)

    def send_once(self, session_info: Mapping[str, Value], user_info: Payload, category: int, type: int,
                  payload: Payload = None, *, callback: Optional[Callback[Optional[str]]] = None) -> Status:
        """Sends a single message under another identity.

        session_info has at least "clientType" and "sessionID". Set "requireUserInfo" in it. Answer: "finished" or
        "storebag not available".
        """
        return self._post(operations.once(session_info, user_info, category, type, payload), callback, self._timeout)

    def send_once_and_wait(self, session_info: Mapping[str, Value], user_info: Payload, category: int, type: int,
                           payload: Payload = None, timeout: float = DEFAULT_TIMEOUT) -> Optional[str]:
        return self._wait(operations.once(session_info, user_info, category, type, payload), timeout)

    async def asend_once(self, session_info: Mapping[str, Value], user_info: Payload, category: int, type: int,
                         payload: Payload = None, timeout: float = DEFAULT_TIMEOUT) -> Optional[str]:
        return await self._await(operations.once(session_info, user_info, category, type, payload), timeout)

    def _configure(self, session_info: Mapping[str, Value],
                   on_aggregated: Optional[Callable[[AggregatedMessage], object]]) -> Status:
        aggregation = None
        if on_aggregated is not None:
            receive = on_aggregated

            def on_message(message: c.Aggregated) -> None:
                receive(AggregatedMessage(read_dictionary(message.session_info), message.timestamp, message.category,
                                          message.type, read_dictionary(message.payload)))

            aggregation = _lifetime.aggregation(self._handle.address or 0, on_message)
        with Views.borrow() as views:
            return status_of(self._library.vesk_session_configure(
                self._handle.address, views.dictionary(session_info), views.dictionary(self._user_info), None, 0,
                aggregation))

    def _ask_library(self, ask: Callable[[Any, Optional[int]], int]) -> int:
        handle = self._handle
        try:
            return ask(self._library, handle.address) if handle.enter() else 0
        finally:
            handle.leave()


def _options(given: Options) -> c.Options:
    options = c.Options()
    c.load().vesk_options_init(ctypes.byref(options), ctypes.sizeof(options))
    if given.socket_path is not None:
        options.socket_path = os.fsencode(given.socket_path)
    for name in ("maximum_queued_messages", "maximum_queued_bytes"):
        if getattr(given, name) is not None:
            setattr(options, name, checked(name, getattr(given, name), 0, 2**64 - 1))
    for name, member in (("drain_time", "drain_ms"), ("first_reconnect_wait", "first_reconnect_ms"),
                         ("last_reconnect_wait", "last_reconnect_ms"), ("refresh_interval", "refresh_ms")):
        if getattr(given, name) is not None:
            setattr(options, member, milliseconds(getattr(given, name)))
    return options
