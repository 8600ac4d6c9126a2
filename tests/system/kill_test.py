#!/usr/bin/env python3
"""Saves and commands that are injured: killed, interrupted, on a full disk, beside a second writer, by their peer."""
import json
import os
import re
import socket
import subprocess
import time
import unittest

import private_machine as machine

ETC, TRACE = "/var/packages/Quarrox/etc/", machine.SCRATCH + "/trace"
PROGRAMS = {"status_save": "fileindex.status", "folder_save": "fileindex.folders"}  # and what they save
os.environ["ASAN_OPTIONS"] = "detect_leaks=0"  # they cannot be looked for under a tracer


def saved(program):
    with open(ETC + PROGRAMS[program], encoding="utf-8") as file:
        return file.read()


# The exit status of one save, which changes the text that the one before has left, and the text.
def save(program, *tracer):
    run = subprocess.run([*tracer, os.environ["TEST_PROGRAMS"] + "/" + program, "1"], stderr=subprocess.DEVNULL)
    return run.returncode, saved(program)


class KillTest(unittest.TestCase):
    def test_a_kill_at_any_change_of_a_file_leaves_the_old_text_or_the_new(self):
        for program in PROGRAMS:
            new, old = save(program)[1], save(program)[1]
            trace = ["strace", "-o", TRACE, "-e"]
            self.assertEqual(save(program, *trace, "openat,write,fsync,rename,chmod,fchmod,unlink"), (0, new))
            with open(TRACE, encoding="utf-8", errors="replace") as file:
                calls = re.findall(r"^(\w+)\(", file.read(), re.M)
            self.assertEqual([calls.count(call) for call in ("write", "fsync", "rename", "chmod")], [1, 2, 1, 1])
            for end, call in enumerate(calls, 1):
                if saved(program) != old:
                    self.assertEqual(save(program), (0, old))
                fault = "inject=%s:signal=KILL:when=%d" % (call, calls[:end].count(call))
                self.assertIn(save(program, *trace, fault), ((-9, old), (-9, new)), fault)

    def test_a_full_disk_keeps_the_old_text(self):
        subprocess.run(["mount", "-t", "tmpfs", "-o", "size=64k", "none", ETC], check=True)
        self.addCleanup(subprocess.run, ["umount", ETC], check=True)
        old = [save(program)[1] for program in PROGRAMS]
        subprocess.run(["cp", "/dev/zero", ETC + "big"], stderr=subprocess.DEVNULL)
        self.assertEqual(machine.ctl("pause")[1][0]["error"]["code"], 505)
        self.assertEqual([save(program) for program in PROGRAMS], [(-6, text) for text in old])
        self.assertEqual(len(os.listdir(ETC)), 3)

    def test_a_reader_beside_two_writers_sees_no_part(self):
        save("status_save")
        writers = [subprocess.Popen(["timeout", "1", os.environ["TEST_PROGRAMS"] + "/status_save"]) for _ in range(2)]
        while None in [writer.poll() for writer in writers]:
            self.assertIn(json.loads(saved("status_save"))["share"]["docs"], (0, 3))

    # The end of what fileindexctl says where a peer takes the request but for some bytes, sends the pieces of `answer`
    # and closes, which is a reset where something is unread. A call of the system may be at fault.
    def send(self, *words, answer=(bytes(4),), unread=0, fault="read:error=EIO:when=9999"):
        command = ["strace", "-o", TRACE, "-e", "inject=" + fault, os.environ["FILEINDEXCTL"], *words]
        client = subprocess.Popen(command, stdout=subprocess.PIPE, stderr=subprocess.STDOUT, text=True)
        with self.listener.accept()[0] as peer:
            self.request = peer.recv(int.from_bytes(peer.recv(4), "little") - unread, socket.MSG_WAITALL)
            for piece in answer if self.request else ():
                peer.send(piece)
        return client.communicate(timeout=20)[0].strip().split(": ")[-1]

    def test_a_command_is_told_whole_and_no_peer_and_no_interruption_harms(self):
        self.listener = self.enterContext(socket.create_server("/run/fileindexd.sock", family=socket.AF_UNIX))
        said = self.send("pause", "2", answer=[b"\0", b"\x10", b"\0", b"\0", *[b"x"] * 4096])
        end = json.loads(saved("status_save"))["resume_time"]
        self.assertEqual(said, time.strftime("paused until %F %T %Z", time.localtime(end)))
        self.assertEqual(json.loads(self.request[:-1]), {"type": "pause", "data": {"resume_time": end}})
        for answer in ((), (b"\xff\xff\xff\xff",), (b"\xff\xff\xff\xff{",)):
            self.assertIn("read failed, reason=Connection reset", self.send("pause", answer=answer, unread=1))
        self.assertEqual((self.send("resume"), self.request), ("running", b'{"data":null,"type":"resume"}\0'))
        with open(TRACE, encoding="utf-8", errors="replace") as file:
            read = len(re.findall(r"^read\(", file.read(), re.M))  # the last one is that of the answer
        for fault, last, said in (("error=EINTR", read + 9, "running"), ("retval=0", read + 99, "running"),
                                  ("error=EINTR", read + 10, "read failed, reason=Interrupted system call")):
            self.assertEqual(self.send("resume", fault="read:%s:when=%d..%d" % (fault, read, last)), said)
        self.assertIn("Broken pipe", self.send("resume", fault="write:error=EPIPE:signal=PIPE:when=3"))


if __name__ == "__main__":
    machine.enter()
    machine.write("/etc/vexo/shares.conf", "[docs]\npath = %s\n" % machine.SCRATCH)
    os.makedirs(ETC)
    unittest.main()
