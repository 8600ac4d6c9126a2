#!/usr/bin/env python3
"""What `fileindexctl status` says, from what workers, queues and people have left behind and of real daemons."""
import json
import os
import pathlib
import pty
import select
import shutil
import subprocess
import time
import unittest

import private_machine as machine

CTL = os.environ["FILEINDEXCTL"]

ETC, VOLUME = pathlib.Path("/var/packages/Quarrox/etc"), pathlib.Path(machine.SCRATCH, "v")


def status():
    return {line["share"]: line for line in machine.ctl("status")[1]}


class StatusTest(unittest.TestCase):
    def start(self, *command, stdout=subprocess.DEVNULL):
        process = subprocess.Popen(command, stdout=stdout, stderr=subprocess.DEVNULL)
        self.addCleanup(lambda: (process.kill(), process.wait()))
        return process

    def follow(self, *options, **streams):
        return self.start(os.environ["FILEINDEXCTL"], "status", "--follow", *options, **streams)

    def folders(self, *paths):
        kinds = dict.fromkeys(("document", "audio", "video", "photo"), True)
        records = [{"path": path, "name": path, "paused": path == "/paused", **kinds} for path in paths]
        machine.write(ETC / "fileindex.folders", json.dumps(records))

    # What the worker of docs tells: of 1,000 documents 250 in ten seconds, but for what is given.
    def tell(self, **progress):
        working = {"state": "working", "pid": self.worker.pid, "since": 100, "updated": 110, "done": 250, "left": 750}
        machine.write(VOLUME / "@fileindex/docs/new", json.dumps({**working, **progress}))
        os.rename(VOLUME / "@fileindex/docs/new", VOLUME / "@fileindex/docs/progress")

    def setUp(self):
        for place in (VOLUME, ETC, machine.SCRATCH + "/engine"):
            shutil.rmtree(place, ignore_errors=True)
        shares = ["docs", "photos", "paused", "shut"]
        config = "".join("[%s]\npath = %s/%s\n" % (share, VOLUME, share) for share in shares)
        machine.write("/etc/vexo/shares.conf", config + "read only = yes\n")
        list(map(os.makedirs, (VOLUME / share for share in shares)))
        shutil.copy(shutil.which("sleep"), machine.SCRATCH + "/fileindexd")  # bears the worker's name
        self.worker = self.start(machine.SCRATCH + "/fileindexd", "1000")

    def test_each_share_says_what_keeps_it_and_one_that_is_gone_keeps_no_other(self):
        self.folders("/docs", "/paused", "/shut", "/gone")
        says = lambda *keys: [status()["docs"][key] for key in keys]
        self.assertEqual([share["state"] for share in status().values()], ["outdated", "blocked", "paused", "blocked"])
        self.assertIn("share rebuild docs", *says("reason"))
        os.makedirs(VOLUME / "@fileindex/docs/db")
        self.assertEqual(says("state"), ["current"])
        self.tell(failed=5)
        self.assertEqual(says("state", "rate", "seconds_left", "failed"), ["working", 25, 31, 5])
        self.tell(pid=os.getpid())
        self.assertEqual(says("state"), ["current"])  # another process has the number now
        machine.write(ETC / "fileindex.status", '{"resume_time": 0}')
        self.assertEqual(says("reason"), ["paused without end"])
        self.worker.kill() or self.worker.wait()
        machine.write(ETC / "fileindex.status", '{"share": {"docs": 3}}')
        self.assertIn("rebuild", says("reason")[0])
        machine.write(VOLUME / "@fileindex/docs/queue", "four")
        self.assertEqual(says("state", "reason", "queue_bytes"), ["waiting", "fileindexd is not running", 4])

    def test_a_terminal_shows_one_block_in_its_place_and_anything_else_some_lines(self):
        self.folders("/docs")
        self.tell()
        terminal, inner = pty.openpty()
        drawing, log, seen = self.follow("--until-idle", stdout=inner), self.follow(stdout=subprocess.PIPE), ""
        for done in range(250, 501, 10):
            time.sleep(0.1) or self.tell(done=done, left=1000 - done)
        bar = "docs  [%s]  %s of 1,000 documents, %d a second, %d s left\x1b[K\r\n\x1b[J\x1b[?7h"
        while bar % ("#" * 12 + "." * 12, "50 %, 500", 50, 11) not in seen:
            self.assertTrue(select.select([terminal], [], [], 5)[0], seen)
            seen += os.read(terminal, 65536).decode()
        self.assertIn(bar % ("#" * 6 + "." * 18, "25 %, 250", 25, 31) + "\x1b[?7l\x1b[3A\r", seen)  # with one on each daemon that is missing
        self.tell(state="waiting", reason="No room", since=int(time.time()) - 61)
        self.assertEqual(drawing.wait(10), 1)
        self.assertLessEqual(len(list(iter(log.stdout.readline, b"docs: waiting: No room\n"))), 4)  # one a second

    def test_the_documents_of_real_daemons_are_counted(self):
        for number in range(3000):
            machine.write("%s/photos/%d/%d.txt" % (VOLUME, number % 30, number), "many words")
        self.start(os.environ["VEXOELASTICD"], "--foreground", "--data", machine.SCRATCH + "/engine")
        self.start(os.environ["FILEINDEXD"], "--foreground")
        self.assertEqual(machine.ctl("folder", "add", "/photos", "/docs")[0], 0)
        states = set()
        while "current" not in states:
            states.add(status()["photos"]["state"])
        self.assertIn("working", states)
        self.assertEqual(self.follow("--until-idle").wait(60), 0)
        self.assertEqual([share["state"] for share in status().values()], ["current", "current"])
        self.assertEqual([share["documents"] for share in status().values()], [1, 3031])
        figures = dict(line.rsplit(" ", 1) for line in subprocess.check_output([CTL, "metrics"], text=True).splitlines() if not line.startswith("#"))
        for name, value in [("documents{share=\"photos\"}", 3031), ("share_state{share=\"docs\",state=\"current\"}", 1),
                            ("failures{share=\"docs\",reason=\"not_readable\"}", 0), ("up{daemon=\"vexoelasticd\"}", 1),
                            ("queue_bytes{share=\"docs\"}", 0)]:
            self.assertEqual(float(figures["fileindex_" + name]), value, name)
        self.assertGreater(sum(float(value) for name, value in figures.items() if "operations_total" in name), 0, figures)
        self.assertGreater(float(figures["fileindex_index_bytes{share=\"photos\"}"]), 100000)
        text = machine.SCRATCH + "/fileindex.prom"
        subprocess.check_call([CTL, "metrics", "--textfile", text])
        self.assertEqual(subprocess.getoutput("grep -c '^# HELP' %s" % text), "10")


if __name__ == "__main__":
    machine.enter()
    unittest.main()
