#!/usr/bin/env python3
"""The engine, killed, with damaged databases, and on a disk without room."""
import json
import os
import pathlib
import random
import shutil
import socket
import struct
import subprocess
import threading
import time
import unittest

import private_machine as machine

SOCKET, DATA, VOLUME = "/var/run/vexoelasticd.sock", machine.SCRATCH + "/engine", machine.SCRATCH + "/volume"
KILLS = 50 if os.environ.get("FILEINDEX_LONG") else 12
MAPPINGS = {"property_id": "VEXOMDPath",
            "default": {"type": "string", "analyzer": "vexostandard", "required": False, "stored": True, "_all": True},
            "properties": {"VEXOMDPath": {"analyzer": "keyword", "required": True, "_all": False},
                           "VEXOMDTextContent": {"type": "text"}, "VEXOMDFSSize": {"type": "int"}}}


def ask(command, **data):
    with socket.socket(socket.AF_UNIX) as client:
        client.connect(SOCKET)
        text = json.dumps({"command": command, "data": data}).encode() + b"\0"
        client.sendall(struct.pack("=I", len(text)) + text)
        received = bytearray()
        while piece := client.recv(1 << 20):
            received += piece
            if len(received) >= 4 and len(received) == 4 + struct.unpack_from("=I", received)[0]:
                return json.loads(received[4:-1])
    raise ConnectionError


def code(response):
    return 0 if response["success"] else response["error"]["code"]


