"""Kills a process of the program (SIGKILL) at a random moment of an operation, and looks after each
whether everything still holds, by the same promises as the campaign of faults. Which process is one of

  program   the command in the terminal, or the server
  child     the one that answers the call
  worker    one that goes on after the answer, to search or to clean
  sorter    what a worker with very many results makes

that are there at that moment, or the next of its kind that comes.
"""

import multiprocessing
import os
import random
import signal
import threading
import time

from attack import Outcome
from fault_operations import Attack, Call, Download, Http, Stop, operations
from faults import check_stores
from house import DEADLINE, Hang, SEARCH, become_subreaper, children, eventually
from scene import OLD_HISTORY, Broken, check_files, check_goes_on, check_reply, demand

PROMISE = "A process that is killed costs its own answer at most: nothing else is lost or left over"
ATTACK = "SIGKILL to program, child, worker or sorter at a random moment of each operation"

ROUNDS = 5000
SHORT_ROUNDS = 40
MANY = 100_000  # rows, from which on a sorter is made
WITH_WORKER = ("start", "stop", "clean", "search")


class NoFaults:
    """In the place of the injector: here processes fail."""

    def __init__(self, house):
        self.environment = {}
        self.cut = False

    def wants(self, kind):
        return kind == "socket" and self.cut

    def disarm(self):
        pass


def tree_of(process):
    below = children(process)
    return below.union(*(tree_of(child) for child in below))


def kind_of(process, spared):
    """By its process group: a child leads one, and what it forks is in that. None for one that has
    ended, or is none of the program's. Nor is a child of those that are spared one: it has answered
    before, and who kills it while it ends kills the search with it that it has started."""
    try:
        with open(f"/proc/{process}/stat") as file:
            name, _, rest = file.read().partition("(")[2].rpartition(")")
        state, parent, group = rest.split()[:3]
        # Bubblewrap and what runs in it are not this house's.
        if state == "Z" or name != "arbory":
            return None
        if int(group) == os.getpgrp():
            return "program"
        if int(group) != process:
            return "worker"
        if int(parent) in spared:
            return None
        return "child" if os.getpgid(int(parent)) == os.getpgrp() else "sorter"
    except (OSError, ValueError):
        return None


class Killer(threading.Thread):
    """Kills one process of that kind `moment` seconds after its start, or the next that comes until
    it is told that the operation is over."""

    def __init__(self, kind, moment, spared):
        super().__init__(daemon=True)
        self.kind, self.moment, self.spared = kind, moment, spared
        self.over = threading.Event()
        self.killed = None

    def run(self):
        if self.over.wait(self.moment):
            return
        while not self.over.is_set() and self.killed is None:
            for process in tree_of(os.getpid()) - self.spared:
                if kind_of(process, self.spared) == self.kind:
                    self.kill(process)
                    break
            else:
                time.sleep(0.0001)

    def kill(self, process):
        try:
            os.kill(process, signal.SIGKILL)
            self.killed = self.kind
        except ProcessLookupError:
            pass


class Many(Call):
    """A search that finds so much that a process of its own sorts it."""

    def __init__(self):
        super().__init__(SEARCH + "start", {"folder_path": "/many", "pattern": "file"},
                         (OLD_HISTORY, ["file", *OLD_HISTORY]))

    def check_content(self, attack, reply, harmless):
        if reply["code"] != 0:
            return
        task = reply["data"]["taskid"]
        attack.list_to_end(task)
        listed = check_reply(attack.call(SEARCH + "list", {"taskid": task, "sort_by": "name",
                                                           "limit": 2}))
        state = attack.checker.ask("GET", "/searches/" + task)
        if b'"progress":1' in state.content:
            demand(listed["code"] == 0 and listed["data"]["total"] == MANY and
                   [file["name"] for file in listed["data"]["files"]] == ["file0", "file1"],
                   f"a complete search lost files: {listed}")


