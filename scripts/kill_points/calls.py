"""The system calls of a command, and the command run again with one of them hit."""
from __future__ import annotations

import collections
import dataclasses
import os
import pathlib
import re
import subprocess

WRITING = {"write", "pwrite64", "writev", "pwritev", "pwritev2", "fsync", "fdatasync", "ftruncate",
           "fallocate", "rename", "renameat", "renameat2", "unlink", "unlinkat", "link", "linkat",
           "mkdir", "mkdirat", "sync_file_range", "copy_file_range", "sendfile"}
READING = {"openat", "open", "read", "pread64", "readv", "newfstatat", "fstat", "stat", "lstat",
           "statx", "getdents64"}
ERRORS = ("ENOSPC", "EIO", "EMFILE", "ENFILE", "EACCES")
LIMIT = 100  # seconds; the longest wait of a pass is 60


@dataclasses.dataclass(frozen=True)
class Call:
    name: str
    number: int  # of the calls of this name by its thread
    writes: bool
    subject: str  # the file it is about
    path: str = ""  # only calls about this path are counted: another thread than the first makes it

    def __str__(self) -> str:
        return f"{'usage-' if self.path else ''}{self.name}:{self.number}"


@dataclasses.dataclass(frozen=True)
class Hit:
    """A process killed before a call, or the call failed."""
    call: Call
    error: str | None = None

    def __str__(self) -> str:
        return f"{self.error or 'kill'}:{self.call}"

    def about(self) -> str:
        done = f"fails with {self.error}" if self.error else "never came, killed"
        return f"{self.call.name} of {self.call.subject} {done}"


@dataclasses.dataclass(frozen=True)
class Ended:
    status: int | None  # none: killed by us
    errors: str
    was_hit: bool


def environment(root: pathlib.Path) -> dict[str, str]:
    return {**os.environ, "QUORLET_ROOT": str(root), "TZ": "UTC"}


def _run(command_line: list[str], root: pathlib.Path):
    return subprocess.run(command_line, env=environment(root), capture_output=True, text=True,
                          timeout=LIMIT, stdin=subprocess.DEVNULL)


def _subject(line: str, root: pathlib.Path) -> str:
    named = re.search(r'<([^>]*)>, ""|"([^"]*)"', line) or re.search(r"<([^>]*)>", line)
    path = next((group for group in named.groups() if group), "") if named else ""
    about = re.search(r"^\w+\(\d+<([^>]*)>", line)
    path = about.group(1) if about else path
    return path.removeprefix(str(root)) or "?"


def trace(command: list[str], root: pathlib.Path, output: pathlib.Path,
          path: str = "") -> list[Call]:
    """What is called from when the program first turns to its root; that before is the loader's.

    Only calls of the first thread, or of all threads those about PATH.
    """
    options = ["-y", "-e", "trace=" + ",".join(f"?{name}" for name in WRITING | READING)]
    if path:
        options += ["-f", "-P", str(root / path)]
    ended = _run(["strace", "-o", str(output), *options, *command], root)
    if ended.returncode != 0:
        raise SystemExit(f"kill-points: {' '.join(command)} gives {ended.returncode}: "
                         f"{ended.stderr.strip()[:200]}")
    calls, numbers, begun = [], collections.Counter(), False
    for line in output.read_text(errors="replace").splitlines():
        found = re.match(r"(?:\d+ +)?((\w+)\(.*)", line)
        if not found:
            continue
        name = found[2]
        numbers[name] += 1
        begun = begun or str(root) in line
        if begun and (name in WRITING or name in READING):
            writes = name in WRITING or "O_CREAT" in line
            calls.append(Call(name, numbers[name], writes, _subject(found[1], root), path))
    return calls


def command_line(command: list[str], hit: Hit | None, lie: str | None, root: pathlib.Path,
                 output: pathlib.Path) -> list[str]:
    """LIE: calls of this name do nothing and say that they did."""
    options = []
    names = {lie} if lie else set()
    if lie:
        options += ["-e", f"inject={lie}:retval=0"]
    if hit:
        what = f"error={hit.error}" if hit.error else "signal=KILL"
        names.add(hit.call.name)
        options += ["-e", f"inject={hit.call.name}:{what}:when={hit.call.number}"]
        if hit.call.path:
            options += ["-f", "-P", str(root / hit.call.path)]
    traced = ",".join(sorted(names)) or "none"
    return ["strace", "-o", str(output), "-e", f"trace={traced}", *options, *command]


def run(command: list[str], hit: Hit | None, lie: str | None, root: pathlib.Path,
        output: pathlib.Path) -> Ended:
    ended = _run(command_line(command, hit, lie, root, output), root)
    if hit and not hit.error:
        was_killed = ended.returncode in (-9, 137)
        return Ended(None if was_killed else ended.returncode, ended.stderr, was_killed)
    said = output.read_text(errors="replace").splitlines()
    was_hit = hit is not None and any(
        f"{hit.call.name}(" in line and f"{hit.error} " in line and line.endswith("(INJECTED)")
        for line in said)
    return Ended(ended.returncode, ended.stderr, was_hit)
