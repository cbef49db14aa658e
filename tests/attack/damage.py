"""Cuts each stored file to every length and changes bytes of it, and looks after each whether calls
answer with a documented code, soon and in bounded memory, whether the user's other searches are as
they were, and whether what is left can be cleaned or is swept.
"""

import json
import multiprocessing
import os
import random
import time

from attack import Outcome
from house import (FOUND, HISTORY, SEARCH, Server, Tree, become_subreaper, children,
                   eventually)
from scene import Scene, Broken, check_files, check_goes_on, check_reply, demand, paths

PROMISE = ("A stored file that is cut or changed costs that file at most: every call answers, the "
           "other searches stay")
ATTACK = "each stored file cut to its lengths, bytes changed, in 512 MiB of memory"

MEMORY = 512 << 20
KINDS = ["record", "record of a killed search", "lock of a task", "lock of the folder", "settings",
         "history", "results", "results of a killed search", "their log", "their index",
         "configuration"]
SHORT = 6
LONG = 1000


class Damage(Scene):
    def __init__(self, bin_dir):
        super().__init__(bin_dir)
        self.furnish()
        self.kept = self.search("one")
        killed = self.start("one", "/endless", contents=True)
        demand(eventually(lambda: self.has_row(killed)), "a search finds nothing")
        # As a worker that is killed now would leave it.
        self.tree = Tree(self.house.state, self.house.dir + "/volume1/@tmp")
        self.call(SEARCH + "clean", {"taskid": killed})
        demand(eventually(lambda: not children(self.checker.process)), "a worker lives on")
        self.checker.stop()
        self.serve()
        self.slowest = 0.0
        tasks, preference = self.house.tasks, self.house.preference
        self.tree.put_back()
        results = {task: f"{self.house.results}/{self.results_of(task)}.db"
                   for task in (self.found, killed)}
        self.results = {task: [path, path + "-wal", path + "-shm"]
                        for task, path in results.items()}
        self.targets = dict(zip(KINDS, [
            (self.found, f"{tasks}/{self.found}.json"), (killed, f"{tasks}/{killed}.json"),
            (self.found, f"{tasks}/{self.found}.lock"), (self.found, f"{tasks}/lock"),
            (self.found, f"{preference}/usersettings"),
            (self.found, f"{preference}/search_history.db"), (self.found, results[self.found]),
            (killed, results[killed]), (killed, results[killed] + "-wal"),
            (killed, results[killed] + "-shm"), (None, self.house.config)]))

    def has_row(self, task):
        reply = self.call(SEARCH + "list", {"taskid": task})
        return reply["code"] == 0 and paths(reply)

    def results_of(self, task):
        with open(f"{self.house.tasks}/{task}.json") as file:
            return json.load(file)["properties"]["data"]["sdbid"]

    def serve(self):
        self.checker = Server(self.house, "checker", memory=MEMORY)

    def ask(self, method, params):
        begin = time.monotonic()
        try:
            reply = check_reply(self.call(method, params))
        except (OSError, ValueError) as error:
            raise Broken(f"{method} {params}: {error!r}") from None
        self.slowest = max(self.slowest, time.monotonic() - begin)
        demand(reply["code"] != 100, f"{method} {params} failed inside")
        return reply

    def check(self, task, path):
        if task is None:
            return self.check_configuration()
        self.ask(SEARCH + "list", {"taskid": task, "additional": "real_path,size,time,owner"})
        self.ask(SEARCH + "list", {"taskid": task, "sort_by": "name", "limit": 2})
        reply = self.ask(SEARCH + "list", {"taskid": self.kept})
        demand(paths(reply) == FOUND, f"another search lost its files: {reply}")
        demand(self.ask(HISTORY + "get", {})["code"] == 0, "the history cannot be asked")
        demand(self.ask(HISTORY + "set", {"pattern": "new"})["code"] in (0, 401), "set")
        demand(self.ask(SEARCH + "stop", {"taskid": task})["code"] == 0, "stop")
        demand(self.ask(SEARCH + "clean", {"taskid": [task, self.kept]})["code"] == 0, "clean")
        demand(eventually(lambda: self.kept not in self.house.task_ids(), 5),
               "a clean stops at the damaged one")
        demand(eventually(lambda: not children(self.checker.process)), "the cleaner lives on")
        check_goes_on(self, set(check_files(self)) | self.beyond_cleaning(task))
        demand(self.checker.lives(), "the server died")

    def beyond_cleaning(self, task):
        """What is still there of a cleaned search, where its record could not be read; the sweep has
        to take it."""
        tasks = [f"{self.house.tasks}/{task}.{end}" for end in ("json", "lock")]
        return {path for path in [*tasks, *self.results[task]] if os.path.exists(path)}

    def check_configuration(self):
        """Asked by a command that only reads, as the configuration says where to write."""
        words = self.house.words("why", self.house.share + "/one.txt", "one", self.house.share)
        limited = ["/usr/bin/prlimit", f"--as={MEMORY}", *words]
        status, out, err = self.house.run(limited)
        demand(status in (0, 1, 2), f"exit status {status}: {out}{err}")
        demand(status != 2 or err.startswith("arbory: "), f"status 2 without a word: {out}{err}")


