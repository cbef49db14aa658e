"""Runs the program and its peers in turn and prints one table.

Each row runs ours, each peer and the floor once a round, round after round, so that what else the
machine does falls on all of them; ratios are taken within a round. Commands write to a file, whose
lines are counted: peers that disagree about what there is to find are marked.
"""

import argparse
import itertools
import os
import pathlib
import re
import shutil
import statistics
import subprocess
import sys
import tempfile
import time

import index as name_index
import rows as many_rows

ROUNDS = 7
COLD_ROUNDS = 3
THREADS = str(os.cpu_count())
FLEET = "| a fleet |"  # how the table begins that scripts/bench-fleet writes
KERNEL_SOURCE = "/usr/src/linux-source-6.1.tar.xz"


def parse_arguments():
    parser = argparse.ArgumentParser(prog="scripts/bench")
    parser.add_argument("bin", type=pathlib.Path, help=argparse.SUPPRESS)
    parser.add_argument("top", type=pathlib.Path, help=argparse.SUPPRESS)
    parser.add_argument("--quick", action="store_true", help="trees of a tenth of the size")
    parser.add_argument("--write", action="store_true", help="write docs/benchmarks.md")
    parser.add_argument("--only", default="", help="rows whose name holds this text")
    parser.add_argument("--large", action="store_true",
                        help="the index of 10,000,000 files too, which take 11,000,000 inodes")
    parser.add_argument("--before", type=pathlib.Path, metavar="DIR",
                        help="an older build's bin folder, measured as one more peer")
    return parser.parse_args()


