"""The trees that commands are hit in, and the commands with what each of them promises."""
from __future__ import annotations

import dataclasses
import json
import pathlib
import plistlib
import shutil
import subprocess
import time

import calls
import story
from verdict import PREFERENCES, SPOOL, Programs

OLD_VERSION, NEW_VERSION = "Story 1 (A)", "Story 2 (B)"
CORRUPTIONS = 3
CORRUPTION_KEY = "nuvex.diagwell.tallyd.database.corruptions"
EVENTS = {1, 2, 3}
APP = {"uuid": "1B4E28BA-2FA1-11D2-883F-B9A761BDE3FB", "bundle_id": "org.example.story",
       "version": "7", "tesk_id": 5, "arch": 64}
# Another program's keys, in files that ours change.
FOREIGN = ("nuvex.diagwell", "nuvex.diagwell.quorlet", "nuvex.aggregated",
           "nuvex.aggregated.quorlet", "nuvex.story")
SUPPORT_LOG = "var/mobile/Library/Logs/Carewell/story.log"
SUPPORT_TEXT = "kept once\n"
USAGE_COUNTED, USAGE = 50, 150  # KB that earlier passes counted, and in all


@dataclasses.dataclass(frozen=True)
class Scene:
    """A command in a tree. What it changes, when it does, is all there."""
    name: str
    tree: str
    command: list[str]  # with the program's name for its path
    adds: dict[str, int] = dataclasses.field(default_factory=dict)  # to yesterday's scalars
    values: int = 0  # more in yesterday's distribution

    @property
    def is_pass(self) -> bool:
        return self.command[0] == "quorlet"


@dataclasses.dataclass(frozen=True)
class Stage:
    """Everything of one day: a pass that runs on it is for the day before."""
    directory: pathlib.Path
    programs: Programs
    today: int

    def tree(self, name: str) -> pathlib.Path:
        return self.directory / name

    def argv(self, command: list[str]) -> list[str]:
        return [getattr(self.programs, command[0]), *command[1:]]


COUNTERS = {"nuvex.story.a": 111, **{f"nuvex.story.i{i}": i + 1 for i in range(10)}}
VALUES = 3
IMPORTED = {f"nuvex.story.n{i}": i + 1 for i in range(40)}


def scenes(stage: Stage) -> list[Scene]:
    day = ["--day", str(stage.today - 1)]
    ctl = "quorletctl"
    lines = stage.directory / "lines"
    return [
        Scene("pass", "due", ["quorlet", "-d"]),
        # The very first pass, and one after a pass that was killed when its log had appeared.
        Scene("first", "fresh", ["quorlet", "-d"]),
        Scene("repeated", "killed", ["quorlet", "-d"]),
        Scene("add", "due", [ctl, "tally", "add", "nuvex.story.a", "1000", *day],
              adds={"nuvex.story.a": 1000}),
        Scene("record", "due", [ctl, "tally", "record", "nuvex.storydist.t", "8", "16", *day],
              values=2),
        Scene("import", "due", [ctl, "tally", "import", str(lines)], adds=IMPORTED, values=1),
        Scene("prefs", "due", [ctl, "prefs", "set", *story.PREFERENCE, "42"]),
        Scene("submit", "due", [ctl, "logs", "submit"]),
        Scene("consent-off", "due", [ctl, "consent", "off"]),
    ]


def write_usage(root: pathlib.Path, kilobytes: int) -> None:
    """The counters of the kernel, which grow while nobody counts them."""
    path = root / story.USAGE
    records = plistlib.loads(story.usage_list(kilobytes))
    records[0]["since"] = plistlib.loads(path.read_bytes())[0]["since"]
    path.write_bytes(plistlib.dumps(records))


def _write(root: pathlib.Path, name: str, data: bytes | str) -> None:
    path = root / name
    path.parent.mkdir(parents=True, exist_ok=True)
    path.write_bytes(data.encode() if isinstance(data, str) else data)


def _set_version(root: pathlib.Path, version: str) -> None:
    name, number, build = version.replace("(", "").replace(")", "").split()
    _write(root, "etc/os-release", f"NAME={name}\nVERSION_ID={number}\nBUILD_ID={build}\n")


def _change_preferences(root: pathlib.Path, domain: str, **changes) -> None:
    path = root / PREFERENCES / f"{domain}.plist"
    values = plistlib.loads(path.read_bytes()) if path.exists() else {}
    values.update(changes)
    kept = {key: value for key, value in values.items() if value is not None}
    _write(root, str(path.relative_to(root)), plistlib.dumps(kept))


