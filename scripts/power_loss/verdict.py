"""Judges what survived a power cut: a tree of files, after which the next gated passes run."""
from __future__ import annotations

import collections
import dataclasses
import json
import os
import pathlib
import plistlib
import struct
import subprocess
import time

import story
from story import DAY, Key, State, Step

SPOOL = "var/mobile/Library/Logs/Diagwell"
STRUCTURED = "var/mobile/Library/Logs/FaultScribe"
PREFERENCES = "var/mobile/Library/Preferences"
GROWTH = (17, 5)  # KB of network usage between the cut and the pass, and until the next day's


class Broken(Exception):
    """A promise is; the text says which."""


def require(holds: bool, otherwise: str) -> None:
    if not holds:
        raise Broken(otherwise)


@dataclasses.dataclass(frozen=True)
class Programs:
    quorlet: str
    quorletctl: str

    def run(self, root: pathlib.Path, at: int, *command: str) -> str:
        """Standard output; what fails or hangs is a broken promise too."""
        clock = time.strftime("@%Y-%m-%d %H:%M:%S", time.gmtime(at))
        # The clock of files stays as it is: only the program's own day matters.
        environment = {**os.environ, "QUORLET_ROOT": str(root), "NO_FAKE_STAT": "1", "TZ": "UTC"}
        for _ in range(5):
            ended = subprocess.run(["faketime", "-f", clock, *command], capture_output=True,
                                   text=True, env=environment, timeout=60)
            # It names its semaphore by its process, and one that was killed left one behind.
            if not ended.stderr.startswith("faketime: sem_open"):
                break
        if ended.returncode != 0:
            raise Broken(f"{pathlib.Path(command[0]).name} {command[1]} gives "
                                 f"{ended.returncode}: {ended.stderr.strip()[:200]}")
        return ended.stdout


@dataclasses.dataclass
class Spool:
    days: dict[int, list[dict]] = dataclasses.field(default_factory=dict)
    metadata: dict[int, dict] = dataclasses.field(default_factory=dict)  # of a day's last log
    status: int = 0


def read_plist(path: pathlib.Path, data: bytes):
    try:
        return plistlib.loads(data)
    except Exception as error:  # whatever is wrong with it, it is not whole
        raise Broken(f"{path.name} is not whole ({len(data)} bytes): {error}") from error


def _read_log(path: pathlib.Path, spool: Spool) -> None:
    head, _, body = path.read_bytes().partition(b"\n")
    try:
        header = json.loads(head)
    except ValueError as error:
        raise Broken(f"{path.name} has no header") from error
    if header["name"] != "log-aggregated":
        require(body, f"{path.name} has no body")
        spool.status += 1
        return
    require(header["type"] == "193", f"{path.name} is of type {header['type']}")
    document = read_plist(path, body)
    start = document["TLStartDate"].replace(tzinfo=story.datetime.timezone.utc).timestamp()
    day = int(start) // 86400
    spool.days.setdefault(day, []).append(document)
    spool.metadata[day] = header.get("metadata", {})


def read_spool(root: pathlib.Path) -> Spool:
    spool = Spool()
    for path in sorted((root / SPOOL).glob("*/*.log")):
        if not path.name.startswith("."):
            _read_log(path, spool)
    return spool


def check_files(root: pathlib.Path) -> None:
    """What is there under its name is whole, before any program has looked at it."""
    for path in (root / PREFERENCES).glob("*.plist"):
        if not path.name.startswith("."):
            read_plist(path, path.read_bytes())
    read_spool(root)
    aside = [path.name for path in root.rglob("*.damaged*")]
    require(not aside, f"set aside as damaged: {', '.join(aside)}")


def structured_lines(root: pathlib.Path) -> list[dict]:
    lines = []
    for path in sorted((root / STRUCTURED).glob("structured*.jsonl")):
        torn = 0
        for line in path.read_bytes().splitlines():
            try:
                lines.append(json.loads(line))
            except ValueError:
                torn += 1  # the one that the cut hit, which is nobody's promise
        require(torn <= 1, f"{path.name} has {torn} lines that cannot be read")
    return lines


def check_structured(root: pathlib.Path, events: set[int], once: bool = True) -> None:
    """ONCE: no storage line of a day stands twice."""
    lines = structured_lines(root)
    storage = collections.Counter((line["time"][:10], json.dumps(line["data"], sort_keys=True))
                                  for line in lines if line["type"] == 176)
    doubled = sum(count - 1 for count in storage.values())
    require(doubled == 0 or not once, f"{doubled} type-176 lines of one day stand twice")
    seen = {line["data"].get("reg0") for line in lines if line["type"] == 172}
    queue = root / story.QUEUE
    for path in queue.iterdir() if queue.is_dir() else ():
        data = path.read_bytes()
        if len(data) == len(story.event(0)):
            seen.add(struct.unpack_from("<Q", data, 8)[0])
    require(events <= seen, f"ECC events lost: {sorted(events - seen)}")


def dump(programs: Programs, root: pathlib.Path, at: int):
    """Scalars, and how many values each distribution has."""
    scalars: dict[Key, int] = {}
    values: collections.Counter[Key] = collections.Counter()
    for line in programs.run(root, at, programs.quorletctl, "tally", "dump").splitlines():
        kind, day, key, *rest = line.split("\t")
        if kind == "scalar":
            scalars[int(day), key] = int(rest[0])
        else:
            values[int(day), key] += 1
    return scalars, values


