"""What a session can ask the daemon for."""

import operator
import os
from typing import Any, Mapping, Optional, Sequence, Union

from ._calls import Call
from ._values import Value, Views
from .results import read_accepted, read_backends, read_text

Payload = Optional[Mapping[str, Value]]
Path = Union[str, "os.PathLike[str]"]

_REALTIME, _OVERRIDE_SAMPLING = 1, 2

START = Call(lambda library, session, completion: library.vesk_session_start(session, completion), read_backends)
FLUSH = Call(lambda library, session, completion: library.vesk_session_flush(session, completion), read_text)
DISPLAY_URL = Call(
    lambda library, session, completion: library.vesk_session_fetch_display_url(session, completion), read_text)


def states(user_info: Payload) -> "Call[Optional[list[str]]]":
    def post(library: Any, session: Optional[int], completion: Any) -> int:
        with Views.borrow() as views:
            return library.vesk_session_fetch_states(session, views.dictionary(user_info), completion)

    return Call(post, read_backends)


def message(category: int, type: int, payload: Payload, fields: Mapping[str, Value], realtime: bool,
            override_sampling: bool) -> Call[Optional[str]]:
    _check_message(category, type)
    if payload is not None and fields:
        payload = {**payload, **fields}
    elif fields:
        payload = fields
    if realtime or override_sampling:
        flag = (_REALTIME if realtime else 0) | (_OVERRIDE_SAMPLING if override_sampling else 0)
        return _message_with_flag(category, type, payload, flag)

    def post(library: Any, session: Optional[int], completion: Any) -> int:
        with Views.borrow() as views:
            return library.vesk_session_send(session, category, type, views.dictionary(payload), completion)

    return Call(post, read_text)


def _message_with_flag(category: int, type: int, payload: Payload, flag: int) -> Call[Optional[str]]:
    parameters = {"category": category, "type": type, "payload": payload, "flag": flag}
    if payload is None:
        del parameters["payload"]

    def post(library: Any, session: Optional[int], completion: Any) -> int:
        with Views.borrow() as views:
            return library.vesk_session_send_parameters(session, views.dictionary(parameters), completion)

    return Call(post, read_text)


def file(path: Path) -> Call[bool]:
    name = os.fsencode(path)
    if b"\0" in name:
        raise ValueError("a path has no NULs")
    return Call(lambda library, session, completion: library.vesk_session_upload_file(session, name, completion),
                read_accepted)


def log_data(values: Sequence[Value]) -> Call[bool]:
    def post(library: Any, session: Optional[int], completion: Any) -> int:
        with Views.borrow() as views:
            return library.vesk_session_upload_log_data(session, views.list_of(values), completion)

    return Call(post, read_accepted)


def once(session_info: Mapping[str, Value], user_info: Payload, category: int, type: int,
         payload: Payload) -> Call[Optional[str]]:
    _check_message(category, type)

    def post(library: Any, session: Optional[int], completion: Any) -> int:
        with Views.borrow() as views:
            return library.vesk_session_send_once(session, views.dictionary(session_info), views.dictionary(user_info),
                                                  category, type, views.dictionary(payload), completion)

    return Call(post, read_text)


def _check_message(category: int, type: int) -> None:
    checked("category", category, 0, 0xFFFF)
    checked("type", type, 0, 0xFFFF)


def checked(name: str, number: int, least: int, most: int) -> int:
    if not least <= operator.index(number) <= most:
        raise ValueError(f"{name} is {number}, not {least} to {most}")
    return number
