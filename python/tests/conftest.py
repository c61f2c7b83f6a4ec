import pytest

from veskreporting import Session
from veskreporting.pytest_plugin import veskreporting_recorder as recorder  # noqa: F401


@pytest.fixture
def session(recorder):  # noqa: F811
    with Session(5, "Camera") as session:
        yield session
