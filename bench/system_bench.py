#!/usr/bin/env python3
"""The whole system on real files, beside recollindex on the same files.

    FILEINDEX_BUILD_DIR=build/release python3 bench/system_bench.py [--media] [--small]

The files are text; with --media a twelfth more of them are documents, mail, sound, pictures and video, and only passes are
measured: then the other's helper programs are to be installed, too.

Runs on a private machine (tests/system/private_machine.py), with files and indexes on the disk that holds the build
directory. Processor time is that of all processes of a system; memory is the sum of the peaks of our daemons, and the
largest process of the other; disk is what the index takes. recollindex runs as Debian configures it, without the
spelling dictionary.
"""
import json
import os
import pathlib
import random
import re
import resource
import shutil
import signal
import socket
import statistics
import struct
import subprocess
import sys
import time

sys.path.insert(0, str(pathlib.Path(__file__).resolve().parent.parent / "tests/system"))
import media_corpus
import private_machine as machine

SMALL, MEDIA = "--small" in sys.argv, "--media" in sys.argv
FILES, RENAMED, CHANGED, TRIES, IDLE = (1200, 500, 20, 10, 5) if SMALL else (24000, 10000, 100, 100, 60)
BUILD = pathlib.Path(os.environ.get("FILEINDEX_BUILD_DIR", "build/release")).resolve()
ROOT = BUILD / (pathlib.Path(sys.argv[0]).stem + "_small" * SMALL)  # of the program that runs
PROGRAMS = {name: BUILD / place for name, place in (
    ("vexoelasticd", "platform/elasticd/vexoelasticd"), ("vexonotifyd", "platform/notifyd/vexonotifyd"),
    ("fileindexd", "src/fileindexd/fileindexd"), ("fileindexctl", "src/fileindexctl/fileindexctl"))}
LARGEST = 200_000  # bytes of a file
DAEMONS = []  # that run
TICKS = os.sysconf("SC_CLK_TCK")


def text_files():
    """Headers and documentation of this machine, as far as they are UTF-8, unpacked."""
    for top in ("/usr/include", "/usr/share/doc", "/usr/lib/python3", "/usr/share/perl", "/usr/lib/gcc"):
        for directory, subdirectories, names in os.walk(top):
            subdirectories.sort()
            for name in sorted(names):
                path = os.path.join(directory, name)
                if os.path.islink(path) or not os.path.isfile(path) or os.path.getsize(path) > LARGEST:
                    continue
                if name.endswith(".gz"):
                    data = subprocess.run(["gzip", "-dc", path], capture_output=True).stdout
                else:
                    data = pathlib.Path(path).read_bytes()
                if not 0 < len(data) <= LARGEST or b"\0" in data:
                    continue
                try:
                    data.decode()
                except UnicodeDecodeError:
                    continue
                yield path[len("/usr/"):], data


def make_corpus(docs, files):
    """Files in a tree like that of their origin; both systems know them as text by their names."""
    count = size = 0
    for path, data in text_files():
        target = docs / ("bulk" if count < RENAMED else "rest") / (path + ".txt")
        target.parent.mkdir(parents=True, exist_ok=True)
        target.write_bytes(data)
        count, size = count + 1, size + len(data)
        if count == files:
            break
    return count, size


def ask(data):
    """One exchange with the search engine."""
    text = json.dumps({"command": "document_get_by_query", "data": data}).encode() + b"\0"
    with socket.socket(socket.AF_UNIX, socket.SOCK_STREAM) as engine:
        engine.connect("/run/vexoelasticd.sock")
        engine.sendall(struct.pack("=I", len(text)) + text)
        answer = b""
        while part := engine.recv(1 << 20):
            answer += part
            if len(answer) >= 4 and len(answer) - 4 >= struct.unpack("=I", answer[:4])[0]:
                break
    return json.loads(answer[4:-1])


