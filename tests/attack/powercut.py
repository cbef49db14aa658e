"""Copies the disk, an ext4 on a loop device, at random moments while a server works on it, and looks
at each copy as at a machine that comes up again: the file system is mounted, which replays its
journal, and a server is started on it. Every history that was answered for is there, what was being
written is there or not, and everything else holds as after a fault.

The copy is of one moment: the disk's file lies on an xfs, which clones it while nothing is written.
So it has each block write that the disk was given, up to that moment, and none that only the
system's memory had: what nobody has asked to be synced.
"""

import ctypes
import fcntl
import json
import mmap
import os
import random
import shutil
import signal
import sqlite3
import struct
import subprocess
import tempfile
import time
import traceback

from attack import Outcome
from house import HISTORY, SEARCH, Server, become_subreaper
from scene import Broken, Scene, check_files, check_goes_on, check_reply, demand, patterns

PROMISE = "A power cut loses nothing that was answered for, and damages nothing"
ATTACK = "an ext4 copied at random moments while histories and searches are written"

ROUNDS = 1000
SHORT_ROUNDS = 12
DISK_MIB, LOWER_MIB = 64, 512
BLOCK = 4096
FICLONE = 0x40049409
CLONE_NEWNS = 0x20000
LONGEST_WAIT = 0.05  # seconds before a copy
DELETE_EVERY = 5  # operations on the history
SEARCH_EVERY = 3


def mount(image, folder, make):
    if make:
        subprocess.run([*make, image], check=True, capture_output=True)
    subprocess.run(["mount", "-o", "loop", image, folder], check=True, capture_output=True)


def file_of(path, size):
    with open(path, "wb") as file:
        file.truncate(size)
    return path


class Disk:
    """The disk that a house stands on."""

    def __init__(self):
        fast = "/dev/shm" if os.access("/dev/shm", os.W_OK) else None
        self.dir = tempfile.mkdtemp(prefix="arbory-disk-", dir=fast)
        self.lower = self.dir + "/lower"
        self.mounted = []
        os.mkdir(self.lower)
        self.mount(file_of(self.dir + "/lower.img", LOWER_MIB << 20), self.lower,
                   ["mkfs.xfs", "-q", "-m", "reflink=1"])
        self.image = file_of(self.lower + "/disk.img", DISK_MIB << 20)

    def mount(self, image, folder, make):
        mount(image, folder, make)
        self.mounted.append(folder)

    def place(self, folder):
        self.mount(self.image, folder, ["mkfs.ext4", "-q", "-b", str(BLOCK)])

    def copy(self):
        path = self.lower + "/copy.img"
        with open(self.image, "rb") as source, open(path, "wb") as target:
            fcntl.ioctl(target.fileno(), FICLONE, source.fileno())
        return path

    def remove(self):
        for folder in reversed(self.mounted):
            subprocess.run(["umount", "-l", folder], capture_output=True)
        for folder in self.mounted[1:]:
            shutil.rmtree(folder, ignore_errors=True)
        shutil.rmtree(self.dir, ignore_errors=True)


class Writer:
    """A process that goes on asking, and tells how far it has come."""

    def __init__(self, scene):
        self.memory = mmap.mmap(-1, mmap.PAGESIZE)
        self.process = os.fork()
        if self.process == 0:
            try:
                self.write(scene)
            finally:
                os._exit(1)
        scene.house.known.add(self.process)

    def write(self, scene):
        for number in range(1 << 30):
            self.memory[0:8] = struct.pack("q", number + 1)
            reply = scene.call(*operation(number))
            if reply["code"] != 0:
                return
            self.memory[8:16] = struct.pack("q", number + 1)
            if number % SEARCH_EVERY == 0:
                scene.call(SEARCH + "clean", {"taskid": scene.search("one")})

    def begun(self):
        return struct.unpack("q", self.memory[0:8])[0]

    def answered(self):
        return struct.unpack("q", self.memory[8:16])[0]


