#!/usr/bin/env python3
"""The indexing daemon FILEINDEXD: its answers on the socket, and its workers, which drain the shares' queues."""
import contextlib
import fcntl
import json
import os
import pathlib
import socket
import struct
import subprocess
import threading
import time
import unittest

import private_machine as machine

ETC, SOCKET, VOLUME = "/var/packages/Quarrox/etc/", "/var/run/fileindexd.sock", machine.SCRATCH + "/v"
LOG, QUEUE, TMP = (pathlib.Path(VOLUME, p) for p in ("../log", "@fileindex/docs/queue", "@fileindex/docs/queue.tmp"))
MANY = ["f%06d" % n for n in range(3000)]  # a pass that takes a while
HANDLED = []  # the documents that the engine was told of, in order


def append(names):
    QUEUE.parent.mkdir(parents=True, exist_ok=True)
    with open(QUEUE, "a") as file:
        fcntl.flock(file, fcntl.LOCK_EX)
        file.write("".join('{"event": 64, "path": "/%s"}\n' % name for name in names))


def handled():
    return list(HANDLED)


def be_engine():
    """Takes everything. No file of the events is there, so that each is one document to be deleted."""
    listener = socket.socket(socket.AF_UNIX)
    listener.bind("/var/run/vexoelasticd.sock")
    listener.listen(8)
    while True:
        with contextlib.suppress(OSError, ValueError, struct.error), listener.accept()[0] as client:  # it may be killed
            data = client.makefile("rb")
            text = data.read(struct.unpack("=I", data.read(4))[0])[:-1]
            request = json.loads(text)
            if request["command"] == "document_del_by_id":
                HANDLED.append(request["data"]["doc_id"][1:])
            client.sendall(frame('{"success":true}'))


def connect(*pieces):
    client = socket.socket(socket.AF_UNIX)
    client.settimeout(5)
    client.connect(SOCKET)
    list(map(client.sendall, pieces))
    return client


def answer(client):
    data = client.makefile("rb").read()
    assert data[:4] == struct.pack("=I", len(data) - 4) and data.endswith(b"\0"), data
    return json.loads(data[4:-1])


def frame(text):
    return struct.pack("=I", len(text) + 1) + text.encode() + b"\0"


def tell(command, share=""):
    return answer(connect(frame('{"type":"%s","data":{"share_name":"%s"}}' % (command, share)))) == {"success": True}


def folders(*shares):
    kinds = dict.fromkeys(["document", "audio", "video", "photo"], True)
    machine.write(ETC + "fileindex.folders", json.dumps([{"path": "/" + s, "name": s, **kinds} for s in shares]))


class FileindexdTest(unittest.TestCase):
    def until(self, condition):
        end = time.monotonic() + 30
        while not condition():
            self.assertLess(time.monotonic(), end, LOG.read_text()[-2000:])
            time.sleep(0.01)

    def setUp(self):
        HANDLED.clear()
        subprocess.run("rm -rf {0} {1}; mkdir -p {0}/docs {0}/more; >{2}".format(VOLUME, ETC, LOG), shell=True, check=True)
        machine.write("/etc/vexo/shares.conf", "[docs]\npath={0}/docs\n[more]\npath={0}/more\n".format(VOLUME))
        folders("docs", "gone")
        machine.write(TMP, '{"event": 64, "path": "/left"}\n')
        self.daemon = subprocess.Popen("exec $FILEINDEXD --foreground 2>%s" % LOG, shell=True)
        self.addCleanup(self.stop)
        self.until(lambda: "left" in handled() and not TMP.exists() and len(self.workers()) == 1)

    def stop(self):
        workers = self.workers()
        self.daemon.terminate()
        self.assertEqual((self.daemon.wait(1), [pid for pid in workers if os.path.exists("/proc/%s" % pid)]), (0, []))

    def workers(self):
        return pathlib.Path("/proc/{0}/task/{0}/children".format(self.daemon.pid)).read_text().split()

    def test_every_client_is_answered_at_once_whatever_it_sends_and_others_do(self):
        subprocess.run(["kill", "-STOP", *self.workers()], check=True)
        silent, lying, good = connect(), connect(struct.pack("=I", 1 << 20) + b"{"), frame('{"type":"resume"}')
        bad = [*map(frame, ["", '{"type":7}', "[]", '{"type":"x"}', '{"type":"worker_create"}', "{} {}"])]
        for data in bad + [good[:-1] + b"x", b"\0" * 4, b"\xff" * (1 << 20)]:
            self.assertEqual(answer(connect(data))["error"]["code"], 120, data[:40])
        self.assertEqual(answer(connect(*[bytes([byte]) for byte in good])), {"success": True})
        if "4294967295" in pathlib.Path("/proc/self/uid_map").read_text():  # there are other users
            os.chmod(SOCKET, 0o666)
            os.seteuid(65534)
            self.assertIn("may not", answer(connect(good))["error"]["msg"])
            os.seteuid(0)
        self.assertIn("Another fileindexd is running", subprocess.getoutput("timeout 5 $FILEINDEXD"))
        self.daemon.terminate()
        self.assertEqual([answer(client)["error"]["msg"] for client in (silent, lying)], ["The daemon is stopping"] * 2)

    def test_workers_follow_folders_and_commands_and_lose_nothing_when_killed(self):
        QUEUE.parent.rename(VOLUME + "/old")
        folders("docs", "more", "gone")
        for command, count in ("notify_setting_changed", 2), ("worker_delete", 1), ("worker_create", 2):
            self.assertTrue(tell(command, "docs"))
            self.until(lambda: len(self.workers()) == count)
        append(MANY)
        self.until(lambda: MANY[0] in handled())
        subprocess.run(["kill", "-KILL", *self.workers()], check=True)
        append(["after"])
        self.until(lambda: handled()[-len(MANY) - 1:] == MANY + ["after"])
        self.assertEqual(LOG.read_text().count("The share gone is not to be found"), 1)
        os.rename("/etc/vexo/shares.conf", "/etc/vexo/away")
        append(["unseen"])
        self.until(lambda: len(self.workers()) < 2)
        os.rename("/etc/vexo/away", "/etc/vexo/shares.conf")
        self.until(lambda: handled()[-1] == "unseen" and len(self.workers()) == 2)

    def test_a_pause_stops_a_pass_and_both_its_end_and_resume_run_it_again(self):
        for end, pause in (("resume", 0), ("time", 3)):
            append([end, *MANY])
            self.until(lambda: end in handled())
            machine.write(ETC + "fileindex.status", json.dumps({"resume_time": pause and int(time.time()) + pause}))
            self.assertTrue(tell("pause"))
            time.sleep(0.5)
            append(["last"])
            seen = handled()
            time.sleep(0.5)
            self.assertEqual((handled(), TMP.exists(), pause or machine.ctl("resume")[0]), (seen, True, pause))
            self.until(lambda: handled()[len(seen):] == [end, *MANY, "last"])


if __name__ == "__main__":
    machine.enter()
    threading.Thread(target=be_engine, daemon=True).start()
    unittest.main()