def found(word):
    """How many documents have the word, up to a thousand."""
    query = {"qsl": {"query_string": word}, "load_field": ["VEXOMDPath"], "from": 0, "size": 1000}
    return len(ask({"id": "fileindex_docs", "query": query}).get("data", []))


def holds(path):
    query = {"qsl": {"term": {"VEXOMDPath": str(path)}}, "load_field": ["VEXOMDPath"]}
    return len(ask({"id": "fileindex_docs", "query": query}).get("data", [])) == 1


def below(directory, end=""):
    """How many files the index holds below a directory, of those whose names end so."""
    fields = ["VEXOMDIsDir", "VEXOMDPath"]
    answer = ask({"id": "fileindex_docs", "query": {"qsl": {"prefix": {"VEXOMDPath": f"{directory}/"}}, "load_field": fields}})
    return sum(not document["VEXOMDIsDir"] and document["VEXOMDPath"].endswith(end) for document in answer.get("data", []))


class Ours:
    def __init__(self, volume, fresh=True):
        """The daemons, with the index that is there unless it is to be made afresh."""
        self.volume = volume
        indexes = [volume / "@fileindex", ROOT / "engine"] if fresh else []
        for place in ("/var/lib/vexonotifyd", "/var/packages/Quarrox", "/run/vexoelasticd.sock", *indexes):
            shutil.rmtree(place, ignore_errors=True)
        machine.write("/etc/vexo/shares.conf", "[docs]\npath = %s/docs\n" % volume)
        os.makedirs("/var/packages/Quarrox/etc")
        self.log = open(ROOT / "log", "w")
        self.daemons = DAEMONS
        self.daemons.clear()
        for name, arguments in (("vexoelasticd", ["--data", str(ROOT / "engine")]), ("fileindexd", []), ("vexonotifyd", [])):
            self.daemons.append(subprocess.Popen([PROGRAMS[name], "--foreground", *arguments], stderr=self.log))
        self.until(lambda: os.path.exists("/run/vexoelasticd.sock") and os.path.exists("/run/fileindexd.sock"))

    def until(self, condition, seconds=600):
        end = time.monotonic() + seconds
        while not condition():
            if time.monotonic() > end:
                raise SystemExit("waited too long, see %s" % (ROOT / "log"))
            time.sleep(0.005)

    def idle(self):
        queue = self.volume / "@fileindex/docs/queue"
        return not queue.exists() and not queue.with_name("queue.tmp").exists()

    @staticmethod
    def ctl(*arguments):
        subprocess.run([PROGRAMS["fileindexctl"], *arguments], check=True, stdout=subprocess.DEVNULL)

    def pids(self):
        """Of all our processes, children behind their parents."""
        pids = [daemon.pid for daemon in self.daemons]
        for pid in pids:
            for thread in pathlib.Path(f"/proc/{pid}/task").iterdir():
                pids.extend(map(int, (thread / "children").read_text().split()))
        return pids

    def cpu(self):
        """With that of children that ended."""
        fields = (pathlib.Path(f"/proc/{pid}/stat").read_text().rsplit(")", 1)[1].split() for pid in self.pids())
        return sum(sum(map(int, values[11:15])) for values in fields) / TICKS

    def peak(self):
        """Of the memory, in MiB."""
        pages = re.compile(r"^VmHWM:\s+(\d+)", re.MULTILINE)
        return sum(int(pages.search(pathlib.Path(f"/proc/{pid}/status").read_text())[1]) for pid in self.pids()) / 1024

    def wake_ups(self):
        waits = re.compile(r"^voluntary_ctxt_switches:\s+(\d+)", re.MULTILINE)
        threads = (thread for pid in self.pids() for thread in pathlib.Path(f"/proc/{pid}/task").iterdir())
        return sum(int(waits.search((thread / "status").read_text())[1]) for thread in threads)

    def written(self):
        written = re.compile(r"^write_bytes: (\d+)", re.MULTILINE)
        return sum(int(written.search(pathlib.Path(f"/proc/{pid}/io").read_text())[1]) for pid in self.pids())

    def measure(self, work, done):
        """Seconds and seconds of processor time from the begin of the work until it is done and nothing is left to do."""
        cpu, begin = self.cpu(), time.monotonic()
        work()
        self.until(done)
        seconds = time.monotonic() - begin
        self.until(self.idle)
        return seconds, self.cpu() - cpu

    def rest(self):
        """Until nothing has been done for a while."""
        self.until(self.idle)
        time.sleep(1.5)
        self.until(self.idle)

    def stop(self):
        for daemon in reversed(self.daemons):
            daemon.terminate()
        for daemon in self.daemons:
            daemon.wait()


