#!/usr/bin/env python3
"""The life of a share, as it is typed, with the real daemons VEXOELASTICD, VEXONOTIFYD and FILEINDEXD."""
import os
import pathlib
import signal
import subprocess
import time
import unittest

import private_machine as machine

VOLUME, LOG, ENGINE = (pathlib.Path(machine.SCRATCH, name) for name in ("v", "log", "engine"))
PLACES = (VOLUME, "@fileindex/*"), (pathlib.Path("/var/lib/vexonotifyd"), "*"), (ENGINE, "indexes/*")


def left():
    """What stands beside the shares, with the monitor configurations and the engine's indexes."""
    return [found.name for place, names in PLACES for found in place.glob(names)]


def name_share(name):
    machine.write("/etc/vexo/shares.conf", "[%s]\npath = %s/%s\n" % (name, VOLUME, name))


class ShareLifeTest(unittest.TestCase):
    def do(self, *commands):
        for command in commands:
            self.assertEqual(machine.ctl(*command.split())[0], 0, LOG.read_text()[-3000:])

    def until(self, expected, look):
        end = time.monotonic() + 30
        while (seen := look()) != expected:
            self.assertLess(time.monotonic(), end, (expected, seen, LOG.read_text()[-3000:]))
            time.sleep(0.05)

    def until_found(self, share, *names):
        hits = lambda: {hit["path"] for hit in machine.ctl("search", "--limit=99", "alpha")[1]}
        self.until({"%s/%s/%s" % (VOLUME, share, name) for name in names}, hits)

    def move(self, old, new):
        os.rename(VOLUME / old, VOLUME / new)
        name_share(new)
        self.do("share rename %s %s" % (old, new))

    def start(self, name, *arguments):
        self.daemons[name] = subprocess.Popen([os.environ[name], "--foreground", *arguments], stderr=self.log)

    def kill_worker(self):
        self.daemons["FILEINDEXD"].kill() or self.daemons["FILEINDEXD"].wait()
        self.start("FILEINDEXD")

    def folder(self, path):
        record = machine.ctl("folder", "get", path)[1][0]
        return record["paused"], record.get("resume_time")

    def setUp(self):
        subprocess.run("rm -rf %s %s /run/*.sock /var/lib/vexo* /var/packages" % (VOLUME, ENGINE), shell=True, check=True)
        for name in ("top.txt", "in/in.txt", "in/pic.jpg"):
            machine.write(VOLUME / "docs" / name, "alpha")
        name_share("docs")
        self.log, self.daemons = self.enterContext(open(LOG, "w")), {}
        for name, *arguments in ("VEXOELASTICD", "--data", ENGINE), ("VEXONOTIFYD",), ("FILEINDEXD",):
            self.start(name, *arguments)
            self.addCleanup(lambda name=name: (self.daemons[name].terminate(), self.daemons[name].wait()))

    def test_searches_follow_a_share_from_its_first_folder_to_its_last(self):
        self.do("folder add /docs --types document", "folder add /docs/in --types none")
        self.until_found("docs", "top.txt")
        self.do("pause", "folder set /docs/in --types document,photo")  # still to be done when the share is renamed
        self.move("docs", "papers")
        self.do("resume")
        self.until_found("papers", "top.txt", "in/in.txt", "in/pic.jpg")
        machine.write(VOLUME / "papers/late.txt", "alpha")
        self.until_found("papers", "top.txt", "late.txt", "in/in.txt", "in/pic.jpg")
        self.do("share pause papers")
        self.assertEqual(machine.ctl("search", "alpha"), (0, []))
        (VOLUME / "papers/late.txt").unlink()
        self.move("papers", "docs")
        self.move("docs", "notes")
        self.do("share resume notes")
        self.until_found("notes", "top.txt", "in/in.txt", "in/pic.jpg")
        self.assertNotIn("made anew", LOG.read_text())
        self.do("folder delete /notes/in")
        self.until_found("notes", "top.txt", "in/in.txt")
        self.do("share auto-clean notes")
        self.assertEqual((left(), machine.ctl("search", "alpha")), ([], (0, [])))
        self.do("share rebuild notes")
        self.until_found("notes", "top.txt", "in/in.txt")
        self.do("share clear-paused notes %s/notes" % VOLUME)  # which was not paused
        self.until([], left)

    def test_a_folder_is_left_alone_while_it_is_paused_and_agrees_with_the_disk_afterwards(self):
        docs = VOLUME / "docs"
        for name in ("in/deep/d.txt", "in/out.txt", "in/was.txt", "dir/f.txt", "in/both/b.txt"):
            machine.write(docs / name, "alpha")
        self.do("folder add /docs --types document", "folder add /docs/in", "folder add /docs/in/deep")
        others, deep = {"dir/f.txt", "in/both/b.txt"}, {"in/deep/d.txt", "in/deep/late.txt"}
        before = {"in/in.txt", "in/pic.jpg", "in/out.txt", "in/was.txt"}
        self.until_found("docs", "top.txt", "in/deep/d.txt", *before, *others)
        self.do("folder pause /docs/in")
        explain = lambda path: machine.ctl("explain", str(docs / path))[1][0]["paused"]
        self.assertEqual([explain(path) for path in ("in/in.txt", "in/deep/d.txt", "top.txt")], [True, False, False])
        (docs / "in/in.txt").write_text("ahpla")  # in the second in which it was read, and as long
        (docs / "in/was.txt").unlink()
        os.rename(docs / "top.txt", docs / "in/top.txt")
        os.rename(docs / "in/out.txt", docs / "out.txt")
        os.rename(docs / "dir", docs / "in/dir")
        os.rename(docs / "in/both", docs / "in/deep/both")
        for name in ("late.txt", "in/late.txt", "in/deep/late.txt"):
            machine.write(docs / name, "alpha")
        stale = {"late.txt", "out.txt", "in/both/b.txt", "in/deep/both/b.txt", *before, *deep}
        self.until_found("docs", *stale)
        self.kill_worker()
        self.assertEqual(machine.ctl("audit", "docs", "--wait", "30")[0], 0, LOG.read_text()[-3000:])
        status = machine.ctl("status")[1][0]
        self.assertEqual((status["state"], [folder["status"] for folder in status["folders"]]), ("current", ["finished", "paused", "finished"]))
        self.do("folder set /docs/in --types document", "folder reindex /docs/in")
        machine.write(docs / "late2.txt", "alpha")
        self.until_found("docs", "late2.txt", *stale)
        self.do("folder resume /docs/in")
        now = {"late.txt", "late2.txt", "out.txt", "in/late.txt", "in/top.txt", "in/dir/f.txt", "in/deep/both/b.txt", *deep}
        self.until_found("docs", *now)
        self.assertEqual(machine.ctl("audit", "docs", "--wait", "30")[0], 0)

        end = int(time.time()) + 6
        self.do('call FolderPause "/docs/in" %d' % end)
        machine.write(docs / "in/last.txt", "alpha")
        machine.write(docs / "last.txt", "alpha")
        self.until_found("docs", "last.txt", *now)
        self.assertEqual(self.folder("/docs/in"), (True, end))
        self.kill_worker()
        self.until_found("docs", "last.txt", "in/last.txt", *now)
        self.assertGreaterEqual(time.time(), end)
        self.assertEqual(self.folder("/docs/in"), (False, None))

        self.do("folder pause /docs/in")
        machine.write(docs / "in/more.txt", "alpha")
        self.move("docs", "papers")
        self.until_found("papers", "last.txt", "in/last.txt", *now)
        self.assertEqual(self.folder("/papers/in"), (True, 0))
        self.do("folder delete /papers/in")
        self.until_found("papers", "in/more.txt", "last.txt", "in/last.txt", *now)

    def test_the_only_folder_of_a_share_is_paused_in_the_middle_of_a_long_pass(self):
        for number in range(6000):
            machine.write(VOLUME / "docs/in" / ("%d.txt" % number), "many words %d" % number)
        self.do("folder add /docs")
        documents = lambda: machine.ctl("status")[1][0]["documents"] or 0
        time.sleep(0.5)
        self.daemons["VEXOELASTICD"].send_signal(signal.SIGSTOP)  # or else all of them may be done
        self.do("folder pause /docs")
        self.daemons["VEXOELASTICD"].send_signal(signal.SIGCONT)
        self.until("current", lambda: machine.ctl("status")[1][0]["state"])
        first = documents()
        self.assertLess(first, 6000)
        wrong = [finding for finding in machine.ctl("doctor")[1] if finding["check"] in ("index", "monitor") and not finding["ok"]]
        self.assertEqual(wrong, [])
        machine.write(VOLUME / "docs/new.txt", "alpha")
        self.kill_worker()
        self.until(False, lambda: list(PLACES[0][0].glob("@fileindex/docs/queue*")) != [])
        self.assertEqual(documents(), first)
        self.do("folder resume /docs")
        self.until(6006, documents)
        self.do("folder pause /docs", "share pause docs")
        self.assertEqual(machine.ctl("folder", "resume", "/docs")[0], 1)
        self.do("share resume docs")
        self.assertEqual(self.folder("/docs"), (False, None))

    def test_a_folder_deleted_while_it_is_indexed_leaves_nothing_behind(self):
        for number in range(2000):
            machine.write(VOLUME / "docs" / ("%d.txt" % number), "beta")
        for seconds in 0.25, 0.4:
            for command, pause in ("folder add /docs", seconds), ("folder delete /docs", 0.5):
                self.do(command)
                time.sleep(pause)
            self.until([], left)


if __name__ == "__main__":
    machine.enter()
    unittest.main()
