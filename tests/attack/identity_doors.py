"""Who one says one is, what was planted before another came, and what is swapped while it is opened:
rows of the identity campaign.
"""

import ctypes
import json
import os
import signal
from concurrent.futures import ThreadPoolExecutor

from house import HISTORY, SEARCH, children, eventually, password
from identity_cells import Cell
from identity_world import NAME, as_user, system_call, uid_of

RENAME_EXCHANGE = 2
AT_FDCWD = -100


def session_cells(world, owner, other):
    """Guessed sessions and passwords."""
    cookie = world.visitors[owner].cookie
    name, _, value = cookie.partition("=")
    own = world.visitors[other].cookie.partition("=")[2]
    swapped = value[:-1] + ("0" if value[-1] != "0" else "1")
    half = len(value) // 2
    cookies = {"none": "", "last letter": f"{name}={swapped}", "beginning": f"{name}={value[:-1]}",
               "longer": f"{name}={value}0", "mixed": f"{name}={value[:half]}{own[half:]}",
               "other case": f"{name}={value.swapcase()}", "user": f"{name}={owner}",
               "other name": f"session={value}", "NUL": f"{name}=%00{value}"}

    def enters(text):
        reply = world.server.ask("GET", "/session", more={"Cookie": text})
        return reply.status == 200 and json.loads(reply.content)["user"] == owner
    for thing, text in cookies.items():
        yield Cell("session by cookie: " + thing, "use", owner, other,
                   lambda text=text: enters(text), lambda: enters(cookie), (owner, "cookie"))

    def let_in(user, word):
        reply = world.server.ask("POST", "/login", {"user": user, "password": word})
        return reply.status == 200
    words = {"another's": password(other), "none": "", "the name": owner,
             "more": password(owner) + "x", "other case": password(owner).upper()}
    # Each refusal takes two seconds.
    with ThreadPoolExecutor(len(words)) as pool:
        tries = {thing: pool.submit(let_in, owner, word) for thing, word in words.items()}
    for thing, entered in tries.items():
        yield Cell("login by password: " + thing, "enter", owner, other, entered.result,
                   lambda: let_in(owner, password(owner)), (owner, "login"))


def naming_cells(world, owner, other):
    """Calls that say that they are another's."""
    found = world.found[owner]

    def shows(who, method, params):
        return any(text in json.dumps(world.call(who, method, params))
                   for text in (world.secret(owner), "own-" + owner))
    calls = {"list": (SEARCH + "list", {"taskid": found}), "get": (HISTORY + "get", {})}
    for name in ("user", "username", "login", "owner", "account", "uid", "_user", "session"):
        for operation, (method, params) in calls.items():
            yield Cell("parameter " + name, operation, owner, other,
                       lambda name=name, method=method, params=params: shows(
                           other, method, {**params, name: owner}),
                       lambda method=method, params=params: shows(owner, method, params),
                       (owner, "naming", operation))
    house = world.house
    commands = {
        "search": ("search", "--content", world.secret(owner), world.top + "/own-" + owner),
        "why": ("why", f"{world.top}/own-{owner}/{NAME}", "treasure", world.top + "/own-" + owner),
        "call": ("call", "NUVA.Arbory.Search.History", "1", "get", "{}"),
    }
    for command, words in commands.items():
        def run(by, words=words):
            status, out = world.terminal(owner, by, *words)
            return status == 0 and out != ""
        yield Cell("--user in the terminal", command, owner, other, lambda run=run: run(other),
                   lambda run=run: run(owner), (owner, "terminal", command))


def clean_all_cells(world, owner, other):
    """Links in one's own folder of results, which clean-all removes with all that is in it."""
    mine = f"{world.roads}/{other}"
    targets = {"home": f"{world.top}/homes/{owner}", "share": f"{world.top}/own-{owner}",
               "results": f"{world.roads}/{owner}", "all results": world.roads,
               "state": f"{world.house.state}/users/{owner}", "volume": world.top, "all": "/"}

    def changes(who, target):
        world.put_back()
        if target:
            folder = f"{mine}/a folder"
            os.mkdir(folder)
            for place in (f"{mine}/{os.path.basename(target)}x", f"{folder}/link"):
                os.symlink(target, place)
                os.lchown(place, uid_of(other), -1)
            world.give(folder, other, 0o700)
        before = world.picture(owner)
        world.call(who, SEARCH + "Clean", {"action": "cleanall",
                                           "taskid": [world.found[owner]]})
        eventually(lambda: not children(world.server.process))
        return world.picture(owner) != before
    for thing, target in targets.items():
        yield Cell(f"{thing}, linked among results", "clean-all", owner, other,
                   lambda target=target: changes(other, target),
                   lambda: changes(owner, None), (owner, "clean-all"))
    world.put_back()


