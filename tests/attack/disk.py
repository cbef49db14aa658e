"""Puts the state directory, the preferences and the results in turn on a file system of a few hundred
KiB, leaves it a number of free blocks, from none on, and lets each operation run there. Every one
answers, nothing stored before is lost, and with room again everything works.
"""

import os
import subprocess

from attack import Outcome
from fault_operations import Attack, operations
from faults import check_stores
from house import DEADLINE, Hang, become_subreaper
from scene import Broken, check_files, check_goes_on

PROMISE = "A full disk costs a clear error: nothing stored is lost, and with room again all works"
ATTACK = ("each operation on a small file system for state, preferences and results, with each "
          "number of free blocks")

SIZE = 768 << 10  # two searches and little more
BLOCK = 4096
SHORT_LEVELS = (0, 2)
# A search that has all it wants takes some 60 blocks.
LEVELS = (*range(16), *range(16, 80, 4))
# A server writes nothing of its own.
OPERATIONS = ("start", "list", "stop", "clean", "clean-all", "get", "set", "delete", "search")


class NoFaults:
    """In the place of the injector: here the disk fails, and with it whatever is written."""

    def __init__(self, house):
        self.environment = {}

    def wants(self, kind):
        return False

    def disarm(self):
        pass


class Disk:
    """A small file system in the place of a folder of the house."""

    def __init__(self, attack, folder):
        self.folder = folder
        self.filler = folder + "/filler"
        subprocess.run(["mount", "-t", "tmpfs", "-o", f"size={SIZE}", "none", folder], check=True)
        attack.restart()  # puts back what the file system has covered, and its owner

    def leave(self, blocks):
        info = os.statvfs(self.folder)
        with open(self.filler, "wb") as file:
            if info.f_bavail > blocks:
                os.posix_fallocate(file.fileno(), 0, (info.f_bavail - blocks) * BLOCK)

    def make_room(self):
        if os.path.exists(self.filler):
            os.unlink(self.filler)

    def remove(self):
        subprocess.run(["umount", "-l", self.folder], check=True)


def can_mount(folder):
    words = ["mount", "-t", "tmpfs", "-o", f"size={SIZE}", "none", folder]
    if subprocess.run(words, capture_output=True).returncode != 0:
        return False
    subprocess.run(["umount", folder], check=True)
    return True


def one_run(attack, disk, operation, blocks):
    attack.restart()
    operation.prepare(attack)
    disk.leave(blocks)
    try:
        result = operation.run(attack)
    except Hang:
        attack.house.kill_the_unknown()
        raise Broken(f"nothing within {DEADLINE:.0f} s, or a process left over") from None
    finally:
        disk.make_room()
    operation.check(attack, result, harmless=False)
    left = check_files(attack)
    check_stores(attack, operation)
    check_goes_on(attack, left)
    return len(left) > 0


def attack_place(attack, name, folder, levels, wanted, outcome):
    disk = Disk(attack, folder)
    try:
        for operation_name in OPERATIONS:
            if wanted not in ("", operation_name):
                continue
            for blocks in levels:
                left = False
                try:
                    left = one_run(attack, disk, operations()[operation_name], blocks)
                except Exception as broken:
                    what = broken if isinstance(broken, Broken) else repr(broken)
                    outcome.breaks(f"{operation_name} with {blocks} free blocks for {name}: {what}",
                                   f"scripts/attack disk --only {name}:{operation_name}:{blocks}")
                    attack.house.kill_the_unknown()
                outcome.count("runs on a full disk")
                outcome.count("left something to the sweep", left)
    finally:
        disk.remove()


def options(parser):
    parser.add_argument("--only", metavar="PLACE[:OPERATION[:BLOCKS]]", default="")


def run(options, bin_dir, top):
    outcome = Outcome()
    become_subreaper()
    attack = Attack(bin_dir, NoFaults)
    house = attack.house
    place, operation, blocks = (options.only.split(":") + ["", ""])[:3]
    levels = SHORT_LEVELS if options.short else LEVELS
    try:
        if not can_mount(house.state):
            outcome.skip("a small file system: only root can mount one")
            return outcome
        for name, folder in (("state", house.state), ("preferences", house.preference),
                             ("results", house.dir + "/volume1/@tmp")):
            if place in ("", name):
                attack_place(attack, name, folder, [int(blocks)] if blocks else levels, operation,
                             outcome)
    finally:
        attack.close()
    return outcome
