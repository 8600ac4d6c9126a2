#!/usr/bin/env python3
"""Operations of several processes at once; FILEINDEX_LONG gives them their full length."""
import fcntl
import json
import os
import socket
import subprocess
import threading
import time
import unittest

import private_machine as machine

LIST, LOCK = "/var/packages/Quarrox/etc/fileindex.folders", "/tmp/quarrox_cfg_folder.lock"
COUNT = 100 if os.environ.get("FILEINDEX_LONG") else 25


def answer_slowly(path, seconds):
    """A daemon that takes its time to say yes to every request."""
    listener = socket.socket(socket.AF_UNIX)
    listener.bind(path)
    listener.listen()

    def answer(connection):
        with connection, connection.makefile("rwb") as frames:
            frames.read(int.from_bytes(frames.read(4), "little"))
            time.sleep(seconds)
            text = b'{"success":true}\0'
            frames.write(len(text).to_bytes(4, "little") + text)

    def serve():
        while True:
            threading.Thread(target=answer, args=(listener.accept()[0],), daemon=True).start()

    threading.Thread(target=serve, daemon=True).start()


def after(folders, operation):
    """The list behind an operation as it should have gone; None where it should have ended in another way."""
    what, *paths, code = operation.split()
    if what == "delete":
        return tuple(folder for folder in folders if folder not in paths) if code == "0" else None
    refused = len(set(paths)) < len(paths) or any(path in folders for path in paths)
    if code != ("901" if refused else "0"):
        return None
    return folders if refused else (*folders, *paths)


def outcomes(first, second):
    """Every list that some order of the two sequences of operations can end with."""
    lists = {(0, 0): {()}}
    for i in range(len(first) + 1):
        for j in range(len(second) + 1):
            ends = [after(folders, first[i - 1]) for folders in lists.get((i - 1, j), ())]
            ends += [after(folders, second[j - 1]) for folders in lists.get((i, j - 1), ())]
            lists.setdefault((i, j), set()).update(end for end in ends if end is not None)
    return lists[len(first), len(second)]


class OperationTest(unittest.TestCase):
    def test_folders_that_two_processes_change_at_once_are_those_of_some_order(self):
        machine.write("/etc/vexo/shares.conf", "[docs]\npath={0}/docs\n[music]\npath={0}/music\n".format(machine.SCRATCH))
        for place in ("docs/a", "docs/1", "docs/2", "music/a", "music/1", "music/2"):
            os.makedirs(machine.SCRATCH + "/" + place)
        answer_slowly("/var/run/vexoelasticd.sock", 0.1)  # while an operation has its list in memory
        answer_slowly("/var/run/fileindexd.sock", 0.01)
        churn = os.environ["TEST_PROGRAMS"] + "/folder_churn"
        both = [subprocess.Popen([churn, seed, str(COUNT)], stdout=subprocess.PIPE, text=True) for seed in "12"]
        operations = [process.communicate()[0].splitlines() for process in both]
        self.assertEqual([len(lines) for lines in operations] + [process.returncode for process in both], [COUNT] * 2 + [0] * 2)
        with open(LIST, encoding="utf-8") as file:
            folders = tuple(folder["path"] for folder in json.load(file))
        self.assertIn(folders, outcomes(*operations), operations)
        with open(LOCK, encoding="ascii") as lock:
            fcntl.flock(lock, fcntl.LOCK_EX | fcntl.LOCK_NB)


if __name__ == "__main__":
    machine.enter()
    unittest.main()