def _of_story(counters: dict[Key, int]) -> dict[Key, int]:
    return {key: value for key, value in counters.items() if key[1].startswith("nuvex.story")}


def difference(found: dict, wanted: dict) -> str:
    keys = [key for key in {**wanted, **found} if found.get(key) != wanted.get(key)]
    shown = ", ".join(f"{key[1]} of day {key[0]} is {found.get(key)}, not {wanted.get(key)}"
                      for key in keys[:2])
    return shown + (f" and {len(keys) - 2} more" if len(keys) > 2 else "")


def _check_counters(scalars, values, states: list[State]) -> None:
    """Exactly what was acknowledged, or that and the whole step that the cut hit."""
    found = {**_of_story(scalars), **_of_story(values)}
    wanted = [{**state.scalars, **state.values} for state in states]
    require(found in wanted, "counters: " + difference(found, wanted[0]))


def _check_usage(scalars, total: int, states: list[State]) -> None:
    found = sum(value for (_, key), value in scalars.items()
                if key.startswith("datausage.wifiInKB"))
    wanted = {total - state.uncounted_usage for state in states}
    require(found in wanted, f"network usage is {found} KB, not {sorted(wanted)}")
    odd = [key for _, key in scalars if "baddata" in key or "olddata" in key]
    require(not odd, f"network usage went backwards: {odd}")


def _check_preference(root: pathlib.Path, states: list[State]) -> None:
    domain, name = story.PREFERENCE
    path = root / PREFERENCES / f"{domain}.plist"
    found = read_plist(path, path.read_bytes()).get(name) if path.exists() else None
    wanted = [state.preference for state in states]
    require(found in wanted, f"preference {name} is {found}, not {wanted[0]}")


def _check_logs(root: pathlib.Path, today: int, states: list[State]) -> None:
    spool = read_spool(root)
    for day, logs in spool.days.items():
        require(len(logs) == 1, f"{len(logs)} aggregated logs of day {day}")
    require(spool.status <= 1, f"{spool.status} status logs of one week")
    if not any(state.enabled for state in states):
        require(not spool.days and not spool.status, "a log was written without consent")
    if not all(state.enabled for state in states):
        return
    due = {day for day in range(DAY - 1, today) if day + 1 in states[0].passes}
    due |= {day for day, _ in states[0].scalars if today - 1 <= day <= today}
    missing = sorted(due - set(spool.days))
    require(not missing, f"no aggregated log of days {missing}")
    for day, logs in spool.days.items():
        _check_log(day, logs[0], states)
    # Only the first log ever tells of the change of the operating system, and a repeated pass must
    # not forget it.
    if DAY - 1 in spool.days:
        told = spool.metadata[DAY - 1].get("previous_os_version")
        require(told is not None, f"the log of day {DAY - 1} has lost the previous OS version")


def _check_log(day: int, document: dict, states: list[State]) -> None:
    found = {(day, key): value for key, value in document.get("TLScalars", {}).items()}
    for key, summary in document.get("TLDistributions", {}).items():
        found[day, key] = summary[-1]
    found = _of_story(found)
    wanted = [{key: value for key, value in {**state.scalars, **state.values}.items()
               if key[0] == day} for state in states]
    require(found in wanted, f"the log of day {day}: " + difference(found, wanted[0]))


def _grow(root: pathlib.Path, amount: int, surviving: int) -> int:
    path = root / story.USAGE
    path.parent.mkdir(parents=True, exist_ok=True)
    path.write_bytes(story.usage_list(surviving + amount))
    return surviving + amount


def _surviving_usage(root: pathlib.Path) -> int:
    path = root / story.USAGE
    if not path.exists():
        return 0
    return plistlib.loads(path.read_bytes())[0]["wifiInBytes"] // 1024


def run_passes(programs: Programs, root: pathlib.Path, at: int) -> int:
    """Runs the gated passes of today and of tomorrow; network usage in all, in KB."""
    check_files(root)
    total = _grow(root, GROWTH[0], _surviving_usage(root))
    programs.run(root, at, programs.quorlet, "-d")
    total = _grow(root, GROWTH[1], total)
    programs.run(root, at + 86400, programs.quorlet, "-d")
    check_files(root)
    return total


def judge(root: pathlib.Path, steps: list[Step], acknowledged: int,
          programs: Programs) -> list[str]:
    """Everything that is broken. ROOT is used up."""
    states = [State()]
    for step in steps[:acknowledged + 1]:
        states.append(states[-1].after(step))
    states = states[acknowledged:]
    at = steps[min(acknowledged, len(steps) - 1)].at + 3600
    broken = []

    def attempt(check, *arguments):
        try:
            return check(*arguments)
        except (Broken, subprocess.TimeoutExpired, OSError) as why:
            broken.append(str(why))
            return None

    total = attempt(run_passes, programs, root, at)
    if total is None:
        return broken
    counters = attempt(dump, programs, root, at + 86400)
    if counters is not None:
        attempt(_check_counters, *counters, states)
        attempt(_check_usage, counters[0], total, states)
    attempt(_check_preference, root, states)
    attempt(_check_logs, root, at // 86400, states)
    attempt(check_structured, root, states[0].events)
    return broken
