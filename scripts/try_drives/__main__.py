"""Compares what quorletctl says of a guest's drives with what smartctl and nvme say of them."""
from __future__ import annotations

import argparse
import base64
import json
import pathlib
import shutil
import sys
import tempfile

HERE = pathlib.Path(__file__).parent
TOP = HERE.parents[1]
sys.path.insert(0, str(TOP / "scripts/power_loss"))
from machine import CannotRun, Machine  # noqa: E402

HELP = """\
Starts a virtual machine that has two NVMe drives and an SD card, all of them emulated, writes to
them, and has quorletctl, smartctl and nvme tell what they see. Every figure that quorletctl shares
with one of the others must be the same, no drive may count an error because it was asked, and what
is not told must be unknown.

Exit status: 0 all agree, 1 something does not, 77 this cannot run here.
"""
MODULES = ("nvme", "sdhci_pci", "mmc_block")
DRIVES = {"nvme0": "0000:00:05.0", "nvme1": "0000:00:04.0"}
CARD_PLACE = "0000:00:06.0"

# Figure of quorletctl: the tool's name for it, and its value in the figure's unit.
UNITS = 512_000
OF_NVME = {
    "warnings": ("critical_warning", 1),
    "spare": ("avail_spare", 1),
    "spare.threshold": ("spare_thresh", 1),
    "used": ("percent_used", 1),
    "bytes.read": ("data_units_read", UNITS),
    "bytes.written": ("data_units_written", UNITS),
    "reads": ("host_read_commands", 1),
    "writes": ("host_write_commands", 1),
    "busy": ("controller_busy_time", 60),
    "power.cycles": ("power_cycles", 1),
    "power.on": ("power_on_hours", 3600),
    "unsafe.shutdowns": ("unsafe_shutdowns", 1),
    "media.errors": ("media_errors", 1),
    "error.log.entries": ("num_err_log_entries", 1),
    "warm": ("warning_temp_time", 60),
    "critical": ("critical_comp_time", 60),
    "throttled.1": ("thm_temp1_trans_count", 1),
    "throttled.2": ("thm_temp2_trans_count", 1),
    "throttled.1.time": ("thm_temp1_total_time", 1),
    "throttled.2.time": ("thm_temp2_total_time", 1),
}
OF_SMARTCTL = dict(OF_NVME) | {
    "spare": ("available_spare", 1),
    "spare.threshold": ("available_spare_threshold", 1),
    "used": ("percentage_used", 1),
    "reads": ("host_reads", 1),
    "writes": ("host_writes", 1),
}
for only_nvme in ("throttled.1", "throttled.2", "throttled.1.time", "throttled.2.time"):
    del OF_SMARTCTL[only_nvme]


class Comparison:
    def __init__(self) -> None:
        self.compared = 0
        self.faults: list[str] = []

    def same(self, what: str, ours: object, theirs: object) -> None:
        self.compared += 1
        if ours != theirs:
            self.faults.append(f"{what}: quorletctl says {ours}, it is {theirs}")

    def figures(self, tool: str, name: str, ours: dict, theirs: dict, names: dict,
                celsius: int) -> None:
        for figure, (field, factor) in names.items():
            value = int(theirs[field]) * factor
            # No drive has written nothing since it was made: 0 stands for a figure not told.
            expected = None if value == 0 and factor == UNITS else value
            self.same(f"{tool} {name} {figure}", ours.get(figure), expected)
        self.same(f"{tool} {name} temperature", ours.get("temperature"), celsius * 1000)


def answers_of(said: list[str]) -> dict[str, tuple[int, str]]:
    answers = {}
    for line in said[1:]:
        name, status, *text = line.split(" ")
        raw = base64.b64decode(text[0]) if text else b""
        answers[name] = (int(status), raw.decode(errors="replace"))
    return answers


