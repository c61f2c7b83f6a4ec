"""The fixture for pytest."""

from typing import Iterator

import pytest

from .testing import Recorder


@pytest.fixture
def veskreporting_recorder() -> Iterator[Recorder]:
    """Records what the sessions made in this test send. No daemon is needed."""
    with Recorder() as recorder:
        yield recorder
