#!/usr/bin/env python3
"""The commands of fileindexctl that change folders and shares, against an engine and a daemon that agree to everything."""
import json
import os
import socket
import subprocess
import threading
import unittest

import private_machine as machine

LOCK, DOCS = "/tmp/quarrox_cfg_folder.lock", machine.SCRATCH + "/docs"


def agree(path, requests):
    """Takes and keeps every request, and whether the folder lock was held when it came."""
    listener = socket.socket(socket.AF_UNIX)
    listener.bind(path)
    listener.listen()

    def serve():
        while True:
            with listener.accept()[0] as connection, connection.makefile("rwb") as frames:
                text = frames.read(int.from_bytes(frames.read(4), "little"))
                requests.append((text, subprocess.run(["flock", "-n", LOCK, "true"]).returncode == 1))
                frames.write(b'\x11\0\0\0{"success":true}\0')

    threading.Thread(target=serve, daemon=True).start()


def refused(*arguments):
    """What fileindexctl says to bad usage."""
    result = subprocess.run([os.environ["FILEINDEXCTL"], *arguments], capture_output=True, text=True)
    return (result.returncode, result.stdout) == (2, "") and result.stderr


def folders():
    kinds = ("document", "audio", "video", "photo")
    return {folder["path"]: (folder["name"], folder["group"], *(kind for kind in kinds if folder[kind]))
            for folder in machine.ctl("folder", "list")[1]}


class OperationCommandTest(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        machine.write("/etc/vexo/shares.conf", "[docs]\npath=%s\n" % DOCS)
        os.makedirs(DOCS + "/a/b")
        cls.requests = []
        for name in ("vexoelasticd", "fileindexd"):
            agree("/var/run/%s.sock" % name, cls.requests)

    def test_folders_are_added_changed_by_what_is_named_and_deleted(self):
        self.assertEqual(machine.ctl("folder", "add", "/docs/a", "--types", "document,photo", "--group", "g")[0], 0)
        self.assertEqual(machine.ctl("folder", "add", DOCS + "/a/b/", "--name=inner", "--types=none")[0], 0)
        added = {"/docs/a": ("a", "g", "document", "photo"), "/docs/a/b": ("inner", "")}
        self.assertEqual(folders(), added)
        for code, verb, path in ((901, "add", "/docs/a"), (903, "add", "/docs/x"), (800, "add", "/nowhere"), (902, "set", "/docs/x")):
            self.assertEqual(machine.ctl("folder", verb, path, "--types=audio")[1][0]["error"]["code"], code)
        self.assertEqual(machine.ctl("folder", "set", "/docs/a/b", "--types=audio,video", "--group=h")[0], 0)
        self.assertEqual(folders(), added | {"/docs/a/b": ("inner", "h", "audio", "video")})
        self.assertEqual(machine.ctl("folder", "get", DOCS + "/a/b/")[1][0]["group"], "h")
        governed = {"code": 902, "msg": "/docs/a/c/d; it is governed by the folder /docs/a"}
        self.assertEqual(machine.ctl("folder", "get", DOCS + "/a/c/d"), (1, [{"success": False, "error": governed}]))
        self.assertEqual(machine.ctl("folder", "reindex", "/docs/a", "/void")[1][0]["passed_over"], ["/void"])
        self.assertEqual([machine.ctl("queue", "show", "docs")[1][-1][key] for key in ("op", "path")], [6, DOCS + "/a"])
        self.requests.clear()
        for verb in ("pause", "resume", "rebuild"):
            self.assertEqual(machine.ctl("share", verb, "docs")[1], [{"success": True, "share": "docs", "changed": True}])
        self.assertEqual({locked for _, locked in self.requests}, {True})
        paused = machine.ctl("call", "SharePause", '"docs"')
        self.assertEqual((paused, self.requests[-1][1]), ((0, [{"success": True, "data": None}]), False))
        self.assertTrue(machine.ctl("call", "FolderGet", '"/docs/a"')[1][0]["data"]["paused"])
        self.assertEqual(machine.ctl("folder", "delete", "/docs/a", "/docs/a/b", "/docs/c")[1][0]["passed_over"], ["/docs/c"])
        self.assertEqual(folders(), {})
        self.assertFalse(machine.ctl("share", "pause", "docs")[1][0]["changed"])

    def test_bad_usage_says_what_there_is_and_bad_arguments_what_is_wrong(self):
        self.assertIn("\n  FolderAdd folder_list updater_mode\n", refused("call", "FolderEat"))
        self.assertIn("call Pause hours\n", refused("call", "Pause"))
        for words in (["folder", "add", "--types=documents", "/docs/a"], ["folder", "add"], ["folder", "set", "/docs/a"],
                      ["folder", "delete", ""], ["share", "migrate", "docs", "a", "/b"], ["share", "pause"]):
            self.assertTrue(refused(*words), words)
        for text, why in (("/docs", "is no JSON: /docs"), ("5", "is not a string: 5")):
            status, [failure] = machine.ctl("call", "FolderGet", text)
            self.assertEqual((status, failure["success"], failure["error"]["code"]), (1, False, 120))
            self.assertIn("argument 1 of FolderGet (path) " + why, failure["error"]["msg"])

    def test_no_operation_does_anything_for_arguments_that_cannot_be(self):
        good = {"additional": [], "folder_list": [], "path_list": [], "updater_mode": False, "enable": True, "hours": 1, "offset": 0,
                "limit": 1, "resume_time": 0, "path_from": DOCS, "path_to": DOCS, "share_path": DOCS, "mount_point": machine.SCRATCH,
                "path": "/docs", "changes": {}}
        impossible = ["", "docs\0x", "/docs/a\0b", DOCS + "\0x", "docs/a" * 20000]
        self.assertEqual(machine.ctl("folder", "add", "/docs/a/b")[0], 0)
        self.requests.clear()
        find = ["find", "/var/packages", "/var/lib/vexonotifyd", machine.SCRATCH + "/@fileindex", "-type", "f", "-exec", "sha256sum", "{}", "+"]
        files = subprocess.check_output(find)
        operations = [line.split() for line in refused("call", "FolderEat").splitlines() if line.startswith("  ")]
        self.assertEqual(len(operations), 33)
        for name, *names in operations:
            for count in {len(names) + 1, len(names) - 1} - {-1}:
                self.assertIn("call " + name, refused("call", name, *["1"] * count))
            arguments = [good.get(parameter, "docs") for parameter in names]
            for place, parameter in enumerate(names):
                def call(value):
                    status, [answer] = machine.ctl("call", name, *[json.dumps(value if at == place else a) for at, a in enumerate(arguments)])
                    return status == 0 or answer["error"]["code"]
                for value in ({}, 1.5, [1]) if parameter not in ("additional", "changes") else ():
                    self.assertEqual(call(value), 120, (name, parameter, value))
                if isinstance(arguments[place], str) and (name, place) not in (("ShareRename", 0), ("ShareClearPaused", 0)):
                    list(map(call, impossible))  # to a question that is an answer, too
        self.assertEqual((subprocess.check_output(find).decode(), self.requests), (files.decode(), []))


if __name__ == "__main__":
    machine.enter()
    unittest.main()