def compare(answers: dict[str, tuple[int, str]]) -> Comparison:
    def text(name: str) -> str:
        return answers[name][1]

    result = Comparison()
    health = {drive["name"]: drive for drive in json.loads(text("health"))["drives"]}
    result.same("drives", sorted(health), ["mmcblk0", "nvme0", "nvme1"])
    order = [drive["drive"] for drive in json.loads(text("health"))["drives"]]
    result.same("order", order, sorted(order))
    for name in ("nvme0", "nvme1"):
        drive = health[name]
        nvme, before = json.loads(text(f"nvme-{name}")), json.loads(text(f"before-{name}"))
        smartctl = json.loads(text(f"smartctl-{name}"))
        result.figures("nvme", name, drive["figures"], nvme, OF_NVME, nvme["temperature"] - 273)
        log = smartctl["nvme_smart_health_information_log"]
        result.figures("smartctl", name, drive["figures"], log, OF_SMARTCTL, log["temperature"])
        result.same(f"model {name}", drive["model"], smartctl["model_name"])
        result.same(f"firmware {name}", drive["firmware"], smartctl["firmware_version"])
        result.same(f"usedPercent {name}", drive["usedPercent"], nvme["percent_used"])
        result.same(f"errors {name}", drive["errors"], int(nvme["media_errors"]))
        result.same(f"place {name}", drive["drive"], text(f"place-{name}").split("/")[-3])
        result.same(f"errors counted by {name}", nvme["num_err_log_entries"],
                    before["num_err_log_entries"])
        result.same(f"serial number of {name}", smartctl["serial_number"] in text("health"), False)
    card = health["mmcblk0"]
    result.same("card's place", card["drive"], CARD_PLACE)
    result.same("card", (card["kind"], card["model"], card["figures"]),
                ("sd", text("card").strip(), {}))
    result.same("info", ("NumLogicalWrites" in text("info"), "NumPhysicalWrites" in text("info")),
                (True, False))
    result.same("user", (answers["user"][0], "needs root" in text("user")), (1, True))
    result.same("user's info", (answers["user-info"][0], "needs root" in text("user-info")),
                (1, True))
    recorded = dict(line.split("\t")[2:4] for line in text("recorded").splitlines()
                    if line.startswith("scalar"))
    for name in ("nvme0", "nvme1"):
        place = health[name]["drive"]
        result.same(f"recorded {name}", recorded.get(f"nuvex.flash.{place}.written"),
                    str(health[name]["bytesWritten"]))
        result.same(f"recorded cycles {name}",
                    recorded.get(f"nuvex.drvreport.flash.{place}.power.cycles"),
                    str(health[name]["figures"]["power.cycles"]))
    return result


def run(arguments: argparse.Namespace, work: pathlib.Path) -> int:
    programs = [arguments.bin / "quorlet", arguments.bin / "quorletctl"]
    programs += [pathlib.Path(shutil.which(tool) or "") for tool in ("smartctl", "nvme")]
    machine = Machine(TOP / "build/power-loss/kernel", programs, work, init=HERE / "guest_init",
                      modules=MODULES, needed_files=("nvme", "sdhci-pci", "mmc-block"))
    devices: list[str] = []
    for number, (name, place) in enumerate(DRIVES.items()):
        image = work / name
        image.touch()
        image.open("r+b").truncate(64 << 20)
        slot = place.split(":")[-1].split(".")[0]
        devices += ["-drive", f"file={image},if=none,id={name},format=raw,cache=unsafe", "-device",
                    f"nvme,drive={name},serial=SECRET{number},addr={slot}"]
    card = work / "card"
    card.touch()
    card.open("r+b").truncate(64 << 20)
    devices += ["-drive", f"file={card},if=none,id=card,format=raw,cache=unsafe", "-device",
                "sdhci-pci,addr=06", "-device", "sd-card,drive=card"]
    answers = answers_of(machine.run([], {}, arguments.seconds, tuple(devices)))
    if arguments.show:
        for name, (status, text) in answers.items():
            print(f"== {name} ({status})\n{text}")
    missing = {"health", "recorded"} - answers.keys()
    if missing:
        print(machine.console.read_text()[-4000:], file=sys.stderr)
        raise CannotRun("the virtual machine did not come to its end")
    result = compare(answers)
    print(answers["table"][1], end="")
    for fault in result.faults:
        print(f"DIFFERS {fault}")
    print(f"{result.compared} comparisons, {len(result.faults)} differ")
    return 1 if result.faults else 0


def main() -> int:
    parser = argparse.ArgumentParser(prog="scripts/try-drives", description=HELP,
                                     formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("--bin", type=pathlib.Path, default=TOP / "build/release/src/all",
                        help="directory of quorlet and quorletctl (default: built first)")
    parser.add_argument("--seconds", type=int, default=300, help="time for the machine (300)")
    parser.add_argument("--show", action="store_true", help="print every answer of the guest")
    arguments = parser.parse_args()
    with tempfile.TemporaryDirectory(prefix="try-drives-") as work:
        try:
            return run(arguments, pathlib.Path(work))
        except CannotRun as reason:
            print(f"try-drives: cannot run: {reason}", file=sys.stderr)
            return 77


if __name__ == "__main__":
    sys.exit(main())
