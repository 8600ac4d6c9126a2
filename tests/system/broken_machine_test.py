#!/usr/bin/env python3
"""One machine with the real daemons, broken in one way after another: `doctor` or `explain` names the fault, and what
it says, followed to the letter, mends it."""
import json
import os
import pathlib
import re
import shutil
import signal
import socket
import struct
import subprocess
import time
import unittest

import private_machine as machine

ETC, MONITORS, LOCK = "/var/packages/Quarrox/etc/", pathlib.Path("/var/lib/vexonotifyd"), "/tmp/quarrox_cfg_folder.lock"
CONF, LIST, LOG = "/etc/vexo/shares.conf", pathlib.Path(ETC, "fileindex.folders"), machine.SCRATCH + "/log"
VOLUME, INDEXES, ODD = machine.SCRATCH + "/v", machine.SCRATCH + "/v/@fileindex/", "it's odd"  # to a shell, two words
DOCS, SMALL, QUEUE = VOLUME + "/docs", machine.SCRATCH + "/small", INDEXES + "docs/queue"
SOCKET, STATUS = "/run/vexoelasticd.sock", ETC + "fileindex.status"
NO_ID = 0xffffffff  # of an entry of an access control list that is about nobody by name
INSTANCES = "/proc/sys/fs/inotify/max_user_instances"
READER = os.environ["FILEINDEX_BUILD_DIR"] + "/src/fileindex/vexocontentextract"
DAEMONS = {name: os.environ[name.upper()] for name in ("vexoelasticd", "vexonotifyd", "fileindexd")}
SHARES = {"docs": DOCS, ODD: VOLUME + "/" + ODD, "disk": VOLUME + "/disk", "tight": SMALL + "/tight"}
COMMANDS = ("fileindexctl ", "chmod ", "setfacl ")


def sh(line):
    with open(LOG, "a") as log:
        return subprocess.run(["sh", "-c", line], stdout=log, stderr=log).returncode


def must(line):
    assert sh(line) == 0, (line, pathlib.Path(LOG).read_text()[-2000:])


def configure(**changes):
    places = {name: place for name, place in {**SHARES, **changes}.items() if place}
    machine.write(CONF, "".join("[%s]\npath = %s\n" % place for place in places.items()))


def pids(name):
    """Those of this machine, not of others on the real one."""
    own = os.readlink("/proc/self/ns/mnt")
    found = []
    for process in filter(str.isdigit, os.listdir("/proc")):
        try:
            if os.readlink("/proc/%s/ns/mnt" % process) == own and pathlib.Path("/proc", process, "comm").read_text().strip() == name:
                found.append(int(process))
        except OSError:
            pass
    return sorted(found)


def is_alive(process):
    try:
        return pathlib.Path("/proc/%d/stat" % process).read_text().rsplit(") ", 1)[1][0] not in "ZX"
    except OSError:
        return False


def kill(name):
    killed = pids(name)
    for process in killed:
        os.kill(process, signal.SIGKILL)
    while any(map(is_alive, killed)):
        time.sleep(0.01)


def start(name, program=None):
    must("setsid -f %s --foreground" % (program or name))
    end = time.monotonic() + 5
    while not pids(name):
        assert time.monotonic() < end, pathlib.Path(LOG).read_text()[-2000:]
        time.sleep(0.01)


def restart_other(change):
    """In place of the notification daemon one from another file, which `change` does something to."""
    other = pathlib.Path(machine.SCRATCH, "other/vexonotifyd")
    kill("vexonotifyd")
    os.makedirs(other.parent, exist_ok=True)
    shutil.copy(DAEMONS["vexonotifyd"], other)
    change(other)
    start("vexonotifyd", other)
    return other


def damage_database():
    kill("vexoelasticd")
    for file in pathlib.Path(INDEXES, "docs/db").rglob("*.glass"):
        file.write_bytes(b"\x55" * file.stat().st_size)
    start("vexoelasticd")


