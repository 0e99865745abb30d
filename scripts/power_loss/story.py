"""What the programs do while the disk is recorded, and what must hold after each step.

Steps are run in order. One that ends with status 0 is acknowledged: its mark goes into the log of
writes. What is not a step of the programs (counters of the kernel that grow, events that it queues)
is synced with everything else, as it does not depend on the disk in a real device.
"""
from __future__ import annotations

import dataclasses
import datetime
import plistlib
import re
import shlex
import struct
import subprocess

DAY = 20516  # 2026-03-04
QUEUE = "var/db/kernel/kern.next_ecc_event"
USAGE = "var/db/vigil/usage.plist"
WHITELIST = "Library/Application Support/TallyLedger/Whitelist_Zed.plist"
PREFERENCE = ("nuvex.story", "answer")

Key = tuple[int, str]  # day, key


@dataclasses.dataclass
class Step:
    name: str
    at: int  # seconds since 1970, in the guest
    shell: str
    adds: dict[Key, int] = dataclasses.field(default_factory=dict)
    values: dict[Key, list[float]] = dataclasses.field(default_factory=dict)
    preference: int | None = None
    events: list[int] = dataclasses.field(default_factory=list)
    usage: int | None = None  # KB in all, from now on
    gated_pass: bool = False
    enables: bool | None = None  # what becomes of the owner's consent
    drops: bool = False  # the counters so far


