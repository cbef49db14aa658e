"""The rows of the table that are about the name index: a daemon of their own answers ours, while
the peers walk, or ask an index of theirs."""

import contextlib
import http.client
import json
import os
import pathlib
import re
import resource
import shutil
import statistics
import subprocess
import sys
import tempfile
import time
import urllib.parse

QUESTIONS = 300
CHANGED = 20_000
FRESH_ROUNDS = 40
ROUNDS = 15
PATIENCE = 600
SMALL_BOX = 256 << 20
INSTANT = ["invoice", "xylophone", "zzz-nothing", "e", "*.jpg", "regex:[0-9]{3}x", "size:>1k",
           "modified:today", "ext:pdf report", "!invoice photo|music"]


class Index:
    """`arbory index` over one folder, and what asks it. `prepare` is called in its process first."""

    def __init__(self, bin_dir, folder, prepare=None):
        self.program = str(bin_dir / "arbory")
        self.folder = folder
        self.prepare = prepare
        self.dir = tempfile.mkdtemp(prefix="arbory-bench-index-")
        self.config = self.dir + "/arbory.toml"
        pathlib.Path(self.config).write_text(
            f'state_dir = "{self.dir}/state"\nvolumes = []\n[shares]\ntree = "{folder}"\n'
            '[server]\nlisten = "127.0.0.1:0"\naccess_log = false\n')
        self.warm()
        self.built = self.start()

    def warm(self):
        """Folders and inodes come into memory, as a machine that is used has them."""
        subprocess.run(["find", self.folder, "-size", "+1G"], check=True,
                       stdout=subprocess.DEVNULL)

    def start(self):
        """Seconds until everything is current."""
        begun = time.perf_counter()
        self.daemon = self.spawn("index", preexec_fn=self.prepare)
        self.wait(lambda: self.status()["current"])
        self.wait(lambda: self.figures()["attributes"] == "current")
        return time.perf_counter() - begun

    def wait(self, reached):
        """Seconds until then."""
        begun = time.perf_counter()
        while not reached():
            if time.perf_counter() - begun > PATIENCE:
                raise RuntimeError(f"waited too long for the index: {self.status()}")
            time.sleep(0.005)
        return time.perf_counter() - begun

    def spawn(self, *words, **more):
        return subprocess.Popen([self.program, *words, "--config", self.config],
                                stderr=subprocess.DEVNULL, **more)

    def status(self):
        done = subprocess.run([self.program, "index", "--status", "--json", "--config", self.config],
                              capture_output=True, text=True)
        try:
            return json.loads(done.stdout)
        except ValueError:
            return {"current": False}

    def figures(self):
        return self.status()["file_systems"][0]

    def search_words(self, use="always"):
        return [self.program, "search", "--config", self.config, "--index", use]

    def search(self, *words, use="always"):
        return [*self.search_words(use), *words, self.folder]

    def took(self, *words, use="always"):
        """Milliseconds of whole searches, the median."""
        took = []
        for _ in range(ROUNDS):
            begun = time.perf_counter()
            done = subprocess.run(self.search(*words, use=use), stdout=subprocess.DEVNULL,
                                  stderr=subprocess.DEVNULL)
            if done.returncode not in (0, 1):
                raise RuntimeError(f"{words}: ended with {done.returncode}")
            took.append((time.perf_counter() - begun) * 1000)
        return statistics.median(took)

    def stop(self):
        self.daemon.terminate()
        self.daemon.wait()

    def close(self):
        self.stop()
        shutil.rmtree(self.dir, ignore_errors=True)


