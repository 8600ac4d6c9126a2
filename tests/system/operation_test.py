#!/usr/bin/env python3
"""Operations of several processes at once; FILEINDEX_LONG gives them their full length."""
import fcntl
import json
import os
import random
import socket
import subprocess
import threading
import time
import unittest

import private_machine as machine

BEFORE_SAVE = "617", "913"  # what the engine's failures end with; those of the daemon come when the list is saved
LIST, LOCK = "/var/packages/Quarrox/etc/fileindex.folders", "/tmp/quarrox_cfg_folder.lock"
SECONDS = "60" if os.environ.get("FILEINDEX_LONG") else "3"
YES, NO = b'{"success":true}\0', b'{"success":false,"error":{"code":617,"msg":"no"}}\0'


class Daemon:
    """Answers now so, now otherwise, as long as it is moody: slowly, half, not at all, or it refuses, or is away."""

    def __init__(self, name, moods):
        self.path, self.moods, self.random, self.indexes = "/var/run/%s.sock" % name, moods, random.Random(name), set()
        self.listen()
        threading.Thread(target=self.serve, daemon=True).start()

    def listen(self):
        self.listener = socket.socket(socket.AF_UNIX)
        self.listener.bind(self.path + ".new")
        self.listener.listen()
        os.rename(self.path + ".new", self.path)

    def serve(self):
        while True:
            with self.listener.accept()[0] as connection, connection.makefile("rwb") as frames:
                mood = self.random.choice(self.moods)
                if mood == "away":
                    self.listener.close()
                    time.sleep(0.1)
                    self.listen()
                elif mood != "gone":
                    self.answer(mood, frames)

    def answer(self, mood, frames):
        request = json.loads(frames.read(int.from_bytes(frames.read(4), "little"))[:-1])
        change = {"index_create": self.indexes.add, "index_delete": self.indexes.discard}.get(request.get("command"))
        if mood != "no" and change:
            change(request["data"]["id"])
        time.sleep(0.05 if mood == "slow" else 0)
        text = NO if mood == "no" else YES
        frames.write(len(text).to_bytes(4, "little") + text[:9 if mood == "half" else None])


def after(folders, operation):
    """The list behind an operation as it should have gone; None where it should have ended in another way."""
    _, _, what, *paths, code = operation
    if what == "delete":
        return folders if code in BEFORE_SAVE else tuple(folder for folder in folders if folder not in paths)
    refused = len(set(paths)) < len(paths) or any(path in folders for path in paths)
    if refused != (code == "901"):
        return None
    return folders if refused or code in BEFORE_SAVE else (*folders, *paths)


def outcomes(first, second):
    """Every list that some order of the two sequences of operations, in which none begins after a later one has ended,
    can end with."""
    lists = {(0, 0): {()}}
    for i in range(len(first) + 1):
        for j in range(len(second) + 1):
            ends = set()
            if i > 0 and (j == len(second) or second[j][1] >= first[i - 1][0]):
                ends |= {after(folders, first[i - 1]) for folders in lists.get((i - 1, j), ())}
            if j > 0 and (i == len(first) or first[i][1] >= second[j - 1][0]):
                ends |= {after(folders, second[j - 1]) for folders in lists.get((i, j - 1), ())}
            if ends := ends - {None}:
                lists[i, j] = ends
    return lists.get((len(first), len(second)), set())


class OperationTest(unittest.TestCase):
    def test_folders_that_two_processes_change_at_once_are_those_of_some_order(self):
        machine.write("/etc/vexo/shares.conf", "[docs]\npath={0}/docs\n[music]\npath={0}/music\n".format(machine.SCRATCH))
        for place in ("docs/a", "docs/1", "docs/2", "music/a", "music/1", "music/2"):
            os.makedirs(machine.SCRATCH + "/" + place)
        engine = Daemon("vexoelasticd", ["slow", "slow", "yes", "yes", "no", "half", "gone", "away"])
        daemon = Daemon("fileindexd", ["slow", "yes", "yes", "yes", "gone", "away"])
        churn = os.environ["TEST_PROGRAMS"] + "/folder_churn"
        both = [subprocess.Popen([churn, seed, SECONDS], stdout=subprocess.PIPE, stderr=subprocess.DEVNULL, text=True) for seed in "12"]
        said = [[line.split() for line in process.communicate()[0].splitlines()] for process in both]
        operations = [[[int(start), int(end), *rest] for start, end, *rest in lines] for lines in said]
        self.assertEqual([process.returncode for process in both], [0, 0])
        codes = {operation[-1] for lines in operations for operation in lines}
        self.assertLessEqual(codes, {"0", "502", "901", *BEFORE_SAVE})
        self.assertLessEqual({"0", "502", "901"}, codes)
        with open(LIST, encoding="utf-8") as file:
            folders = tuple(folder["path"] for folder in json.load(file))
        self.assertIn(folders, outcomes(*operations), operations)
        with open(LOCK, encoding="ascii") as lock:
            fcntl.flock(lock, fcntl.LOCK_EX | fcntl.LOCK_NB)
        engine.moods = daemon.moods = ["yes"]
        paths = ["/docs/a", "/docs/1", "/docs/2", "/music/a", "/music/1", "/music/2"]
        self.assertEqual(machine.ctl("call", "FolderDelete", json.dumps(paths))[0], 0)
        self.assertEqual((engine.indexes, os.listdir("/var/lib/vexonotifyd"), os.listdir(machine.SCRATCH + "/@fileindex")), (set(), [], []))
        self.assertEqual(machine.ctl("folder", "add", *paths)[0], 0)
        self.assertEqual(engine.indexes, {"fileindex_docs", "fileindex_music"})


if __name__ == "__main__":
    machine.enter()
    unittest.main()
