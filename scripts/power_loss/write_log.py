"""Reads what the kernel's dm-log-writes target recorded.

The log begins with a superblock of one sector, all numbers little-endian:
    u64 magic, u64 version, u64 number of entries, u32 sector size
Each entry is one sector, followed by the bytes it describes, rounded up to whole sectors:
    u64 first sector, u64 sectors, u64 flags, u64 length of the bytes that follow the entry's header
A mark has no sectors: its text lies in its own sector, behind the header. A discard has no bytes.
"""
from __future__ import annotations

import dataclasses
import pathlib
import struct

MAGIC = 0x6A736677736872
FLUSH, FUA, DISCARD, MARK = 1, 2, 4, 8
_SUPER = struct.Struct("<QQQI")
_ENTRY = struct.Struct("<QQQQ")


@dataclasses.dataclass(frozen=True)
class Entry:
    """One write, flush, discard or mark, in the order in which the disk had them."""
    flags: int
    offset: int  # bytes from the start of the disk
    length: int
    data: bytes = b""
    mark: str = ""

    @property
    def changes_disk(self) -> bool:
        return self.length > 0


def read_log(path: pathlib.Path) -> list[Entry]:
    """Every entry of a log disk; ValueError when it is none."""
    with path.open("rb") as disk:
        magic, version, count, sector = _SUPER.unpack(disk.read(_SUPER.size))
        if magic != MAGIC or version != 1 or sector < 512:
            raise ValueError("not a log of dm-log-writes")
        position = sector
        entries = []
        for _ in range(count):
            disk.seek(position)
            head = disk.read(sector)
            position += sector
            first, sectors, flags, length = _ENTRY.unpack_from(head)
            if flags & MARK:
                text = head[_ENTRY.size:_ENTRY.size + length]
                entries.append(Entry(flags, 0, 0, mark=text.rstrip(b"\0").decode()))
                continue
            # Sectors of an entry are of the log's own size.
            size = sectors * sector
            data = b"" if flags & DISCARD else disk.read(size)
            position += len(data)
            entries.append(Entry(flags, first * sector, size, data))
    return entries
