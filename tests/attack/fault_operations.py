"""The operations that the fault campaign attacks, and what each promises when a call of the system
fails in it."""

import contextlib
import json
import os
import signal

from house import (FOUND, HISTORY, Hang, QUERY, SEARCH, Server, children, eventually,
                   password)
from injector import Faults
from scene import OLD_HISTORY, Broken, Scene, check_reply, demand, paths, patterns

NO_LIMIT = 1 << 30
MOST_REFUSALS = 2  # each takes two seconds
STATUSES = {200, 400, 401, 403, 404, 408, 429, 503}


class Attack(Scene):
    """A scene whose calls go through `faults`."""

    def __init__(self, bin_dir, faults=Faults):
        super().__init__(bin_dir, "logins_per_minute = 1000000\n", logins=True)
        self.faults = faults(self.house)
        self.victim = self.logins = None
        self.left = 0  # runs that left a file to the sweep
        self.ended = 0  # that the C library ended
        self.furnish()

    def server(self, logins):
        """The one whose calls fail."""
        name = "logins" if logins else "victim"
        server = getattr(self, name)
        if server is None or not server.lives():
            self.faults.disarm()
            server = Server(self.house, name, self.faults.environment, logins)
            server.ask("GET", "/health")
            server.quiet = server.settled_descriptors()
            setattr(self, name, server)
        return server

    def forget_servers(self):
        """One that broke a promise may have more to break."""
        for server in (self.victim, self.logins):
            if server and server.lives():
                server.kill()
        self.victim = self.logins = None
        self.house.kill_the_unknown()


class Call:
    """An operation of `arbory call`. `histories` are those that may stand afterwards."""

    most = NO_LIMIT  # faults of one kind

    def __init__(self, method, params=None, histories=(OLD_HISTORY,), keeps_results=True,
                 adds_search=False):
        self.method = method
        self.params = params
        self.histories = histories
        self.keeps_results = keeps_results
        self.adds_search = adds_search

    def prepare(self, attack):
        self.running = None

    def run(self, attack):
        return attack.house.run(attack.house.call_words(self.method, self.made(attack)),
                                attack.faults.environment)

    def made(self, attack):
        names = {"FOUND": attack.found, "RUNNING": self.running}
        return {key: names.get(value, value) if isinstance(value, str) else value
                for key, value in (self.params or {}).items()}

    def check(self, attack, result, harmless):
        status, out, err = result
        if ends_by_right(attack, status, err):
            return
        demand(status in (0, 1, 2), f"exit status {status}: {err}")
        if status == 2:
            mute = attack.faults.wants("write") and not err  # standard error is written as well
            demand(not out and (err.startswith("arbory: ") or mute) and not harmless,
                   f"an error without a word: {out}{err}")
            return
        lines = out.splitlines()
        demand(len(lines) == 1, f"not one reply: {out}{err}")
        reply = check_reply(json.loads(lines[0]))
        demand(status == (reply["code"] != 0), f"status {status} for {reply}")
        self.check_content(attack, reply, harmless)

    def check_content(self, attack, reply, harmless):
        if harmless:
            demand(reply["code"] == 0, f"what is no failure made one: {reply}")
        # A search whose record cannot be read is one that was cleaned, as far as a listing can tell.
        cleaned = not harmless and reply["data"] == {"finished": True}
        if self.method == SEARCH + "list" and reply["code"] == 0 and not cleaned:
            demand(paths(reply) == FOUND, f"a listing that lost files: {paths(reply)}")
        if self.method == HISTORY + "get" and reply["code"] == 0 and harmless:
            demand(patterns(reply) == OLD_HISTORY, f"a history that lost entries: {reply}")
        if self.method == SEARCH + "start" and reply["code"] == 0:
            check_search(attack, reply["data"]["taskid"], harmless)


def check_search(attack, task, harmless):
    """A search that calls itself complete is; every other one says that it is not."""
    reply = attack.list_to_end(task)
    try:
        with open(f"{attack.house.tasks}/{task}.json") as file:
            properties = json.load(file)["properties"]
    except FileNotFoundError:
        raise Broken("a search that was started has no record") from None
    walk = properties.get("walk") or {}
    skipped = [*walk.get("skipped", {}).values(), walk.get("files", {}).get("unreadable", 0)]
    complete = properties.get("progress") == 1 and not any(skipped)
    demand(complete or not harmless, f"what is no failure made one: {properties}")
    if complete:
        demand(paths(reply) == FOUND, f"a complete search lost files: {paths(reply)} {reply['code']}")


class Stop(Call):
    def prepare(self, attack):
        self.running = attack.start("one", "/endless", contents=True)
        demand(eventually(lambda: self.walks(attack)), "a search without faults does not walk")

    def walks(self, attack):
        with open(f"{attack.house.tasks}/{self.running}.json") as file:
            return "sdbid" in json.load(file)["properties"].get("data", {})

    def check(self, attack, result, harmless):
        super().check(attack, result, harmless)
        # What a fault has kept alive, one without faults ends.
        if not harmless:
            attack.call(SEARCH + "stop", {"taskid": self.running})
        demand(eventually(lambda: not children(attack.checker.process)), "a stopped worker lives on")


class CleanBeforeTheStop(Stop):
    """What is cleaned is still in use: the worker stands still until the clean has ended."""

    def run(self, attack):
        with open(f"{attack.house.tasks}/{self.running}.json") as file:
            worker = json.load(file)["properties"]["data"]["pid"]
        os.kill(worker, signal.SIGSTOP)
        try:
            return super().run(attack)
        finally:
            with contextlib.suppress(ProcessLookupError):
                os.kill(worker, signal.SIGCONT)


