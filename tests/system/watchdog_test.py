#!/usr/bin/env python3
"""What the daemons tell the service manager: it comes from their loops, and stops with them."""
import os
import socket
import subprocess
import time
import unittest

import private_machine as machine
from elasticd_server_test import PROGRAM, SOCKET, SPOOL, answer, connect, frame

READY, INTERVAL = machine.SCRATCH + "/ready", 0.2  # seconds; a word is due in half of it
ALIVE = b"WATCHDOG=1\nEXTEND_TIMEOUT_USEC=%d"
FOLDERS, CONFIGS, DOCS = "/var/packages/Quarrox/etc/fileindex.folders", "/var/lib/vexonotifyd/", machine.SCRATCH + "/v/docs"


class WatchdogTest(unittest.TestCase):
    def setUp(self):
        self.manager = socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM)
        self.manager.bind(READY)
        self.addCleanup(lambda: (self.manager.close(), os.unlink(READY)))

    def start(self, *command, interval=INTERVAL):
        usec = {"WATCHDOG_USEC": str(int(interval * 1e6))} if interval else {}
        self.daemon = subprocess.Popen(command, env={**os.environ, "NOTIFY_SOCKET": READY, **usec})
        self.addCleanup(lambda daemon: (daemon.kill(), daemon.wait()), self.daemon)

    def heard(self, seconds):
        """What was said in that time."""
        words, end = [], time.monotonic() + seconds
        while (left := end - time.monotonic()) > 0:
            self.manager.settimeout(left)
            try:
                words.append(self.manager.recv(99))
            except TimeoutError:
                break
        return words

    def expect_alive(self):
        self.manager.settimeout(20)
        self.assertEqual([self.manager.recv(99) for _ in range(3)], [ALIVE % (INTERVAL * 1e6)] * 3)

    def expect_silence(self):
        self.heard(INTERVAL)  # what was on its way
        self.assertEqual(self.heard(2 * INTERVAL), [])

    def expect_ready(self):
        self.manager.settimeout(20)
        self.assertEqual(self.manager.recv(99), b"READY=1")

    def test_the_engine_is_alive_while_there_is_a_thread_for_the_next_client_and_long_requests_do_not_count(self):
        self.start(PROGRAM, SOCKET, SPOOL)
        self.expect_alive()
        self.assertLess(len(self.heard(5 * INTERVAL)), 14)  # nothing wakes it oftener than it must
        slow = connect(frame(b"wait 1"))
        self.expect_alive()
        all_threads = [connect(frame(b"wait 2")) for _ in range(300)]
        self.assertEqual(answer(slow), b"wait 1")
        self.expect_silence()
        for client in all_threads[:256]:
            answer(client)
        self.expect_alive()
        for client in (slow, *all_threads):
            client.close()

    def test_a_loop_that_hangs_says_nothing_and_one_that_nobody_asks_neither(self):
        for variable, hang in ("FILEINDEXD", FOLDERS), ("VEXONOTIFYD", CONFIGS + "docs.json"):
            with self.subTest(variable):
                self.start(os.environ[variable], "--foreground")
                self.expect_ready()
                self.expect_alive()
                os.makedirs(os.path.dirname(hang), exist_ok=True)
                os.mkfifo(hang + ".new")
                os.rename(hang + ".new", hang)  # opening it takes until somebody writes to it
                self.expect_silence()
                writer = os.open(hang, os.O_RDWR)  # closed when it cannot be opened again
                os.unlink(hang)
                os.close(writer)
                self.expect_alive()
                self.daemon.kill()
                self.daemon.wait()
                self.heard(0.1)
        self.start(os.environ["VEXOELASTICD"], "--foreground", interval=None)
        self.expect_ready()
        self.assertEqual(self.heard(INTERVAL), [])

    def test_a_start_that_takes_long_asks_for_more_time_while_it_gets_on(self):
        subprocess.run(["sh", "-c", "mkdir -p $0 && cd $0 && seq 20000 | xargs mkdir", DOCS], check=True)
        self.start(os.environ["VEXONOTIFYD"], "--method", "inotify", "--watch", DOCS, "--queue", DOCS + "/q", interval=0.02)
        self.manager.settimeout(20)
        self.assertEqual(self.manager.recv(99), ALIVE % 20000)


if __name__ == "__main__":
    machine.enter()
    unittest.main()
