#!/usr/bin/env python3
"""The shares of a plain machine, from its files to the command FILEINDEXCTL: shares.conf, and Samba's by testparm."""
import os
import subprocess
import unittest

import private_machine as machine

OWN, SAMBA, INCLUDED = "/etc/vexo/shares.conf", "/etc/samba/smb.conf", "/etc/samba/more.conf"
VOLUME = machine.SCRATCH + "/v"


def shares():
    """The directories of all shares by name, and what is told beside the list."""
    told = subprocess.run([os.environ["FILEINDEXCTL"], "share", "list"], capture_output=True).stderr.decode()
    return {share["name"]: share["path"] for share in machine.ctl("share", "list")[1]}, told.splitlines()


class ShareTest(unittest.TestCase):
    def setUp(self):
        subprocess.run(["rm", "-rf", OWN, SAMBA, INCLUDED, VOLUME], check=True)

    def test_samba_s_shares_are_found_as_testparm_reads_them(self):
        names = ["docs", "homes", "two words", 'größe "x"', "n" * 255]
        for name in names + ["docs/#recycle", "more", "moved/more"]:
            os.makedirs("%s/%s" % (VOLUME, name))
        machine.write(INCLUDED, "[more]\npath = %s/more\n" % VOLUME)
        machine.write(SAMBA, (
            "[global]\nread only = no\ninclude = INCLUDED\n[docs]\npath = VOLUME//docs/%U\nvfs objects = ro recycle\n"
            "recycle:repository = \"#recycle/%U\"\nhide unreadable = yes\nfileindex:encrypted = locked\n"
            + "".join("[%s]\npath = \"VOLUME/%%S/\"\n" % name for name in names[2:])
            + "[homes]\npath = VOLUME/homes/%S\n[dynamic]\npath = /srv/%m\n[print$]\npath = VOLUME\n"
            "[printers]\npath = VOLUME\nprintable = yes\n[printer]\npath = VOLUME\nprintable = yes\n"
        ).replace("INCLUDED", INCLUDED).replace("VOLUME", VOLUME))
        found, told = shares()
        self.assertEqual(found, {name: VOLUME + "/" + name for name in names + ["more"]})
        self.assertEqual([line.split(";")[0] for line in told], [
            "fileindexctl: /etc/samba/smb.conf: share dynamic: its path \"/srv/%m\" has the variable \"%m\", "
            "which can stand for any directory"])
        machine.write(INCLUDED, "[more]\npath = %s/moved/more\n" % VOLUME)
        self.assertEqual(shares()[0]["more"], VOLUME + "/moved/more")
        status, [docs] = machine.ctl("share", "show", "docs")
        place = VOLUME + "/@fileindex/docs"
        expected = {"path": VOLUME + "/docs", "db_path": place + "/db", "queue_path": place + "/queue",
                    "is_encryption": True, "recycle_bin": True, "hide_unreadable": True, "can_be_indexed": False}
        self.assertEqual((status, docs), (0, {**docs, **expected}))
        status, [failure] = machine.ctl("share", "show", "DOCS")
        self.assertEqual((status, failure["error"]), (1, {"code": 800, "msg": "DOCS"}))

    def test_the_own_file_wins_over_samba_s_also_where_it_cannot_be_read(self):
        machine.write(SAMBA, "[samba]\npath = %s\n" % VOLUME)
        os.makedirs(VOLUME + "/docs/bin/inner")
        os.symlink("docs", VOLUME + "/link")
        machine.write(OWN, "[docs]\npath = %s/docs\nvfs objects = recycle\nrecycle:repository = bin/#recycle\n\n"
                      "[link]\npath = %s/link\n[far]\npath = %s/far\n[inner]\npath = %s/docs/bin/inner\n"
                      % ((VOLUME,) * 4))
        found, told = shares()
        self.assertEqual(sorted(found), ["docs", "far", "inner", "link"])
        for line, start in zip(told, ["7: share link: %s/link goes through a symbolic link" % VOLUME,
                                      "9: share far: its directory %s/far does not exist; create" % VOLUME,
                                      "10: share inner: it lies in the share docs in line 1, but"]):
            self.assertIn("%s:%s" % (OWN, start), line)
        self.assertEqual(len(told), 3)
        for path, share, accepted in [("/docs/a", "docs", True), ("/docs/bin/#recycle/a", "docs", False),
                                      ("/docs/bin/#recycled/a", "docs", True), ("/docs/bin/inner/a", "inner", True)]:
            machine.write(VOLUME + path)
            answer = machine.ctl("explain", VOLUME + path)[1][0]
            self.assertEqual((answer["share"], answer["indexable"]), (share, accepted), path)
        os.remove(OWN)
        os.mkdir(OWN)
        self.assertEqual(machine.ctl("share", "list")[0], 1)

    def test_a_file_that_is_rewritten_in_its_place_is_read_as_a_whole(self):
        texts = ["".join("[s%d]\npath = /s%d\n%s" % (n, n, more) for n in range(9)) for more in ("# x\n" * 999, "")]
        machine.write(OWN, texts[0])
        writer = subprocess.Popen(["sh", "-c", 'while :; do for t; do printf %s "$t" > $0; done; done', OWN, *texts])
        self.addCleanup(writer.wait)
        self.addCleanup(writer.kill)
        for _ in range(20):
            self.assertEqual(len(machine.ctl("share", "list")[1]), 9)


if __name__ == "__main__":
    machine.enter()
    unittest.main()
