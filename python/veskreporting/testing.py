"""A recorder replaces the daemon in an application's tests. The fixture is `veskreporting_recorder`."""

import ctypes
import dataclasses
import enum
import threading
from typing import Any, Dict, Iterable, List, Optional

from . import _library as c
from . import _lifetime
from ._values import read_dictionary, read_list


class Call(enum.Enum):
    """What was called."""

    CONFIGURE = 1
    START = 2
    STATES = 3
    DISPLAY_URL = 4
    MESSAGE = 5
    FLUSH = 6
    FILE = 7
    LOG_DATA = 8


@dataclasses.dataclass(frozen=True)
class Recorded:
    """A call as the daemon would have received it. Members that the call doesn't have are None or 0."""

    call: Call
    category: int = 0
    type: int = 0
    realtime: bool = False
    override_sampling: bool = False
    payload: Optional[Dict[str, Any]] = None
    session_info: Optional[Dict[str, Any]] = None  # of the session at the time of the call
    user_info: Optional[Dict[str, Any]] = None  # likewise
    log_data: Optional[List[Any]] = None
    path: Optional[str] = None  # of an uploaded file


class Recorder:
    """While it exists, new sessions of this process connect to it instead of a daemon. Thread-safe.

    One-way calls return after they were recorded, so a test can check them at once. Sessions connect to the newest
    recorder. Make it before them. Closing it also closes the sessions made since.
    """

    def __init__(self) -> None:
        self._library = c.load()
        self._lock = threading.Lock()  # against `clear` while calls are copied
        self._earlier_sessions = set(_lifetime.open_handles())
        self._handle: Optional[int] = self._library.vesk_recorder_new()
        if not self._handle:
            raise OSError("the recorder can't listen; the log says why")

    def __enter__(self) -> "Recorder":
        return self

    def __exit__(self, *_: object) -> None:
        self.close()

    def close(self) -> None:
        """May be called again. Nothing is recorded then."""
        for session in _lifetime.open_handles():
            if session not in self._earlier_sessions:
                session.close()
        with self._lock:
            handle, self._handle = self._handle, None
            self._library.vesk_recorder_free(handle)

    @property
    def calls(self) -> List[Recorded]:
        """All calls, in their order."""
        return self._copy(0)

    @property
    def messages(self) -> List[Recorded]:
        return self._copy(Call.MESSAGE.value)

    def count(self, call: Call) -> int:
        with self._lock:
            number: int = self._library.vesk_recorder_count(self._handle, call.value)
            return number

    def clear(self) -> None:
        with self._lock:
            self._library.vesk_recorder_clear(self._handle)

    def set_backends(self, names: Optional[Iterable[str]]) -> None:
        """Sets the enabled backends reported for later starts and state queries. None: there is no storebag.

        The default is "httpPost".
        """
        encoded = None if names is None else [name.encode() for name in names]
        array = None if encoded is None else (ctypes.c_char_p * max(len(encoded), 1))(*encoded)
        with self._lock:
            self._library.vesk_recorder_set_backends(self._handle, array, len(encoded or ()))

    def _copy(self, kind: int) -> List[Recorded]:
        with self._lock:
            count = self._library.vesk_recorder_count(self._handle, kind)
            found = (self._library.vesk_recorder_at(self._handle, kind, index) for index in range(count))
            return [_recorded(pointer.contents) for pointer in found if pointer]


def _recorded(view: c.Recorded) -> Recorded:
    return Recorded(Call(view.call), view.category, view.type, bool(view.flag & 1), bool(view.flag & 2),
                    read_dictionary(view.payload), read_dictionary(view.session_info),
                    read_dictionary(view.user_info), read_list(view.log_data),
                    None if view.path is None else view.path.decode("utf-8", "surrogateescape"))
