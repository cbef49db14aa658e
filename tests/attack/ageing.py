"""Makes very many calls on one server, and looks at what it holds at the beginning, in the middle and at
the end: memory, descriptors, processes, and what lies in the state directory and among the results.
Each round starts a search, lists it, looks at and writes the history, loads a file, and cleans; the
first rounds are not looked at, as they fill what is filled once.
"""

import http.client
import json
import os

from attack import Outcome
from house import (FOUND, HISTORY, House, QUERY, SEARCH, Server, become_subreaper, children,
                   eventually)
from scene import paths

PROMISE = "A server that has answered for long is as it was: memory, descriptors, files, children"
ATTACK = "searches, lists, histories, files and cleans in turn, looked at in the middle and at the end"

CALLS = 100_000
SHORT_CALLS = 700
CALLS_OF_A_ROUND = 7
HISTORIES = 5  # distinct ones, fewer than are kept
# What may be found between two looks that is no leak, such as a page that came to be used. A leak of
# 100 bytes a call comes to several times that in the half of a long run.
NOISE_KIB = 512
# A short run makes too few calls for pages to come and go.
SHORT_NOISE_KIB = 96


class Client:
    """One connection, as a page keeps it."""

    def __init__(self, server):
        self.server = server
        self.connection = http.client.HTTPConnection("127.0.0.1", server.port, timeout=20)
        self.calls = 0

    def ask(self, method, path, body=None):
        self.connection.request(method, path, None if body is None else json.dumps(body),
                                {"Content-Type": "application/json", "Cookie": self.server.cookie})
        reply = self.connection.getresponse()
        self.calls += 1
        return reply.read()

    def call(self, method, params):
        reply = json.loads(self.ask("POST", "/api/" + method, params))
        if reply["code"] != 0:
            raise RuntimeError(f"{method} {params}: {reply}")
        return reply


def one_round(client, number):
    task = client.call(SEARCH + "start", QUERY)["data"]["taskid"]
    listed = eventually(lambda: finished(client, task))
    if paths(listed) != FOUND:
        raise RuntimeError(f"a search lost files: {listed}")
    client.call(HISTORY + "set", {"pattern": f"pattern {number % HISTORIES}"})
    client.call(HISTORY + "get", {})
    if client.ask("GET", "/files/share/one.txt") != b"one\n":
        raise RuntimeError("a file is another")
    client.ask("GET", "/searches/" + task)
    client.call(SEARCH + "clean", {"taskid": task})


def finished(client, task):
    reply = client.call(SEARCH + "list", {"taskid": task, "additional": "real_path,size,time"})
    return reply if reply["data"]["finished"] else None


def memory(process):
    """In KiB, of the server: all that it has in memory, and what is its own. Its share of what others
    have too says more of the others."""
    wanted = {"Rss": 0, "Private_Dirty": 0}
    with open(f"/proc/{process}/smaps_rollup") as file:
        for line in file:
            name = line.partition(":")[0]
            if name in wanted:
                wanted[name] = int(line.split()[1])
    return wanted


def look(house, server):
    eventually(lambda: not children(server.process))
    eventually(lambda: not house.task_ids() and not house.result_ids())
    stored = sum(os.lstat(f"{folder}/{name}").st_size
                 for root in (house.state, house.dir + "/volume1/@tmp")
                 for folder, _, names in os.walk(root) for name in names)
    files = sum(len(names) for root in (house.state, house.dir + "/volume1/@tmp")
                for _, _, names in os.walk(root))
    return {**memory(server.process), "descriptors": server.settled_descriptors(),
            "children": len(children(server.process)), "files": files, "stored KiB": stored >> 10}


def check(outcome, middle, end, noise):
    repeat = "scripts/attack ageing"
    for name in ("Rss", "Private_Dirty"):
        if end[name] - middle[name] > noise:
            outcome.breaks(f"{name} grew from {middle[name]} to {end[name]} KiB", repeat)
    # One connection may be opened anew meanwhile.
    for name in ("descriptors", "children", "files"):
        if end[name] > middle[name]:
            outcome.breaks(f"{name} became more: {middle[name]}, then {end[name]}", repeat)
    if end["stored KiB"] > middle["stored KiB"] + noise:
        outcome.breaks(f"the state grew: {middle} then {end}", repeat)


def options(parser):
    parser.add_argument("--calls", type=int, default=CALLS)


def run(options, bin_dir, top):
    outcome = Outcome()
    become_subreaper()
    calls = SHORT_CALLS if options.short else options.calls
    house = House(bin_dir)
    looks = []
    try:
        server = Server(house)
        client = Client(server)
        number = 0
        # A fifth of the calls comes before the first look.
        for part in (calls // 5, calls * 3 // 5, calls):
            while client.calls < part:
                one_round(client, number)
                number += 1
            looks.append(look(house, server))
            print(f"after {client.calls:,} calls: " + ", ".join(
                f"{name} {value:,}" for name, value in looks[-1].items()), flush=True)
        outcome.count("calls", client.calls)
        outcome.count("KiB of memory after a fifth", looks[0]["Rss"])
        outcome.count("in the middle", looks[1]["Rss"])
        outcome.count("at the end", looks[2]["Rss"])
        check(outcome, looks[1], looks[2], SHORT_NOISE_KIB if options.short else NOISE_KIB)
        server.stop()
    finally:
        house.remove()
    return outcome
