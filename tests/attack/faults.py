"""Lets every call of the C library fail once, by a preloaded library (fail_nth.cpp), while the
program works, and looks after each fault whether everything still holds:

  one reply, with a documented code and exit status, within 20 seconds
  nothing found is lost without a word
  no process and no descriptor left over
  what is left on disk is the user's own, and swept when it is a day old
  searches, histories and settings read as they were or as they were to become
  a search without faults works afterwards, and everything can be cleaned
"""

import json
import multiprocessing
import os
import random
import re
import sqlite3
import time

from attack import Outcome
from fault_operations import Attack, Http, operations
from house import (DEADLINE, FOUND, HISTORY, Hang, SEARCH, become_subreaper, children, eventually,
                   list_folder)
from injector import CLASSES, HARMLESS
from scene import Broken, check_files, check_goes_on, demand, paths, patterns

PROMISE = ("A call of the system that fails anywhere costs one clear error: nothing hangs, is lost, "
           "or is left over")
ATTACK = "each call of the C library fails once, over every operation"

# Of the thousands of allocations only some are failed, spread over all of them.
MOST_OF_A_KIND = {"alloc": 150}
SHORT_KINDS = 6  # of an operation's, in the short form


def check_stores(attack, operation):
    house = attack.house
    reply = attack.call(HISTORY + "get", {})
    demand(reply["code"] == 0 and patterns(reply) in operation.histories, f"the history is {reply}")
    with open(house.preference + "/usersettings") as file:
        json.load(file)
    for folder in (house.preference, house.results):
        for name in list_folder(folder):
            if name.endswith(".db"):
                database = sqlite3.connect(f"file:{folder}/{name}?mode=ro", uri=True)
                try:
                    demand(database.execute("PRAGMA integrity_check").fetchall() == [("ok",)],
                           f"{name} is damaged")
                finally:
                    database.close()
    listed = attack.call(SEARCH + "list", {"taskid": attack.found})
    if operation.keeps_results:
        demand(paths(listed) == FOUND, f"older results are lost: {listed}")


def one_fault(attack, operation, kind, way, nth):
    """Raises Broken; otherwise tells whether the n-th call was reached."""
    attack.restart()
    operation.prepare(attack)
    if isinstance(operation, Http):
        attack.server(operation.logins)
    attack.faults.arm(kind, way, nth)
    try:
        result = operation.run(attack)
        if isinstance(operation, Http):
            server = attack.logins if operation.logins else attack.victim
            eventually(lambda: not children(server.process))
    except Hang:
        attack.faults.disarm()
        attack.house.kill_the_unknown()
        raise Broken(f"nothing within {DEADLINE:.0f} s, or a process left over") from None
    finally:
        attack.faults.disarm()
    harmless = attack.faults.control.failed == 0 or way in HARMLESS
    operation.check(attack, result, harmless)
    left = check_files(attack)
    attack.left += len(left) > 0
    check_stores(attack, operation)
    check_goes_on(attack, left)
    return attack.faults.seen(kind) >= nth


class Campaign:
    def __init__(self, attack, outcome, options):
        self.attack = attack
        self.outcome = outcome
        self.options = options

    def try_one(self, name, operation, kind, way, nth):
        control = self.attack.faults.control
        try:
            reached = one_fault(self.attack, operation, kind, way, nth)
        except Exception as broken:
            reached = True
            what = broken if isinstance(broken, Broken) else repr(broken)
            self.outcome.breaks(f"{name}: {kind} fails with {way}: {control.what.decode()}: {what}",
                                f"scripts/attack faults --only {name}:{kind}.{way}:{nth}")
            self.attack.forget_servers()
        self.outcome.count("faults injected", min(control.failed, 1))
        self.outcome.count("of them in SQLite", min(control.in_sqlite, 1))
        return reached

    def over(self, name, operation):
        begin = time.monotonic()
        one_fault(self.attack, operation, "open", "EIO", 0)
        seen = {kind: self.attack.faults.seen(kind) for kind in CLASSES}
        for kind, way in self.chosen(seen):
            most = self.options.most or MOST_OF_A_KIND.get(kind, operation.most)
            for nth in spread(seen[kind], most):
                self.try_one(name, operation, kind, way, nth)
            nth = seen[kind] + 1
            # A run is never quite like the one before: on until no call is left to fail.
            while seen[kind] <= most and self.try_one(name, operation, kind, way, nth):
                nth += 1
        print(f"{name}: {self.outcome.counts['faults injected']:,} faults in "
              f"{time.monotonic() - begin:.0f} s", flush=True)

    def chosen(self, seen):
        every = [(kind, way) for kind, ways in CLASSES.items() for way in ways if seen[kind] > 0]
        return random.sample(every, SHORT_KINDS) if self.options.short else every


def spread(seen, most):
    """Every number up to `seen`, or `most` of them."""
    everyone = range(1, seen + 1)
    return everyone if seen <= most else sorted(random.sample(everyone, most))


def options(parser):
    parser.add_argument("--only", metavar="OPERATION[:CLASS.WAY:N]", default="",
                        help="such as start:write.ENOSPC:17")
    parser.add_argument("--most", type=int, default=0,
                        help="at most so many faults of a kind in an operation, spread")
    parser.add_argument("--seed", type=int, default=1)
    parser.add_argument("--jobs", type=int, default=2, help="operations attacked at the same time")


def attack_operation(name, options, bin_dir):
    """In a process of its own, which watches over nothing but what it makes."""
    become_subreaper()
    random.seed(f"{options.seed} {name}")
    outcome = Outcome()
    outcome.counts = {"faults injected": 0, "of them in SQLite": 0, "left something to the sweep": 0,
                      "ended by the C library itself": 0}
    attack = Attack(bin_dir)
    campaign = Campaign(attack, outcome, options)
    _, _, rest = options.only.partition(":")
    try:
        if rest:
            kind, way, nth = re.split(r"[.:]", rest)
            campaign.try_one(name, operations()[name], kind, way, int(nth))
            print(attack.faults.control.what.decode())
        else:
            campaign.over(name, operations()[name])
        outcome.count("left something to the sweep", attack.left)
        outcome.count("ended by the C library itself", attack.ended)
    finally:
        attack.close()
    return outcome


def run(options, bin_dir, top):
    outcome = Outcome()
    if os.geteuid() != 0:
        outcome.skip("logins: only root has them")
    if options.short:
        options.most = 1
    wanted = options.only.partition(":")[0]
    names = [name for name in operations() if wanted in ("", name)]
    with multiprocessing.Pool(options.jobs, maxtasksperchild=1) as pool:
        work = [pool.apply_async(attack_operation, (name, options, bin_dir)) for name in names]
        for each in work:
            outcome.add(each.get())
    return outcome
