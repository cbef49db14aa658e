"""A house for a campaign: shares, a state directory and a configuration of its own, the program run
in it, and a server that looks at it without faults. Every process that the program makes becomes
this one's child when its parent ends, so that none is overlooked.
"""

import ctypes
import http.client
import json
import os
import pwd
import re
import resource
import shutil
import signal
import stat
import sys
import tempfile
import time

DEADLINE = 20.0  # seconds; nothing the program does on so small a house takes one
PR_SET_CHILD_SUBREAPER = 36
SEARCH = "NUVA.Arbory.Search/2/"
HISTORY = "NUVA.Arbory.Search.History/1/"
# What the share holds, and what the search of every campaign finds there.
FILES = {"one.txt": "one\n", "two one.txt": "and another\n", "below/one three.jpg": "x",
         "below/deep/other.txt": "nothing\n"}
FOUND = ["/share/below/one three.jpg", "/share/one.txt", "/share/two one.txt"]
QUERY = {"folder_path": "/share", "pattern": "one"}


class Hang(Exception):
    pass


def become_subreaper():
    if ctypes.CDLL(None).prctl(PR_SET_CHILD_SUBREAPER, 1, 0, 0, 0) != 0:
        sys.exit("cannot watch over processes that lose their parent")


def children(process=None):
    process = process or os.getpid()
    try:
        with open(f"/proc/{process}/task/{process}/children") as file:
            return {int(number) for number in file.read().split()}
    except (FileNotFoundError, ProcessLookupError):
        return set()


def reap_others(kept):
    """Of those who lost their parent, which would otherwise be there for ever once they ended."""
    for process in children() - set(kept):
        os.waitid(os.P_PID, process, os.WEXITED | os.WNOHANG)


def eventually(holds, seconds=DEADLINE):
    pause, end = 0.0005, time.monotonic() + seconds
    while not (value := holds()):
        if time.monotonic() > end:
            return value
        time.sleep(pause)
        pause = min(2 * pause, 0.02)
    return value


class Tree:
    """Folders and files as they were, to be put back."""

    def __init__(self, *roots):
        self.roots = roots
        self.entries = []
        for root in roots:
            for folder, _, names in os.walk(root):
                self.entries.append((folder, os.lstat(folder), None))
                for name in names:
                    path = os.path.join(folder, name)
                    with open(path, "rb") as file:
                        self.entries.append((path, os.lstat(path), file.read()))

    def put_back(self):
        for root in self.roots:
            shutil.rmtree(root, ignore_errors=True)
        for path, info, content in self.entries:
            if content is None:
                os.makedirs(path, exist_ok=True)
            else:
                with open(path, "wb") as file:
                    file.write(content)
            os.chmod(path, stat.S_IMODE(info.st_mode))
            if os.geteuid() == 0:
                os.chown(path, info.st_uid, info.st_gid)


class House:
    def __init__(self, bin_dir, server_lines="", logins=False, place=None):
        """`logins` makes a PAM service of its own, where everybody's password is known. `place` is
        called with the folder before anything is put into it."""
        self.program = bin_dir + "/arbory"
        self.bin_dir = bin_dir
        # As root everything is done for another user, which is the harder case.
        self.as_root = os.geteuid() == 0
        self.user = "nobody" if self.as_root else pwd.getpwuid(os.geteuid()).pw_name
        # In memory where that can be had: what is attacked is the program, not the disk.
        fast = "/dev/shm" if os.access("/dev/shm", os.W_OK) else None
        self.dir = os.path.realpath(tempfile.mkdtemp(prefix="arbory-attack-", dir=fast))
        if place:
            place(self.dir)
        os.chmod(self.dir, 0o755)
        self.share = self.dir + "/volume1/share"
        self.state = self.dir + "/state"
        self.results = f"{self.dir}/volume1/@tmp/webfm/FBSearch/{self.user}"
        self.tasks = f"{self.state}/users/{self.user}/tasks"
        self.preference = f"{self.state}/users/{self.user}/preference"
        for name, content in FILES.items():
            path = f"{self.share}/{name}"
            os.makedirs(os.path.dirname(path), exist_ok=True)
            with open(path, "w") as file:
                file.write(content)
        if logins:
            server_lines += f'pam_dir = "{self.make_pam()}"\n'
        self.config = self.dir + "/arbory.toml"
        with open(self.config, "w") as file:
            file.write(f'state_dir = "{self.state}"\nvolumes = ["{self.dir}/volume*"]\n'
                       f'[server]\nlisten = "127.0.0.1:0"\naccess_log = false\n{server_lines}')
        self.known = set()  # children that may stay

    def make_pam(self):
        folder = self.dir + "/pam"
        os.mkdir(folder)
        with open(folder + "/check", "w") as file:
            file.write('#!/bin/sh\nread -r given || :\n[ "$given" = "right-$PAM_USER" ]\n')
        os.chmod(folder + "/check", 0o755)
        with open(folder + "/arbory", "w") as file:
            file.write(f"auth required pam_exec.so quiet expose_authtok {folder}/check\n"
                       "account required pam_permit.so\n")
        return folder

    def remove(self):
        for process in self.known:
            os.kill(process, signal.SIGKILL)
            os.waitpid(process, 0)
        shutil.rmtree(self.dir, ignore_errors=True)

    def words(self, *words):
        return [self.program, *words, "--config", self.config, "--user", self.user]

    def call_words(self, method, params):
        api, version, name = method.split("/")
        return [*self.words("call"), api, version, name, json.dumps(params)]

    def spawn(self, words, environment=None, name="call"):
        """Its output goes to files, so that nobody has to read along."""
        out, err = f"{self.dir}/{name}.out", f"{self.dir}/{name}.err"
        flags = os.O_WRONLY | os.O_CREAT | os.O_TRUNC
        actions = [(os.POSIX_SPAWN_OPEN, 0, "/dev/null", os.O_RDONLY, 0),
                   (os.POSIX_SPAWN_OPEN, 1, out, flags, 0o600),
                   (os.POSIX_SPAWN_OPEN, 2, err, flags, 0o600)]
        return os.posix_spawn(words[0], words, {**os.environ, **(environment or {})},
                              file_actions=actions)

    def output(self, name="call"):
        texts = []
        for end in ("out", "err"):
            with open(f"{self.dir}/{name}.{end}", errors="replace") as file:
                texts.append(file.read())
        return texts

    def wait_for_all(self, program, seconds=DEADLINE):
        """Until `program` and all it left behind have ended: its status. Raises Hang."""
        def late(*_):
            raise Hang()
        signal.signal(signal.SIGALRM, late)
        signal.setitimer(signal.ITIMER_REAL, seconds)
        status = None
        try:
            while status is None or not children() <= self.known:
                ended, how = os.waitpid(-1, 0)
                self.known.discard(ended)
                if ended == program:
                    status = os.waitstatus_to_exitcode(how)
        finally:
            signal.setitimer(signal.ITIMER_REAL, 0)
        return status

    def kill_the_unknown(self):
        for process in children() - self.known:
            os.kill(process, signal.SIGKILL)
        while not children() <= self.known:
            os.waitpid(-1, 0)

    def run(self, words, environment=None, seconds=DEADLINE):
        status = self.wait_for_all(self.spawn(words, environment), seconds)
        return (status, *self.output())

    def call(self, method, params):
        _, out, err = self.run(self.call_words(method, params))
        if not out:
            raise RuntimeError(f"{method}: {err}")
        return json.loads(out)

    def task_ids(self):
        return {name[:-5] for name in list_folder(self.tasks) if re.fullmatch(r"[0-9a-f]{32}\.json", name)}

    def result_ids(self):
        return {name[:32] for name in list_folder(self.results) if re.match(r"[0-9a-f]{32}\.db", name)}


