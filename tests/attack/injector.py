"""The preloaded library fail_nth.cpp as the fault campaign handles it."""

import ctypes
import errno
import mmap
import os

# fail_nth.cpp has the same list in the same order. An errno that the kernel can give there; EINTR
# and "short" are no failures and must change nothing; with "+" every later call fails too.
CLASSES = {
    "open": ["EIO", "EMFILE", "EMFILE+"], "read": ["EIO", "EINTR", "short"],
    "write": ["EIO", "ENOSPC", "ENOSPC+", "EINTR", "short"], "rename": ["EIO", "ENOSPC"],
    "link": ["EIO", "ENOSPC"], "unlink": ["EIO"], "mkdir": ["EIO", "ENOSPC"], "sync": ["EIO"],
    "truncate": ["EIO", "ENOSPC"], "fork": ["EAGAIN", "EAGAIN+"], "thread": ["EAGAIN", "EAGAIN+"],
    "kill": ["EPERM"], "map": ["ENOMEM"], "alloc": ["ENOMEM", "ENOMEM+"], "pipe": ["EMFILE"],
    "poll": ["EINTR", "ENOMEM"], "lock": ["EIO", "ENOLCK"], "descriptor": ["EMFILE"],
    "stat": ["EIO", "ENOMEM"], "identity": ["EPERM"], "wait": ["EINTR"], "owner": ["EPERM"],
    "socket": ["ECONNRESET", "EMFILE", "EINTR", "short"],
    "watch": ["ENOMEM", "ENOSPC"],
}
HARMLESS = ("EINTR", "short")
SHORT_TRANSFER = -1


class Control(ctypes.Structure):
    _fields_ = [("armed", ctypes.c_uint32), ("wanted", ctypes.c_uint32), ("way", ctypes.c_int32),
                ("from_then_on", ctypes.c_uint32), ("nth", ctypes.c_uint64),
                ("failed", ctypes.c_uint64), ("in_sqlite", ctypes.c_uint64),
                ("seen", ctypes.c_uint64 * len(CLASSES)), ("what", ctypes.c_char * 256)]


class Faults:
    """The preloaded library as seen from here."""

    def __init__(self, house):
        path = house.dir + "/control"
        with open(path, "wb") as file:
            file.truncate(ctypes.sizeof(Control))
        os.chmod(path, 0o666)
        with open(path, "r+b") as file:
            self.memory = mmap.mmap(file.fileno(), ctypes.sizeof(Control))
        self.control = Control.from_buffer(self.memory)
        self.environment = {"LD_PRELOAD": house.bin_dir + "/libfail_nth.so",
                            "ARBORY_FAIL_NTH": path}

    def arm(self, kind="open", way="EIO", nth=0):
        ctypes.memset(ctypes.addressof(self.control), 0, ctypes.sizeof(Control))
        name = way.rstrip("+")
        self.control.wanted = list(CLASSES).index(kind)
        self.control.way = SHORT_TRANSFER if name == "short" else getattr(errno, name)
        self.control.from_then_on = way.endswith("+")
        self.control.nth = nth
        self.control.armed = 1

    def disarm(self):
        self.control.armed = 0

    def wants(self, kind):
        return self.control.wanted == list(CLASSES).index(kind)

    def seen(self, kind):
        return self.control.seen[list(CLASSES).index(kind)]
