"""Changes a tree at random, as root and by other processes, and asks after each few changes the same
question twice, of the index and of a walk, for root and for two users of whom each owns half of it.
The rows must be the same, with their sizes and times, and hold no name that the user cannot reach.

It does so on each kind of file system that can be had, while the index's processes are killed, its
files damaged, and folders exchanged for others during the question; while more changes than it keeps
in mind, or while it is away. And once as a user who has an index for oneself, without root.
"""

import contextlib
import ctypes
import json
import mmap
import os
import pwd
import random
import shutil
import signal
import subprocess
import tempfile
import threading
import time
from collections import Counter

from attack import Outcome
from house import House, become_subreaper, children, eventually, reap_others

PROMISE = "An answer of the index is that of a walk, for every user, and tells of no file out of reach"
ATTACK = ("random changes, kills, damage, storms and gaps on each kind of file system, and without root, "
          "the same questions to both")

ROWS, SHORT_ROWS = 100_000, 2_000  # to compare, on all file systems together
USERS = ("daemon", "bin")
FOLDERS, FILES_OF_A_FOLDER = 40, 6
MOST_CHANGES = 12  # before a question
PATIENCE = 20.0  # seconds for the index to be current
MOST_BUSY = 0.1  # of the questions, on a machine that does too much else
KILL_EVERY, DAMAGE_EVERY, SWAP_EVERY, STORM_EVERY, GAP_EVERY = 25, 90, 30, 45, 35  # questions
MOST_IN_MIND = 250  # changes; a storm has more
STORM_FOLDERS = 150
STUB = 2  # an inode's number
WORDS = ["report", "holiday", "a", "Übung", "cafe\u0301", "naïve", "x y", "IMG_12", "straße", "日本"]
ENDINGS = ["txt", "jpg", "JPG", "tar.gz", "md", ""]
ODD = [b"line\nbreak", b"bad\xff\xfename", b"tab\there", b"-rf", b"a" * 255, b"*", b"\\x"]
QUESTIONS = [["report"], ["*.jpg"], ["jpg", "-t", "file"], ["regex:^[a-h].*t$"], [""], ["ubung|cafe"],
             ["!report"], ["f1/"], ["**/*.md"], ["size:>2k"], ["modified:today"], ["modified:2020"],
             ["size:0..100", "-t", "file"], ["owner:daemon"], ["", "-t", "dir"], ["empty:"],
             ["holiday", "--no-recursive"], ["case:IMG"], ["ext:txt,md size:<1k"], ["x y"],
             ["exclude:*.md,f1* hidden:no"], ["ignored:no"], ["ignored:no depth:<=3 report"],
             ["", "-E", "report*", "-d", "4"], ["type:l,x"], ["letters:smart IMG|holiday"],
             ["mounts:no"], ["zzz-nothing"], ["depth:<3"], ["created:today"], ["!<report|jpg>"], ["type:image"]]
MAKERS = {
    "ext4": (96, ["mkfs.ext4", "-q"], ["-o", "loop"]),
    "xfs": (320, ["mkfs.xfs", "-q"], ["-o", "loop"]),
    "btrfs": (256, ["mkfs.btrfs", "-q"], ["-o", "loop"]),
    "btrfs subvolume": (256, ["mkfs.btrfs", "-q"], ["-o", "loop,subvol=sub"]),
    "tmpfs": (0, None, ["-t", "tmpfs"]),
    "ext4 without root": (96, ["mkfs.ext4", "-q"], ["-o", "loop"]),
}


def ran(*words):
    return subprocess.run(words, capture_output=True).returncode == 0


class Place:
    """A file system of its own for a house's volume."""

    def __init__(self, kind):
        self.kind = kind
        self.mounted = []
        fast = "/dev/shm" if os.access("/dev/shm", os.W_OK) else None
        self.dir = tempfile.mkdtemp(prefix="arbory-place-", dir=fast)

    def __call__(self, folder):
        size, maker, options = MAKERS[self.kind]
        volume = folder + "/volume1"
        os.mkdir(volume)
        source = "none"
        if maker:
            if not shutil.which(maker[0]):
                raise OSError(f"there is no {maker[0]}")
            source = self.dir + "/image"
            with open(source, "wb") as file:
                file.truncate(size << 20)
            subprocess.run([*maker, source], check=True, capture_output=True)
            if "subvol" in options[-1]:
                self.mount(["-o", "loop"], source, volume)
                subprocess.run(["btrfs", "subvolume", "create", volume + "/sub"], check=True,
                               capture_output=True)
                self.umount(volume)
        self.mount(options, source, volume)

    def mount(self, options, source, folder):
        done = subprocess.run(["mount", *options, source, folder], capture_output=True, text=True)
        if done.returncode != 0:
            raise OSError(done.stderr.strip())
        self.mounted.append(folder)

    def umount(self, folder):
        subprocess.run(["umount", "-l", folder], capture_output=True)
        self.mounted.remove(folder)

    def remove(self):
        for folder in reversed(self.mounted[:]):
            self.umount(folder)
        shutil.rmtree(self.dir, ignore_errors=True)


