"""Writes Python values as views for the library, and reads views."""

import ctypes
import datetime
import numbers
import struct
from collections.abc import Mapping, Sequence
from typing import Any, Dict, List, Optional, Union

from . import _library as c

Value = Union[None, bool, int, float, str, bytes, datetime.datetime, Sequence["Value"], Mapping[str, "Value"]]

_EPOCH = datetime.datetime(1970, 1, 1, tzinfo=datetime.timezone.utc)
_MAXIMUM_DEPTH = 64  # of the library; also ends the walk through a list that contains itself

_ENTRY, _VALUE = ctypes.sizeof(c.EntryView), ctypes.sizeof(c.ValueView)
_VALUE_IN_ENTRY = c.EntryView.value.offset
# What is written at the offset of a ValueView: the kind and a member of the union.
_START = f"@I{c.ValueView.content.offset - ctypes.sizeof(ctypes.c_uint32)}x"
_put_boolean = struct.Struct(_START + "i").pack_into
_put_signed = struct.Struct(_START + "q").pack_into
_put_unsigned = struct.Struct(_START + "Q").pack_into
_put_double = struct.Struct(_START + "d").pack_into
_put_array = struct.Struct(_START + "PN").pack_into  # text, bytes, list, dictionary
_put_view = struct.Struct("@PN").pack_into


class _Block:
    """Memory that stays where it is."""

    def __init__(self, size: int) -> None:
        self.size = size
        self.bytes = bytearray(size)
        self._pinned = ctypes.c_char.from_buffer(self.bytes)
        self.address = ctypes.addressof(self._pinned)


class Views:
    """Views for one call, which are valid until the end of a `with` statement.

    A value of a type that can't be sent raises TypeError, an integer beyond 64 bits or deep nesting ValueError.
    Text that is not valid is written as it is: the library refuses it and counts the loss.
    """

    _FIRST_SIZE = 16 * 1024
    _unused: List["Views"] = []  # making blocks costs more than writing a payload

    def __init__(self) -> None:
        self._first = self._block = _Block(self._FIRST_SIZE)
        self._further: List[_Block] = []
        self._used = 0

    @classmethod
    def borrow(cls) -> "Views":
        try:
            return cls._unused.pop()
        except IndexError:
            return cls()

    def __enter__(self) -> "Views":
        return self

    def __exit__(self, *_: object) -> None:
        self._block = self._first
        self._further.clear()
        self._used = 0
        self._unused.append(self)

    def dictionary(self, mapping: Optional[Mapping[str, Any]]) -> Optional[int]:
        """The address of a VeskDictionaryView; None for None."""
        if mapping is None:
            return None
        return self._view(*self._entries(mapping, 1))

    def list_of(self, values: Sequence[Any]) -> int:
        """The address of a VeskListView."""
        return self._view(*self._values(values, 1))

    def _view(self, address: int, count: int) -> int:
        at = self._reserve(ctypes.sizeof(c.DictionaryView))
        _put_view(self._block.bytes, at, address, count)
        return self._block.address + at

    def _reserve(self, size: int) -> int:
        """Returns the offset of unused bytes, aligned for views, in the current block."""
        at = (self._used + 7) & -8
        if at + size > self._block.size:
            self._block = _Block(max(size, 2 * self._block.size))
            self._further.append(self._block)
            at = 0
        self._used = at + size
        return at

    def _copy(self, data: bytes) -> int:
        block, at = self._block, self._used
        end = at + len(data)
        if end > block.size:
            at = self._reserve(len(data))
            block, end = self._block, self._used
        self._used = end
        block.bytes[at:end] = data
        return block.address + at

    def _entries(self, mapping: Mapping[str, Any], depth: int) -> "tuple[int, int]":
        items = [*mapping.items()]
        begin = at = self._reserve(len(items) * _ENTRY)
        block = self._block  # values may need further ones
        for key, value in items:
            if not isinstance(key, str):
                raise TypeError(f"a key must be text, not {type(key).__name__}")
            data = _encoded(key)
            _put_view(block.bytes, at, self._copy(data), len(data))
            self._put(block.bytes, at + _VALUE_IN_ENTRY, value, depth)
            at += _ENTRY
        return block.address + begin, len(items)

    def _values(self, values: Sequence[Any], depth: int) -> "tuple[int, int]":
        values = [*values]
        begin = at = self._reserve(len(values) * _VALUE)
        block = self._block
        for value in values:
            self._put(block.bytes, at, value, depth)
            at += _VALUE
        return block.address + begin, len(values)

    def _put(self, memory: bytearray, at: int, value: Any, depth: int) -> None:
        if isinstance(value, str):
            data = _encoded(value)
            _put_array(memory, at, c.TEXT, self._copy(data), len(data))
        elif isinstance(value, bool):
            _put_boolean(memory, at, c.BOOLEAN, value)
        elif isinstance(value, int):
            _put_integer(memory, at, value)
        elif isinstance(value, float):
            _put_double(memory, at, c.DOUBLE, value)
        elif value is None:
            _put_boolean(memory, at, c.NONE, 0)
        elif isinstance(value, (bytes, bytearray, memoryview)):
            data = bytes(value)
            _put_array(memory, at, c.BYTES, self._copy(data), len(data))
        elif isinstance(value, datetime.datetime):
            _put_double(memory, at, c.DATE, value.timestamp())
        elif isinstance(value, (Mapping, Sequence)):
            if depth == _MAXIMUM_DEPTH:
                raise ValueError(f"lists and dictionaries are nested more than {_MAXIMUM_DEPTH} levels deep")
            if isinstance(value, Mapping):
                _put_array(memory, at, c.DICTIONARY, *self._entries(value, depth + 1))
            else:
                _put_array(memory, at, c.LIST, *self._values(value, depth + 1))
        elif isinstance(value, numbers.Integral):  # of other libraries
            _put_integer(memory, at, int(value))
        elif isinstance(value, numbers.Real):
            _put_double(memory, at, c.DOUBLE, float(value))
        else:
            raise TypeError(f"a value of type {type(value).__name__} can't be sent")


