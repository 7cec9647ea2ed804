# SPDX-License-Identifier: BSD-2-Clause
"""What pytest needs to run trials: workers on private devices, quick runs, the command
that runs a failing trial alone, and the figures at the end."""

import collections
import os
import shlex
import sys

import pytest

sys.path.insert(0, os.path.dirname(os.path.dirname(os.path.abspath(__file__))))

from lab.carriers import namespace  # noqa: E402
from lab.places import BUILD  # noqa: E402

TALLY = collections.Counter()
os.environ["PYTEST_CACHE"] = str(BUILD / "prove" / "pytest")  # for pytest.ini


def pytest_addoption(parser):
    parser.addoption("--quick", action="store_true", help="a sample of each table")
    parser.addoption("--states", type=int, metavar="N", help="so many random devices")
    parser.addoption("--seed", default="1", help="other random devices")
    parser.addoption("--state", metavar="SEED/N", help="one of the random devices")


def pytest_sessionstart(session):
    if namespace.INSIDE in os.environ:
        os.umask(0o022)
        os.chdir("/")


@pytest.fixture
def count(request):
    """count(title, n=1) adds to a figure that is printed at the end."""
    tally = collections.Counter()
    yield lambda title, n=1: tally.update({title: n})
    request.node.user_properties.extend(tally.items())


@pytest.hookimpl(hookwrapper=True)
def pytest_runtest_makereport(item, call):
    report = (yield).get_result()
    if report.failed:
        report.sections.append(("Alone", "scripts/prove " + shlex.quote(report.nodeid)))


def pytest_runtest_logreport(report):
    if report.when == "call" and report.passed:
        TALLY[report.nodeid.partition("[")[0].partition("::")[2]] += 1
    if report.when == "teardown":
        for title, number in report.user_properties:
            TALLY[title] += number


def pytest_terminal_summary(terminalreporter):
    for title, number in sorted(TALLY.items()):
        title = title.removeprefix("test_").replace("_", " ")
        terminalreporter.line(f"{number:8} {title}")