class Recoll:
    def __init__(self, docs, fresh=True):
        self.config = ROOT / "recoll"
        if fresh:
            shutil.rmtree(self.config, ignore_errors=True)
        self.config.mkdir(parents=True, exist_ok=True)
        (self.config / "recoll.conf").write_text(f"topdirs = {docs}\nnoaspell = 1\nskippedNames =\n")

    def run(self):
        before, begin = resource.getrusage(resource.RUSAGE_CHILDREN), time.monotonic()
        process = subprocess.Popen(["recollindex", "-c", str(self.config)], stdout=subprocess.DEVNULL,
                                   stderr=subprocess.DEVNULL, env={**os.environ, "HOME": str(ROOT)})
        _, status, usage = os.wait4(process.pid, 0)
        process.returncode = status
        seconds = time.monotonic() - begin
        assert status == 0, status
        self.peak = usage.ru_maxrss
        return seconds, usage.ru_utime + usage.ru_stime

    def count(self, query):
        out = subprocess.run(["recollq", "-c", str(self.config), "-n", "0-1", query], capture_output=True, text=True,
                             env={**os.environ, "HOME": str(ROOT)}).stdout
        for line in out.splitlines():
            if line.strip().split(" ")[0].isdigit() and "results" in line:
                return int(line.split()[0])
        return 0


def disk(*places):
    sizes = (subprocess.run(["du", "-sk", place], capture_output=True, text=True).stdout for place in places)
    return sum(int(size.split()[0]) for size in sizes) / 1024


def report(what, ours, theirs, unit="s", ratio=True):
    text = f"{what:46} {ours:9.2f} {unit:4}"
    if theirs is not None:
        text += f"{theirs:9.2f} {unit:4}" + (f" {ours / theirs:6.2f}" if ratio else "")
    print(text, flush=True)


def change_some(docs, word):
    for path in random.Random(word).sample(sorted(docs.rglob("*.txt")), CHANGED):
        with open(path, "a") as file:
            file.write(f"\n{word}\n")


def indexed(volume):
    """The system with everything below the volume's share indexed, and what that took."""
    ours = Ours(volume)
    figures = ours.measure(lambda: ours.ctl("folder", "add", "/docs"), lambda: ours.idle() and found("include") > 0)
    return ours, figures


