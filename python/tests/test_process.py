"""What concerns a whole process: its exit, its log, a missing library."""

import os
import subprocess
import sys

import pytest

PACKAGE = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))


def run(program, **environment):
    return subprocess.run([sys.executable, "-X", "dev", "-c", program], cwd=PACKAGE, timeout=60, text=True,
                          env={**os.environ, **environment}, stdout=subprocess.PIPE, stderr=subprocess.STDOUT)


PREPARED = """
import gc, logging, os, sys, threading, time
from veskreporting import Options, Session, Status, log_to
from veskreporting.testing import Recorder
nowhere = Options(socket_path="/nonexistent/socket", drain_time=0)
recorder = Recorder()
"""


@pytest.mark.parametrize("program", [
    "session = Session(5, 'Camera'); session.send(3, 1)",
    "session = Session(5, 'Camera', options=nowhere); session.send(3, 1, callback=print)",
    "session = Session(5, 'Camera'); session.itself = session; session.start(callback=lambda _: time.sleep(0.1))",
    "Session(5, 'Camera', options=nowhere).start(callback=lambda _: None); gc.collect()",
    "for i in range(30): Session(5, 'Camera', options=nowhere)",
    "s = Session(5, 'Camera', options=nowhere); s.start(); os.fork(); s.start()",
    "s = Session(5, 'Camera'); "
    "threading.Thread(target=lambda: [s.send(3, 1) for _ in iter(int, 1)], daemon=True).start()",
    "import atexit; s = Session(5, 'Camera'); atexit.register(lambda: s.send(3, 1))",
    "log_to(logging.getLogger('x')); s = Session(5, 'Camera', options=nowhere); s.send(3, 1, a=chr(0))",
    "s = Session(5, 'Camera', options=nowhere); s.send(3, 1, callback=lambda _: s.send(3, 1)); sys.exit(0)",
])
def test_a_process_ends_in_order(program):
    ended = run(PREPARED + program)
    assert ended.returncode == 0 and "rror" not in ended.stdout and "Exception" not in ended.stdout, ended.stdout


def test_a_missing_library_is_named():
    ended = run("from veskreporting import Session; Session(5, 'Camera')", VESKREPORTING_LIBRARY="/nonexistent.so")
    assert "ImportError: the library of veskreportingd can't be used: /nonexistent.so" in ended.stdout