class ElasticdInjuryTest(unittest.TestCase):
    def setUp(self):
        for place in (DATA, VOLUME):
            shutil.rmtree(place, ignore_errors=True)
        self.start()
        self.addCleanup(lambda: (self.engine.kill(), self.engine.wait()))

    def start(self):
        self.engine = subprocess.Popen([os.environ["VEXOELASTICD"], "--foreground", "--data", DATA],
                                       stderr=subprocess.DEVNULL)
        for _ in range(500):
            try:
                return ask("list_term_sugg_db")
            except OSError:
                time.sleep(0.01)
        self.fail("the engine does not answer")

    def create(self, index, place=VOLUME):
        os.makedirs(place, exist_ok=True)
        self.assertEqual(0, code(ask("index_create", id=index, path=place + "/" + index, settings={}, mappings=MAPPINGS,
                                     event_handler={})))

    def upsert(self, index, path, text):
        return ask("document_upsert_by_id", id=index, doc_id=path,
                   data={"VEXOMDPath": path, "VEXOMDTextContent": text, "VEXOMDFSSize": len(text)})

    def find(self, index, query):
        """The texts by path, once nothing is being checked any more."""
        response = ask("document_get_by_query", id=index, query={"qsl": query})
        while code(response) == 608:
            time.sleep(0.05)
            response = ask("document_get_by_query", id=index, query={"qsl": query})
        self.assertTrue(response["success"], response)
        return {hit["VEXOMDPath"]: hit["VEXOMDTextContent"] for hit in response["data"]}

    def load(self, seed):
        """Changes documents until the engine is gone: what was committed, and what each path may hold besides."""
        rng, committed, maybe = random.Random(seed), dict(self.committed), {}
        try:
            while True:
                path = "/v/%d/%d" % (rng.randrange(5), rng.randrange(40))
                text = None if rng.random() < 0.2 else "word%d " % rng.randrange(10**9) * rng.randrange(1, 400)
                maybe.setdefault(path, []).append(text)
                self.assertTrue((self.upsert("a", path, text) if text else
                                 ask("document_del_by_id", id="a", doc_id=path))["success"])
                if rng.random() < 0.05 and ask("commit", id="a")["success"]:
                    committed.update({path: texts[-1] for path, texts in maybe.items()})
                    maybe = {}
        except OSError:
            self.committed, self.maybe = committed, maybe

    def test_what_was_committed_survives_every_kill_and_the_rest_is_whole_or_absent(self):
        self.create("a")
        self.committed, rng = {}, random.Random(5)
        for kill in range(KILLS):
            worker = threading.Thread(target=self.load, args=(kill,))
            worker.start()
            time.sleep(rng.uniform(0.01, 0.4))
            self.engine.kill()
            self.engine.wait()
            worker.join()
            self.start()
            found = self.find("a", {"prefix": {"VEXOMDPath": "/"}})
            for path in self.committed.keys() | self.maybe.keys() | found.keys():
                self.assertIn(found.get(path), [self.committed.get(path), *self.maybe.get(path, [])], path)
            self.committed = found
            for path, text in random.Random(kill).sample(sorted(found.items()), min(5, len(found))):
                self.assertIn(path, self.find("a", {"match": {"VEXOMDTextContent": text.split()[0]}}))
                self.assertIn(path, self.find("a", {"range": {"VEXOMDFSSize": {"gte": len(text), "lte": len(text)}}}))
        self.assertGreater(len(self.committed), 50)

    def damage(self, how, index):
        files = pathlib.Path(VOLUME, index, "index")
        table = files / ("postlist.glass" if index < "m" else "termlist.glass")
        content = bytearray(table.read_bytes())
        if how == "missing":
            return table.unlink()
        if how == "truncated":
            return table.write_bytes(content[:len(content) // 2])
        rng = random.Random(how + index)
        for _ in range(40):
            content[rng.randrange(len(content))] ^= 1 << rng.randrange(8)
        table.write_bytes(content)

    def test_a_damaged_database_is_set_aside_and_the_others_are_served(self):
        indexes = {how + suffix: how for how in ("flipped", "missing", "truncated") for suffix in ("", "2", "3")}
        indexes = {("a" if number % 2 else "z") + index: how for number, (index, how) in enumerate(indexes.items())}
        texts = {"/v/%d" % number: "text %d " % number * 50 for number in range(300)}
        for index in ["sound", *indexes]:
            self.create(index)
            for path, text in texts.items():
                self.upsert(index, path, text)
        self.engine.terminate()
        self.assertEqual(0, self.engine.wait(20))
        for index, how in indexes.items():
            self.damage(how, index)
        self.start()
        self.assertEqual(texts, self.find("sound", {"prefix": {"VEXOMDPath": "/"}}))
        for index in indexes:
            answer = ask("document_get_by_query", id=index, query={"qsl": {"prefix": {"VEXOMDPath": "/"}}})
            while code(answer) == 608:
                time.sleep(0.05)
                answer = ask("document_get_by_query", id=index, query={"qsl": {"prefix": {"VEXOMDPath": "/"}}})
            self.assertEqual((609, index), (code(answer), index))
            self.assertTrue(os.path.isdir("%s/%s/index.damaged" % (VOLUME, index)))
            self.create(index)
            self.assertEqual(0, code(self.upsert(index, "/v/new", "text")))
            self.assertEqual({"/v/new": "text"}, self.find(index, {"prefix": {"VEXOMDPath": "/"}}))

    def test_a_disk_without_room_loses_nothing_that_was_committed_and_says_what_it_lost(self):
        small = machine.SCRATCH + "/small"
        os.makedirs(small, exist_ok=True)
        subprocess.run(["mount", "-t", "tmpfs", "-o", "size=6m", "small", small], check=True)
        self.addCleanup(lambda: subprocess.run(["umount", "-l", small]))
        self.create("full", small)
        kept, rng = {}, random.Random(1)
        for number in range(20):
            kept["/v/%d" % number] = text = "%030x " % rng.getrandbits(120)
            self.upsert("full", "/v/%d" % number, text)
        self.assertEqual(0, code(ask("commit", id="full")))
        ballast = pathlib.Path(small, "ballast")
        with open(ballast, "wb") as file:
            free = os.statvfs(small)
            file.write(b"x" * (free.f_bavail * free.f_bsize - 200000))
        codes = set()
        for number in range(3000):
            codes.add(code(self.upsert("full", "/v/more%d" % number, "%0500x " % rng.getrandbits(2000))))
        codes.add(code(ask("commit", id="full")))
        self.assertIn(618, codes)
        self.assertEqual(kept, {path: text for path, text in self.find("full", {"prefix": {"VEXOMDPath": "/"}}).items()
                                if path in kept})
        ballast.unlink()
        while code(ask("commit", id="full")) != 0:
            codes.add(0)  # what was lost is said once
        self.assertEqual(0, code(self.upsert("full", "/v/last", "text")))
        self.assertEqual(0, code(ask("commit", id="full")))
        self.assertIn("/v/last", self.find("full", {"match": {"VEXOMDTextContent": "text"}}))


if __name__ == "__main__":
    machine.enter()
    unittest.main()