def compare(volume, docs):
    ours, full = indexed(volume)
    recoll = Recoll(docs)
    theirs = recoll.run()
    report("full index", full[0], theirs[0])
    report("  processor time", full[1], theirs[1])
    report("  peak memory", ours.peak(), recoll.peak / 1024, "MiB")
    report("  disk", disk(volume / "@fileindex", ROOT / "engine"), disk(recoll.config / "xapiandb"), "MiB")
    for kind in ["txt", *(kind for kind, _ in media_corpus.SHARES if MEDIA)]:
        print(f"{f'  {kind} files that both hold':46} {below(docs, '.' + kind):9d}      {recoll.count('ext:' + kind):9d}")

    def a_pass(what, change, done):
        change()
        ours.rest()
        figures = ours.measure(lambda: ours.ctl("folder", "reindex", "/docs"), lambda: ours.idle() and done())
        theirs = recoll.run()
        report(what, figures[0], theirs[0])
        report("  processor time", figures[1], theirs[1])

    a_pass("a pass with nothing changed", lambda: None, lambda: True)
    for daemon in ours.daemons[2:]:
        daemon.send_signal(signal.SIGSTOP)  # or else the changes are known before the pass
    a_pass(f"a pass with {CHANGED} files changed", lambda: change_some(docs, "xyquokka"), lambda: found("xyquokka") == CHANGED)
    for daemon in ours.daemons[2:]:
        daemon.send_signal(signal.SIGCONT)
    ours.until(ours.idle)

    if MEDIA:
        return ours
    moved = len(list((docs / "bulk").rglob("*.txt")))
    ours.rest()
    name = next((docs / "bulk").rglob("*.txt")).relative_to(docs / "bulk")
    renamed = ours.measure(lambda: os.rename(docs / "bulk", docs / "moved"), lambda: holds(docs / "moved" / name) and ours.idle())
    assert (below(docs / "moved"), below(docs / "bulk")) == (moved, 0)
    theirs = recoll.run()
    report(f"a directory with {moved} files renamed", renamed[0], theirs[0])
    report("  processor time", renamed[1], theirs[1])
    return ours


def latency(ours, docs):
    times = []
    for turn in range(TRIES):
        word = f"wombat{turn}x"
        (docs / f"{word}.txt").write_text(f"a letter about a {word}\n")
        begin = time.monotonic()
        ours.until(lambda: found(word) == 1)
        times.append(time.monotonic() - begin)
        time.sleep(random.Random(turn).uniform(0.6, 0.9))
    times.sort()
    print(f"{'from the close of a file to its being found':46} {statistics.median(times):9.3f} s    median,"
          f" {times[int(len(times) * 0.99)]:.3f} s 99th, {times[-1]:.3f} s worst")


def idle(ours):
    time.sleep(2)
    before = ours.cpu(), ours.wake_ups(), ours.written()
    time.sleep(IDLE)
    after = ours.cpu(), ours.wake_ups(), ours.written()
    cpu, wakes, written = (b - a for a, b in zip(before, after))
    print(f"{f'idle for {IDLE} s':46} {cpu:9.2f} s    processor time, {wakes} wake-ups, {written} bytes written")


def growth(volume, docs):
    """The same files once, twice and four times."""
    figures = []
    for times in 1, 2, 4:
        shutil.rmtree(docs)
        for turn in range(times):
            make_corpus(docs / str(turn), FILES // 4)
        ours, (seconds, cpu) = indexed(volume)
        ours.stop()
        figures.append((seconds, cpu))
        print(f"{f'full index of {times * FILES // 4} files':46} {seconds:9.2f} s    {seconds / figures[0][0]:.2f} times the first;"
              f" processor time {cpu:.2f} s, {cpu / figures[0][1]:.2f} times", flush=True)


def main():
    os.environ["FILEINDEX_BUILD_DIR"] = str(BUILD)
    machine.enter()
    shutil.rmtree(ROOT, ignore_errors=True)
    volume = ROOT / "volume"
    docs = volume / "docs"
    count, size = make_corpus(docs, FILES)
    print(f"{count} text files, {size / 1e6:.0f} MB")
    if MEDIA:
        texts = (data.decode() for path, data in text_files())
        count, size = media_corpus.make(docs / "media", count // 12, texts)
        print(f"{count} other files, {size / 1e6:.0f} MB")
    print(f"{'':46} {'ours':>13} {'recollindex':>13}  ratio", flush=True)
    try:
        ours = compare(volume, docs)
        if not MEDIA:
            latency(ours, docs)
            idle(ours)
        ours.stop()
        if not MEDIA:
            growth(volume, docs)
    finally:
        for daemon in DAEMONS:
            daemon.kill()
    shutil.rmtree(ROOT)


if __name__ == "__main__":
    main()