def comparisons(index, fd):
    """Rows beside the peers, as run.py has them."""
    tree = index.folder
    database = index.dir + "/plocate.db"
    plocate = shutil.which("plocate")
    if plocate:
        subprocess.run(["updatedb.plocate", "-U", tree, "-o", database, "--prunepaths", "",
                        "-l", "no"], check=True)

    def row(name, words, fds, finds, located, targets):
        commands = {"ours": index.search(*words), "fd": [*fd, *fds, tree],
                    "find": ["find", tree, "-mindepth", "1", *finds]}
        if plocate and located:
            commands["plocate"] = [plocate, "-d", database, "-b", *located]
        return name, commands, targets

    yield row("index: invoice", ["invoice"], ["invoice"], ["-iname", "*invoice*"],
              ["-i", "invoice"], {"fd": "≤ 0.25", "plocate": "≤ 1"})
    yield row("index: xylophone, few hits", ["xylophone"], ["xylophone"],
              ["-iname", "*xylophone*"], ["-i", "xylophone"],
              {"fd": "≤ 0.02 and 25 ms", "plocate": "≤ 1"})
    if plocate:  # by the command that is most like it: best first, a hundred rows at most
        yield ("index: the same, arbory find",
               {"ours": [index.program, "find", "--config", index.config, "xylophone"],
                "plocate": [plocate, "-d", database, "-b", "-i", "xylophone"]}, {})
    yield row("index: nothing", ["zzz-nothing"], ["zzz-nothing"], ["-iname", "*zzz-nothing*"],
              ["-i", "zzz-nothing"], {"fd": "≤ 0.02 and 25 ms", "plocate": "≤ 15 ms"})
    yield row("index: a glob", ["*xylo*.jpg"], ["-g", "*xylo*.jpg"], ["-iname", "*xylo*.jpg"],
              ["-i", "*xylo*.jpg"], {"plocate": "≤ 1"})
    yield row("index: an expression", ["regex:[x-z]{3}[0-9]{4}q"], ["[x-z]{3}[0-9]{4}q"],
              ["-regextype", "posix-extended", "-iregex", ".*/[^/]*[x-z]{3}[0-9]{4}q[^/]*"],
              ["-i", "--regex", "[x-z]{3}[0-9]{4}q"], {"plocate": "≤ 1"})
    yield row("index: size and time", ["size:>1k modified:<2000", "--type", "file"],
              ["-t", "f", "-S", "+1k", "--changed-before", "2000-01-01", "."],
              ["-type", "f", "-size", "+1k", "!", "-newermt", "2000-01-01"], None, {})
    yield row("index: everything", [""], ["."], [], [""], {"fd": "≤ 1.5"})


def cold_comparison(index, fd):
    """A row with nothing of the tree, the table or the programs in memory."""
    commands = {"ours": index.search("xylophone"), "fd": [*fd, "xylophone", index.folder],
                "find": ["find", index.folder, "-iname", "*xylophone*"]}
    return "index, cold cache: xylophone", commands


@contextlib.contextmanager
def server(index):
    process = index.spawn("serve", "--user", "root", stdout=subprocess.PIPE, text=True)
    try:
        match = None
        while not match:
            match = re.search(r"http://127\.0\.0\.1:(\d+)(/\S*)", process.stdout.readline())
        connection = http.client.HTTPConnection("127.0.0.1", int(match[1]))
        connection.request("GET", match[2])
        reply = connection.getresponse()
        reply.read()
        yield connection, reply.getheader("Set-Cookie", "").partition(";")[0]
    finally:
        process.terminate()
        process.wait()


def instant(index):
    """Milliseconds of each instant answer."""
    took = []
    with server(index) as (connection, cookie):
        for number in range(QUESTIONS):
            query = urllib.parse.quote(json.dumps({"pattern": INSTANT[number % len(INSTANT)]}))
            begun = time.perf_counter()
            connection.request("GET", "/instant?params=" + query, headers={"Cookie": cookie})
            reply = connection.getresponse()
            text = reply.read()
            took.append((time.perf_counter() - begun) * 1000)
            if reply.status != 200:
                raise RuntimeError(f"{query}: {reply.status} {text[:200]}")
    return sorted(took)


