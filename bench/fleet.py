#!/usr/bin/env python3
"""What a search over many machines costs: fleet.py BIN_DIR TOP [--boxes N] [--files N]
[--stand-ins N ...] [--quick] [--write]

Real boxes, each an `arbory serve`, walking and with an index; and stand-ins, which give the same
short page at once, so that what is left is the front. HAProxy stands between them and the front, as
it does outside, and plays the stand-ins. Prints rows of a table, in medians of all rounds."""

import argparse
import asyncio
import concurrent.futures
import contextlib
import getpass
import http.client
import json
import os
import pathlib
import re
import shutil
import signal
import socket
import statistics
import subprocess
import tempfile
import threading
import time

import run

ROUNDS = 15
FIRST_PORT = 21000
DEADLINE_MS = 500
PAGE = {"limit": 100, "sort_by": "name", "sort_direction": "ASC", "additional": "size,time"}
HAPROXY = "/usr/sbin/haproxy"
# Whom all servers serve.
USER = "nobody" if os.geteuid() == 0 else getpass.getuser()
AS_USER = ["--user", USER] if os.geteuid() == 0 else []


HEAD = ["a fleet", "measured", "must"]
MOST_MEMORY = 64  # MiB
MOST_OVER_SLOWEST = 1.3


def page_of(count, name="invoice"):
    rows = [[0, f"{name} {number}.txt", 33188, 0, 0, 5, 1, 1, 1, None, number]
            for number in range(count)]
    return json.dumps({"protocol": 2, "version": "0", "task": "0" * 32, "error": 0, "source": "walk",
                       "index": "none", "users": ["u"], "groups": ["g"], "folders": [["data", "f"]],
                       "finished": True, "total": count, "next": count, "rows": rows})


class Fleet:
    """A front and what it asks, `boxes` by name and address."""

    def __init__(self, bin_dir, folder, boxes):
        self.program = str(bin_dir / "arbory")
        self.folder = folder
        self.boxes = list(boxes)
        key = folder / "front.key"
        if not key.exists():
            subprocess.run([self.program, "fleet", "key", str(key)], check=True,
                           stdout=subprocess.DEVNULL)
        lines = "".join(f'{name} = "{address}"\n' for name, address in boxes.items())
        (folder / "fleet.toml").write_text(
            f'front = "bench"\nkey_file = "{key}"\nproxy = "{folder}/proxy.sock"\n'
            f"deadline_ms = {DEADLINE_MS}\n[boxes]\n{lines}")
        subprocess.run([self.program, "fleet", "config", str(folder / "fleet.toml"), "--write",
                        str(folder / "proxy.cfg")], check=True)

    @contextlib.contextmanager
    def running(self):
        with process([HAPROXY, "-W", "-db", "-f", str(self.folder / "proxy.cfg")]):
            while not (self.folder / "proxy.sock").exists():
                time.sleep(0.02)
            time.sleep(3)  # the first checks
            with server(self.program, self.folder, "front", "",
                        "--fleet", str(self.folder / "fleet.toml")) as front:
                yield front


@contextlib.contextmanager
def process(words, **more):
    child = subprocess.Popen(words, stderr=subprocess.DEVNULL, **more)
    try:
        yield child
    finally:
        child.terminate()
        child.wait()


class Client:
    def __init__(self, child, port, path):
        self.pid = child.pid
        self.address = f"http://127.0.0.1:{port}"
        self.connection = http.client.HTTPConnection("127.0.0.1", port)
        self.connection.request("GET", path)
        reply = self.connection.getresponse()
        reply.read()
        self.cookie = reply.getheader("Set-Cookie", "").partition(";")[0]

    def ask(self, method, path, body=None):
        self.connection.request(method, path, json.dumps(body) if body else None,
                                {"Cookie": self.cookie, "Content-Type": "application/json"})
        reply = self.connection.getresponse()
        text = reply.read()
        if reply.status != 200:
            raise RuntimeError(f"{path}: {reply.status} {text[:300]}")
        return json.loads(text)

    def call(self, method, params):
        return self.ask("POST", f"/api/NUVA.Arbory.Search/2/{method}", params)["data"]

    def first_page(self, folders, pattern="invoice"):
        """Milliseconds until rows can be shown, until the search has ended, and what it says then."""
        begun = time.perf_counter()
        said = self.ask("POST", "/searches", {"pattern": pattern, "folder_path": folders, "list": PAGE})
        page = said["page"]
        while not page["files"] and not page["finished"]:
            page = self.call("list", {**PAGE, "taskid": said["taskid"]})
        shown = (time.perf_counter() - begun) * 1000
        state = {}
        while not state.get("finished"):
            time.sleep(0.02)  # as the page asks; more often would take what the search needs
            state = self.ask("GET", "/searches/" + said["taskid"])
        ended = (time.perf_counter() - begun) * 1000
        self.call("clean", {"taskid": said["taskid"]})
        return shown, ended, state