def ends_by_right(attack, status, err):
    """Going on as somebody else would be worse than ending. And the C library ends a program where
    it has no memory for its own: for a thread's destructors, for the list of account databases."""
    faults = attack.faults
    if status == -signal.SIGABRT and faults.wants("identity"):
        return "cannot take its user's identity" in err
    by_library = faults.wants("alloc") and b" by libc.so" in faults.control.what
    ended = by_library and status in (-signal.SIGABRT, -signal.SIGSEGV)
    attack.ended += ended
    return ended


class Terminal:
    most = NO_LIMIT
    histories = (OLD_HISTORY, ["on", *OLD_HISTORY])
    keeps_results = True
    adds_search = False

    def prepare(self, attack):
        pass

    def run(self, attack):
        return attack.house.run(attack.house.words("search", "on", attack.house.share),
                                attack.faults.environment)

    def check(self, attack, result, harmless):
        status, out, err = result
        if ends_by_right(attack, status, err):
            return
        expected = {attack.house.dir + "/volume1" + path for path in FOUND}
        lines = out.splitlines()
        demand(status in (0, 1, 2), f"exit status {status}: {err}")
        demand(len(lines) == len(set(lines)) and set(lines) <= expected,
               f"lines that are no results: {out}")
        if status == 2 or len(lines) < len(expected):
            mute = attack.faults.wants("write") and status == 2
            demand(err.startswith("arbory: ") or mute, f"status {status} without a word: {out}")
        demand(not harmless or (status == 0 and not err), f"what is no failure made one: {err}")


class Http(Call):
    """The same by way of a server whose calls fail."""

    logins = False
    ends_early = ("socket", "watch", "alloc")

    def run(self, attack):
        return self.ask(attack, "POST", "/api/" + self.method, self.made(attack))

    def ask(self, attack, *request):
        try:
            reply = attack.server(self.logins).ask(*request)
            return reply.status, reply.content
        except TimeoutError:
            raise Hang() from None
        except OSError as error:
            return 0, str(error)
        except Exception as error:  # a reply that broke off
            return 0, repr(error)

    def check(self, attack, result, harmless):
        server = attack.logins if self.logins else attack.victim
        demand(server.lives(), "the server died")
        demand(eventually(lambda: not children(server.process)), "the server keeps a child")
        demand(eventually(lambda: server.descriptors() == server.quiet, 5),
               f"the server keeps descriptors: {server.quiet} became {server.descriptors()}")
        # Without any memory it turns clients away until it has some.
        demand(eventually(lambda: is_well(server)), "the server is not well")
        status, content = result
        # Where the server itself cannot hear, think or speak the connection ends.
        lost = any(attack.faults.wants(kind) for kind in self.ends_early)
        demand(status in STATUSES or (status == 0 and lost), f"status {status}: {content}")
        if harmless:
            demand(status == 200, f"what is no failure made one: {status} {content}")
        if status == 200:
            self.check_body(attack, content, harmless)

    def check_body(self, attack, content, harmless):
        self.check_content(attack, check_reply(json.loads(content)), harmless)


def is_well(server):
    try:
        return server.ask("GET", "/health").status == 200
    except OSError:
        return False


class Download(Http):
    # What cannot be read of a file whose size has been told is told by an early end alone.
    ends_early = (*Http.ends_early, "read")

    def run(self, attack):
        return self.ask(attack, "GET", "/files/share/one.txt")

    def check_body(self, attack, content, harmless):
        demand(content == b"one\n", f"another file: {content}")


class Login(Http):
    logins = True

    def __init__(self, right):
        super().__init__("login")
        self.right = right
        if not right:
            self.most = MOST_REFUSALS

    def run(self, attack):
        return self.ask(attack, "POST", "/login",
                        {"user": attack.house.user,
                         "password": password(attack.house.user) if self.right else "wrong"})

    def check(self, attack, result, harmless):
        if not self.right:
            demand(result[0] != 200, "a wrong password opened the door")
            harmless = False
        super().check(attack, result, harmless)

    def check_body(self, attack, content, harmless):
        demand(json.loads(content)["user"] == attack.house.user, f"somebody else: {content}")


def operations():
    start = {**QUERY, "pattern": "on", "extension": "txt,jpg", "size_to": 100}
    after_start = (OLD_HISTORY, ["on", *OLD_HISTORY])
    listed = {"taskid": "FOUND", "sort_by": "name", "additional": "real_path,size,owner,time,perm"}
    return {
        "start": Call(SEARCH + "start", start, after_start, adds_search=True),
        "list": Call(SEARCH + "list", listed),
        "stop": Stop(SEARCH + "stop", {"taskid": "RUNNING"}),
        "clean-running": Stop(SEARCH + "clean", {"taskid": "RUNNING"}),
        "clean-standing": CleanBeforeTheStop(SEARCH + "clean", {"taskid": "RUNNING"}),
        "clean": Call(SEARCH + "clean", {"taskid": "FOUND"}, keeps_results=False),
        "clean-all": Call(SEARCH + "Clean", {"action": "cleanall"}, keeps_results=False),
        "get": Call(HISTORY + "get", {}),
        "set": Call(HISTORY + "set", {"pattern": "new"}, (OLD_HISTORY, ["new", *OLD_HISTORY])),
        "delete": Call(HISTORY + "delete", {}, (OLD_HISTORY, [])),
        "search": Terminal(),
        "http-start": Http(SEARCH + "start", start, after_start,
                           adds_search=True),
        "http-list": Http(SEARCH + "list", listed),
        "download": Download("download"),
        **({"login": Login(True), "refusal": Login(False)} if os.geteuid() == 0 else {}),
    }
