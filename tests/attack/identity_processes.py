"""Processes of one user as another reaches for them: rows of the identity campaign."""

import ctypes
import os
import signal
import socket
import subprocess

from house import children, eventually
from identity_cells import Cell
from identity_world import SETPRIV, may, system_call, uid_of

PTRACE_SEIZE = 0x4206
SYS_PIDFD_OPEN, SYS_PIDFD_SIGNAL, SYS_PIDFD_GETFD, SYS_KCMP = 434, 424, 438, 312


def seize(process):
    system_call("ptrace", PTRACE_SEIZE, process, None, None)


def read_memory(process):
    with open(f"/proc/{process}/maps") as maps:
        first = int(maps.read().split("-")[0], 16)
    buffer = ctypes.create_string_buffer(1)
    ours = (ctypes.c_size_t * 2)(ctypes.addressof(buffer), 1)
    theirs = (ctypes.c_size_t * 2)(first, 1)
    system_call("process_vm_readv", process, ours, ctypes.c_ulong(1), theirs, ctypes.c_ulong(1),
                ctypes.c_ulong(0))


def pidfd(process):
    return system_call("syscall", SYS_PIDFD_OPEN, process, 0)


def limit(process):
    system_call("prlimit", process, 0, None, (ctypes.c_uint64 * 2)())


def read(name):
    def act(process):
        with open(f"/proc/{process}/{name}", "rb") as file:
            file.read(0 if name == "mem" else 1)
    return act


PROCESS_ACTS = {
    "signal": lambda process: os.kill(process, signal.SIGURG),
    "no signal": lambda process: os.kill(process, 0),
    "signal by pidfd": lambda process: system_call("syscall", SYS_PIDFD_SIGNAL, pidfd(process),
                                                   signal.SIGURG, None, 0),
    "descriptor by pidfd": lambda process: system_call("syscall", SYS_PIDFD_GETFD, pidfd(process),
                                                       0, 0),
    "ptrace": seize, "read memory": read_memory, "limits": limit,
    "compare": lambda process: system_call("syscall", SYS_KCMP, os.getpid(), process, 2, 0, 0),
    "priority": lambda process: os.setpriority(os.PRIO_PROCESS, process, 19),
    "processors": lambda process: os.sched_setaffinity(process, os.sched_getaffinity(0)),
    "fd": lambda process: os.listdir(f"/proc/{process}/fd"),
    "descriptor": lambda process: os.close(os.open(f"/proc/{process}/fd/0", os.O_RDONLY)),
    "map_files": lambda process: os.listdir(f"/proc/{process}/map_files"),
    **{name: lambda process, name=name: os.readlink(f"/proc/{process}/{name}")
       for name in ("cwd", "root", "exe", "ns/mnt")},
    "into root": lambda process: os.listdir(f"/proc/{process}/root/"),
    **{name: read(name) for name in ("mem", "environ", "maps", "auxv", "io")},
}


class Actors:
    """Processes of the owner's that live for a while."""

    def __init__(self, world, owner):
        self.world = world
        self.started = []
        _, worker = world.run_search(owner)
        self.processes = {"worker": worker, "download's child": self.download(owner)}
        terminal, below = self.terminal(owner)
        self.processes |= {"terminal": terminal, "terminal's worker": below}
        become = [SETPRIV, f"--reuid={owner}", f"--regid={owner}", "--clear-groups",
                  "/bin/sleep", "1000"]
        plain = subprocess.Popen(become)
        self.started.append(plain)
        eventually(lambda: os.stat(f"/proc/{plain.pid}").st_uid == uid_of(owner) and
                   b"sleep" in open(f"/proc/{plain.pid}/cmdline", "rb").read()[:12])
        self.plain = plain.pid

    def download(self, owner):
        """Nobody reads what it sends."""
        before = children(self.world.server.process)
        self.client = socket.create_connection(("127.0.0.1", self.world.server.port))
        self.client.sendall(f"GET /files/run-{owner}/other.log HTTP/1.1\r\nHost: localhost\r\n"
                            f"Cookie: {self.world.visitors[owner].cookie}\r\n\r\n".encode())
        eventually(lambda: children(self.world.server.process) - before)
        return (children(self.world.server.process) - before).pop()

    def terminal(self, owner):
        house = self.world.house
        words = [SETPRIV, f"--reuid={owner}", f"--regid={owner}", "--init-groups",
                 house.program, "search", "--config", house.config, "--content", "zzz",
                 f"{self.world.top}/run-{owner}"]
        before = children()
        program = subprocess.Popen(words, stdin=subprocess.DEVNULL, stdout=subprocess.DEVNULL,
                                   stderr=subprocess.DEVNULL, cwd="/")
        self.started.append(program)
        # The worker loses its parent, the call, and becomes this process's.
        eventually(lambda: children() - before - {program.pid})
        return program.pid, (children() - before - {program.pid}).pop()

    def close(self):
        self.client.close()
        for program in self.started:
            program.terminate()
            program.wait()
        for worker in children() - self.world.house.known:
            os.waitpid(worker, 0)


def process_cells(world, owner, other):
    actors = Actors(world, owner)

    def control(act, process):
        # A process that has changed its user is shut even to that user.
        return may(owner, act, process) or (
            may(owner, act, actors.plain) and may("root", act, process))
    try:
        for thing, process in actors.processes.items():
            for operation, act in PROCESS_ACTS.items():
                yield Cell(thing, operation, owner, other,
                           lambda act=act, process=process: may(other, act, process),
                           lambda act=act, process=process: control(act, process),
                           (owner, thing, operation))
    finally:
        actors.close()