class Tree:
    """What changes: a share, and a folder beside it that is none."""

    def __init__(self, place, top, chance):
        self.place = place
        self.top = top
        self.share = os.fsencode(top + "/share")
        self.outside = os.fsencode(top + "/#outside")
        self.chance = chance
        self.number = 0
        self.open = []
        self.snapshots = 0
        os.makedirs(self.share, exist_ok=True)
        os.mkdir(self.outside)
        folders = [self.share]
        for _ in range(FOLDERS):
            folders.append(self.make_folder(chance.choice(folders)))
        for folder in folders:
            for _ in range(FILES_OF_A_FOLDER):
                self.make_file(folder)

    def name(self):
        self.number += 1
        if self.chance.random() < 0.05:
            return self.chance.choice(ODD)
        word, ending = self.chance.choice(WORDS), self.chance.choice(ENDINGS)
        return os.fsencode(f"{word}{self.number}" + ("." + ending if ending else ""))

    def give(self, path, mode):
        user = pwd.getpwnam(self.chance.choice(USERS))
        os.chown(path, user.pw_uid, user.pw_gid, follow_symlinks=False)
        os.chmod(path, mode)

    def make_folder(self, parent):
        self.number += 1
        path = parent + os.fsencode(f"/f{self.number}")
        os.mkdir(path)
        self.give(path, self.chance.choice([0o755, 0o755, 0o700, 0o711, 0o744]))
        return path

    def make_file(self, folder):
        path = folder + b"/" + self.name()
        with open(path, "wb") as file:
            file.write(b"x" * self.chance.choice([0, 1, 90, 3000, 20_000]))
        self.give(path, self.chance.choice([0o644, 0o600]))
        return path

    def folders(self):
        return [folder for folder, _, _ in os.walk(self.share)]

    def pick(self, kind):
        """A folder, or a file, somewhere in the share."""
        folders = self.folders()
        for _ in range(20):
            folder = self.chance.choice(folders)
            if kind == "folder":
                if folder != self.share and not os.path.ismount(folder):
                    return folder
            else:
                files = [entry.path for entry in os.scandir(folder)
                         if entry.is_file(follow_symlinks=False)]
                if files:
                    return self.chance.choice(files)
        return self.make_folder(self.share) if kind == "folder" else self.make_file(self.share)

    def any_folder(self):
        return self.chance.choice(self.folders())

    # The changes. One that the file system refuses is none.

    def change(self):
        act = self.chance.choice(self.CHANGES)
        try:
            act(self)
        except OSError:
            return
        return act.__name__

    def create(self):
        self.make_file(self.any_folder())

    def create_folder(self):
        below = self.make_folder(self.any_folder())
        self.make_file(below)

    def ignore(self):
        folder = self.any_folder()
        name = self.chance.choice([".gitignore", ".ignore", ".fdignore"])
        with open(folder + b"/" + os.fsencode(name), "w") as file:
            file.write(self.chance.choice(["*.txt\n!report*\n", "f*1/\n", "/moved*\n*.jpg\n"]))
        if name == ".gitignore":
            os.mkdir(folder + b"/.git")

    def write(self):
        with open(self.pick("file"), "ab") as file:
            file.write(b"more" * self.chance.choice([1, 800]))

    def truncate(self):
        os.truncate(self.pick("file"), self.chance.choice([0, 10, 5000]))

    def rename(self):
        os.rename(self.pick("file"), self.any_folder() + b"/" + self.name())

    def replace(self):
        os.rename(self.pick("file"), self.pick("file"))

    def exchange(self):
        exchange(self.pick("folder"), self.pick("folder"))

    def move_tree(self):
        os.rename(self.pick("folder"), self.any_folder() + b"/moved" + self.name()[:200])

    def move_out(self):
        os.rename(self.pick("folder"), self.outside + b"/" + self.name())

    def move_in(self):
        if names := os.listdir(self.outside):
            os.rename(self.outside + b"/" + self.chance.choice(names),
                      self.any_folder() + b"/" + self.name())

    def touch_outside(self):
        for folder, _, _ in os.walk(self.outside):
            if self.chance.random() < 0.3:
                self.make_file(folder)

    def link(self):
        os.link(self.pick("file"), self.any_folder() + b"/" + self.name())

    def symlink(self):
        os.symlink(self.pick("file"), self.any_folder() + b"/" + self.name())

    def remove(self):
        os.unlink(self.pick("file"))

    def remove_tree(self):
        if self.chance.random() < 0.3:
            shutil.rmtree(self.pick("folder"))

    def chmod(self):
        os.chmod(self.pick(self.chance.choice(["file", "folder"])),
                 self.chance.choice([0o700, 0o755, 0o711, 0o644]))

    def chown(self):
        self.give(self.pick(self.chance.choice(["file", "folder"])), 0o750)

    def acl(self):
        ran("setfacl", "-m", f"u:{self.chance.choice(USERS)}:{self.chance.choice(['---', 'rx'])}",
            self.pick("folder"))

    def utime(self):
        at = self.chance.choice([1_590_000_000, 0, time.time(), -5, 5_000_000_000])
        os.utime(self.pick("file"), (at, at))

    def hold_open(self):
        """Grows without being closed."""
        file = open(self.pick("file"), "ab", buffering=0)
        file.write(b"held" * 700)
        self.open.append(file)
        if len(self.open) > 8:
            self.open.pop(0).close()

    def map(self):
        """Written by memory alone, also much later."""
        path = self.pick("file")
        os.truncate(path, 5000)
        os.utime(path, (1_590_000_000, 1_590_000_000))
        with open(path, "r+b") as file:
            memory = mmap.mmap(file.fileno(), 5000)
        self.open.append(memory)
        for other in self.open:
            if isinstance(other, mmap.mmap) and other.size() >= len(other):
                other[8:12] = os.urandom(4)

    def mount(self):
        if len(self.place.mounted) < 4:
            folder = os.fsdecode(self.pick("folder"))
            self.place.mount(["-t", "tmpfs"], "none", folder)
            os.chmod(folder, 0o755)
            self.make_file(os.fsencode(folder))

    def unmount(self):
        if len(self.place.mounted) > 1:
            self.place.umount(self.place.mounted[-1])

    def snapshot(self):
        if self.place.kind.startswith("btrfs") and self.snapshots < 3:
            self.snapshots += 1
            ran("btrfs", "subvolume", "snapshot", self.top, self.any_folder() + b"/snap")

    def storm(self):
        """Many folders, each with a change of its own, and then without."""
        top = self.make_folder(self.share)
        below = [self.make_folder(top) for _ in range(STORM_FOLDERS)]
        for folder in below:
            for _ in range(3):
                self.make_file(folder)
        for folder in self.folders():
            # Nobody writes into a snapshot's stub, or where the name is that of a folder or of a link
            # to nowhere.
            with contextlib.suppress(OSError):
                self.make_file(folder)
        if self.chance.random() < 0.8:
            shutil.rmtree(top)

    CHANGES = [create, create, create, create_folder, ignore, write, write, truncate, rename,
               rename, replace, exchange, move_tree, move_tree, move_out, move_in, touch_outside, link,
               symlink, remove, remove_tree, chmod, chown, acl, utime, hold_open, map, mount, unmount, snapshot]

    def close(self):
        for file in self.open:
            file.close()


