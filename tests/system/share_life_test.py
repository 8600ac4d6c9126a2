#!/usr/bin/env python3
"""The life of a share, as it is typed, with the real daemons VEXOELASTICD, VEXONOTIFYD and FILEINDEXD."""
import os
import pathlib
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
        hits = lambda: {hit["path"] for hit in machine.ctl("search", "alpha")[1]}
        self.until({"%s/%s/%s" % (VOLUME, share, name) for name in names}, hits)

    def move(self, old, new):
        os.rename(VOLUME / old, VOLUME / new)
        name_share(new)
        self.do("share rename %s %s" % (old, new))

    def setUp(self):
        for name in ("top.txt", "in/in.txt", "in/pic.jpg"):
            machine.write(VOLUME / "docs" / name, "alpha")
        name_share("docs")
        log = self.enterContext(open(LOG, "w"))
        for name, *arguments in ("VEXOELASTICD", "--data", ENGINE), ("VEXONOTIFYD",), ("FILEINDEXD",):
            process = subprocess.Popen([os.environ[name], "--foreground", *arguments], stderr=log)
            self.addCleanup(lambda process=process: (process.terminate(), process.wait()))
        self.addCleanup(subprocess.run, ["rm", "-rf", VOLUME, ENGINE], check=True)

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