@contextlib.contextmanager
def server(program, folder, name, more, *words):
    config = folder / f"{name}.toml"
    config.write_text(f'state_dir = "{folder}/{name}-state"\nvolumes = []\n{more}\n')
    text = config.read_text()
    if "[server]" not in text:
        config.write_text(text + '[server]\nlisten = "127.0.0.1:0"\naccess_log = false\n')
    (folder / f"{name}-state").mkdir(exist_ok=True)
    with process([program, "serve", "--config", str(config), *AS_USER, *words],
                 stdout=subprocess.PIPE, text=True) as child:
        match = None
        while not match:
            match = re.search(r"http://127\.0\.0\.1:(\d+)(/\S*)", child.stdout.readline())
        yield Client(child, int(match[1]), match[2])


class Memory:
    """The most that any search's worker of the front's has had, in MiB, while this is entered, and
    any other of its processes, such as those that sort large results afterwards."""

    def __init__(self, pid):
        self.pid, self.most, self.others, self.ended = pid, 0, 0, False
        self.workers = set()

    def __enter__(self):
        self.thread = threading.Thread(target=self.watch)
        self.thread.start()
        return self

    def __exit__(self, *failure):
        self.ended = True
        self.thread.join()

    def watch(self):
        while not self.ended:
            for status in pathlib.Path("/proc").glob("[0-9]*/status"):
                with contextlib.suppress(OSError):
                    text = status.read_text()
                    if f"\nPPid:\t{self.pid}\n" in text and "VmHWM:" in text:
                        self.saw(status.parent.name, text)
            time.sleep(0.01)

    def saw(self, pid, text):
        had = int(text.split("VmHWM:")[1].split()[0]) / 1024
        # No other process has threads.
        if int(text.split("Threads:")[1].split()[0]) > 1:
            self.workers.add(pid)
        if pid in self.workers:
            self.most = max(self.most, had)
        else:
            self.others = max(self.others, had)


def measure(front, folders):
    front.first_page(folders)
    took = [front.first_page(folders) for _ in range(ROUNDS)]
    return (statistics.median(shown for shown, _, _ in took),
            statistics.median(ended for _, ended, _ in took), took[-1][2])


def row(name, measured, must="", reached=True):
    line = [name, measured, must + ("" if reached else ": not reached")]
    print("| " + " | ".join(line) + " |", flush=True)
    return line


@contextlib.contextmanager
def folder():
    path = pathlib.Path(tempfile.mkdtemp(prefix="arbory-bench-fleet-"))
    path.chmod(0o755)
    try:
        yield path
    finally:
        shutil.rmtree(path, ignore_errors=True)


class Liars:
    """Stand-ins that answer with as many bytes as are read of a box, none of them to be believed."""

    def __init__(self, count):
        # More rows than it counts itself.
        page = page_of(1700, "n" * 240).replace('"total": 1700', '"total": 1').encode()
        self.reply = (b"HTTP/1.1 200 OK\r\nContent-Type: application/json\r\nContent-Length: "
                      + str(len(page)).encode() + b"\r\n\r\n" + page)
        self.loop = asyncio.new_event_loop()
        servers = [self.loop.run_until_complete(
            asyncio.start_server(self.answer, "127.0.0.1", 0)) for _ in range(count)]
        self.addresses = [f"http://127.0.0.1:{one.sockets[0].getsockname()[1]}" for one in servers]
        self.thread = threading.Thread(target=self.loop.run_forever, daemon=True)
        self.thread.start()

    async def answer(self, reader, writer):
        with contextlib.suppress(OSError, asyncio.IncompleteReadError):
            while True:
                head = await reader.readuntil(b"\r\n\r\n")
                length = re.search(rb"(?i)content-length: (\d+)", head)
                await reader.readexactly(int(length[1]) if length else 0)
                writer.write(self.reply if head.startswith(b"POST") else
                             b"HTTP/1.1 200 OK\r\nContent-Length: 0\r\n\r\n")
                await writer.drain()
        writer.close()

    def close(self):
        self.loop.call_soon_threadsafe(self.loop.stop)
        self.thread.join()


