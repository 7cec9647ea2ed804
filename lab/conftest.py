# SPDX-License-Identifier: BSD-2-Clause
"""What pytest needs to run trials: workers on private devices, quick runs, the command
that runs a failing trial alone, and the figures at the end."""

import collections
import os
import shlex
import sys

import hypothesis
import pytest

sys.path.insert(0, os.path.dirname(os.path.dirname(os.path.abspath(__file__))))

from lab.carriers import namespace  # noqa: E402
from lab.oracles import properties  # noqa: E402
from lab.words import chosen_devices  # noqa: E402
from lab.words.places import BUILD  # noqa: E402

TALLY = {}
PAIR = ", then "  # in the title of two kinds of events that met
REASON = "marlin-status said: "  # before a reason; of them only their number is shown
# Of tests that scripts/prove cannot run.
DOORS = {"lab/arm64_device/": "device --tests",
         "lab/proofs/cuts": "device --tests", "lab/debian_systems/": "device --systems",
         "lab/proofs/readers": "readers", "lab/proofs/recipe": "readers",
         "lab/proofs/image": "readers --image"}
os.environ["PYTEST_CACHE"] = str(BUILD / "prove" / "pytest")  # for pytest.ini


def added_up(figures):
    sums = collections.Counter()
    for title, number in figures:
        sums[title] = (max if title.startswith("most ") else sum)((sums[title], number))
    return sums


def pytest_addoption(parser):
    parser.addoption("--quick", action="store_true", help="a sample of each table")
    parser.addoption("--states", type=int, metavar="N", help="so many random devices")
    parser.addoption("--seed", default="1", help="other random devices")
    parser.addoption("--state", metavar="SEED/N", help="one of the random devices")
    parser.addoption("--unshrunk", action="store_true",
                     help="tells of the first life that fails, not the shortest")
    parser.addoption("--story", help="events, with \";\" between them")
    parser.addoption("--preset", action="append", metavar="NAME",
                     help="the package of this preset; may be repeated")


def pytest_configure(config):
    config.addinivalue_line(
        "markers", "cases(names, table, quick=1): table(option) gives the cases of a "
        "run, and --quick takes every so-manieth; option gives the value of an option")
    hypothesis.settings.register_profile(
        "run", max_examples=300 if config.getoption("quick") else 3000, deadline=None,
        database=None, suppress_health_check=list(hypothesis.HealthCheck),
        phases=[phase for phase in hypothesis.Phase if phase != hypothesis.Phase.shrink
                or not config.getoption("unshrunk")])
    hypothesis.settings.load_profile("run")


def pytest_generate_tests(metafunc):
    for mark in metafunc.definition.iter_markers("cases"):
        (names, table), option = mark.args, metafunc.config.getoption
        every = mark.kwargs.get("quick", 1) if option("quick") else 1
        metafunc.parametrize(names, list(table(option))[::every])


def pytest_sessionstart(session):
    if namespace.INSIDE in os.environ:
        os.umask(0o022)
        os.chdir("/")


@pytest.fixture
def count(request):
    """count(title, n=1) adds to a figure that is printed at the end; of a "most ..."
    the greatest counts."""
    tally = []
    yield lambda title, n=1: tally.append((title, n))
    request.node.user_properties.extend(added_up(tally).items())


@pytest.hookimpl(hookwrapper=True)
def pytest_runtest_makereport(item, call):
    report = (yield).get_result()
    if report.failed:
        door = next((door for part, door in DOORS.items() if part in report.nodeid),
                    "prove")
        report.sections.append(
            ("Alone", f"scripts/{door} {shlex.quote(report.nodeid)}"))


def pytest_runtest_logreport(report):
    if report.when == "call" and report.passed:
        name = report.nodeid.partition("[")[0].partition("::")[2]
        TALLY[name] = TALLY.get(name, 0) + 1
    if report.when == "teardown":
        TALLY.update(added_up([*TALLY.items(), *report.user_properties]))


def never_seen() -> list[str]:
    """What a run of this size has to have met, and has not."""
    wanted = []
    if TALLY.get("test_a_kill", 0) >= 1500:
        # Not above: pytest explains only asserts of what it imports itself.
        from lab.proofs.windows import WINDOWS
        wanted += [f"kills leave {window}" for window in WINDOWS]
    if TALLY.get("test_a_kill_of_the_installer", 0) >= 600:
        wanted += ["kills that leave the new update announced",
                   "kills that leave the old announcement"]
    if TALLY.get("states", 0) >= 2000:
        wanted += [f"of them: {outcome}" for outcome in properties.OUTCOMES]
    if TALLY.get("refusals of memory", 0) >= len(chosen_devices.CHOSEN):
        wanted.append("refusals of memory to a walk")
    if TALLY.get("events", 0) >= 50_000:
        from lab.proofs.life import EVENTS
        wanted += [one + PAIR + other for one in EVENTS for other in EVENTS]
    if TALLY.get("devices asked about", 0) >= 20_000:
        from lab.oracles.status import OF_STORAGE, REASONS
        wanted += [REASON + reason for reason in REASONS - OF_STORAGE]
    return [title for title in wanted if not TALLY.get(title)]


@pytest.hookimpl(tryfirst=True)
def pytest_sessionfinish(session):
    if never_seen() and not session.exitstatus:
        session.exitstatus = 1


@pytest.hookimpl(trylast=True)
def pytest_terminal_summary(terminalreporter):
    for title in never_seen():
        terminalreporter.line(f"FAILED: never seen: {title}")
    shown = {title: number for title, number in TALLY.items()
             if PAIR not in title and not title.startswith(REASON)}
    if reasons := sum(title.startswith(REASON) for title in TALLY):
        shown["reasons of marlin-status that were met"] = reasons
    terminalreporter.line("figures: " + "; ".join(
        f"{title.removeprefix('test_').replace('_', ' ')}: {number}"
        for title, number in shown.items()))