def writing(folder):
    """Seconds of processor that creating, renaming and deleting files took, an operation."""
    os.makedirs(folder)
    before = resource.getrusage(resource.RUSAGE_SELF)
    for number in range(CHANGED):
        path = f"{folder}/{number}"
        os.close(os.open(path, os.O_CREAT | os.O_WRONLY))
        os.rename(path, path + "x")
        os.unlink(path + "x")
    after = resource.getrusage(resource.RUSAGE_SELF)
    shutil.rmtree(folder)
    spent = after.ru_utime + after.ru_stime - before.ru_utime - before.ru_stime
    return spent / CHANGED / 3


def freshness(index, rounds=FRESH_ROUNDS):
    """Milliseconds of answers that show a change made just before, and how many there were."""
    took = []
    for number in range(rounds):
        path = f"{index.folder}/fresh-{number}-{os.getpid()}"
        pathlib.Path(path).touch()
        begun = time.perf_counter()
        done = subprocess.run(index.search(os.path.basename(path)), capture_output=True)
        milliseconds = (time.perf_counter() - begun) * 1000
        os.unlink(path)
        if done.returncode == 0:
            took.append(milliseconds)
        elif done.returncode == 1:
            raise RuntimeError("a file that was there before the question is not in its answer")
    return sorted(took)


STORM = """
import os, sys
os.makedirs(sys.argv[1], exist_ok=True)
while True:
    for name in ("a", "b", "c", "d"):
        path = sys.argv[1] + "/" + name
        os.close(os.open(path, os.O_CREAT | os.O_WRONLY))
        os.rename(path, path + "x")
        os.unlink(path + "x")
"""


def under_storm(index):
    """The same while a process makes as many events as it can; and how many a second."""
    beside = index.folder + "/storm-of-the-benchmark"
    storm = subprocess.Popen([sys.executable, "-c", STORM, beside])
    try:
        time.sleep(0.5)
        events, begun = index.figures()["events"], time.perf_counter()
        took = freshness(index)
        rate = (index.figures()["events"] - events) / (time.perf_counter() - begun)
    finally:
        storm.kill()
        storm.wait()
        shutil.rmtree(beside, ignore_errors=True)
    return took, rate


def gap(index):
    """Seconds until names, and then attributes, are current after a time without the daemon."""
    index.stop()
    pathlib.Path(index.folder + "/made-in-the-gap").touch()
    begun = time.perf_counter()
    index.daemon = index.spawn("index")
    # All is current once attributes are as well.
    index.wait(lambda: any(one["state"] == "current"
                           for one in index.status().get("file_systems", [])))
    names = time.perf_counter() - begun
    index.wait(lambda: index.figures()["attributes"] == "current")
    os.unlink(index.folder + "/made-in-the-gap")
    return names, time.perf_counter() - begun


def rebuilt(index, drop_caches):
    """Seconds that a build from nothing takes with nothing of the tree in memory."""
    index.stop()
    shutil.rmtree(index.dir + "/state/index")
    drop_caches()
    return index.start()


def small_box():
    """What puts a process into a memory group of its own, and that group's peak and end; None
    where groups cannot be made."""
    for root, limit, peak in [("/sys/fs/cgroup", "memory.max", "memory.peak"),
                              ("/sys/fs/cgroup/memory", "memory.limit_in_bytes",
                               "memory.max_usage_in_bytes")]:
        group = pathlib.Path(root) / f"arbory-bench-{os.getpid()}"
        if not (pathlib.Path(root) / "cgroup.procs").exists():
            continue
        try:
            group.mkdir()
            (group / limit).write_text(str(SMALL_BOX))
        except OSError:
            if group.is_dir():
                group.rmdir()
            continue
        def enter():
            (group / "cgroup.procs").write_text(str(os.getpid()))
        return enter, lambda: int((group / peak).read_text()), group.rmdir
    return None