class Trees:
    """Makes each tree once; a finished one is marked by a file beside it."""

    def __init__(self, tools, quick):
        self.tools = tools
        self.root = pathlib.Path(os.environ.get("ARBORY_BENCH_DIR", "/var/tmp/arbory-bench"))
        self.scale = 10 if quick else 1
        self.root.mkdir(parents=True, exist_ok=True)

    def made(self, name, make):
        tree = self.root / f"{name}-{self.scale}"
        done = self.root / f"{name}-{self.scale}.done"
        if not done.exists():
            print(f"making {tree} ...", file=sys.stderr)
            shutil.rmtree(tree, ignore_errors=True)
            make(tree)
            done.touch()
        return str(tree)

    def generated(self, kind, count, name=None):
        return self.made(name or kind, lambda tree: subprocess.run(
            [self.tools / "make_tree", kind, tree, str(count // self.scale)], check=True))

    def growing(self, large):
        """The same kind of tree in several sizes, with a name for each."""
        yield "100,000", self.generated("names", 100_000, "names-small")
        yield "1,000,000", self.generated("names", 1_000_000)
        if large:
            yield "10,000,000", self.generated("names", 10_000_000, "names-large")

    def text(self):
        def unpack(tree):
            tree.mkdir()
            # A tenth of the sources: one of their large folders.
            part = [] if self.scale == 1 else ["--wildcards", "linux-source-6.1/fs/*"]
            subprocess.run(["tar", "-C", tree, "-xf", KERNEL_SOURCE, *part], check=True)
        return self.made("text", unpack)

    def empty(self):
        return self.made("empty", lambda tree: tree.mkdir())


def run_once(command):
    """Seconds and lines of one run."""
    with tempfile.TemporaryFile() as out:
        begun = time.perf_counter()
        subprocess.run(command, stdout=out, stderr=subprocess.DEVNULL, check=False)
        seconds = time.perf_counter() - begun
        out.seek(0)
        lines = sum(block.count(b"\n") for block in iter(lambda: out.read(1 << 20), b""))
    return seconds, lines


def drop_caches():
    subprocess.run(["sync"], check=True)
    pathlib.Path("/proc/sys/vm/drop_caches").write_text("3\n")


def milliseconds(seconds):
    return f"{seconds * 1000:.0f} ms" if seconds >= 0.02 else f"{seconds * 1000:.1f} ms"


def compare(name, commands, target, rounds=ROUNDS, before=None):
    """One row a peer: medians of both, the median ratio with its spread, the target."""
    times = {label: [] for label in commands}
    lines = {}
    for number in range(rounds + (0 if before else 1)):
        for label, command in commands.items():
            if before:
                before()
            seconds, lines[label] = run_once(command)
            if before or number > 0:  # the first round warms the cache
                times[label].append(seconds)
    rows = []
    for label in commands:
        if label == "ours":
            continue
        ratios = sorted(o / p for o, p in zip(times["ours"], times[label]))
        ratio = f"{statistics.median(ratios):.2f} ({ratios[0]:.2f} to {ratios[-1]:.2f})"
        note = "" if label == "floor" or lines[label] == lines["ours"] else \
            f" ({lines[label]:,} lines)"
        rows.append([name, f"{lines['ours']:,}", milliseconds(statistics.median(times["ours"])),
                     label + note, milliseconds(statistics.median(times[label])), ratio,
                     judged(target.get(label, ""), f"{statistics.median(ratios):.2f}",
                            milliseconds(statistics.median(times["ours"])))])
    return rows


def comparisons(args, trees):
    """Name, commands by label, targets by peer; made lazily, as trees take long to make."""
    tools = args.bin
    ours = [tools / "arbory", "search"]

    def floor(kind, tree):
        return [tools / "floor", kind, tree, THREADS]

    names = trees.generated("names", 1_000_000)
    fd = ["fdfind", "-uu"]
    yield "invoice, 7 % of all names", {
        "ours": [*ours, "invoice", names], "fd": [*fd, "invoice", names],
        "find": ["find", names, "-iname", "*invoice*"], "floor": floor("walk", names),
    }, {"fd": "≤ 0.8"}
    yield "xylophone, few hits", {
        "ours": [*ours, "xylophone", names], "fd": [*fd, "xylophone", names],
        "find": ["find", names, "-iname", "*xylophone*"], "floor": floor("walk", names),
    }, {"fd": "≤ 0.6", "floor": "≤ 1.3"}
    yield "photo, size and mtime", {
        "ours": [*ours, "photo", names, "--type", "file", "--size-to", "1k", "--mtime-from", "300d"],
        "fd": [*fd, "-t", "f", "-S", "-1k", "--changed-within", "300d", "photo", names],
        "find": ["find", names, "-type", "f", "-iname", "*photo*", "-size", "-2", "-mtime", "-300"],
    }, {"fd": "≤ 0.8"}
    yield "everything", {
        "ours": [*ours, "", names], "fd": [*fd, ".", names],
        "find": ["find", names, "-mindepth", "1"], "floor": floor("walk", names),
    }, {}
    yield from many_rows.comparisons("", ours, names, fd)
    huge = trees.generated("huge", 200_000)
    yield "invoice in one huge folder", {
        "ours": [*ours, "invoice", huge], "fd": [*fd, "invoice", huge],
        "find": ["find", huge, "-iname", "*invoice*"], "floor": floor("walk", huge),
    }, {}
    chain = trees.generated("chain", 1_000)
    yield "link, 1,000 folders deep", {
        "ours": [*ours, "link", chain], "fd": [*fd, "link", chain],
        "find": ["find", chain, "-iname", "*link*"],
    }, {}
    text = trees.text()
    yield "contents, a literal", {
        "ours": [*ours, "--content", "spin_lock_irqsave", text],
        "ripgrep": ["rg", "-uu", "-il", "spin_lock_irqsave", text],
        "grep": ["grep", "-rilIF", "spin_lock_irqsave", text], "floor": floor("read", text),
    }, {"ripgrep": "≤ 0.95"}
    expression = "[a-z]{3}[0-9]{4}[x-z]{2}[0-9]{2}"
    yield "contents, an expression without a literal", {
        "ours": [*ours, "--content", "regex:" + expression, text],
        "ripgrep": ["rg", "-uu", "-il", expression, text], "floor": floor("read", text),
    }, {"ripgrep": "≤ 1.5"}
    for kind, name, target in [("photos", "photos", {"ripgrep": "≤ 1.1"}),
                               ("sparse", "sparse files", {})]:
        binaries = trees.generated(kind, 3_000)
        yield f"contents, {name}", {
            "ours": [*ours, "--content", "spin_lock_irqsave", binaries],
            "ripgrep": ["rg", "-uu", "-il", "spin_lock_irqsave", binaries],
            "floor": floor("read", binaries),
        }, target
    empty = trees.empty()
    yield "an empty folder", {
        "ours": [*ours, "x", empty], "fd": [*fd, "x", empty],
    }, {"fd": "ours ≤ 25 ms"}


def cold_comparisons(args, trees):
    names = trees.generated("names", 1_000_000)
    yield "cold cache: xylophone", {
        "ours": [args.bin / "arbory", "search", "xylophone", names],
        "fd": ["fdfind", "-uu", "xylophone", names],
        "find": ["find", names, "-iname", "*xylophone*"],
    }, {}


SERVICE_TARGETS = {
    "first page with rows, from start": "≤ 50",
    "page while running, slowest": "≤ 50",
    "peak memory of the worker": "≤ 64",
    "from stop to worker gone": "≤ 100",
}


def service_rows(args, trees):
    """What a client of the module sees; measured by bench/service.cpp."""
    service = [args.bin / "service", args.bin / "NUVA.Arbory.Search.so", trees.root / "state"]
    names = trees.generated("names", 1_000_000)
    huge = trees.generated("huge", 200_000)
    runs = [("", [names]), ("stop in the tree: ", [names, "stop"]),
            ("stop in one huge folder: ", [huge, "stop"])]
    for prefix, arguments in runs:
        out = subprocess.run([*service, *arguments], check=True, capture_output=True, text=True)
        for line in out.stdout.splitlines():
            name, value, unit = line.split("\t")
            target = SERVICE_TARGETS.get(name, "")
            if name.startswith("page by") or name.startswith("first page by"):
                target = "≤ 50"
            yield [prefix + name, f"{value} {unit}".strip(), target]


def judged(must, ratio, measured):
    """What had to be, with a word where it is not so: bare numbers are of the ratio, those with a
    unit of what was measured in that unit."""
    if not must.split():
        return must
    for number, unit in re.findall(r"([\d.]+) ?(ms|s|MB|µs)?\b", must):
        got = ratio if not unit else next(
            (value for value, its in re.findall(r"([\d.]+) (ms|s|MB|µs)\b", measured)
             if its == unit), "")
        if got and float(got) > float(number):
            return must + ": not reached"
    return must


def table(head, rows):
    lines = ["| " + " | ".join(head) + " |", "|" + "---|" * len(head)]
    lines += ["| " + " | ".join(row) + " |" for row in rows]
    return "\n".join(lines) + "\n"


def main():
    args = parse_arguments()
    trees = Trees(args.bin, args.quick)
    head = ["work", "found", "ours", "peer", "peer's time", "ours / peer (spread)", "must"]
    rows = []
    for name, commands, target in comparisons(args, trees):
        if args.only in name:
            if args.before:
                older = [args.before / "arbory", *commands["ours"][1:]]
                commands = {"ours": commands["ours"], "before": older, **commands}
            rows += compare(name, commands, target)
            print(*(" | ".join(row) for row in rows[-len(commands) + 1:]), sep="\n",
                  file=sys.stderr)
    if os.access("/proc/sys/vm/drop_caches", os.W_OK):
        for name, commands, target in cold_comparisons(args, trees):
            if args.only in name:
                rows += compare(name, commands, target, COLD_ROUNDS, drop_caches)
    measured = []
    if os.geteuid() == 0 and (args.only in "index" or args.only.startswith("index")):
        names = trees.generated("names", 1_000_000)
        index = name_index.Index(args.bin, names)
        fd = ["fdfind", "-uu"]
        for name, commands, target in itertools.chain(
                name_index.comparisons(index, fd),
                many_rows.comparisons("index: ", index.search_words(), names, fd)):
            if args.only in name:
                rows += compare(name, commands, target)
                print(*(" | ".join(row) for row in rows[-len(commands) + 1:]), sep="\n",
                      file=sys.stderr)
        can_drop = os.access("/proc/sys/vm/drop_caches", os.W_OK)
        if can_drop:
            cold = name_index.cold_comparison(index, ["fdfind", "-uu"])
            rows += compare(*cold, {}, COLD_ROUNDS, drop_caches)
        measured = [[name, value, judged(must, "", value)] for name, value, must
                    in name_index.measures(index, args.bin, trees.growing(args.large),
                                           drop_caches if can_drop else None)]
    tables = [(head, rows), (["the name index", "measured", "must"], measured)]
    if args.only in "service":
        tables.append((["as a client of the module", "measured", "must"],
                       list(service_rows(args, trees))))
    text = "\n".join(table(*one) for one in tables if one[1])
    print(text)
    if args.write:
        write(args, tables)


def write(args, tables):
    """The document with these rows; a run of some of them leaves the others as they stand, as one
    without --large does."""
    document = args.top / "docs" / "benchmarks.md"
    text = document.read_text()
    if args.only or not args.large:
        tables = merged(text, tables)
    machine = subprocess.run(["lscpu"], capture_output=True, text=True, check=True).stdout
    model = next((line.split(":", 1)[1].strip() for line in machine.splitlines()
                  if line.startswith("Model name")), "unknown processor")
    intro = (args.top / "bench" / "benchmarks.md.in").read_text()
    intro = intro.replace("@MACHINE@", f"{os.cpu_count()} cores of {model}")
    intro = intro.replace("@SCALE@", "a tenth of the full size" if args.quick else "full size")
    # What another script has measured.
    fleets = [block.strip("\n") + "\n" for block in text.split("\n\n")
              if block.startswith(FLEET)]
    document.write_text(
        intro + "\n" + "\n".join([table(*one) for one in tables if one[1]] + fleets))


def merged(document, tables):
    """The tables of the document, with the rows of those works that were measured replaced."""
    old = {}
    for block in document.split("\n\n"):
        if block.startswith(FLEET):
            continue
        cells = [line.strip("| ").split(" | ") for line in block.splitlines()
                 if line.startswith("| ")]
        if cells:
            old[cells[0][0]] = cells[1:]
    for head, rows in tables:
        names = {row[0] for row in rows}
        kept = [row for row in old.pop(head[0], []) if row[0] not in names]
        yield head, padded(kept, len(head)) + rows
    for name, rows in old.items():
        head = [name, "measured", "must"]
        yield head, padded(rows, len(head))


def padded(rows, width):
    return [row + [""] * (width - len(row)) for row in rows]


if __name__ == "__main__":
    main()
