# SPDX-License-Identifier: BSD-2-Clause
"""Memory is refused, in turn, wherever the program asks the system for more, which is
the one way to a directory walk that cannot be started. What comes of it has to be one
of the ways in which the model's boot can do without."""

import copy
import math
from errno import ENOMEM

import pytest

from lab.carriers import boot, namespace
from lab.oracles import model
from lab.oracles.trial import call_differences, differences, fail, real
from lab.words.chosen_devices import CHOSEN
from lab.words.seen import Seen


class ListingGivenUp(Exception):
    """What the walk does then is in BootWithoutMemory."""


class BootWithoutMemory(model.Boot):

    any_error_from = math.inf  # this number of calls on

    def warn(self, form, *arguments):
        super().warn(form, *arguments)
        if len(self.kernel.calls) >= self.any_error_from:
            self.lines[-1] = self.lines[-1][0], None

    def walk(self, root, schema_of):
        try:
            return super().walk(root, schema_of)
        except ListingGivenUp:
            # fts(3) forgets the entries so far and keeps the error.
            for leave in (self.kernel.close, self.kernel.fchdir, self.kernel.close):
                leave()
            self.kernel.last_error = ENOMEM
            return ""


def a_walk_is_not_started(refused, made):
    refused.kernel.walk_error = (
        lambda path: ENOMEM if len(refused.kernel.calls) == made else None)


def a_directory_is_not_opened(refused, made):
    """After it was examined; the rest is as if that had failed."""
    refused.kernel.fault = lambda number, name, path: (
        ENOMEM if (number, name) == (made, "fstat") else None)


def a_listing_is_given_up(refused, made):
    refused.kernel.fault = raising(ListingGivenUp, refused.kernel, made)


def an_exception_is_thrown(refused, made):
    refused.kernel.fault = raising(model.Thrown, refused.kernel, made)


def the_runtime_does_without(refused, made):
    """To sort its tables for a throw, say, which leaves no more than an error."""
    refused.any_error_from = made


WAYS = {way.__name__.replace("_", " "): way for way in (
    a_walk_is_not_started, a_directory_is_not_opened, a_listing_is_given_up,
    an_exception_is_thrown, the_runtime_does_without)}


def raising(exception, kernel, made):
    """A fault that raises this, once, in place of the next call."""

    def fault(number, name, path):
        if number == made + 1:
            kernel.calls.pop()
            kernel.fault = lambda *_: None
            kernel.last_error = ENOMEM
            raise exception

    return fault


def boot_without_memory(device, made, way):
    """Boots a device that is refused memory when this many calls were made."""
    kernel = model.Kernel(device)
    refused = BootWithoutMemory(kernel)
    way(refused, made)
    try:
        refused.run()
        ending = "exit 0"
    except model.Thrown:
        ending = "abort"
    except ListingGivenUp:
        ending = "no listing to give up"
    return model.Outcome(kernel, refused.lines, ending)


def refusals(command):
    """The options that refuse a program memory, in turn, at each of its requests from
    its first look at the device on. Without a reserve it makes one for a few pages."""
    options = ["-E", "MALLOC_TOP_PAD_=0", "-e", f"trace={boot.TRACED},brk,mmap"]
    boot.traced(*options, command=command)
    undisturbed = list(boot.calls())
    start = boot.beginning(undisturbed)
    # A loader may have mapped what it loaded. brk(2) itself never fails: it returns
    # where the heap ends.
    mapped = sum(call.call == "mmap" for call in undisturbed[:start])
    options += boot.failing("mmap", ENOMEM, f"{mapped + 1}+")
    return [options + boot.inject("brk", "retval=0", call.number)
            for call in undisturbed[start:] if call.call == "brk"]


@pytest.mark.parametrize("name", CHOSEN)
def test_memory_is_refused(name, count):
    real(name)
    for options in refusals([boot.PROGRAM]):
        count("refusals of memory")
        count(f"refusals after which {refuse(name, options)}")


def refuse(name, options):
    """The way in which the boot did without."""
    built, before = real(name)
    booted = boot.traced(*options)
    seen = Seen(before, namespace.look(), *booted, list(boot.calls()))
    refused = [index for index, call in enumerate(seen.calls) if call.injected]
    assert [seen.calls[index].call for index in refused[:2]] == ["brk", "mmap"]
    made = len(boot.pass_of(seen.calls[:refused[0]]))
    attempts = []
    for title, way in WAYS.items():
        device = copy.deepcopy(built)
        nodes = dict(device.everything())
        outcome = boot_without_memory(device, made, way)
        outcome.failed = []
        calls = [call._replace(injected=False) for call in boot.pass_of(seen.calls)]
        found = (differences(device, nodes, outcome, seen) +
                 call_differences(outcome, calls))
        if not found:
            return title
        attempts += [f"if {title}:"] + found
    return fail(f"memory refused with {options[-1]}", attempts, before)
