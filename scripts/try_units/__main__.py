"""Runs the package's units under the systemd of a virtual machine."""
from __future__ import annotations

import argparse
import base64
import json
import pathlib
import subprocess
import sys
import tempfile

HERE = pathlib.Path(__file__).parent
TOP = HERE.parents[1]
sys.path.insert(0, str(TOP / "scripts/power_loss"))
from machine import CannotRun, Machine  # noqa: E402

HELP = """\
Installs the package into a fresh Debian root, boots that in a virtual machine, and has its units do
a device's work for some days: record, close a day, serve, ask a drive. Then the same pass runs as
the same user without the units' directives: whatever that finds more than the hardened one, the
directives take away.

Exit status: 0 all is done, 1 something is not, 77 this cannot run here.
"""
MODULES = ("virtio_blk", "ext4", "crc32c_generic", "nvme", "autofs4")
TOOLS = "systemd,systemd-sysv,udev,dbus,kmod,passwd,python3-minimal"
# What differs between two days of one machine, with or without directives.
OF_THE_MOMENT = ("datausage.",)
DRIVE = "0000:00:05.0"


def make_root(package: pathlib.Path, root: pathlib.Path) -> None:
    depends = subprocess.run(["dpkg-deb", "-f", str(package), "Depends"], capture_output=True,
                             text=True, check=True).stdout
    names = [part.split("|")[0].split("(")[0].strip() for part in depends.split(",")]
    command = ["mmdebstrap", "--quiet", "--variant=minbase",
               "--include=" + ",".join([TOOLS, *names]),
               f"--customize-hook=upload {package} /package.deb",
               '--customize-hook=chroot "$1" dpkg -i /package.deb',
               f"--customize-hook=upload {HERE / 'check'} /usr/local/sbin/check",
               f"--customize-hook=upload {HERE / 'check.service'} /etc/systemd/system/check.service",
               '--customize-hook=chmod 755 "$1/usr/local/sbin/check"',
               '--customize-hook=chroot "$1" systemctl enable check.service',
               '--customize-hook=chroot "$1" systemctl mask serial-getty@ttyS0.service getty.target',
               "bookworm", str(root)]
    made = subprocess.run(command, capture_output=True, text=True)
    if made.returncode != 0:
        raise CannotRun("no root could be made: " + made.stderr.strip()[-300:])


def make_image(root: pathlib.Path, image: pathlib.Path) -> None:
    image.touch()
    image.open("r+b").truncate(1200 << 20)
    subprocess.run(["mkfs.ext4", "-q", "-F", "-d", str(root), str(image)], check=True)


