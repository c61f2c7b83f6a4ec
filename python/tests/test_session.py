"""Calls and callbacks of sessions, against the recorder."""

import asyncio
import gc
import os
import threading

import pytest

from veskreporting import Options, ReportingError, Session, Status, persistent_identifier, version
from veskreporting.testing import Call, Recorder

NOWHERE = Options(socket_path="/nonexistent/socket", drain_time=0)


def test_making_a_session_configures_and_starts_it(recorder):
    with Session(5, "Camera", service_name="Clips", session_id=9, client_version=2, batch_events=True,
                 user_info={"firmware": "2.4", "clientName": "another"}) as session:
        assert session.send(3, 1, {"lens": "wide"}, frames=240) is Status.QUEUED
        assert session.is_connected
    calls = recorder.calls
    assert [call.call for call in calls] == [Call.CONFIGURE, Call.START, Call.MESSAGE]
    assert (calls[2].category, calls[2].type, calls[2].payload) == (3, 1, {"lens": "wide", "frames": 240})
    assert calls[2].session_info == {"sessionID": 9, "clientType": 5, "clientVersion": 2, "requireUserInfo": True,
                                     "batchEvent": True}
    assert calls[2].user_info == {"firmware": "2.4", "clientName": "Camera", "serviceName": "Clips"}


def test_every_call_in_every_form(session, recorder, tmp_path):
    file = tmp_path / "dump"
    file.write_text("x")
    info = {"clientType": 6, "sessionID": 1, "requireUserInfo": True}
    operations = [("start", (), Call.START, ["httpPost"]), ("flush", (), Call.FLUSH, None),
                  ("send", (3, 1, {"a": 1}), Call.MESSAGE, None), ("upload_file", (file,), Call.FILE, True),
                  ("upload_log_data", ([1, {"b": 2}],), Call.LOG_DATA, True),
                  ("send_once", (info, {"clientName": "C"}, 4, 2, {"c": 3}), Call.MESSAGE, "finished")]
    for name, arguments, call, answer in operations:
        recorder.clear()
        results: list = []
        arrived = threading.Event()

        def callback(result):
            results.append(result)
            arrived.set()

        assert getattr(session, name)(*arguments) is Status.QUEUED
        assert getattr(session, name)(*arguments, callback=callback) is Status.QUEUED
        assert arrived.wait(10)
        assert results[0].status is Status.DONE and results[0].get() == answer
        assert getattr(session, name + "_and_wait")(*arguments) == answer
        assert asyncio.run(getattr(session, "a" + name)(*arguments)) == answer
        assert recorder.count(call) == 4 and len({repr(recorded) for recorded in recorder.calls}) == 1
        if name == "send_once":
            assert recorder.calls[0].session_info == info and recorder.calls[0].user_info == {"clientName": "C"}
        if call is Call.FILE:
            assert recorder.calls[0].path == str(file)
        if call is Call.LOG_DATA:
            assert recorder.calls[0].log_data == [1, {"b": 2}]


@pytest.mark.parametrize("realtime, override", [(True, False), (False, True), (True, True)])
def test_flags(session, recorder, realtime, override):
    session.send(3, 1, {"a": 1}, realtime=realtime, override_sampling=override)
    message, = recorder.messages
    assert (message.realtime, message.override_sampling, message.payload) == (realtime, override, {"a": 1})


def test_states_and_user_info(session, recorder):
    recorder.set_backends(["httpPost", "dashboard"])
    session.set_user_info({"firmware": "3"})
    assert session.states_and_wait() == ["httpPost", "dashboard"]
    assert recorder.calls[-1].user_info == {"clientName": "Camera", "firmware": "3"}
    recorder.set_backends([])
    assert asyncio.run(session.astates()) == []
    recorder.set_backends(None)
    assert session.start_and_wait() is None
    assert session.display_url_and_wait() == "URL not available"


@pytest.mark.parametrize("arguments, error", [
    ({"client_name": ""}, ValueError), ({"session_id": -1}, ValueError), ({"client_version": 1 << 16}, ValueError),
    ({"session_id": "1"}, TypeError), ({"user_info": {"a": {1}}}, TypeError), ({"user_info": {"a": "\0"}}, ValueError),
])
def test_wrong_arguments_of_a_session(recorder, arguments, error):
    with pytest.raises(error):
        Session(**{"client_type": 5, "client_name": "Camera", **arguments})
    assert recorder.calls == []


def test_wrong_arguments_of_calls(session, tmp_path):
    with pytest.raises(TypeError):
        session.send(3, 1, callback="field")
    with pytest.raises(ValueError):
        session.upload_file("a\0b")
    assert session.upload_file(tmp_path / "none") is Status.FILE_UNAVAILABLE
    with pytest.raises(ReportingError) as failure:
        session.upload_file_and_wait(tmp_path)
    assert failure.value.status is Status.FILE_UNAVAILABLE and str(failure.value) == "the file can't be opened"