def early_cells(world, owner, other):
    """What somebody laid where the owner's results come to stand, while the folder was open to all as
    an older server left it."""
    mine = f"{world.roads}/{owner}"

    def lay(kind):
        if kind == "link":
            os.mkdir(f"{world.roads}/{other}/trap")
            os.chmod(f"{world.roads}/{other}/trap", 0o777)
            os.symlink(f"{world.roads}/{other}/trap", mine)
        elif kind == "file":
            return os.close(os.open(mine, os.O_CREAT | os.O_RDWR, 0o666))
        else:
            os.mkdir(mine)
            os.chmod(mine, 0o777 if kind == "open folder" else 0o700)
        return None

    def reads(who):
        """Whether a result stands where `who` can read it."""
        def look():
            for folder, _, names in os.walk(world.top + "/@tmp"):
                for name in names:
                    path = f"{folder}/{name}"
                    if os.access(path, os.R_OK) and NAME.encode() in open(path, "rb").read():
                        return os.lstat(folder).st_uid in (uid_of(owner), uid_of(who))
            return False
        return as_user(who, look)

    def attempt(kind):
        world.put_back()
        for user in (owner, other):
            for name in os.listdir(f"{world.roads}/{user}"):
                os.unlink(f"{world.roads}/{user}/{name}")
        os.rmdir(mine)
        os.chmod(world.roads, 0o1777)
        as_user(other, lambda: lay(kind))
        if not os.path.lexists(mine):
            raise RuntimeError("nothing could be laid")
        world.hits(owner, f"/own-{owner}", NAME)
        task = world.start(owner, f"/own-{owner}", NAME)
        eventually(lambda: world.state_of(owner, task)["finished"])
        seen = reads(other)
        world.call(owner, SEARCH + "clean", {"taskid": task})
        world.settle()
        return seen

    def control():
        world.put_back()
        return reads(owner)
    for kind in ("folder", "open folder", "link", "file"):
        yield Cell(f"{kind} laid for results", "search", owner, other,
                   lambda kind=kind: attempt(kind), control, (owner, "early"))
    world.put_back()


class Swapping:
    """A process of `user`'s that goes on exchanging two things of theirs."""

    def __init__(self, user, one, two):
        def swap():
            exchange = ctypes.CDLL(None, use_errno=True).renameat2
            while True:
                exchange(AT_FDCWD, one.encode(), AT_FDCWD, two.encode(), RENAME_EXCHANGE)
        self.process = os.fork()
        if self.process == 0:
            as_user(user, swap)
            os._exit(0)
        eventually(lambda: children(self.process))
        self.swapper = children(self.process).pop()

    def close(self):
        os.kill(self.swapper, signal.SIGKILL)
        os.waitpid(self.process, 0)


def race_cells(world, owner, other, rounds):
    """Something of `other`'s that is a link to the owner's half of the time, while it is opened.
    Yields (thing, operation, attempt, whether some rounds are refused); an attempt tells what came of
    each round: "got", "own" or "refused"."""
    by = f"{world.top}/open/by-{other}"
    for name in ("swap", "swap-file"):
        if not os.path.lexists(f"{by}/{name}"):
            if name == "swap":
                os.mkdir(f"{by}/swap")
                world.give(f"{by}/swap", other, 0o755)
                world.write(f"{by}/swap/{NAME}", "my own\n", other, 0o644)
            else:
                world.write(f"{by}/swap-file", "my own\n", other, 0o644)
    links = {"swap": f"../closed-{owner}", "swap-file": f"../closed-{owner}/{NAME}"}
    for name, target in links.items():
        link = f"{by}/{name}-{owner}"
        if not os.path.lexists(link):
            os.symlink(target, link)
            os.lchown(link, uid_of(other), -1)
    secret, own = world.secret(owner), f"/open/by-{other}/"

    def of_download(location):
        reply = world.get_file(other, location)
        if secret.encode() in reply.content:
            return "got"
        return "own" if reply.status == 200 else "refused"

    def of_search(pattern):
        paths = world.hits(other, own + "swap", pattern, contents=pattern == secret)
        if pattern == secret:
            return "got" if paths else "own"
        return "own" if paths else "refused"

    def of_history():
        reply = world.call(other, HISTORY + "get", {})
        world.call(other, HISTORY + "set", {"pattern": "mine"})
        if secret in json.dumps(reply):
            return "got"
        return "own" if "mine" in json.dumps(reply) else "refused"

    def of_start():
        reply = world.call(other, SEARCH + "start", {"folder_path": "/open", "pattern": "none"})
        world.settle()
        return "own" if reply["code"] == 0 else "refused"
    preference, tasks = world.preference(other), world.tasks(other)
    races = (
        ("folder", "download", by + "/swap", f"{by}/swap-{owner}",
         lambda: of_download(own + "swap/" + NAME), rounds, True),
        ("file", "download", by + "/swap-file", f"{by}/swap-file-{owner}",
         lambda: of_download(own + "swap-file"), rounds, True),
        ("folder", "search", by + "/swap", f"{by}/swap-{owner}",
         lambda: of_search(NAME), rounds // 4, True),
        ("folder", "search contents", by + "/swap", f"{by}/swap-{owner}",
         lambda: of_search(secret), rounds // 4, False),
        ("preference", "history", preference, world.preference(owner), of_history, rounds // 2,
         True),
        ("settings", "start", preference + "/usersettings", world.preference(owner) +
         "/usersettings", of_start, rounds // 4, False),
        ("tasks", "start", tasks, world.tasks(owner), of_start, rounds // 4, True),
    )
    for thing, operation, one, two, act, count, mixed in races:
        yield thing, operation, lambda one=one, two=two, act=act, count=count: one_race(
            world, owner, other, one, two, act, count), mixed


def one_race(world, owner, other, one, two, act, rounds):
    """What came of the rounds, and whether the owner's own was changed."""
    world.put_back()
    stored = two.startswith(world.house.state)
    link = two
    if stored:
        link = one + ".link"
        os.symlink(two, link)
        os.lchown(link, uid_of(other), -1)
    before = world.picture(owner)
    swapping = Swapping(other, one, link)
    try:
        seen = [act() for _ in range(rounds)]
    finally:
        swapping.close()
    world.settle()
    changed = world.picture(owner) != before
    if not stored and os.path.islink(one):
        os.rename(one, one + ".x")
        os.rename(link, one)
        os.rename(one + ".x", link)
    world.put_back()
    return seen + ["changed"] * changed
