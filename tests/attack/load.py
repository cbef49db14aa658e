"""Many users at once on one server with logins: each starts searches, asks for their pages, stops
some, cleans, downloads, looks at histories and logs in again. Half of the time one more is hostile:

  large deep bodies; lists without a limit and with every attribute; downloads that are not read;
  idle connections; a damaged result file that is listed

The others must not wait for that one, and every search finds what it finds in a quiet house. The
users are this run's own: the server sees a file of accounts in the place of the machine's.
"""

import asyncio
import json
import os
import random
import time
import urllib.parse

from attack import Outcome
from house import HISTORY, SEARCH, House, Server, become_subreaper, children, eventually, password

PROMISE = "Nobody waits for another: a hostile user costs the others little, and no search a file"
ATTACK = "users search, page, stop, clean, download and log in, half of the time beside a hostile one"

USERS, SECONDS, SLICE, THINK = 50, 600, 20, 1.0
SHORT_USERS, SHORT_SECONDS, SHORT_SLICE, SHORT_THINK = 6, 8, 1, 0.05
FIRST_UID = 23000
HOSTILE = "hostile"
FOLDERS, FILES_OF_A_FOLDER = 60, 40
MANY = 30_000  # files that the hostile one finds
DAMAGED_BYTES = 1 << 20  # the results of so many are larger
PAGE = 500
MOST_SLOWER = 3  # times, of the slowest hundredth of the others' requests
SERVER_KIB = 32 << 10
RETRY = 0.02  # seconds after a refusal
QUERIES = [{"pattern": "report"}, {"pattern": "*.jpg"}, {"pattern": "a3", "extension": "txt"},
           {"pattern": "needle", "search_content": True}]
EVERYTHING = "real_path,size,owner,time,perm,type"
DEEP = ('{"folder_path":' + "[" * 500_000 + "]" * 500_000 + "}").encode()


class Connection:
    """HTTP by one user, one request at a time."""

    def __init__(self, port, user):
        self.port, self.user = port, user
        self.cookie = ""
        self.writer = None

    async def send(self, method, path, body=b""):
        if self.writer is None:
            self.reader, self.writer = await asyncio.open_connection("127.0.0.1", self.port)
        head = (f"{method} {path} HTTP/1.1\r\nHost: localhost\r\nCookie: {self.cookie}\r\n"
                f"Content-Type: application/json\r\nContent-Length: {len(body)}\r\n\r\n")
        self.writer.write(head.encode() + body)
        await self.writer.drain()

    async def ask(self, method, path, body=None):
        """Status and body."""
        data = b"" if body is None else body if isinstance(body, bytes) else json.dumps(body).encode()
        try:
            await self.send(method, path, data)
            head = (await self.reader.readuntil(b"\r\n\r\n")).decode("latin1")
            fields = {name.lower(): value for name, _, value in
                      (line.partition(": ") for line in head.split("\r\n"))}
            if "set-cookie" in fields:
                self.cookie = fields["set-cookie"].partition(";")[0]
            content = await self.reader.readexactly(int(fields.get("content-length", "0")))
        except (OSError, asyncio.IncompleteReadError):
            self.close()
            return 0, b""
        if fields.get("connection", "").lower() == "close":
            self.close()
        return int(head.split()[1]), content

    def close(self):
        if self.writer:
            self.writer.close()
        self.writer = None

    async def log_in(self):
        return await self.ask("POST", "/login", {"user": self.user,
                                                 "password": password(self.user)})


