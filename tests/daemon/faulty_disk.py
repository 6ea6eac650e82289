"""Tells a daemon's faulty_disk library what to do, and asks what it has counted."""

import mmap
import struct

# The numbers are those of faulty_disk.cpp.
FAULTS = ["none", "slow", "hang", "read_error", "write_error", "torn", "full", "read_only"]


class FaultyDisk:
    """The memory that both share, in the file `path`."""

    def __init__(self, library, path):
        self.library = library
        self.path = path
        with open(path, "wb+") as file:
            file.truncate(40)
            self.memory = mmap.mmap(file.fileno(), 40)

    def environment(self):
        """What a daemon is to be started with."""
        return {"LD_PRELOAD": self.library, "FAULTY_DISK": self.path}

    def tell(self, fault="none", milliseconds=0):
        self.memory[24:32] = struct.pack("<q", milliseconds)
        self.memory[16:24] = struct.pack("<q", FAULTS.index(fault))

    def set_clock_ahead(self, seconds):
        self.memory[32:40] = struct.pack("<q", seconds)

    def syncs(self):
        return struct.unpack("<q", self.memory[0:8])[0]