class Judge:
    def __init__(self, said: list[str]) -> None:
        self.answers: dict[str, tuple[int, str]] = {}
        self.logs: list[str] = []
        self.faults: list[str] = []
        self.count = 0
        for line in said[1:]:
            name, status, *text = line.split(" ")
            raw = base64.b64decode(text[0]).decode(errors="replace") if text else ""
            if name == "log":
                self.logs.append(raw)
            self.answers[name] = (int(status), raw)

    def expect(self, what: str, holds: bool, *shown: str) -> None:
        self.count += 1
        if not holds:
            tails = "".join(f"\n    {name}: {self.answers.get(name)}" for name in shown)
            self.faults.append(what + tails)

    def text(self, name: str) -> str:
        return self.answers.get(name, (-1, ""))[1]

    def goes_well(self, name: str) -> None:
        self.expect(name, self.answers.get(name, (-1, ""))[0] == 0, name)

    def keys(self, name: str) -> set[str]:
        """The keys of the dump's last day."""
        rows = [line.split("\t") for line in self.text(name).splitlines()]
        last = max((row[1] for row in rows), default="")
        return {row[2] for row in rows
                if row[1] == last and not row[2].startswith(OF_THE_MOMENT)}

    def judge(self) -> None:
        for name in ("units", "unconsented", "consent", "add", "member", "daily", "outbox", "plain",
                     "send", "with_drives", "drives_dump", "errors"):
            self.goes_well(name)
        self.expect("a stranger cannot record", self.answers["stranger"][0] != 0, "stranger")
        self.expect("the first datagram starts the listener", self.text("listening") == "active\n",
                    "listening")
        for name in ("recorded", "daily_result", "service"):
            self.expect(f"{name} ends well", "Result=success" in self.text(name), name, "errors")
        self.expect("the listener goes when nobody sends", "=inactive" in self.text("recorded"),
                    "recorded")
        log = "".join(self.logs)
        for part in ("example.runs", "<integer>5</integer>", "example.sent", "example.time"):
            self.expect(f"the day's log holds {part}", part in log, "outbox", "errors")
        findings = json.loads(self.text("after") or "{}").get("checks", [])
        wrong = [check for check in findings if check.get("level") == "error"]
        self.expect(f"status finds nothing wrong: {wrong}", not wrong and bool(findings), "after")
        hardened, plain = self.keys("hardened"), self.keys("plain_dump")
        self.expect(f"the directives take nothing away: {sorted(plain - hardened)}",
                    bool(plain) and plain <= hardened, "errors")
        drive = f"nuvex.drvreport.flash.{DRIVE}.power.cycles"
        self.expect("a drive is not asked without its rights", drive not in hardened)
        self.expect("a drive is asked with them", drive in self.keys("drives_dump"), "errors")
        # The journal has the messages without their level.
        refused = [line for line in self.text("errors").splitlines()
                   if line.startswith("Cannot ") or "denied" in line or "not permitted" in line]
        self.expect(f"nothing is refused: {refused[:5]}", not refused)
        self.expect("the guest comes to its end", "end" in self.answers)


def run(arguments: argparse.Namespace, work: pathlib.Path) -> int:
    package = arguments.package or next(iter(sorted((TOP / "build/package").glob("quorlet_*.deb"))),
                                        None)
    if package is None:
        raise CannotRun("no package: run scripts/package")
    make_root(package.resolve(), work / "root")
    image = work / "disk"
    make_image(work / "root", image)
    drive = work / "drive"
    drive.touch()
    drive.open("r+b").truncate(64 << 20)
    machine = Machine(TOP / "build/power-loss/kernel", [], work, init=HERE / "guest_init",
                      modules=MODULES, needed_files=("nvme", "ext4"))
    devices = ("-drive", f"file={drive},if=none,id=nvme0,format=raw,cache=unsafe", "-device",
               f"nvme,drive=nvme0,serial=SECRET,addr={DRIVE.split(':')[-1].split('.')[0]}")
    said = machine.run([image], {}, arguments.seconds, devices)
    judge = Judge(said)
    if arguments.show:
        for name, (status, text) in judge.answers.items():
            print(f"== {name} ({status})\n{text}")
    if "end" not in judge.answers:
        print(machine.console.read_text()[-4000:], file=sys.stderr)
    judge.judge()
    for fault in judge.faults:
        print(f"FAILS {fault}")
    print(f"{judge.count} expectations, {len(judge.faults)} failed; a guest of {machine.accelerator}")
    return 1 if judge.faults else 0


def main() -> int:
    parser = argparse.ArgumentParser(prog="scripts/try-units", description=HELP,
                                     formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("--package", type=pathlib.Path,
                        help="the package (default: that of scripts/package)")
    parser.add_argument("--seconds", type=int, default=400, help="time for the machine (400)")
    parser.add_argument("--show", action="store_true", help="print every answer of the guest")
    arguments = parser.parse_args()
    with tempfile.TemporaryDirectory(prefix="try-units-") as work:
        try:
            return run(arguments, pathlib.Path(work))
        except CannotRun as reason:
            print(f"try-units: cannot run: {reason}", file=sys.stderr)
            return 77


if __name__ == "__main__":
    sys.exit(main())
