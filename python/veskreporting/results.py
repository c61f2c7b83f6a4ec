"""Outcomes of calls."""

import enum
from typing import Any, Callable, Generic, List, Optional, TypeVar

from . import _library as c

Answer = TypeVar("Answer")


class Status(enum.Enum):
    """The outcome of a call."""

    DONE = 0  # the daemon has answered
    QUEUED = 1  # waits to be sent, after everything queued before it
    QUEUE_FULL = 2  # not sent: the queue is full
    NOT_CONNECTED = 3  # no daemon in time, or the connection ended before the answer
    TIMED_OUT = 4  # sent, but not answered in time
    REFUSED = 5  # the daemon answered with an error
    INVALID_ARGUMENT = 6  # larger than 1 MiB, nested too deeply, or text that is not valid Unicode or has NULs
    FILE_UNAVAILABLE = 7  # the file can't be opened or is not a regular file
    FORKED_PROCESS = 8  # the session belongs to the process that this one was forked from
    ON_SESSION_THREAD = 9  # a waiting call made from a callback would deadlock
    CLOSED = 10  # the session was closed before the answer
    OUT_OF_RESOURCES = 11  # out of memory, descriptors or threads
    TOO_MANY_CONNECTIONS = 12  # like NOT_CONNECTED: the daemon's limit on connections is reached
    UNKNOWN = -1  # a later version of the library has more

    @property
    def ok(self) -> bool:
        """Whether nothing went wrong so far: DONE or QUEUED."""
        return self in (Status.DONE, Status.QUEUED)

    @property
    def text(self) -> str:
        """A short description for a log line."""
        described: bytes = c.load().vesk_status_text(self.value)
        return described.decode()


_STATUSES = {status.value: status for status in Status}


def status_of(number: int) -> Status:
    return _STATUSES.get(number, Status.UNKNOWN)


class ReportingError(Exception):
    """A waiting call that has no answer. `status` and `detail` say why."""

    def __init__(self, status: Status, detail: str = "") -> None:
        super().__init__(status, detail)
        self.status = status
        self.detail = detail

    def __str__(self) -> str:
        return f"{self.status.text}: {self.detail}" if self.detail else self.status.text


class Result(Generic[Answer]):
    """The outcome of a call that has an answer."""

    def __init__(self, status: Status, answer: Optional[Answer] = None, detail: str = "") -> None:
        self.status = status
        self.answer = answer  # None unless `status` is DONE
        self.detail = detail  # the cause of a failure, if there is more to say than `status.text` does

    def get(self) -> Answer:
        """Returns the answer, or raises ReportingError if there is none."""
        if self.status is not Status.DONE:
            raise ReportingError(self.status, self.detail)
        return self.answer  # type: ignore[return-value]  # of a DONE result; may be None if Answer allows it

    def __repr__(self) -> str:
        return f"Result({self.status.name}, {self.answer!r}, {self.detail!r})"


def read_result(result: int, read: Callable[[Any, int], Answer]) -> Result[Answer]:
    """Copies a vesk_result. `read` is a function such as those below."""
    library = c.load()
    status = status_of(library.vesk_result_status(result))
    answer = read(library, result) if status is Status.DONE else None
    return Result(status, answer, library.vesk_result_detail(result).decode("utf-8", "replace"))


def read_text(library: Any, result: int) -> Optional[str]:
    text = library.vesk_result_text(result)
    return None if text is None else text.decode("utf-8", "replace")


def read_accepted(library: Any, result: int) -> bool:
    return bool(library.vesk_result_accepted(result))


def read_backends(library: Any, result: int) -> Optional[List[str]]:
    if not library.vesk_result_accepted(result):
        return None
    count = library.vesk_result_backend_count(result)
    return [library.vesk_result_backend(result, index).decode() for index in range(count)]
