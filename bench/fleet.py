#!/usr/bin/env python3
"""What a search over many machines costs: fleet.py BIN_DIR [--boxes N] [--files N] [--stand-ins N ...]

Real boxes, each an `arbory serve` with a tree of its own; and stand-ins, which give the same short page
at once, so that what is left is the front. HAProxy stands between them and the front, as it does
outside, and plays the stand-ins. Prints rows of a table, milliseconds in medians."""

import argparse
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

ROUNDS = 15
FIRST_PORT = 21000
DEADLINE_MS = 500
PAGE = {"limit": 100, "sort_by": "name", "sort_direction": "ASC", "additional": "size,time"}
HAPROXY = "/usr/sbin/haproxy"
# Whom all servers serve.
USER = "nobody" if os.geteuid() == 0 else getpass.getuser()
AS_USER = ["--user", USER] if os.geteuid() == 0 else []


def page_of_four():
    rows = [[0, f"invoice {number}.txt", 33188, 0, 0, 5, 1, 1, 1, None, number]
            for number in range(4)]
    return json.dumps({"protocol": 1, "version": "0", "task": "0" * 32, "error": 0, "source": "walk",
                       "index": "none", "users": ["u"], "groups": ["g"], "folders": [["data", "f"]],
                       "finished": True, "total": 4, "next": 4, "rows": rows})


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
    """The most that any process of the front's has had, in MiB, while this is entered."""

    def __init__(self, pid):
        self.pid, self.most, self.ended = pid, 0, False

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
                        self.most = max(self.most, int(text.split("VmHWM:")[1].split()[0]) / 1024)
            time.sleep(0.01)


def measure(front, folders):
    front.first_page(folders)
    took = [front.first_page(folders) for _ in range(ROUNDS)]
    return (statistics.median(shown for shown, _, _ in took),
            statistics.median(ended for _, ended, _ in took), took[-1][2])


def stand_ins(bin_dir, count, frozen=0):
    folder = pathlib.Path(tempfile.mkdtemp(prefix="arbory-bench-fleet-"))
    folder.chmod(0o755)
    try:
        config = folder / "stand-ins.cfg"
        config.write_text(
            "defaults\n mode http\n timeout connect 5s\n timeout client 1m\n timeout server 1m\n"
            f"frontend all\n bind 127.0.0.1:{FIRST_PORT}-{FIRST_PORT + count - frozen - 1}\n"
            " http-request return status 200 content-type application/json file "
            f"{folder}/page.json\n")
        (folder / "page.json").write_text(page_of_four())
        boxes = {f"box{number}": f"http://127.0.0.1:{FIRST_PORT + number}"
                 for number in range(count - frozen)}
        silent = [socket.create_server(("127.0.0.1", 0), backlog=4096) for _ in range(frozen)]
        for number, listener in enumerate(silent):
            boxes[f"silent{number}"] = f"http://127.0.0.1:{listener.getsockname()[1]}"
        fleet = Fleet(bin_dir, folder, boxes)
        if frozen:  # as it is before a check has noticed
            text = (folder / "proxy.cfg").read_text()
            (folder / "proxy.cfg").write_text(text.replace("default-server check", "default-server"))
        with process([HAPROXY, "-db", "-f", str(config)]), fleet.running() as front:
            with Memory(front.pid) as memory:
                shown, ended, state = measure(front, [f"/{name}/data" for name in boxes])
        told = state["walk"]["fleet"]
        if told["answered"] != count - frozen or told["late"] != frozen:
            raise RuntimeError(f"not all stand-ins answered: {json.dumps(told)[:500]}")
        name = f"{count} stand-ins" + (f", {frozen} of them frozen" if frozen else "")
        print(f"| {name} | {shown:.0f} | {ended:.0f} | | {memory.most:.0f} |", flush=True)
    finally:
        shutil.rmtree(folder, ignore_errors=True)


def real(bin_dir, count, files):
    folder = pathlib.Path(tempfile.mkdtemp(prefix="arbory-bench-fleet-"))
    folder.chmod(0o755)
    with contextlib.ExitStack() as stack:
        stack.callback(shutil.rmtree, folder, ignore_errors=True)
        key = subprocess.run([str(bin_dir / "arbory"), "fleet", "key", str(folder / "front.key")],
                             check=True, capture_output=True, text=True).stdout.strip()
        boxes, own = {}, []
        for number in range(count):
            name = f"box{number}"
            tree = folder / name
            subprocess.run([str(bin_dir / "make_tree"), "names", str(tree), str(files)], check=True,
                           stdout=subprocess.DEVNULL)
            box = stack.enter_context(server(
                str(bin_dir / "arbory"), folder, name,
                f'[shares]\ndata = "{tree}"\n[server]\nlisten = "127.0.0.1:0"\naccess_log = false\n'
                f'[fleet]\nname = "{name}"\nlowest_uid = 1\n[fleet.fronts.bench]\nkey = "{key}"\n'
                f'users = ["{USER}"]\n'))
            boxes[name] = box.address
            own.append(box)
        front = stack.enter_context(Fleet(bin_dir, folder, boxes).running())
        slowest = max(measure(box, ["/data"])[0] for box in own)
        with Memory(front.pid) as memory:
            shown, ended, _ = measure(front, [f"/{name}/data" for name in boxes])
        print(f"| {count} boxes of {files:,} files | {shown:.0f} | {ended:.0f} | "
              f"{shown / slowest:.2f} of the slowest by itself, {slowest:.0f} ms | "
              f"{memory.most:.0f} |", flush=True)


def main():
    parser = argparse.ArgumentParser(description=__doc__.split("\n", 1)[0])
    parser.add_argument("bin_dir", type=pathlib.Path)
    parser.add_argument("--boxes", type=int, default=5)
    parser.add_argument("--files", type=int, default=1_000_000)
    parser.add_argument("--stand-ins", type=int, nargs="*", default=[100, 1000])
    asked = parser.parse_args()
    bin_dir = asked.bin_dir.resolve()
    signal.signal(signal.SIGTERM, lambda *_: exit(1))
    print("| over | first page, ms | end, ms | | most memory of a process, MiB |\n"
          "|---|---|---|---|---|", flush=True)
    for count in asked.stand_ins:
        stand_ins(bin_dir, count)
    stand_ins(bin_dir, 10, frozen=1)
    if asked.boxes:
        real(bin_dir, asked.boxes, asked.files)


if __name__ == "__main__":
    main()
