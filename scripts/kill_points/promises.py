"""Judges a tree in which a command was hit: what is there, and what the next passes make of it."""
from __future__ import annotations

import pathlib
import plistlib
import re
import time

import scenes
import story
import verdict
from calls import Ended
from scenes import Scene, Stage
from verdict import PREFERENCES, SPOOL, Broken, require

GROWTH = (17, 5)  # KB of network usage before the pass that comes next, and before tomorrow's
SYSTEM_LOG = "var/log/quorlet.log"


def _preference(root: pathlib.Path, domain: str, key: str):
    path = root / PREFERENCES / f"{domain}.plist"
    return plistlib.loads(path.read_bytes()).get(key) if path.exists() else None


def _spool_names(root: pathlib.Path) -> dict[str, list[str]]:
    return {stage: sorted(path.name for path in (root / SPOOL / stage).iterdir()
                          if not path.name.startswith("."))
            for stage in ("pending", "outbox")}


def _error_lines(root: pathlib.Path) -> list[str]:
    path = root / SYSTEM_LOG
    lines = path.read_text(errors="replace").splitlines() if path.exists() else []
    return [line.split("]: ", 1)[-1] for line in lines if re.match(r"\S+ error ", line)]


class Judgement:
    """What is broken after one command. The tree is used up."""

    def __init__(self, stage: Stage, scene: Scene, root: pathlib.Path, ended: Ended) -> None:
        self.stage, self.scene, self.root, self.ended = stage, scene, root, ended
        self.broken: list[str] = []
        self.acknowledged = ended.status == 0
        self.had_before = _spool_names(stage.tree(scene.tree))
        known = len(_error_lines(stage.tree(scene.tree)))
        self.errors = _error_lines(root)[known:]
        # What a failed call cost is told, or it is a broken promise; a kill costs nothing.
        self.is_excused = ended.status is not None and bool(self.errors)
        self.was_repeated_by_hand = False
        self.usage = scenes.USAGE

    def run(self) -> list[str]:
        for check in (self.check_end, self.check_whole, self.check_effect, self.run_passes):
            if not self.attempt(check):
                return self.broken
        for check in (self.check_counters, self.check_usage, self.check_preferences,
                      self.check_logs, self.check_told_once, self.check_structured,
                      self.check_rest):
            self.attempt(check)
        return self.broken

    def attempt(self, check) -> bool:
        try:
            check()
        except (Broken, OSError, ValueError, KeyError) as why:
            what = str(why) if isinstance(why, Broken) else f"{check.__name__}: {why!r}"
            self.broken.append(what)
            return False
        return True

    def check_end(self) -> None:
        """The exit status, and one line that says why."""
        status, lines = self.ended.status, self.ended.errors.splitlines()
        if status is None:
            return
        said = self.ended.errors.strip()[:200]
        if self.scene.is_pass:
            require(status == 0, f"the exit status is {status}: {said}")
            return
        require(status in (0, 1), f"the exit status is {status}: {said}")
        require(status == 0 or len(lines) == 1, f"{len(lines)} lines tell of one failure: {said}")

    def check_whole(self) -> None:
        verdict.check_files(self.root)

    def check_effect(self) -> None:
        """What can be told from the files alone; what may be said again is."""
        if self.scene.name not in ("prefs", "submit", "consent-off"):
            return
        self.check_files_of_effect()
        if not self.acknowledged:
            if self.scene.name == "consent-off":
                self.check_consent_left()
            argv = self.stage.argv(self.scene.command)
            self.stage.programs.run(self.root, int(time.time()), *argv)
            self.acknowledged = True
            self.check_files_of_effect()

    def check_files_of_effect(self) -> None:
        names, before = _spool_names(self.root), self.had_before
        if self.scene.name == "prefs":
            wanted = {42} if self.acknowledged else {42, None}
            found = _preference(self.root, *story.PREFERENCE)
            require(found in wanted, f"preference {story.PREFERENCE[1]} is {found}")
        elif self.scene.name == "submit":
            both = sorted(names["pending"] + names["outbox"])
            require(both == sorted(before["pending"] + before["outbox"]),
                    f"the spool has {both} after submitting")
            require(not self.acknowledged or not names["pending"], "submitted logs are pending")
        elif self.acknowledged:
            left = [path.name for stage in names for path in (self.root / SPOOL / stage).iterdir()]
            require(not left, f"logs are left without consent: {left}")
            require(not self.has_consent(), "the consent stands")

    def check_consent_left(self) -> None:
        whole = _spool_names(self.root) == self.had_before
        require(whole or not self.has_consent(), "logs are removed although the consent stands")

    def has_consent(self) -> bool:
        return _preference(self.root, "nuvex.diagwell", "SubmissionEnabled") is True

    def grow(self, amount: int) -> None:
        self.usage += amount
        scenes.write_usage(self.root, self.usage)

    def run_passes(self) -> None:
        programs, now = self.stage.programs, int(time.time())
        self.grow(GROWTH[0])
        programs.run(self.root, now, programs.quorlet, "-d")
        self.repeat_lost_log(now)
        self.grow(GROWTH[1])
        programs.run(self.root, now + 86400, programs.quorlet, "-d")
        verdict.check_files(self.root)

    def repeat_lost_log(self, now: int) -> None:
        """By the command that the error line names."""
        day = self.stage.today - 1
        if not self.has_consent() or day in verdict.read_spool(self.root).days:
            return
        self.was_repeated_by_hand = True
        told = [line for line in self.errors if line.startswith(f"The log of day {day} ")]
        require(self.is_excused and told, f"no log of day {day}, and no error line says so")
        command = re.search(r'"(quorlet -\w)"', told[-1])
        require(command is not None, f"not the command that repeats the day: {told[-1]}")
        self.stage.programs.run(self.root, now, self.stage.programs.quorlet,
                                command[1].split()[1])
        require(day in verdict.read_spool(self.root).days, f"{command[1]} leaves no log of {day}")

    def wanted_counters(self) -> list[tuple[dict[str, int], int]]:
        """Yesterday's scalars, and how many values: with the command's effect, or without."""
        after = dict(scenes.COUNTERS)
        for key, amount in self.scene.adds.items():
            after[key] = after.get(key, 0) + amount
        wanted = [(after, scenes.VALUES + self.scene.values)]
        if not self.acknowledged:
            wanted.append((scenes.COUNTERS, scenes.VALUES))
        return wanted

    def check_counters(self) -> None:
        now, programs = int(time.time()), self.stage.programs
        self.scalars, values = verdict.dump(programs, self.root, now + 86400)
        day = self.stage.today - 1
        stored = {key: value for (at, key), value in self.scalars.items()
                  if at == day and key.startswith("nuvex.story")}
        self.found = stored, values[day, "nuvex.storydist.t"]
        wanted = self.wanted_counters()
        require(self.found in wanted, f"counters: {self.found}, not {wanted[0]}")

    def check_usage(self) -> None:
        found = sum(value for (_, key), value in self.scalars.items()
                    if key.startswith("datausage.wifiInKB"))
        require(found == self.usage, f"network usage is {found} KB, not {self.usage}")
        odd = [key for _, key in self.scalars if "baddata" in key or "olddata" in key]
        require(not odd, f"network usage went backwards: {odd}")

    def check_preferences(self) -> None:
        for domain in scenes.FOREIGN:
            require(_preference(self.root, domain, "Foreign") == "kept",
                    f"{domain} has lost another program's key")

    def check_logs(self) -> None:
        spool = verdict.read_spool(self.root)
        if not self.has_consent():
            require(not spool.days and not spool.status, "a log was written without consent")
            return
        for day, logs in spool.days.items():
            require(len(logs) == 1, f"{len(logs)} aggregated logs of day {day}")
        require(spool.status <= 1, f"{spool.status} status logs of one week")
        require(spool.status == 1 or self.is_excused, "no status log, and no error line")
        if self.scene.tree != "fresh":
            require(self.stage.today - 2 in spool.days, "the log of an earlier day is gone")
        self.check_log(spool.days[self.stage.today - 1][0])

    def check_log(self, document: dict) -> None:
        """The same as the store has; what a failed call left out is told."""
        scalars = {key: value for key, value in document["TLScalars"].items()
                   if key.startswith("nuvex.story")}
        counted = {key: summary[-1] for key, summary in document["TLDistributions"].items()}
        found = {**scalars, **counted}
        stored = {**self.found[0], "nuvex.storydist.t": self.found[1]}
        odd = {key: value for key, value in found.items() if stored.get(key) != value}
        require(not odd, f"the log has {odd}, the store {stored}")
        missing = sorted(set(stored) - set(found))
        require(not missing or self.is_excused,
                f"the log lacks {missing}, and no error line says so")

    def check_told_once(self) -> None:
        """The OS version before, the corruptions and app info stand in a log."""
        if not self.has_consent():
            return
        spool, day = verdict.read_spool(self.root), self.stage.today - 1
        logs = [document for documents in spool.days.values() for document in documents]
        corruptions = sum(log["TLScalars"].get(scenes.CORRUPTION_KEY, 0) for log in logs)
        left = _preference(self.root, "nuvex.aggregated", "DatabaseCorruptionCount") or 0
        require(corruptions + left == scenes.CORRUPTIONS,
                f"{corruptions} corruptions are told, {left} left to tell of {scenes.CORRUPTIONS}")
        require(left == 0 or self.is_excused, f"{left} corruptions are not told, and no error line")
        before = "<unknown>" if self.scene.tree == "fresh" else scenes.OLD_VERSION
        told = [metadata.get("previous_os_version") for metadata in spool.metadata.values()]
        require(before in told, f"no log tells the OS version before, but {told}")
        if not self.is_excused:
            version = spool.metadata[day].get("previous_os_version")
            require(version == before, f"the OS version before is told as {version}")
        if self.scene.tree == "killed":
            apps = spool.days[day][0].get("TLActivatedAppInfo", [])
            require([app["bundle"] for app in apps] == [scenes.APP["bundle_id"]],
                    f"the log's app info is {apps}")

    def check_structured(self) -> None:
        doubled = not self.was_repeated_by_hand  # that pass was a second one
        verdict.check_structured(self.root, scenes.EVENTS, doubled)

    def check_rest(self) -> None:
        """No support log is lost, and what is left unfinished is used by the next writer."""
        log = self.root / scenes.SUPPORT_LOG
        copies = [path.read_text() for path in log.parent.glob(log.name + "*")]
        kept = copies.count(scenes.SUPPORT_TEXT)
        require(kept == 1, f"a support log is there {kept} times")
        known = re.compile(r"\.([A-Za-z.-]+\.)?(lock|tmp)")  # no number: no new name each time
        litter = [path.name for path in self.root.rglob(".*")
                  if path.is_file() and not known.fullmatch(path.name)]
        require(not litter, f"unfinished files stay: {litter}")


def judge(stage: Stage, scene: Scene, root: pathlib.Path, ended: Ended) -> list[str]:
    return Judgement(stage, scene, root, ended).run()
