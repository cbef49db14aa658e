"""What all campaigns share: choosing one, printing what it found, and the table in
docs/reliability.md. A campaign is a file NAME.py beside this one with

    PROMISE, ATTACK   what is promised, and how that is attacked, in a few words
    options(parser)   adds options of its own, if any
    run(options, bin_dir, top) -> Outcome

and a line in tests/CMakeLists.txt, by which its short form is one of the tests.
Usage: attack.py BIN_DIR TOP CAMPAIGN [options]
"""

import argparse
import importlib
import os
import pathlib
import subprocess
import sys

# ctest's word for a test that could not be made here.
SKIPPED = 77


class Outcome:
    """What a campaign counted. `broken` holds (what happened, how to repeat it)."""

    def __init__(self):
        self.counts = {}
        self.broken = []
        self.skips = []

    def count(self, what, number=1):
        self.counts[what] = self.counts.get(what, 0) + number

    def add(self, other):
        for what, number in other.counts.items():
            self.count(what, number)
        self.broken += other.broken
        self.skips += other.skips

    def breaks(self, what, repeat):
        self.broken.append((what, repeat))
        print(f"BROKEN  {what}\n        {repeat}", flush=True)

    def skip(self, why):
        self.skips.append(why)
        print(f"skipped: {why}", flush=True)

    def measured(self):
        counts = [f"{number:,} {what}" for what, number in self.counts.items()]
        return ", ".join(counts + [f"{len(self.broken):,} broken promises"])


def campaigns():
    folder = pathlib.Path(__file__).parent
    return sorted(path.stem for path in folder.glob("*.py") if "\nPROMISE = " in path.read_text())


def commit(top):
    def git(*words):
        return subprocess.run(["git", "-C", top, *words], capture_output=True, text=True).stdout.strip()
    changed = git("status", "--porcelain", "--untracked-files=no", ".", ":!docs/reliability.md")
    return git("rev-parse", "--short=10", "HEAD") + (" and changes" if changed else "")


def write_row(top, name, campaign, outcome):
    """Puts the campaign's row in the place of its older one, else behind those of the others."""
    path = pathlib.Path(top, "docs/reliability.md")
    mark = f"| `scripts/attack {name}`: "
    row = (f"| {campaign.PROMISE} {mark}{campaign.ATTACK} | {outcome.measured()} | "
           f"{commit(top)} |")
    lines = path.read_text().splitlines()
    rows = [number for number, line in enumerate(lines) if "| `scripts/attack " in line]
    own = [number for number in rows if mark in lines[number]]
    if own:
        lines[own[0]] = row
    else:
        lines.insert(rows[-1] + 1, row)
    path.write_text("\n".join(lines) + "\n")


def main():
    bin_dir, top, *words = sys.argv[1:]
    parser = argparse.ArgumentParser(prog="scripts/attack")
    kinds = parser.add_subparsers(dest="name", metavar="CAMPAIGN", required=True)
    modules = {name: importlib.import_module(name) for name in campaigns()}
    for name, module in modules.items():
        kind = kinds.add_parser(name, help=module.PROMISE, description=module.__doc__,
                                formatter_class=argparse.RawDescriptionHelpFormatter)
        kind.add_argument("--short", action="store_true", help="seconds instead of minutes")
        kind.add_argument("--write", action="store_true", help="into docs/reliability.md")
        if hasattr(module, "options"):
            module.options(kind)
    options = parser.parse_args(words)
    campaign = modules[options.name]
    outcome = campaign.run(options, os.path.abspath(bin_dir), top)
    print(f"{options.name}: {outcome.measured()}")
    for why in outcome.skips:
        print(f"{options.name}: skipped: {why}")
    if options.write:
        write_row(top, options.name, campaign, outcome)
    if outcome.broken:
        return 1
    return 0 if outcome.counts else SKIPPED


if __name__ == "__main__":
    sys.exit(main())