def _put_integer(memory: bytearray, at: int, value: int) -> None:
    if -(1 << 63) <= value < 1 << 63:
        _put_signed(memory, at, c.SIGNED, value)
    elif 0 <= value < 1 << 64:
        _put_unsigned(memory, at, c.UNSIGNED, value)
    else:
        raise ValueError("an integer has more than 64 bits")


def _encoded(text: str) -> bytes:
    try:
        return text.encode()
    except UnicodeEncodeError:
        return text.encode("utf-8", "surrogatepass")


def read_dictionary(address: Optional[int]) -> Optional[Dict[str, Any]]:
    """A copy of the VeskDictionaryView at that address; None for None."""
    return _read_entries(c.DictionaryView.from_address(address)) if address else None


def read_list(address: Optional[int]) -> Optional[List[Any]]:
    """A copy of the VeskListView at that address; None for None."""
    return _read_values(c.ListView.from_address(address)) if address else None


def _read_entries(view: c.DictionaryView) -> Dict[str, Any]:
    entries = (c.EntryView.from_address(view.entries + i * _ENTRY) for i in range(view.count))
    return {_text(entry.key): _read(entry.value) for entry in entries if entry.value.kind <= c.DICTIONARY}


def _read_values(view: c.ListView) -> List[Any]:
    values = (c.ValueView.from_address(view.values + i * _VALUE) for i in range(view.count))
    return [_read(value) for value in values if value.kind <= c.DICTIONARY]


def _text(view: c.TextView) -> str:
    return ctypes.string_at(view.data, view.length).decode() if view.length else ""


def _read(view: c.ValueView) -> Any:
    content = view.content
    if view.kind == c.BOOLEAN:
        return content.boolean != 0
    if view.kind == c.SIGNED:
        return content.signed
    if view.kind == c.UNSIGNED:
        return content.unsigned
    if view.kind == c.DOUBLE:
        return content.real
    if view.kind == c.TEXT:
        return _text(content.text)
    if view.kind == c.BYTES:
        return ctypes.string_at(content.text.data, content.text.length) if content.text.length else b""
    if view.kind == c.DATE:
        return _date(content.real)
    if view.kind == c.LIST:
        return _read_values(content.list)
    if view.kind == c.DICTIONARY:
        return _read_entries(content.dictionary)
    return None


def _date(seconds: float) -> Union[datetime.datetime, float]:
    try:
        return _EPOCH + datetime.timedelta(seconds=seconds)
    except (OverflowError, ValueError):
        return seconds  # before the year 1, after 9999, or no number
