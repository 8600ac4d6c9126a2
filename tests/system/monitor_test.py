#!/usr/bin/env python3
"""The notification daemon VEXONOTIFYD as it serves monitor configurations, in a private machine."""
import json
import os
import pathlib
import socket
import subprocess
import time
import unittest

import private_machine as machine
from notifyd_test import CREATED, DAEMON, DELETED, LOST, RENAMED, parse, touch

CONFIGS, LOG, DISKS = "/var/lib/vexonotifyd/", pathlib.Path(machine.SCRATCH, "log"), machine.SCRATCH + "/disks"
# All are reached through a symbolic link.
VOLUME, DOCS, SUB, PHOTOS, DISK, LATE = (
    machine.SCRATCH + "/v" + name for name in ("", "/docs", "/docs/sub", "/photos", "/disk", "/late/deep"))


class MonitorTest(unittest.TestCase):
    method = "fanotify"

    def setUp(self):
        if self.method == "fanotify" and "4294967295" not in pathlib.Path("/proc/self/uid_map").read_text():
            self.skipTest("fanotify needs root")
        self.addCleanup(subprocess.run, f"umount -q {DISK}; rm -rf {DISKS} {CONFIGS}", shell=True, check=True)
        for path in CONFIGS, *(f"{DISKS}/{name}" for name in ("@fileindex", "docs/skip/d", "docs/sub", "photos", "disk")):
            os.makedirs(path)
        self.queue = {name: pathlib.Path(VOLUME, "@fileindex", name) for name in ("docs", "photos", "other", "late")}

    def configure(self, name, *folders, mask=65484, ignore=("@eaDir",)):
        config = [{"path": path, "mask": mask, "ignore": ignore} for path in folders]
        machine.write(CONFIGS + "new", json.dumps({"queue": str(self.queue[name]), "config": config}))
        os.rename(CONFIGS + "new", f"{CONFIGS}{name}.json")

    def start(self):
        with socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM) as ready, open(LOG, "w") as log:
            ready.bind(VOLUME + "/ready")
            ready.settimeout(20)
            os.environ["NOTIFY_SOCKET"] = VOLUME + "/ready"
            self.daemon = subprocess.Popen([DAEMON, "--foreground", "--method", self.method], stderr=log)
            self.addCleanup(lambda: self.daemon.kill() or self.daemon.wait())
            self.assertEqual(ready.recv(99), b"READY=1")

    def lines(self, name):
        """The queue's lines without repetitions, of which one method has more than the other."""
        return list(dict.fromkeys(parse(self.queue[name].read_bytes()))) if self.queue[name].exists() else []

    def until(self, condition):
        end = time.monotonic() + 20
        while not condition():
            self.assertLess(time.monotonic(), end, LOG.read_text())
            time.sleep(0.005)

    def until_heard(self, name, path):
        self.until(lambda: touch(path) or path in [line[1] for line in self.lines(name)])

    def expect(self, name, *wanted):
        """Waits until the queue has these lines, and forgets them: (bit, path, old path), "/" ends a directory."""
        lines = [(bit, path.rstrip("/"), old[0] if old else None, path.endswith("/")) for bit, path, *old in wanted]
        self.until(lambda: set(lines) <= set(self.lines(name)))
        self.assertEqual(self.lines(name), lines)
        self.queue[name].unlink()

    def test_it_tells_how_each_folder_is_heard_and_is_the_only_one(self):
        self.configure("docs", DOCS)
        self.start()
        told = lambda: json.loads(pathlib.Path("/run/vexonotifyd.status").read_text())
        self.assertEqual((told()["pid"], told()["folders"][DOCS]["method"]), (self.daemon.pid, self.method))
        self.assertAlmostEqual(told()["folders"][DOCS]["since"], time.time(), delta=60)
        self.configure("photos", PHOTOS)
        self.until(lambda: told()["folders"].get(PHOTOS, {}).get("method") == self.method)
        self.assertEqual(subprocess.run([DAEMON], stderr=subprocess.DEVNULL, timeout=20).returncode, 1)
        self.daemon.terminate() or self.daemon.wait()
        self.assertFalse(os.path.exists("/run/vexonotifyd.status"))

    def test_a_folder_that_stays_misses_nothing_while_configurations_come_and_go(self):
        self.configure("docs", DOCS)
        self.start()
        writer = subprocess.Popen(["sh", "-c", "for i in $(seq 1500); do : > $i; : > sub/$i; sleep 0; done"], cwd=DOCS)
        for turn in range(11):
            self.configure("docs", DOCS, *[SUB][turn % 2:])
            self.configure("other", SUB, ignore=["x"] * (turn % 3))
            self.configure("photos", PHOTOS)
            self.until_heard("photos", f"{PHOTOS}/{turn}")
            os.unlink(CONFIGS + ("photos.json", "other.json")[turn % 2])
        self.configure("late", PHOTOS)
        self.until_heard("late", PHOTOS + "/late")
        touch(PHOTOS + "/unheard")
        writer.wait()
        os.mknod(SUB + "/once")
        self.daemon.terminate()
        self.assertEqual(self.daemon.wait(), 0)
        self.assertEqual({str(p) for p in pathlib.Path(DOCS).rglob("[0-9]*")} - {line[1] for line in self.lines("docs")}, set())
        for text, counts in ("sub/once", [1, 0, 1]), ("unheard", [0, 0, 0]):
            self.assertEqual([self.queue[name].read_text().count(text) for name in ("docs", "photos", "other")], counts)
        self.assertEqual(self.queue["docs"].read_text().count('"event":512'), 1)
        self.assertIn((CREATED, SUB, None, True), self.lines("docs"))  # it joined: before it was watched it may have changed
        for name, root in ("photos", PHOTOS), ("other", SUB):
            self.assertIn((LOST, root, None, False), self.lines(name))

    def test_masks_and_ignored_names_hold_for_each_queue_until_a_good_configuration_comes(self):
        self.queue["other"] = pathlib.Path(DOCS, "queue")
        self.configure("docs", VOLUME, SUB, ignore=["skip"])
        self.configure("other", VOLUME, mask=CREATED, ignore=[])
        machine.write(CONFIGS + "photos.json", '{"queue": "photos"}')
        self.start()
        machine.write(CONFIGS + "docs.json", "{")
        self.configure("photos", PHOTOS)
        self.expect("photos", (LOST, PHOTOS))
        for old, new in ("skip/d", "sub/d"), ("sub/d", "sub/e"), ("sub/e", "skip/e"):
            os.rename(f"{DOCS}/{old}", f"{DOCS}/{new}")
            time.sleep(0.1)  # or else only what came of it may be written
        os.mknod(DOCS + "/skip/e/a")
        self.expect("other", (LOST, VOLUME), (CREATED, DOCS + "/skip/e/a"))
        self.expect("docs", (LOST, VOLUME), (CREATED, SUB + "/d/"), (RENAMED, SUB + "/e/", SUB + "/d"), (DELETED, SUB + "/e/"))
        self.assertEqual([LOG.read_text().count(why) for why in ("no absolute path", "not JSON; what it said before")], [1, 1])
        switches = lambda: pathlib.Path(f"/proc/{self.daemon.pid}/status").read_text().split("voluntary_ctxt_switches")[1]
        self.until(lambda: switches() == (time.sleep(1), switches())[1])  # it rests, though it wrote where it watches

    def test_folders_that_come_and_go_are_watched_as_soon_as_they_are_there(self):
        self.start()
        self.configure("docs", LATE, DISK)
        self.configure("other", VOLUME)
        self.expect("docs", (LOST, LATE))
        self.until_heard("other", DISK + "/a")
        for turn, first in ("1", CREATED), ("2", LOST):
            os.makedirs(LATE)
            self.until_heard("docs", LATE + "/a")
            os.rename(VOLUME + "/late", VOLUME + "/gone" + turn)
            bits = lambda: {line[0] for line in self.lines("docs") if line[1] == LATE}
            self.until(lambda: bits() >= {first, DELETED})
            self.assertLessEqual(bits(), {CREATED, first, DELETED})
            subprocess.run(["mount", "-t", "tmpfs", "disk", DISK], check=True)
            self.until_heard("docs", DISK + "/on" + turn)
            self.until_heard("other", DISK + "/on" + turn)
            self.assertIn((LOST, DISK, None, False), self.lines("docs"))
            self.until(lambda: subprocess.run(["umount", DISK], stderr=subprocess.DEVNULL).returncode == 0)
            self.until_heard("docs", DISK + "/off" + turn)
            self.queue["docs"].unlink()


class InotifyTest(MonitorTest):
    method = "inotify"


if __name__ == "__main__":
    machine.enter()
    os.symlink(DISKS, VOLUME)
    unittest.main()
