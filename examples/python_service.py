#!/usr/bin/python3
"""A service that reports as it measures, with asyncio. Stops in order on SIGTERM and Ctrl-C.

Nothing here waits for veskreportingd. If it is away, messages wait in the session's queue, up to a limit.
Needs the package veskreporting (docs/python.md).
"""

import argparse
import asyncio
import logging
import signal

from veskreporting import Session, VeskReportingHandler

MEASUREMENTS, SERVICE = 3, 9  # categories
MEASURED, STARTED, STOPPED, LOGGED = 2, 1, 2, 3  # types

log = logging.getLogger("focus")


async def measure(session: Session, interval: float, stopped: asyncio.Event) -> None:
    """Reports measurements until the service is stopped."""
    number = 0
    while not stopped.is_set():
        # The status is worth a look only where a loss matters; `drops` counts them all.
        session.send(MEASUREMENTS, MEASURED, number=number, sharpness=0.5 + number % 10 * 0.05)
        number += 1
        try:
            await asyncio.wait_for(stopped.wait(), interval)
        except asyncio.TimeoutError:
            pass
    log.warning("stopped after %d measurements", number)


async def serve(interval: float) -> None:
    stopped = asyncio.Event()
    for number in (signal.SIGTERM, signal.SIGINT):
        asyncio.get_running_loop().add_signal_handler(number, stopped.set)

    # The user's consent and the storebag's rules for this client apply, since user info is required by default.
    # The daemon collects the events into few posts. `user_info` becomes part of every event.
    async with Session(5, "Camera", service_name="Focus", batch_events=True, user_info={"firmware": "2.4"}) as session:
        handler = VeskReportingHandler(session, SERVICE, LOGGED, logging.WARNING)
        log.addHandler(handler)
        session.send(SERVICE, STARTED, {"text": "the service started"}, realtime=True)  # does not wait for a batch
        try:
            await measure(session, interval, stopped)
        finally:
            log.removeHandler(handler)
            session.send(SERVICE, STOPPED, {"text": "the service stopped"})
    # Here the daemon has taken everything, or the time for that was up.


def main() -> None:
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("--interval", type=float, default=1.0, help="seconds between measurements (default: 1)")
    asyncio.run(serve(parser.parse_args().interval))


if __name__ == "__main__":
    main()