def tell_engine(command, share):
    with socket.socket(socket.AF_UNIX) as engine:
        engine.connect(SOCKET)
        text = json.dumps({"command": command, "data": {"id": "fileindex_" + share}}).encode() + b"\0"
        engine.sendall(len(text).to_bytes(4, "little") + text)
        assert b"true" in engine.recv(999)


def change_list(change):
    LIST.write_text(json.dumps(change(json.loads(LIST.read_text()))))


def paused_in_list(folders):
    return [{**folder, "paused": folder["path"].startswith("/docs")} for folder in folders]


def monitor(share):
    return next(file for file in MONITORS.iterdir() if share in json.loads(file.read_text())["queue"])


def watch_paused():
    text, config = monitor("docs").read_text(), monitor("docs")
    machine.ctl("share", "pause", "docs")
    config.write_text(text)


def leave_behind():
    os.makedirs(INDEXES + "odd/db")
    (MONITORS / "odd.json").write_text(monitor("docs").read_text().replace("docs/queue", "odd/queue"))


def with_reader(mode):
    """Reads files with a copy of the program."""
    copy = machine.SCRATCH + "/reader"
    shutil.copy(READER, copy)
    os.chmod(copy, mode)
    must("mount --bind %s %s" % (copy, READER))


def lower_instances():
    machine.write(machine.SCRATCH + "/instances", "8\n")
    must("mount --bind %s/instances %s" % (machine.SCRATCH, INSTANCES))


def doctor():
    status, findings = machine.ctl("doctor")
    found = [finding for finding in findings if not finding["ok"]]
    assert status == bool(found), findings
    return found


def explain(path, user=None):
    status, [answer] = machine.ctl("explain", path, *(["--as", user] if user else []))
    assert status == 0, answer
    return answer