def list_folder(path):
    try:
        return os.listdir(path)
    except FileNotFoundError:
        return []


class Server:
    """`arbory serve` for the house's user, or for all who log in. `name` is that of its output."""

    def __init__(self, house, name="server", environment=None, logins=False, memory=None,
                 before=()):
        """`memory` bounds what each of its children, and itself, may map; `before` are words that come
        before the command."""
        self.house = house
        self.cookie = None
        words = [house.program, "serve", "--config", house.config]
        # A campaign that is killed leaves no server behind.
        mortal = ["/usr/bin/setpriv", "--pdeathsig", "KILL"]
        self.process = house.spawn([*mortal, *before] + (words if logins else house.words("serve")),
                                   environment, name)
        house.known.add(self.process)
        if memory:
            resource.prlimit(self.process, resource.RLIMIT_AS, (memory, memory))
        pattern = r"http://127\.0\.0\.1:(\d+)(/open\?token=\w+|/)\n"
        match = eventually(lambda: re.search(pattern, "".join(house.output(name))))
        if not match:
            raise RuntimeError("the server does not start: " + "".join(house.output(name)))
        self.port = int(match[1])
        if not logins:
            reply = self.ask("GET", match[2])
            self.cookie = reply.getheader("Set-Cookie").partition(";")[0]

    def ask(self, method, path, body=None, seconds=DEADLINE, more=None):
        connection = http.client.HTTPConnection("127.0.0.1", self.port, timeout=seconds)
        fields = {"Content-Type": "application/json", "Connection": "close", **(more or {})}
        if self.cookie:
            fields.setdefault("Cookie", self.cookie)
        try:
            connection.request(method, path, None if body is None else json.dumps(body), fields)
            reply = connection.getresponse()
            reply.content = reply.read()
            return reply
        finally:
            connection.close()

    def call(self, method, params, seconds=DEADLINE):
        reply = self.ask("POST", "/api/" + method, params, seconds)
        return json.loads(reply.content)

    def descriptors(self):
        try:
            return len(os.listdir(f"/proc/{self.process}/fd"))
        except FileNotFoundError:
            return 0

    def settled_descriptors(self):
        """The number once it stays the same for a while."""
        number, since = self.descriptors(), time.monotonic()
        while time.monotonic() - since < 0.2:
            time.sleep(0.01)
            if number != (now := self.descriptors()):
                number, since = now, time.monotonic()
        return number

    def lives(self):
        if self.process in self.house.known and os.waitpid(self.process, os.WNOHANG) != (0, 0):
            self.house.known.discard(self.process)
        return self.process in self.house.known

    def kill(self):
        os.kill(self.process, signal.SIGKILL)
        os.waitpid(self.process, 0)
        self.house.known.discard(self.process)

    def stop(self):
        os.kill(self.process, signal.SIGTERM)
        os.waitpid(self.process, 0)
        self.house.known.discard(self.process)


def password(user):
    return "right-" + user


class Visitor:
    """One of a server's users, once logged in. Asks as a Server does."""

    def __init__(self, server, user):
        self.server = server
        self.user = user
        reply = server.ask("POST", "/login", {"user": user, "password": password(user)})
        if reply.status != 200:
            raise RuntimeError(f"{user} is not let in: {reply.status} {reply.content}")
        self.cookie = reply.getheader("Set-Cookie").partition(";")[0]

    def ask(self, method, path, body=None, seconds=DEADLINE, more=None):
        return self.server.ask(method, path, body, seconds, {"Cookie": self.cookie, **(more or {})})

    def call(self, method, params, seconds=DEADLINE):
        return json.loads(self.ask("POST", "/api/" + method, params, seconds).content)
