#!/usr/bin/env python3
"""What people type, as whole processes, among 100,000 documents: searches beside recollq on the same files, and how long
fileindexctl takes to answer while all of them are indexed for the first time.

    FILEINDEX_BUILD_DIR=build/release python3 bench/command_bench.py [--keep] [--small]

The texts are this machine's; as there are too few, the later ones are halves of two. Names differ, too. --keep leaves files and
indexes in the build directory and takes them from there, so that only searches are measured: making them takes ten minutes.

A search of either side is run in turn with the other's, both for the first ten hits, and the engines have what they need in
memory: each query was asked once before. Times are from the start of a process to its end, its output thrown away.
"""
import collections
import os
import pathlib
import random
import re
import shutil
import statistics
import subprocess
import sys
import time

import system_bench as system
from system_bench import PROGRAMS, ROOT, machine

SMALL, KEEP = "--small" in sys.argv, "--keep" in sys.argv
FILES, SAMPLE, QUERIES, ROUNDS, CALLS = (1200, 400, 30, 1, 5) if SMALL else (100_000, 4000, 40, 5, 50)
CTL = PROGRAMS["fileindexctl"]
DOCS = ROOT / "volume/docs"
USERS = {5001: "ann", 5002: "ben", 5003: "cai"}  # each with a group of the same name and number
GROUPS = {5101: ("staff5", "ann,ben"), 5102: ("sales5", "cai")}
MODES = 0o644, 0o640, 0o600, 0o664, 0o640
WORD = re.compile(r"(?<!\w)[a-z]{4,12}(?!\w)")


