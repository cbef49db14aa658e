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
import tempfile
import time
import urllib.parse

QUESTIONS = 300
CHANGED = 20_000
FRESH_ROUNDS = 40
PATIENCE = 600
INSTANT = ["invoice", "xylophone", "zzz-nothing", "e", "*.jpg", "regex:[0-9]{3}x", "size:>1k",
           "modified:today", "ext:pdf report", "!invoice photo|music"]


class Index:
    """`arbory index` over one folder, and what asks it."""

    def __init__(self, bin_dir, folder):
        self.program = str(bin_dir / "arbory")
        self.folder = folder
        self.dir = tempfile.mkdtemp(prefix="arbory-bench-index-")
        self.config = self.dir + "/arbory.toml"
        pathlib.Path(self.config).write_text(
            f'state_dir = "{self.dir}/state"\nvolumes = []\n[shares]\ntree = "{folder}"\n'
            '[server]\nlisten = "127.0.0.1:0"\naccess_log = false\n')
        begun = time.perf_counter()
        self.daemon = self.spawn("index")
        while not self.status()["current"]:
            if time.perf_counter() - begun > PATIENCE:
                raise RuntimeError(f"the index is not current: {self.status()}")
            time.sleep(0.02)
        self.built = time.perf_counter() - begun

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

    def search(self, *words):
        return [self.program, "search", "--config", self.config, "--index", "always", *words,
                self.folder]

    def close(self):
        self.daemon.terminate()
        self.daemon.wait()
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


def freshness(index):
    """Milliseconds from a change to an answer that shows it, less those of an answer without one."""
    took = []
    for number in range(FRESH_ROUNDS):
        path = f"{index.folder}/fresh-{number}-{os.getpid()}"
        def ask():
            begun = time.perf_counter()
            found = subprocess.run(index.search(os.path.basename(path)), capture_output=True).stdout
            return (time.perf_counter() - begun) * 1000, found
        quiet, _ = ask()
        pathlib.Path(path).touch()
        changed, found = ask()
        os.unlink(path)
        if not found:
            raise RuntimeError("a file that was there before the question is not in its answer")
        took.append(changed - quiet)
    return statistics.median(took)


def measures(index, folder):
    """Rows of one figure: name, measured, must."""
    figures = index.figures()
    entries = max(figures["entries"], 1)
    yield ["index: built with all attributes", f"{index.built:.2f} s", "≤ 3 s"]
    yield ["index: on disk", f"{figures['table_bytes'] / 1e6:.1f} MB, "
           f"{figures['table_bytes'] / entries:.1f} bytes an entry", "≤ 75 MB"]
    yield ["index: memory of the daemon beside the mapped file",
           f"{figures['memory_bytes'] / 1e6:.1f} MB", "≤ 16.7 MB"]
    took = instant(index)
    yield ["index: instant answer over HTTP, half of them within", f"{took[len(took) // 2]:.1f} ms",
           "≤ 10 ms"]
    yield ["index: instant answer over HTTP, 99 of 100 within", f"{took[len(took) * 99 // 100]:.1f} ms",
           "≤ 30 ms"]
    yield ["index: a change is seen after", f"{freshness(index):.1f} ms more", "≤ 2 ms"]
    beside = folder + "/written-by-the-benchmark"
    watched = min(writing(beside) for _ in range(3))
    index.close()
    free = min(writing(beside) for _ in range(3))
    yield ["index: a writer's extra cost", f"{(watched - free) * 1e6:.2f} µs an operation", "≤ 4 µs"]