def _whitelist() -> bytes:
    groups = plistlib.loads(story.whitelist())
    groups["Story"]["ScalarKeys"] = {CORRUPTION_KEY: {}}
    groups["Story"]["ScalarKeyPrefixes"]["nuvex.NANDInfo."] = {}
    return plistlib.dumps(groups)


def _prepare_fresh(stage: Stage, root: pathlib.Path) -> None:
    """Nothing has run here, and yesterday was counted."""
    now, ctl = int(time.time()), stage.programs.quorletctl
    root.mkdir()
    stage.programs.run(root, now, ctl, "init", "--demo")
    _write(root, story.WHITELIST, _whitelist())
    _set_version(root, NEW_VERSION)
    _become_due(stage, root)


def _become_due(stage: Stage, root: pathlib.Path) -> None:
    day, run = stage.today - 1, stage.programs.run
    ctl, now = stage.programs.quorletctl, int(time.time())
    lines = "".join(f"scalar\t{day}\t{key}\t{value}\n" for key, value in COUNTERS.items())
    lines += "".join(f"value\t{day}\tnuvex.storydist.t\t{i}\t{i}.5\n" for i in range(VALUES))
    _write(stage.directory, "counted", lines)
    run(root, now, ctl, "tally", "import", str(stage.directory / "counted"))
    for number in EVENTS:
        _write(root, f"{story.QUEUE}/{number:04d}", story.event(number))
    _write(root, SUPPORT_LOG, SUPPORT_TEXT)
    for domain in FOREIGN:
        _change_preferences(root, domain, Foreign="kept")
    _change_preferences(root, "nuvex.aggregated", DatabaseCorruptionCount=CORRUPTIONS)
    write_usage(root, USAGE)


def _prepare_due(stage: Stage, root: pathlib.Path) -> None:
    """After yesterday's pass; whatever a pass can have to do is due."""
    now, ctl = int(time.time()), stage.programs.quorletctl
    root.mkdir()
    stage.programs.run(root, now - 2 * 86400, ctl, "init", "--demo")
    _write(root, story.WHITELIST, _whitelist())
    _set_version(root, OLD_VERSION)
    write_usage(root, USAGE_COUNTED)
    stage.programs.run(root, now - 2 * 86400, ctl, "tally", "add", "nuvex.story.b", "9", "--day",
                       str(stage.today - 2))
    stage.programs.run(root, now - 86400, stage.programs.quorlet, "-d")
    _set_version(root, NEW_VERSION)
    for log in (root / SPOOL).glob("*/StorageStatus*"):
        log.unlink()
    _change_preferences(root, "nuvex.diagwell.quorlet", SSLastLoggedAt=None)
    _become_due(stage, root)


def _prepare_killed(stage: Stage, root: pathlib.Path) -> None:
    """A pass that had app info was killed between the log's appearance and everything else."""
    shutil.copytree(stage.tree("due"), root, symlinks=True)
    apps = stage.directory / "apps.json"
    apps.write_text(json.dumps([APP]))
    pending = f"{SPOOL}/pending"
    hit = calls.Hit(calls.Call("fsync", 1, True, pending, pending))

    def send(*words: str) -> None:
        stage.programs.run(root, int(time.time()), stage.programs.quorletctl, "send", *words)

    listener = subprocess.Popen(calls.command_line([stage.programs.quorlet], hit, None, root,
                                                   stage.directory / "listener"),
                                env=calls.environment(root))
    try:
        send("logging-status", "--wait", "10")
        send("app-info", str(apps), "--wait", "10")
    finally:
        if listener.wait(calls.LIMIT) == 0:
            raise SystemExit("kill-points: the pass with app info was not killed")


def prepare(stage: Stage) -> None:
    stage.directory.mkdir()
    day = stage.today - 1
    lines = "".join(f"scalar\t{day}\t{key}\t{value}\n" for key, value in IMPORTED.items())
    (stage.directory / "lines").write_text(lines + f"value\t{day}\tnuvex.storydist.t\t9\t2.5\n")
    _prepare_fresh(stage, stage.tree("fresh"))
    _prepare_due(stage, stage.tree("due"))
    _prepare_killed(stage, stage.tree("killed"))