# What doctor says, what breaks the machine; where the remedy is no command, a part of it and what does that; and what
# takes away what the test put up.
FAULTS = [
    ("vexoelasticd does not serve", lambda: kill("vexoelasticd")),
    ("fileindexd does not serve", lambda: kill("fileindexd")),
    ("no vexonotifyd watches", lambda: kill("vexonotifyd")),
    ("as it was before it was replaced", lambda: os.unlink(restart_other(lambda program: None))),
    ("is of another version", lambda: restart_other(lambda program: program.write_bytes(re.sub(
        rb"(vexonotifyd )([0-9.]+)", lambda found: found[1] + b"9" * len(found[2]), program.read_bytes())))),
    ("does not tell in /var/run/vexonotifyd.status", lambda: os.unlink("/run/vexonotifyd.status")),
    ("files open", lambda: must("prlimit --pid %d --nofile=64:" % pids("fileindexd")[0])),
    ("has the mode 0777", lambda: os.chmod("/run/fileindexd.sock", 0o777)),
    (SOCKET + " belongs to", lambda: os.chown(SOCKET, 65534, 0)),
    ("so ordinary users cannot search", lambda: os.unlink("/run/vexosearch.sock")),
    ("has the mode 0600 instead of 0666", lambda: os.chmod("/run/vexosearch.sock", 0o600)),
    ("the lock file", lambda: os.chown(LOCK, 65534, 0)),
    ("is no file", lambda: (os.unlink(LOCK), os.mkdir(LOCK))),
    ("the list of indexed folders cannot be read", lambda: LIST.write_text('[{"path": "/do')),
    ("has the mode 0200", lambda: os.chmod(LIST, 0o200)),
    ("belongs to the user with the number 65534", lambda: (os.chmod(LIST, 0o666), os.chown(LIST, 65534, 0))),
    ("the state of indexing cannot be read", lambda: machine.write(STATUS, "\0\0\0\0")),
    ("paused until a time", lambda: machine.write(ETC + "fileindex.pauses", "{]")),
    ("made anew", lambda: machine.write(STATUS, '{"resume_time": 0, "share": {"docs": 2}}')),
    ("which is not configured", lambda: configure(**{ODD: ""})),
    ("directory of another name", lambda: (os.rename(SHARES[ODD], VOLUME + "/other"), configure(**{ODD: VOLUME + "/other"})),
     "one name", lambda: (os.rename(VOLUME + "/other", SHARES[ODD]), configure())),
    ("no plain absolute path", lambda: configure(disk=VOLUME + "/x/../disk"), "write one without", configure),
    ("shares.conf:1",
     lambda: machine.write(CONF, "docs]\npath\n"), "write it as one of them", configure),
    ("No such file or directory", lambda: os.rename(DOCS, VOLUME + "/away"),
     "create it", lambda: os.rename(VOLUME + "/away", DOCS)),
    ("is not mounted", lambda: must("umount %s/disk" % VOLUME), "mount it", lambda: must("mount -t tmpfs disk %s/disk" % VOLUME)),
    ("has no directory", lambda: os.rmdir(DOCS + "/b")),
    ("the engine has no index of it", lambda: tell_engine("index_delete", ODD)),
    ("is not at " + INDEXES, lambda: shutil.rmtree(INDEXES + "docs/db")),
    ("the engine has no index of it", damage_database),
    ("its index is paused and", lambda: tell_engine("index_pause", "docs")),
    ("docs are paused, but its index", lambda: change_list(paused_in_list)),
    ("docs has the mode 0755", lambda: os.chmod(INDEXES + "docs", 0o755)),
    ("a database at", lambda: change_list(lambda folders: [each for each in folders if ODD not in each["path"]])),
    ("a database of no share", leave_behind),
    ("nothing in /var/lib/vexonotifyd", lambda: monitor(ODD).unlink()),
    ("is damaged, so it has nothing watched", lambda: monitor("docs").write_text('{"applic')),
    ("other folders of the share docs", lambda: change_list(lambda folders: [each for each in folders if each["path"] != "/docs/a"])),
    ("is paused, but", watch_paused),
    ("queue has the mode 0666", lambda: (machine.write(QUEUE), os.chmod(QUEUE, 0o666))),
    ("queue belongs to", lambda: (machine.write(QUEUE), os.chmod(QUEUE, 0o600), os.chown(QUEUE, 65534, 0))),
    ("is no file, so no change is taken", lambda: os.mkdir(QUEUE)),
    ("8 inotify instances are allowed", lower_instances, None, None, lambda: must("umount " + INSTANCES)),
    ("less than 100 MiB left", lambda: must("fallocate -l 100M %s/filler" % SMALL), "make room there", lambda: os.unlink(SMALL + "/filler")),
    ("only plain text is read", lambda: with_reader(0o644), None, None, lambda: must("umount -l " + READER)),
]


