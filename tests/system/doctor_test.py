#!/usr/bin/env python3
"""What `fileindexctl doctor` finds with the real daemons on a machine that is broken, and that what it says mends it."""
import json
import os
import pathlib
import socket
import subprocess
import time
import unittest

import private_machine as machine

ETC, MONITORS, LOCK = "/var/packages/Quarrox/etc/", pathlib.Path("/var/lib/vexonotifyd"), "/tmp/quarrox_cfg_folder.lock"
CONF, LIST, LOG = "/etc/vexo/shares.conf", pathlib.Path(ETC, "fileindex.folders"), machine.SCRATCH + "/log"
VOLUME, INDEXES, ODD = machine.SCRATCH + "/v", machine.SCRATCH + "/v/@fileindex/", "it's odd"  # to a shell, two words


def tell_engine(command, share):
    with socket.socket(socket.AF_UNIX) as engine:
        engine.connect("/var/run/vexoelasticd.sock")
        text = json.dumps({"command": command, "data": {"id": "fileindex_" + share}}).encode() + b"\0"
        engine.sendall(len(text).to_bytes(4, "little") + text)
        assert b"true" in engine.recv(999)


def configure(**places):
    machine.write(CONF, "".join("[%s]\npath = %s/%s\n" % (name, VOLUME, place) for name, place in places.items()))


def change_list(change=lambda folders: [{**folder, "paused": folder["path"].startswith("/docs")} for folder in folders]):
    LIST.write_text(json.dumps(change(json.loads(LIST.read_text()))))


def monitor(share):
    return next(file for file in MONITORS.iterdir() if share in json.loads(file.read_text())["queue"])


def pause_but_watch(config):
    text = config.read_text()
    machine.ctl("share", "pause", "docs")
    config.write_text(text)


def wrong():
    status, findings = machine.ctl("doctor")
    found = [finding for finding in findings if not finding["ok"]]
    assert status == bool(found), findings
    return found


@unittest.skipUnless("4294967295" in pathlib.Path("/proc/self/uid_map").read_text(), "only root gives files away")
class DoctorTest(unittest.TestCase):
    def until_well(self, idle=False):
        end = time.monotonic() + 30
        while found := wrong() or idle and [queue for queue in machine.ctl("queue", "list")[1] if queue["exists"]]:
            self.assertLess(time.monotonic(), end, (found, pathlib.Path(LOG).read_text()[-2000:]))
            time.sleep(0.05)

    def start(self, name):
        process = subprocess.Popen([os.environ[name.upper()], "--foreground"], stderr=self.log)
        self.addCleanup(lambda: (process.kill(), process.wait()))
        return process

    def make_all(self):
        for place in ("docs/a", "docs/b", ODD):
            os.makedirs("%s/%s" % (VOLUME, place), exist_ok=True)
        configure(docs="docs", **{ODD: ODD})
        for path in ("/docs/a", "/docs/b", "/" + ODD):
            self.assertIn(machine.ctl("folder", "add", path)[1][0].get("error", {}).get("code"), (None, 901))
        self.assertEqual([machine.ctl(*words.split())[0] for words in ("resume", "share resume docs")], [0, 0])
        self.until_well(idle=True)

    def setUp(self):
        subprocess.run("rm -rf /run/*.sock /var/lib/vexo* %s %s" % (VOLUME, ETC), shell=True, check=True)
        self.log = self.enterContext(open(LOG, "w"))
        self.daemons = {name: self.start(name) for name in ("vexoelasticd", "fileindexd", "vexonotifyd")}
        self.make_all()

    def test_what_it_says_mends_what_is_broken(self):
        for check, count, text, hurt in (
                ("index", 1, "no index of it", lambda: tell_engine("index_delete", ODD)),
                ("index", 1, "is not at", lambda: subprocess.run(["rm", "-r", INDEXES + "docs/db"], check=True)),
                ("index", 1, "its index is paused and", lambda: tell_engine("index_pause", "docs")),
                ("index", 2, "docs are paused, but its index", change_list),
                ("monitor", 1, "nothing in", lambda: monitor(ODD).unlink()),
                ("monitor", 1, "other folders", lambda: change_list(lambda folders: folders[1:])),
                ("monitor", 1, "paused, but", lambda: pause_but_watch(monitor("docs"))),
                ("folders", 1, "/docs/b", lambda: os.rmdir(VOLUME + "/docs/b")),
                ("shares", 1, "not configured", lambda: configure(docs="docs")),
                ("shares", 2, "directory of another name", lambda: (
                    os.rename(VOLUME + "/" + ODD, VOLUME + "/other"), configure(docs="docs", **{ODD: "other"}))),
                ("shares.conf", 2, "no plain absolute path", lambda: configure(docs="docs", **{ODD: "x/../" + ODD})),
                ("leftovers", 2, "queue of no share", lambda: (os.makedirs(INDEXES + "odd/db"), (MONITORS / "odd.json").write_text(
                    monitor("docs").read_text().replace("docs/queue", "odd/queue")))),
                ("leftovers", 1, "a database at", lambda: change_list(lambda folders: folders[:2])),
                ("flags", 1, "made anew", lambda: machine.write(ETC + "fileindex.status", '{"resume_time": 0, "share": {"docs": 2}}')),
                ("sockets", 1, "0777", lambda: os.chmod("/var/run/fileindexd.sock", 0o777)),
                ("rights", 1, "0755", lambda: os.chmod(INDEXES + "docs", 0o755)),
                ("rights", 2, "belongs to", lambda: (os.chmod(LIST, 0o666), os.chown(LIST, 65534, 0))),
                ("locks", 1, "65534", lambda: os.chown(LOCK, 65534, 0))):
            machine.ctl("pause")  # fileindexd mends some of it by itself
            hurt()
            found = wrong()
            self.assertIn(check, [finding["check"] for finding in found if text in finding["finding"]], (text, found))
            self.assertEqual(len(found), count, found)
            machine.ctl("resume")
            by_hand = [finding for finding in found if "shares.conf" in finding["check"] + finding["remedy"]]
            for finding in [finding for finding in found if finding not in by_hand]:
                done = subprocess.run(["sh", "-c", finding["remedy"]], capture_output=True)
                self.assertEqual(done.returncode, 0, (finding, done))
            by_hand or self.until_well()
            self.make_all()

    def test_a_daemon_that_is_down_or_silent_is_told_and_never_waited_for_long(self):
        for name, socket_path in ("fileindexd", None), ("vexoelasticd", "/var/run/vexoelasticd.sock"), ("vexonotifyd", None):
            self.daemons[name].kill() or self.daemons[name].wait()
            self.assertIn(("daemons", "start it as root: " + name), [(f["check"], f["remedy"]) for f in wrong()])
            if socket_path:
                os.unlink(socket_path)
                with socket.socket(socket.AF_UNIX) as silent:
                    silent.bind(socket_path)
                    silent.listen()
                    started = time.monotonic()
                    self.assertIn("does not answer in time", "".join(f["finding"] for f in wrong()))
                    self.assertLess(time.monotonic() - started, 9)
            self.start(name)
            self.until_well()


if __name__ == "__main__":
    machine.enter()
    os.environ["PATH"] = os.path.dirname(os.environ["FILEINDEXCTL"]) + ":" + os.environ["PATH"]
    unittest.main()
