"""A house of three users, each with secrets of every kind, and what somebody can do to another's."""

import ctypes
import json
import os
import pwd
import subprocess
import traceback
import urllib.parse

from house import DEADLINE, SEARCH, House, Server, Tree, Visitor, children, eventually

USERS = ("daemon", "bin", "games")  # accounts that every machine has
NAME = "treasure.txt"
ENDLESS = 1 << 42
TEXT = 1 << 18  # enough for contents to be read
EVERYTHING = "real_path,size,owner,time,perm,type"
SETPRIV = "/usr/bin/setpriv"


def may(user, act, *arguments):
    """Whether the system lets the user do that."""
    def run():
        act(*arguments)
        return True
    return as_user(user, run) is not None


def uid_of(user):
    return pwd.getpwnam(user).pw_uid


def as_user(user, act):
    """What `act` gives in a process that is the user's for good; None when the system refuses."""
    account = pwd.getpwnam(user)
    ours, theirs = os.pipe()
    child = os.fork()
    if child == 0:
        try:
            os.initgroups(user, account.pw_gid)
            os.setresgid(*[account.pw_gid] * 3)
            os.setresuid(*[account.pw_uid] * 3)
            os.write(theirs, json.dumps(act()).encode())
        except OSError:
            os._exit(0)
        except BaseException:
            traceback.print_exc()
        os._exit(0)
    os.close(theirs)
    with os.fdopen(ours, "rb") as file:
        got = file.read()
    os.waitpid(child, 0)
    return json.loads(got) if got else None


def system_call(name, *arguments):
    """One of the C library's, as an OSError where it fails."""
    library = ctypes.CDLL(None, use_errno=True)
    if (value := getattr(library, name)(*arguments)) < 0:
        raise OSError(ctypes.get_errno(), name)
    return value


