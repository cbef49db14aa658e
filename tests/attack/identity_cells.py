"""The table of the identity campaign: each cell is one user's operation on an object of another's.

An attempt tells whether it got at the object. Its control is the same operation by the owner (for
some by root, or on a thing of the owner's), which must get at it: otherwise the cell would be
refused for another reason than whose the object is.
"""

import dataclasses
import fcntl
import json
import os
import struct
import typing

from house import HISTORY, SEARCH, children, eventually
from identity_world import NAME, may, system_call, uid_of


GRACE = 0.3  # seconds; a worker that is told to stop takes a tenth of one


@dataclasses.dataclass
class Cell:
    thing: str
    operation: str
    owner: str
    other: str
    attempt: typing.Callable[[], bool]
    control: typing.Callable[[], bool]
    # Controls of the same name are made once.
    control_name: tuple


# Files and folders by location.

def plant_links(world, owner, other):
    """What `other` could lay into their own folder to get at `owner`'s."""
    place = f"{world.top}/open/by-{other}/{owner}-"
    closed = f"{world.top}/open/closed-{owner}"
    for name, target in (("link", f"../closed-{owner}"), ("chain", f"{owner}-link"),
                         ("absolute", closed), ("proc", f"/proc/self/root{closed}"),
                         ("file", f"../closed-{owner}/{NAME}"),
                         ("shelf", f"../shelf-{owner}/{NAME}")):
        if not os.path.lexists(place + name):
            os.symlink(target, place + name)
            os.lchown(place + name, uid_of(other), -1)
    if not os.path.lexists(place + "hard"):
        os.link(f"{closed}/{NAME}", place + "hard")


def roads(owner, other):
    """(thing, folder to search or None, file, whether the owner may be refused that way too)."""
    by = f"/open/by-{other}/{owner}-"
    return [
        ("closed folder", f"/open/closed-{owner}", NAME, False),
        ("closed folder by //", f"/open//closed-{owner}", NAME, True),
        ("closed folder by ..", f"/open/by-{other}/../closed-{owner}", NAME, True),
        ("closed folder by link", by + "link", NAME, False),
        ("closed folder by links", by + "chain", NAME, False),
        ("closed folder by absolute link", by + "absolute", NAME, True),
        ("closed folder by /proc", by + "proc", NAME, True),
        ("closed share", f"/own-{owner}", NAME, False),
        ("closed share by ..", f"/own-{other}/../own-{owner}", NAME, True),
        ("home", f"/homes/{owner}", NAME, False),
        ("home by ..", f"/home/../{owner}", NAME, True),
        ("closed file", None, f"/open/shelf-{owner}/{NAME}", False),
        ("closed file by link", None, by + "shelf", True),
        ("file by access list", None, f"/open/shelf-{owner}/listed.txt", False),
        ("file in a closed folder by link", None, by + "file", True),
        ("file in a closed folder by hard link", None, by + "hard", False),
    ]


def file_operations(world, owner):
    secret = world.secret(owner).encode()

    def got(reply):
        return reply.status in (200, 206) and secret[:8] in reply.content
    return {
        "download": lambda who, file: got(world.get_file(who, file)),
        "preview": lambda who, file: got(world.get_file(who, file, "?preview=1")),
        "range": lambda who, file: got(world.get_file(who, file, "", {"Range": "bytes=0-10"})),
        "head": lambda who, file: world.ask(who, "HEAD", "/files" + file).status == 200,
        "why": lambda who, file: world.terminal(
            who, "root", "why", "--content", world.top + file, secret.decode(),
            os.path.dirname(world.top + file))[0] == 0,
    }


def folder_operations(world, owner):
    secret = world.secret(owner)

    def terminal(by_root, pattern, *more):
        return lambda who, folder: NAME in world.terminal(
            who, "root" if by_root else who, "search", *more, pattern, world.top + folder)[1]
    return {
        "search": lambda who, folder: world.hits(who, folder, NAME) > 0,
        "search contents": lambda who, folder: world.hits(who, folder, secret, True) > 0,
        "terminal": terminal(False, NAME),
        "terminal contents": terminal(False, secret, "--content"),
        "terminal by root": terminal(True, NAME),
        "terminal by root contents": terminal(True, secret, "--content"),
    }


