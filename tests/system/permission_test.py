#!/usr/bin/env python3
"""What a search as a user finds is what that user may open, with the real daemons VEXOELASTICD, VEXONOTIFYD and FILEINDEXD."""
import json
import os
import pathlib
import random
import select
import shutil
import socket
import struct
import subprocess
import time
import unittest

import private_machine as machine

VOLUME = pathlib.Path(machine.SCRATCH, "v")
DOCS, LOG = VOLUME / "docs", VOLUME / "log"
USERS = {"u%d" % n: 2000 + n for n in range(6)}
GROUPS = {"g%d" % n: 3000 + n for n in range(4)}
MEMBERS = {"g0": ["u0", "u1"], "g1": ["u1", "u2", "u3"], "g2": ["u4"], "g3": []}
MODES = [0o644, 0o640, 0o600, 0o604, 0o444, 0o040, 0o000, 0o660, 0o004]
DIRECTORY_MODES = [0o755, 0o755, 0o755, 0o750, 0o711, 0o700, 0o770, 0o705, 0o777]


def as_user(name, work):
    """What `work` prints, run as a user."""
    groups = [GROUPS[group] for group, members in MEMBERS.items() if name in members]
    become = lambda: (os.setgroups(groups), os.setgid(USERS[name]), os.setuid(USERS[name]))
    reader, writer = os.pipe()
    if (child := os.fork()) == 0:
        try:
            become()
            os.write(writer, json.dumps(work()).encode())
        except OSError as error:
            os.write(writer, json.dumps(str(error)).encode())
        finally:
            os._exit(0)
    os.close(writer)
    with open(reader, "rb") as answer:
        text = answer.read()
    os.waitpid(child, 0)
    return json.loads(text)


def may_open(path):
    try:
        os.close(os.open(path, os.O_RDONLY | os.O_NOFOLLOW))
        return True
    except PermissionError:
        return False


def ask(place, command="document_get_by_query", user=None, **query):
    query = {"load_field": ["VEXOMDPath", "_snippet"], **query}
    data = {"id": "fileindex_docs", "query": query, **({"as": user} if user else {})}
    text = json.dumps({"command": command, "data": data}).encode() + b"\0"
    with socket.socket(socket.AF_UNIX) as client:
        client.connect(place)
        client.sendall(struct.pack("I", len(text)) + text)
        with client.makefile("rb") as answer:
            return json.loads(answer.read(struct.unpack("I", answer.read(4))[0])[:-1])


def line(text, user=None, **query):
    return ask("/run/vexoelasticd.sock", user=user, qsl={"query_string": text}, **query)


