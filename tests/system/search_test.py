#!/usr/bin/env python3
"""From a change on the disk to the answer of a search, with the real daemons VEXOELASTICD, VEXONOTIFYD and FILEINDEXD.

FAILING_READS    a library with which files and directories named bad* cannot be read while /run/bad_disk is there
"""
import json
import os
import pathlib
import re
import shutil
import subprocess
import time
import unittest

import private_machine as machine

ETC, VOLUME = pathlib.Path("/var/packages/Quarrox/etc"), pathlib.Path(machine.SCRATCH, "v")
DOCS, QUEUE, FAILURES, LOG = (VOLUME / p for p in ("docs", "@fileindex/docs/queue", "@fileindex/docs/failures", "../log"))
KINDS = {"document": True, "audio": True, "video": True, "photo": False}


def found(*query):
    status, hits = machine.ctl("search", *query, "--limit", "100000")
    return sorted(str(pathlib.Path(hit["path"]).relative_to(DOCS)) for hit in hits) if status == 0 else hits


class SearchTest(unittest.TestCase):
    def until_found(self, expected, *query):
        end = time.monotonic() + 60
        while (hits := found(*query)) != sorted(expected):
            self.assertLess(time.monotonic(), end, (query, hits, LOG.read_text()[-3000:]))
            time.sleep(0.05)

    def start(self, name, *arguments):
        preload = {"LD_PRELOAD": os.environ["FAILING_READS"]} if name == "FILEINDEXD" else {}
        process = subprocess.Popen([os.environ[name], *arguments], stderr=self.log, env={**os.environ, **preload})
        self.addCleanup(lambda: (process.kill(), process.wait()))
        return process

    def tell(self, **event):
        machine.write(VOLUME / "event", json.dumps({"path": str(DOCS), **event}) + "\n")
        os.rename(VOLUME / "event", QUEUE)

    def start_engine(self):
        self.engine = self.start("VEXOELASTICD", "--foreground", "--data", machine.SCRATCH + "/engine")

    def folders(self, *paths):
        machine.write(ETC / "fileindex.folders", json.dumps([
            {"path": path, "name": path, **KINDS} for path in paths]))

    def setUp(self):
        for place in (VOLUME, ETC, machine.SCRATCH + "/engine"):
            shutil.rmtree(place, ignore_errors=True)
        list(map(os.makedirs, (DOCS / "in/deep", QUEUE.parent)))
        machine.write("/etc/vexo/shares.conf", "[docs]\npath = %s\n" % DOCS)
        self.folders("/docs/in", "/docs/in/deep")
        self.log = self.enterContext(open(LOG, "w"))
        self.start_engine()
        self.watcher = self.start("VEXONOTIFYD", "--watch", DOCS, "--queue", QUEUE)
        self.daemon = self.start("FILEINDEXD", "--foreground")
        while "watching" not in LOG.read_text():
            time.sleep(0.01)
        (DOCS / "in/first.txt").write_text("alpha")
        self.until_found(["in/first.txt"], "alpha")  # the index was missing, so it was made

    def test_what_changes_on_the_disk_is_what_a_search_finds(self):
        inside = DOCS / "in"
        for path in ("in/deep/b.txt", "out.txt", "in/.git/c.txt", "in/photo.jpg", "in/Long name.txt"):
            machine.write(DOCS / path, "beta " + path)
        os.symlink("first.txt", inside / "link.txt")
        self.until_found(["in/deep/b.txt", "in/Long name.txt"], "beta")
        self.until_found(["in/photo.jpg"], "photo", "--name")  # its name, not what is in it
        self.assertEqual([found("name.t", "--name", "--type", t) for t in ("c", "c,TXT")], [[], ["in/Long name.txt"]])
        (inside / "photo.jpg").unlink()
        (inside / "first.txt").write_text("gamma")
        os.rename(inside / "Long name.txt", inside / "photo.txt")
        os.rename(inside / "deep", inside / "moved")
        self.until_found(["in/first.txt"], "gamma")
        self.until_found(["in/moved/b.txt", "in/photo.txt"], "beta")
        self.assertEqual((found("alpha"), found("jpg", "--name")), ([], []))
        os.utime(inside / "first.txt", (0, 0))
        (inside / "moved/b.txt").write_text("beta")
        self.until_found(["in/photo.txt"], "in beta")
        self.assertEqual([(hit["size"], hit["changed"]) for hit in machine.ctl("search", "gamma")[1]], [(5, 0)])
        shutil.rmtree(inside / "moved")
        self.until_found(["in/photo.txt"], "beta")

    def test_a_typed_line_finds_by_phrases_and_fields_and_shows_the_words(self):
        for path, text in ("in/plan.md", "the annual report\n\x1b[31m"), ("in/deep/old.txt", "report annual"), ("in/p.mp3", "x" * 2048):
            machine.write(DOCS / path, text)
        os.utime(DOCS / "in/deep/old.txt", (1714564800, 1714564800))
        os.sync()
        self.until_found(["in/deep/old.txt"], "date:2024-05")
        for line, expected in ('"annual report"', ["in/plan.md"]), ("annual -path:deep", ["in/plan.md"]), ("type:audio", ["in/p.mp3"]), \
                ("name:*.mp3 size:2k", ["in/p.mp3"]), ("type:folder name:deep", ["in/deep"]), ("ext:md OR alpha", ["in/first.txt", "in/plan.md"]):
            self.until_found(expected, line)
        self.until_found(["in/deep/old.txt", "in/p.mp3"], "--type", "txt,audio", "NOT alpha")
        snippet = machine.ctl("search", "plan")[1], machine.ctl("search", "report the")[1][0]["snippet"]
        self.assertEqual(("snippet" in snippet[0][0], snippet[1]["marks"]), (False, [[0, 3], [11, 6]]))
        refused = machine.ctl("search", 'annual "report')
        self.assertEqual((refused[0], refused[1][0]["error"]["code"]), (1, 613))
        self.assertEqual(machine.ctl("search", "anual report")[1], [])
        self.assertEqual(machine.ctl("suggest", "rebuild")[0], 0)
        self.assertEqual(machine.ctl("search", "anual report")[1], [{"did_you_mean": "annual report"}])
        for line, shown in ('"annual report"', b"the \x1b[1mannual\x1b[0m \x1b[1mreport\x1b[0m [31m\r\n"), \
                ('annual "report', b'  annual "report\r\n         ^\r\n'):
            terminal, other = os.openpty()
            subprocess.run([os.environ["FILEINDEXCTL"], "search", line], stdout=other, stderr=other)
            self.assertIn(shown, os.read(terminal, 10000))
            (os.close(terminal), os.close(other))

    def test_a_folder_list_that_changed_is_followed(self):
        (DOCS / "out.txt").write_text("alpha")
        self.folders("/docs")
        self.tell(event=0x20000, data=KINDS)
        self.until_found(["in/first.txt", "out.txt"], "alpha")
        KINDS["document"] = False
        self.addCleanup(KINDS.update, {"document": True})
        self.folders("/docs")
        self.tell(event=0x200)  # events were lost, the one about the folder, too
        self.until_found([], "alpha")
        self.assertEqual(found("txt", "--name"), ["in/first.txt", "out.txt"])

    def test_what_cannot_be_read_is_found_by_its_name_and_tried_again_when_it_is_time(self):
        machine.write("/run/bad_disk")
        (DOCS / "in/baddir").mkdir()
        for name in ("in/bad.txt", "in/good.txt"):
            machine.write(DOCS / name, "beta")
        self.until_found(["in/good.txt"], "beta")
        self.until_found(["in/bad.txt", "in/baddir"], "bad", "--name")
        while not FAILURES.exists() or any(name not in FAILURES.read_text() for name in ("bad.txt", "baddir")):
            time.sleep(0.01)
        for name, code in ("in/bad.txt", 914), ("in/baddir", 502):
            answer = machine.ctl("explain", str(DOCS / name))[1][0]
            failure = answer["failure"]
            pause = 60 << failure["tries"] - 1
            self.assertEqual((answer["indexed"], failure["code"], failure["next_try"] - failure["tried"]), (True, code, pause))
            self.assertIn("Input/output error", failure["reason"])
        (self.daemon.kill(), self.daemon.wait())
        os.unlink("/run/bad_disk")
        machine.write(FAILURES, re.sub('"tried":[0-9]+', '"tried":1', FAILURES.read_text()))
        self.start("FILEINDEXD", "--foreground")  # nothing tells it of the files
        self.until_found(["in/bad.txt", "in/good.txt"], "beta")
        while "bad" in FAILURES.read_text():
            time.sleep(0.01)
    def test_an_audit_says_what_disk_and_index_disagree_on_and_a_repair_mends_it(self):
        inside, names = DOCS / "in", ["in/%s.txt" % name for name in ("deep/gone", "gone", "kept", "stale", "turned")]
        for name in names:
            machine.write(DOCS / name, "beta")
        self.until_found(names, "beta")
        self.watcher.kill()
        self.assertEqual(machine.ctl("audit", "--wait", "20"), (0, [{"shares": 1, "documents": 8, "differences": 0}]))
        for name in ("gone.txt", "turned.txt", "deep/gone.txt"):
            (inside / name).unlink()
        for name in ("stale.txt", "new.txt"):
            (inside / name).write_text("alphabet")
        (inside / "turned.txt").mkdir()
        os.chmod(inside / "deep", 0o700)
        for document, more in (True, []), (False, ["stale in/first.txt", "stale in/kept.txt"]):
            machine.write(ETC / "fileindex.folders", json.dumps([{"path": "/docs/in", "name": "in", **KINDS, "document": document}]))
            status, lines = machine.ctl("audit", "docs")
            said = sorted(line["difference"] + " " + os.path.relpath(line["path"], DOCS) for line in lines[:-1])
            self.assertEqual((status, said), (1, ["gone in/deep/gone.txt", "gone in/gone.txt", "missing in/new.txt",
                                                  "stale in/deep", *more, "stale in/stale.txt", "stale in/turned.txt"]))
        self.assertEqual(machine.ctl("audit", "--repair")[1][-1]["differences"], 0)
        self.assertEqual((found("beta"), found("alphabet")), ([], []))

    def test_nothing_is_lost_when_the_engine_is_killed_in_a_pass_or_its_index_is_gone(self):
        names = ["in/many/%d/%d.txt" % (i % 20, i) for i in range(4000)]
        for name in names:
            machine.write(DOCS / name, "plenty")
        for seconds in (0.3, 0.6, 0.1):
            time.sleep(seconds)
            self.engine.kill()
            self.engine.wait()
            self.start_engine()
        self.until_found(names, "plenty")
        self.engine.kill()
        self.engine.wait()
        for path in filter(pathlib.Path.is_file, (VOLUME / "@fileindex/docs/db").rglob("*")):
            path.write_bytes(b"damaged")
        os.rename(DOCS / "in/many/7", DOCS / "in/many/new")
        self.start_engine()
        self.until_found([name.replace("/7/", "/new/") for name in names], "plenty")
        while json.loads((ETC / "fileindex.status").read_text())["share"]["docs"] != 0:
            time.sleep(0.01)

    @unittest.skipIf("4294967295" not in pathlib.Path("/proc/self/uid_map").read_text(), "another user needs root")
    def test_another_user_reaches_neither_the_index_nor_the_daemons(self):
        index = next((QUEUE.parent / "db").rglob("*.glass"))
        connect = "import socket, sys; socket.socket(socket.AF_UNIX).connect(sys.argv[1])"
        for options in {"user": 65534, "group": 65534, "extra_groups": []}, {}:
            reached = [subprocess.run(command, capture_output=True, **options).returncode == 0 for command in (
                ["cat", index], ["python3", "-c", connect, "/run/vexoelasticd.sock"],
                ["python3", "-c", connect, "/run/fileindexd.sock"])]
            self.assertEqual(reached, [not options] * 3)


if __name__ == "__main__":
    machine.enter()
    unittest.main()