def with_another_type(content):
    """JSON in which one value has become something else; None where it is none."""
    try:
        document = json.loads(content)
    except ValueError:
        return None
    places = []

    def visit(value):
        if isinstance(value, dict):
            for key in value:
                places.append((value, key))
                visit(value[key])
    visit(document)
    if places:
        holder, key = random.choice(places)
        holder[key] = random.choice(({}, [], {"a": [1]}, None, True, -1, 1e300, 1 << 63, "", "x\n",
                                     "x" * 100_000))
    return json.dumps(document).encode()


def damaged(content, number, of):
    """The number-th of `of` ways: half of them cut it, the others change bytes or a value's type."""
    if number % 2 == 0:
        return content[:len(content) * number // of]
    if number % 4 == 1 and (changed := with_another_type(content)):
        return changed
    changed = bytearray(content)
    if not changed:
        return os.urandom(number)
    way = random.choice(("bit", "byte", "zeros", "noise", "more"))
    at = random.randrange(len(changed))
    if way == "bit":
        changed[at] ^= 1 << random.randrange(8)
    elif way == "byte":
        changed[at] = random.randrange(256)
    elif way == "more":
        changed += random.randbytes(at + 1)
    else:
        length = min(random.choice((4, 64, 4096)), len(changed) - at)
        changed[at:at + length] = bytes(length) if way == "zeros" else random.randbytes(length)
    return bytes(changed)


def attack_kind(kind, options, bin_dir):
    become_subreaper()
    outcome = Outcome()
    scene = Damage(bin_dir)
    begin = time.monotonic()
    numbers = [options.number] if options.number is not None else range(options.most)
    try:
        for number in numbers:
            random.seed(f"{options.seed} {kind} {number}")
            scene.restart()
            task, path = scene.targets[kind]
            with open(path, "rb") as file:
                whole = file.read()
            with open(path, "wb") as file:
                file.write(damaged(whole, number, options.most))
            try:
                scene.check(task, path)
            except Exception as broken:
                what = broken if isinstance(broken, Broken) else repr(broken)
                outcome.breaks(f"{kind}: {what}", "scripts/attack damage --only "
                               f"'{kind}' --most {options.most} --number {number}")
                scene.checker.kill()
                scene.house.kill_the_unknown()
                scene.serve()
            if task is None:
                with open(path, "wb") as file:
                    file.write(whole)
            outcome.count("damaged files")
        slowest = f", the slowest reply after {scene.slowest:.2f} s" if scene.slowest else ""
        print(f"{kind}: {len(numbers):,} in {time.monotonic() - begin:.0f} s{slowest}", flush=True)
    finally:
        scene.close()
    return outcome


def options(parser):
    parser.add_argument("--only", metavar="KIND", choices=KINDS)
    parser.add_argument("--most", type=int, default=LONG, help="of each kind")
    parser.add_argument("--number", type=int, help="only this one of them")
    parser.add_argument("--seed", type=int, default=1)
    parser.add_argument("--jobs", type=int, default=2, help="kinds attacked at the same time")


def run(options, bin_dir, top):
    outcome = Outcome()
    if options.short:
        options.most = SHORT
    with multiprocessing.Pool(options.jobs, maxtasksperchild=1) as pool:
        work = [pool.apply_async(attack_kind, (kind, options, bin_dir))
                for kind in ([options.only] if options.only else KINDS)]
        for each in work:
            outcome.add(each.get())
    return outcome
