"""Where the power can go, and what a disk then holds.

A disk with a volatile cache keeps everything up to its last completed flush, each write that was
forced to the medium, and any of the others. A point is named
    p120      everything up to the log's entry 120 and nothing after it
    s120.7    of the writes since the last flush before entry 120 a random part, drawn from seed 7
"""
from __future__ import annotations

import dataclasses
import random
import re

from write_log import DISCARD, FLUSH, FUA, Entry

PAGE = 4096


@dataclasses.dataclass(frozen=True)
class Point:
    entry: int  # entries before this one had been issued
    seed: int | None = None  # draws what of the unflushed writes survives; none: all

    def __str__(self) -> str:
        return f"p{self.entry}" if self.seed is None else f"s{self.entry}.{self.seed}"


def parse_point(text: str) -> Point:
    match = re.fullmatch(r"p(\d+)|s(\d+)\.(\d+)", text)
    if not match:
        raise ValueError(f"no point: {text} (p120, s120.7)")
    if match[1]:
        return Point(int(match[1]))
    return Point(int(match[2]), int(match[3]))


def _spread(items: list, count: int) -> list:
    """At most so many of them, evenly, the last one always among them."""
    if len(items) <= count:
        return items
    return [items[(i + 1) * len(items) // count - 1] for i in range(count)]


def choose(entries: list[Entry], count: int, seed: int) -> list[Point]:
    """Prefixes for up to two thirds of the points, reordered writes for the others."""
    # A cut has the marks that follow its last write: they were printed before the next one came.
    prefixes = [i for i, entry in enumerate(entries) if entry.changes_disk] + [len(entries)]
    points = [Point(i) for i in _spread(prefixes, count - count // 3)]
    reordered = [i for i in prefixes if len(_unflushed(entries, i)) > 1]
    draw = random.Random(seed)
    while reordered and len(points) < count:
        points.append(Point(draw.choice(reordered), draw.randrange(1 << 31)))
    return sorted(set(points), key=lambda point: (point.entry, point.seed or -1))


def _last_flush(entries: list[Entry], end: int) -> int:
    while end > 0 and not entries[end - 1].flags & FLUSH:
        end -= 1
    return end


def _unflushed(entries: list[Entry], end: int) -> list[int]:
    return [i for i in range(_last_flush(entries, end), end)
            if entries[i].changes_disk and not entries[i].flags & FUA]


def lost_entries(entries: list[Entry], point: Point) -> set[int]:
    """The writes before the point that did not reach the medium."""
    if point.seed is None:
        return set()
    draw = random.Random(point.seed)
    kept = draw.random()
    return {i for i in _unflushed(entries, point.entry) if draw.random() > kept}


def marks(entries: list[Entry], point: Point) -> list[str]:
    """The names of the steps that had been acknowledged."""
    return [entry.mark for entry in entries[:point.entry] if entry.mark]


Image = dict[int, bytes]  # number of a page -> its bytes; a page that is missing is zero


def apply(image: Image, entry: Entry) -> None:
    data = bytes(entry.length) if entry.flags & DISCARD else entry.data
    done = 0
    while done < len(data):
        page, start = divmod(entry.offset + done, PAGE)
        part = data[done:done + PAGE - start]
        old = image.get(page, bytes(PAGE))
        image[page] = old[:start] + part + old[start + len(part):]
        done += len(part)


def images(entries: list[Entry], base: Image, points: list[Point]):
    """The disk at each point; the points by ascending entry, so that writes are done once."""
    flushed, done = dict(base), 0
    for point in points:
        lost = lost_entries(entries, point)
        # What a flush made durable is common to this point and all later ones.
        for done in range(done, _last_flush(entries, point.entry)):
            apply(flushed, entries[done])
        done = _last_flush(entries, point.entry)
        image = dict(flushed)
        for i in range(done, point.entry):
            if i not in lost:
                apply(image, entries[i])
        yield image