def honest(place, count):
    """HAProxy's configuration for so many stand-ins, and their addresses."""
    (place / "page.json").write_text(page_of(4))
    config = place / "stand-ins.cfg"
    config.write_text(
        "defaults\n mode http\n timeout connect 5s\n timeout client 1m\n timeout server 1m\n"
        f"frontend all\n bind 127.0.0.1:{FIRST_PORT}-{FIRST_PORT + count - 1}\n"
        " http-request return status 200 content-type application/json file "
        f"{place}/page.json\n")
    return config, [f"http://127.0.0.1:{FIRST_PORT + number}" for number in range(count)]


def stand_ins(bin_dir, count, others=(), checked=True):
    """Times, what was said and the memory, of a search over so many stand-ins and other boxes.
    Fails where there is not each row of the stand-ins, or one of the others."""
    with folder() as place:
        config, addresses = honest(place, count)
        boxes = {f"box{number:04}": address
                 for number, address in enumerate([*addresses, *others])}
        fleet = Fleet(bin_dir, place, boxes)
        if not checked:  # as it is before a check has noticed
            text = (place / "proxy.cfg").read_text()
            (place / "proxy.cfg").write_text(re.sub("default-server check .*", "", text))
        with process([HAPROXY, "-db", "-f", str(config)]), fleet.running() as front:
            with Memory(front.pid) as memory:
                shown, ended, state = measure(front, [f"/{name}/data" for name in boxes])
    told = state["walk"]["fleet"]
    rows = state["walk"]["matches"]
    if told["answered"] != count or rows != 4 * count:
        raise RuntimeError(f"not all stand-ins answered: {json.dumps(state)[:800]}")
    return shown, ended, told, memory.most


def many(bin_dir, count, must):
    shown, ended, _, memory = stand_ins(bin_dir, count)
    name = f"{count:,} stand-ins"
    yield row(f"{name}: first page", f"{shown:.0f} ms", f"≤ {must} ms" if must else "",
              not must or shown <= must)
    yield row(f"{name}: all rows", f"{ended:.0f} ms; {memory:.0f} MiB of the search")


def troubled(bin_dir):
    with socket.create_server(("127.0.0.1", 0), backlog=4096) as silent:
        address = f"http://127.0.0.1:{silent.getsockname()[1]}"
        shown, ended, told, _ = stand_ins(bin_dir, 9, [address], checked=False)
    most = DEADLINE_MS + 250
    yield row("10 stand-ins, one frozen: first page", f"{shown:.0f} ms", f"≤ {DEADLINE_MS} ms",
              shown <= DEADLINE_MS)
    yield row(f"10 stand-ins, one frozen: end, at a deadline of {DEADLINE_MS} ms",
              f"{ended:.0f} ms; {told['answered']} answered, {told['late']} late", f"≤ {most} ms",
              ended <= most and told["late"] == 1)
    liars = Liars(100)
    try:
        for count in (1, 100):
            shown, ended, told, memory = stand_ins(bin_dir, 9, liars.addresses[:count])
            lost = told["down"] + told["late"]
            yield row(f"9 stand-ins, and {count} that say 500 KB of lies at once",
                      f"all rows of the 9, none of the others; {memory:.0f} MiB of the search",
                      f"≤ {MOST_MEMORY} MiB", lost == count and memory <= MOST_MEMORY)
    finally:
        liars.close()


@contextlib.contextmanager
def index_of(program, config):
    """Once it is current."""
    with process([program, "index", "--config", str(config)], stdout=subprocess.DEVNULL):
        attributes = None
        while attributes != "current":
            time.sleep(0.1)
            done = subprocess.run([program, "index", "--status", "--json", "--config", str(config)],
                                  capture_output=True, text=True)
            with contextlib.suppress(ValueError, KeyError, IndexError):
                attributes = json.loads(done.stdout)["file_systems"][0]["attributes"]
        yield