@unittest.skipUnless("4294967295" in pathlib.Path("/proc/self/uid_map").read_text(), "only root gives files away")
class BrokenMachineTest(unittest.TestCase):
    def until(self, true, what):
        end = time.monotonic() + 20
        while not true():
            self.assertLess(time.monotonic(), end, (what(), pathlib.Path(LOG).read_text()[-3000:]))
            time.sleep(0.02)

    def make_well(self):
        """All as at the beginning: four shares with folders, and nothing to be done."""
        for place in (DOCS + "/a", DOCS + "/b", *SHARES.values()):
            os.makedirs(place, exist_ok=True)
        configure()
        for path in ("/docs/a", "/docs/b", "/" + ODD, "/disk", "/tight"):
            self.assertIn(machine.ctl("folder", "add", path)[1][0].get("error", {}).get("code"), (None, 901))
        must("fileindexctl resume && fileindexctl share resume docs")
        idle = lambda: not [queue for queue in machine.ctl("queue", "list")[1] if queue["exists"]]
        self.until(lambda: idle() and not doctor(), doctor)

    @classmethod
    def setUpClass(cls):
        os.makedirs(VOLUME + "/disk"), os.makedirs(SMALL)
        must("mount -t tmpfs disk %s/disk && mount -t tmpfs -o size=180m small %s" % (VOLUME, SMALL))
        for name in DAEMONS:
            start(name)
            cls.addClassCleanup(kill, name)
        while not os.path.exists(SOCKET) or not os.path.exists("/run/fileindexd.sock"):
            time.sleep(0.01)

    def follow(self, finding, words, by_hand):
        if finding["runnable"]:
            return self.assertEqual(sh(finding["remedy"]), 0, (finding, pathlib.Path(LOG).read_text()[-3000:]))
        self.assertIsNotNone(by_hand, finding)
        self.assertIn(words, finding["remedy"])
        by_hand()

    def mend(self, words, by_hand):
        """From the top, as doctor says; what was done once may take a moment to help."""
        done, end = set(), time.monotonic() + 20
        while found := doctor():
            left = [finding for finding in found if finding["finding"] not in done]
            self.assertLess(time.monotonic(), end, (found, pathlib.Path(LOG).read_text()[-3000:]))
            if left:
                self.follow(left[0], words, by_hand)
                done.add(left[0]["finding"])
            else:
                time.sleep(0.05)

    def test_doctor_names_each_fault_and_its_remedy_mends_it(self):
        self.assertGreaterEqual(len(FAULTS), 20)
        for text, hurt, words, by_hand, put_away in ((*fault, *[None] * (5 - len(fault))) for fault in FAULTS):
            with self.subTest(fault=text):
                self.make_well()
                machine.ctl("pause")  # fileindexd mends some of it by itself
                hurt()
                self.assertIn(text, "\n".join(finding["finding"] for finding in doctor()))
                machine.ctl("resume")
                self.mend(words, by_hand)
                if put_away:
                    put_away()

    def test_an_engine_that_is_silent_is_not_waited_for_long(self):
        self.make_well()
        kill("vexoelasticd")
        os.unlink(SOCKET)
        with socket.socket(socket.AF_UNIX) as silent:
            silent.bind(SOCKET)
            silent.listen()
            started = time.monotonic()
            self.assertIn("does not answer in time", json.dumps(doctor()))
            self.assertLess(time.monotonic() - started, 9)
        self.mend("", None)

    def check(self, path, text, words=None, by_hand=None, user=None):
        """That explain says the text, and is content after its remedy."""
        said = explain(path, user)
        self.until(lambda: text in json.dumps(explain(path, user)), lambda: explain(path, user))
        said = explain(path, user)
        part = lambda answer: answer["as"] if user else answer
        remedy = part(said)["remedy"]
        if by_hand:
            self.assertIn(words, remedy)
            by_hand(remedy)
        else:
            self.assertTrue(remedy.startswith(COMMANDS), said)
            self.assertEqual(sh(remedy), 0, (said, pathlib.Path(LOG).read_text()[-3000:]))
        return lambda: part(explain(path, user))["remedy"] == ""

    def expect(self, path, text, words=None, by_hand=None, user=None):
        with self.subTest(text=text):
            self.until(self.check(path, text, words, by_hand, user), lambda: explain(path, user))

    def test_explain_names_what_keeps_a_file_and_its_remedy_brings_it(self):
        self.make_well()
        note = DOCS + "/a/note.txt"
        machine.write(note, "alpha")
        self.until(lambda: explain(note)["text_bytes"] == 5, lambda: explain(note))
        self.assertAlmostEqual(explain(note)["indexed_at"], time.time(), delta=60)
        machine.write(DOCS + "/c/.git/plan.txt", "alpha")
        self.expect(DOCS + "/c", "\"folder\": null")
        with self.subTest("reserved name"):
            self.check(DOCS + "/c/.git/plan.txt", "kept for the system", "move the files", lambda _: os.rename(DOCS + "/c/.git", DOCS + "/c/git"))
            self.until(lambda: explain(DOCS + "/c/git/plan.txt")["indexed"], lambda: explain(DOCS + "/c/git/plan.txt"))
        os.symlink("a", DOCS + "/link")
        self.assertEqual(explain(DOCS + "/link/note.txt")["remedy"], "use the plain form: " + note)
        must("fileindexctl folder set /docs/a --types none")
        self.expect(note, '"wants_contents": false')
        for pause, text in (("fileindexctl folder pause /docs/a", '"paused": true'), ("fileindexctl share pause docs", '"paused": true'),
                            ("fileindexctl pause; touch '%s'" % note, '"pending": true')):
            must(pause)
            self.expect(note, text)
        must("fileindexctl status --follow --until-idle")  # a pass over a share that cannot be indexed drops what it looks at
        configured = pathlib.Path(CONF).read_text()
        machine.write(CONF, configured.replace("[docs]\n", "[docs]\nread only = yes\n"))
        self.expect(note, "share_read_only", "read only = no", lambda _: machine.write(CONF, configured))
        kill("vexoelasticd")
        self.assertEqual((explain(note)["indexed"], explain(note)["remedy"]), (None, "fileindexctl doctor"))
        self.mend("", None)

    def test_a_file_that_could_not_be_read_is_told_by_status_and_explain_and_read_when_it_can_be(self):
        self.make_well()
        with_reader(0o644)
        self.addCleanup(must, "umount -l " + READER)
        latin = DOCS + "/a/latin.txt"
        pathlib.Path(latin).write_bytes(b"\xfcbel alpha")
        self.until(lambda: "cannot be started" in json.dumps(explain(latin)), lambda: explain(latin))
        self.until(lambda: machine.ctl("status", "--failed")[1], lambda: machine.ctl("status"))
        self.assertEqual([each["path"] for each in machine.ctl("status", "--failed")[1]], [latin])
        self.assertEqual({each["share"]: each["failures"] for each in machine.ctl("status")[1]}["docs"], 1)
        mend = lambda remedy: (must("chmod 0755 " + READER), must(remedy.split(": ", 1)[1]))
        self.expect(latin, "cannot be started", "put right what it says", mend)
        self.assertEqual(machine.ctl("status", "--failed")[1], [])

    def test_who_may_find_a_file_is_what_the_kernel_lets_them_open(self):
        self.make_well()
        secret = DOCS + "/a/in/secret.txt"
        machine.write(secret, "alpha")
        self.assertEqual(explain(secret, "nobody")["readers"], {"who": "everybody", "on_the_way": []})
        os.chmod(secret, 0o640)
        os.chown(secret, 34, 50)  # backup, staff
        os.chmod(os.path.dirname(secret), 0o700)
        os.chown(os.path.dirname(secret), 34, 0)
        self.assertEqual(explain(secret)["readers"], {
            "who": "backup, members of staff", "on_the_way": [{"directory": DOCS + "/a/in", "who": "backup"}]})
        self.assertTrue(explain(secret, "backup")["as"]["may_find"])
        refused = lambda: explain(secret, "nobody")["as"]["refused_by"]
        self.assertEqual(refused(), os.path.dirname(secret))
        self.check(secret, "may not enter", user="nobody")
        self.assertEqual(refused(), secret)
        self.expect(secret, "may not read", user="nobody")
        os.chmod(secret, 0o040)  # whoever owns it is asked as the owner
        self.expect(secret, "mode 0040", user="backup")
        self.assertEqual(machine.ctl("explain", secret, "--as", "no such user")[0], 1)
        listed = DOCS + "/a/listed.txt"
        machine.write(listed, "alpha")
        for group, mask, others, who in ((0, 4, 0, "backup"), (4, 4, 0, "backup, members of root"), (4, 0, 0, "nobody but root"),
                                         (0, 4, 4, "everybody but members of root")):
            entries = ((1, 6, NO_ID), (2, 4, 34), (4, group, NO_ID), (16, mask, NO_ID), (32, others, NO_ID))
            acl = struct.pack("<I", 2) + b"".join(struct.pack("<HHI", *entry) for entry in entries)
            os.setxattr(listed, "system.posix_acl_access", acl)
            self.assertEqual(explain(listed)["readers"], {"who": who, "on_the_way": []})
            self.assertEqual(explain(listed, "backup")["as"]["may_find"], mask == 4)


if __name__ == "__main__":
    machine.enter()
    os.environ["PATH"] = ":".join([os.path.dirname(os.environ["FILEINDEXCTL"]), *map(os.path.dirname, DAEMONS.values()), os.environ["PATH"]])
    os.umask(0o022)
    unittest.main()