def texts():
    """Without end: each text of the machine, then halves of two that are next but so many to each other."""
    once = list(system.text_files())
    for round in range(FILES):
        for at, (path, data) in enumerate(once):
            if round:
                path, other = f"copy{round}/{path}", once[(at + round) % len(once)][1]
                data = data[len(data) // 2:] + other[:len(other) // 2] + b"\ncopy %d\n" % round
            yield path, data


def make_files():
    """Of a few users and groups, if that can be said here, and each with a name of its own."""
    size = 0
    for count, (path, data) in zip(range(FILES), texts()):
        target = DOCS / pathlib.Path(path).with_name("%s-%d.txt" % (pathlib.Path(path).name, count))
        target.parent.mkdir(parents=True, exist_ok=True)
        target.write_bytes(data)
        if may_give_away():
            os.chown(target, [*USERS][count % 3], [*USERS, *GROUPS][count % 5])
            target.chmod(MODES[count % 7 % 5])
        size += len(data)
    return size


def may_give_away():
    return pathlib.Path("/proc/self/uid_map").read_text().split()[2] == str(2**32 - 1)


def make_users():
    with open("/etc/passwd", "a") as users, open("/etc/group", "a") as groups:
        for number, name in USERS.items():
            users.write(f"{name}:x:{number}:{number}::/:/bin/sh\n")
            groups.write(f"{name}:x:{number}:\n")
        for number, (name, members) in GROUPS.items():
            groups.write(f"{name}:x:{number}:{members}\n")


def seconds(program, *arguments):
    """From the start of a process to its end."""
    nowhere = [(os.POSIX_SPAWN_OPEN, number, "/dev/null", os.O_WRONLY, 0) for number in (1, 2)]
    environment = {**os.environ, "HOME": str(ROOT)}
    begin = time.perf_counter()
    child = os.posix_spawnp(program, [str(program), *map(str, arguments)], environment, file_actions=nowhere)
    _, status = os.waitpid(child, 0)
    taken = time.perf_counter() - begin
    assert status == 0, (status, program, arguments)
    return taken


def load():
    return "load %.1f" % os.getloadavg()[0]


class Queries:
    """Of words and parts of names that a sample of the files has; the same for the same files."""

    def __init__(self):
        self.random = random.Random(1)
        paths = self.random.sample(sorted(DOCS.rglob("*.txt")), SAMPLE)
        self.names = [path.name[:-4].lower() for path in paths]
        self.texts = [WORD.findall(path.read_text(errors="replace").lower()) for path in paths]
        self.shares = collections.Counter(word for text in self.texts for word in set(text))

    def pick(self, words, least, most):
        """A word that so many of a hundred texts have; none where there is none."""
        fit = [word for word in sorted(set(words)) if least <= 100 * self.shares[word] / SAMPLE < most]
        return self.random.choice(fit) if fit else None

    def word(self, least, most):
        return self.pick(self.shares, least, most)

    def pair(self):
        while True:
            text = self.random.choice(self.texts)
            pair = self.pick(text, 0.5, 5), self.pick(text, 5, 100)
            if all(pair):
                return " ".join(pair)

    def phrase(self):
        while True:
            text = self.random.choice(self.texts)
            if len(text) > 1:
                at = self.random.randrange(len(text) - 1)
                return '"%s %s"' % (text[at], text[at + 1])

    def part(self):
        """Of fewer than a twentieth of the names: where it fits 10,000, recollq refuses it."""
        while True:
            if words := re.findall("[a-z]{3,}", self.random.choice(self.names)):
                word = self.random.choice(words)
                at = self.random.randrange(len(word) - 2)
                part = word[at:at + self.random.randrange(3, 9)]
                if sum(part in name for name in self.names) <= 0.05 * SAMPLE:
                    return part


def hits(command):
    """How many the command says it found."""
    out = subprocess.run([*map(str, command)], capture_output=True, text=True, env={**os.environ, "HOME": str(ROOT)}).stdout
    found = re.search(r"^(?:\d+ to \d+ of (?:about |at least )?)?(\d+)(?: results.*)?$", out, re.MULTILINE)
    return int(found[1]) if found else 0


def compare(what, asked):
    """Times of two commands for the same questions, a line with them, and their ratio."""
    ours, theirs = [], []
    counts = [(hits((CTL, *a)), hits(b)) for a, b in asked]
    for turn in range(ROUNDS):
        for a, b in asked:
            pairs = [(ours, (CTL, *a)), (theirs, b)]
            for times, command in pairs if turn % 2 else reversed(pairs):
                times.append(seconds(*command))
    medians = [statistics.median(times) * 1000 for times in (ours, theirs)]
    found = [sorted(side)[len(asked) // 2] for side in zip(*counts)]
    print(f"{what:34} {medians[0]:8.1f} {sum(ours) / ROUNDS:8.2f} {medians[1]:8.1f} {sum(theirs) / ROUNDS:8.2f}"
          f" {medians[0] / medians[1]:6.2f}   {found[0]}, {found[1]} hits; {load()}", flush=True)


def searches(recoll):
    queries = Queries()
    recollq = ["recollq", "-c", recoll.config, "-n", "10"]
    print(f"{'':34} {'ours: median ms, sum s':>17} {'theirs':>17}  ratio   hits at the median")
    made = {what: [make() for _ in range(QUERIES)] for what, make in (
        ("a rare word", lambda: queries.word(0, 150 / SAMPLE)), ("a word in 1 to 5 % of the texts", lambda: queries.word(1, 5)),
        ("a word in 5 to 90 %", lambda: queries.word(5, 90)), ("two words", queries.pair), ("a phrase of two", queries.phrase))}
    made["all of these"] = [text for texts in list(made.values())[:4] for text in texts]
    for what, texts in made.items():
        compare(what, [(("search", text), (*recollq, text)) for text in texts])
    parts = [queries.part() for _ in range(QUERIES)]
    compare("a part of a name", [(("search", "--name", part), (*recollq, f"filename:*{part}*")) for part in parts])
    if "--as" not in subprocess.run([CTL, "search", "--help"], capture_output=True, text=True).stdout:
        print("search knows no --as, so it is not measured")
    elif may_give_away():
        compare("as a user, beside without", [(("search", "--as", "ann", text), (CTL, "search", text)) for text in made["all of these"]])


def while_indexing(ours):
    """The first index, and what the command takes to answer meanwhile."""
    paths = random.Random(2).sample(sorted(DOCS.rglob("*.txt")), CALLS)
    begin = time.monotonic()
    ours.ctl("folder", "add", "/docs")
    times = {"status": [], "explain": [], "search": [], "a process that does nothing": []}
    for path in paths:
        commands = (CTL, "status"), (CTL, "explain", path), (CTL, "search", "include"), ("true",)
        for taken, command in zip(times.values(), commands):
            if not ours.idle():
                taken.append(seconds(*command))
                time.sleep(0 if SMALL else 0.2)
    ours.until(lambda: ours.idle() and system.found("include") > 0, 3600)
    print(f"first index: {time.monotonic() - begin:.1f} s; {load()}; meanwhile:")
    for what, taken in times.items():
        if taken:
            print(f"{what:34} {statistics.median(taken) * 1000:8.1f} ms median,"
                  f" {max(taken) * 1000:.1f} ms worst of {len(taken)}", flush=True)


def main():
    os.environ["FILEINDEX_BUILD_DIR"] = str(system.BUILD)
    machine.enter()
    make_users()
    if not KEEP:
        shutil.rmtree(ROOT, ignore_errors=True)
    if not DOCS.exists():
        print(f"{FILES} text files, {make_files() / 1e6:.0f} MB", flush=True)
    try:
        known = (ROOT / "volume/@fileindex").exists()
        ours = system.Ours(ROOT / "volume", fresh=not known)
        if known:
            ours.ctl("folder", "add", "/docs")
            ours.until(lambda: ours.idle() and system.found("include") > 0)
        else:
            while_indexing(ours)
        recoll = system.Recoll(DOCS, fresh=not (ROOT / "recoll/xapiandb").exists())
        print(f"recollindex: {recoll.run()[0]:.1f} s; {load()}", flush=True)
        ours.rest()
        searches(recoll)
        ours.stop()
    finally:
        for daemon in system.DAEMONS:
            daemon.kill()
    if not KEEP:
        shutil.rmtree(ROOT)


if __name__ == "__main__":
    main()
