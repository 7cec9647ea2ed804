# SPDX-License-Identifier: BSD-2-Clause
"""What marlin-status says on a running device is what the next boot does."""

from lab.words import lines
from lab.words.device import sound_device
from lab.words.paths import RECORD, ZONEINFO, update_path

UPDATE = "2024a.1.0"
ASK = """
marlin-status --check >/run/said 2>&1
say "told status $?"
while read -r line; do say "told $line"; done </run/said
"""


def test_an_update_and_then_nothing(machine):
    here = machine("status")
    device = sound_device()
    device.install_update(UPDATE)
    here.build(device)
    before = here.look()
    console = here.boot(script=ASK)
    assert console.told == ["status 0"]
    assert here.look() == before

    console = here.boot(then=lambda: device.announce(UPDATE), script=ASK)
    assert console.told == [
        "status 1", f"update: {UPDATE} is activated: newer than 2023c.1.0",
        f"record: the change is recorded: 2023c.1.0_{UPDATE}"]
    assert here.look()[ZONEINFO].text == "/usr/share/zoneinfo.default"

    console = here.boot(script=ASK)
    assert console.booted() == ("exit 0", "")
    seen = here.look()
    assert seen[ZONEINFO].text == f"{update_path(UPDATE)}/zoneinfo"
    assert seen[RECORD].text == f"2023c.1.0_{UPDATE}"
    # It is announced still, and in use.
    assert console.told == ["status 0"]
    console = here.boot()
    assert lines.NOT_NEWER % (UPDATE, UPDATE) in console.booted().log
