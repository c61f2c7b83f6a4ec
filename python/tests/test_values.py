"""What is sent, as it arrives at the recorder."""

import datetime
import fractions

import pytest

from veskreporting import Status

UTC = datetime.timezone.utc
LONG = "ä" * 50_000  # larger than the memory that is there at first


@pytest.mark.parametrize("value", [
    None, True, False, 0, -1, 2**63 - 1, -(2**63), 2**63, 2**64 - 1, 0.5, float("inf"), "", "ünï €", LONG, b"",
    b"\0\xff", datetime.datetime(2024, 2, 29, 12, 30, tzinfo=UTC), datetime.datetime(1901, 1, 1, tzinfo=UTC), [], {},
    [1, "two", [3.0, None]], {"a": {"b": [{"c": b"d"}]}, "": 0}, {str(i): [LONG[:i], i] for i in range(600)},
], ids=lambda value: repr(value)[:20])
def test_arrives_as_it_was(session, recorder, value):
    assert session.send(3, 1, {"before": "b", "value": value, "after": 1}) is Status.QUEUED
    payload = recorder.messages[0].payload
    assert payload == {"before": "b", "value": value, "after": 1}
    assert type(payload["value"]) is type(value)
    assert list(payload) == ["before", "value", "after"]


@pytest.mark.parametrize("value, sent", [
    ((1, 2), [1, 2]), (bytearray(b"x"), b"x"), (memoryview(b"x"), b"x"), (range(3), [0, 1, 2]),
    (fractions.Fraction(1, 4), 0.25),
    (datetime.datetime(2024, 1, 1, 1, tzinfo=datetime.timezone(datetime.timedelta(hours=1))),
     datetime.datetime(2024, 1, 1, tzinfo=UTC)),
], ids=repr)
def test_is_converted(session, recorder, value, sent):
    session.send(3, 1, {"value": value})
    assert recorder.messages[0].payload == {"value": sent}


CIRCLE: list = []
CIRCLE.append(CIRCLE)


@pytest.mark.parametrize("payload, error", [
    ({"value": {1, 2}}, TypeError), ({"value": object()}, TypeError),
    ({"value": [1, datetime.date(2024, 1, 1)]}, TypeError), ({1: "value"}, TypeError), ({"a": {None: 1}}, TypeError),
    ({"value": 2**64}, ValueError),
    ({"value": -(2**63) - 1}, ValueError), ({"value": CIRCLE}, ValueError),
], ids=repr)
def test_programming_errors_raise(session, recorder, payload, error):
    for call in (session.send, session.send_and_wait):
        with pytest.raises(error):
            call(3, 1, payload)
    assert session.send(3, 1, {"still": "works"}) is Status.QUEUED
    assert [message.payload for message in recorder.messages] == [{"still": "works"}]


@pytest.mark.parametrize("value", ["\udc80", "a\0b", "x" * (1 << 20)], ids=["surrogate", "NUL", "1 MiB"])
def test_unsuitable_data_is_refused_and_counted(session, recorder, value):
    assert session.send(3, 1, {"value": value}) is Status.INVALID_ARGUMENT
    assert session.send(3, 1, {value: 1}) is Status.INVALID_ARGUMENT
    assert session.drops.invalid == session.drops.total == 2
    assert recorder.messages == []


@pytest.mark.parametrize("category, type", [(-1, 0), (65536, 0), (0, -1), (0, 65536)])
def test_numbers_of_messages_have_16_bits(session, category, type):
    with pytest.raises(ValueError):
        session.send(category, type)
