#!/usr/bin/env python3
"""Files that were made to harm whoever reads them, and files of all formats that are damaged, in a folder that is indexed."""
import gzip
import io
import os
import pathlib
import random
import re
import shutil
import socket
import stat
import subprocess
import sys
import threading
import time
import unittest
import zipfile

import private_machine as machine

sys.path.insert(0, str(pathlib.Path(__file__).resolve().parent.parent.parent / "bench"))
import media_corpus

VOLUME = pathlib.Path(machine.SCRATCH, "v")
DOCS, LOG = VOLUME / "docs", pathlib.Path(machine.SCRATCH, "log")
COPIES = 1000 if os.environ.get("FILEINDEX_LONG") else 10  # damaged ones of each file
PATIENCE = 3600 if os.environ.get("FILEINDEX_LONG") else 120  # seconds
MOST = 900 << 10  # of memory in KiB that a process may have had


def zipped(members, level=9):
    data = io.BytesIO()
    with zipfile.ZipFile(data, "w", zipfile.ZIP_DEFLATED, compresslevel=level) as archive:
        for name, content in members:
            archive.writestr(name, content)
    return data.getvalue()


def bombs():
    """Names and contents; each is small, and has no end, or says that it is huge."""
    zeros = gzip.compress(bytes(64 << 20))
    yield "size.gz", zeros * 40  # members one behind the other: 2.5 GiB
    yield "size.docx", zipped([("word/document.xml", "<w><p>" + "<t>boom</t>" * (8 << 20))])
    yield "count.zip", zipped([(f"{number}.txt", "") for number in range(200000)], 0)
    deep = b"the end"
    for depth in range(200):
        deep = zipped([(f"{depth}.zip", deep)])
    yield "depth.zip", deep
    yield "path.zip", zipped([("d/" * 20000 + "x", "x"), ("../../../etc/passwd", "x")])
    lol = "".join(f'<!ENTITY l{n} "{f"&l{n - 1};" * 10}">' for n in range(1, 12))
    yield "entities.xml", f'<!DOCTYPE l [<!ENTITY l0 "lol">{lol}]><l>&l11;</l>'.encode()
    yield "outside.xml", b'<!DOCTYPE l [<!ENTITY x SYSTEM "file:///etc/passwd">]><l>&x;</l>'
    yield "nested.html", b"<div>" * 2000000
    yield "loop.pdf", (b"%PDF-1.4\n1 0 obj<</Type/Catalog/Pages 2 0 R>>endobj\n2 0 obj<</Type/Pages/Count 9/Kids[2 0 R 2 0 R]/Parent 2 0 R>>"
                       b"endobj\ntrailer<</Size 3/Root 1 0 R>>\n")
    yield "pages.pdf", b"%PDF-1.4\n1 0 obj<</Type/Catalog/Pages 2 0 R>>endobj\n2 0 obj<</Type/Pages/Count 2147483647/Kids[]>>endobj\ntrailer<</Root 1 0 R>>\n"
    yield "groups.rtf", b"{\\rtf1" + b"{" * 3000000
    yield "parts.eml", b"".join(b"Content-Type: multipart/mixed; boundary=b%d\n\n--b%d\n" % (n, n) for n in range(20000))


def damaged(data, rng):
    data = bytearray(data)
    if rng.random() < 0.5:
        del data[rng.randrange(len(data)):]
    for _ in range(rng.randrange(1, 20) if data else 0):
        data[min(len(data) - 1, int(rng.expovariate(20 / len(data))) if rng.random() < 0.5 else rng.randrange(len(data)))] ^= 1 << rng.randrange(8)
    return bytes(data)


