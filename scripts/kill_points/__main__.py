"""Kills the installed programs at their system calls, fails these, and checks the promises."""
from __future__ import annotations

import argparse
import concurrent.futures
import itertools
import os
import pathlib
import random
import shutil
import signal
import subprocess
import sys
import tempfile
import threading
import time

HERE = pathlib.Path(__file__).resolve().parent
sys.path.append(str(HERE.parent / "power_loss"))

import calls  # noqa: E402
import promises  # noqa: E402
import scenes  # noqa: E402
import story  # noqa: E402
import verdict  # noqa: E402

HELP = """\
A gated pass and the commands of quorletctl that change something run under strace in a copy of a
prepared tree. In one run the process is killed before one of its writing system calls; in another
one of these calls, or an open, read or stat, fails with an error of the system. Then today's gated
pass comes (and a command that may be said again is), network usage having grown, and tomorrow's;
everything is compared with what had been acknowledged. What a failed call cost must have an error
line. Calls before the program first turns to its tree are the loader's, and left alone.

Points: pass:kill:rename:3 kills the pass before its third rename; add:EIO:openat:7 fails the
seventh openat of "tally add" with EIO. Each line of a broken point ends with the command that
checks it again; --trees DIR keeps the tree as the hit command leaves it.

Exit status: 0 nothing is broken, 1 something is (--prove: not noticed), 77 this cannot run here.
"""
USAGE_FILE = story.USAGE
SHORT = 800  # points
PROVEN = 12  # points of each scene with each lie
LIES = ("rename", "unlink")