def road_cells(world, owner, other):
    plant_links(world, owner, other)
    straight = f"/open/closed-{owner}"
    for thing, folder, name, odd in roads(owner, other):
        targets = [(f"{folder}/{name}" if folder else name, f"{straight}/{NAME}",
                    file_operations(world, owner))]
        if folder:
            targets.append((folder, straight, folder_operations(world, owner)))
        for target, plain, operations in targets:
            for operation, run in operations.items():
                control = lambda run=run, target=target, plain=plain, odd=odd: (
                    run(owner, target) or (odd and run(owner, plain)))
                yield Cell(thing, operation, owner, other,
                           lambda run=run, target=target: run(other, target), control,
                           (owner, operation, target))


# Searches by their ids.

def forms(world, owner, task):
    tasks = world.tasks(owner)
    return {
        "id": task, "id in capitals": task.upper(), "id as a file": task + ".json",
        "./id": "./" + task, "owner/id": f"{owner}/{task}",
        "../ to the record": f"../../{owner}/tasks/{task}",
        "../ to the file": f"../../{owner}/tasks/{task}.json", "path": f"{tasks}/{task}",
        "id and NUL": task + "\0", "path and NUL": f"../../{owner}/tasks/{task}\0.json",
        "id and a line's end": task + "\n", "backslashes": f"..\\..\\{owner}\\tasks\\{task}",
        "encoded": f"%2e%2e%2f%2e%2e%2f{owner}%2ftasks%2f{task}", "beginning": task[:31],
        "long": "../" * 3000 + f"{tasks[1:]}/{task}", "star": "*", "nothing": "",
        "two": f"x,{task}", "list": [task, "../" + task], "text of a list": json.dumps([task]),
    }


def search_operations(world, owner):
    """Each tells whether it did something to the owner's running search."""

    def act(method):
        def run(who, task):
            world.call(who, SEARCH + method, {"taskid": task})
            world.settle()
            return not world.runs(owner)
        return run
    return {
        "list": lambda who, task: len(world.rows(who, task, additional="real_path")) > 0,
        "progress": lambda who, task: isinstance(task, str) and task != "" and
        world.state_of(who, task) is not None,
        "stop": act("stop"), "clean": act("clean"),
    }


def search_cells(world, owner, other):
    task, _ = world.run_search(owner)
    operations = search_operations(world, owner)

    def control(run):
        plain = world.running.get(owner) or world.run_search(owner)
        allowed = run(owner, plain[0])
        if not world.runs(owner):
            world.run_search(owner)
        return allowed
    for form, text in forms(world, owner, task).items():
        for operation, run in operations.items():
            yield Cell("search by " + form, operation, owner, other,
                       lambda run=run, text=text: run(other, text),
                       lambda run=run: control(run), (owner, "search", operation))

    def log_out(who):
        visitor = world.visitors[who]
        world.server.ask("POST", "/logout", {"stop_searches": True},
                         more={"Cookie": visitor.cookie})
        world.visitors[who] = type(visitor)(world.server, who)
        world.settle()
        return not world.runs(owner)
    yield Cell("search", "log out and stop", owner, other, lambda: log_out(other),
               lambda: control(lambda who, _: log_out(who)), (owner, "log out"))


# What is planted in one's own folders to be led to another's.

def write_record(world, user, properties):
    """A task of `user`'s that says of itself what they like."""
    task = "0123456789abcdef" * 2
    for end, text in (("json", json.dumps({"version": 1, "finished": False,
                                           "properties": properties})), ("lock", "")):
        world.write(f"{world.tasks(user)}/{task}.{end}", text, user, 0o600)
    return task