class HostileTest(unittest.TestCase):
    def until_found(self, word, *names):
        end = time.monotonic() + PATIENCE
        while (hits := sorted(os.path.basename(hit["path"]) for hit in machine.ctl("search", word)[1])) != sorted(names):
            self.assertLess(time.monotonic(), end, (hits, LOG.read_text()[-3000:]))
            time.sleep(0.1)

    def test_the_daemons_live_and_the_next_file_is_right(self):
        os.makedirs(DOCS / "damaged")
        machine.write("/etc/vexo/shares.conf", "[docs]\npath = %s\n" % DOCS)
        for name, data in bombs():
            (DOCS / name).write_bytes(data)
        os.mkfifo(DOCS / "fifo.pdf")
        os.mknod(DOCS / "zero.txt", 0o644 | stat.S_IFCHR, os.makedev(1, 5))
        with socket.socket(socket.AF_UNIX) as unix:
            unix.bind(str(DOCS / "socket.html"))
        os.symlink("/etc/passwd", DOCS / "link.txt")
        (DOCS / "huge.txt").touch()
        os.truncate(DOCS / "huge.txt", 2 << 30)
        pathlib.Path(os.fsdecode(bytes(DOCS) + b"/\xff\xfe.html")).write_text("<p>oddname</p>")
        samples, rng = DOCS / "samples", random.Random(1)
        media_corpus.make(samples, 20, iter(["a text about a numbat\n" * 30] * 100))
        for sample in samples.rglob("*.*"):
            content = sample.read_bytes()
            for number in range(COPIES):
                (DOCS / "damaged" / f"{number}-{sample.name}").write_bytes(damaged(content, rng))

        with open(LOG, "w") as log:
            daemons = [subprocess.Popen([os.environ[name], "--foreground"], stderr=log) for name in ("VEXOELASTICD", "FILEINDEXD", "VEXONOTIFYD")]
            self.addCleanup(lambda: [(daemon.kill(), daemon.wait()) for daemon in daemons])
            while not os.path.exists("/run/vexoelasticd.sock") or "error" in machine.ctl("folder", "add", "/docs")[1][0]:
                time.sleep(0.1)
            stop, shifty = threading.Event(), DOCS / "shifty.docx"

            def change():
                whole = zipped([("word/document.xml", "<w><t>shift</t></w>" * 20000)], 0)
                while not stop.wait(0.01):
                    shifty.write_bytes(whole[:rng.randrange(len(whole))])
                    if rng.random() < 0.3:
                        shifty.unlink()
                shifty.write_bytes(zipped([("word/document.xml", "<w><t>settled</t></w>")]))

            changer = threading.Thread(target=change)
            changer.start()
            self.until_found("oddname", "\udcff\udcfe.html")
            (DOCS / "next.txt").write_text("a letter about a wombat")
            (DOCS / "next.html").write_text("<p>a page about a wombat")
            self.until_found("wombat", "next.txt", "next.html")
            stop.set()
            changer.join()
            self.until_found("settled", "shifty.docx")
            self.assertEqual([daemon.poll() for daemon in daemons], [None] * 3)
            peaks = {pid: int(re.search(r"VmHWM:\s+(\d+)", pathlib.Path(f"/proc/{pid}/status").read_text())[1])
                     for pid in subprocess.getoutput("ps -e -o pid= -o comm= | grep -E 'vexo|fileindexd' | awk '{print $1}'").split()
                     if os.path.exists(f"/proc/{pid}/status") and os.readlink(f"/proc/{pid}/ns/mnt") == os.readlink("/proc/self/ns/mnt")}
            self.assertLess(max(peaks.values()), MOST, peaks)
            print("largest process: %d MiB" % (max(peaks.values()) >> 10), file=sys.stderr)
            self.assertEqual(machine.ctl("search", "nologin")[1], [])  # of /etc/passwd
            status, lines = machine.ctl("audit", "docs", "--wait", str(PATIENCE))
            self.assertEqual(status, 0, lines[-5:])


if __name__ == "__main__":
    machine.enter()
    shutil.rmtree(VOLUME, ignore_errors=True)
    unittest.main()
