"""Python's logging in both directions."""

import logging
import queue

import pytest

from veskreporting import Options, Session, VeskReportingHandler, log_to


@pytest.fixture
def logger():
    logger = logging.Logger("app.camera", logging.INFO)
    yield logger
    log_to(None)


def test_records_become_messages(session, recorder, logger):
    logger.addHandler(VeskReportingHandler(session, 7, 2, logging.WARNING,
                                           fields=lambda record: {"function": record.funcName}))
    logger.info("below the level")
    logger.warning("lens %s", "blocked")
    try:
        raise KeyError("iso")
    except KeyError:
        logger.exception("bad \udc80 \0 text")
    logger.error("%d", "no number")  # reported on standard error by logging itself
    first, second = recorder.messages
    assert (first.category, first.type) == (7, 2)
    assert first.payload == {"level": "WARNING", "logger": "app.camera", "message": "lens blocked",
                             "function": "test_records_become_messages"}
    assert second.payload["message"] == "bad \\udc80 \\0 text"
    assert second.payload["exception"].endswith("KeyError: 'iso'")


def test_long_records_are_cut(session, recorder, logger):
    logger.addHandler(VeskReportingHandler(session, 7, 2))
    logger.error("x" * (2 << 20))
    assert len(recorder.messages[0].payload["message"]) == 16 * 1024


def test_the_librarys_log_goes_to_a_logger(session, recorder, logger):
    records: "queue.Queue[logging.LogRecord]" = queue.Queue()

    class Kept(logging.Handler):
        def emit(self, record):
            session.send(1, 1)  # handlers may use the library
            records.put(record)

    logger.addHandler(Kept())
    logger.addHandler(VeskReportingHandler(session, 7, 2))
    log_to(logger)
    full = Options(socket_path="/nonexistent/socket", drain_time=0, maximum_queued_messages=2)
    with Session(5, "Camera", options=full) as unconnected:
        unconnected.send(3, 1)
        record = records.get(timeout=10)
    assert record.levelno == logging.WARNING and "messages are dropped" in record.getMessage()
    log_to(None)
    assert recorder.messages and all(message.category == 1 for message in recorder.messages)  # none of the log itself
