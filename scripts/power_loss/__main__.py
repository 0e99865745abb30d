"""Cuts the power of a virtual machine at many points and checks what quorlet promises."""
from __future__ import annotations

import argparse
import concurrent.futures
import dataclasses
import io
import json
import os
import pathlib
import re
import shutil
import subprocess
import sys
import tarfile
import tempfile
import time

import cuts
import story
import verdict
import write_log
from machine import FILE_SYSTEMS, CannotRun, FileSystem, Machine

TOP = pathlib.Path(__file__).resolve().parents[2]
WORK = TOP / "build/power-loss"
SLOT = 4 << 20  # bytes for the tree of one point
BATCH = 100  # points that one boot of the machine recovers

HELP = """\
A guest kernel records every block that a run of quorlet and quorletctl writes (counters added,
recorded and imported, preferences, consent, two gated passes on two days, submitted logs). For each
point the disk is put together as a power cut at that moment leaves it, the guest mounts it, and
the tree that survives is taken out. There the day's gated pass runs again, with network usage
grown meanwhile, and the next day's; then everything is compared with what had been acknowledged.
Neither root nor loop devices are needed, and no damaged file system meets this machine's kernel.

Points: p120 has everything written before entry 120 of the recording; s120.7 has of the writes
since the last flush only a random part, drawn from seed 7, as disks reorder what was not flushed.

A line of a broken point names the seed, the point, the file system, the step that the cut hit and
what is broken. Its recording is kept; the command at the end of the line checks the same point
again, with --trees DIR leaving what survived in a directory to look at.

Exit status: 0 nothing is broken, 1 something is (--prove: nothing is), 77 this cannot run here.
"""


@dataclasses.dataclass
class Recording:
    """A story once told: the disk before it, and every write since."""
    directory: pathlib.Path
    system: FileSystem
    entries: list[write_log.Entry]
    base: cuts.Image
    steps: list[story.Step]


