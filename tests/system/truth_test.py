#!/usr/bin/env python3
"""Whatever happens to files and daemons: once all is quiet, disk and index agree. FILEINDEX_LONG gives it full length.

TRUTH_SEED     the first seed (1)
JUMPING_CLOCK  a library with which a daemon's clock is as many seconds ahead as the file CLOCK_OFFSET says
"""
import collections
import itertools
import os
import pathlib
import signal
import subprocess
import time
import unittest

import private_machine as machine
from random_files import Files

SEED, PATIENCE = int(os.environ.get("TRUTH_SEED", "1")), 60  # seconds
SEEDS, KILLS, MINUTES, MINUTE = (300, 50, 30, 60) if os.environ.get("FILEINDEX_LONG") else (2, 2, 2, 2)
SCRATCH, VOLUME, DOCS, LOG = (machine.SCRATCH + place for place in ("", "/v", "/v/docs", "/log"))
DAEMONS = {"VEXOELASTICD": ["--foreground", "--data", SCRATCH + "/engine"], "FILEINDEXD": ["--foreground"], "VEXONOTIFYD": ["--foreground"]}


class TruthTest(unittest.TestCase):
    def restart(self, name, *more, **environment):
        if name in self.daemons:
            self.daemons[name].kill()
            self.daemons[name].wait()
        self.daemons[name] = subprocess.Popen([os.environ[name], *DAEMONS[name], *more], stderr=self.log, env={**os.environ, **environment})

    def setUp(self):
        self.addCleanup(subprocess.run, f"umount -lq {DOCS}; umount -lq {VOLUME}; umount -lq {SCRATCH}/disk", shell=True)
        subprocess.run(f"rm -rf {SCRATCH}/* /var/lib/vexo* /var/packages /run/*.sock; mkdir -p {VOLUME} {SCRATCH}/disk; mount -t "
                       f"tmpfs -o size=160m v {VOLUME}; mkdir -p {DOCS} {VOLUME}/outside {SCRATCH}/engine", shell=True, check=True)
        machine.write("/etc/vexo/shares.conf", "[docs]\npath = %s\n" % DOCS)
        self.log, self.daemons = self.enterContext(open(LOG, "w")), {}
        for name in DAEMONS:
            self.restart(name)
            self.addCleanup(lambda name=name: (self.daemons[name].kill(), self.daemons[name].wait()))
        subprocess.run("until [ -S /run/vexoelasticd.sock -a -S /run/fileindexd.sock ]; do sleep 0.01; done", shell=True, check=True)
        self.assertEqual(machine.ctl("folder", "add", "/docs", "--name", "docs")[0], 0)

    def expect_truth(self, files, seed):
        """Waits for quiet. A change through one name of a file is not seen at its other names: a repair finds it."""
        is_linked = lambda path: os.path.lexists(os.fsencode(path)) and os.lstat(os.fsencode(path)).st_ino in files.linked
        end, left = time.monotonic() + PATIENCE, True
        while left:
            status, lines = machine.ctl("audit", "docs", "--wait", str(PATIENCE))
            left = "differences" not in lines[-1] or "pending" in lines[-1] or [line for line in lines[:-1] if not is_linked(line["path"])]
            self.assertLess(time.monotonic(), end, (seed, lines, pathlib.Path(LOG).read_bytes()[-5000:]))
        self.assertEqual(status and machine.ctl("audit", "docs", "--repair")[0], 0, seed)
        holders = collections.defaultdict(set, {word: set() for word in files.words[:20]})  # some are no more
        for path in map(os.fsdecode, filter(os.path.isfile, files.paths())):
            for word in set() if os.path.islink(path) else set(pathlib.Path(path).read_text().split()) & set(files.words):
                holders[word].add(path)
        for word, paths in holders.items():
            hits = {hit["path"] for hit in machine.ctl("search", word)[1]}
            self.assertEqual(set(itertools.filterfalse(is_linked, hits ^ paths)), set(), (seed, word))

    def test_operations_drained_in_random_portions(self):
        for seed in range(SEED, SEED + SEEDS):
            files, stopped = Files(DOCS, VOLUME + "/outside", seed), []
            for _ in range(25):
                files.step(files.rng.randrange(12))
                if not stopped and files.rng.random() < 0.3:
                    workers = map(int, subprocess.getoutput("pgrep -P %d" % self.daemons["FILEINDEXD"].pid).split())
                    stopped.append(files.rng.choice([self.daemons["VEXONOTIFYD"].pid, *workers]))
                    os.kill(stopped[0], signal.SIGSTOP)
                files.step(files.rng.randrange(6))
                time.sleep(max(0, files.rng.random() * 0.6 - 0.4))
                while stopped and files.rng.random() < 0.7:
                    os.kill(stopped.pop(), signal.SIGCONT)
            for pid in stopped:
                os.kill(pid, signal.SIGCONT)
            self.expect_truth(files, seed)

    def test_each_daemon_killed_at_random_moments(self):
        for seed in range(SEED, SEED + KILLS):
            files = Files(DOCS, VOLUME + "/outside", -seed, alike=False)
            for name in files.rng.sample(list(DAEMONS), len(DAEMONS)):
                files.step(files.rng.randrange(120))
                time.sleep(files.rng.random() * 0.5)
                files.step()
                self.restart(name)
                files.step()
            self.expect_truth(files, -seed)

    def test_folders_paused_and_resumed_at_random_moments(self):
        folders = ["/a", "/a/dir", "/dir", "/dir/g"]
        os.makedirs(DOCS + "/a/dir"), os.makedirs(DOCS + "/dir/g")
        self.assertEqual(machine.ctl("folder", "add", *("/docs" + folder for folder in folders))[0], 0)
        linked = set()
        for seed in range(SEED, SEED + KILLS):
            files = Files(DOCS, VOLUME + "/outside", seed, alike=False)
            files.linked = linked  # also those of the seeds before
            for _ in range(12):
                files.step(files.rng.randrange(60))
                machine.ctl("folder", files.rng.choice(["pause", "pause", "resume"]), "/docs" + files.rng.choice(folders))
                files.step(files.rng.randrange(20))
                if files.rng.random() < 0.2:
                    self.restart("FILEINDEXD")
                time.sleep(files.rng.random() * 0.4)
            for folder in folders:
                self.assertEqual(machine.ctl("folder", "resume", "/docs" + folder)[0], 0)
            self.expect_truth(files, "pauses %d" % seed)

    def test_files_that_change_all_the_time_but_for_a_moment_each_minute(self):
        files = Files(DOCS, VOLUME + "/outside", SEED, alike=False)
        for minute in range(MINUTES):
            end = time.monotonic() + MINUTE
            while time.monotonic() < end:
                files.step(files.rng.randrange(10))
                time.sleep(files.rng.random() * 0.3)
            self.expect_truth(files, "minute %d" % minute)

    def test_a_clock_that_jumps(self):
        """The daemons' own: the file system's goes on."""
        for name in DAEMONS:
            self.restart(name, LD_PRELOAD=os.environ["JUMPING_CLOCK"], CLOCK_OFFSET=SCRATCH + "/clock")
        for seed in range(SEED, SEED + KILLS):
            files = Files(DOCS, VOLUME + "/outside", seed, alike=False)
            for seconds in 3600, -3 * 86400, 0, -10 ** 9, 3 * 10 ** 8, -1:
                machine.write(SCRATCH + "/clock", str(seconds))
                files.step(files.rng.randrange(40))
                time.sleep(files.rng.random() * 0.4)
            self.expect_truth(files, "clock %d" % seed)

    def test_a_full_disk_an_overflowing_kernel_queue_and_a_disk_that_comes_and_goes(self):
        files = Files(DOCS, VOLUME + "/outside", SEED, alike=False)
        files.step(60)
        subprocess.run(["cp", "/dev/zero", VOLUME + "/big"], stderr=subprocess.DEVNULL)
        files.step(60)
        time.sleep(2)
        os.unlink(VOLUME + "/big")
        self.expect_truth(files, "full disk")

        self.restart("VEXONOTIFYD", "--limited-queue")
        self.expect_truth(files, "limited queue")
        self.daemons["VEXONOTIFYD"].send_signal(signal.SIGSTOP)
        list(map(lambda path: (os.mknod(path), os.unlink(path)), (DOCS + "/%d" % n for n in range(9000))))
        files.step(60)
        self.daemons["VEXONOTIFYD"].send_signal(signal.SIGCONT)
        self.expect_truth(files, "overflow")

        subprocess.run(f"mount -t tmpfs disk {SCRATCH}/disk; cp -a {DOCS}/. {SCRATCH}/disk; rm -r {DOCS}/*; mount --bind {SCRATCH}/disk "
                       f"{DOCS}", shell=True, check=True)
        self.restart("VEXONOTIFYD")
        files.write(DOCS + "/kept.txt")
        self.expect_truth(files, "on its own disk")
        subprocess.run(["umount", "-l", DOCS], check=True)
        self.restart("VEXONOTIFYD")
        time.sleep(2)
        self.assertEqual(len(machine.ctl("search", files.words[-1])[1]), 1, "what is on a disk that is away is not deleted")
        subprocess.run(["mount", "--bind", SCRATCH + "/disk", DOCS], check=True)
        self.restart("VEXONOTIFYD")
        files.step(60)
        self.expect_truth(files, "its disk is back")


if __name__ == "__main__":
    machine.enter()
    print("seed %d" % SEED)
    unittest.main()
