"""The virtual machine: its initial file system, made of Debian's packages, and how it is run."""
from __future__ import annotations

import dataclasses
import lzma
import os
import pathlib
import re
import shutil
import subprocess

HERE = pathlib.Path(__file__).parent
# Disks, the recording target, both file systems, and the checksums that they ask for by name only.
MODULES = ("virtio_blk", "dm-log-writes", "crc32c_generic", "crc32_generic", "ext4", "f2fs")


class CannotRun(Exception):
    """Something of this machine is missing: the checks say nothing about the programs."""


@dataclasses.dataclass(frozen=True)
class FileSystem:
    name: str
    make: tuple[str, ...]
    mount: str  # mount options
    size: int  # of the disk, bytes


FILE_SYSTEMS = {
    "ext4": FileSystem("ext4", ("mkfs.ext4", "-q", "-F", "-b", "4096", "-m", "0", "-E",
                                "lazy_itable_init=0,lazy_journal_init=0,nodiscard"),
                       "commit=1", 32 << 20),
    # Discards would be recorded as writes of zeroes that no disk promises.
    "f2fs": FileSystem("f2fs", ("mkfs.f2fs", "-q", "-f", "-t", "0"), "nodiscard", 64 << 20),
}


def _libraries(program: pathlib.Path) -> list[str]:
    listed = subprocess.run(["ldd", str(program)], capture_output=True, text=True, check=True)
    return re.findall(r"(/\S+) \(0x", listed.stdout)


def _module_files(kernel: pathlib.Path) -> dict[str, pathlib.Path]:
    return {path.name.split(".ko")[0].replace("_", "-"): path
            for path in kernel.glob("lib/modules/*/kernel/**/*.ko*")}


def _load_order(kernel: pathlib.Path, modules: tuple[str, ...],
                needed_files: tuple[str, ...]) -> dict[str, bytes]:
    """The modules, decompressed, each after those that it depends on."""
    files = _module_files(kernel)
    order: dict[str, bytes] = {}

    def add(name: str) -> None:
        name = name.replace("_", "-")
        # What is built into the kernel has no file.
        if name in order or name not in files:
            return
        raw = files[name].read_bytes()
        code = lzma.decompress(raw) if files[name].suffix == ".xz" else raw
        needed = re.search(rb"\0depends=([^\0]*)\0", code)
        for dependency in needed[1].decode().split(",") if needed else ():
            add(dependency)
        order[name] = code

    for module in modules:
        add(module)
    for module in needed_files:
        if module not in order:
            raise CannotRun(f"the kernel package has no module {module}")
    return order


class Machine:
    """Boots the unpacked kernel with the programs under test."""

    def __init__(self, kernel: pathlib.Path, programs: list[pathlib.Path], work: pathlib.Path,
                 emulate: bool = False, init: pathlib.Path = HERE / "guest_init",
                 modules: tuple[str, ...] = MODULES,
                 needed_files: tuple[str, ...] = ("dm-log-writes", "ext4")):
        self.work = work
        self.console = work / "console"  # what the last run printed
        self.boot_seconds: list[float] = []
        images = sorted(kernel.glob("boot/vmlinuz-*"))
        if not images:
            raise CannotRun("no kernel: run scripts/install-deps --power-loss")
        self._image = images[-1]
        self._stage = work / "initramfs"
        self._lay_out(programs, init)
        self._add_modules(_load_order(kernel, modules, needed_files))
        kvm = not emulate and os.access("/dev/kvm", os.R_OK | os.W_OK)
        self._accelerators = ["kvm", "tcg"] if kvm else ["tcg"]

    def _copy(self, source: str | pathlib.Path, target: str) -> None:
        path = self._stage / target.lstrip("/")
        path.parent.mkdir(parents=True, exist_ok=True)
        shutil.copy(source, path)

    def _lay_out(self, programs: list[pathlib.Path], init: pathlib.Path) -> None:
        for directory in ("proc", "sys", "dev", "tmp", "mnt", "sbin", "bin", "modules", "run"):
            (self._stage / directory).mkdir(parents=True, exist_ok=True)
        self._copy("/bin/busybox", "/bin/busybox")
        self._copy(init, "/init")
        (self._stage / "init").chmod(0o755)
        dmsetup = pathlib.Path(shutil.which("dmsetup") or "/usr/sbin/dmsetup")
        self._copy(dmsetup, "/usr/sbin/dmsetup")
        for program in programs:
            self._copy(program, f"/programs/{program.name}")
        for program in (dmsetup, *programs):
            for library in _libraries(program):
                self._copy(library, library)

    def _add_modules(self, modules: dict[str, bytes]) -> None:
        for name, code in modules.items():
            (self._stage / "modules" / name).write_bytes(code)
        (self._stage / "modules/order").write_text("".join(f"{name}\n" for name in modules))

    def add_file(self, source: pathlib.Path, target: str) -> None:
        self._copy(source, target)
        (self.work / "initramfs.cpio").unlink(missing_ok=True)

    def _pack(self) -> pathlib.Path:
        initrd = self.work / "initramfs.cpio"
        if not initrd.exists():
            listed = subprocess.run(["find", "."], cwd=self._stage, capture_output=True, check=True)
            with initrd.open("wb") as out:
                subprocess.run(["cpio", "-o", "-H", "newc", "--quiet"], cwd=self._stage,
                               input=listed.stdout, stdout=out, check=True)
        return initrd

    def run(self, disks: list[pathlib.Path], words: dict[str, str | int], seconds: int,
            devices: tuple[str, ...] = ()) -> list[str]:
        """Boots, waits until the machine turns itself off, and returns what its init said."""
        initrd = self._pack()
        line = "console=ttyS0 quiet panic=-1 " + " ".join(f"{k}={v}" for k, v in words.items())
        command = ["qemu-system-x86_64", "-nographic", "-no-reboot", "-nodefaults",
                   "-serial", "stdio", "-m", "768", "-cpu", "max", "-kernel", str(self._image),
                   "-initrd", str(initrd), "-append", line]
        command += devices
        for disk in disks:
            command += ["-drive", f"file={disk},if=none,id={disk.name},format=raw,cache=unsafe",
                        "-device", f"virtio-blk-pci,drive={disk.name}"]
        while True:
            accelerator = self._accelerators[0]
            said = self._boot([*command, "-accel", accelerator], seconds)
            if said or len(self._accelerators) == 1:
                break
            # A hypervisor that is there may still be unable to run a guest.
            self._accelerators.pop(0)
        if not said:
            raise CannotRun("the virtual machine does not start")
        return said

    def _boot(self, command: list[str], seconds: int) -> list[str]:
        try:
            ended = subprocess.run(command, capture_output=True, timeout=seconds,
                                   stdin=subprocess.DEVNULL)
            output = ended.stdout + ended.stderr
        except subprocess.TimeoutExpired as late:
            output = late.stdout or b""
        text = output.decode(errors="replace")
        self.console.write_text(text)
        said = re.findall(r"guest: ([^\r\n]*)", text)
        if said and said[0].startswith("up "):
            self.boot_seconds.append(float(said[0].split()[1]))
        return said

    @property
    def accelerator(self) -> str:
        return self._accelerators[0]