def test_without_a_daemon_calls_wait_up_to_the_limit():
    options = Options(socket_path="/nonexistent/socket", drain_time=0, maximum_queued_messages=10)
    with Session(5, "Camera", options=options) as session:
        statuses = [session.send(3, 1) for _ in range(12)]
        assert set(statuses[:8]) == {Status.QUEUED} and set(statuses[8:]) == {Status.QUEUE_FULL}
        assert session.drops.queue_full == 4 and not session.is_connected


def test_without_a_daemon_waiting_calls_raise():
    with Session(5, "Camera", options=NOWHERE) as session:
        for wait in (lambda: session.send_and_wait(3, 1, timeout=0.01),
                     lambda: asyncio.run(session.asend(3, 1, timeout=0.01))):
            with pytest.raises(ReportingError) as failure:
                wait()
            assert failure.value.status is Status.NOT_CONNECTED and "/nonexistent/socket" in str(failure.value)


def test_closing_ends_calls(recorder):
    results: list = []
    session = Session(5, "Camera", options=NOWHERE)
    session.send(3, 1, callback=results.append)
    session.close()
    session.close()
    assert [result.status for result in results] == [Status.CLOSED]
    assert session.send(3, 1) is Status.CLOSED and session.drops.total == 0 and not session.is_connected
    with pytest.raises(ReportingError):
        results[0].get()
    with pytest.raises(ReportingError):
        session.flush_and_wait()


def test_closing_again_leaves_other_sessions_alone(recorder):
    closed = [Session(5, "Camera", options=NOWHERE) for _ in range(5)]
    for session in closed:
        session.close()
    others = [Session(5, "Camera") for _ in range(5)]  # usually at the same addresses
    for session in closed:
        session.close()
    assert {other.send(3, 1) for other in others} == {Status.QUEUED}


def test_threads_may_send_while_the_session_is_closed(recorder):
    session = Session(5, "Camera", options=NOWHERE)
    sent = threading.Barrier(5)
    seen = []

    def send_until_closed():
        sent.wait()
        while (status := session.send(3, 1, a=[1, {"b": "c"}])) is not Status.CLOSED:
            seen.append(status)

    threads = [threading.Thread(target=send_until_closed) for _ in range(4)]
    for thread in threads:
        thread.start()
    sent.wait()
    session.close()
    for thread in threads:
        thread.join()
    assert set(seen) <= {Status.QUEUED, Status.QUEUE_FULL}


def test_callbacks_may_send_but_not_wait_or_close(session, recorder):
    outcomes: list = []
    arrived = threading.Event()

    def callback(result):
        outcomes.append(session.send(3, 2))
        for refused in (session.flush_and_wait, session.close):
            try:
                refused()
            except ReportingError as error:
                outcomes.append(error.status)
        arrived.set()

    session.send(3, 1, callback=callback)
    assert arrived.wait(10)
    assert outcomes == [Status.QUEUED, Status.ON_SESSION_THREAD, Status.ON_SESSION_THREAD]


def test_exceptions_of_callbacks_go_to_the_hook(session, monkeypatch):
    caught: list = []
    hooked = threading.Event()
    monkeypatch.setattr("sys.unraisablehook", lambda seen: (caught.append(repr(seen.exc_value)), hooked.set()))

    def callback(result):
        raise RuntimeError("of the callback")

    session.send(3, 1, callback=callback)
    assert hooked.wait(10) and caught == ["RuntimeError('of the callback')"]
    assert session.send_and_wait(3, 1) is None


def test_awaiting(recorder):
    async def report():
        async with Session(5, "Camera") as session:
            await asyncio.gather(*(session.asend(3, 1, number=number) for number in range(50)))
            task = asyncio.ensure_future(session.aflush())
            await asyncio.sleep(0)
            task.cancel()
            with pytest.raises(asyncio.CancelledError):
                await task
            return session

    assert asyncio.run(report()).send(3, 1) is Status.CLOSED
    assert sorted(message.payload["number"] for message in recorder.messages) == list(range(50))


def test_results_for_a_closed_loop_are_ignored():
    session = Session(5, "Camera", options=NOWHERE)
    loop = asyncio.new_event_loop()
    awaited = loop.create_task(session.asend(3, 1))
    loop.run_until_complete(asyncio.sleep(0))
    awaited.cancel()
    loop.run_until_complete(asyncio.gather(awaited, return_exceptions=True))
    loop.close()
    session.close()  # delivers the result


def test_a_collected_session_is_closed():
    closed = threading.Event()
    session = Session(5, "Camera", options=NOWHERE)
    session.send(3, 1, callback=lambda result: result.status is Status.CLOSED and closed.set())
    del session
    gc.collect()
    assert closed.wait(10)


def test_a_forked_process_is_refused(session):
    child = os.fork()
    if child == 0:
        os._exit(0 if session.send(3, 1) is Status.FORKED_PROCESS else 1)
    assert os.waitpid(child, 0)[1] == 0
    assert session.send(3, 1) is Status.QUEUED


def test_the_recorder_closes_its_sessions():
    with Recorder() as recorder:
        session = Session(5, "Camera")
    assert session.send(3, 1) is Status.CLOSED and recorder.calls == []


def test_the_installation():
    assert version()
    assert len(persistent_identifier()) == len(persistent_identifier(False)) == 36