@dataclasses.dataclass
class State:
    """What a number of acknowledged steps adds up to."""
    scalars: dict[Key, int] = dataclasses.field(default_factory=dict)
    values: dict[Key, int] = dataclasses.field(default_factory=dict)
    preference: int | None = None
    events: set[int] = dataclasses.field(default_factory=set)
    usage: int = 0
    uncounted_usage: int = 0
    enabled: bool = False
    passes: set[int] = dataclasses.field(default_factory=set)

    def after(self, step: Step) -> State:
        new = State(dict(self.scalars), dict(self.values), self.preference, set(self.events),
                    self.usage, self.uncounted_usage, self.enabled, set(self.passes))
        if step.drops:
            new.scalars, new.values, new.uncounted_usage = {}, {}, self.usage
        for key, amount in step.adds.items():
            new.scalars[key] = new.scalars.get(key, 0) + amount
        for key, values in step.values.items():
            new.values[key] = new.values.get(key, 0) + len(values)
        new.preference = self.preference if step.preference is None else step.preference
        new.usage = self.usage if step.usage is None else step.usage
        new.enabled = self.enabled if step.enables is None else step.enables
        new.events |= set(step.events)
        if step.gated_pass:
            new.passes.add(step.at // 86400)
        return new


def usage_list(kilobytes: int) -> bytes:
    since = datetime.datetime.fromtimestamp(DAY * 86400, datetime.timezone.utc).replace(tzinfo=None)
    return plistlib.dumps([{"procName": "story", "since": since, "wifiInBytes": kilobytes * 1024,
                            "wifiOutBytes": 0, "wwanInBytes": 0, "wwanOutBytes": 0}])


def whitelist() -> bytes:
    names = {"nuvex.story.": {}, "datausage.": {}}
    return plistlib.dumps({"Story": {"ScalarKeyPrefixes": names,
                                     "DistributionKeyPrefixes": {"nuvex.storydist.": {}}}})


def event(number: int) -> bytes:
    return struct.pack("<BB6x8Q", 7, 1, number, *[0] * 7)


def _put(path: str, data: bytes) -> str:
    """A file of the kernel's making appears whole."""
    escaped = shlex.quote("".join(f"\\{byte:03o}" for byte in data))
    quoted = shlex.quote(path)
    return (f'mkdir -p "$(dirname {quoted})" && printf {escaped} >/mnt/root/.put && '
            f"mv /mnt/root/.put {quoted}")


class _Teller:
    """Collects steps; the clock moves on by a minute with each of them."""

    def __init__(self) -> None:
        self.steps: list[Step] = []
        self.clock = DAY * 86400 + 8 * 3600

    def step(self, name: str, shell: str, **effects) -> None:
        self.clock += 60
        self.steps.append(Step(f"{len(self.steps):02d}-{name}", self.clock, shell, **effects))

    def add(self, day: int, key: str, amount: int) -> None:
        self.step("add", f"run quorletctl tally add nuvex.story.{key} {amount} --day {day}",
                  adds={(day, f"nuvex.story.{key}"): amount})

    def record(self, day: int, values: list[float]) -> None:
        words = " ".join(map(str, values))
        self.step("record", f"run quorletctl tally record nuvex.storydist.t {words} --day {day}",
                  values={(day, "nuvex.storydist.t"): values})

    def load(self, day: int, count: int) -> None:
        lines = "".join(f"scalar\\t{day}\\tnuvex.story.i{i}\\t{i + 1}\\n" for i in range(count))
        self.step("import", f"printf {shlex.quote(lines)} >/tmp/lines && "
                            "run quorletctl tally import /tmp/lines",
                  adds={(day, f"nuvex.story.i{i}"): i + 1 for i in range(count)})

    def prefer(self, value: int) -> None:
        self.step("prefs", f"run quorletctl prefs set {' '.join(PREFERENCE)} {value}",
                  preference=value)

    def world(self, events: list[int], usage: int, more: str = "true") -> None:
        files = [_put(f"{QUEUE}/{number:04d}", event(number)) for number in events]
        files.append(_put(USAGE, usage_list(usage)))
        self.step("world", " && ".join([*files, more, "sync"]), events=events, usage=usage)

    def gated_pass(self) -> None:
        self.step("pass", "run quorlet -d", gated_pass=True)

    def consent(self, known: bool) -> None:
        """Older programs have no word for it."""
        if known:
            self.step("consent-off", "run quorletctl consent off", enables=False)
            self.step("consent-on", "run quorletctl consent on", enables=True, drops=True)
        else:
            self.step("consent", "run quorletctl prefs set nuvex.diagwell SubmissionEnabled true",
                      enables=True)


def _knows(quorletctl: str, *words: str) -> bool:
    """Whether these programs list the last word among the commands of the words before it."""
    asked = subprocess.run([quorletctl, *words[:-1], "--help"], capture_output=True, text=True)
    return re.search(rf"^\s+{words[-1]}\b", asked.stdout, re.MULTILINE) is not None


def tell(quorletctl: str) -> list[Step]:
    """The steps for these programs."""
    teller = _Teller()
    teller.world([1, 2, 3], 100, _put(WHITELIST, whitelist()))
    teller.step("init", "run quorletctl init --demo", enables=True)
    teller.consent(_knows(quorletctl, "consent"))
    for amount in (1, 10, 100):
        teller.add(DAY - 1, "a", amount)
    teller.record(DAY - 1, [1, 2.5, 4])
    teller.load(DAY - 1, 40)
    teller.prefer(1)
    teller.gated_pass()
    for amount in (2, 20, 200):
        teller.add(DAY, "a", amount)
    teller.record(DAY, [3, 5])
    teller.prefer(2)
    if _knows(quorletctl, "logs", "submit"):
        teller.step("submit", "run quorletctl logs submit")
    teller.load(DAY, 40)
    teller.clock = (DAY + 1) * 86400 + 1800
    teller.world([11, 12], 350)
    teller.add(DAY, "b", 7)
    teller.gated_pass()
    teller.add(DAY + 1, "a", 5)
    teller.record(DAY + 1, [6])
    teller.prefer(3)
    return teller.steps


def script(steps: list[Step], no_sync: bool) -> str:
    """The story for the guest's shell."""
    preload = "LD_PRELOAD=/programs/no_sync.so " if no_sync else ""
    lines = ["export QUORLET_ROOT=/mnt/root", "mkdir -p /mnt/root && cd /mnt/root",
             f'run() {{ {preload}"$@" >/dev/null; }}',
             'done_or_stop() { [ "$1" = 0 ] && dmsetup message log 0 mark "$2" || '
             'say "failed $2: $(head -n 1 /tmp/error)"; }']
    for step in steps:
        lines.append(f"date -u -s @{step.at} >/dev/null")
        lines.append(f"{{ {step.shell}; }} 2>/tmp/error; done_or_stop $? {step.name}")
        if no_sync:
            # Time for the file system's own write-back, which reorders what nobody synced.
            lines.append("usleep 250000")
    return "\n".join([*lines, "cd /", ""])
