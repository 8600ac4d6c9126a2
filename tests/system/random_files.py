"""What may happen to files."""
import contextlib
import ctypes
import functools
import os
import random
import subprocess

NAMES = [b"a", b"b.txt", b"c.md", b"d \xc3\xa9.txt", b"e\xff\xc3(.txt", b"long" * 50 + b".c", b"dir", b"f.jpg", b"g"]
LIBC = ctypes.CDLL(None)


class Files:
    # Random operations on real files below a directory; those that the file system refuses are none. Where events are
    # lost, what has another's size, place and times by the second cannot be told from it: `alike` says whether there is such.

    def __init__(self, root, outside, seed, alike=True):
        self.root, self.outside = map(os.fsencode, (root, outside))
        self.rng, self.alike, self.linked, self.words = random.Random(seed), alike, set(), []

    def paths(self):
        return [os.path.join(d, n) for d, dirs, names in os.walk(self.root) for n in dirs + names] or [self.root + b"/a"]

    def path(self):
        """One that is there, or perhaps a new one."""
        path = self.rng.choice(self.paths())
        directory = path if os.path.isdir(path) and not os.path.islink(path) else os.path.dirname(path)
        return path if self.rng.random() < 0.5 else directory + b"/" + self.rng.choice(NAMES)

    def write(self, path, mode="wb"):
        self.words.append("word%dx%d" % (self.rng.randrange(10**9), len(self.words)))
        with open(path, mode) as file:
            file.write((self.words[-1] + " " * (self.rng.randrange(3) if self.alike else 20 * len(self.words))).encode())

    def save(self, path):
        self.write(path + b".tmp~")
        os.rename(path + b".tmp~", path)

    def edit_and_rename_parent(self, path):
        self.write(path)
        if os.path.dirname(path) != self.root:
            os.rename(os.path.dirname(path), os.path.dirname(path) + b"x")

    def turn(self, path):
        if os.path.isdir(path) and not os.path.islink(path):
            subprocess.run(["rm", "-r", path], check=True)
        else:
            os.unlink(path)
            os.mkdir(path)
        self.write(path + b"/in.txt" if os.path.isdir(path) else path)

    def move(self, path):
        away = self.outside + b"/%d" % self.rng.randrange(4)
        os.rename(*(away, path) if os.path.lexists(away) else (path, away))

    def attributes(self, path):
        if self.alike or not os.path.isdir(path):
            os.chmod(path, self.rng.choice([0o600, 0o644, 0o755]))
            os.chown(path, self.rng.randrange(9), 0)

    def step(self, count=1):
        operations = [self.write] * 5 + [lambda p: self.write(p, "ab"), self.save, self.turn, self.move,
            self.edit_and_rename_parent, self.attributes, os.unlink, os.mkdir, lambda p: os.rename(p, self.path()),
            lambda p: os.truncate(p, self.rng.randrange(9)) or self.write(p, "ab"),
            lambda p: functools.reduce(lambda a, b: os.rename(a, b) or b, [p, self.path(), self.path(), self.path()]),
            lambda p: self.linked.add(os.link(p, self.path()) or os.lstat(p).st_ino),
            lambda p: LIBC.renameat2(-100, p, -100, self.rng.choice(self.paths()), 2),  # swaps the two
            lambda p: os.makedirs(p + b"/deep" * self.rng.choice([2, 2, 2, 40])), lambda p: os.symlink(b"a", p),
            lambda p: subprocess.run(["rm", "-r", p], stderr=subprocess.DEVNULL)]
        for _ in range(count):
            with contextlib.suppress(OSError, subprocess.CalledProcessError):
                self.rng.choice(operations)(self.path())