def parse_options() -> argparse.Namespace:
    parser = argparse.ArgumentParser(prog="scripts/power-loss", description=HELP,
                                     formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("--points", type=int, default=500, help="points for each file system (500)")
    parser.add_argument("--fs", choices=("ext4", "f2fs", "both"), default="both")
    parser.add_argument("--seed", type=int, default=1, help="draws the reordered writes (1)")
    parser.add_argument("--no-sync", action="store_true", help="let the programs' syncs do nothing")
    parser.add_argument("--prove", action="store_true",
                        help="run with --no-sync and succeed only when promises are broken")
    parser.add_argument("--bin", type=pathlib.Path, help="directory of quorlet and quorletctl, else"
                                                         " the release build")
    parser.add_argument("--short", action="store_true", help="60 points on ext4")
    parser.add_argument("--recording", type=pathlib.Path, help="use a recording that was kept")
    parser.add_argument("--point", type=cuts.parse_point, help="check only this point")
    parser.add_argument("--trees", type=pathlib.Path, help="leave what survived in this directory")
    parser.add_argument("--tcg", action="store_true", help="emulate the processor even with KVM")
    options = parser.parse_args()
    if options.short:
        options.points, options.fs = 60, "ext4"
    options.no_sync = options.no_sync or options.prove
    return options


def find_programs(directory: pathlib.Path) -> verdict.Programs:
    """Also in the tree of a build, where quorletctl lies in a directory of its own."""
    def find(name: str) -> str:
        for place in (directory / name, directory / "ctl" / name):
            if place.is_file():
                return str(place.resolve())
        raise CannotRun(f"no {name} in {directory}")
    return verdict.Programs(find("quorlet"), find("quorletctl"))


def run_tool(*command: str) -> None:
    ended = subprocess.run(command, capture_output=True, text=True)
    if ended.returncode != 0:
        raise CannotRun(f"{command[0]} fails: {ended.stderr.strip()[-200:]}")


def read_image(path: pathlib.Path) -> cuts.Image:
    image, zero = {}, bytes(cuts.PAGE)
    with path.open("rb") as disk:
        for number in range(path.stat().st_size // cuts.PAGE):
            page = disk.read(cuts.PAGE)
            if page != zero:
                image[number] = page
    return image


def write_image(disk: io.BufferedIOBase, start: int, image: cuts.Image) -> None:
    for number in sorted(image):
        disk.seek(start + number * cuts.PAGE)
        disk.write(image[number])


def sparse(path: pathlib.Path, size: int) -> pathlib.Path:
    with path.open("wb") as disk:
        disk.truncate(size)
    return path


def record(machine: Machine, system: FileSystem, programs: verdict.Programs, no_sync: bool,
           scratch: pathlib.Path) -> pathlib.Path:
    """Tells the story once; the directory of the recording."""
    name = f"{system.name}{'-no-sync' if no_sync else ''}-{time.strftime('%H%M%S')}-{os.getpid()}"
    directory = WORK / name
    directory.mkdir(parents=True)
    base = sparse(directory / "base", system.size)
    run_tool(*system.make, str(base))
    data, log = scratch / "data", sparse(scratch / "log", 512 << 20)
    run_tool("cp", "--sparse=always", str(base), str(data))
    steps = story.tell(programs.quorletctl)
    (scratch / "story").write_text(story.script(steps, no_sync))
    machine.add_file(scratch / "story", "/story")
    words = {"job": "record", "fs": system.name, "options": system.mount}
    said = machine.run([data, log], words, 300)
    if said[-1:] != ["recorded"] or any(line.startswith("failed") for line in said):
        shutil.copy(machine.console, directory)
        raise SystemExit(f"power-loss: the recording failed: {'; '.join(said[1:])} "
                         f"({directory}/console)")
    run_tool("cp", "--sparse=always", str(log), str(directory / "log"))
    # The steps of this recording: another build may know other commands.
    (directory / "steps").write_text("\n".join(step.name for step in steps))
    (directory / "about").write_text(json.dumps({"fs": system.name}))
    return directory


def load(directory: pathlib.Path, programs: verdict.Programs) -> Recording:
    system = FILE_SYSTEMS[json.loads((directory / "about").read_text())["fs"]]
    steps = story.tell(programs.quorletctl)
    if (directory / "steps").read_text().splitlines() != [step.name for step in steps]:
        raise CannotRun(f"{directory} was recorded with programs that know other commands")
    return Recording(directory, system, write_log.read_log(directory / "log"),
                     read_image(directory / "base"), steps)


def recover(machine: Machine, recording: Recording, images: list[cuts.Image],
            scratch: pathlib.Path) -> list[tuple[str, bytes]]:
    """Mounts each disk as the next boot does: what became of it, and the packed tree."""
    size, count = recording.system.size, len(images)
    data, out = sparse(scratch / "images", size * count), sparse(scratch / "trees", SLOT * count)
    with data.open("r+b") as disk:
        for i, image in enumerate(images):
            write_image(disk, i * size, image)
    said = machine.run([data, out], {"job": "recover", "fs": recording.system.name,
                                     "options": recording.system.mount, "count": count,
                                     "sectors": size // 512, "slot": SLOT // 65536}, 540)
    results = dict(re.findall(r"^point (\d+) (.*)$", "\n".join(said), re.MULTILINE))
    recovered = []
    with out.open("rb") as trees:
        for i in range(count):
            said_of_it = results.get(str(i), "unmountable: the machine stopped")
            result, _, numbers = said_of_it.partition("=")
            length, _, inode = numbers.partition(":")
            trees.seek(i * SLOT)
            recovered.append((f"{result}:{inode}", trees.read(int(length or 0))))
    return recovered


def give_inode(root: pathlib.Path, inode: str) -> None:
    """Files that tell the inode of the structured log beside them tell that of its copy."""
    log = root / "var/mobile/Library/Logs/FaultScribe/structured.jsonl"
    if not inode or not log.exists():
        return
    for path in log.parent.glob(f".structured*.{inode}*"):
        parts = path.name.split(".")
        parts = [str(log.stat().st_ino) if part == inode else part for part in parts]
        path.rename(path.with_name(".".join(parts)))


def judge_point(recording: Recording, point: cuts.Point, result: str, packed: bytes,
                programs: verdict.Programs, scratch: pathlib.Path,
                keep: pathlib.Path | None) -> str | None:
    if not result.startswith("read:"):
        return result.rstrip(":")
    inode = result.removeprefix("read:")
    names = {step.name for step in recording.steps}
    acknowledged = sum(mark in names for mark in cuts.marks(recording.entries, point))
    directory = scratch / f"tree-{point}"
    with tarfile.open(fileobj=io.BytesIO(packed)) as archive:
        archive.extractall(directory)
    root = directory / "root"
    root.mkdir(exist_ok=True)
    give_inode(root, inode)
    if keep:
        shutil.copytree(root, keep / str(point), symlinks=True)
    broken = verdict.judge(root, recording.steps, acknowledged, programs)
    shutil.rmtree(directory)
    if not broken:
        return None
    done = acknowledged == len(recording.steps)
    step = "the end" if done else recording.steps[acknowledged].name
    return f"in {step}: {'; '.join(broken)}"


def recovered_batches(machine: Machine, recording: Recording, points: list[cuts.Point],
                      scratch: pathlib.Path):
    """(point, result, packed tree); the machine is one batch ahead of whoever takes them."""
    states = cuts.images(recording.entries, recording.base, points)

    def next_batch(batch: list[cuts.Point]) -> list[tuple[str, bytes]]:
        return recover(machine, recording, [next(states) for _ in batch], scratch) if batch else []

    batches = [points[first:first + BATCH] for first in range(0, len(points), BATCH)]
    with concurrent.futures.ThreadPoolExecutor(1) as ahead:
        coming = ahead.submit(next_batch, batches[0])
        for batch, following in zip(batches, [*batches[1:], []]):
            trees = coming.result()
            coming = ahead.submit(next_batch, following)
            yield [(point, *tree) for point, tree in zip(batch, trees)]


def check(machine: Machine, recording: Recording, options: argparse.Namespace,
          programs: verdict.Programs, scratch: pathlib.Path) -> int:
    """Prints a line for each broken point; how many there are."""
    entries = recording.entries
    points = [options.point] if options.point else \
        cuts.choose(entries, options.points, options.seed)
    broken, started = 0, time.monotonic()

    def judge(found: tuple[cuts.Point, str, bytes]) -> str | None:
        return judge_point(recording, *found, programs, scratch, options.trees)

    with concurrent.futures.ThreadPoolExecutor(os.cpu_count()) as pool:
        for batch in recovered_batches(machine, recording, points, scratch):
            for (point, *_), what in zip(batch, pool.map(judge, batch)):
                if what is not None:
                    broken += 1
                    again = repeat_command(recording, point, options)
                    print(f"broken: seed {options.seed}, point {point}, {recording.system.name}, "
                          f"{what} [{again}]", flush=True)
    seconds = time.monotonic() - started
    flushes = sum(1 for entry in entries if entry.flags & write_log.FLUSH)
    print(f"{recording.system.name}: {broken} of {len(points)} points broken; "
          f"{sum(entry.changes_disk for entry in entries)} writes, {flushes} flushes recorded; "
          f"{seconds:.0f} s, {100 * seconds / len(points):.1f} s for 100 points "
          f"({machine.accelerator})", flush=True)
    return broken


def repeat_command(recording: Recording, point: cuts.Point, options: argparse.Namespace) -> str:
    programs = f" --bin {os.path.relpath(options.bin)}" if options.bin else ""
    return f"scripts/power-loss{programs} --recording {os.path.relpath(recording.directory)} " \
           f"--point {point}"


def run(options: argparse.Namespace) -> int:
    programs = find_programs(options.bin or TOP / "build/release/src")
    broken = 0
    memory = "/dev/shm" if os.access("/dev/shm", os.W_OK) else None
    with tempfile.TemporaryDirectory(prefix="power-loss-", dir=memory) as name:
        scratch = pathlib.Path(name)
        both = [pathlib.Path(programs.quorlet), pathlib.Path(programs.quorletctl)]
        machine = Machine(WORK / "kernel", both, scratch, options.tcg)
        library = scratch / "no_sync.so"
        run_tool("cc", "-shared", "-fPIC", "-O1", "-o", str(library),
                 str(pathlib.Path(__file__).with_name("no_sync.c")))
        machine.add_file(library, "/programs/no_sync.so")
        systems = ("ext4", "f2fs") if options.fs == "both" else (options.fs,)
        for system in ([None] if options.recording else systems):
            directory = options.recording or record(machine, FILE_SYSTEMS[system], programs,
                                                    options.no_sync, scratch)
            found = check(machine, load(directory, programs), options, programs, scratch)
            if not found and not options.recording:
                shutil.rmtree(directory)
            broken += found
        boots = machine.boot_seconds
        print(f"{len(boots)} boots, {sum(boots) / len(boots):.1f} s each", flush=True)
    if options.prove:
        print("proved: without syncs promises break" if broken else "nothing breaks without syncs")
        return 0 if broken else 1
    return 1 if broken else 0


def main() -> int:
    options = parse_options()
    try:
        return run(options)
    except CannotRun as reason:
        print(f"power-loss: cannot run: {reason}", file=sys.stderr)
        return 77


sys.exit(main())