class World:
    def __init__(self, bin_dir):
        # A download that nobody reads is there for as long as its child is attacked.
        lines = "logins_per_minute = 1000000\nstall_seconds = 3600\n"
        self.house = House(bin_dir, lines, logins=True)
        self.top = self.house.dir + "/volume1"
        self.roads = self.top + "/@tmp/webfm/FBSearch"
        os.mkdir(self.top + "/open")
        os.chmod(self.top + "/open", 0o777)
        os.makedirs(self.top + "/homes")
        os.chmod(self.top + "/homes", 0o711)
        for user in USERS:
            self.furnish(user)
        self.server = Server(self.house, logins=True)
        self.visitors = {user: Visitor(self.server, user) for user in USERS}
        self.found, self.running = {}, {}
        for user in USERS:
            self.call(user, "NUVA.Arbory.Search.History/1/set", {"pattern": self.secret(user)})
            self.found[user] = self.start(user, f"/own-{user}", NAME)
            eventually(lambda: self.state_of(user, self.found[user])["finished"])
        self.settle()

    def secret(self, user):
        return "treasure-of-" + user

    def furnish(self, user):
        for folder, mode in ((f"open/closed-{user}", 0o700), (f"open/shelf-{user}", 0o755),
                             (f"own-{user}", 0o700), (f"homes/{user}", 0o700),
                             (f"run-{user}", 0o700),
                             (f"open/by-{user}", 0o755)):
            path = f"{self.top}/{folder}"
            os.mkdir(path)
            self.give(path, user, mode)
            if "by-" not in folder and "run-" not in folder:
                self.write(f"{path}/{NAME}", self.secret(user) + "\n", user, 0o600)
        listed = f"{self.top}/open/shelf-{user}/listed.txt"
        self.write(listed, self.secret(user) + "\n", user, 0o644)
        others = [f"u:{other}:---" for other in USERS if other != user]
        subprocess.run(["setfacl", "-m", ",".join(others), listed], check=True)
        self.write(f"{self.top}/run-{user}/endless", "", user, 0o600)
        endless = f"{self.top}/run-{user}/other.log"
        self.write(endless, "a" * TEXT, user, 0o600)
        os.truncate(endless, ENDLESS)

    def write(self, path, text, user, mode):
        with open(path, "w") as file:
            file.write(text)
        self.give(path, user, mode)

    def give(self, path, user, mode):
        os.chown(path, uid_of(user), pwd.getpwnam(user).pw_gid)
        os.chmod(path, mode)

    # What users ask of the server.

    def ask(self, user, method, path, more=None):
        return self.visitors[user].ask(method, path, more=more)

    def call(self, user, method, params):
        return self.visitors[user].call(method, params)

    def get_file(self, user, location, query="", more=None):
        return self.ask(user, "GET", "/files" + urllib.parse.quote(location) + query, more)

    def start(self, user, location, pattern, contents=False):
        reply = self.call(user, SEARCH + "start", {"folder_path": location, "pattern": pattern,
                                                   "search_content": contents})
        if reply["code"] != 0:
            raise RuntimeError(f"{user} cannot start a search: {reply}")
        return reply["data"]["taskid"]

    def rows(self, user, task, **more):
        reply = self.call(user, SEARCH + "list", {"taskid": task, **more})
        return [file["path"] for file in (reply["data"] or {}).get("files", [])]

    def hits(self, user, location, pattern, contents=False):
        """How many files the user's search finds there."""
        task = self.start(user, location, pattern, contents)

        def ended():
            reply = self.call(user, SEARCH + "list", {"taskid": task, "additional": EVERYTHING})
            return reply if reply["code"] != 0 or reply["data"]["finished"] else None
        reply = eventually(ended)
        self.call(user, SEARCH + "clean", {"taskid": task})
        return len(reply["data"]["files"]) if reply["code"] == 0 else 0

    def state_of(self, user, task):
        reply = self.ask(user, "GET", "/searches/" + urllib.parse.quote(task, safe=""))
        return json.loads(reply.content) if reply.status == 200 else None

    def run_search(self, user):
        """A search of theirs that walks until it is stopped: its id and its worker."""
        self.rest(user)
        task = self.start(user, f"/run-{user}", "endless", contents=True)
        eventually(lambda: self.rows(user, task))  # the name of one file
        self.running[user] = (task, self.record(user, task)["properties"]["data"]["pid"])
        return self.running[user]

    def runs(self, user):
        task, worker = self.running[user]
        state = self.state_of(user, task)
        return bool(state and not state["finished"] and os.path.exists(f"/proc/{worker}"))

    def rest(self, *users):
        """Ends the searches that walk."""
        for user in users or USERS:
            if user in self.running:
                task, _ = self.running.pop(user)
                self.call(user, SEARCH + "clean", {"taskid": task})
        self.settle()

    def settle(self):
        """Until none but workers are at work for the server."""
        workers = {worker for _, worker in self.running.values()}
        eventually(lambda: children(self.server.process) <= workers)

    # What is stored.

    def tasks(self, user):
        return f"{self.house.state}/users/{user}/tasks"

    def preference(self, user):
        return f"{self.house.state}/users/{user}/preference"

    def record(self, user, task):
        with open(f"{self.tasks(user)}/{task}.json") as file:
            return json.load(file)

    def results(self, user, task):
        return self.record(user, task)["properties"]["data"]["sdbid"]

    def picture(self, user):
        """All that is stored of the user, to be compared."""
        seen = {}
        for root in (f"{self.house.state}/users/{user}", f"{self.roads}/{user}",
                     f"{self.top}/homes/{user}", f"{self.top}/own-{user}"):
            for folder, _, names in os.walk(root):
                for path in [folder] + [f"{folder}/{name}" for name in names]:
                    info = os.lstat(path)
                    content = ""
                    if os.path.isfile(path) and info.st_size < ENDLESS and "-shm" not in path:
                        with open(path, "rb") as file:
                            content = file.read().hex()
                    seen[path] = (info.st_uid, info.st_mode, info.st_ino, content)
        return seen

    def keep(self):
        self.tree = Tree(self.house.state, self.top + "/@tmp")

    def put_back(self):
        self.settle()
        self.tree.put_back()

    # The program in a terminal: run by root for the user, or by the user.

    def terminal(self, user, by, *words):
        become = [SETPRIV, f"--reuid={by}", f"--regid={pwd.getpwnam(by).pw_gid}",
                  "--init-groups"] if by != "root" else []
        done = subprocess.run([*become, self.house.program, words[0], "--config",
                               self.house.config, "--user", user, *words[1:]],
                              stdin=subprocess.DEVNULL, capture_output=True, text=True, cwd="/",
                              timeout=DEADLINE)
        return done.returncode, done.stdout

    def close(self):
        self.server.stop()
        self.house.remove()
