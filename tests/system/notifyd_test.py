#!/usr/bin/env python3
"""The notification daemon against a real kernel: every test watches a directory of its own and replays the queue.

VEXONOTIFYD      the daemon's binary
STRESS_FILES     files that each stress run creates (20000)
STRESS_REPORT    set: print what each stress run cost
"""
import errno
import fcntl
import json
import os
import random
import shutil
import signal
import subprocess
import sys
import tempfile
import time
import unittest

ATTRIB, WRITTEN, CREATED, DELETED, RENAMED, LOST = 0x04, 0x08, 0x40, 0x80, 0x100, 0x200
DAEMON = os.environ.get("VEXONOTIFYD", "vexonotifyd")
STRESS_FILES = int(os.environ.get("STRESS_FILES", "20000"))
DEADLINE = 20


def parse(raw):
    """The lines of a queue as tuples (bit, path, path_old, is_dir); every one must be whole and carry one bit."""
    events = []
    assert raw == b"" or raw.endswith(b"\n"), "torn line"
    for line in raw.splitlines():
        event = json.loads(line.decode("utf-8", "surrogateescape"))
        assert event["event"] in (ATTRIB, WRITTEN, CREATED, DELETED, RENAMED, LOST), line
        assert set(event) <= {"event", "is_dir", "path", "path_old"}, line
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
        self.root, self.top, self.lost, self.looks = root, Node(True), False, 0
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

    def exists(self, path, is_dir):
        node, looked = self.find(path)
        if node is None or node.is_dir is not is_dir:
            self.put(path, Node(is_dir, is_dir and looked and node is None))

    def rename(self, old, new, is_dir):
        node, looked = self.find(old)
        if node is None or node.is_dir is not is_dir:
            node = Node(is_dir, looked and node is None)
        self.put(old, Node(None))
        self.put(new, node)

    def replay(self, events):
        for bit, path, old, is_dir in events:
            if bit == LOST:
                self.lost = True
            elif path == self.root:
                pass
            elif bit == RENAMED:
                self.rename(old, path, is_dir)
            elif bit == DELETED:
                self.put(path, Node(None))
            elif bit == CREATED and is_dir:
                self.looks += 1
                self.put(path, Node(True, looked=True))
            else:
                self.exists(path, is_dir)
        return self

    def differences(self):
        """Where the reader's last word is not the disk's, both ways."""
        found, stack = [], [(self.root, self.top)]
        while stack:
            path, node = stack.pop()
            disk = kind(path)
            if node.is_dir is not disk:
                found.append(f"{path}: told {node.is_dir}, disk has {disk} (directory?)")
                continue
            if not disk:
                continue
            stack += [(f"{path}/{name}", child) for name, child in node.children.items()]
            if not node.looked:
                found += [f"{path}/{n}: never told" for n in os.listdir(path) if n not in node.children]
        return found


def kind(path):
    """True for a directory, False for anything else, None for nothing."""
    return os.path.isdir(path) and not os.path.islink(path) if os.path.lexists(path) else None


def touch(path, text="x"):
    with open(path, "w") as f:
        f.write(text)


def make(path):
    """A new file that nobody had open."""
    os.mknod(path)


class Daemon:
    def __init__(self, watch, queue, *options):
        self.watch, self.queue, self.seen = watch, queue, 0
        self.process = subprocess.Popen([DAEMON, "--watch", watch, "--queue", queue, *options],
                                        stderr=subprocess.PIPE)
        self.greeting = self.process.stderr.readline().decode("utf-8", "surrogateescape")

    def raw(self):
        try:
            with open(self.queue, "rb") as f:
                fcntl.flock(f, fcntl.LOCK_SH)  # no line is seen half written
                return f.read()
        except FileNotFoundError:
            return b""

    def signal(self, number):
        os.kill(self.process.pid, number)

    def stop(self):
        """Ends the daemon and returns its exit code; its cost is in `usage`."""
        self.signal(signal.SIGCONT)
        self.signal(signal.SIGTERM)
        _, status, self.usage = os.wait4(self.process.pid, 0)
        self.process.returncode = os.waitstatus_to_exitcode(status)
        self.process.stderr.close()
        return self.process.returncode

    def kill(self):
        if self.process.returncode is None:
            self.process.kill()
            self.process.wait()
            self.process.stderr.close()


def essence(events):
    """Without repetitions, of which the one method has more than the other."""
    return list(dict.fromkeys(events))


