#!/usr/bin/env python3
"""Which paths of a real machine may be indexed: file systems that are really mounted, and names and forms of paths.

FILEINDEXCTL     the command's binary
"""
import os
import subprocess
import unittest

import private_machine as machine

VOLUME = machine.SCRATCH + "/v"
DOCS = VOLUME + "/docs"

SHARES = """[docs]
path = VOLUME/docs
vfs objects = recycle
recycle:repository = #recycle
[memory]
path = VOLUME/memory
[vault]
path = VOLUME/vault
fileindex:encrypted = yes
[safe]
path = VOLUME/safe
fileindex:encrypted = locked
[archive]
path = VOLUME/archive
read only = yes
[renamed]
path = VOLUME/other
"""

DIRECTORIES = ["docs", "memory", "vault/inner", "safe", "archive", "other"]
IN_DOCS = ["reports/.git/refs", "reports/.gitignore", "reports/#snapshot", "reports/#recycle", "#recycle/old",
           "#snapshot/daily", "a#snapshotb", "@eaDir", "bound", "image", "remote", "processes", "two words"]


def run(*command):
    subprocess.run(command, check=True, stdout=subprocess.DEVNULL)


def is_real_root():
    with open("/proc/self/uid_map", encoding="ascii") as uids:
        return uids.read().split() == ["0", "0", "4294967295"]


def mount_all():
    """The share docs is a disk of its own; in it, and in a share that is encrypted, something is mounted."""
    disk, image, server = (machine.SCRATCH + "/" + name for name in ("disk", "image", "server"))
    machine.write(disk)
    os.truncate(disk, 16 << 20)
    run("mkfs.ext4", "-q", disk)
    run("mount", "-o", "loop", disk, DOCS)
    for name in IN_DOCS:
        os.makedirs(DOCS + "/" + name)
    machine.write(DOCS + "/reports/2024.txt")
    os.symlink("reports", DOCS + "/link")
    run("mksquashfs", DOCS + "/reports", image, "-quiet", "-no-progress")
    run("mount", "-t", "squashfs", "-o", "loop", image, DOCS + "/image")
    run("mount", "-t", "proc", "none", DOCS + "/processes")
    for place in (DOCS + "/bound", VOLUME + "/vault/inner"):
        run("mount", "--bind", DOCS + "/reports", place)
    # What sshfs starts in the place of ssh is the server itself.
    machine.write(server, "#!/bin/sh\nexec /usr/lib/openssh/sftp-server\n")
    os.chmod(server, 0o755)
    run("sshfs", "-o", "ssh_command=" + server, "none:" + DOCS + "/reports", DOCS + "/remote")


@unittest.skipUnless(is_real_root(), "only root mounts disks")
class ExplainTest(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        machine.write("/etc/vexo/shares.conf", SHARES.replace("VOLUME", VOLUME))
        for name in DIRECTORIES:
            os.makedirs(VOLUME + "/" + name)
        cls.addClassCleanup(subprocess.run, ["umount", "-q", DOCS + "/remote"], check=False)  # ends its daemon
        mount_all()

    def check(self, rule, *paths):
        for path in paths:
            with self.subTest(path=path):
                status, [answer] = machine.ctl("explain", path)
                self.assertEqual((status, answer["indexable"], answer["rule"]), (0, rule == "", rule), answer)

    def test_other_machines_images_and_the_kernel_s_own_file_systems_are_refused_and_disks_and_memory_are_not(self):
        self.check("file_system", "/proc", DOCS + "/processes/1", DOCS + "/image", DOCS + "/image/2024.txt",
                   DOCS + "/remote", DOCS + "/remote/2024.txt")
        self.check("", DOCS, DOCS + "/reports/2024.txt", DOCS + "/two words", VOLUME + "/memory")

    def test_what_is_mounted_inside_a_share_is_refused_unless_the_share_is_encrypted(self):
        self.check("mount_point", DOCS + "/bound")
        self.check("", DOCS + "/bound/2024.txt", VOLUME + "/vault/inner")

    def test_snapshots_and_recycle_bins_are_so_only_in_their_place(self):
        self.check("snapshot", DOCS + "/#snapshot", DOCS + "/#snapshot/daily", VOLUME + "/#snapshot/docs")
        self.check("recycle_bin", DOCS + "/#recycle", DOCS + "/#recycle/old")
        self.check("", DOCS + "/a#snapshotb", DOCS + "/reports/#snapshot", DOCS + "/reports/#recycle")

    def test_names_of_the_system_and_other_forms_of_a_path_are_refused(self):
        self.check("reserved_name", DOCS + "/reports/.git", DOCS + "/reports/.git/refs", DOCS + "/@eaDir")
        self.check("", DOCS + "/reports/.gitignore")
        self.check("not_canonical", DOCS + "/link", DOCS + "/link/2024.txt", DOCS + "/image/../reports")
        self.check("", DOCS + "/reports/", DOCS + "//reports", DOCS + "/./reports", DOCS + "/")

    def test_a_share_may_be_locked_read_only_or_of_another_name_than_its_directory(self):
        self.check("share_locked", VOLUME + "/safe")
        self.check("share_read_only", VOLUME + "/archive")
        self.check("share_directory", VOLUME + "/other")
        self.check("no_share", VOLUME)


if __name__ == "__main__":
    machine.enter()
    unittest.main()
