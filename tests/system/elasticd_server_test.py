#!/usr/bin/env python3
"""The engine's socket, under clients of every kind. Behind it is a program that answers with what it was asked."""
import concurrent.futures
import contextlib
import os
import pathlib
import resource
import select
import socket
import struct
import subprocess
import unittest

import private_machine as machine

SOCKET, SPOOL = machine.SCRATCH + "/engine.sock", machine.SCRATCH + "/spool"
PROGRAM, MIB = os.environ["TEST_PROGRAMS"] + "/engine_echo", 1 << 20
# What a sanitizer keeps for itself is no fault.
ROOM = MIB * (10 if b"__sanitizer" in pathlib.Path(PROGRAM).read_bytes() else 1)


def frame(text):
    return struct.pack("=I", len(text) + 1) + text + b"\0"


def connect(data=b""):
    client = socket.socket(socket.AF_UNIX)
    client.connect(SOCKET)
    client.sendall(data)
    return client


def answer(client):
    client.settimeout(20)
    length, data = struct.unpack("=I", client.recv(4, socket.MSG_WAITALL))[0], bytearray()
    while len(data) < length:
        data += client.recv(min(MIB, length - len(data))) or b"cut short" * MIB
    assert len(data) == length and data[-1] == 0, data[:80]
    return bytes(data[:-1])


class ElasticdServerTest(unittest.TestCase):
    def start(self, before="true"):
        pathlib.Path(SOCKET).unlink(missing_ok=True)
        self.daemon = subprocess.Popen("%s; exec '%s' %s %s" % (before, PROGRAM, SOCKET, SPOOL), shell=True)
        self.addCleanup(lambda: (self.daemon.kill(), self.daemon.wait()))
        while not os.path.exists(SOCKET):
            self.assertIsNone(self.daemon.poll())

    def stop(self):
        self.daemon.terminate()
        self.assertEqual((self.daemon.wait(10), os.path.exists(SOCKET)), (0, False))

    def memory(self, what="VmRSS"):
        return int(pathlib.Path("/proc/%d/status" % self.daemon.pid).read_text().split(what + ":")[1].split()[0]) << 10

    def test_every_request_is_answered_and_what_is_none_is_refused_with_the_reason(self):
        self.start()
        bad = {b"\0" * 4: b"empty", frame(b"a")[:-1] + b"b": b"zero byte", b"\xff" * MIB: b"4294967295 bytes is too long",
               struct.pack("=I", 256 * MIB + 1): b"268435457 bytes is too long; the longest has 268435456"}
        for client, reason in zip(map(connect, bad), bad.values()):
            self.assertEqual((reason in answer(client), client.recv(1)), (True, b""), reason)
        for client in map(connect, (frame(b"cut")[:2], frame(b"cut")[:-1])):
            client.shutdown(socket.SHUT_WR)
            self.assertEqual((answer(client), client.recv(1)), (b"The request was cut short", b""))
        client = connect(frame(b"") + frame(b"two"))
        rest = frame(b"big 5000000") + frame(b"a" * 200000) + frame(b"last")
        list(map(client.sendall, [bytes([byte]) for byte in frame(b"three")] + [rest]))
        client.shutdown(socket.SHUT_WR)
        wanted = [b"", b"two", b"three", b"x" * 5000000, b"a" * 200000, b"last"]
        self.assertEqual(([answer(client) == text for text in wanted], client.recv(1)), ([True] * 6, b""))
        if "4294967295" in pathlib.Path("/proc/self/uid_map").read_text():  # there are other users
            os.chmod(SOCKET, 0o666)
            os.seteuid(65534)
            self.assertIn(b"may not", answer(connect(frame(b"mine"))))
            os.seteuid(0)
        self.stop()

    def test_memory_is_bounded_whatever_clients_send_or_leave_unread(self):
        self.start()
        clients = [connect(struct.pack("=I", 256 * MIB) + b"a" * 1000) for _ in range(1000)]
        self.assertEqual(answer(connect(frame(b"hello"))), b"hello")
        self.assertLess(self.memory("VmHWM"), 12 * ROOM)
        clients = [connect(frame(b"big %d" % size)) for size in [50000000] + [900000] * 200]
        self.assertEqual(answer(connect(frame(b"hello"))), b"hello")
        self.assertLess(self.memory("VmHWM"), 90 * ROOM)
        self.assertEqual([len(answer(client)) for client in clients], [50000000] + [900000] * 200)
        large, sent = frame(b"l" * 6 * MIB), {connect(): 0 for _ in range(30)}
        for _ in range(100):
            for client, count in sent.items():
                client.setblocking(False)
                with contextlib.suppress(BlockingIOError):
                    sent[client] += client.send(large[count:min(count + 100000, len(large) - 1)])
            self.assertEqual(answer(connect(frame(b"small"))), b"small")
        finish = lambda client: (client.setblocking(True), client.sendall(large[sent[client]:]), answer(client))[2]
        answers = concurrent.futures.ThreadPoolExecutor(30).map(finish, sent)
        self.assertEqual({text == large[4:-1] for text in answers}, {True})
        self.assertLess(self.memory("VmHWM"), 140 * ROOM)
        self.stop()

    def test_silent_clients_hold_up_nobody_and_give_way_when_there_are_too_many(self):
        self.start()
        resource.setrlimit(resource.RLIMIT_NOFILE, [most := resource.getrlimit(resource.RLIMIT_NOFILE)[1]] * 2)
        before, count = self.memory(), min(10000, most - 600)
        silent = [connect() for _ in range(count)]
        self.assertEqual([answer(connect(frame(b"hello"))) for _ in range(100)], [b"hello"] * 100)
        self.assertLess(self.memory() - before, count * ROOM / 1024 + MIB)
        self.stop()
        self.assertEqual({answer(client) for client in silent}, {b"The engine is stopping; ask again when it runs"})
        self.start("ulimit -n 600")  # 150 of them are for clients
        begun, silent = connect(frame(b"begun")[:-1]), [connect() for _ in range(149)]
        self.assertEqual(answer(connect(frame(b"new"))), b"new")
        self.assertIn(b"Too many clients", answer(silent[0]))
        self.assertEqual((begun.send(b"\0"), answer(begun)), (1, b"begun"))

    def test_a_request_that_is_being_carried_out_is_answered_before_the_end(self):
        self.start()
        slow, also, silent, begun = map(connect, (frame(b"wait 1"), frame(b"wait 2"), b"", frame(b"begun")[:-1]))
        unread = connect(frame(b"big 3000000"))
        self.assertEqual((answer(connect(frame(b"hello"))), select.select([slow, also], [], [], 0)[0]), (b"hello", []))
        self.daemon.terminate()
        self.assertEqual([b"stopping" in answer(client) for client in (silent, begun)], [True] * 2)
        self.assertRaises(FileNotFoundError, connect)
        self.assertEqual((answer(slow), len(answer(unread)), answer(also)), (b"wait 1", 3000000, b"wait 2"))
        self.assertEqual(self.daemon.wait(10), 0)


if __name__ == "__main__":
    machine.enter()
    unittest.main(warnings="ignore")