class NotifydTest(unittest.TestCase):
    method = "fanotify"

    def setUp(self):
        if self.method == "fanotify" and os.geteuid() != 0:
            self.skipTest("fanotify needs root")
        self.scratch = os.path.realpath(tempfile.mkdtemp(prefix="notifyd-test."))
        self.addCleanup(shutil.rmtree, self.scratch.encode())
        self.tree, self.outside = self.scratch + "/tree", self.scratch + "/outside"
        os.mkdir(self.tree)
        os.mkdir(self.outside)

    def start(self, *options, queue=None):
        daemon = Daemon(self.tree, queue or self.scratch + "/queue", "--method", self.method, *options)
        self.addCleanup(daemon.kill)
        self.addCleanup(os.chdir, "/")
        self.assertIn(self.method, daemon.greeting)
        return daemon

    def await_(self, condition, message):
        end = time.monotonic() + DEADLINE
        while not condition():
            if time.monotonic() > end:
                self.fail(message() if callable(message) else message)
            time.sleep(0.002)

    def expect(self, daemon, *wanted):
        """Waits until the lines since the last call amount to `wanted`: (bit, name[, old name][, True for a directory])."""
        def full(bit, name, *rest):
            old = self.tree + "/" + rest[0] if rest and isinstance(rest[0], str) else None
            return (bit, self.tree + "/" + name, old, bool(rest) and rest[-1] is True)

        wanted = [full(*w) for w in wanted]
        new = lambda: essence(parse(daemon.raw()[daemon.seen:]))  # noqa: E731
        self.await_(lambda: new() == wanted, lambda: f"wanted {wanted}, got {new()}")
        daemon.seen = len(daemon.raw())

    def finish(self, daemon):
        """Stops the daemon; nothing that was not expected may be in the queue."""
        self.assertEqual(daemon.stop(), 0)
        self.assertEqual(essence(parse(daemon.raw()[daemon.seen:])), [])

    def agree(self, daemon, model):
        self.assertEqual(daemon.stop(), 0)
        model.replay(parse(daemon.raw()))
        self.assertFalse(model.lost)
        self.assertEqual(model.differences(), [])

    # What each change is written as

    def test_a_file_lives_and_dies(self):
        daemon, path = self.start(), self.tree + "/a"
        make(path)
        self.expect(daemon, (CREATED, "a"))
        touch(path, "more")
        self.expect(daemon, (WRITTEN, "a"))
        os.chmod(path, 0o600)
        self.expect(daemon, (ATTRIB, "a"))
        os.rename(path, self.tree + "/b")
        self.expect(daemon, (RENAMED, "b", "a"))
        os.unlink(self.tree + "/b")
        self.expect(daemon, (DELETED, "b"))
        os.symlink("/", self.tree + "/link")
        self.expect(daemon, (CREATED, "link"))
        self.finish(daemon)

    def test_a_directory_lives_and_dies(self):
        daemon, path = self.start(), self.tree + "/d"
        os.mkdir(path)
        self.expect(daemon, (CREATED, "d", True))
        make(path + "/a")
        self.expect(daemon, (CREATED, "d/a"))
        os.chmod(path, 0o700)
        self.expect(daemon, (ATTRIB, "d", True))
        os.rename(path, self.tree + "/e")
        self.expect(daemon, (RENAMED, "e", "d", True))
        touch(self.tree + "/e/a", "more")
        self.expect(daemon, (WRITTEN, "e/a"))
        os.unlink(self.tree + "/e/a")
        self.expect(daemon, (DELETED, "e/a"))
        os.rmdir(self.tree + "/e")
        self.expect(daemon, (DELETED, "e", True))
        self.finish(daemon)

    def test_moves_across_the_border_are_creations_and_deletions(self):
        os.makedirs(self.outside + "/d/sub")
        daemon = self.start()
        make(self.outside + "/a")
        for name, flag in (("a", ()), ("d", (True,))):
            os.rename(f"{self.outside}/{name}", f"{self.tree}/{name}")
            self.expect(daemon, (CREATED, name, *flag))
        make(self.tree + "/d/sub/x")
        self.expect(daemon, (CREATED, "d/sub/x"))
        for name, flag in (("a", ()), ("d", (True,))):
            os.rename(f"{self.tree}/{name}", f"{self.outside}/{name}")
            self.expect(daemon, (DELETED, name, *flag))
        make(self.outside + "/d/sub/y")
        self.finish(daemon)

    def test_metadata_directories_and_similar_names(self):
        os.mkdir(self.tree + "-sibling")
        os.mkdir(self.tree + "/d")
        daemon = self.start()
        os.makedirs(self.tree + "/@eaDir/x")
        make(self.tree + "/@eaDir/x/a")
        make(self.tree + "-sibling/a")
        os.mkdir(self.tree + "/d/@eaDir")
        make(self.tree + "/d/@eaDir/b")
        make(self.tree + "/x@eaDir")
        self.expect(daemon, (CREATED, "x@eaDir"))
        os.rename(self.tree + "/d/@eaDir/b", self.tree + "/b")
        self.expect(daemon, (CREATED, "b"))
        os.rename(self.tree + "/b", self.tree + "/@eaDir/b")
        self.expect(daemon, (DELETED, "b"))
        os.rename(self.tree + "/@eaDir", self.tree + "/plain")
        self.expect(daemon, (CREATED, "plain", True))
        make(self.tree + "/plain/x/c")
        self.expect(daemon, (CREATED, "plain/x/c"))
        self.finish(daemon)

    def test_the_queue_inside_the_tree_is_never_spoken_of(self):
        queue = self.tree + "/queue"
        daemon = self.start(queue=queue)
        make(self.tree + "/queue.txt")
        self.expect(daemon, (CREATED, "queue.txt"))
        os.rename(queue, queue + ".tmp")  # the reader takes the queue
        daemon.seen = 0
        os.unlink(queue + ".tmp")
        make(self.tree + "/a")
        self.expect(daemon, (CREATED, "a"))
        os.rename(queue, self.tree + "/kept")
        daemon.seen = 0
        self.expect(daemon, (CREATED, "kept"))
        self.finish(daemon)

    def test_names_survive_as_bytes(self):
        names = [b'quote"back\\slash', b"new\nline\ttab\x01", b"\xff\xfe latin \xe4", "ünï".encode(), b"x (deleted)"]
        daemon = self.start()
        for raw in names:
            name = os.fsdecode(raw)
            os.mkdir(f"{self.tree}/{name}")
            self.expect(daemon, (CREATED, name, True))
            make(f"{self.tree}/{name}/{name}")
            self.expect(daemon, (CREATED, f"{name}/{name}"))
        self.assertIn(b"\xff\xfe latin \xe4", daemon.raw())
        self.finish(daemon)

    def test_the_watched_directory_itself(self):
        daemon = self.start()
        os.chmod(self.tree, 0o711)
        self.await_(lambda: (ATTRIB, self.tree, None, True) in parse(daemon.raw()), "no line for the directory")
        self.assertEqual(daemon.stop(), 0)

    # What happens before the daemon looks

    def test_tangles_of_renames_and_replacements_end_in_the_truth(self):
        t = self.tree
        for name in ("p/q", "swap1", "swap2", "chain", "tmp", "doomed", "kinds"):
            os.makedirs(f"{t}/{name}")
            touch(f"{t}/{name}/file")
        touch(f"{t}/p/file")
        model, daemon = Model(t), self.start()
        daemon.signal(signal.SIGSTOP)
        for old, new in (("ping", "pong"), ("pong", "ping"), ("ping", "pong")):  # merged by the kernel
            touch(f"{t}/ping") if old == "ping" and not os.path.exists(f"{t}/ping") else None
            os.rename(f"{t}/{old}", f"{t}/{new}")
        for old, new in (("swap1", "tmp/s"), ("swap2", "swap1"), ("tmp/s", "swap2")):
            os.rename(f"{t}/{old}", f"{t}/{new}")
        os.rename(f"{t}/p/q", f"{t}/z")  # leaves a directory that then moves
        os.rename(f"{t}/p/file", f"{t}/p/file2")
        os.rename(f"{t}/p", f"{t}/r")
        os.mkdir(f"{t}/r/inner")
        os.rename(f"{t}/chain", f"{t}/r/inner/chain")
        os.rename(f"{t}/r", f"{t}/p2")
        touch(f"{t}/p2/inner/chain/new")
        shutil.rmtree(f"{t}/doomed")
        touch(f"{t}/doomed")  # a file where a directory was
        os.unlink(f"{t}/kinds/file")
        os.mkdir(f"{t}/kinds/file")
        touch(f"{t}/kinds/file/below")
        os.unlink(f"{t}/doomed")
        os.mkdir(f"{t}/doomed")
        self.agree(daemon, model)

    def test_a_full_kernel_queue_is_a_loss(self):
        daemon = self.start("--limited-queue")
        daemon.signal(signal.SIGSTOP)
        with open("/proc/sys/fs/fanotify/max_queued_events") as f:
            limit = int(f.read())
        for i in range(limit + 1000):
            os.close(os.open(f"{self.tree}/{i}", os.O_CREAT | os.O_WRONLY))
        daemon.signal(signal.SIGCONT)
        lost = (LOST, self.tree, None, False)
        self.await_(lambda: lost in parse(daemon.raw()), "no line about the loss")
        daemon.seen = len(daemon.raw())
        make(self.tree + "/after")
        after = (CREATED, self.tree + "/after", None, False)
        self.await_(lambda: after in parse(daemon.raw()), "deaf after the loss")
        self.assertEqual(daemon.stop(), 0)

    def test_stopping_writes_what_was_reported(self):
        model, daemon = Model(self.tree), self.start()
        os.mkdir(self.tree + "/d")
        for i in range(3000):
            touch(f"{self.tree}/{i}")
            if i % 3 == 0:
                os.rename(f"{self.tree}/{i}", f"{self.tree}/d/{i}")
        self.agree(daemon, model)

    def test_a_full_disk_delays_lines_and_then_owns_up(self):
        mount = self.scratch + "/small"
        os.mkdir(mount)
        self.mount_memory(mount, "1m")
        self.mount_memory(self.tree, "64m")  # where nobody else keeps the daemon from coming to rest
        daemon = self.start(queue=mount + "/queue")
        make(self.tree + "/a")
        self.expect(daemon, (CREATED, "a"))
        self.fill(mount)
        for i in range(500):
            make(f"{self.tree}/late{i}")
        self.await_(lambda: self.idle(daemon), "the daemon never came to rest")
        self.assertLessEqual(len(daemon.raw()), 4096)  # the page that the queue had
        os.unlink(mount + "/filler")
        self.expect(daemon, *((CREATED, f"late{i}") for i in range(500)))
        self.fill(mount)
        self.make_long_lines(daemon)
        os.unlink(mount + "/filler")
        self.await_(lambda: (LOST, self.tree, None, False) in parse(daemon.raw()), "no line about the loss")
        if daemon.stop() != 0:  # what came since is more than the disk holds
            self.assertEqual(parse(daemon.raw())[-1], (LOST, self.tree, None, False))
    def mount_memory(self, path, size):
        if os.geteuid() != 0 or subprocess.run(["mount", "-t", "tmpfs", "-o", "size=" + size, "none", path]).returncode != 0:
            self.skipTest("cannot mount a tmpfs")
        self.addCleanup(subprocess.run, ["umount", path], check=True)

    def fill(self, mount):
        with open(mount + "/filler", "wb") as f:
            try:
                while True:
                    f.write(b"x" * 4096)
                    f.flush()
            except OSError as error:
                self.assertEqual(error.errno, errno.ENOSPC)
            try:
                f.close()
            except OSError:
                pass

    def make_long_lines(self, daemon):
        """More bytes of lines than the daemon keeps."""
        deep = self.tree
        while len(deep) < 3500:
            deep += "/" + "x" * 250
        os.makedirs(deep)
        os.chdir(deep)
        for wave in range(4):  # the kernel's shortest queue holds one
            self.await_(lambda: self.idle(daemon), "the daemon never came to rest")
            for i in range(8000):
                make(f"{wave}.{i}")
        self.await_(lambda: self.idle(daemon), "the daemon never came to rest")

    def idle(self, daemon):
        def ticks():
            with open(f"/proc/{daemon.process.pid}/stat") as f:
                return f.read().rsplit(")", 1)[1].split()[11:13]
        first = ticks()
        time.sleep(1)
        return ticks() == first

    # Stress

    def peak_memory(self, daemon):
        daemon.signal(signal.SIGCONT)
        self.await_(lambda: self.idle(daemon), "the daemon never came to rest")
        with open(f"/proc/{daemon.process.pid}/status") as f:
            return next(line.split(":")[1].strip() for line in f if line.startswith("VmHWM"))

    def stress(self, stopped):
        for i in range(40):
            os.makedirs(f"{self.tree}/d{i}/sub")
            for j in range(10):
                touch(f"{self.tree}/d{i}/old{j}")
        model, daemon = Model(self.tree), self.start()
        if stopped:
            daemon.signal(signal.SIGSTOP)
        began = time.monotonic()
        workers = []
        for seed in range(4):
            pid = os.fork()
            if pid == 0:
                work(self.tree, seed, STRESS_FILES // 4)
                os._exit(0)
            workers.append(pid)
        for pid in workers:
            self.assertEqual(os.waitpid(pid, 0)[1], 0)
        burst = time.monotonic() - began
        peak = self.peak_memory(daemon) if "STRESS_REPORT" in os.environ else ""
        self.assertEqual(daemon.stop(), 0)
        events = parse(daemon.raw())
        model.replay(events)
        differences = [] if model.lost else model.differences()
        if "STRESS_REPORT" in os.environ:
            u = daemon.usage
            print(f"\n{self.method} stopped={stopped}: files {STRESS_FILES}, lines {len(events)}, directories to look at "
                  f"{model.looks}, lost {model.lost}, burst {burst:.1f} s, daemon CPU {u.ru_utime:.2f}+{u.ru_stime:.2f} s, "
                  f"peak {peak}, differences {len(differences)}", file=sys.stderr)
        self.assertEqual(differences[:20], [])
        return model

    def test_stress_while_running(self):
        self.stress(stopped=False)

    def test_stress_while_stopped(self):
        self.stress(stopped=True)


def work(tree, seed, files):
    """Creates `files` files among directories that all workers rename; what another worker took away is skipped."""
    rng = random.Random(seed)
    dirs = [f"{tree}/d{i}" for i in range(40)] + [f"{tree}/d{i}/sub" for i in range(40)]
    mine = [f"{tree}/d{i}/old{j}" for i in range(seed, 40, 4) for j in range(10)]

    def attempt(action, *args):
        try:
            action(*args)
            return True
        except OSError as error:
            if error.errno not in (errno.ENOENT, errno.ENOTEMPTY, errno.EEXIST, errno.EINVAL, errno.ENOTDIR, errno.EISDIR):
                raise
            return False

    def create(path):
        fd = os.open(path, os.O_CREAT | os.O_WRONLY)
        os.write(fd, b"x")
        os.close(fd)

    def rescan():
        dirs[:] = [path for path, _, _ in os.walk(tree) if path != tree]

    def rename_directory():
        old = rng.choice(dirs)
        new = rng.choice((old + "_", old.rstrip("_"), f"{rng.choice(dirs)}/in{rng.randrange(5)}", f"{tree}/m{rng.randrange(20)}"))
        if attempt(os.rename, old, new):
            dirs.append(new)

    def new_directory():
        path = f"{rng.choice(dirs)}/n{seed}_{rng.randrange(10)}"
        if attempt(os.mkdir, path):
            attempt(create, path + "/f")
            attempt(os.rename, path, path + "x")
        else:
            attempt(shutil.rmtree, path + "x")

    for i in range(files):
        if i % 200 == 0:
            rescan()
        path = f"{rng.choice(dirs)}/f{seed}_{rng.randrange(files)}"
        if attempt(create, path):
            mine.append(path)
        what = rng.random()
        if what < 0.4 and mine:
            moved = f"{rng.choice(dirs)}/r{seed}_{i}"
            if attempt(os.rename, mine.pop(rng.randrange(len(mine))), moved):
                mine.append(moved)
        elif what < 0.7 and mine:
            attempt(os.unlink, mine.pop(rng.randrange(len(mine))))
        elif what < 0.71:
            rename_directory()
        elif what < 0.72:
            new_directory()


class InotifyTest(NotifydTest):
    method = "inotify"


class CommandLineTest(unittest.TestCase):
    def run_daemon(self, *args):
        return subprocess.run([DAEMON, *args], capture_output=True, text=True, timeout=DEADLINE)

    def test_bad_usage_and_failures(self):
        with tempfile.TemporaryDirectory() as scratch:
            missing = scratch + "/missing"
            for args in ((), ("--watch", scratch), ("--queue", "q"), ("--nonsense",),
                         ("--watch", scratch, "--queue", "q", "--method", "x"), ("--watch", scratch, "--queue", "q", "z")):
                self.assertEqual(self.run_daemon(*args).returncode, 2, args)
            for args in (("--watch", missing, "--queue", scratch + "/q"), ("--watch", scratch, "--queue", missing + "/q")):
                result = self.run_daemon(*args)
                self.assertEqual(result.returncode, 1)
                self.assertIn(missing, result.stderr)
        self.assertIn("--watch DIR", self.run_daemon("--help").stdout)


if __name__ == "__main__":
    unittest.main()
