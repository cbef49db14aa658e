#!/usr/bin/env python3
"""The manual pages and completions against what the program's own help says, each read by the
programs that people read them with: manual_test.py BIN-FOLDER SOURCE-FOLDER. A shell that is not
installed is told of and left out."""

import glob
import os
import re
import shutil
import subprocess
import sys
import tempfile
import unittest

BIN, SOURCE = (os.path.abspath(path) for path in sys.argv[1:3])
PROGRAM = os.path.join(BIN, "arbory")
SAMPLE = os.path.join(SOURCE, "packaging/arbory.toml")
HERE = os.path.dirname(os.path.abspath(__file__))
SHELLS_WAIT = 60  # seconds until a shell counts as stuck


def run(*words, **more):
    more = {"env": {**os.environ, "LC_ALL": "C.UTF-8", "MANWIDTH": "80"}, **more}
    done = subprocess.run(words, capture_output=True, text=True, timeout=SHELLS_WAIT, **more)
    return done


def commands():
    text = run(PROGRAM, "--help").stdout
    return re.findall(r"^  (\w+) ", text[text.index("Subcommands:"):], re.M)


def options(*command):
    """All names of the options that the help of a command tells of."""
    names = set()
    for line in run(PROGRAM, *command, "--help").stdout.splitlines():
        found = re.match(r"  (-[^ ]+)", line)
        if found:
            names.update(found.group(1).split(","))
    return names


class Written(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.folder = tempfile.mkdtemp()
        cls.addClassCleanup(shutil.rmtree, cls.folder)
        done = run(PROGRAM, "generate", cls.folder, "2026-01-31", SAMPLE)
        assert done.returncode == 0, done.stderr

    def path(self, *names):
        return os.path.join(self.folder, *names)


class Manual(Written):
    def pages(self):
        return sorted(glob.glob(self.path("man/man*/*")))

    def test_readers_find_nothing_wrong(self):
        self.assertEqual(len(self.pages()), len(commands()) + 2)
        for page in self.pages():
            shown = run("man", "-l", "--warnings=w", page)
            self.assertEqual((shown.returncode, shown.stderr), (0, ""), page)
            checked = run("mandoc", "-Tlint", "-Wwarning", page)
            self.assertEqual((checked.returncode, checked.stdout), (0, ""), page)

    def test_every_option_is_told_of(self):
        for command in commands():
            page = glob.glob(self.path(f"man/man*/arbory-{command}.[18]"))
            told = set(re.findall(r"(?<![\w-])--?[\w-]+", run("man", "-l", *page).stdout))
            self.assertEqual(options(command) - told, set(), command)

    def test_help_fits_a_terminal(self):
        for command in [[]] + [[name] for name in commands()]:
            for line in run(PROGRAM, *command, "--help").stdout.splitlines():
                self.assertLessEqual(len(line), 80, f"{command}: {line}")

    def test_every_key_of_the_configuration_is_told_of(self):
        with open(os.path.join(SOURCE, "nas/system/config_file.cpp")) as reader:
            # What a front reads of its fleet is another file, and told of in docs/fleet.md.
            text = re.sub(r"  void ReadFleet\(.*?\n  }\n", "", reader.read(), flags=re.S)
        known = set(re.findall(r'\{"(\w+)",\s', text)) - {"fronts"}
        self.assertGreater(len(known), 20)
        page = run("man", "-l", self.path("man/man5/arbory.toml.5")).stdout
        tables = re.findall(r"^\[([\w.]+)\]$", page, re.M)
        told = set(re.findall(r"^ +(\w+) = ", page, re.M)) | set(tables)
        self.assertEqual(known - told, set())
        self.assertEqual(len(tables), len(set(tables)), tables)


class Completion(Written):
    # A line, and what is offered for its last word.
    LINES = [
        ("arbory se", {"search", "serve"}),
        ("arbory search --sort s", {"size"}),
        ("arbory search --sort=s", {"size"}),
        ("arbory search x --index n", {"never"}),
        ("arbory search -l --owner roo", {"root"}),
        ("arbory search x here/fo", {"folder"}),  # and not the file beside it
        ("arbory why here/fo", {"folder", "fold"}),
        ("arbory serve --config here/fo", {"folder", "fold"}),
        ("arbory search --limit ", set()),
        ("arbory fleet st", {"status"}),
        ("arbory fleet config here/fo", {"folder", "fold"}),
    ]

    def setUp(self):
        self.place = tempfile.mkdtemp()
        self.addCleanup(shutil.rmtree, self.place)
        os.makedirs(os.path.join(self.place, "here/folder"))
        open(os.path.join(self.place, "here/fold"), "w").close()

    def check(self, complete):
        for line, expected in self.LINES:
            offered = {os.path.basename(word.rstrip("/")) for word in complete(line)} - {"here"}
            self.assertEqual({word.split("=")[-1] for word in offered}, expected, line)
        for command in commands():
            self.assertLessEqual(options(command), set(complete(f"arbory {command} -")), command)

    def test_bash(self):
        script = self.path("bash-completion/completions/arbory")
        driver = """source "$1"; compopt() { :; }
            # As readline cuts a line.
            read -ra COMP_WORDS <<< "${2//=/ = }"; [[ $2 == *' ' ]] && COMP_WORDS+=('')
            COMP_CWORD=$((${#COMP_WORDS[@]} - 1)); _arbory; printf '%s\\n' "${COMPREPLY[@]}" """
        self.check(lambda line: run("bash", "-euc", driver, "bash", script, line,
                                    cwd=self.place).stdout.split())

    @unittest.skipUnless(shutil.which("fish"), "no fish here")
    def test_fish(self):
        script = self.path("fish/vendor_completions.d/arbory.fish")
        driver = "source $argv[1]; complete -C $argv[2]"

        def complete(line):
            done = run("fish", "--no-config", "-c", driver, script, line, cwd=self.place)
            self.assertEqual(done.stderr, "")
            return [answer.split("\t")[0] for answer in done.stdout.splitlines()]

        self.check(complete)

    @unittest.skipUnless(shutil.which("zsh"), "no zsh here")
    def test_zsh(self):
        folder = self.path("zsh/vendor-completions")
        driver = os.path.join(HERE, "zsh_complete.zsh")
        self.check(lambda line: re.findall(
            "<([^<>]+)>", run("zsh", "-f", driver, folder, line, cwd=self.place).stdout))


if __name__ == "__main__":
    unittest.main(argv=sys.argv[:1])
