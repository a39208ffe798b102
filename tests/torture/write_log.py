"""The log of a disk's writes as QEMU's blklogwrites and the kernel's dm-log-writes make it, and its replay.

The log begins with a sector that holds the magic, the version, the number of entries and the sector size. Every entry is a
sector with its head (first sector written, number of sectors, flags, length of a mark's data) and then the data.
"""

import os
import struct

HEAD = struct.Struct("<QQQI")
ENTRY = struct.Struct("<QQQQ")
MAGIC, VERSION = 0x6A736677736872, 1
FLUSH, FUA, DISCARD, MARK = 1, 2, 4, 8


class Entry:
    def __init__(self, start, data, end, sector, count, flags):
        self.start, self.data, self.end = start, data, end  # where it begins in the log, its data, and what comes next
        self.sector, self.count, self.flags = sector, count, flags  # in bytes


def entries(log):
    """Every entry of an open log, in order. The number in the first sector is written with each flush."""
    magic, version, number, size = HEAD.unpack(os.pread(log, HEAD.size, 0))
    if magic != MAGIC or version != VERSION:
        raise ValueError("this is no log of writes")
    found, at = [], size
    for _ in range(number):
        sector, count, flags, length = ENTRY.unpack(os.pread(log, ENTRY.size, at))
        data = at + size
        end = data + (0 if flags & DISCARD else count * size) + (length if flags & MARK else 0)
        found.append(Entry(at, data, end, sector * size, count * size, flags))
        at = end
    return found


def apply(entry, log, disk):
    """Writes an entry's data on an open disk image. What a discard leaves is undefined: it is left as it was."""
    if entry.flags & (DISCARD | MARK) or not entry.count:
        return
    os.pwrite(disk, os.pread(log, entry.count, entry.data), entry.sector)