def parse_options() -> argparse.Namespace:
    parser = argparse.ArgumentParser(prog="scripts/kill-points", description=HELP,
                                     formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("--bin", type=pathlib.Path, help="directory of quorlet and quorletctl, else"
                                                         " the release build")
    parser.add_argument("--short", action="store_true",
                        help=f"a random {SHORT} of the points")
    parser.add_argument("--all-errors", action="store_true",
                        help="fail each call with each error, not with one in turn")
    parser.add_argument("--scene", help="only the points of this command")
    parser.add_argument("--seed", type=int, default=1, help="draws points and errors (1)")
    parser.add_argument("--jobs", type=int, default=os.cpu_count(), help="points at a time")
    parser.add_argument("--prove", action="store_true",
                        help="let renames, then unlinks, only say that they were done, and succeed"
                             " only when promises are broken by each")
    parser.add_argument("--point", help="check only this point")
    parser.add_argument("--trees", type=pathlib.Path, help="leave the trees in this directory")
    return parser.parse_args()


def find_programs(directory: pathlib.Path) -> verdict.Programs:
    """Also in the tree of a build, where quorletctl lies in a directory of its own."""
    def find(name: str) -> str:
        for place in (directory / name, directory / "ctl" / name):
            if place.is_file():
                return str(place.resolve())
        print(f"kill-points: cannot run: no {name} in {directory}", file=sys.stderr)
        sys.exit(77)
    return verdict.Programs(find("quorlet"), find("quorletctl"))


class Theatre:
    """The prepared trees; made anew when the day changes, as the programs see the real clock."""

    def __init__(self, scratch: pathlib.Path, programs: verdict.Programs) -> None:
        self.scratch, self.programs = scratch, programs
        self.lock, self.numbers, self.current = threading.Lock(), itertools.count(), None

    def stage(self) -> scenes.Stage:
        today = int(time.time()) // 86400
        with self.lock:
            if self.current is None or self.current.today != today:
                self.current = scenes.Stage(self.scratch / str(today), self.programs, today)
                scenes.prepare(self.current)
            return self.current

    def copy(self, stage: scenes.Stage, scene: scenes.Scene) -> pathlib.Path:
        # Names of one length: the calls depend on how deep a path is.
        root = self.scratch / f"tree-{next(self.numbers):06d}"
        subprocess.run(["cp", "-a", str(stage.tree(scene.tree)), str(root)], check=True)
        return root


def scene_named(stage: scenes.Stage, name: str) -> scenes.Scene:
    for scene in scenes.scenes(stage):
        if scene.name == name:
            return scene
    raise SystemExit(f"kill-points: no scene {name}")


def list_points(theatre: Theatre, name: str, options: argparse.Namespace,
                draw: random.Random) -> list[tuple[str, calls.Hit]]:
    stage = theatre.stage()
    scene = scene_named(stage, name)
    command = stage.argv(scene.command)

    def trace(path: str = "") -> list[calls.Call]:
        root = theatre.copy(stage, scene)
        found = calls.trace(command, root, pathlib.Path(f"{root}.trace"), path)
        shutil.rmtree(root)
        return found

    # A pass reads network usage in another thread: of that thread's calls those about this file.
    found = trace() + (trace(USAGE_FILE) if scene.is_pass else [])
    hits = [calls.Hit(call) for call in found if call.writes]
    errors = itertools.cycle(draw.sample(calls.ERRORS, len(calls.ERRORS)))
    for call in found:
        chosen = calls.ERRORS if options.all_errors or options.point else [next(errors)]
        hits += [calls.Hit(call, error) for error in chosen]
    return [(name, hit) for hit in hits]


def check_point(theatre: Theatre, name: str, hit: calls.Hit, lie: str | None,
                trees: pathlib.Path | None) -> tuple[bool, list[str]]:
    """Whether the call came at all, and what is broken."""
    while True:
        stage = theatre.stage()
        scene = scene_named(stage, name)
        root = theatre.copy(stage, scene)
        output = pathlib.Path(f"{root}.trace")
        try:
            ended = calls.run(stage.argv(scene.command), hit, lie, root, output)
            if trees:
                shutil.copytree(root, trees / f"{name}:{hit}", symlinks=True)
            broken = promises.judge(stage, scene, root, ended)
            was_hit = ended.was_hit
        except subprocess.TimeoutExpired as late:
            broken, was_hit = [f"{pathlib.Path(late.cmd[0]).name} does not end"], True
        shutil.rmtree(root)
        output.unlink(missing_ok=True)
        # What began on one day and ended on another says nothing.
        if int(time.time()) // 86400 == stage.today:
            return was_hit, broken


def repeat_command(name: str, hit: calls.Hit, options: argparse.Namespace) -> str:
    programs = f" --bin {os.path.relpath(options.bin)}" if options.bin else ""
    return f"scripts/kill-points{programs} --point {name}:{hit}"


def print_broken(name: str, hit: calls.Hit, broken: list[str],
                 options: argparse.Namespace) -> None:
    again = repeat_command(name, hit, options)
    if options.point:
        print("\n".join([f"broken: {name}:{hit} ({hit.about()})", *(f"  {one}" for one in broken)]))
        return
    print(f"broken: {name}:{hit} ({hit.about()}): {'; '.join(broken)} [{again}]", flush=True)


def check(theatre: Theatre, points: list[tuple[str, calls.Hit]], options: argparse.Namespace,
          lie: str | None = None) -> int:
    """Prints each broken point, unless a lie is to break them; how many there are."""
    started, count, missed = time.monotonic(), 0, 0
    pool = concurrent.futures.ThreadPoolExecutor(options.jobs)
    try:
        results = pool.map(lambda point: check_point(theatre, *point, lie, options.trees), points)
        for (name, hit), (was_hit, broken) in zip(points, results):
            missed += not was_hit
            count += bool(broken)
            if broken and not lie:
                print_broken(name, hit, broken, options)
    finally:
        pool.shutdown(cancel_futures=True)
    kills = sum(hit.error is None for _, hit in points)
    with_lie = f", {lie} only saying that it was done" if lie else ""
    print(f"{count} of {len(points)} points broken{with_lie}; {kills} kills, "
          f"{len(points) - kills} failed calls, {missed} not reached; "
          f"{time.monotonic() - started:.0f} s", flush=True)
    return count


def prove(theatre: Theatre, points: list[tuple[str, calls.Hit]], options: argparse.Namespace,
          draw: random.Random) -> int:
    unnoticed = []
    for lie in LIES:
        chosen = []
        for name in sorted({name for name, _ in points}):
            of_scene = [point for point in points if point[0] == name and point[1].call.name != lie]
            chosen += draw.sample(of_scene, min(PROVEN, len(of_scene)))
        if check(theatre, chosen, options, lie) == 0:
            unnoticed.append(lie)
    print(f"not noticed: {', '.join(unnoticed)} that does nothing" if unnoticed else
          f"proved: promises break when {' or '.join(LIES)} does nothing")
    return 1 if unnoticed else 0


def main() -> int:
    options = parse_options()
    signal.signal(signal.SIGTERM, lambda *_: sys.exit(1))  # the trees go then too
    programs = find_programs(options.bin or HERE.parents[1] / "build/release/src")
    draw = random.Random(options.seed)
    memory = "/dev/shm" if os.access("/dev/shm", os.W_OK) else None
    with tempfile.TemporaryDirectory(prefix="kill-points-", dir=memory) as scratch:
        theatre = Theatre(pathlib.Path(scratch), programs)
        only = options.point.split(":")[0] if options.point else options.scene
        names = [only] if only else [scene.name for scene in scenes.scenes(theatre.stage())]
        points = [point for name in names for point in list_points(theatre, name, options, draw)]
        if options.point:
            points = [point for point in points if f"{point[0]}:{point[1]}" == options.point]
            if not points:
                raise SystemExit(f"kill-points: no point {options.point}")
        if options.prove:
            return prove(theatre, points, options, draw)
        if options.short and len(points) > SHORT:
            points = draw.sample(points, SHORT)
        return 1 if check(theatre, points, options) else 0


sys.exit(main())
