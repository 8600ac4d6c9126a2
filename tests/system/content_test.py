#!/usr/bin/env python3
"""Files that end, hang or bloat whoever reads them, and a reader that is not there, with the real daemons."""
import os
import pathlib
import shutil
import subprocess
import time
import unittest

import private_machine as machine

VOLUME = pathlib.Path(machine.SCRATCH, "v")
DOCS, LOG = VOLUME / "docs", pathlib.Path(machine.SCRATCH, "log")
READER = os.environ["FILEINDEX_BUILD_DIR"] + "/src/fileindex/vexocontentextract"
FAULTY = os.environ["TEST_PROGRAMS"] + "/faulty_reader"


def explain(name):
    return machine.ctl("explain", str(DOCS / name))[1][0]


def contents():
    return [finding for finding in machine.ctl("doctor")[1] if finding["check"] == "contents"]


class ContentTest(unittest.TestCase):
    def until(self, true, what):
        end = time.monotonic() + 60
        while not true():
            self.assertLess(time.monotonic(), end, (what(), LOG.read_text()[-3000:]))
            time.sleep(0.05)

    def start(self, name):
        process = subprocess.Popen([os.environ[name], "--foreground"], stderr=self.log)
        self.addCleanup(lambda: (process.kill(), process.wait()))

    def until_failed(self, name, reason):
        self.until(lambda: (explain(name)["failure"] or {}).get("reason", "").endswith(reason), lambda: explain(name))
        return explain(name)

    def until_found(self, word, *names):
        hits = lambda: sorted(os.path.basename(hit["path"]) for hit in machine.ctl("search", word)[1])
        self.until(lambda: hits() == sorted(names), hits)

    def replace_reader(self, source):
        subprocess.run(["mount", "--bind", source, READER], check=True)
        self.addCleanup(subprocess.run, ["umount", "-l", READER], check=True)

    def setUp(self):
        subprocess.run("rm -rf /run/*.sock /var/lib/vexo* /var/packages", shell=True, check=True)
        shutil.rmtree(VOLUME, ignore_errors=True)
        os.makedirs(DOCS)
        machine.write("/etc/vexo/shares.conf", "[docs]\npath = %s\n" % DOCS)
        self.log = self.enterContext(open(LOG, "w"))

    def start_all(self):
        for name in ("VEXOELASTICD", "FILEINDEXD", "VEXONOTIFYD"):
            self.start(name)
        self.until(lambda: "error" not in machine.ctl("folder", "add", "/docs")[1][0], lambda: "folder add")

    def test_a_file_that_ends_its_reader_is_found_by_its_name_and_not_tried_again(self):
        self.replace_reader(FAULTY)
        (DOCS / "bad.crash").write_bytes(b"\xfcbel alpha")
        (DOCS / "good").write_bytes(b"\xfcbel alpha")
        self.start_all()
        self.until_found("alpha", "good")
        failed = self.until_failed("bad.crash", "reason=the file's reader was ended by signal 11 (x-crash)")
        self.assertEqual((failed["indexed"], failed["failure"]["next_try"]), (True, None))
        (DOCS / "more").write_bytes(b"\xfcbel alpha")
        self.until_found("alpha", "good", "more")
        self.assertEqual(LOG.read_text().count("signal 11"), 1)
        os.rename(DOCS / "bad.crash", DOCS / "bad.txt")  # its reader can do with it
        self.until_found("alpha", "good", "more", "bad.txt")

    def test_without_a_reader_plain_text_is_read_and_the_rest_later(self):
        machine.write(machine.SCRATCH + "/nothing")
        self.replace_reader(machine.SCRATCH + "/nothing")
        (DOCS / "latin").write_bytes(b"\xfcbel alpha")
        machine.write(str(DOCS / "plain"), "alpha")
        self.start_all()
        self.until_found("alpha", "plain")
        failed = self.until_failed("latin", "cannot be started: Permission denied")
        self.assertTrue(failed["failure"]["next_try"])
        [finding] = contents()
        self.assertFalse(finding["ok"])
        self.assertIn("only plain text is read: the reader of files " + READER, finding["finding"])

    def test_on_this_machine_readers_are_kept_in(self):
        self.assertTrue(contents()[0]["ok"], contents())


if __name__ == "__main__":
    machine.enter()
    unittest.main()