def sizes(bin_dir, trees):
    """A row for each tree: what grows with it, and what does not."""
    for name, tree in trees:
        index = Index(bin_dir, tree)
        figures = index.figures()
        few = index.took("xylophone")
        none = index.took("zzz-nothing")
        index.close()
        yield [f"index: {name} files", f"built {index.built:.1f} s; "
               f"{figures['table_bytes'] / 1e6:.0f} MB on disk; few hits {few:.1f} ms, "
               f"none {none:.1f} ms", "linear"]


def in_small_box(bin_dir, tree):
    box = small_box()
    if not box:
        yield ["index: in 256 MB", "not measured: no memory groups here", ""]
        return
    enter, peak, leave = box
    try:
        index = Index(bin_dir, tree, enter)
        few = index.took("xylophone")
        many = index.took("invoice")
        most = peak()
        index.close()
    finally:
        leave()
    yield ["index: daemon in a memory group of 256 MB", f"built {index.built:.1f} s; few hits "
           f"{few:.1f} ms, invoice {many:.0f} ms; peak with cache {most / 1e6:.0f} MB", ""]


def measures(index, bin_dir, trees, drop_caches):
    """Rows of one figure: name, measured, must. Ends the index. `drop_caches` may be None."""
    cold = f"{rebuilt(index, drop_caches):.2f} s" if drop_caches else "not measured"
    index.warm()
    figures = index.figures()
    entries = max(figures["entries"], 1)
    memory = 16 + figures["folders"] * 10 / 1e6
    yield ["index: built with all attributes", f"{index.built:.2f} s", "≤ 3 s"]
    yield ["index: the same, cold cache", cold, ""]
    yield ["index: on disk", f"{figures['table_bytes'] / 1e6:.1f} MB, "
           f"{figures['table_bytes'] / entries:.1f} bytes an entry", "≤ 75 MB"]
    yield ["index: memory of the daemon beside the mapped file",
           f"{figures['memory_bytes'] / 1e6:.1f} MB", f"≤ {memory:.1f} MB"]
    took = instant(index)
    yield ["index: instant answer over HTTP, half of them within",
           f"{took[len(took) // 2]:.1f} ms", "≤ 10 ms"]
    yield ["index: instant answer over HTTP, 99 of 100 within",
           f"{took[len(took) * 99 // 100]:.1f} ms", "≤ 30 ms"]
    none = index.took("zzz-nothing")
    quiet = freshness(index)
    middle = statistics.median(quiet)
    yield ["index: a change is seen after", f"{max(middle - none, 0):.1f} ms more than no change",
           "≤ 2 ms"]
    loaded, rate = under_storm(index)
    loaded_middle = statistics.median(loaded) if loaded else float("nan")
    yield ["index: the same in a storm of events",
           f"{loaded_middle - middle:.1f} ms more, beside {rate:,.0f} events/s on the same cores; "
           f"{len(loaded)} of {FRESH_ROUNDS} from the index, the others told to walk",
           "≤ 100 ms, else walks"]
    names, attributes = gap(index)
    yield ["index: after a gap, names are current in", f"{names:.2f} s from the daemon's start",
           "≤ 0.3 s"]
    yield ["index: after a gap, attributes are current in", f"{attributes:.2f} s", "≤ 3 s"]
    subprocess.run([index.program, "index", "--rebuild", "--config", index.config], check=True,
                   stdout=subprocess.DEVNULL)
    building = index.took("xylophone", use="auto")
    walked = not index.status()["current"]
    yield ["index: few hits while it is built anew", f"{building:.0f} ms"
           + ("" if walked else " (built before the last of them)"), "by walking"]
    index.wait(lambda: index.status()["current"])
    beside = index.folder + "/written-by-the-benchmark"
    watched = min(writing(beside) for _ in range(3))
    index.close()
    free = min(writing(beside) for _ in range(3))
    yield ["index: a writer's extra cost", f"{(watched - free) * 1e6:.2f} µs an operation",
           "≤ 4 µs"]
    yield from in_small_box(bin_dir, index.folder)
    yield from sizes(bin_dir, trees)