class Load:
    def __init__(self, bin_dir, outcome, options):
        self.outcome = outcome
        self.options = options
        self.house = House(bin_dir, "logins_per_minute = 1000000\n", logins=True)
        self.names = [f"user{number}" for number in range(options.users)]
        self.make_shares()
        self.server = Server(self.house, logins=True, before=self.with_accounts())
        self.hostile = False
        self.took = {False: [], True: []}  # by whether the hostile one was there
        self.expected = {}

    def make_shares(self):
        """What is found in it depends on nothing."""
        chance = random.Random(1)
        top = self.house.dir + "/volume1/"
        for folder in range(FOLDERS):
            os.makedirs(f"{top}data/folder{folder}")
            for number in range(FILES_OF_A_FOLDER):
                kind = chance.choice(["jpg", "txt", "md"])
                name = chance.choice(["report", "picture", "a3 sheet", "other"])
                with open(f"{top}data/folder{folder}/{name} {number}.{kind}", "w") as file:
                    file.write("hay " * 200 + "needle" * (number % 9 == 0))
        os.makedirs(top + "many")
        os.mknod(top + "many/file")
        for number in range(MANY):
            os.link(top + "many/file", f"{top}many/file{number}")
        with open(self.house.share + "/large", "w") as file:
            file.truncate(1 << 30)

    def with_accounts(self):
        """Words before a command that lets it see this run's accounts."""
        for name, line in (("passwd", "{0}:x:{1}:{1}::/:/bin/false\n"), ("group", "{0}:x:{1}:\n")):
            with open("/etc/" + name) as file:
                text = file.read()
            for number, user in enumerate([*self.names, HOSTILE]):
                text += line.format(user, FIRST_UID + number)
            with open(f"{self.house.dir}/{name}", "w") as file:
                file.write(text)
        mount = " && ".join(f"mount --bind {self.house.dir}/{name} /etc/{name}"
                            for name in ("passwd", "group"))
        return ["/usr/bin/unshare", "--mount", "/bin/sh", "-c", mount + ' && exec "$@"', "sh"]

    # One of the users.

    async def timed(self, connection, method, path, body=None):
        """Until it is answered by more than a refusal."""
        hostile, begin = self.hostile, time.monotonic()
        while True:
            status, content = await connection.ask(method, path, body)
            if status not in (0, 429, 503):
                break
            self.outcome.count("refusals to the others")
            await asyncio.sleep(RETRY)
        self.took[hostile].append(time.monotonic() - begin)
        if status != 200:
            self.outcome.breaks(f"{method} {path} {body}: {status} {content[:200]}", self.repeat())
        return content

    async def call(self, connection, method, params):
        reply = json.loads(await self.timed(connection, "POST", "/api/" + method, params))
        if reply["code"] != 0:
            self.outcome.breaks(f"{method} {params}: {reply}", self.repeat())
        return reply["data"] or {}

    async def search(self, connection, number, chance):
        """Asks for pages until it has all; a search that was stopped shows a part."""
        task = (await self.call(connection, SEARCH + "start",
                                {"folder_path": "/data", **QUERIES[number]}))["taskid"]
        stopped = chance.random() < 0.2
        if stopped:
            await self.call(connection, SEARCH + "stop", {"taskid": task})
        while True:
            await asyncio.sleep(self.options.think * chance.random())
            data = await self.call(connection, SEARCH + "list", {
                "taskid": task, "limit": PAGE, "additional": EVERYTHING})
            if data.get("finished"):
                break
        found = [file["path"] for file in data["files"]]
        while len(found) < data["total"]:
            data = await self.call(connection, SEARCH + "list", {
                "taskid": task, "limit": PAGE, "offset": len(found)})
            found += [file["path"] for file in data["files"]]
            if not data["files"]:
                break
        await self.call(connection, SEARCH + "clean", {"taskid": task})
        self.outcome.count("searches")
        expected = self.expected.setdefault(number, sorted(found))
        if not (set(found) <= set(expected) if stopped else sorted(found) == expected):
            self.outcome.breaks(f"search {number} found {len(found)} of {len(expected)} files",
                                self.repeat())
        return found

    async def live(self, user, until):
        chance = random.Random(f"{self.options.seed} {user}")
        connection = Connection(self.server.port, user)
        await self.timed(connection, "POST", "/login", {"user": user, "password": password(user)})
        while time.monotonic() < until:
            numbers = list(range(len(QUERIES)))
            chance.shuffle(numbers)
            for number in numbers:
                await self.search(connection, number, chance)
                if time.monotonic() > until:
                    break
            path = "/files" + urllib.parse.quote(self.expected[0][0])
            content = await self.timed(connection, "GET", path)
            if not content.startswith(b"hay "):
                self.outcome.breaks(f"{path} came as {content[:50]}", self.repeat())
            await self.call(connection, HISTORY + "get", {})
            await self.timed(connection, "POST", "/logout", {})
            await self.timed(connection, "POST", "/login",
                             {"user": user, "password": password(user)})
        connection.close()

    # The hostile one.

    async def prepare(self):
        """The hostile one's session, a search with very many results, and one whose results it has
        made something else."""
        self.enemy = Connection(self.server.port, HOSTILE)
        await self.enemy.log_in()
        self.large = await self.enemys_search("/many", "file")
        self.damaged = await self.enemys_search("/data", "report")
        folder = f"{self.house.dir}/volume1/@tmp/webfm/FBSearch/{HOSTILE}"
        for name in os.listdir(folder):
            path = f"{folder}/{name}"
            if name.endswith(".db") and os.path.getsize(path) < DAMAGED_BYTES:
                with open(path, "r+b") as file:
                    file.seek(os.path.getsize(path) // 2)
                    file.write(random.Random(1).randbytes(4096))
                self.outcome.count("damaged result files")
        self.enemy.close()

    async def enemys_search(self, folder, pattern):
        async def ask(method, params):
            return json.loads((await self.enemy.ask("POST", "/api/" + SEARCH + method, params))[1])
        task = (await ask("start", {"folder_path": folder, "pattern": pattern}))["data"]["taskid"]
        while not (await ask("list", {"taskid": task, "limit": 1}))["data"].get("finished"):
            await asyncio.sleep(RETRY)
        return task

    async def attack(self):
        """Goes on with everything until it is cancelled."""
        def another():
            connection = Connection(self.server.port, HOSTILE)
            connection.cookie = self.enemy.cookie
            return connection

        async def again(path, body):
            connection = another()
            try:
                while True:
                    status, _ = await connection.ask("POST", path, body)
                    self.outcome.count("hostile requests")
                    self.outcome.count("of them refused", status != 200)
                    await asyncio.sleep(0.005)
            finally:
                connection.close()

        async def hold(path):
            """A reply that is asked for and not read, or a connection without a request."""
            connection = another()
            try:
                while True:
                    if path:
                        await connection.send("GET", path)
                    else:
                        _, connection.writer = await asyncio.open_connection("127.0.0.1",
                                                                             self.server.port)
                    await asyncio.sleep(2)
                    connection.close()
            except OSError:
                pass
            finally:
                connection.close()

        lists = [{"taskid": self.large, "limit": 0, "additional": EVERYTHING}] * 4
        lists += [{"taskid": self.damaged, "additional": EVERYTHING}] * 2
        await asyncio.gather(
            *[again("/api/" + SEARCH + "start", DEEP) for _ in range(6)],
            *[again("/api/" + SEARCH + "list", params) for params in lists],
            *[hold("/files/share/large") for _ in range(20)], *[hold("") for _ in range(40)])

    async def turns(self, until):
        while time.monotonic() < until:
            await asyncio.sleep(self.options.slice)
            self.hostile = True
            attack = asyncio.create_task(self.attack())
            await asyncio.sleep(self.options.slice)
            attack.cancel()
            try:
                await attack
            except asyncio.CancelledError:
                pass
            except Exception as error:
                self.outcome.breaks(f"the hostile one fails: {error!r}", self.repeat())
            self.hostile = False
            # What is still being worked on is of the hostile time.
            await asyncio.sleep(self.options.slice / 10)

    async def all(self):
        # In a quiet house each search is made once, which tells what all others must find.
        quiet = Connection(self.server.port, self.names[0])
        await quiet.log_in()
        never = random.Random()
        never.random = lambda: 0.99
        for number in range(len(QUERIES)):
            await self.search(quiet, number, never)
        quiet.close()
        await self.prepare()
        self.took = {False: [], True: []}
        until = time.monotonic() + self.options.seconds
        lives = asyncio.gather(*[self.live(user, until) for user in self.names])
        await asyncio.gather(lives, self.turns(until))

    def repeat(self):
        return (f"scripts/attack load --users {self.options.users} --seconds "
                f"{self.options.seconds} --seed {self.options.seed}")

    def judge(self):
        slow = {}
        for hostile, took in self.took.items():
            slow[hostile] = sorted(took)[len(took) * 99 // 100]
            self.outcome.count("requests of the others" + " beside the hostile one" * hostile,
                               len(took))
            name = "ms for the slowest hundredth" + " then" * hostile
            self.outcome.count(name, round(slow[hostile] * 1000))
        if slow[True] > MOST_SLOWER * slow[False]:
            self.outcome.breaks(f"the others wait: {slow[True]:.3f} s instead of {slow[False]:.3f}",
                                self.repeat())
        with open(f"/proc/{self.server.process}/status") as file:
            most = next(int(line.split()[1]) for line in file if line.startswith("VmHWM"))
        self.outcome.count("KiB of the server at most", most)
        if most > SERVER_KIB:
            self.outcome.breaks(f"the server took {most} KiB", self.repeat())
        if not eventually(lambda: not children(self.server.process)):
            left = [open(f"/proc/{child}/status").read().split("\n")[:9] for child in
                    children(self.server.process)]
            self.outcome.breaks(f"children are left: {left}", self.repeat())


def options(parser):
    parser.add_argument("--users", type=int, default=USERS)
    parser.add_argument("--seconds", type=int, default=SECONDS)
    parser.add_argument("--slice", type=float, default=SLICE, help="seconds with and without")
    parser.add_argument("--think", type=float, default=THINK, help="seconds between requests")
    parser.add_argument("--seed", type=int, default=1)


def run(options, bin_dir, top):
    outcome = Outcome()
    if os.geteuid() != 0:
        outcome.skip("logins: only root has them")
        return outcome
    if options.short:
        options.users, options.seconds = SHORT_USERS, SHORT_SECONDS
        options.slice, options.think = SHORT_SLICE, SHORT_THINK
    become_subreaper()
    load = Load(bin_dir, outcome, options)
    try:
        asyncio.run(load.all())
        load.judge()
        load.server.stop()
    finally:
        load.house.remove()
    return outcome