def exchange(one, other):
    if ctypes.CDLL(None).renameat2(-100, one, -100, other, 2) != 0:
        raise OSError("not exchanged")


def is_stub(row):
    """What a snapshot of btrfs has in the place of another subvolume: an empty folder, whose times are
    those of the moment in which the system had to look at it anew."""
    try:
        return row["is_dir"] and row["name"] == "snap" and os.lstat(row["real_path"]).st_ino == STUB
    except OSError:
        return False


class Equality:
    def __init__(self, kind, bin_dir, outcome, options):
        self.kind, self.outcome, self.options = kind, outcome, options
        self.chance = random.Random(f"{options.seed} {kind}")
        self.place = Place(kind)
        self.house = None
        self.daemon = None
        self.asked = 0
        try:
            lines = f"[index]\nmax_changes = {MOST_IN_MIND}\n"
            self.house = House(bin_dir, lines, place=self.place)
            os.chmod(self.house.dir + "/volume1", 0o755)
            self.users, self.before = ["root", *USERS], []
            if kind.endswith("without root"):
                self.users = [USERS[0]]
                self.before = ["/usr/bin/setpriv", "--reuid", USERS[0], "--regid", USERS[0],
                               "--clear-groups"]
                os.mkdir(self.house.state, 0o700)
                shutil.chown(self.house.state, USERS[0], USERS[0])
            self.tree = Tree(self.place, self.house.dir + "/volume1", self.chance)
        except BaseException:
            self.remove()
            raise

    def start(self):
        words = [self.house.program, "index", "--config", self.house.config]
        self.daemon = self.house.spawn(self.before + words, name="index")
        self.house.known.add(self.daemon)

    def stop(self, how=signal.SIGTERM):
        os.kill(self.daemon, how)
        os.waitpid(self.daemon, 0)
        self.house.known.discard(self.daemon)

    def processes(self):
        """The daemon's, all of them."""
        def below(process):
            for child in children(process):
                yield child
                yield from below(child)
        return [self.daemon, *below(self.daemon)]

    def is_current(self):
        words = [*self.before, self.house.program, "index", "--status", "--config", self.house.config]
        return subprocess.run(words, capture_output=True).returncode == 0

    def checked(self):
        """In what the index finds that it differs from the files."""
        words = [*self.before, self.house.program, "index", "--check", "--config", self.house.config]
        told = subprocess.run(words, capture_output=True, text=True, errors="replace")
        return (told.stdout + told.stderr)[:2000]

    def how_it_is(self):
        """For whoever looks into it: what the daemon tells, and what its processes do."""
        words = [*self.before, self.house.program, "index", "--status", "--config", self.house.config]
        told = subprocess.run(words, capture_output=True, text=True)
        lines = [told.stdout + told.stderr]
        for process in self.processes():
            try:
                with open(f"/proc/{process}/stat") as stat, open(f"/proc/{process}/wchan") as waits:
                    lines.append(f"{' '.join(stat.read().split()[:4])} waits in {waits.read()}")
            except OSError:
                lines.append(f"{process} is gone")
        return "\n".join(lines)

    def kill_one(self):
        victim = self.chance.choice(self.processes())
        try:
            if victim == self.daemon:
                self.stop(signal.SIGKILL)
                self.start()
            else:
                os.kill(victim, signal.SIGKILL)
        except ProcessLookupError:
            return
        self.outcome.count("processes killed")

    def leave_a_gap(self):
        self.stop()
        for _ in range(MOST_CHANGES):
            self.tree.change()
        self.start()
        self.outcome.count("gaps")

    def storm(self):
        self.tree.storm()
        self.outcome.count("storms of changes")

    def damage(self):
        self.stop(self.chance.choice([signal.SIGTERM, signal.SIGKILL]))
        files = [os.path.join(folder, name) for folder, _, names in os.walk(self.house.state + "/index")
                 for name in names]
        for path in files:
            if not os.path.isfile(path) or not (size := os.path.getsize(path)):
                continue
            with open(path, "r+b") as file:
                if self.chance.random() < 0.5:
                    file.truncate(self.chance.randrange(size))
                else:
                    file.seek(self.chance.randrange(size))
                    file.write(self.chance.randbytes(3))
            self.outcome.count("files of the index damaged")
        for _ in range(self.chance.randrange(MOST_CHANGES)):
            self.tree.change()
        self.start()

    def search(self, user, source, question, folder):
        """Status and rows, as the terminal has them."""
        words = [*self.before, self.house.program, "search", "--config", self.house.config,
                 *([] if self.before else ["--user", user]), "--index", source, "--json", *question[1:], "--", question[0], folder]
        done = subprocess.run(words, capture_output=True)
        # A search is cleaned up after its program has ended.
        reap_others({self.daemon})
        rows = []
        for line in done.stdout.splitlines():
            row = json.loads(line)
            row.get("time", {}).pop("atime", None)
            row.pop("atime", None)
            if is_stub(row):
                row.pop("time", None)
            rows.append(json.dumps(row, sort_keys=True))
        return done.returncode, sorted(rows), done.stderr.decode(errors="replace")

    def from_index(self, user, question, folder):
        """None where the index is not current for so long."""
        # What lies below a folder that one may pass through but not read, only a path leads to.
        always = "auto" if self.before and folder != os.fsdecode(self.tree.share) else "always"
        end = time.monotonic() + PATIENCE
        status, rows, said = self.search(user, always, question, folder)
        while status == 2 and time.monotonic() < end:
            self.outcome.count("questions put again")
            time.sleep(0.02)
            status, rows, said = self.search(user, always, question, folder)
        if status != 2:
            self.said = f"{status} {said}"
            return rows
        if said.rstrip().endswith("busy") and self.is_current():
            self.outcome.count("questions with no answer in time")
        else:
            self.outcome.breaks(f"{self.kind}, question {self.asked}, {user} {question}: not current "
                                f"after {PATIENCE} s: {said}{self.how_it_is()}", self.repeat())
        return None

    def ask(self):
        question = list(self.chance.choice(QUESTIONS))
        user = self.chance.choice(self.users)
        top = os.fsdecode(self.tree.share)
        folder = top if self.chance.random() < 0.7 else os.fsdecode(self.tree.any_folder())
        if os.stat(folder).st_dev != os.stat(top).st_dev:
            folder = top  # another file system, which is walked
        self.outcome.count("questions")
        status, walked, _ = self.search(user, "never", question, folder)
        if status == 2:
            self.outcome.count("questions that a walk refuses")
            return
        got = self.from_index(user, question, folder)
        if got is None:
            return
        self.outcome.count("rows compared", len(walked))
        if got != walked:
            more, less = [list((Counter(one) - Counter(other)).elements())
                          for one, other in ((got, walked), (walked, got))]
            self.outcome.breaks(
                f"{self.kind}, question {self.asked}, {user} {question} {folder}: {len(more)} rows "
                f"too many, {len(less)} missing, such as {more[:2]} {less[:9]}; it ended with {self.said}; "
                f"mounted are {self.place.mounted}; {self.checked()}", self.repeat())

    def ask_during_swaps(self):
        """Folders of one user and of another take each other's place while a third asks: no row may
        be of a folder that is closed to that one."""
        top = self.tree.share
        open_, closed = top + b"/swapped", self.tree.outside + b"/closed"
        for path, mode, name in ((open_, 0o755, b"shown"), (closed, 0o700, b"hidden")):
            os.makedirs(path, exist_ok=True)
            for number in range(20):
                open(path + b"/" + name + b"-swap%d" % number, "w").close()
            os.chmod(path, mode)
        over = threading.Event()

        def swap():
            while not over.is_set():
                exchange(open_, closed)
                time.sleep(self.chance.random() / 500)
        thread = threading.Thread(target=swap)
        thread.start()
        try:
            for _ in range(5):
                status, rows, _ = self.search("bin", "auto", ["-swap"], os.fsdecode(top))
                self.outcome.count("questions during exchanges")
                if any("hidden" in row for row in rows):
                    self.outcome.breaks(f"{self.kind}: a name of a closed folder leaks: {rows}",
                                        self.repeat())
        finally:
            over.set()
            thread.join()
        for path in (open_, closed):
            shutil.rmtree(path, ignore_errors=True)

    def run(self, rows):
        self.start()
        end = self.outcome.counts.get("rows compared", 0) + rows
        while self.outcome.counts.get("rows compared", 0) < end and not self.outcome.broken:
            self.asked += 1
            if self.asked % KILL_EVERY == 0:
                self.kill_one()
            if self.asked % DAMAGE_EVERY == 0:
                self.damage()
            if self.asked % SWAP_EVERY == 0 and not self.before:
                self.ask_during_swaps()
            if self.asked % STORM_EVERY == 0:
                self.storm()
            if self.asked % GAP_EVERY == 0:
                self.leave_a_gap()
            for _ in range(self.chance.randrange(MOST_CHANGES)):
                if what := self.tree.change():
                    self.outcome.count("changes")
            self.ask()
        self.stop()
        late = self.outcome.counts.get("questions with no answer in time", 0)
        if late > MOST_BUSY * self.outcome.counts["questions"]:
            self.outcome.breaks(f"{self.kind}: {late} questions have no answer in time", self.repeat())

    def repeat(self):
        return (f"scripts/attack equality --seed {self.options.seed} --only '{self.kind}' "
                f"--rows {self.options.rows or ROWS}")

    def remove(self):
        if self.house:
            self.house.remove()
        self.place.remove()
        if self.house:
            shutil.rmtree(self.house.dir, ignore_errors=True)  # where the volume was mounted


def options(parser):
    parser.add_argument("--rows", type=int, help=f"to compare, {ROWS:,} by default")
    parser.add_argument("--seed", type=int, default=1)
    parser.add_argument("--only", metavar="KIND", choices=MAKERS, help="this file system alone")


def run(options, bin_dir, top):
    outcome = Outcome()
    if os.geteuid() != 0:
        outcome.skip("only root can mount and act for other users")
        return outcome
    become_subreaper()
    kinds = [options.only] if options.only else ["ext4"] if options.short else list(MAKERS)
    options.rows = options.rows or (SHORT_ROWS if options.short else ROWS // len(kinds))
    for kind in kinds:
        try:
            equality = Equality(kind, bin_dir, outcome, options)
        except (OSError, subprocess.CalledProcessError) as error:
            outcome.skip(f"{kind}: {error}")
            continue
        try:
            equality.run(options.rows)
        finally:
            equality.tree.close()
            equality.remove()
    return outcome