def record_cells(world, owner, other):
    results = world.results(owner, world.found[owner])
    volume = world.top

    def data(**more):
        return {"progress": 1, "data": {"taskid": "", "pid": 0, "location": ["/open"],
                                        "sdbvol": volume, "sdbid": results, **more}}
    places = {
        "results of another": {}, "results by ..": {"sdbid": f"../{owner}/{results}"},
        "results by path": {"sdbid": f"{world.roads}/{owner}/{results}"},
        "results by volume": {"sdbvol": f"{world.roads}/{owner}"},
        "results by volume and ..": {"sdbvol": f"{volume}/@tmp/webfm/FBSearch/{owner}/../../../.."},
        "results by NUL": {"sdbid": f"../{owner}/{results}.db\0"},
    }

    def act(method, more):
        def run(who):
            before = world.picture(owner)
            task = write_record(world, who, data(**more))
            rows = world.rows(who, task) if method == "list" else []
            if method != "list":
                world.call(who, SEARCH + method, {"taskid": task})
                world.settle()
            after = world.picture(owner)
            known = {path for path in after if "0123456789abcdef" in path}
            changed = any(after.get(path) != before[path] for path in before if path not in known)
            return len(rows) > 0 or changed
        return run

    def control(method):
        allowed = act(method, {})(owner)
        world.put_back()
        return allowed
    for thing, more in places.items():
        for method in ("list", "clean"):
            yield Cell("record with " + thing, method, owner, other,
                       lambda method=method, more=more: act(method, more)(other),
                       lambda method=method: control(method), (owner, "record", method))


def signal_cells(world, owner, other):
    """A record that names somebody else's process as its worker."""
    def signalled(who, method, process):
        task = write_record(world, who, {"progress": 0, "data": {
            "taskid": "", "pid": process, "location": ["/open"], "sdbid": "", "sdbvol": ""}})
        # Held as a search that runs holds it, so that the worker is thought to be alive.
        with open(f"{world.tasks(who)}/{task}.lock", "r+") as file:
            life = struct.pack("hhqqi4x", fcntl.F_WRLCK, os.SEEK_SET, 0, 1, 0)
            fcntl.fcntl(file, fcntl.F_OFD_SETLK, life)
            world.call(who, SEARCH + method, {"taskid": task})
            world.settle()
        return bool(eventually(lambda: not world.server.lives() or not world.runs(owner), GRACE))

    def control(method):
        allowed = signalled(owner, method, world.running[owner][1])
        world.run_search(owner)
        return allowed
    world.run_search(owner)
    processes = {"worker": lambda: world.running[owner][1], "everybody": lambda: -1,
                 "worker's group": lambda: -world.running[owner][1],
                 "server": lambda: world.server.process}
    for thing, process in processes.items():
        for method in ("stop", "clean"):
            yield Cell("record with the process of: " + thing, method, owner, other,
                       lambda process=process, method=method: signalled(other, method, process()),
                       lambda method=method: control(method), (owner, "signal", method))


