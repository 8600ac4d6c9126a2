#!/usr/bin/env python3
"""The notification daemon against a real kernel: every test watches a directory of its own and replays the queue.

VEXONOTIFYD      the daemon's binary
STRESS_FILES     files that each stress run creates (20000)
"""
import fcntl
import json
import multiprocessing
import os
import pathlib
import random
import shutil
import signal
import subprocess
import tempfile
import time
import unittest

ATTRIB, WRITTEN, CREATED, DELETED, RENAMED, LOST = 0x04, 0x08, 0x40, 0x80, 0x100, 0x200
DAEMON = os.path.realpath(os.environ["VEXONOTIFYD"])
STRESS_FILES = int(os.environ.get("STRESS_FILES", "20000"))
DEADLINE = 20


def parse(raw):
    """The lines of a queue as tuples (bit, path, path_old, is_dir); every one must be whole and carry one bit."""
    events = []
    assert raw == b"" or raw.endswith(b"\n"), "torn line"
    for line in raw.splitlines():
        event = json.loads(line.decode("utf-8", "surrogateescape"))
        assert event["event"] in (ATTRIB, WRITTEN, CREATED, DELETED, RENAMED, LOST), line
        assert ("path_old" in event) == (event["event"] == RENAMED), line
        events.append((event["event"], event["path"], event.get("path_old"), event.get("is_dir", False)))
    return events


class Node:
    """What a reader knows about one path: its kind (None: gone), and, of a directory, whether it has looked below."""

    def __init__(self, is_dir, looked=False):
        self.is_dir, self.looked, self.children = is_dir, looked, {}


class Model:
    """A reader that replays the queue. Paths that it was never told about count as known only below a directory that
    it was told to look at."""

    def __init__(self, root):
        self.root, self.top, self.lost = root, Node(True), False
        for dirpath, dirs, files in os.walk(root):
            for name in dirs + files:
                self.put(os.path.join(dirpath, name), Node(name in dirs))

    def find(self, path):
        """The node for a path, or None, and whether the nearest known directory was looked at."""
        node, looked = self.top, self.top.looked
        for name in path[len(self.root):].split("/")[1:]:
            node = node.children.get(name)
            if node is None:
                return None, looked
            looked = node.looked
        return node, looked

    def put(self, path, new):
        node = self.top
        *parents, last = path[len(self.root):].split("/")[1:]
        for name in parents:
            node = node.children.setdefault(name, Node(True, node.looked))
        node.children[last] = new

    def replay(self, events):
        for bit, path, old, is_dir in events:
            node, looked = self.find(old or path)
            if bit == LOST:
                self.lost = True
            if bit == LOST or path == self.root:
                continue
            if bit == DELETED:
                node = Node(None)
            elif bit == CREATED and is_dir:
                node = Node(True, looked=True)
            elif node is None or node.is_dir is not is_dir:
                node = Node(is_dir, looked and node is None)
            if old:
                self.put(old, Node(None))
            self.put(path, node)

    def differences(self):
        """Where the reader's last word is not the disk's, both ways."""
        found, stack = [], [(self.root, self.top)]
        while stack:
            path, node = stack.pop()
            disk = os.path.isdir(path) and not os.path.islink(path) if os.path.lexists(path) else None
            if node.is_dir is not disk:
                found.append(f"{path}: told {node.is_dir}, disk has {disk} (directory?)")
            elif disk:
                stack += [(f"{path}/{name}", child) for name, child in node.children.items()]
                found += [f"{path}/{n}: never told" for n in os.listdir(path) if n not in node.children and not node.looked]
        return found


def touch(path, text="x"):
    with open(path, "w") as f:
        f.write(text)