@unittest.skipIf("4294967295" not in pathlib.Path("/proc/self/uid_map").read_text(), "other users need root")
class PermissionTest(unittest.TestCase):
    def start(self, name, *arguments):
        process = subprocess.Popen([os.environ[name], *arguments], stderr=self.log)
        self.addCleanup(lambda: (process.terminate(), process.wait()))

    def until_idle(self):
        subprocess.run([os.environ["FILEINDEXCTL"], "status", "--follow", "--until-idle"], check=True, stdout=self.log)

    def until(self, expected, look):
        end = time.monotonic() + 20
        while (seen := look()) != expected:
            self.assertLess(time.monotonic(), end, (seen, expected))
            time.sleep(0.02)

    def setUp(self):
        for place in VOLUME, pathlib.Path("/var/packages"), pathlib.Path("/var/lib/vexonotifyd"), VOLUME.parent / "engine":
            shutil.rmtree(place, ignore_errors=True)
        os.makedirs(DOCS)
        with open("/etc/passwd", "a") as users, open("/etc/group", "a") as groups:
            users.writelines("%s:x:%d:%d::/:/bin/sh\n" % (name, uid, uid) for name, uid in USERS.items())
            groups.writelines("%s:x:%d:%s\n" % (name, gid, ",".join(MEMBERS[name])) for name, gid in GROUPS.items())
        machine.write("/etc/vexo/shares.conf", "[docs]\npath = %s\n" % DOCS)
        self.log = self.enterContext(open(LOG, "w"))
        self.random = random.Random(int(os.environ.get("SEED", "1")))
        self.paths = []
        self.words = {}

    def serve(self):
        self.start("VEXOELASTICD", "--foreground", "--data", machine.SCRATCH + "/engine")
        self.start("VEXONOTIFYD", "--foreground")
        self.start("FILEINDEXD", "--foreground")
        self.assertEqual(machine.ctl("folder", "add", "/docs", "--types", "document")[0], 0)
        self.until_idle()

    def make(self, path, text, uid=None, gid=None, mode=None):
        path.write_text(text)
        self.own(path, MODES, uid, gid, mode)

    def own(self, path, modes, uid=None, gid=None, mode=None):
        choose = self.random.choice
        os.chown(path, choose([*USERS.values()]) if uid is None else uid, choose([*GROUPS.values()]) if gid is None else gid)
        os.chmod(path, choose(modes) if mode is None else mode)
        if mode is None and self.random.random() < 0.3:
            who = choose(["u:%s" % choose([*USERS]), "g:%s" % choose([*GROUPS])])
            subprocess.run(["setfacl", "-m", who + ":" + choose(["r", "rx", "---", "rwx"]), path], check=True)

    def grow(self, directory, depth, most):
        for number in range(self.random.randint(2, 9)):
            if len(self.paths) < most:
                path = directory / ("f%d.txt" % number)
                self.words[str(path)] = "word" + "".join(self.random.choices("abcdefghij", k=9))
                self.paths.append(str(path))
                self.make(path, "common %s %s" % (self.words[str(path)], "rare" if self.random.random() < 0.2 else ""))
        for number in range(self.random.randint(1, 4) if depth else 0):
            inner = directory / ("d%d" % number)
            inner.mkdir()
            self.grow(inner, depth - 1, most)
            self.own(inner, DIRECTORY_MODES)

    def pages(self, text, user, size):
        hits = []
        while True:
            answer = line(text, user, **{"from": len(hits), "size": size})
            page = [hit["VEXOMDPath"] for hit in answer["data"]]
            hits += page
            if len(page) < size:
                return hits, answer["total"]

    def test_a_search_as_a_user_finds_what_the_user_may_open(self):
        while len(self.paths) < 250:
            top = DOCS / ("top%d" % len(self.paths))
            top.mkdir()
            self.grow(top, 4, len(self.paths) + 120)
            os.chmod(top, 0o755)
        self.serve()
        self.assertEqual(machine.ctl("suggest", "rebuild")[0], 0)
        rare = {hit["VEXOMDPath"] for hit in line("rare")["data"]}
        self.assertEqual(line("common", "root")["total"], len(self.paths))
        counts = set()
        for user in USERS:
            mine = as_user(user, lambda: [path for path in self.paths if may_open(path)])
            hidden = set(self.paths) - set(mine)
            counts.add(len(mine))
            for text, expected in ("common", set(mine)), ("rare", rare & set(mine)), ("common -rare", set(mine) - rare):
                for size in (1, 7, 64, 5000):
                    hits, total = self.pages(text, user, size)
                    self.assertEqual(sorted(hits), sorted(expected), (user, text, size))
                    self.assertEqual(total, len(expected), (user, text, size))
                first = line(text, user, size=10)
                self.assertEqual((len(first["data"]), "at_least" in first), (min(10, len(expected)), not first["exact"]))
                self.assertLessEqual(first["total"], len(expected))
                self.assertGreaterEqual(first["total"], min(100, len(expected)))
            for path in self.random.sample(self.paths, 40):
                word = self.words[path]
                meant = line(word[:-1] + "x", user, suggest=True).get("suggestion")
                self.assertTrue(meant is None or any(self.words[readable] == meant for readable in mine), (user, meant))
                self.assertEqual(meant is not None, path in mine)
                typed = "%sx OR %sx" % (word[:-1], self.words[mine[0]][:-1])
                meant = line(typed, user, suggest=True).get("suggestion", "")
                self.assertIn(self.words[mine[0]], meant)
                self.assertEqual(word in meant, path in mine, (user, typed, meant))
                self.assertEqual(line(word, user)["total"], int(path not in hidden))
                self.assertEqual(line('"common %s" OR name:nothing' % word, user)["total"], int(path not in hidden))
        self.assertGreater(len(counts), 3)
        scores = [line("common rare", "u0", load_field=["VEXOMDPath", "_score"])["data"] for _ in range(2)]
        (DOCS / "secret").mkdir(0o700)
        for number in range(30):
            self.make(DOCS / "secret" / ("s%d.txt" % number), "rare common", 0, 0, 0o644)
        self.until_idle()
        self.assertEqual(line("common rare", "u0", load_field=["VEXOMDPath", "_score"])["data"], scores[0])

    def test_an_ordinary_user_searches_as_nobody_but_themselves(self):
        for name, mode in ("open", 0o644), ("closed", 0o600):
            self.make(DOCS / (name + ".txt"), "common " + name, 0, 0, mode)
        self.serve()
        search = [os.environ["FILEINDEXCTL"], "search", "--json"]
        run = lambda *arguments: subprocess.run([*search, *arguments], stdout=subprocess.PIPE, stderr=self.log).stdout.decode()
        found = lambda *arguments: [json.loads(row).get("path") for row in run(*arguments).splitlines()]
        own = "/run/vexosearch.sock"
        self.assertEqual(as_user("u0", lambda: found("common")), [str(DOCS / "open.txt")])
        self.assertEqual(as_user("u0", lambda: found("common", "--as", "u0")), [str(DOCS / "open.txt")])
        self.assertEqual(sorted(found("common")), [str(DOCS / "closed.txt"), str(DOCS / "open.txt")])
        self.assertEqual(found("common", "--as", "u0"), [str(DOCS / "open.txt")])
        for user in "u1", "nobody-at-all":
            self.assertEqual(json.loads(as_user("u0", lambda: run("common", "--as", user)))["error"]["code"], 612)
        self.assertIn("no user", json.loads(run("common", "--as", "nobody-at-all"))["error"]["msg"])
        for field in {"term": {"VEXOMDPath": str(DOCS / "closed.txt")}}, {"prefix": {"VEXOMDPath": str(DOCS)}}, \
                {"match": {"_all": "closed"}}, {"range": {"VEXOMDFSSize": {"gte": 0}}}:
            hits = as_user("u0", lambda: ask(own, qsl=field))["data"]
            self.assertNotIn(str(DOCS / "closed.txt"), [hit["VEXOMDPath"] for hit in hits])
        self.assertEqual(as_user("u0", lambda: ask(own, "document_del_by_query", qsl={"query_string": "common"}))["error"]["code"], 615)
        self.assertEqual(as_user("u0", lambda: ask(own, qsl={"query_string": "x" * (2 << 20)}))["error"]["code"], 616)
        self.assertIn("denied", as_user("u0", lambda: ask("/run/vexoelasticd.sock", qsl={"query_string": "common"})))

    def test_what_a_user_may_not_read_shows_in_nothing_that_is_told(self):
        for number in range(100):
            for kind in "csv", "md":
                self.make(DOCS / ("n%d.%s" % (number, kind)), "common", 0, 0, 0o644)
        self.make(DOCS / "own.txt", "blackbiryz zebra merger", 0, 0, 0o644)
        self.make(DOCS / "hidden.csv", "blackbird merger zebra robin", 0, 0, 0o600)
        self.make(DOCS / "words.txt", " ".join("robin%04d wren%04d" % (n, n) for n in range(1000)), 0, 0, 0o644)
        self.serve()
        self.assertEqual(machine.ctl("suggest", "rebuild")[0], 0)
        self.assertEqual(line("blackbirx", suggest=True)["suggestion"], "blackbird")
        self.assertEqual(line("blackbirx", "u0", suggest=True)["suggestion"], "blackbiryz")
        told = [{key: line(text, "u0", size=1).get(key) for key in ("total", "exact", "at_least", "cut")} for text in ("ext:csv", "ext:md")]
        self.assertEqual(told[0], told[1])
        self.assertTrue(line("robin*")["cut"])
        self.assertEqual([(answer["total"], "cut" in answer) for answer in (line("robin*", "u0"), line("wren*", "u0"))], [(1, False)] * 2)
        self.assertEqual(line("robin0999 robin*", "u0")["total"], 1)
        phrase = '"merger zebra" OR ' * 60 + "nothing"
        self.assertEqual(line(phrase, "u0")["total"], 0)
        own = "/run/vexosearch.sock"

        def crowd():
            clients = [socket.socket(socket.AF_UNIX) for _ in range(40)]
            for client in clients:
                client.connect(own)
            time.sleep(0.3)
            answered = len(select.select(clients, [], [], 0)[0])
            return answered

        self.assertEqual(as_user("u0", crowd), 24)
        for many in {"query_string": "path:*n*"}, {"term": {"VEXOMDSearchAncestor": "/"}}, {"prefix": {"VEXOMDPath": "/"}}:
            self.assertEqual(as_user("u0", lambda: ask(own, qsl={"bool": {"should": [many] * 20}}))["error"]["code"], 613)
        self.assertEqual(as_user("u0", lambda: ask(own, qsl={"query_string": "common"}, sort=["VEXOMDFSSize"] * 20))["error"]["code"], 613)

    def test_what_was_put_in_the_place_of_another_file_shows_nothing_of_it(self):
        (DOCS / "all").mkdir()
        os.chmod(DOCS / "all", 0o777)
        (DOCS / "all/bobs").mkdir(0o700)
        for path in DOCS / "all/plan.txt", DOCS / "all/bobs/plan.txt":
            self.make(path, "common secret", USERS["u1"], GROUPS["g2"], 0o640)
        os.chown(DOCS / "all/bobs", USERS["u1"], USERS["u1"])
        self.make(DOCS / "all/owned.txt", "common hoard", USERS["u1"], GROUPS["g2"], 0o600)
        os.symlink("x" * len("common hoard"), DOCS / "all/link")
        for path in DOCS / "all/owned.txt", DOCS / "all/link":
            os.utime(path, (10**9, 10**9), follow_symlinks=False)
        os.chown(DOCS / "all/link", USERS["u1"], GROUPS["g2"], follow_symlinks=False)
        (DOCS / "all/public").mkdir()
        os.chown(DOCS / "all/public", USERS["u1"], GROUPS["g2"])
        self.make(DOCS / "all/other.txt", "common second", USERS["u1"], GROUPS["g2"], 0o644)
        self.serve()
        seen = lambda text: sorted(hit["VEXOMDPath"] for hit in line(text, "u0")["data"])
        self.assertEqual((seen("secret"), seen("second")), ([], [str(DOCS / "all/other.txt")]))
        self.assertEqual(machine.ctl("pause")[0], 0)

        def swap():
            for directory in DOCS / "all", DOCS / "all/bobs":
                if directory.name == "bobs":
                    os.rename(directory, DOCS / "all/aside")
                    directory.mkdir()
                else:
                    os.rename(directory / "plan.txt", directory / "mine.txt")
                (directory / "plan.txt").write_text("common sicret")
                moment = os.stat(DOCS / "all/mine.txt")
                os.utime(directory / "plan.txt", ns=(moment.st_atime_ns, moment.st_mtime_ns))
            return may_open(DOCS / "all/plan.txt") and may_open(DOCS / "all/bobs/plan.txt")

        self.assertTrue(as_user("u0", swap))
        self.assertEqual(seen("secret"), [])
        as_user("u0", lambda: (os.rename(DOCS / "all/owned.txt", DOCS / "all/kept.txt"), os.rename(DOCS / "all/public", DOCS / "all/owned.txt")))
        self.assertEqual(seen("hoard"), [])
        as_user("u0", lambda: (os.rename(DOCS / "all/owned.txt", DOCS / "all/public"), os.rename(DOCS / "all/link", DOCS / "all/owned.txt")))
        self.assertEqual(seen("hoard"), [])
        as_user("u0", lambda: (os.rename(DOCS / "all/owned.txt", DOCS / "all/link"), os.rename(DOCS / "all/kept.txt", DOCS / "all/owned.txt")))
        os.chmod(DOCS / "all/other.txt", 0o600)
        self.assertEqual(seen("second"), [])
        self.assertEqual(machine.ctl("resume")[0], 0)
        self.until([str(DOCS / "all/bobs/plan.txt"), str(DOCS / "all/plan.txt")], lambda: seen("sicret"))
        with open(DOCS / "all/owned.txt", "w") as other:  # what is in the index is what was there before
            (other.write("common public"), other.flush())
            os.chmod(DOCS / "all/owned.txt", 0o644)
            self.until([str(DOCS / "all/owned.txt")], lambda: seen("public ext:txt"))
            self.assertEqual(seen("hoard"), [])
        os.chmod(DOCS / "all/other.txt", 0o644)
        self.until([str(DOCS / "all/other.txt")], lambda: seen("second"))


if __name__ == "__main__":
    machine.enter()
    unittest.main()