def link_cells(world, owner, other):
    """A folder or file of one's own that is really another's, and calls that go there."""
    state = world.house.state + "/users/"
    results = world.results(owner, world.found[owner]) + ".db"
    places = {
        "tasks": f"{state}{{}}/tasks", "preference": f"{state}{{}}/preference",
        "settings": f"{state}{{}}/preference/usersettings",
        "history": f"{state}{{}}/preference/search_history.db",
        "record": f"{state}{{}}/tasks/{world.found[owner]}.json",
        "lock": f"{state}{{}}/tasks/lock", "results": f"{world.roads}/{{}}/{results}",
        "folder of results": f"{world.roads}/{{}}", "state": f"{state}{{}}",
    }

    def shows(reply):
        return any(text in json.dumps(reply) for text in (world.secret(owner), "own-" + owner))
    calls = {
        "list": lambda who: shows(world.call(who, SEARCH + "list",
                                             {"taskid": world.found[owner]})),
        "clean": lambda who: world.call(who, SEARCH + "clean",
                                        {"taskid": world.found[owner]}) and False,
        "get": lambda who: shows(world.call(who, HISTORY + "get", {})),
        "set": lambda who: world.call(who, HISTORY + "set", {"pattern": "planted"}) and False,
        "delete": lambda who: world.call(who, HISTORY + "delete", {}) and False,
        "start": lambda who: world.call(who, SEARCH + "start", {
            "folder_path": "/open", "pattern": "nothing"}) and False,
        "clean-all": lambda who: world.call(who, SEARCH + "Clean",
                                            {"action": "cleanall"}) and False,
    }

    def attempt(who, place, plant, run):
        world.put_back()
        if who != owner:
            mine, theirs = place.format(who), place.format(owner)
            if os.path.lexists(mine):
                os.rename(mine, mine + ".old")
            plant(theirs, mine)
        before = world.picture(owner)
        shown = run(who)
        eventually(lambda: not children(world.server.process))
        return shown or world.picture(owner) != before
    for thing, place in places.items():
        for way, plant in (("link", os.symlink), ("hard link", os.link)):
            folder = os.path.isdir(place.format(owner))
            if folder and plant is os.link:
                continue
            for operation, run in calls.items():
                yield Cell(f"{thing} by {way}", operation, owner, other,
                           lambda place=place, plant=plant, run=run: attempt(
                               other, place, plant, run),
                           lambda run=run: attempt(owner, "", None, run),
                           (owner, "call", operation))
    world.put_back()


# Stored files by the system's own calls.

def lock(path):
    with open(path, "r+") as file:
        fcntl.fcntl(file, fcntl.F_OFD_SETLK, struct.pack("hhqqi4x", fcntl.F_WRLCK, 0, 0, 1, 0))


def make(path):
    with open(path, "w"):
        return True


FILE_ACTS = {
    "read": lambda path: open(path, "rb").read(1),
    "write": lambda path: open(path, "ab").close(),
    "cut": lambda path: os.truncate(path, 0),
    "remove": os.unlink,
    "move": lambda path: os.rename(path, path + "x"),
    "replace": lambda path: make(path + "y") and os.rename(path + "y", path),
    "mode": lambda path: os.chmod(path, 0o666),
    "times": lambda path: os.utime(path, (0, 0)),
    "lock": lock,
    "attribute": lambda path: os.setxattr(path, "user.planted", b"x"),
}
FOLDER_ACTS = {
    "list": os.listdir,
    "enter": os.chdir,
    "make": lambda path: make(path + "/planted"),
    "make a folder": lambda path: os.mkdir(path + "/planted"),
    "make a link": lambda path: os.symlink("/etc", path + "/planted"),
    "mode": lambda path: os.chmod(path, 0o777),
    "watch": lambda path: system_call("inotify_add_watch", system_call("inotify_init"),
                                      path.encode(), 0xfff),
}


def stored_cells(world, owner, other):
    tasks, preference, found = world.tasks(owner), world.preference(owner), world.found[owner]
    results = f"{world.roads}/{owner}"
    files = {"record": f"{tasks}/{found}.json", "lock of a task": f"{tasks}/{found}.lock",
             "lock of the folder": tasks + "/lock", "settings": preference + "/usersettings",
             "history": preference + "/search_history.db",
             "results": f"{results}/{world.results(owner, found)}.db"}
    folders = {"state": os.path.dirname(tasks), "tasks": tasks, "preference": preference,
               "folder of results": results}
    # In these not even the owner may do anything: root must.
    above = {"all states": world.house.state + "/users", "state directory": world.house.state,
             "all results": world.roads, "temporary folder": world.top + "/@tmp"}
    for things, acts, by in ((files, FILE_ACTS, owner), (folders, FOLDER_ACTS, owner),
                             (above, {name: FOLDER_ACTS[name] for name in (
                                 "make", "make a folder", "make a link", "mode")}, "root")):
        for thing, path in things.items():
            for operation, act in acts.items():
                def run(who, act=act, path=path):
                    return may(who, act, path)

                def control(run=run, by=by):
                    allowed = run(by)
                    world.put_back()
                    return allowed
                yield Cell(thing, operation, owner, other, lambda run=run: run(other), control,
                           (owner, thing, operation))