def real(bin_dir, count, tree, files, indexed):
    program = str(bin_dir / "arbory")
    with folder() as place, contextlib.ExitStack() as stack:
        key = subprocess.run([program, "fleet", "key", str(place / "front.key")],
                             check=True, capture_output=True, text=True).stdout.strip()
        boxes, own = {}, []
        for number in range(count):
            name = f"box{number}"
            box = stack.enter_context(server(
                program, place, name,
                f'[shares]\ndata = "{tree}"\n[server]\nlisten = "127.0.0.1:0"\naccess_log = false\n'
                f'[index]\nfolders = ["data"]\n'
                f'[fleet]\nname = "{name}"\nlowest_uid = 1\n[fleet.fronts.bench]\nkey = "{key}"\n'
                f'users = ["{USER}"]\n'))
            if indexed:
                stack.enter_context(index_of(program, place / f"{name}.toml"))
            boxes[name] = box.address
            own.append(box)
        front = stack.enter_context(Fleet(bin_dir, place, boxes).running())
        folders = [f"/{name}/data" for name in boxes]
        pool = stack.enter_context(concurrent.futures.ThreadPoolExecutor(count))
        shown, ended, at_once, alone = [], [], [], []
        with Memory(front.pid) as memory:
            for turn in range(ROUNDS + 1):
                fleets = front.first_page(folders)
                all_boxes = [first for first, _, _ in
                             pool.map(lambda box: box.first_page(["/data"]), own)]
                one = own[turn % count].first_page(["/data"])
                if turn == 0:
                    continue
                shown.append(fleets[0])
                ended.append(fleets[1])
                at_once.append(max(all_boxes))
                alone.append(one[0])
        said = fleets[2]["walk"]["fleet"]
        if said["answered"] != count:
            raise RuntimeError(f"not all boxes answered: {json.dumps(said)}")
    took, slowest = statistics.median(shown), statistics.median(at_once)
    most = MOST_OVER_SLOWEST * slowest + count
    name = f"{count} boxes of {files:,} files, {'indexed' if indexed else 'walked'}"
    yield row(f"{name}: first page", f"{took:.0f} ms", f"≤ {most:.0f} ms, {MOST_OVER_SLOWEST} of the "
              "slowest and 1 ms a box", took <= most)
    yield row(f"{name}: the slowest box, where people ask all of them at once",
              f"{slowest:.0f} ms; one asked alone {statistics.median(alone):.0f} ms")
    yield row(f"{name}: all rows",
              f"{statistics.median(ended):.0f} ms; {memory.most:.0f} MiB of the search, "
              f"{memory.others:.0f} to sort its rows", f"≤ {MOST_MEMORY} MiB of the search",
              memory.most <= MOST_MEMORY)


def figures(asked, bin_dir):
    musts = {100: 25, 1000: 250}
    for count in asked.stand_ins:
        yield from many(bin_dir, count, musts.get(count))
    yield from troubled(bin_dir)
    if not asked.boxes:
        return
    trees = run.Trees(bin_dir, asked.quick)
    files = asked.files // trees.scale
    with contextlib.ExitStack() as stack:
        if asked.files == 1_000_000:
            tree = trees.generated("names", asked.files)
        else:  # a size that nothing else is measured with
            tree = str(stack.enter_context(folder()) / "names")
            subprocess.run([bin_dir / "make_tree", "names", tree, str(files)], check=True)
        for indexed in (False, True) if os.geteuid() == 0 else (False,):
            yield from real(bin_dir, asked.boxes, tree, files, indexed)


def write(document, rows):
    """The document with these rows in its table of a fleet, all else as it is."""
    measured = {line[0] for line in rows}
    blocks = document.read_text().rstrip("\n").split("\n\n")
    mine = next((block for block in blocks if block.startswith(f"| {HEAD[0]} |")), None)
    old = [line.strip("|").split("|") for line in mine.splitlines()[2:]] if mine else []
    kept = [[cell.strip() for cell in line] for line in old if line[0].strip() not in measured]
    text = run.table(HEAD, kept + rows).rstrip("\n")
    blocks = [text if block == mine else block for block in blocks] + ([] if mine else [text])
    document.write_text("\n\n".join(blocks) + "\n")


def main():
    parser = argparse.ArgumentParser(prog="scripts/bench-fleet")
    parser.add_argument("bin", type=pathlib.Path, help=argparse.SUPPRESS)
    parser.add_argument("top", type=pathlib.Path, help=argparse.SUPPRESS)
    parser.add_argument("--boxes", type=int, default=5, help="real ones; 0 for none")
    parser.add_argument("--files", type=int, default=1_000_000, help="that each of them has")
    parser.add_argument("--stand-ins", type=int, nargs="*", default=[100, 1000])
    parser.add_argument("--quick", action="store_true", help="boxes with a tenth of the files")
    parser.add_argument("--write", action="store_true", help="write docs/benchmarks.md")
    asked = parser.parse_args()
    signal.signal(signal.SIGTERM, lambda *_: exit(1))
    print("| " + " | ".join(HEAD) + " |\n|---|---|---|", flush=True)
    rows = list(figures(asked, asked.bin.resolve()))
    if asked.write:
        write(asked.top / "docs" / "benchmarks.md", rows)


if __name__ == "__main__":
    main()
