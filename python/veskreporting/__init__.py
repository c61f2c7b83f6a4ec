"""Reports through veskreportingd.

    from veskreporting import Session

    with Session(5, "Camera") as session:
        session.send(3, 1, frames=240)

docs/python.md describes the rest.
"""

from ._values import Value
from .installation import persistent_identifier, public_key, version
from .logs import VeskReportingHandler, log_to
from .results import ReportingError, Result, Status
from .session import AggregatedMessage, Drops, Options, Session

__all__ = ["AggregatedMessage", "Drops", "Options", "ReportingError", "Result", "Session", "Status", "Value",
           "VeskReportingHandler", "log_to", "persistent_identifier", "public_key", "version"]
