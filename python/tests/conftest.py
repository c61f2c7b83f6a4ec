import pytest

from veskreporting import Session

try:
    import importlib.metadata

    importlib.metadata.distribution("veskreporting")  # an installed package brings the fixture itself
except importlib.metadata.PackageNotFoundError:
    pytest_plugins = ["veskreporting.pytest_plugin"]


@pytest.fixture
def recorder(veskreporting_recorder):
    return veskreporting_recorder


@pytest.fixture
def session(recorder):
    with Session(5, "Camera") as session:
        yield session