class Campaign:
    def __init__(self, bin_dir, outcome, options):
        self.outcome = outcome
        self.options = options
        self.attack = Attack(bin_dir, NoFaults)
        self.operations = operations() | {"start-many": Many()}
        self.operations.pop("refusal", None)  # it takes two seconds
        self.make_many()
        self.lengths = {name: min(self.length(operation) for _ in range(2))
                        for name, operation in self.operations.items()}

    def make_many(self):
        folder = self.attack.house.dir + "/volume1/many"
        os.mkdir(folder)
        os.mknod(folder + "/file0")
        for number in range(1, MANY):
            os.link(folder + "/file0", f"{folder}/file{number}")

    def prepare(self, operation):
        self.attack.restart()
        operation.prepare(self.attack)
        if isinstance(operation, Http):
            self.attack.server(operation.logins)

    def length(self, operation):
        """Seconds that it takes, workers and all."""
        self.prepare(operation)
        begin = time.monotonic()
        result = operation.run(self.attack)
        self.settle(operation)
        length = time.monotonic() - begin
        operation.check(self.attack, result, True)
        check_goes_on(self.attack, check_files(self.attack))
        return length

    def settle(self, operation):
        """Until none but what may stay is there."""
        house = self.attack.house
        for server in (self.attack.victim, self.attack.logins):
            if server and server.lives():
                demand(eventually(lambda: not children(server.process)), "the server keeps a child")

        def all_ended():
            for process in children() - house.known:
                os.waitpid(process, os.WNOHANG)
            return children() <= house.known
        demand(eventually(all_ended), "a process is left over")

    def check(self, operation, result, killed):
        attack = self.attack
        if killed == "program":
            if isinstance(operation, Http):
                status, content = result
                # A child that has no group of its own yet is taken for the program.
                demand(status in (0, 200, 503), f"status {status}: {content}")
                if status == 200:
                    operation.check_body(attack, content, False)
            elif isinstance(operation, Call) and result[0] != -signal.SIGKILL:
                operation.check(attack, result, False)
            if isinstance(operation, Stop):
                attack.call(SEARCH + "stop", {"taskid": operation.running})
                demand(eventually(lambda: not children(attack.checker.process)),
                       "a stopped worker lives on")
            return
        attack.faults.cut = isinstance(operation, Download) and killed == "child"
        operation.check(attack, result, killed is None)

    def round(self, number):
        name, kind, part = self.chosen(number)
        operation, attack = self.operations[name], self.attack
        self.prepare(operation)
        killer = Killer(kind, part * self.lengths[name], {attack.checker.process} |
                        {server.process for server in (attack.victim, attack.logins)
                         if server and not isinstance(operation, Http)})
        killer.start()
        try:
            result = operation.run(attack)
            self.settle(operation)
            killer.over.set()
            killer.join()
        except Hang:
            raise Broken(f"nothing within {DEADLINE:.0f} s, or a process left over") from None
        finally:
            killer.over.set()
        self.outcome.count(f"{killer.killed or 'nobody'} killed")
        self.check(operation, result, killer.killed)
        left = check_files(attack)
        check_stores(attack, operation)
        check_goes_on(attack, left)

    def chosen(self, number):
        random.seed(f"{self.options.seed} {number}")
        name = random.choice(list(self.operations))
        kinds = ["program", "child"]
        kinds += ["worker"] * any(word in name for word in WITH_WORKER)
        kind = random.choice(kinds + ["sorter"] * (name == "start-many"))
        return name, kind, random.random() ** 3  # most happens early

    def try_round(self, number):
        self.outcome.count("rounds")
        try:
            self.round(number)
        except Exception as broken:
            what = broken if isinstance(broken, Broken) else repr(broken)
            self.outcome.breaks("%s, %s after %.0f %%: %s" % (*self.chosen(number)[:2],
                                100 * self.chosen(number)[2], what),
                                f"scripts/attack kills --seed {self.options.seed} --only {number}")
            self.attack.forget_servers()


def attack_share(numbers, options, bin_dir):
    become_subreaper()
    outcome = Outcome()
    campaign = Campaign(bin_dir, outcome, options)
    try:
        for number in numbers:
            campaign.try_round(number)
    finally:
        campaign.attack.close()
    return outcome


def options(parser):
    parser.add_argument("--only", type=int, metavar="ROUND")
    parser.add_argument("--rounds", type=int, default=ROUNDS)
    parser.add_argument("--seed", type=int, default=1)
    parser.add_argument("--jobs", type=int, default=2, help="rounds made at the same time")


def run(options, bin_dir, top):
    outcome = Outcome()
    if options.short:
        options.rounds = SHORT_ROUNDS
    numbers = [options.only] if options.only is not None else range(options.rounds)
    shares = [numbers[job::options.jobs] for job in range(options.jobs)]
    with multiprocessing.Pool(options.jobs, maxtasksperchild=1) as pool:
        work = [pool.apply_async(attack_share, (share, options, bin_dir))
                for share in shares if share]
        for each in work:
            outcome.add(each.get())
    return outcome