class Daemon:
    def __init__(self, watch, queue, *options):
        self.queue, self.seen = queue, 0
        self.process = subprocess.Popen([DAEMON, "--watch", watch, "--queue", queue, *options], stderr=subprocess.PIPE)
        self.greeting = self.process.stderr.readline().decode("utf-8", "surrogateescape")

    def raw(self):
        try:
            with open(self.queue, "rb") as f:
                fcntl.flock(f, fcntl.LOCK_SH)  # no line is seen half written
                return f.read()
        except FileNotFoundError:
            return b""

    def events(self):
        """The lines since `seen`, without repetitions, of which the one method has more than the other."""
        return list(dict.fromkeys(parse(self.raw()[self.seen:])))

    def stop(self):
        self.process.send_signal(signal.SIGCONT)
        self.process.terminate()
        return self.process.wait()

    def close(self):
        self.process.kill()
        self.process.wait()
        self.process.stderr.close()

    def is_idle(self):
        stat = pathlib.Path(f"/proc/{self.process.pid}/stat")
        ticks = stat.read_text().split()[13:15]
        time.sleep(1)
        return stat.read_text().split()[13:15] == ticks


class NotifydTest(unittest.TestCase):
    """Once watching starts, the watched directory is the current one."""
    method = "fanotify"

    def setUp(self):
        if self.method == "fanotify" and os.geteuid() != 0:
            self.skipTest("fanotify needs root")
        self.scratch = os.path.realpath(tempfile.mkdtemp(prefix="notifyd-test."))
        self.addCleanup(shutil.rmtree, self.scratch.encode())
        self.tree, self.lost = self.scratch + "/tree", (LOST, self.scratch + "/tree", None, False)
        os.makedirs(self.scratch + "/outside/d/sub")
        touch(self.scratch + "/outside/a")
        os.mkdir(self.tree)

    def start(self, *options, queue="queue"):
        daemon = Daemon(self.tree, os.path.join(self.scratch, queue), "--method", self.method, *options)
        self.addCleanup(daemon.close)
        self.addCleanup(os.chdir, "/")
        os.chdir(self.tree)
        self.assertIn(self.method, daemon.greeting)
        return daemon

    def wait(self, condition):
        end = time.monotonic() + DEADLINE
        while not condition() and time.monotonic() < end:
            time.sleep(0.002)

    def wait_for(self, daemon, event):
        self.wait(lambda: event in daemon.events())
        self.assertIn(event, daemon.events())

    def expect(self, daemon, *wanted):
        """Waits until the lines since the last call amount to `wanted`: (bit, name, old name), "/" ends a directory."""
        lines = [(bit, f"{self.tree}/{name}".rstrip("/"), f"{self.tree}/{old[0]}" if old else None, name.endswith("/"))
                 for bit, name, *old in wanted]
        self.wait(lambda: daemon.events() == lines)
        self.assertEqual(daemon.events(), lines)
        daemon.seen = len(daemon.raw())

    def play(self, *steps):
        """Each step: a call, its arguments, and the line that must come of it, or None."""
        daemon = self.start()
        for call, *args, wanted in steps:
            call(*args)
            if wanted:
                self.expect(daemon, wanted)
        self.assertEqual(daemon.stop(), 0)
        self.assertEqual(daemon.events(), [])

    def agree(self, daemon, model, may_lose=False):
        """Stops the daemon, which writes what was reported by then."""
        self.assertEqual(daemon.stop(), 0)
        model.replay(parse(daemon.raw()))
        if not (may_lose and model.lost):
            self.assertEqual((model.lost, model.differences()[:20]), (False, []))

    # What each change is written as

    def test_what_each_change_is_written_as(self):
        self.play((os.mknod, "a", (CREATED, "a")),  # a new file that nobody had open
                  (touch, "a", (WRITTEN, "a")),
                  (os.chmod, "a", 0o600, (ATTRIB, "a")),
                  (os.rename, "a", "b", (RENAMED, "b", "a")),
                  (os.unlink, "b", (DELETED, "b")),
                  (os.symlink, "/", "link", (CREATED, "link")),
                  (os.mkdir, "d", (CREATED, "d/")),
                  (os.mknod, "d/a", (CREATED, "d/a")),
                  (os.chmod, "d", 0o700, (ATTRIB, "d/")),
                  (os.rename, "d", "e", (RENAMED, "e/", "d")),
                  (touch, "e/a", (WRITTEN, "e/a")),
                  (os.unlink, "e/a", (DELETED, "e/a")),
                  (os.rmdir, "e", (DELETED, "e/")),
                  (os.chmod, self.tree, 0o711, (ATTRIB, "/")))

    def test_moves_across_the_border_are_creations_and_deletions(self):
        self.play((os.rename, "../outside/a", "a", (CREATED, "a")),
                  (os.rename, "../outside/d", "d", (CREATED, "d/")),
                  (os.mknod, "d/sub/x", (CREATED, "d/sub/x")),
                  (os.rename, "a", "../outside/a", (DELETED, "a")),
                  (os.rename, "d", "../outside/d", (DELETED, "d/")),
                  (os.mknod, "../outside/d/sub/y", None))

    def test_metadata_directories_and_similar_names(self):
        os.mkdir(self.tree + "-sibling")
        self.play((os.makedirs, "@eaDir/x", None),
                  (os.mknod, "@eaDir/x/a", None),
                  (os.mknod, "../tree-sibling/a", None),
                  (os.mknod, "x@eaDir", (CREATED, "x@eaDir")),
                  (os.rename, "@eaDir/x/a", "b", (CREATED, "b")),
                  (os.rename, "b", "@eaDir/b", (DELETED, "b")),
                  (os.rename, "@eaDir", "plain", (CREATED, "plain/")),
                  (os.mknod, "plain/x/c", (CREATED, "plain/x/c")))

    def test_names_survive_as_bytes(self):
        for raw in b'quote"back\\slash', b"new\nline\ttab\x01", b"\xff\xfe latin \xe4", b"x (deleted)":
            name = os.fsdecode(raw)
            self.play((os.mkdir, name, (CREATED, name + "/")), (os.mknod, f"{name}/{name}", (CREATED, f"{name}/{name}")))
            os.unlink(self.scratch + "/queue")

    def test_the_queue_inside_the_tree_is_never_spoken_of(self):
        daemon = self.start(queue="tree/queue")
        os.mknod("queue.txt")
        self.expect(daemon, (CREATED, "queue.txt"))
        os.rename("queue", "queue.tmp")  # the reader takes the queue
        daemon.seen = 0
        os.unlink("queue.tmp")
        os.mknod("a")
        self.expect(daemon, (CREATED, "a"))

    # What happens before the daemon looks

    def test_tangles_of_renames_and_replacements_end_in_the_truth(self):
        for name in ("p/q", "swap1", "swap2", "chain", "tmp", "doomed", "kinds"):
            os.makedirs(f"{self.tree}/{name}")
            touch(f"{self.tree}/{name}/file")
        touch(self.tree + "/ping")
        model, daemon = Model(self.tree), self.start()
        daemon.process.send_signal(signal.SIGSTOP)
        for old, new in (("ping", "pong"), ("pong", "ping"), ("ping", "pong"),  # merged by the kernel
                         ("swap1", "tmp/s"), ("swap2", "swap1"), ("tmp/s", "swap2"),
                         ("p/q", "z"), ("p", "r"), ("chain", "r/chain"), ("r", "p2")):  # out of and into what moves
            os.rename(old, new)
        touch("p2/chain/new")
        for name in ("doomed", "kinds"):  # a file where a directory was
            shutil.rmtree(name)
            touch(name)
        os.unlink("kinds")  # and a directory where a file was
        os.mkdir("kinds")
        touch("kinds/file")
        self.agree(daemon, model)

    def test_a_full_kernel_queue_is_a_loss(self):
        daemon = self.start("--limited-queue")
        daemon.process.send_signal(signal.SIGSTOP)
        limit = int(pathlib.Path("/proc/sys/fs/fanotify/max_queued_events").read_text())
        for i in range(limit + 1000):
            os.mknod(str(i))
        daemon.process.send_signal(signal.SIGCONT)
        self.wait_for(daemon, self.lost)
        os.mknod("after")
        self.wait_for(daemon, (CREATED, self.tree + "/after", None, False))

    def test_a_full_disk_delays_lines_and_then_owns_up(self):
        mount = self.scratch + "/small"
        os.mkdir(mount)
        for path, size in (mount, "1m"), (self.tree, "64m"):  # where nobody else keeps the daemon from coming to rest
            if subprocess.run(["mount", "-t", "tmpfs", "-o", "size=" + size, "none", path]).returncode != 0:
                self.skipTest("cannot mount a tmpfs")
            self.addCleanup(subprocess.run, ["umount", path], check=True)
        daemon = self.start(queue="small/queue")
        os.mknod("a")
        self.expect(daemon, (CREATED, "a"))
        self.fill(mount)
        for i in range(500):
            os.mknod(f"late{i}")
        self.wait(daemon.is_idle)
        os.unlink(mount + "/filler")
        self.expect(daemon, *((CREATED, f"late{i}") for i in range(500)))
        self.fill(mount)
        deep = "/".join(["x" * 250] * 13)
        os.makedirs(deep)
        os.chdir(deep)
        for wave in range(4):  # more bytes of lines than the daemon keeps; the kernel's shortest queue holds one wave
            self.wait(daemon.is_idle)
            for i in range(8000):
                os.mknod(f"{wave}.{i}")
        self.wait(daemon.is_idle)
        os.unlink(mount + "/filler")
        self.wait_for(daemon, self.lost)

    def fill(self, mount):
        filler = os.open(mount + "/filler", os.O_CREAT | os.O_WRONLY)
        with self.assertRaisesRegex(OSError, "No space"):
            while True:
                os.write(filler, b"x" * 4096)
        os.close(filler)

    # Stress

    def stress(self, stopped):
        for i in range(40):
            os.makedirs(f"{self.tree}/d{i}/sub")
            for j in range(10):
                touch(f"{self.tree}/d{i}/old{j}")
        model, daemon = Model(self.tree), self.start()
        if stopped:
            daemon.process.send_signal(signal.SIGSTOP)
        workers = [multiprocessing.Process(target=work, args=(self.tree, i, STRESS_FILES // 4)) for i in range(4)]
        for worker in workers:
            worker.start()
        for worker in workers:
            worker.join()
            self.assertEqual(worker.exitcode, 0)
        self.agree(daemon, model, may_lose=self.method == "inotify")  # its queue is short

    def test_stress_while_running(self):
        self.stress(stopped=False)

    def test_stress_while_stopped(self):
        self.stress(stopped=True)


def work(tree, seed, files):
    """Creates files among directories that all workers rename; what another worker took away is skipped."""
    rng = random.Random(seed)
    mine = [f"{tree}/d{i}/old{j}" for i in range(seed, 40, 4) for j in range(10)]

    def attempt(action, *args):
        try:
            action(*args)
            return True
        except OSError:
            return False

    for i in range(files):
        if i % 200 == 0:
            dirs = [path for path, _, _ in os.walk(tree) if path != tree]
        here, there, what = rng.choice(dirs), rng.choice(dirs), rng.random()
        if attempt(touch, f"{here}/f{seed}_{i}"):
            mine.append(f"{here}/f{seed}_{i}")
        if what < 0.7 and mine:
            victim, moved = mine.pop(rng.randrange(len(mine))), f"{there}/r{seed}_{i}"
            if what < 0.3:
                attempt(os.unlink, victim)
            elif attempt(os.rename, victim, moved):
                mine.append(moved)
        elif what > 0.99:
            attempt(os.rename, here, rng.choice((here + "_", here.rstrip("_"), f"{there}/in{i % 5}", f"{tree}/m{i % 20}")))
        elif what > 0.98:
            path = f"{here}/n{seed}_{i % 10}"
            if not attempt(os.mkdir, path) or not attempt(touch, path + "/f") or not attempt(os.rename, path, path + "x"):
                attempt(shutil.rmtree, path + "x")


class InotifyTest(NotifydTest):
    method = "inotify"


class CommandLineTest(unittest.TestCase):
    def test_bad_usage_is_2_and_failure_is_1(self):
        with tempfile.TemporaryDirectory() as here:
            missing = here + "/missing"
            for code, *args in ((2, "--queue", "q"), (2, "--watch", here), (2, "--watch", here, "--queue", "q", "--method", "x"),
                                (1, "--watch", missing, "--queue", here + "/q"), (1, "--watch", here, "--queue", missing + "/q")):
                done = subprocess.run([DAEMON, *args], stderr=subprocess.PIPE, text=True, timeout=DEADLINE)
                self.assertEqual(done.returncode, code, args)
                self.assertIn(missing if code == 1 else "--watch", done.stderr)


if __name__ == "__main__":
    unittest.main()
