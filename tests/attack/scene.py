"""A house in which searches have been made, to be put back to that state before each attack, and
what has to hold in it after one.
"""

import glob
import json
import os
import re
import time

from house import (FOUND, HISTORY, House, SEARCH, Server, Tree, children, eventually, list_folder)

CODES = {0, 100, 101, 400, 401, 405, 407, 408, 418, 600}
OLD_HISTORY = ["one", "older"]
TASK_FILES = r"lock|large|[0-9a-f]{32}\.(json|lock)"
RESULT_FILES = r"[0-9a-f]{32}\.db(-wal|-shm|-journal)?"
TEMPORARY = ".arbory-new-"
DAY = 24 * 60 * 60
PREFERENCE_FILES = r"usersettings|(adv_)?search_history\.db(-wal|-shm|-journal)?"


class Broken(Exception):
    pass


def demand(holds, what):
    if not holds:
        raise Broken(what)


class Scene:
    def __init__(self, bin_dir, server_lines="", logins=False, place=None):
        self.house = House(bin_dir, server_lines, logins, place)
        self.make_endless_share()

    def make_endless_share(self):
        """Names are found there at once, and contents are read for hours."""
        os.makedirs(self.house.dir + "/volume1/endless")
        with open(self.house.dir + "/volume1/endless/one.log", "w"):
            pass
        # What its name has matched is not read.
        with open(self.house.dir + "/volume1/endless/other.log", "w") as file:
            file.write("a" * (1 << 18))
            file.truncate(1 << 42)

    def furnish(self):
        self.checker = Server(self.house, "checker")
        self.call(HISTORY + "set", {"pattern": "older"})
        self.found = self.search("one")
        self.tree = Tree(self.house.state, self.house.dir + "/volume1/@tmp")

    def call(self, method, params):
        return self.checker.call(method, params)

    def start(self, pattern, location="/share", contents=False):
        reply = self.call(SEARCH + "start", {"folder_path": location, "pattern": pattern,
                                             "search_content": contents})
        demand(reply["code"] == 0, f"a start without faults: {reply}")
        return reply["data"]["taskid"]

    def list_to_end(self, task):
        def ended():
            reply = self.call(SEARCH + "list", {"taskid": task})
            return reply if reply["code"] != 0 or reply["data"]["finished"] else None
        reply = eventually(ended)
        demand(reply, "a search without a worker never finishes")
        return reply

    def search(self, pattern):
        task = self.start(pattern)
        demand(paths(self.list_to_end(task)) == FOUND, "a search without faults finds too little")
        return task

    def restart(self):
        self.tree.put_back()

    def close(self):
        self.house.remove()


def paths(reply):
    data = reply.get("data") or {}
    return sorted(file["path"] for file in data.get("files", []))


def check_reply(reply):
    demand(set(reply) == {"code", "data"} and reply["code"] in CODES, f"an unknown reply: {reply}")
    # What the call had no memory for is told in words.
    told = reply["code"] == 100 and set(reply["data"] or {}) == {"error"}
    demand(reply["code"] == 0 or reply["data"] is None or told, f"an error with data: {reply}")
    return reply


def patterns(reply):
    return [entry.get("pattern") for entry in reply["data"]["history"]]


def check_files(scene):
    """What lies on disk once everything has ended: the files that the day's sweep will have to take."""
    house = scene.house
    left = []
    owner = os.stat(f"{house.state}/users/{house.user}").st_uid
    for folder, allowed in ((house.tasks, TASK_FILES), (house.results, RESULT_FILES),
                            (house.preference, PREFERENCE_FILES)):
        for name in list_folder(folder):
            info = os.lstat(f"{folder}/{name}")
            demand(info.st_uid == owner and info.st_mode & 0o77 == 0, f"{name} is open to others")
            if not re.fullmatch(allowed, name):
                demand(name.startswith(TEMPORARY), f"{name} is left behind")
                left.append(f"{folder}/{name}")
    locks = {name[:32] for name in list_folder(house.tasks) if re.fullmatch(r"\w{32}\.lock", name)}
    left += [f"{house.tasks}/{task}.lock" for task in locks - house.task_ids()]
    left += [f"{house.tasks}/{task}.json" for task in house.task_ids() - locks]
    named = {named_results(f"{house.tasks}/{task}.json") for task in house.task_ids()}
    return left + [f"{house.results}/{name}" for name in list_folder(house.results)
                   if name[:32] not in named]


def named_results(record):
    try:
        with open(record) as file:
            return str(json.load(file)["properties"]["data"]["sdbid"])
    except (ValueError, LookupError, TypeError):
        return None


def check_goes_on(scene, left):
    # A look at a database leaves a companion of it, so all that begins alike is made old.
    old = (time.time() - 2 * DAY,) * 2
    for path in left:
        for beside in glob.glob(path.partition(".db")[0] + "*"):
            os.utime(beside, old)
    scene.search("one")
    for path in left:
        demand(not os.path.exists(path), f"the day's sweep leaves {os.path.basename(path)}")
    tasks = sorted(scene.house.task_ids())
    scene.call(SEARCH + "clean", {"taskid": tasks})
    gone = lambda: not scene.house.task_ids() and not scene.house.result_ids()
    if not eventually(gone):
        left = scene.house.task_ids() | scene.house.result_ids()
        raise Broken(f"a clean of {tasks} without faults leaves {left}; cleaned again: "
                     f"{scene.call(SEARCH + 'clean', {'taskid': tasks})}, {eventually(gone)}")
    demand(eventually(lambda: not children(scene.checker.process)), "a process is left")