def operation(number):
    if number % DELETE_EVERY == 0:
        return HISTORY + "delete", {}
    return HISTORY + "set", {"pattern": f"number {number}"}


def history_after(count):
    """What the history holds once so many operations were done, but for what searches add."""
    if count == 0:
        return ["older"]
    first = (count - 1) // DELETE_EVERY * DELETE_EVERY + 1
    return [f"number {number}" for number in range(count - 1, first - 1, -1)]


def look(scene, image, answered, begun):
    """In a process with mounts of its own, where the copy stands in the disk's place."""
    if ctypes.CDLL(None).unshare(CLONE_NEWNS) != 0:
        raise OSError("unshare")
    subprocess.run(["mount", "--make-rprivate", "/"], check=True)
    mount(image, scene.house.dir, None)
    house = scene.house
    house.known = set()
    scene.checker = Server(house, "again")
    reply = check_reply(scene.call(HISTORY + "get", {}))
    demand(reply["code"] == 0, f"the history cannot be read: {reply}")
    found = [each for each in patterns(reply) if each != "one"]
    possible = [history_after(count) for count in range(answered, begun + 1)]
    demand(found in possible, f"the history is {found}, of {answered} to {begun}: {possible}")
    with open(house.preference + "/usersettings") as file:
        json.load(file)
    for name in os.listdir(house.preference):
        if name.endswith(".db"):
            with sqlite3.connect(f"file:{house.preference}/{name}?mode=ro", uri=True) as database:
                demand(database.execute("PRAGMA integrity_check").fetchall() == [("ok",)],
                       f"{name} is damaged")
    for task in house.task_ids() | {scene.found}:
        listed = check_reply(scene.call(SEARCH + "list", {"taskid": task}))
        demand(listed["code"] != 100, f"a list failed inside: {listed}")
    check_goes_on(scene, check_files(scene))
    scene.checker.stop()


def in_a_process(act):
    """What `act` says went wrong; nothing when it returns."""
    ours, theirs = os.pipe()
    child = os.fork()
    if child == 0:
        try:
            become_subreaper()
            signal.alarm(60)
            act()
        except BaseException as broken:
            os.write(theirs, (str(broken) if isinstance(broken, Broken) else
                              traceback.format_exc()).encode())
        finally:
            os._exit(0)
    os.close(theirs)
    with os.fdopen(ours, "rb") as file:
        said = file.read().decode()
    _, status = os.waitpid(child, 0)
    return said or ("it did not end" if status else "")


def options(parser):
    parser.add_argument("--rounds", type=int, default=ROUNDS)
    parser.add_argument("--seed", type=int, default=1)


def run(options, bin_dir, top):
    outcome = Outcome()
    if os.geteuid() != 0 or not shutil.which("mkfs.xfs") or not shutil.which("mkfs.ext4"):
        outcome.skip("a disk of its own: only root can mount one; and mkfs.xfs is needed")
        return outcome
    become_subreaper()
    disk = Disk()
    scene = None
    try:
        scene = Scene(bin_dir, place=disk.place)
        scene.furnish()
        os.sync()
        writer = Writer(scene)
        random.seed(options.seed)
        for number in range(SHORT_ROUNDS if options.short else options.rounds):
            time.sleep(random.random() * LONGEST_WAIT)
            answered = writer.answered()
            image = disk.copy()
            begun = writer.begun()
            outcome.count("power cuts")
            outcome.count("in the middle of an operation", begun > answered)
            said = in_a_process(lambda: look(scene, image, answered, begun))
            if said:
                outcome.breaks(f"power cut {number} after {answered} operations: {said}",
                               f"scripts/attack powercut --seed {options.seed}")
        if writer.answered() < 2:
            outcome.breaks("nothing was written meanwhile", "scripts/attack powercut")
        outcome.count("operations answered meanwhile", writer.answered())
    finally:
        if scene:
            scene.close()
        disk.remove()
    return outcome
